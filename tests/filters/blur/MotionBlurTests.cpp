// Motion blur pixels worked out by hand: segments of 2r + 1 pixels, the fractional and whole-radius windows,
// the view's zoom, premultiplied sums, and the parameters' contract.
#include "PipelineTestSupport.h"
#include "filters/Catalogue.h"
#include "filters/blur/MotionBlurTool.h"
#include "filters/blur/RasterMotionBlurCommand.h"
#include "pipeline/RenderJob.h"

#include <gtest/gtest.h>

#include <cmath>
#include <numbers>

namespace {

using Raster::PixelFormat;
using RasterTools::RasterMotionBlurCommand;

Kernel::Counted<Raster::DynamicBuffer> Blur(const RasterMotionBlurCommand& command,
                                            const Kernel::Counted<Raster::DynamicBuffer>& source,
                                            int tileSize = 0, Raster::AffineTransform::Params view = {}) {
    auto destination =
        Raster::DynamicBuffer::Create(source->GetWidth(), source->GetHeight(), source->GetFormat());
    RasterTools::RenderJobOptions options;
    options.tileSize = tileSize;
    options.threads = 1;
    options.transform = view;
    const auto result = RasterTools::RenderImage(command, source, destination, nullptr, options);
    EXPECT_TRUE(result.complete) << result.error;
    return destination;
}

// Opaque black RGBA8 with one white pixel at (x, y).
Kernel::Counted<Raster::DynamicBuffer> Dot(int size, int x, int y) {
    const std::uint8_t black[4] = {0, 0, 0, 255};
    auto image = PipelineTest::MakeFilled(PixelFormat::RGBA8, size, size, black);
    std::uint8_t* p = image->Row<std::uint8_t>(y) + 4 * x;
    p[0] = p[1] = p[2] = 255;
    return image;
}

// The red values of every pixel whose red is not 0, as (x, y, red).
struct Lit {
    int x, y, red;
};
std::vector<Lit> LitPixels(const Raster::DynamicBuffer& image) {
    std::vector<Lit> lit;
    for (int y = 0; y < image.GetHeight(); ++y)
        for (int x = 0; x < image.GetWidth(); ++x)
            if (const int red = image.Row<std::uint8_t>(y)[4 * x]; red != 0) lit.push_back({x, y, red});
    return lit;
}

TEST(MotionBlurPixels, RadiusZeroChangesNothing) {
    for (const PixelFormat format : {PixelFormat::RGBA8, PixelFormat::RGBAUF, PixelFormat::CMYKA8}) {
        const auto source = PipelineTest::MakeImage(format, 37, 29, 3);
        const auto result = Blur(RasterMotionBlurCommand(false, 0.0, 0.7), source, 16);
        EXPECT_FALSE(PipelineTest::Compare(*source, *result)) << Raster::GetPixelFormatName(format);
    }
}

TEST(MotionBlurPixels, AngleZeroSpreadsAlongTheRowAndAQuarterTurnDownTheColumn) {
    const auto source = Dot(41, 20, 17);
    for (const double radians : {0.0, std::numbers::pi / 2, std::numbers::pi, 3 * std::numbers::pi / 2}) {
        const bool rows = std::fabs(std::sin(radians)) < 0.5;
        const auto lit = LitPixels(*Blur(RasterMotionBlurCommand(false, 3.0, radians), source));
        ASSERT_EQ(lit.size(), 7u) << radians; // 2r + 1
        for (std::size_t i = 0; i < lit.size(); ++i) {
            EXPECT_EQ(lit[i].x, rows ? 17 + int(i) : 20) << radians;
            EXPECT_EQ(lit[i].y, rows ? 17 : 14 + int(i)) << radians;
            EXPECT_EQ(lit[i].red, 36) << radians; // 255 / 7 = 36.4
        }
    }
}

TEST(MotionBlurPixels, FractionalRadiusWeighsTheRowsBeyondAndLargerRadiiAreWhole) {
    const RasterMotionBlurCommand fractional(false, 15.5, 0.0), whole(false, 16.0, 0.0),
        cut(false, 16.5, 0.0);
    const Kernel::RectT<int> rect{0, 0, 64, 64};
    EXPECT_EQ(fractional.MakePlan(rect, 64, 64, {}).whole, 15);
    EXPECT_FLOAT_EQ(fractional.MakePlan(rect, 64, 64, {}).fraction, 0.5f);
    EXPECT_EQ(whole.MakePlan(rect, 64, 64, {}).whole, 16);
    EXPECT_EQ(whole.MakePlan(rect, 64, 64, {}).fraction, 0.0f);
    EXPECT_EQ(cut.MakePlan(rect, 64, 64, {}).whole, 16);
    EXPECT_EQ(cut.MakePlan(rect, 64, 64, {}).fraction, 0.0f);

    const auto source = Dot(80, 40, 40);
    // 15.5: 31 rows of weight 1 and two of 0.5 over a total weight of 32.
    const auto lit = LitPixels(*Blur(fractional, source));
    ASSERT_EQ(lit.size(), 33u);
    EXPECT_EQ(lit.front().x, 24);
    EXPECT_EQ(lit.front().red, 4); // 255 × 0.5 / 32 = 3.98
    EXPECT_EQ(lit[1].red, 8);      // 255 / 32 = 7.97
    EXPECT_EQ(lit.back().red, 4);
    // 16 and 16.5 are the same box of 33 rows.
    const auto at16 = Blur(whole, source);
    EXPECT_EQ(LitPixels(*at16).size(), 33u);
    EXPECT_FALSE(PipelineTest::Compare(*at16, *Blur(cut, source)));
}

TEST(MotionBlurPixels, ZoomTwoDoublesTheRadius) {
    Raster::AffineTransform::Params zoom;
    zoom.m = {2.0, 0.0, 0.0, 0.0, 2.0, 0.0};
    EXPECT_DOUBLE_EQ(RasterMotionBlurCommand::GetViewScale(zoom), 2.0);
    const auto lit = LitPixels(*Blur(RasterMotionBlurCommand(false, 3.0, 0.0), Dot(41, 20, 17), 0, zoom));
    ASSERT_EQ(lit.size(), 13u);
    EXPECT_EQ(lit.front().x, 14);
    EXPECT_EQ(lit.front().red, 20); // 255 / 13 = 19.6
}

TEST(MotionBlurPixels, TransparentPixelsLendNoColour) {
    // Left half opaque red, right half transparent green: every pixel that gains alpha stays pure red.
    auto source = Raster::DynamicBuffer::Create(40, 12, PixelFormat::RGBA16);
    for (int y = 0; y < 12; ++y)
        for (int x = 0; x < 40; ++x) {
            std::uint16_t* p = source->Row<std::uint16_t>(y) + 4 * x;
            const bool red = x < 20;
            const std::uint16_t full = 65535, none = 0;
            p[0] = red ? full : none;
            p[1] = red ? none : full;
            p[2] = none;
            p[3] = red ? full : none;
        }
    for (const double radians : {0.0, 0.5}) {
        const auto result = Blur(RasterMotionBlurCommand(false, 6.0, radians), source);
        int partial = 0;
        for (int y = 0; y < 12; ++y)
            for (int x = 0; x < 40; ++x) {
                const std::uint16_t* p = result->Row<std::uint16_t>(y) + 4 * x;
                if (p[3] == 0) continue;
                partial += p[3] < 65535;
                EXPECT_EQ(p[0], 65535) << x << "," << y;
                EXPECT_EQ(p[1], 0) << x << "," << y;
            }
        EXPECT_GT(partial, 0) << "the edge was blurred into the transparent half";
    }
}

// The sum of colour × alpha over an image.
double PremultipliedTotal(const Raster::DynamicBuffer& image) {
    double total = 0.0;
    for (int y = 0; y < image.GetHeight(); ++y)
        for (int x = 0; x < image.GetWidth(); ++x) {
            const float* p = image.Row<float>(y) + 4 * x;
            total += double(p[0]) * p[3] + double(p[1]) * p[3] + double(p[2]) * p[3];
        }
    return total;
}

TEST(MotionBlurPixels, PremultipliedColourIsPreservedAwayFromTheBorders) {
    // A varied blob in the middle of a transparent image, so that nothing reaches the borders.
    auto source = Raster::DynamicBuffer::Create(96, 96, PixelFormat::RGBAUF);
    const auto blob = PipelineTest::MakeImage(PixelFormat::RGBA8, 32, 32, 9);
    for (int y = 0; y < 32; ++y)
        for (int x = 0; x < 32; ++x)
            for (int c = 0; c < 4; ++c)
                source->Row<float>(y + 32)[4 * (x + 32) + c] = blob->Row<std::uint8_t>(y)[4 * x + c] / 255.0f;
    const double before = PremultipliedTotal(*source);
    ASSERT_GT(before, 10.0);
    EXPECT_NEAR(PremultipliedTotal(*Blur(RasterMotionBlurCommand(false, 9.0, 0.0), source)), before,
                before * 1e-5);
    EXPECT_NEAR(PremultipliedTotal(*Blur(RasterMotionBlurCommand(false, 4.5, std::numbers::pi / 2), source)),
                before, before * 1e-5);
    // Turning by 30 degrees resamples twice; bilinear resampling keeps the total to within a fraction.
    EXPECT_NEAR(PremultipliedTotal(*Blur(RasterMotionBlurCommand(false, 12.0, std::numbers::pi / 6), source)),
                before, before * 0.01);
}

TEST(MotionBlurCommand, Rectangles) {
    // The intermediate rectangle: a quarter turn of a 10 x 4 rectangle about its centre is 4 x 10, with
    // trunc(r / s) rows above and below; the unbounded rectangle is left alone.
    Raster::AffineTransform::Params zoom;
    zoom.m = {2.0, 0.0, 0.0, 0.0, 2.0, 0.0};
    const auto turned =
        RasterMotionBlurCommand::CompensateIntermediate({0, 0, 10, 4}, zoom, 7.0, std::numbers::pi / 2);
    EXPECT_EQ(turned.Width(), 4);
    EXPECT_EQ(turned.Height(), 10 + 2 * 3);
    const Kernel::RectT<int> unbounded{-2147483647, -2147483647, -2147483647, -2147483647};
    EXPECT_EQ(RasterMotionBlurCommand::CompensateIntermediate(unbounded, zoom, 7.0, 1.0), unbounded);

    // Along rows the input grows by the radius and the resampling's pixels sideways, barely up and down.
    const RasterMotionBlurCommand along(false, 10.0, 0.0);
    Kernel::RectT<double> in{100.0, 100.0, 200.0, 150.0};
    along.PrepareInputRectangle(in);
    EXPECT_LE(in.left, 100.0 - 11.0);
    EXPECT_GE(in.right, 200.0 + 11.0);
    EXPECT_GE(in.top, 100.0 - 6.0);
    auto sentinel = Kernel::RectT<double>::Unbounded();
    along.PrepareInputRectangle(sentinel);
    EXPECT_TRUE(sentinel.IsUnbounded());
}

} // namespace
