// The dab kernel on an OpenCL device gives the processor's bytes: every layer format, coverage format, write,
// path and texture, with dabs cut by the target's edge.

#include "PixelToolSupport.h"

#include "brushes/DabDevice.h"
#include "brushes/PixelDab.h"
#include "host/raster/device/Hardware.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>

namespace {

using Raster::PixelFormat;

struct Random {
    std::uint64_t state;
    std::uint32_t Next() {
        state = state * 6364136223846793005ull + 1442695040888963407ull;
        return std::uint32_t(state >> 33);
    }
};

// Random components over the whole range (floats a little beyond 0..1, and a few NaNs in float masks).
Kernel::Counted<Raster::DynamicBuffer> RandomImage(int width, int height, PixelFormat format,
                                                   Random& random) {
    auto image = Raster::DynamicBuffer::Create(width, height, format);
    const auto& info = Raster::GetPixelFormatInfo(format);
    for (int y = 0; y < height; ++y)
        for (int c = 0; c < width * info.channelCount; ++c) {
            std::byte* at = image->RowBytes(y) + std::size_t(c * info.bytesPerComponent);
            const std::uint32_t r = random.Next();
            if (info.bytesPerComponent == 1) {
                const auto v = std::uint8_t(r % 4 == 0 ? (r & 4 ? 255 : 0) : r >> 8);
                std::memcpy(at, &v, 1);
            } else if (info.bytesPerComponent == 2) {
                const auto v = std::uint16_t(r % 4 == 0 ? (r & 4 ? 65535 : 0) : r >> 8);
                std::memcpy(at, &v, 2);
            } else {
                float v = float(r % 1000) / 800.0f - 0.1f;
                if (r % 97 == 0 && Raster::IsMaskFormat(format)) v = NAN;
                if (r % 5 == 0) v = (r & 8) ? 1.0f : 0.0f;
                std::memcpy(at, &v, 4);
            }
        }
    return image;
}

std::vector<std::byte> ImageBytes(const Raster::DynamicBuffer& image) {
    std::vector<std::byte> bytes;
    for (int y = 0; y < image.GetHeight(); ++y)
        bytes.insert(bytes.end(), image.RowBytes(y), image.RowBytes(y) + image.GetRowBytes());
    return bytes;
}

TEST(DabDevice, TheDeviceGivesTheProcessorsBytesInEveryFormatAndPath) {
    const auto device = Raster::Hardware::GetDevice("opencl");
    if (!device) GTEST_SKIP() << "no OpenCL device: install pocl-opencl-icd to run the device path";
    const PixelFormat layers[] = {PixelFormat::RGBA8,  PixelFormat::RGBA16, PixelFormat::RGBAUF,
                                  PixelFormat::IA8,    PixelFormat::IA16,   PixelFormat::CMYKA8,
                                  PixelFormat::LabA16, PixelFormat::MaskA8, PixelFormat::MaskA16,
                                  PixelFormat::MaskAF};
    const PixelFormat masks[] = {PixelFormat::MaskA8, PixelFormat::MaskA16, PixelFormat::MaskAF};
    Random random{42};
    int compared = 0;
    for (const PixelFormat layer : layers)
        for (const PixelFormat coverageFormat : masks)
            for (int write = 0; write < 4; ++write)
                for (int path = 0; path < 3; ++path) {
                    const bool mask = Raster::IsMaskFormat(layer);
                    const auto kind = Raster::DabWrite(write);
                    // Colour writes belong to layers, full-intensity writes to masks.
                    if ((kind == Raster::DabWrite::Colour && mask) ||
                        (kind == Raster::DabWrite::FullMask && !mask))
                        continue;
                    SCOPED_TRACE(testing::Message() << Raster::GetPixelFormatName(layer) << " coverage "
                                                    << Raster::GetPixelFormatName(coverageFormat) << " write "
                                                    << write << " path " << path);
                    const auto target = RandomImage(23, 17, layer, random);
                    // A dab hanging over the top-left corner, except for copies, which must fit.
                    const Kernel::RectT<int> rect = kind == Raster::DabWrite::Copy
                                                        ? Kernel::RectT<int>{3, 2, 21, 15}
                                                        : Kernel::RectT<int>{-4, -3, 14, 10};
                    const auto coverage = RandomImage(rect.Width(), rect.Height(), coverageFormat, random);
                    const auto colour = RandomImage(1, 1, layer, random);
                    const auto source = RandomImage(rect.Width(), rect.Height(), layer, random);
                    const auto texture = RandomImage(5, 3, Raster::GetCompatibleMaskFormat(layer), random);
                    for (const bool textured : {false, true}) {
                        Raster::DabRequest request;
                        request.write = kind;
                        request.path = Raster::DabPath(path);
                        request.strength = 0.37 + 0.2 * path;
                        request.dynamic = 0.9;
                        request.colour = colour->RowBytes(0);
                        request.source = source.Get();
                        request.texture = textured ? texture.Get() : nullptr;
                        request.textureScale = 1.5;
                        request.targetOrigin = {-7, 4};
                        auto processor = Raster::DynamicBuffer::Create(23, 17, layer);
                        auto onDevice = Raster::DynamicBuffer::Create(23, 17, layer);
                        for (int y = 0; y < 17; ++y) {
                            std::memcpy(processor->RowBytes(y), target->RowBytes(y), target->GetRowBytes());
                            std::memcpy(onDevice->RowBytes(y), target->RowBytes(y), target->GetRowBytes());
                        }
                        ASSERT_TRUE(Raster::CompositeDab(*processor, rect, *coverage, request));
                        ASSERT_TRUE(RasterTools::CompositeDabOnDevice(device.Get(), *onDevice, rect,
                                                                      *coverage, request));
                        ASSERT_EQ(ImageBytes(*onDevice), ImageBytes(*processor))
                            << (textured ? "textured" : "plain");
                        ++compared;
                    }
                }
    EXPECT_GT(compared, 300);
}

TEST(DabDevice, StrokesPaintTheSamePixelsWithTheDabDevice) {
    const auto device = Raster::Hardware::GetDevice("opencl");
    if (!device) GTEST_SKIP() << "no OpenCL device: install pocl-opencl-icd to run the device path";
    for (const PixelFormat format :
         {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF, PixelFormat::LabA16}) {
        std::vector<std::byte> results[2];
        for (int onDevice = 0; onDevice < 2; ++onDevice) {
            RasterTools::SetDabDevice(onDevice ? device : nullptr);
            PixelToolDocument doc(40, 30, format);
            doc.controller->SetDocumentDefaults({.foreground = {0.3f, 0.8f, 0.1f, 0.7f}});
            auto brush = doc.tool->GetCurrentBrush()->Copy();
            brush->SetSize(5);
            doc.tool->ReplaceBrush(brush);
            doc.tool->Stroke({{-2, 3}, {38, 25}});
            doc.controller->NominateSnapshot();
            doc.tool->SetAlternateLatch(true);
            doc.tool->Stroke({{0, 20}, {39, 20}}); // erase
            doc.tool->SetAlternateMode(RasterTools::RasterPixelTool::UndoFromSnapshot);
            doc.tool->Stroke({{20, 0}, {20, 29}}); // restore
            results[onDevice] = ImageBytes(doc.Pixels());
        }
        RasterTools::SetDabDevice(nullptr);
        EXPECT_EQ(results[1], results[0]) << Raster::GetPixelFormatName(format);
    }
}

TEST(DabDevice, RequestsTheProcessorRefusesAreRefusedOnTheDeviceToo) {
    const auto device = Raster::Hardware::GetDevice("opencl");
    auto image = Raster::DynamicBuffer::Create(4, 4, PixelFormat::RGBA8);
    auto coverage = Raster::DynamicBuffer::Create(4, 4, PixelFormat::MaskA8);
    Raster::DabRequest request; // a colour write without a colour
    EXPECT_FALSE(RasterTools::CompositeDabOnDevice(device.Get(), *image, {0, 0, 4, 4}, *coverage, request));
    EXPECT_FALSE(RasterTools::CompositeDabOnDevice(nullptr, *image, {0, 0, 4, 4}, *coverage, request));
    // Both kernel languages' texts are whole programs with the entry point.
    for (const auto language :
         {Raster::HardwareKernelLanguage::OpenCLC, Raster::HardwareKernelLanguage::CudaCpp}) {
        const auto text = RasterTools::GetDabKernelText(language);
        EXPECT_NE(text.text.find("rt_pixel_dab"), std::string::npos);
        EXPECT_EQ(text.entryPoint, "rt_pixel_dab");
    }
}

} // namespace
