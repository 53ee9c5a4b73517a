// Voronoi: the seed spiral and the 64-bit generator worked out by hand, sites inside the middle 60% of their
// cells, every pixel in the cell of its closest site, border lines and their one-pixel ramp, the view's scale
// and origin, and the command's answers; on the processor and, where there is one, the OpenCL device.
//
// Hand values. Seed(r, c) = 2 × (1 + (d − 2)² + (r + R) × d + (c + R)) with R = max(|r|, |c|), d = 2R + 1
// (2 at the origin): (0, 0) -> 2, (0, 1) -> 2 × (1 + 1 + 3 + 2) = 14, (1, 1) -> 2 × (1 + 1 + 6 + 2) = 20,
// (-2, -2) -> 2 × (1 + 9 + 0 + 0) = 20, (-1, -1) -> 2 × (1 + 1) = 4, and (2^28, 0) -> 2 × (1 + (2^29 - 1)² +
// 2^29 (2^29 + 1) + 2^28) = 2^60 - 2^29 + 4, which needs all 64 bits.
// The generator on v (mod 2^64): v × 3935559000370003845 + 2691343689449507681, xor-shifts 21 right, 37 left,
// 4 right, × 4768777513237032717, xor-shifts 20 left, 41 right, 5 left, then v / 2^64 as a float:
//   2 -> 0x48eb9f74acc52358 -> 0.28484532     3 -> 0x7451f8627ed9f4d5 -> 0.45437577
//   20 -> 0xee482b40b9fc0ea4 -> 0.93078870    21 -> 0x023f1e12b86e97d0 -> 0.00877560
//   14 -> 0x1551f10df2f79426 -> 0.08328158    15 -> 0x0c2af89992762a7c -> 0.04753069
// Sites for cells of 32 at the origin: x = floor(32 (col + 0.5 + 0.6 (r1 − 0.5))) + 0.5, y likewise with r2:
//   (0, 0): 32 × 0.37090719 = 11.87, 32 × 0.47262655 = 15.12 -> (11.5, 15.5)
//   (0, 1): 32 × 1.24996895 = 39.999, 32 × 0.22851841 = 7.31 -> (39.5, 7.5)
//   (1, 1): 32 × 1.75847322 = 56.27, 32 × 1.20526536 = 38.57 -> (56.5, 38.5)
//   (-2, -2): the same jitter as (1, 1): 32 × (-1.24152678) = -39.73, 32 × (-1.79473464) = -57.43
//             -> (-39.5, -57.5), that is (24.5, 6.5) from its cell's corner as (1, 1) is.

#include "PipelineTestSupport.h"

#include "filters/Catalogue.h"
#include "filters/lighting/RasterVoronoiCommand.h"
#include "host/kernel/Simd.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <vector>

namespace {

using namespace RasterTools;
using PipelineTest::Compare;
using PipelineTest::ReadComponents;
using Raster::PixelFormat;

Raster::AffineTransform::Params Affine(double a, double b, double c, double d, double e, double f) {
    Raster::AffineTransform::Params p;
    p.m = {a, b, c, d, e, f};
    return p;
}

Kernel::Counted<RasterVoronoiCommand> MakeVoronoi(double size, double lineWidth) {
    return Kernel::MakeCounted<RasterVoronoiCommand>(false, size, lineWidth);
}

// The defining formulas once more, in the test's own words, for checks over many pixels.
std::uint64_t Seed(std::int64_t r, std::int64_t c) {
    const std::int64_t radius = std::max(std::abs(r), std::abs(c));
    if (radius == 0) return 2;
    const std::uint64_t d = std::uint64_t(2 * radius + 1);
    return 2 * (1 + (d - 2) * (d - 2) + std::uint64_t(r + radius) * d + std::uint64_t(c + radius));
}
float Random(std::uint64_t v) {
    v *= 3935559000370003845ull;
    v += 2691343689449507681ull;
    v ^= v >> 21;
    v ^= v << 37;
    v ^= v >> 4;
    v *= 4768777513237032717ull;
    v ^= v << 20;
    v ^= v >> 41;
    v ^= v << 5;
    return 0x1p-64f * float(v);
}
struct Point {
    double x, y;
};
Point Site(int row, int col, float cell, float originX = 0.0f, float originY = 0.0f) {
    const std::uint64_t seed = Seed(row, col);
    const float jx = 0.5f + 0.6f * (Random(seed) - 0.5f);
    const float jy = 0.5f + 0.6f * (Random(seed + 1) - 0.5f);
    return {originX + (std::floor(cell * (float(col) + jx)) + 0.5f),
            originY + (std::floor(cell * (float(row) + jy)) + 0.5f)};
}

// What the formulas say about pixel (x, y) without a view: its closest site (first of equals in row-major
// order over the 3 × 3 cells around its own), how much farther the runner-up is, and its distance to the
// nearest bisector of the closest site's cell.
struct Nearest {
    Point site;
    double margin; // distance to the second closest site less the distance to the closest
    double border; // distance to the nearest bisector
};
Nearest Closest(int x, int y, float cell) {
    const int row = int(float(y) / cell), col = int(float(x) / cell);
    double best = std::numeric_limits<double>::infinity(), second = best;
    int bestRow = 0, bestCol = 0;
    for (int r = row - 1; r <= row + 1; ++r)
        for (int c = col - 1; c <= col + 1; ++c) {
            const Point s = Site(r, c, cell);
            const double d = std::hypot(s.x - x, s.y - y);
            if (d < best) {
                second = best;
                best = d;
                bestRow = r;
                bestCol = c;
            } else if (d < second) {
                second = d;
            }
        }
    const Point a = Site(bestRow, bestCol, cell);
    double border = std::numeric_limits<double>::infinity();
    for (int r = bestRow - 1; r <= bestRow + 1; ++r)
        for (int c = bestCol - 1; c <= bestCol + 1; ++c) {
            if (r == bestRow && c == bestCol) continue;
            const Point b = Site(r, c, cell);
            const double dx = b.x - a.x, dy = b.y - a.y;
            border = std::min(border, std::fabs((x - (a.x + b.x) / 2) * dx + (y - (a.y + b.y) / 2) * dy) /
                                          std::hypot(dx, dy));
        }
    return {a, second - best, border};
}

// RGBAUF pixels that name their place: red x / 256, green y / 256, blue 0.25, alpha varied; no colour
// component is 0, so a black line shows.
Kernel::Counted<Raster::DynamicBuffer> MakePlaces(int width, int height) {
    auto image = Raster::DynamicBuffer::Create(width, height, PixelFormat::RGBAUF);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x) {
            const Raster::KernelMath::float4 p{float(x + 1) / 256.0f, float(y + 1) / 256.0f, 0.25f,
                                               float((x * 7 + y * 3) % 10 + 1) / 10.0f};
            std::memcpy(image->RowBytes(y) + std::size_t(x) * sizeof p, &p, sizeof p);
        }
    return image;
}

// Renders on the processor, and on the OpenCL device where there is one; each result goes to check.
template <class Check>
void OnBothPaths(const PipelineCommand& command, const Kernel::Counted<Raster::DynamicBuffer>& source,
                 const PipelineTest::View& view, Check check) {
    const auto device = PipelineTest::OpenCLDevice();
    for (const bool onDevice : {false, true}) {
        if (onDevice && !device) continue;
        SCOPED_TRACE(onDevice ? "device" : "processor");
        const auto result = PipelineTest::Render(command, source, 0, onDevice ? device : nullptr, view);
        ASSERT_TRUE(result);
        check(*result);
    }
}

TEST(VoronoiValues, SeedsAndTheGeneratorAsWorkedOutByHand) {
    using namespace VoronoiMath;
    EXPECT_EQ(VoronoiSeed(0, 0), 2u);
    EXPECT_EQ(VoronoiSeed(0, 1), 14u);
    EXPECT_EQ(VoronoiSeed(-1, -1), 4u);
    EXPECT_EQ(VoronoiSeed(1, 1), 20u);
    EXPECT_EQ(VoronoiSeed(-2, -2), 20u) << "the formula's collision is kept";
    EXPECT_EQ(VoronoiSeed(1 << 28, 0), (1ull << 60) - (1ull << 29) + 4u) << "64-bit arithmetic";
    const struct {
        std::uint64_t seed;
        float value;
    } draws[] = {{2, 0.28484532f},  {3, 0.45437577f},  {20, 0.93078870f},
                 {21, 0.00877560f}, {14, 0.08328158f}, {15, 0.04753069f}};
    for (const auto& d : draws)
        EXPECT_NEAR(VoronoiRandom(d.seed), d.value, 2e-8f) << "seed " << d.seed;
    // The largest draw stays below 1 only as far as a float can tell: v / 2^64 is rounded.
    EXPECT_LE(VoronoiRandom(0), 1.0f);
}

TEST(VoronoiValues, SitesAreJitteredPixelCentresWithinTheMiddleOfTheirCells) {
    using namespace VoronoiMath;
    const float2 origin = make_float2(0.0f, 0.0f);
    const struct {
        int row, col;
        float x, y;
    } sites[] = {{0, 0, 11.5f, 15.5f}, {0, 1, 39.5f, 7.5f}, {1, 1, 56.5f, 38.5f}, {-2, -2, -39.5f, -57.5f}};
    for (const auto& s : sites) {
        const float2 at = VoronoiSite(s.row, s.col, 32.0f, origin);
        EXPECT_EQ(at.x, s.x) << s.row << ", " << s.col;
        EXPECT_EQ(at.y, s.y) << s.row << ", " << s.col;
    }
    // Cells sharing a seed share the jitter within their cells.
    const float2 a = VoronoiSite(1, 1, 32.0f, origin), b = VoronoiSite(-2, -2, 32.0f, origin);
    EXPECT_EQ(a.x - 32.0f, b.x + 64.0f);
    EXPECT_EQ(a.y - 32.0f, b.y + 64.0f);
    // Everywhere, for odd cell sizes and an origin off the pixel grid: a pixel centre (relative to the
    // origin) within the middle 60% of the cell, give or take the floor's pixel.
    for (const float cell : {2.0f, 7.25f, 32.0f})
        for (int row = -40; row <= 40; row += 3)
            for (int col = -40; col <= 40; col += 7) {
                const float2 s = VoronoiSite(row, col, cell, make_float2(3.0f, -5.0f));
                const float x = s.x - 3.0f, y = s.y + 5.0f;
                ASSERT_EQ(x - std::floor(x), 0.5f);
                ASSERT_EQ(y - std::floor(y), 0.5f);
                ASSERT_GE(x + 0.5f, cell * (float(col) + 0.2f) - 1e-3f) << cell << " " << row << " " << col;
                ASSERT_LE(x - 0.5f, cell * (float(col) + 0.8f) + 1e-3f) << cell << " " << row << " " << col;
                ASSERT_GE(y + 0.5f, cell * (float(row) + 0.2f) - 1e-3f) << cell << " " << row << " " << col;
                ASSERT_LE(y - 0.5f, cell * (float(row) + 0.8f) + 1e-3f) << cell << " " << row << " " << col;
            }
}

// Every pixel away from borders takes the colour under its closest site (the site's pixel centre is
// (k + 0.5): pixel k); its alpha stays its own. No line without a line width.
TEST(VoronoiRender, PixelsTakeTheColourUnderTheirClosestSite) {
    constexpr int Width = 96, Height = 64;
    constexpr float Cell = 16.0f;
    const auto source = MakePlaces(Width, Height);
    OnBothPaths(*MakeVoronoi(Cell, 0.0), source, {}, [&](const Raster::DynamicBuffer& result) {
        int checked = 0;
        for (int y = 0; y < Height; ++y)
            for (int x = 0; x < Width; ++x) {
                const auto got = ReadComponents(result, x, y);
                ASSERT_EQ(got[3], ReadComponents(*source, x, y)[3]) << "alpha at (" << x << ", " << y << ")";
                ASSERT_FALSE(got[0] == 0.0 && got[1] == 0.0 && got[2] == 0.0)
                    << "a line at " << x << ", " << y;
                const Nearest n = Closest(x, y, Cell);
                // Sites less than √2 pixels farther lend colour: only clear winners are checked.
                if (n.margin < 1.5) continue;
                const int sx = std::clamp(int(n.site.x), 0, Width - 1),
                          sy = std::clamp(int(n.site.y), 0, Height - 1);
                const auto expected = ReadComponents(*source, sx, sy);
                for (int c = 0; c < 3; ++c)
                    ASSERT_EQ(got[c], expected[c]) << "(" << x << ", " << y << ") should have the colour of ("
                                                   << sx << ", " << sy << ")";
                ++checked;
            }
        EXPECT_GT(checked, Width * Height * 3 / 4);
    });
}

// Lines of 25% of 16 pixels: black (w = 1) within 1.5 pixels of a bisector, untouched beyond 2.5, and a
// linear ramp between: colour (1 - w) × cell colour with w = 1 - (m - 2 + 0.5).
TEST(VoronoiRender, BorderLinesHaveAOnePixelRamp) {
    constexpr int Width = 96, Height = 64;
    constexpr float Cell = 16.0f;
    const auto source = MakePlaces(Width, Height);
    OnBothPaths(*MakeVoronoi(Cell, 25.0), source, {}, [&](const Raster::DynamicBuffer& result) {
        int black = 0, ramp = 0, clear = 0;
        for (int y = 0; y < Height; ++y)
            for (int x = 0; x < Width; ++x) {
                const auto got = ReadComponents(result, x, y);
                ASSERT_EQ(got[3], ReadComponents(*source, x, y)[3]);
                const Nearest n = Closest(x, y, Cell);
                if (n.border < 1.5 - 1e-3) {
                    ASSERT_EQ(got[0] + got[1] + got[2], 0.0) << "(" << x << ", " << y << ") lies on a line";
                    ++black;
                    continue;
                }
                if (n.margin < 1.5) continue; // colour blended from several cells
                const auto cellColour = ReadComponents(*source, std::clamp(int(n.site.x), 0, Width - 1),
                                                       std::clamp(int(n.site.y), 0, Height - 1));
                const double w = n.border > 2.5 ? 0.0 : 1.0 - (n.border - 1.5);
                for (int c = 0; c < 3; ++c)
                    ASSERT_NEAR(got[c], (1.0 - w) * cellColour[c], 1e-5)
                        << "(" << x << ", " << y << ") at " << n.border << " from the border";
                ++(w > 0.0 ? ramp : clear);
            }
        EXPECT_GT(black, 300);
        EXPECT_GT(ramp, 200);
        EXPECT_GT(clear, Width * Height * 2 / 5);
    });
}

// With the grid's origin at (0.5, 0.5) sites fall on whole coordinates, and the pixel there is exactly on
// its site: a minimum distance of 0 must not spoil the colour (every other site's scale is -infinity).
TEST(VoronoiRender, APixelExactlyOnASiteTakesItsOwnCellsColour) {
    const auto source = MakePlaces(48, 48);
    const PipelineTest::View view{{}, Affine(1.0, 0.0, 0.5, 0.0, 1.0, 0.5)};
    // Site (0, 0) of cells of 32 is (11.5, 15.5) from the origin: (12, 16). Through the view's inverse it
    // reads (11.5, 15.5), pixel (11, 15); pixel (12, 16) reads its alpha at (12, 16).
    OnBothPaths(*MakeVoronoi(32.0, 10.0), source, view, [&](const Raster::DynamicBuffer& result) {
        const auto got = ReadComponents(result, 12, 16);
        const auto cell = ReadComponents(*source, 11, 15);
        EXPECT_EQ(got[0], cell[0]);
        EXPECT_EQ(got[1], cell[1]);
        EXPECT_EQ(got[2], cell[2]);
        EXPECT_EQ(got[3], ReadComponents(*source, 12, 16)[3]);
    });
}

TEST(VoronoiView, CellsFollowTheViewsScaleAndNeverGoBelowTwoPixels) {
    const auto command = MakeVoronoi(32.0, 10.0);
    const auto zoomed = command->GetSamplerParams(Affine(2.0, 0.0, 7.0, 0.0, 2.0, -3.5));
    EXPECT_EQ(zoomed.block[0], 64.0f) << "a zoom of 2 doubles the cell in output pixels";
    EXPECT_EQ(zoomed.block[1], 6.4f) << "lines are 10% of the cell";
    EXPECT_EQ(zoomed.block[2], 7.0f);
    EXPECT_EQ(zoomed.block[3], -3.5f);
    EXPECT_EQ(command->GetSamplerParams(Affine(0.0, -1.0, 0.0, 1.0, 0.0, 0.0)).block[0], 32.0f) << "rotated";
    EXPECT_EQ(command->GetSamplerParams(Affine(0.01, 0.0, 0.0, 0.0, 0.01, 0.0)).block[0], 2.0f);
    EXPECT_EQ(command->GetSamplerParams(Affine(1e-70, 0.0, 0.0, 0.0, 1e-70, 0.0)).block[0],
              float(RasterVoronoiCommand::CellLimit))
        << "a singular view: the inverse's scale is 0";
    EXPECT_EQ(MakeVoronoi(0.0, 50.0)->GetSamplerParams({}).block[0], 2.0f);
    EXPECT_EQ(MakeVoronoi(0.0, 50.0)->GetSamplerParams({}).block[1], 1.0f);

    // Size 8 seen at zoom 2 is size 16 on the layer scaled up by 2: the same sites in output pixels, and
    // each reads the source pixel under it. The pattern is 24 pixels a side; both sources continue its edge
    // outwards as the filter's reads do, so that sites beyond it read alike.
    constexpr int Side = 48;
    const auto pattern = MakePlaces(Side / 2, Side / 2);
    const auto PatternAt = [&](int x, int y) {
        return reinterpret_cast<const Raster::KernelMath::float4*>(
            pattern->RowBytes(std::min(y, Side / 2 - 1)))[std::min(x, Side / 2 - 1)];
    };
    auto source = Raster::DynamicBuffer::Create(Side, Side, PixelFormat::RGBAUF);
    auto doubled = Raster::DynamicBuffer::Create(Side, Side, PixelFormat::RGBAUF);
    for (int y = 0; y < Side; ++y) {
        auto* row = reinterpret_cast<Raster::KernelMath::float4*>(source->RowBytes(y));
        auto* twice = reinterpret_cast<Raster::KernelMath::float4*>(doubled->RowBytes(y));
        for (int x = 0; x < Side; ++x) {
            row[x] = PatternAt(x, y);
            twice[x] = PatternAt(x / 2, y / 2);
        }
    }
    const auto viewed =
        PipelineTest::Render(*MakeVoronoi(8.0, 20.0), source, 0, nullptr, {{}, Affine(2, 0, 0, 0, 2, 0)});
    const auto plain = PipelineTest::Render(*MakeVoronoi(16.0, 20.0), doubled, 0);
    ASSERT_TRUE(viewed && plain);
    const auto difference = Compare(*viewed, *plain);
    EXPECT_FALSE(difference) << difference->Describe();

    // Sizes below 2 give cells of 2.
    const auto one = PipelineTest::Render(*MakeVoronoi(1.0, 0.0), source, 0);
    const auto two = PipelineTest::Render(*MakeVoronoi(2.0, 0.0), source, 0);
    ASSERT_TRUE(one && two);
    EXPECT_FALSE(Compare(*one, *two));
}

// The grid is fixed to the layer's origin in the view, not to tiles: a shifted, oddly scaled view renders
// the same pixels whole and in tiles, on both paths.
TEST(VoronoiView, TheSamePixelGetsTheSameSiteInEveryTiling) {
    const auto source = PipelineTest::MakeImage(PixelFormat::RGBA8, 70, 50, 3u);
    const auto command = MakeVoronoi(9.0, 30.0);
    const PipelineTest::View view{{}, Affine(1.25, 0.0, 5.5, 0.0, 1.25, -3.25)};
    const auto whole = PipelineTest::Render(*command, source, 0, nullptr, view);
    ASSERT_TRUE(whole);
    const auto device = PipelineTest::OpenCLDevice();
    for (const int tile : {16, 23})
        for (const bool onDevice : {false, true}) {
            if (onDevice && !device) continue;
            const auto tiled =
                PipelineTest::Render(*command, source, tile, onDevice ? device : nullptr, view);
            ASSERT_TRUE(tiled);
            const auto difference = Compare(*whole, *tiled);
            EXPECT_FALSE(difference) << "tiles of " << tile << (onDevice ? " on the device" : "") << ": "
                                     << difference->Describe();
        }
}

TEST(VoronoiCommand, AnswersTransformsAndAreas) {
    auto command = MakeVoronoi(10.5, 30.0);
    EXPECT_EQ(command->GetSize(), 10.5);
    EXPECT_EQ(command->GetLineWidth(), 30.0);
    EXPECT_TRUE(command->DoesAnything());
    EXPECT_FALSE(MakeVoronoi(0.0, 30.0)->DoesAnything());
    EXPECT_TRUE(MakeVoronoi(2e-6, 30.0)->DoesAnything());

    // Both areas grow by ceil(10.5) = 11 on every side; the unbounded sentinel stays.
    Kernel::RectT<double> in{0.0, 0.0, 20.0, 10.0}, out = in;
    command->PrepareInputRectangle(in);
    EXPECT_TRUE(command->PrepareOutputRectangle(out));
    EXPECT_EQ(in, (Kernel::RectT<double>{-11.0, -11.0, 31.0, 21.0}));
    EXPECT_EQ(out, in);
    auto unbounded = Kernel::RectT<double>::Unbounded();
    command->PrepareInputRectangle(unbounded);
    EXPECT_TRUE(unbounded.IsUnbounded());
    EXPECT_TRUE(command->PrepareOutputRectangle(unbounded));
    EXPECT_TRUE(unbounded.IsUnbounded());

    // The size scales with the layer by √(((m0 + m1)² + (m3 + m4)²) / 2); the line width stays.
    command->ApplyTransform(Affine(3.0, 0.0, 100.0, 0.0, 3.0, -50.0));
    EXPECT_DOUBLE_EQ(command->GetSize(), 31.5);
    EXPECT_EQ(command->GetLineWidth(), 30.0);
    command->ApplyTransform(Affine(0.0, -2.0, 0.0, 2.0, 0.0, 0.0)); // rotated a quarter turn, zoomed 2
    EXPECT_DOUBLE_EQ(command->GetSize(), 63.0);
    // The inverse divides by the scale of the inverse map: 63 / (1/4) for a zoom of 4.
    EXPECT_TRUE(command->ApplyInverseTransform(Affine(4.0, 0.0, 3.0, 0.0, 4.0, 3.0)));
    EXPECT_DOUBLE_EQ(command->GetSize(), 252.0);
    EXPECT_FALSE(command->ApplyInverseTransform(Affine(0.0, 0.0, 3.0, 0.0, 0.0, 3.0))) << "singular";
    EXPECT_DOUBLE_EQ(command->GetSize(), 252.0);
    // Beyond the accepted sizes the size stays at the limit.
    command->ApplyTransform(Affine(1e300, 0.0, 0.0, 0.0, 1e300, 0.0));
    EXPECT_EQ(command->GetSize(), VoronoiFilter::kSizeLimit);
    EXPECT_EQ(command->GetLineWidth(), 30.0);
}

TEST(VoronoiCommand, HostileValuesAreBoundedAndRenderAlikeOnBothPaths) {
    const double nan = std::numeric_limits<double>::quiet_NaN();
    EXPECT_EQ(MakeVoronoi(nan, nan)->GetSize(), 32.0) << "a NaN takes the default";
    EXPECT_EQ(MakeVoronoi(-5.0, -1.0)->GetSize(), 0.0);
    EXPECT_EQ(MakeVoronoi(-5.0, -1.0)->GetLineWidth(), 0.0);
    EXPECT_EQ(MakeVoronoi(1e300, 1e300)->GetSize(), VoronoiFilter::kSizeLimit);
    EXPECT_EQ(MakeVoronoi(1e300, 1e300)->GetLineWidth(), 100.0);

    // Far-off grid origins, huge cells and cells of 2 with full lines: the processor and the device give the
    // same pixels, nothing crashes.
    const auto source = PipelineTest::MakeImage(PixelFormat::RGBA16, 33, 21, 9u);
    const auto device = PipelineTest::OpenCLDevice();
    const struct {
        double size, width;
        PipelineTest::View view;
    } cases[] = {
        {0.0, 100.0, {}},
        {VoronoiFilter::kSizeLimit, 50.0, {}},
        {12.0, 40.0, {{}, Affine(1.0, 0.0, 3e9, 0.0, 1.0, -7e12)}},
        {12.0, 40.0, {{}, Affine(1.0, 0.0, 1e300, 0.0, 1.0, 0.0)}},
        {12.0, 40.0, {{}, Affine(1e6, 0.0, 0.0, 0.0, -1e6, 0.0)}},
    };
    for (const auto& c : cases) {
        const auto command = MakeVoronoi(c.size, c.width);
        const auto processor = PipelineTest::Render(*command, source, 0, nullptr, c.view);
        ASSERT_TRUE(processor);
        if (!device) continue;
        const auto onDevice = PipelineTest::Render(*command, source, 0, device, c.view);
        ASSERT_TRUE(onDevice);
        const auto difference = Compare(*processor, *onDevice);
        EXPECT_FALSE(difference) << "size " << c.size << ": " << difference->Describe();
    }
}

// The processor works along a row in runs of one grid column, eight pixels at a time where it can, and keeps
// the sites between rows. Rows far wider than the cells (the cached columns move on many times), cells wider
// than a run, and a shifted view whose column 0 is two cells wide (truncation toward zero): the SIMD and
// plain builds and the device give the same pixels, and a render after other ones gives the same as before.
TEST(VoronoiRender, WideRowsAndLongRunsAgreeOnEveryPath) {
    const auto source = PipelineTest::MakeImage(PixelFormat::RGBA8, 700, 24, 5u);
    const auto device = PipelineTest::OpenCLDevice();
    const struct {
        double size, width;
        PipelineTest::View view;
    } cases[] = {
        {2.0, 100.0, {}},
        {2.5, 0.0, {}},
        {300.0, 10.0, {}},
        {9.0, 35.0, {{}, Affine(1.0, 0.0, 320.25, 0.0, 1.0, 4.5)}},
    };
    struct SimdOn {
        ~SimdOn() { Kernel::SetSimdEnabled(true); }
    } restore;
    std::vector<Kernel::Counted<Raster::DynamicBuffer>> first;
    for (const int round : {0, 1})
        for (const auto& c : cases) {
            SCOPED_TRACE(::testing::Message() << "size " << c.size << " line width " << c.width);
            const auto command = MakeVoronoi(c.size, c.width);
            Kernel::SetSimdEnabled(true);
            const auto simd = PipelineTest::Render(*command, source, 0, nullptr, c.view);
            Kernel::SetSimdEnabled(false);
            const auto plain = PipelineTest::Render(*command, source, 0, nullptr, c.view);
            Kernel::SetSimdEnabled(true);
            ASSERT_TRUE(simd && plain);
            auto difference = Compare(*simd, *plain);
            EXPECT_FALSE(difference) << "SIMD and plain: " << difference->Describe();
            if (round == 0) {
                first.push_back(simd);
            } else {
                difference = Compare(*first[std::size_t(&c - cases)], *simd);
                EXPECT_FALSE(difference) << "rendered again: " << difference->Describe();
            }
            if (!device) continue;
            const auto onDevice = PipelineTest::Render(*command, source, 0, device, c.view);
            ASSERT_TRUE(onDevice);
            difference = Compare(*simd, *onDevice);
            EXPECT_FALSE(difference) << "processor and device: " << difference->Describe();
        }
}

TEST(VoronoiCatalogue, TheFilterIsRegisteredWithItsCodes) {
    const FilterInfo* info = FindFilter("voronoi");
    ASSERT_NE(info, nullptr);
    EXPECT_EQ(info->toolID, ToolID::Voronoi);
    EXPECT_EQ(int(info->toolID), 230);
    EXPECT_EQ(info->classCode, Kernel::MakeFourCC("RVoC"));
    EXPECT_EQ(info->commandClass, "RasterVoronoiCommand");
    EXPECT_EQ(info->toolClass, "VoronoiTool");
    ASSERT_EQ(info->parameters.size(), 2u);
    EXPECT_EQ(info->parameters[0].code, Kernel::MakeFourCC("Size"));
    EXPECT_EQ(info->parameters[0].commandLabel, "Size");
    EXPECT_EQ(info->parameters[1].code, Kernel::MakeFourCC("Widt"));
    EXPECT_EQ(info->parameters[1].commandLabel, "Line Width");
    EXPECT_EQ(SettingsKey(info->name, info->parameters[1]), "tools.voronoi.linewidth");
}

} // namespace
