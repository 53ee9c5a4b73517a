// Add noise in every layer format: the processor and the OpenCL device give the same pixels in every tiling,
// under views that zoom and rotate and for a layer away from the origin; the noise has the promised shape.

#include "NoiseTestSupport.h"

#include "pipeline/Formats.h"
#include "tests/pipeline/LanguageZeroCheck.h"

#include <cmath>
#include <cstring>
#include <numbers>

namespace {

using PipelineTest::Compare;
using PipelineTest::ReadComponents;
using Raster::PixelFormat;

struct Setting {
    double intensity;
    bool mono, gaussian;
};
constexpr Setting Settings[] = {{0.3, false, true}, {0.3, true, false}, {1.0, false, false}};

Raster::AffineTransform::Params Affine(double a, double b, double c, double d, double e, double f) {
    Raster::AffineTransform::Params p;
    p.m = {a, b, c, d, e, f};
    return p;
}

struct NamedView {
    const char* name;
    NoiseTest::View view;
};

std::vector<NamedView> Views() {
    const double angle = 30.0 * std::numbers::pi / 180.0;
    const double c = std::cos(angle), s = std::sin(angle);
    return {
        {"no view", {}},
        {"zoom 0.5", {{}, Affine(0.5, 0.0, 0.0, 0.0, 0.5, 0.0)}},
        {"zoom 2", {{}, Affine(2.0, 0.0, 0.0, 0.0, 2.0, 0.0)}},
        {"rotated 30 degrees", {{}, Affine(c, -s, 12.5, s, c, -7.25)}},
        {"layer at (40, 25)", {{40.0, 25.0, 137.0, 66.0}, Affine(1.0, 0.0, 40.0, 0.0, 1.0, 25.0)}},
    };
}

class NoiseFormats : public testing::TestWithParam<PixelFormat> {};

TEST_P(NoiseFormats, EveryTilingAndBothPathsGiveTheSamePixels) {
    const PixelFormat format = GetParam();
    const auto source = PipelineTest::MakeImage(format, 97, 41, 5u);
    const auto device = PipelineTest::OpenCLDevice();
    for (const Setting& setting : Settings) {
        const auto command = NoiseTest::MakeNoise(setting.intensity, setting.mono, setting.gaussian);
        for (const NamedView& view : Views()) {
            const auto reference = NoiseTest::Render(*command, source, 0, nullptr, view.view);
            ASSERT_TRUE(reference);
            for (const bool onDevice : {false, true}) {
                if (onDevice && !device) continue;
                for (const int tile : {0, 37, 32, 512}) {
                    if (!onDevice && tile == 0) continue; // that is the reference
                    const auto result =
                        NoiseTest::Render(*command, source, tile, onDevice ? device : nullptr, view.view);
                    ASSERT_TRUE(result);
                    if (const auto difference = Compare(*result, *reference))
                        ADD_FAILURE()
                            << Raster::GetPixelFormatName(format) << ", intensity " << setting.intensity
                            << (setting.mono ? " mono" : "") << (setting.gaussian ? " gaussian" : " uniform")
                            << ", " << view.name << ", " << (onDevice ? "device" : "processor") << ", tiles "
                            << tile << ": " << difference->Describe();
                }
            }
        }
    }
    if (!device) GTEST_SKIP() << "no OpenCL device: only processor tilings were compared";
}

TEST_P(NoiseFormats, ZeroIntensityChangesNothingAndAlphaNeverChanges) {
    const PixelFormat format = GetParam();
    const auto source = PipelineTest::MakeImage(format, 45, 20, 9u);
    const int alpha = Raster::GetChannelCount(format) - 1;
    for (const bool mono : {false, true})
        for (const bool gaussian : {false, true}) {
            const auto unchanged = NoiseTest::Render(*NoiseTest::MakeNoise(0.0, mono, gaussian), source, 32);
            ASSERT_TRUE(unchanged);
            EXPECT_FALSE(Compare(*unchanged, *source)) << "intensity 0 changed pixels";
            const auto noisy = NoiseTest::Render(*NoiseTest::MakeNoise(5.0, mono, gaussian), source, 32);
            ASSERT_TRUE(noisy);
            EXPECT_TRUE(Compare(*noisy, *source)) << "intensity 5 changed nothing";
            for (int y = 0; y < 20; ++y)
                for (int x = 0; x < 45; ++x)
                    ASSERT_EQ(ReadComponents(*noisy, x, y)[alpha], ReadComponents(*source, x, y)[alpha])
                        << "alpha changed at (" << x << ", " << y << ")";
        }
}

TEST_P(NoiseFormats, MonoMovesEveryColourChannelAlike) {
    const PixelFormat format = GetParam();
    const int colours = Raster::GetChannelCount(format) - 1;
    if (colours < 2) GTEST_SKIP() << "one colour channel";
    // Grey pixels (equal colour channels) of varied levels, away from the ends so that nothing clamps.
    const auto source = PipelineTest::MakeImage(format, 40, 16, 3u);
    const double maximum =
        Raster::IsFloatFormat(format) ? 1.0 : (Raster::GetBytesPerComponent(format) == 1 ? 255.0 : 65535.0);
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 40; ++x) {
            const double level = maximum * (0.3 + 0.4 * double((x * 7 + y * 3) % 40) / 40.0);
            auto* bytes = reinterpret_cast<std::uint8_t*>(source->RowBytes(y)) +
                          std::size_t(x) * std::size_t(Raster::GetBytesPerPixel(format));
            for (int c = 0; c < colours; ++c) {
                if (Raster::IsFloatFormat(format)) {
                    const float v = float(level / maximum);
                    std::memcpy(bytes + 4 * c, &v, 4);
                } else if (Raster::GetBytesPerComponent(format) == 1) {
                    bytes[c] = std::uint8_t(level);
                } else {
                    const auto v = std::uint16_t(level);
                    std::memcpy(bytes + 2 * c, &v, 2);
                }
            }
        }
    const auto mono = NoiseTest::Render(*NoiseTest::MakeNoise(0.1, true, true), source, 37);
    const auto colour = NoiseTest::Render(*NoiseTest::MakeNoise(0.1, false, true), source, 37);
    ASSERT_TRUE(mono && colour);
    int colourDiffers = 0;
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 40; ++x) {
            const auto m = ReadComponents(*mono, x, y), c = ReadComponents(*colour, x, y);
            for (int k = 1; k < colours; ++k)
                ASSERT_EQ(m[std::size_t(k)], m[0]) << "mono pixel (" << x << ", " << y << ") channel " << k;
            colourDiffers += c[1] != c[0];
        }
    EXPECT_GT(colourDiffers, 40 * 16 / 2) << "colour noise should move the channels apart";
}

// Noise on a mid-level image (no clamping): the change of every channel stays within the distribution's
// bound, the bound is nearly reached, and the spread is the distribution's (uniform: bound / sqrt(3);
// gaussian: bound / 6).
TEST_P(NoiseFormats, ChangesStayWithinTheBoundWithTheExpectedSpread) {
    const PixelFormat format = GetParam();
    const int colours = Raster::GetChannelCount(format) - 1;
    const bool isFloat = Raster::IsFloatFormat(format);
    const double maximum = isFloat ? 1.0 : (Raster::GetBytesPerComponent(format) == 1 ? 255.0 : 65535.0);
    std::vector<std::uint8_t> middle(std::size_t(Raster::GetBytesPerPixel(format)));
    for (int c = 0; c <= colours; ++c) {
        if (isFloat) {
            const float v = c == colours ? 1.0f : 0.5f;
            std::memcpy(middle.data() + 4 * c, &v, 4);
        } else if (maximum == 255.0) {
            middle[std::size_t(c)] = c == colours ? 255 : 128;
        } else {
            const std::uint16_t v = c == colours ? 65535 : 32768;
            std::memcpy(middle.data() + 2 * c, &v, 2);
        }
    }
    const auto source = PipelineTest::MakeFilled(format, 128, 128, middle.data());
    const double intensity = 0.4; // the change never reaches 0.5 of the range: no clamping
    for (const bool gaussian : {false, true}) {
        const double bound = (gaussian ? 1.0 : 0.341) * intensity * maximum;
        const auto result = NoiseTest::Render(*NoiseTest::MakeNoise(intensity, false, gaussian), source, 64);
        ASSERT_TRUE(result);
        double largest = 0.0, squares = 0.0;
        long count = 0;
        for (int y = 0; y < 128; ++y)
            for (int x = 0; x < 128; ++x) {
                const auto before = ReadComponents(*source, x, y), after = ReadComponents(*result, x, y);
                for (int c = 0; c < colours; ++c) {
                    const double change = after[std::size_t(c)] - before[std::size_t(c)];
                    // Integer channels truncate toward zero, which can add one unit below the start.
                    ASSERT_LE(std::fabs(change), bound + (isFloat ? 1e-6 : 1.0))
                        << (gaussian ? "gaussian" : "uniform") << " at (" << x << ", " << y << ")";
                    largest = std::max(largest, std::fabs(change));
                    squares += change * change;
                    ++count;
                }
            }
        const double spread = std::sqrt(squares / double(count));
        const double expected = gaussian ? bound / 6.0 : bound / std::sqrt(3.0);
        EXPECT_NEAR(spread, expected, 0.05 * expected + (isFloat ? 0.0 : 0.5))
            << (gaussian ? "gaussian" : "uniform");
        // Uniform noise reaches its bound; twelve-draw gaussian noise stays far inside it.
        if (!gaussian)
            EXPECT_GT(largest, 0.98 * bound - 1.0);
        else
            EXPECT_LT(largest, 0.9 * bound); // |sum - 6| > 5.4 of twelve draws: about 1e-11 a channel
    }
}

TEST(NoiseView, ZoomTwoGivesEachTwoByTwoBlockOneSeed) {
    const Raster::KernelMath::ushort4 grey{30000, 30000, 30000, 65535};
    const auto source = PipelineTest::MakeFilled(PixelFormat::RGBA16, 16, 8, &grey);
    const auto command = NoiseTest::MakeNoise(0.2, false, true);
    const auto zoomed =
        NoiseTest::Render(*command, source, 0, nullptr, {{}, Affine(2.0, 0.0, 0.0, 0.0, 2.0, 0.0)});
    const auto plain = NoiseTest::Render(*command, source, 0);
    ASSERT_TRUE(zoomed && plain);
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 16; ++x)
            ASSERT_EQ(ReadComponents(*zoomed, x, y), ReadComponents(*zoomed, x & ~1, y & ~1))
                << x << ", " << y;
    // Pixel (2k, 2j) under the zoom is seeded like pixel (k, j) without it.
    for (int y = 0; y < 4; ++y)
        for (int x = 0; x < 8; ++x)
            ASSERT_EQ(ReadComponents(*zoomed, 2 * x, 2 * y), ReadComponents(*plain, x, y)) << x << ", " << y;
}

TEST(NoiseView, ASingularViewSeedsFromTheNegatedTranslation) {
    // The zero linear part puts every pixel at (-tx, -ty) = (3, 1): one seed, Hash(1 × width + 3), for all.
    const Raster::KernelMath::uchar4 grey{128, 128, 128, 255};
    const auto source = PipelineTest::MakeFilled(PixelFormat::RGBA8, 10, 6, &grey);
    const auto command = NoiseTest::MakeNoise(0.3, false, false);
    const auto singular =
        NoiseTest::Render(*command, source, 0, nullptr, {{}, Affine(0.0, 0.0, -3.0, 0.0, 0.0, -1.0)});
    const auto plain = NoiseTest::Render(*command, source, 0);
    ASSERT_TRUE(singular && plain);
    for (int y = 0; y < 6; ++y)
        for (int x = 0; x < 10; ++x)
            ASSERT_EQ(ReadComponents(*singular, x, y), ReadComponents(*plain, 3, 1)) << x << ", " << y;
    const auto params =
        command->GetSamplerParams({0.0, 0.0, 10.9, 6.0}, Affine(1e-70, 0.0, 0.0, 0.0, 1e-70, 0.0));
    EXPECT_EQ(params.block[0], 0.0f) << "a determinant of 1e-140 counts as singular";
    EXPECT_EQ(params.block[7], 10.0f) << "the width is truncated";
    EXPECT_EQ(params.block[6], float(0.341 * 0.3));
}

std::string FormatName(const testing::TestParamInfo<PixelFormat>& info) {
    return std::string(Raster::GetPixelFormatName(info.param));
}

INSTANTIATE_TEST_SUITE_P(Layer, NoiseFormats, testing::ValuesIn(RasterTools::LayerFormats), FormatName);

} // namespace
