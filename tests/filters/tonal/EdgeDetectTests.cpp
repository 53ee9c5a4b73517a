// Vertical edge detect in every layer format: flat areas go to the minimum with alpha kept, a vertical line
// lights the columns beside it, a horizontal edge gives nothing, values worked out by hand, and the
// processor (span and per-pixel forms) and the OpenCL device agree in every tiling.

#include "NoiseTestSupport.h"

#include "filters/Catalogue.h"
#include "filters/tonal/DiffuseStages.h"
#include "filters/tonal/EdgeDetectStages.h"
#include "filters/tonal/RasterVerticalEdgeDetectCommand.h"
#include "pipeline/Formats.h"
#include "tests/pipeline/LanguageZeroCheck.h"

#include <cstring>

namespace {

using PipelineTest::Compare;
using PipelineTest::ReadComponents;
using Raster::PixelFormat;
using RasterTools::RasterVerticalEdgeDetectCommand;

Kernel::Counted<RasterVerticalEdgeDetectCommand> MakeEdge() {
    return Kernel::MakeCounted<RasterVerticalEdgeDetectCommand>();
}

double MaximumOf(PixelFormat format) {
    if (Raster::IsFloatFormat(format)) return 1.0;
    return Raster::GetBytesPerComponent(format) == 1 ? 255.0 : 65535.0;
}

// Writes components (in channel order, in the stored scale) into pixel (x, y).
void Put(Raster::DynamicBuffer& image, int x, int y, const std::vector<double>& components) {
    const PixelFormat format = image.GetFormat();
    auto* bytes = reinterpret_cast<std::uint8_t*>(image.RowBytes(y)) +
                  std::size_t(x) * std::size_t(Raster::GetBytesPerPixel(format));
    for (std::size_t c = 0; c < components.size(); ++c) {
        if (Raster::IsFloatFormat(format)) {
            const float v = float(components[c]);
            std::memcpy(bytes + 4 * c, &v, 4);
        } else if (Raster::GetBytesPerComponent(format) == 1) {
            bytes[c] = std::uint8_t(components[c]);
        } else {
            const auto v = std::uint16_t(components[c]);
            std::memcpy(bytes + 2 * c, &v, 2);
        }
    }
}

// An image whose pixel (x, y) has every colour component colour(x, y) and alpha alpha(x, y).
template <class Colour, class Alpha>
Kernel::Counted<Raster::DynamicBuffer> Paint(PixelFormat format, int width, int height, Colour colour,
                                             Alpha alpha) {
    auto image = Raster::DynamicBuffer::Create(width, height, format);
    const int channels = Raster::GetChannelCount(format);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x) {
            std::vector<double> components(std::size_t(channels), colour(x, y));
            components.back() = alpha(x, y);
            Put(*image, x, y, components);
        }
    return image;
}

class EdgeFormats : public testing::TestWithParam<PixelFormat> {};

TEST_P(EdgeFormats, UniformImagesBecomeTheMinimumWithAlphaKept) {
    const PixelFormat format = GetParam();
    const double maximum = MaximumOf(format);
    const int last = Raster::GetChannelCount(format) - 1;
    const auto device = PipelineTest::OpenCLDevice();
    for (const double level : {0.0, 0.4, 1.0}) {
        // Alpha varies from pixel to pixel: only colour takes part.
        const auto source = Paint(
            format, 70, 9, [&](int, int) { return std::round(level * maximum); },
            [&](int x, int y) { return std::round(maximum * double((x * 7 + y * 13) % 11) / 10.0); });
        for (const bool onDevice : {false, true}) {
            if (onDevice && !device) continue;
            const auto result = NoiseTest::Render(*MakeEdge(), source, 32, onDevice ? device : nullptr);
            ASSERT_TRUE(result);
            for (int y = 0; y < 9; ++y)
                for (int x = 0; x < 70; ++x) {
                    const auto before = ReadComponents(*source, x, y), after = ReadComponents(*result, x, y);
                    for (int c = 0; c < last; ++c)
                        ASSERT_EQ(after[std::size_t(c)], 0.0) << "(" << x << ", " << y << ") channel " << c;
                    ASSERT_EQ(after[std::size_t(last)], before[std::size_t(last)]) << "alpha changed";
                }
        }
    }
}

TEST_P(EdgeFormats, AVerticalLineLightsTheColumnsBesideItAndAHorizontalEdgeNothing) {
    const PixelFormat format = GetParam();
    const double maximum = MaximumOf(format);
    const int last = Raster::GetChannelCount(format) - 1;
    const auto opaque = [&](int, int) { return maximum; };
    // Full-range components in column 5 on zero components: beside the line the sum is 4 × maximum, which
    // saturates in integer formats (no division by the kernel's weight); on the line left and right cancel.
    const auto line = Paint(
        format, 40, 7, [&](int x, int) { return x == 5 ? maximum : 0.0; }, opaque);
    // The top half at full range, the bottom at zero.
    const auto horizontal = Paint(
        format, 40, 8, [&](int, int y) { return y < 4 ? maximum : 0.0; }, opaque);
    const auto device = PipelineTest::OpenCLDevice();
    for (const bool onDevice : {false, true}) {
        if (onDevice && !device) continue;
        const auto lit = NoiseTest::Render(*MakeEdge(), line, 0, onDevice ? device : nullptr);
        const auto flat = NoiseTest::Render(*MakeEdge(), horizontal, 16, onDevice ? device : nullptr);
        ASSERT_TRUE(lit && flat);
        for (int y = 0; y < 7; ++y)
            for (int x = 0; x < 40; ++x) {
                const auto p = ReadComponents(*lit, x, y);
                // Unbounded float colour keeps the whole sum.
                const double beside = Raster::IsFloatFormat(format) ? 4.0 * maximum : maximum;
                const double expected = x == 4 || x == 6 ? beside : 0.0;
                for (int c = 0; c < last; ++c)
                    ASSERT_EQ(p[std::size_t(c)], expected)
                        << "line, (" << x << ", " << y << ") channel " << c;
                ASSERT_EQ(p[std::size_t(last)], maximum);
            }
        for (int y = 0; y < 8; ++y)
            for (int x = 0; x < 40; ++x) {
                const auto p = ReadComponents(*flat, x, y);
                for (int c = 0; c < last; ++c)
                    ASSERT_EQ(p[std::size_t(c)], 0.0) << "horizontal edge, (" << x << ", " << y << ")";
            }
    }
}

TEST_P(EdgeFormats, EveryTilingAndBothPathsAgree) {
    const PixelFormat format = GetParam();
    const auto source = PipelineTest::MakeImage(format, 99, 45, 23u);
    const auto command = MakeEdge();
    const auto reference = NoiseTest::Render(*command, source, 0);
    ASSERT_TRUE(reference);
    const auto device = PipelineTest::OpenCLDevice();
    for (const bool onDevice : {false, true}) {
        if (onDevice && !device) continue;
        for (const int tile : {0, 1, 7, 32, 45}) {
            if (!onDevice && tile == 0) continue;
            const auto result = NoiseTest::Render(*command, source, tile, onDevice ? device : nullptr);
            ASSERT_TRUE(result);
            if (const auto difference = Compare(*result, *reference))
                ADD_FAILURE() << (onDevice ? "device" : "processor") << ", tiles " << tile << ": "
                              << difference->Describe();
        }
    }
    if (!device) GTEST_SKIP() << "no OpenCL device: only processor tilings were compared";
}

// The span form (identity transform) against the per-pixel form for every pixel, spans at every offset and
// length, border spans included.
TEST_P(EdgeFormats, SpansMatchThePerPixelDefinition) {
    const PixelFormat format = GetParam();
    const auto image = PipelineTest::MakeImage(format, 77, 6, 31u);
    RasterTools::LayerFormatList::Dispatch(format, [&](auto tag) {
        constexpr PixelFormat F = decltype(tag)::value;
        using Sampler = RasterTools::EdgeDetectSampler;
        using Transform = Raster::IdentityTransform;
        const Raster::BitmapOf<F> bitmap(image.Get());
        const Transform::Params t{};
        const Sampler::Params params{};
        for (int y = -1; y <= 6; ++y)
            for (int x0 = -2; x0 < 77; x0 += 5)
                for (const int n : {1, 9, 32}) {
                    Raster::StoredPixel<F> span[Raster::SpanLength];
                    Sampler::SampleSpan<Transform, Raster::Safe>(bitmap, t, params, x0, y, n, span);
                    for (int i = 0; i < n; ++i) {
                        const auto pixel = Sampler::Sample<Transform, Raster::Safe>(
                            bitmap, Raster::KernelMath::make_int2(x0 + i, y), t, params);
                        EXPECT_EQ(std::memcmp(&pixel, &span[i], sizeof pixel), 0)
                            << "(" << x0 + i << ", " << y << ") in a span of " << n << " from " << x0;
                    }
                }
        return true;
    });
}

// By hand, RGBA8, one interior pixel; columns left (l) and right (r) of it, rows top to bottom:
//   red   l = 50, 60, 70;   r = 10, 20, 30:  -50 + 10 - 120 + 40 - 70 + 30 = -160 -> 160
//   green l = 0, 0, 0;      r = 100, 90, 80: 100 + 180 + 80 = 360 -> clamped to 255 (no division)
//   blue  l = 7, 9, 11;     r = 7, 9, 11:    0
// The centre column (200, 200, 200) carries no weight; the centre's alpha 77 stays.
TEST(EdgeValues, AnInteriorPixelWorkedOutByHand) {
    auto image = PipelineTest::MakeImage(PixelFormat::RGBA8, 9, 7, 3u);
    const double left[3][4] = {{50, 0, 7, 10}, {60, 0, 9, 20}, {70, 0, 11, 30}};
    const double right[3][4] = {{10, 100, 7, 40}, {20, 90, 9, 50}, {30, 80, 11, 60}};
    for (int r = 0; r < 3; ++r) {
        Put(*image, 3, 2 + r, {left[r][0], left[r][1], left[r][2], left[r][3]});
        Put(*image, 4, 2 + r, {200, 200, 200, r == 1 ? 77.0 : 255.0});
        Put(*image, 5, 2 + r, {right[r][0], right[r][1], right[r][2], right[r][3]});
    }
    const auto device = PipelineTest::OpenCLDevice();
    for (const bool onDevice : {false, true}) {
        if (onDevice && !device) continue;
        const auto result = NoiseTest::Render(*MakeEdge(), image, 0, onDevice ? device : nullptr);
        ASSERT_TRUE(result);
        EXPECT_EQ(ReadComponents(*result, 4, 3), (std::vector<double>{160, 255, 0, 77}))
            << (onDevice ? "device" : "processor");
    }
}

// At the border the missing neighbours are the edge pixels themselves: a ramp along x gives its step at
// the first and last column halved (one real neighbour and the clamped centre).
TEST(EdgeValues, BorderPixelsClampToTheEdge) {
    const auto ramp = Paint(
        PixelFormat::RGBA16, 6, 3, [](int x, int) { return 1000.0 * x; }, [](int, int) { return 65535.0; });
    const auto result = NoiseTest::Render(*MakeEdge(), ramp, 0);
    ASSERT_TRUE(result);
    for (int y = 0; y < 3; ++y) {
        EXPECT_EQ(ReadComponents(*result, 0, y)[0], 4000.0); // (1000 - 0) × 4
        EXPECT_EQ(ReadComponents(*result, 2, y)[0], 8000.0); // (3000 - 1000) × 4
        EXPECT_EQ(ReadComponents(*result, 5, y)[0], 4000.0); // (5000 - 4000) × 4
    }
}

std::string FormatName(const testing::TestParamInfo<PixelFormat>& info) {
    return std::string(Raster::GetPixelFormatName(info.param));
}

INSTANTIATE_TEST_SUITE_P(Layer, EdgeFormats, testing::ValuesIn(RasterTools::LayerFormats), FormatName);

} // namespace
