// The brush engine: where dabs land for a stroke, in pixel mode and out of it.

#include "host/brush/BrushEngine.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdlib>

namespace {

Kernel::Counted<Raster::RasterBrush> MakeBrush(double size) {
    Kernel::Counted<Raster::RasterBrush> brush(new Raster::SquareRasterBrush());
    brush->SetSize(size);
    return brush;
}

TEST(BrushEngine, FastDiagonalDragInPixelModeLeavesAConnectedLineOfWholePixels) {
    Raster::BrushEngine engine;
    engine.SetRasterBrush(MakeBrush(1.0));
    engine.SetPixelMode(1);
    // Two events far apart, as a fast drag reports them.
    engine.BeginStroke({0.7, 0.2});
    engine.StrokeTo({40.3, 17.9});
    engine.StrokeTo({3.5, 29.5});
    const auto nozzles = engine.TakeNozzles();
    ASSERT_GE(nozzles.size(), 2u);
    EXPECT_EQ(nozzles.front().rect, (Kernel::RectT<double>{0, 0, 1, 1}));
    EXPECT_EQ(nozzles.back().rect, (Kernel::RectT<double>{3, 29, 4, 30}));
    for (std::size_t i = 0; i < nozzles.size(); ++i) {
        const auto& r = nozzles[i].rect;
        EXPECT_EQ(r.left, std::floor(r.left));
        EXPECT_EQ(r.top, std::floor(r.top));
        EXPECT_EQ(r.Width(), 1.0);
        EXPECT_EQ(r.Height(), 1.0);
        if (i == 0) continue;
        const auto& p = nozzles[i - 1].rect;
        const double dx = std::abs(r.left - p.left), dy = std::abs(r.top - p.top);
        EXPECT_LE(dx, 1.0) << "gap before dab " << i;
        EXPECT_LE(dy, 1.0) << "gap before dab " << i;
        EXPECT_GT(dx + dy, 0.0) << "dab " << i << " repeats the one before";
    }
    // 40 steps along x for the first leg, 37 along x for the second: one dab per step plus the first.
    EXPECT_EQ(nozzles.size(), 1u + 40u + 37u);
    EXPECT_EQ(engine.GetStrokeBounds(), (Kernel::RectT<double>{0, 0, 41, 30}));
}

TEST(BrushEngine, PixelModeDabsOfEvenAndOddSizesSitOnWholePixels) {
    Raster::BrushEngine engine;
    engine.SetPixelMode(1);
    engine.SetRasterBrush(MakeBrush(3.0));
    engine.BeginStroke({10.9, 20.1});
    EXPECT_EQ(engine.TakeNozzles().front().rect, (Kernel::RectT<double>{9, 19, 12, 22}));
    engine.SetRasterBrush(MakeBrush(4.4)); // rounds to 4
    engine.BeginStroke({10.9, 20.1});
    EXPECT_EQ(engine.TakeNozzles().front().rect, (Kernel::RectT<double>{9, 19, 13, 23}));
}

TEST(BrushEngine, OutsidePixelModeDabsAreSpacedByTheBrushSize) {
    Raster::BrushEngine engine;
    auto brush = MakeBrush(8.0);
    brush->SetSpacing(0.25); // every 2 pixels
    engine.SetRasterBrush(brush);
    engine.BeginStroke({0.0, 0.0});
    engine.StrokeTo({5.0, 0.0});
    engine.StrokeTo({10.0, 0.0});
    const auto nozzles = engine.TakeNozzles();
    ASSERT_EQ(nozzles.size(), 6u);
    for (std::size_t i = 0; i < nozzles.size(); ++i)
        EXPECT_DOUBLE_EQ(nozzles[i].rect.left, 2.0 * double(i) - 4.0) << "dab " << i;
}

TEST(BrushEngine, SymmetryMirrorsEveryDabAboutItsAxis) {
    Raster::BrushEngine engine;
    engine.SetRasterBrush(MakeBrush(1.0));
    engine.SetPixelMode(1);
    engine.SetSymmetry(true, 10.0);
    engine.BeginStroke({2.0, 5.0});
    const auto nozzles = engine.TakeNozzles();
    ASSERT_EQ(nozzles.size(), 2u);
    EXPECT_EQ(nozzles[1].rect, (Kernel::RectT<double>{17, 5, 18, 6}));
    // A dab on the axis is its own mirror image and is not doubled.
    engine.BeginStroke({9.5, 0.0});
    engine.TakeNozzles();
    engine.SetSymmetry(true, 9.5);
    engine.BeginStroke({9.0, 0.0});
    EXPECT_EQ(engine.TakeNozzles().size(), 1u);
}

TEST(BrushEngine, HostileStrokesAreBounded) {
    Raster::BrushEngine engine;
    engine.SetRasterBrush(MakeBrush(1.0));
    engine.SetPixelMode(1);
    engine.BeginStroke({NAN, 0.0});
    EXPECT_FALSE(engine.IsStroking());
    engine.BeginStroke({0.0, 0.0}, NAN);
    engine.StrokeTo({1e300, -1e300}, 7.0);
    const auto nozzles = engine.TakeNozzles();
    EXPECT_EQ(nozzles.size(), Raster::BrushEngine::kMaxNozzlesPerStroke);
    EXPECT_EQ(nozzles.front().pressure, 1.0f);
    EXPECT_LE(nozzles.back().pressure, 1.0f);
}

} // namespace
