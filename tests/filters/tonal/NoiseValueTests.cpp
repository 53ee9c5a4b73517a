// Values worked out by hand from the generator's definition, checked on the processor and the OpenCL device.
//
// The pixel is (2, 1) of a 4-wide layer seen without a view: its seed is Hash(1 × 4 + 2) = Hash(6).
//   (6 XOR 61) XOR (6 >> 16) = 59;  59 + (59 << 3) = 531;  531 XOR (531 >> 4) = 562;
//   562 × 0x27D4EB2D mod 2^32 = 1902921930;  1902921930 XOR (1902921930 >> 15) = 1902946834.
// RandomGet from 1902946834 (state × 214013 + 2531011 mod 2^32, then >> 16):
//   state 2269341837 -> 34627, state 2345195804 -> 35784, state 1103856495 -> 16843, ...
// Every float step below is one single-precision operation, rounded to nearest.

#include "NoiseTestSupport.h"

#include "host/document/RasterInterface.h"
#include "host/raster/Bitmap.h"

#include <gtest/gtest.h>

namespace {

using Raster::PixelFormat;
using Raster::KernelMath::uchar4;
using Raster::KernelMath::ushort4;

struct Expected {
    const char* what;
    double intensity;
    bool mono, gaussian;
    std::vector<double> eight;   // from (100, 150, 200, 255)
    std::vector<double> sixteen; // from (1000, 30000, 60000, 65535)
};

// Uniform, intensity 0.25: sigma = 0.341 × 0.25 = 0.08525 (float 0.0852499977). The first draw 34627/65535
// is 0.528374135 (float); (sigma × (0.528374135 − 0.5)) × 2 = 0.00483779. The next draws give 0.00784792,
// -0.0414302 and 0.0559319 (alpha's, consumed). Red: 100 + 0.00483779 × 255 = 101.23, truncated 101;
// 16-bit red: 1000 + 0.00483779 × 65535 = 1317.04, truncated 1317.
// Gaussian, intensity 0.25: the twelve draws of red sum to 5.87139750 (float), ((sum − 6) × 1) / 6 × 0.25 =
// -0.00535844; green's twelve sum to 6.63410378 (0.0264210), blue's to 5.37831688 (-0.0259035); red:
// 100 − 1.366 = 98.63, truncated 98. Mono uses the first value for every colour channel.
const Expected Cases[] = {
    {"uniform", 0.25, false, false, {101, 152, 189, 255}, {1317, 30514, 57284, 65535}},
    {"uniform mono", 0.25, true, false, {101, 151, 201, 255}, {1317, 30317, 60317, 65535}},
    {"gaussian", 0.25, false, true, {98, 156, 193, 255}, {648, 31731, 58302, 65535}},
    {"gaussian mono", 0.25, true, true, {98, 148, 198, 255}, {648, 29648, 59648, 65535}},
};

TEST(NoiseValues, HashAndDrawsFollowTheirDefinition) {
    using namespace RasterTools::NoiseGenerator;
    EXPECT_EQ(Hash(6u), 1902946834u);
    EXPECT_EQ(Hash(0u), 3232319850u); // steps: 61, 549, 519, 3232286779, 3232319850
    uint state = 1902946834u;
    EXPECT_EQ(RandomGet(&state), 34627u);
    EXPECT_EQ(state, 2269341837u);
    EXPECT_EQ(RandomGet(&state), 35784u);
    EXPECT_EQ(RandomGet(&state), 16843u);
    EXPECT_EQ(state, 1103856495u);
}

TEST(NoiseValues, MatchTheGeneratorsDefinitionOnBothPaths) {
    const uchar4 eight{100, 150, 200, 255};
    const ushort4 sixteen{1000, 30000, 60000, 65535};
    const auto source8 = PipelineTest::MakeFilled(PixelFormat::RGBA8, 4, 3, &eight);
    const auto source16 = PipelineTest::MakeFilled(PixelFormat::RGBA16, 4, 3, &sixteen);
    std::vector<Kernel::Counted<Raster::HardwareDevice>> paths{nullptr};
    if (const auto device = PipelineTest::OpenCLDevice())
        paths.push_back(device);
    else
        std::cerr << "no OpenCL device: only the processor is checked\n";
    for (const Expected& c : Cases) {
        const auto command = NoiseTest::MakeNoise(c.intensity, c.mono, c.gaussian);
        for (const auto& path : paths) {
            const char* where = path ? "device" : "processor";
            const auto result8 = NoiseTest::Render(*command, source8, 0, path);
            const auto result16 = NoiseTest::Render(*command, source16, 0, path);
            ASSERT_TRUE(result8 && result16);
            EXPECT_EQ(PipelineTest::ReadComponents(*result8, 2, 1), c.eight) << c.what << ", " << where;
            EXPECT_EQ(PipelineTest::ReadComponents(*result16, 2, 1), c.sixteen) << c.what << ", " << where;
        }
    }
}

// A layer opened for change, with an optional selection.
class TestRaster final : public MutableRasterInterface {
public:
    explicit TestRaster(Kernel::Counted<Raster::DynamicBuffer> pixels)
        : m_Pixels(std::move(pixels)) {}
    Kernel::Counted<Raster::DynamicBuffer> GetPixels() const override { return m_Pixels; }
    Kernel::RectT<int> GetRasterBoundingBox() const override { return m_Pixels->GetBounds(); }
    Raster::AffineTransform::Params GetTransform() const override { return {}; }
    const SelectionRasterNode* GetSelection() const override { return m_Selection.Get(); }
    Kernel::Counted<SelectionRasterNode> m_Selection;

private:
    Kernel::Counted<Raster::DynamicBuffer> m_Pixels;
};

TEST(NoiseDoEffect, ChangesTheRasterInPlaceAsARenderWouldWithinTheSelection) {
    const auto original = PipelineTest::MakeImage(PixelFormat::RGBA16, 70, 33, 21u);
    const auto command = NoiseTest::MakeNoise(0.3, false, true);
    const auto rendered = NoiseTest::Render(*command, original, 0);
    ASSERT_TRUE(rendered);

    TestRaster whole(original->Clone());
    EXPECT_EQ(command->DoEffect(&whole), original->GetBounds());
    EXPECT_FALSE(PipelineTest::Compare(*whole.GetPixels(), *rendered));

    // A selection of columns 10..29 and rows 5..19: only those pixels change, with the same noise.
    auto mask = Raster::DynamicBuffer::Create(70, 33, PixelFormat::MaskA8);
    ASSERT_TRUE(mask);
    for (int y = 5; y < 20; ++y)
        for (int x = 10; x < 30; ++x)
            mask->Row<std::uint8_t>(y)[x] = 255;
    TestRaster part(original->Clone());
    part.m_Selection = Kernel::MakeCounted<SelectionRasterNode>(mask);
    const Kernel::RectT<int> area{10, 5, 30, 20};
    EXPECT_EQ(command->DoEffect(&part), area);
    for (int y = 0; y < 33; ++y)
        for (int x = 0; x < 70; ++x) {
            const bool inside = x >= 10 && x < 30 && y >= 5 && y < 20;
            ASSERT_EQ(PipelineTest::ReadComponents(*part.GetPixels(), x, y),
                      PipelineTest::ReadComponents(inside ? *rendered : *original, x, y))
                << x << ", " << y;
        }
}

} // namespace
