// Unsharp mask pixels: flat images stay flat, an edge gains contrast on both sides, the threshold leaves
// small differences alone, and renders agree whole and in tiles, on the processor and the device, in every
// layer format.
#include "PipelineTestSupport.h"
#include "filters/tonal/RasterUnsharpMaskCommand.h"
#include "filters/tonal/UnsharpMaskDevice.h"
#include "pipeline/RenderJob.h"
#include "tests/pipeline/LanguageZeroCheck.h"

#include <gtest/gtest.h>

#include <numeric>

namespace {

using Raster::PixelFormat;
using RasterTools::RasterUnsharpMaskCommand;

constexpr PixelFormat kFormats[] = {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF,
                                    PixelFormat::IA8,   PixelFormat::IA16,   PixelFormat::CMYKA8,
                                    PixelFormat::LabA16};

// The render of source in tiles of tile × tile (0: whole), on the processor or, given a device, on the
// device for every tile; through a selection and a channel write mask when given.
Kernel::Counted<Raster::DynamicBuffer>
Sharpen(const RasterUnsharpMaskCommand& command, const Kernel::Counted<Raster::DynamicBuffer>& source,
        int tile = 0, const Kernel::Counted<Raster::HardwareDevice>& device = nullptr,
        const Kernel::Counted<Raster::DynamicBuffer>& mask = nullptr, int channelMask = -1) {
    RasterTools::RenderTarget target;
    target.source.pixels = source;
    target.destination.pixels = PipelineTest::MakeDestination(command, *source);
    target.mask.pixels = mask;
    target.channelMask = channelMask;
    target.device = device;
    if (device) {
        EXPECT_TRUE(command.PrepareDevice(target)) << Raster::GetLastHardwareError();
    }
    const auto paths = PipelineTest::RenderTiled(command, target, tile, tile, tile ? 5 : 0, tile ? 9 : 0);
    EXPECT_EQ(paths.other, 0);
    EXPECT_EQ(device ? paths.processor : paths.device, 0) << "tiles took the other path";
    return target.destination.pixels;
}

// Opaque grey RGBA8, left of column 16 at one level and from it on at another.
Kernel::Counted<Raster::DynamicBuffer> Edge(std::uint8_t left, std::uint8_t right) {
    auto image = Raster::DynamicBuffer::Create(32, 8, PixelFormat::RGBA8);
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 32; ++x) {
            std::uint8_t* p = image->Row<std::uint8_t>(y) + 4 * x;
            p[0] = p[1] = p[2] = x < 16 ? left : right;
            p[3] = 255;
        }
    return image;
}

TEST(UnsharpMaskPixels, TheGaussianIsCutOffAtTheMargin) {
    const RasterUnsharpMaskCommand command(false, 12.0, 1.0, 0.0);
    const auto plan = command.MakePlan();
    ASSERT_EQ(command.GetMargin(), 4);
    ASSERT_EQ(plan.taps.size(), 9u);
    EXPECT_NEAR(std::accumulate(plan.taps.begin(), plan.taps.end(), 0.0), 1.0, 1e-6);
    // Standard deviation radius / 6 = 2: the tap at 2 is exp(-1/2) of the centre's.
    EXPECT_NEAR(plan.taps[6] / plan.taps[4], std::exp(-0.5), 1e-6);
    EXPECT_EQ(RasterUnsharpMaskCommand(false, 0.0, 1.0, 0.0).MakePlan().taps.size(), 1u);
}

TEST(UnsharpMaskPixels, AFlatImageIsUnchanged) {
    for (const PixelFormat format : {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::IA8,
                                     PixelFormat::CMYKA8, PixelFormat::LabA16}) {
        const auto pixel = PipelineTest::MakeImage(format, 1, 1, 4);
        const auto flat = PipelineTest::MakeFilled(format, 20, 20, pixel->RowBytes(0));
        EXPECT_FALSE(
            PipelineTest::Compare(*flat, *Sharpen(RasterUnsharpMaskCommand(false, 9.0, 2.0, 0.0), flat)))
            << Raster::GetPixelFormatName(format);
    }
    const float grey[4] = {0.3f, 0.6f, 1.7f, 1.0f};
    const auto flat = PipelineTest::MakeFilled(PixelFormat::RGBAUF, 20, 20, grey);
    EXPECT_FALSE(
        PipelineTest::Compare(*flat, *Sharpen(RasterUnsharpMaskCommand(false, 9.0, 2.0, 0.0), flat), 8.0));
}

TEST(UnsharpMaskPixels, AnEdgeGainsContrastOnBothSides) {
    const auto result = Sharpen(RasterUnsharpMaskCommand(false, 9.0, 1.0, 0.0), Edge(100, 150));
    const auto grey = [&](int x) { return int(result->Row<std::uint8_t>(4)[4 * x]); };
    EXPECT_LT(grey(15), 100);
    EXPECT_GT(grey(16), 150);
    EXPECT_LT(grey(14), 100);
    EXPECT_GT(grey(17), 150);
    // Beyond the margin (ceil(9 / 3) = 3) nothing changes.
    EXPECT_EQ(grey(12), 100);
    EXPECT_EQ(grey(19), 150);
    EXPECT_EQ(result->Row<std::uint8_t>(4)[4 * 15 + 3], 255);
}

TEST(UnsharpMaskPixels, TheThresholdLeavesSmallDifferencesAlone) {
    const auto small = Edge(100, 110);
    const RasterUnsharpMaskCommand strict(false, 9.0, 1.0, 0.1); // 25.5 levels
    EXPECT_FALSE(PipelineTest::Compare(*small, *Sharpen(strict, small)));
    const auto large = Edge(60, 190);
    const auto result = Sharpen(strict, large);
    EXPECT_LT(int(result->Row<std::uint8_t>(4)[4 * 15]), 60);
}

// The device's two passes give the processor's pixels, with and without a selection and a channel write
// mask, with a threshold and without, whole and in tiles.
TEST(UnsharpMaskPixels, TheDeviceGivesTheProcessorsPixels) {
    REQUIRE_OPENCL(device);
    const auto mask = PipelineTest::MakeImage(PixelFormat::MaskA8, 45, 38, 4);
    for (const PixelFormat format : kFormats) {
        const auto source = PipelineTest::MakeImage(format, 45, 38, 8);
        const RasterUnsharpMaskCommand sharp(false, 3.0, 2.5, 0.0), gentle(false, 10.0, 0.8, 0.02);
        for (const auto* command : {&sharp, &gentle}) {
            const bool masked = command == &gentle;
            const auto reference =
                Sharpen(*command, source, 0, nullptr, masked ? mask : nullptr, masked ? 0b1101 : -1);
            for (const int tile : {0, 16}) {
                const auto difference = PipelineTest::Compare(
                    *reference,
                    *Sharpen(*command, source, tile, device, masked ? mask : nullptr, masked ? 0b1101 : -1));
                EXPECT_FALSE(difference)
                    << Raster::GetPixelFormatName(format) << " radius " << command->GetParameters().radius
                    << " tile " << tile << ": " << difference->Describe();
            }
        }
    }
}

TEST(UnsharpMaskPixels, WholeAndTiledRendersAgreeInEveryFormat) {
    for (const PixelFormat format : kFormats) {
        const auto source = PipelineTest::MakeImage(format, 45, 38, 8);
        const RasterUnsharpMaskCommand command(false, 10.0, 0.8, 0.02);
        const auto difference =
            PipelineTest::Compare(*Sharpen(command, source), *Sharpen(command, source, 16));
        EXPECT_FALSE(difference) << Raster::GetPixelFormatName(format) << ": " << difference->Describe();
    }
}

} // namespace
