// Every conversion into and out of LabA16, through the copy command: the processor and the OpenCL device
// give the same bytes, whole and in tiles, including near black, at the ends of the ranges and from
// non-finite working colours; and the near-black CMYK split is pure black on both paths.

#include "PipelineTestSupport.h"

#include "filters/copy/RasterCopyCommand.h"
#include "host/raster/KernelMath.h"
#include "pipeline/Conversions.h"

#include <gtest/gtest.h>

#include <cstring>
#include <iterator>
#include <limits>
#include <vector>

using Raster::PixelFormat;
using namespace Raster::KernelMath;

namespace {

constexpr PixelFormat OtherLayerFormats[] = {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF,
                                             PixelFormat::IA8,   PixelFormat::IA16,   PixelFormat::CMYKA8};

constexpr int Width = 61, Height = 37;

// Writes pixels over the start of image, row by row.
template <class Pixel>
void Overwrite(Raster::DynamicBuffer& image, const std::vector<Pixel>& pixels) {
    for (std::size_t i = 0; i < pixels.size(); ++i) {
        const int x = int(i % std::size_t(Width)), y = int(i / std::size_t(Width));
        std::memcpy(image.RowBytes(y) + std::size_t(x) * sizeof(Pixel), &pixels[i], sizeof(Pixel));
    }
}

// The varied pixels of the pipeline tests, with the cases that once split the paths written over the first
// rows: the neutral axis near black and white, black with a or b one step off neutral, every extreme.
Kernel::Counted<Raster::DynamicBuffer> LabSource() {
    auto image = PipelineTest::MakeImage(PixelFormat::LabA16, Width, Height, 31u);
    std::vector<ushort4> special;
    for (int l : {0, 1, 2, 3, 10, 100, 257, 32768, 65279, 65534, 65535})
        for (int a : {0, 32767, 32768, 32769, 65535})
            for (int b : {32767, 32768, 32769, 0, 65535})
                special.push_back(make_ushort4(ushort(l), ushort(a), ushort(b), ushort(l ^ a ^ b)));
    Overwrite(*image, special);
    return image;
}

// Working colours for the conversions into Lab: hostile ones first (NaN, infinities, huge, tiny, denormal),
// then what MakeImage gives.
Kernel::Counted<Raster::DynamicBuffer> WorkingSource() {
    auto image = PipelineTest::MakeImage(PixelFormat::RGBAUF, Width, Height, 47u);
    const float nan = std::numeric_limits<float>::quiet_NaN();
    const float inf = std::numeric_limits<float>::infinity();
    const float values[] = {nan,  inf,   -inf,   1e30f,  -1e30f,   1048576.0f,
                            0.0f, 1e-7f, 1e-40f, -1e-7f, 0.04045f, 1.0f};
    std::vector<float4> special;
    constexpr std::size_t count = std::size(values);
    for (std::size_t r = 0; r < count; ++r)
        for (std::size_t g = 0; g < count; ++g)
            special.push_back(make_float4(values[r], values[g], values[(r + 2 * g) % count], 1.0f));
    for (float v : values)
        special.push_back(make_float4(0.5f, 0.5f, 0.5f, v));
    Overwrite(*image, special);
    return image;
}

Kernel::Counted<Raster::DynamicBuffer> SourceIn(PixelFormat format) {
    if (format == PixelFormat::LabA16) return LabSource();
    if (format == PixelFormat::RGBAUF) return WorkingSource();
    return PipelineTest::MakeImage(format, Width, Height, 53u + unsigned(format));
}

std::string PairName(PixelFormat from, PixelFormat to) {
    return std::string(Raster::GetPixelFormatName(from)) + " to " +
           std::string(Raster::GetPixelFormatName(to));
}

// The processor's whole render, and the device's whole and in odd tiles, must be the same bytes.
void CheckPair(PixelFormat from, PixelFormat to, const Kernel::Counted<Raster::HardwareDevice>& device) {
    const RasterTools::RasterCopyCommand command(false, int(to), Kernel::PointT<double>{1.0, 1.0});
    const auto source = SourceIn(from);
    const auto processor = PipelineTest::Render(command, source, 0);
    ASSERT_TRUE(processor) << PairName(from, to);
    ASSERT_EQ(processor->GetFormat(), to);
    const auto tiledProcessor = PipelineTest::Render(command, source, 13);
    ASSERT_TRUE(tiledProcessor);
    if (const auto d = PipelineTest::Compare(*tiledProcessor, *processor))
        ADD_FAILURE() << PairName(from, to) << ", processor in tiles of 13: " << d->Describe();
    if (!device) return;
    for (const int tile : {0, 13}) {
        const auto onDevice = PipelineTest::Render(command, source, tile, device);
        ASSERT_TRUE(onDevice) << PairName(from, to) << Raster::GetLastHardwareError();
        if (const auto d = PipelineTest::Compare(*onDevice, *processor))
            ADD_FAILURE() << PairName(from, to) << ", device in tiles of " << tile
                          << " against the processor: " << d->Describe();
    }
}

// The stored pixel that one source pixel becomes, on the processor and on the device (where there is one).
template <class Out, class In>
std::vector<Out> ConvertOne(PixelFormat from, const In& pixel, PixelFormat to,
                            const Kernel::Counted<Raster::HardwareDevice>& device) {
    const RasterTools::RasterCopyCommand command(false, int(to), Kernel::PointT<double>{1.0, 1.0});
    const auto source = PipelineTest::MakeFilled(from, 3, 2, &pixel);
    std::vector<Out> results;
    for (const auto& on : {Kernel::Counted<Raster::HardwareDevice>{}, device}) {
        if (!results.empty() && !on) break;
        const auto out = PipelineTest::Render(command, source, 0, on);
        if (!out) return {};
        results.push_back(out->template Row<Out>(1)[2]);
    }
    return results;
}

} // namespace

TEST(LabPairs, ProcessorAndDeviceGiveTheSameBytesForEveryPair) {
    const auto device = PipelineTest::OpenCLDevice();
    if (!device) std::cout << "[ SKIPPED  ] device half: no OpenCL device (install pocl-opencl-icd)\n";
    for (const PixelFormat other : OtherLayerFormats) {
        CheckPair(PixelFormat::LabA16, other, device);
        CheckPair(other, PixelFormat::LabA16, device);
    }
    CheckPair(PixelFormat::LabA16, PixelFormat::LabA16, device);
}

TEST(LabPairs, LabBlackIsPureBlackInCMYK) {
    // L = 0 with neutral a and b is working (0, 0, 0): all black ink, no coloured ink, on both paths.
    const auto device = PipelineTest::OpenCLDevice();
    for (const ushort alpha : {ushort(0), ushort(32768), ushort(65535)}) {
        const auto results = ConvertOne<cmyka8>(PixelFormat::LabA16, make_ushort4(0, 32768, 32768, alpha),
                                                PixelFormat::CMYKA8, device);
        ASSERT_FALSE(results.empty());
        const uchar a8 = uchar(rt_round(float(alpha) / 65535.0f * 255.0f));
        for (const cmyka8& p : results)
            EXPECT_EQ(p, rt_make_cmyka8(0, 0, 0, 255, a8))
                << int(p.cmyk[0]) << " " << int(p.cmyk[1]) << " " << int(p.cmyk[2]) << " " << int(p.cmyk[3]);
    }
    // One or two steps above black, black ink stores as full and the inks it leaves are too faint to store.
    for (const ushort l : {ushort(1), ushort(2), ushort(3)})
        for (const cmyka8& p : ConvertOne<cmyka8>(PixelFormat::LabA16, make_ushort4(l, 32769, 32767, 65535),
                                                  PixelFormat::CMYKA8, device))
            EXPECT_EQ(p, rt_make_cmyka8(0, 0, 0, 255, 255)) << "L " << l;
    // The same residue from the other formats: red a float step above black is black, not full magenta and
    // yellow under full black.
    for (const cmyka8& p : ConvertOne<cmyka8>(PixelFormat::RGBAUF, make_float4(1e-6f, 0.0f, 0.0f, 1.0f),
                                              PixelFormat::CMYKA8, device))
        EXPECT_EQ(p, rt_make_cmyka8(0, 0, 0, 255, 255));
    for (const cmyka8& p :
         ConvertOne<cmyka8>(PixelFormat::RGBA16, make_ushort4(1, 0, 0, 65535), PixelFormat::CMYKA8, device))
        EXPECT_EQ(p, rt_make_cmyka8(0, 0, 0, 255, 255));
    // Just inside the rule, black stores as 254 and the inks are worked out: 1 - k = 1.2 / 255.
    for (const cmyka8& p : ConvertOne<cmyka8>(
             PixelFormat::RGBAUF, make_float4(1.2f / 255.0f, 0.0f, 0.0f, 1.0f), PixelFormat::CMYKA8, device))
        EXPECT_EQ(p, rt_make_cmyka8(0, 255, 255, 254, 255));
}

TEST(LabPairs, NonFiniteWorkingColoursStoreAsDefined) {
    const auto device = PipelineTest::OpenCLDevice();
    const float nan = std::numeric_limits<float>::quiet_NaN();
    const float inf = std::numeric_limits<float>::infinity();
    const auto lab = [&](float r, float g, float b, float a) {
        const auto results =
            ConvertOne<ushort4>(PixelFormat::RGBAUF, make_float4(r, g, b, a), PixelFormat::LabA16, device);
        EXPECT_FALSE(results.empty());
        for (const ushort4& p : results)
            EXPECT_EQ(p, results.front()) << "processor and device differ for " << r << " " << g << " " << b;
        return results.empty() ? ushort4{} : results.front();
    };
    // NaN counts as 0: black, and a NaN alpha as 0.
    EXPECT_EQ(lab(nan, nan, nan, 1.0f), make_ushort4(0, 32768, 32768, 65535));
    EXPECT_EQ(lab(nan, nan, nan, nan), make_ushort4(0, 32768, 32768, 0));
    EXPECT_EQ(lab(nan, 0.25f, 0.75f, 1.0f), lab(0.0f, 0.25f, 0.75f, 1.0f));
    // Infinities act as the limit 2^20: white beyond white stores the top of L, black beyond black its
    // bottom.
    EXPECT_EQ(lab(inf, inf, inf, 1.0f), lab(1048576.0f, 1048576.0f, 1048576.0f, 1.0f));
    EXPECT_EQ(lab(inf, inf, inf, 1.0f).x, 65535);
    EXPECT_EQ(lab(-inf, -inf, -inf, 1.0f).x, 0);
    EXPECT_EQ(lab(inf, -inf, 0.5f, 1.0f), lab(1048576.0f, -1048576.0f, 0.5f, 1.0f));
}
