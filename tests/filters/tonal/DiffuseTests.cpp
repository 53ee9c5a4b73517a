// Diffuse in every layer format: the processor and the OpenCL device pick the same neighbour in every tiling
// and under views; offsets stay within 512 × sigma and truncate toward zero; values worked out by hand.
//
// Hand values: a 64 × 64 layer without a view, intensity 0.1 (sigma 0.1f). The seed of pixel (x, y) is
// Hash(y × 64 + x); the two draws r1, r2 give dx = trunc((r1/65535 × 1024 − 512) × sigma), dy likewise.
//   (6, 0):   Hash(6) = 1902946834, draws 34627, 35784:   (2.906, 4.713)   -> (+2, +4):  source (8, 4)
//   (30, 40): Hash(2590) = 1467472646, draws 24830, 29248: (-12.40, -5.50) -> (-12, -5): source (18, 35)
//   (2, 0):   Hash(2) = 3329832309, draws 32589, 12877:   (-0.279, -31.08) -> (0, -31): (2, -31), clamped
//             to the edge: source (2, 0)
//   (26, 40): Hash(2586) = 2532856016, draws 8996, 10870:  (-37.14, -34.22) -> (-37, -34): (-11, 6),
//             clamped: source (0, 6)
// A floor instead of the truncation would give (-13, -6) and (-1, -32) for the second and third.

#include "NoiseTestSupport.h"

#include "filters/tonal/RasterDiffuseCommand.h"
#include "pipeline/Formats.h"
#include "pipeline/RenderJob.h"

#include <cmath>
#include <cstring>

namespace {

using PipelineTest::Compare;
using PipelineTest::ReadComponents;
using Raster::PixelFormat;
using RasterTools::RasterDiffuseCommand;

Kernel::Counted<RasterDiffuseCommand> MakeDiffuse(double intensity) {
    return Kernel::MakeCounted<RasterDiffuseCommand>(false, intensity);
}

Raster::AffineTransform::Params Affine(double a, double b, double c, double d, double e, double f) {
    Raster::AffineTransform::Params p;
    p.m = {a, b, c, d, e, f};
    return p;
}

// RGBA16 pixels that name their own place: red x, green y, blue a mix, alpha varied (so that a copied alpha
// shows).
Kernel::Counted<Raster::DynamicBuffer> MakePlaces(int width, int height) {
    auto image = Raster::DynamicBuffer::Create(width, height, PixelFormat::RGBA16);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x) {
            const Raster::KernelMath::ushort4 p{std::uint16_t(x), std::uint16_t(y),
                                                std::uint16_t((x * 31 + y * 17) % 65536),
                                                std::uint16_t(1000 + x + y * 64)};
            std::memcpy(image->RowBytes(y) + std::size_t(x) * sizeof p, &p, sizeof p);
        }
    return image;
}

// Where the pixel at (x, y) of a render of MakePlaces came from.
std::pair<int, int> Origin(const Raster::DynamicBuffer& image, int x, int y) {
    const auto c = ReadComponents(image, x, y);
    return {int(c[0]), int(c[1])};
}

TEST(DiffuseValues, PicksTheNeighbourWorkedOutByHandOnBothPaths) {
    const auto source = MakePlaces(64, 64);
    const auto command = MakeDiffuse(0.1);
    const struct {
        int x, y, fromX, fromY;
    } cases[] = {{6, 0, 8, 4}, {30, 40, 18, 35}, {2, 0, 2, 0}, {26, 40, 0, 6}};
    const auto device = PipelineTest::OpenCLDevice();
    for (const bool onDevice : {false, true}) {
        if (onDevice && !device) continue;
        const auto result = NoiseTest::Render(*command, source, 16, onDevice ? device : nullptr);
        ASSERT_TRUE(result);
        for (const auto& c : cases)
            EXPECT_EQ(ReadComponents(*result, c.x, c.y), ReadComponents(*source, c.fromX, c.fromY))
                << (onDevice ? "device" : "processor") << ": pixel (" << c.x << ", " << c.y
                << ") should be a copy of (" << c.fromX << ", " << c.fromY << "), alpha included";
    }
    if (!device) GTEST_SKIP() << "no OpenCL device: the hand values were checked on the processor only";
}

TEST(DiffuseValues, OffsetsStayWithin512SigmaAndFillTheSquare) {
    const int size = 160;
    const auto source = MakePlaces(size, size);
    for (const double intensity : {0.05, 0.02}) {
        const auto result = NoiseTest::Render(*MakeDiffuse(intensity), source, 64);
        ASSERT_TRUE(result);
        const int bound = int(512.0 * double(float(intensity))); // 25 and 10 pixels
        int largestX = 0, largestY = 0, moved = 0;
        for (int y = 0; y < size; ++y)
            for (int x = 0; x < size; ++x) {
                const auto [fromX, fromY] = Origin(*result, x, y);
                ASSERT_LE(std::abs(fromX - x), bound) << intensity << " at (" << x << ", " << y << ")";
                ASSERT_LE(std::abs(fromY - y), bound) << intensity << " at (" << x << ", " << y << ")";
                largestX = std::max(largestX, std::abs(fromX - x));
                largestY = std::max(largestY, std::abs(fromY - y));
                moved += fromX != x || fromY != y;
            }
        // A square, not a disc: both axes reach the bound, and corners are reached too.
        EXPECT_EQ(largestX, bound) << intensity;
        EXPECT_EQ(largestY, bound) << intensity;
        EXPECT_GT(moved, size * size * 9 / 10) << intensity;
    }
}

TEST(DiffuseValues, ViewScaleWidensTheScatterAndSeedsFollowTheView) {
    const auto source = MakePlaces(48, 48);
    const auto command = MakeDiffuse(0.01);
    // Zoom 2: sigma doubles (√(((2 + 0)² + (0 + 2)²) × 0.5) = 2), so offsets reach 2 × 5 = 10 pixels.
    const auto params = command->GetSamplerParams({0.0, 0.0, 48.9, 48.0}, Affine(2, 0, 0, 0, 2, 0));
    EXPECT_EQ(params.block[6], float(0.01 * 2.0));
    EXPECT_EQ(params.block[7], 48.0f) << "the width is truncated";
    EXPECT_EQ(params.block[0], 0.5f) << "the sampler affine is the view's inverse";
    const auto singular = command->GetSamplerParams({0.0, 0.0, 48.0, 48.0}, Affine(1e-70, 0, 3, 0, 1e-70, 1));
    EXPECT_EQ(singular.block[0], 0.0f) << "a determinant of 1e-140 counts as singular";
    EXPECT_EQ(singular.block[2], -3.0f);
    EXPECT_EQ(singular.block[5], -1.0f);

    const auto zoomed = NoiseTest::Render(*command, source, 0, nullptr, {{}, Affine(2, 0, 0, 0, 2, 0)});
    ASSERT_TRUE(zoomed);
    int largest = 0;
    for (int y = 0; y < 48; ++y)
        for (int x = 0; x < 48; ++x) {
            const auto [fromX, fromY] = Origin(*zoomed, x, y);
            largest = std::max({largest, std::abs(fromX - x), std::abs(fromY - y)});
        }
    EXPECT_GT(largest, 5);
    EXPECT_LE(largest, 10);
}

// The second seeding step maps the integer location (not its centre) through the sampler affine and takes the
// integer part toward zero. Hand values: a 48 × 48 layer under the view x' = 0.5 x + 10, y' = 0.5 y + 10.25,
// whose inverse (the sampler affine) is x' = 2x − 20, y' = 2y − 20.5; intensity 0.1 and the view's scale
// 0.5 give sigma 0.05f. Seed Hash(ty × 48 + tx) with 32-bit wrap-around; draws r1, r2 give
// dx = trunc((r1/65535 × 1024 − 512) × sigma), dy likewise.
//   (3, 4):   t = (−14, trunc(−12.5) = −12), Hash(4294966706) = 4023617639, draws 64028, 49253:
//             (24.42, 12.88) -> (+24, +12): source (27, 16)
//   (9, 1):   t = (−2, trunc(−18.5) = −18), Hash(4294966430) = 2379760769, draws 38483, 36498:
//             (4.47, 2.92) -> (+4, +2): source (13, 3)
//   (4, 3):   t = (−12, trunc(−14.5) = −14), Hash(4294966612) = 649171369, draws 27581, 37102:
//             (−4.05, 3.39) -> (−4, +3): source (0, 6)
//   (30, 20): t = (40, trunc(19.5) = 19), Hash(952) = 2095827869, draws 36431, 24757:
//             (2.86, −6.26) -> (+2, −6): source (32, 14)
//   (18, 40): t = (16, 59), Hash(2848) = 1047192052, draws 20166, 15332: (−9.84, −13.62) -> (−9, −13):
//             source (9, 27)
// The pixel centre (+0.5, then a floor) would seed (3, 4) from (−13, −12), (9, 1) from (−1, −18), (30, 20)
// from (41, 20); a floor of the integer location's image would seed (3, 4) from (−14, −13).
TEST(DiffuseValues, SeedsFromTheIntegerLocationUnderAScaledView) {
    const auto source = MakePlaces(48, 48);
    const auto command = MakeDiffuse(0.1);
    const PipelineTest::View view{{}, Affine(0.5, 0, 10, 0, 0.5, 10.25)};
    const auto params = command->GetSamplerParams({0.0, 0.0, 48.0, 48.0}, view.transform);
    ASSERT_EQ(params.block[0], 2.0f);
    ASSERT_EQ(params.block[2], -20.0f);
    ASSERT_EQ(params.block[5], -20.5f);
    ASSERT_EQ(params.block[6], 0.05f);
    const struct {
        int x, y, fromX, fromY;
    } cases[] = {{3, 4, 27, 16}, {9, 1, 13, 3}, {4, 3, 0, 6}, {30, 20, 32, 14}, {18, 40, 9, 27}};
    const auto device = PipelineTest::OpenCLDevice();
    for (const bool onDevice : {false, true}) {
        if (onDevice && !device) continue;
        for (const int tile : {0, 16}) {
            const auto result = NoiseTest::Render(*command, source, tile, onDevice ? device : nullptr, view);
            ASSERT_TRUE(result);
            for (const auto& c : cases)
                EXPECT_EQ(Origin(*result, c.x, c.y), std::make_pair(c.fromX, c.fromY))
                    << (onDevice ? "device" : "processor") << ", tiles of " << tile << ": pixel (" << c.x
                    << ", " << c.y << ")";
        }
    }
    if (!device) GTEST_SKIP() << "no OpenCL device: the hand values were checked on the processor only";
}

class DiffuseFormats : public testing::TestWithParam<PixelFormat> {};

TEST_P(DiffuseFormats, EveryTilingAndBothPathsPickTheSameNeighbour) {
    const PixelFormat format = GetParam();
    const auto source = PipelineTest::MakeImage(format, 101, 47, 11u);
    const auto device = PipelineTest::OpenCLDevice();
    const double c = std::cos(0.4), s = std::sin(0.4);
    const NoiseTest::View views[] = {
        {},
        {{}, Affine(0.5, 0, 0, 0, 0.5, 0)},
        {{}, Affine(c, -s, 12.5, s, c, -7.25)},
        {{40.0, 25.0, 141.0, 72.0}, Affine(1, 0, 40, 0, 1, 25)},
    };
    for (const double intensity : {0.03, 0.2}) {
        const auto command = MakeDiffuse(intensity);
        for (std::size_t v = 0; v < std::size(views); ++v) {
            const auto reference = NoiseTest::Render(*command, source, 0, nullptr, views[v]);
            ASSERT_TRUE(reference);
            EXPECT_TRUE(Compare(*reference, *source)) << "nothing moved";
            for (const bool onDevice : {false, true}) {
                if (onDevice && !device) continue;
                // 16 and 37 put tile borders within the scatter distance of most pixels.
                for (const int tile : {0, 16, 37, 64}) {
                    if (!onDevice && tile == 0) continue;
                    const auto result =
                        NoiseTest::Render(*command, source, tile, onDevice ? device : nullptr, views[v]);
                    ASSERT_TRUE(result);
                    if (const auto difference = Compare(*result, *reference))
                        ADD_FAILURE() << Raster::GetPixelFormatName(format) << ", intensity " << intensity
                                      << ", view " << v << ", " << (onDevice ? "device" : "processor")
                                      << ", tiles " << tile << ": " << difference->Describe();
                }
            }
        }
    }
    if (!device) GTEST_SKIP() << "no OpenCL device: only processor tilings were compared";
}

TEST_P(DiffuseFormats, ZeroIntensityChangesNothing) {
    const auto source = PipelineTest::MakeImage(GetParam(), 45, 20, 9u);
    const auto result = NoiseTest::Render(*MakeDiffuse(0.0), source, 32);
    ASSERT_TRUE(result);
    EXPECT_FALSE(Compare(*result, *source));
    if (const auto device = PipelineTest::OpenCLDevice()) {
        const auto onDevice = NoiseTest::Render(*MakeDiffuse(0.0), source, 32, device);
        ASSERT_TRUE(onDevice);
        EXPECT_FALSE(Compare(*onDevice, *source));
    }
}

// A tile reads only inside the input rectangle the command asks for: render one tile of the destination
// alone and check where every pixel of it came from.
TEST(DiffuseRectangles, ATileReadsOnlyInsideItsInputRectangle) {
    const int size = 200;
    const auto source = MakePlaces(size, size);
    const auto command = MakeDiffuse(0.06); // 30.72: 31 pixels each side
    const Kernel::RectT<int> tile{64, 96, 96, 128};
    Kernel::RectT<double> input{double(tile.left), double(tile.top), double(tile.right), double(tile.bottom)};
    command->PrepareInputRectangle(input);
    EXPECT_EQ(input, (Kernel::RectT<double>{33.0, 65.0, 127.0, 159.0}));
    Kernel::RectT<double> output = input;
    EXPECT_TRUE(command->PrepareOutputRectangle(output));
    EXPECT_DOUBLE_EQ(output.left, 33.0 - 30.72);

    RasterTools::RenderTarget target;
    target.source.pixels = source;
    target.destination.pixels = PipelineTest::MakeDestination(*command, *source);
    target.bounds = {0.0, 0.0, double(size), double(size)};
    target.rect = tile;
    ASSERT_EQ(command->Render(target), RasterTools::RenderPath::Processor);
    int nearBorder = 0;
    for (int y = tile.top; y < tile.bottom; ++y)
        for (int x = tile.left; x < tile.right; ++x) {
            const auto [fromX, fromY] = Origin(*target.destination.pixels, x, y);
            ASSERT_TRUE(fromX >= input.left && fromX < input.right && fromY >= input.top &&
                        fromY < input.bottom)
                << "(" << x << ", " << y << ") read (" << fromX << ", " << fromY << ")";
            nearBorder +=
                fromX < tile.left || fromX >= tile.right || fromY < tile.top || fromY >= tile.bottom;
        }
    EXPECT_GT(nearBorder, 0) << "some pixels should come from beyond the tile";
    // The same pixels as the untiled render.
    const auto whole = NoiseTest::Render(*command, source, 0);
    ASSERT_TRUE(whole);
    for (int y = tile.top; y < tile.bottom; ++y)
        for (int x = tile.left; x < tile.right; ++x)
            ASSERT_EQ(ReadComponents(*target.destination.pixels, x, y), ReadComponents(*whole, x, y));

    // 0.3 × 512 = 153.6: the input grows by 154 whole pixels, the output by 153.6; the unbounded rectangle
    // stays as it is.
    const auto point3 = MakeDiffuse(0.3);
    Kernel::RectT<double> in{0.0, 0.0, 10.0, 10.0}, out = in;
    point3->PrepareInputRectangle(in);
    EXPECT_TRUE(point3->PrepareOutputRectangle(out));
    EXPECT_EQ(in, (Kernel::RectT<double>{-154.0, -154.0, 164.0, 164.0}));
    EXPECT_DOUBLE_EQ(out.left, -153.6);
    EXPECT_DOUBLE_EQ(out.top, -153.6);
    EXPECT_DOUBLE_EQ(out.right, 163.6);
    EXPECT_DOUBLE_EQ(out.bottom, 163.6);
    auto unbounded = Kernel::RectT<double>::Unbounded();
    point3->PrepareInputRectangle(unbounded);
    EXPECT_TRUE(unbounded.IsUnbounded());
    EXPECT_TRUE(point3->PrepareOutputRectangle(unbounded));
    EXPECT_TRUE(unbounded.IsUnbounded());
}

// The span form (identity transform) against the per-pixel form, for spans inside and beyond the image,
// offsets small and huge (past 2^22 the span form falls back), places far from the origin, and seeds under
// the identity and a scaled, shifted sampler affine.
TEST(DiffuseSpan, MatchesThePerPixelDefinition) {
    const auto image = MakePlaces(50, 20);
    using Sampler = RasterTools::DiffuseSampler;
    using Transform = Raster::IdentityTransform;
    const Raster::BitmapOf<PixelFormat::RGBA16> bitmap(image.Get());
    const Transform::Params t{};
    for (const float sigma : {0.0f, 0.01f, 0.3f, 5000.0f, 1e6f, 3e38f})
        for (const float scale : {1.0f, 2.0f}) {
            Sampler::Params params;
            params.block[Sampler::AffineIndex + 0] = scale;
            params.block[Sampler::AffineIndex + 2] = scale == 1.0f ? 0.0f : -20.0f;
            params.block[Sampler::AffineIndex + 4] = scale;
            params.block[Sampler::AffineIndex + 5] = scale == 1.0f ? 0.0f : -20.5f;
            params.block[Sampler::SigmaIndex] = sigma;
            params.block[Sampler::WidthIndex] = 50.0f;
            for (const int y : {-3, 0, 7, 19, 25, 2097150, -2097153})
                for (const int x0 : {-40, -1, 0, 13, 32, 45, 2097140})
                    for (const int n : {1, 17, 32}) {
                        Raster::KernelMath::ushort4 span[Raster::SpanLength];
                        Sampler::SampleSpan<Transform, Raster::Safe>(bitmap, t, params, x0, y, n, span);
                        for (int i = 0; i < n; ++i) {
                            const auto pixel = Sampler::Sample<Transform, Raster::Safe>(
                                bitmap, Raster::KernelMath::make_int2(x0 + i, y), t, params);
                            ASSERT_EQ(pixel, span[i]) << "sigma " << sigma << ", scale " << scale << ", ("
                                                      << x0 + i << ", " << y << ")";
                        }
                    }
        }
}

std::string FormatName(const testing::TestParamInfo<PixelFormat>& info) {
    return std::string(Raster::GetPixelFormatName(info.param));
}

INSTANTIATE_TEST_SUITE_P(Layer, DiffuseFormats, testing::ValuesIn(RasterTools::LayerFormats), FormatName);

} // namespace
