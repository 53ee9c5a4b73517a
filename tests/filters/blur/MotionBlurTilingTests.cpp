// Motion blur renders of every layer format agree whole and in tiles, with or without a device, and an
// abort in the middle of a render ends it cleanly (the scratch images are freed: run under ASan).
#include "PipelineTestSupport.h"
#include "filters/blur/MotionBlurDevice.h"
#include "filters/blur/RasterMotionBlurCommand.h"
#include "pipeline/RenderJob.h"
#include "tests/pipeline/LanguageZeroCheck.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <thread>
#include <utility>

namespace {

using Raster::PixelFormat;
using RasterTools::RasterMotionBlurCommand;

constexpr PixelFormat kLayerFormats[] = {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF,
                                         PixelFormat::IA8,   PixelFormat::IA16,   PixelFormat::CMYKA8,
                                         PixelFormat::LabA16};

// Radius and angle: whole and fractional radii, a quarter turn and turns that resample.
constexpr std::pair<double, double> kCases[] = {{5.0, 0.0}, {3.5, 0.6}, {9.0, 2.2}, {20.0, -1.0}};

// What a render goes through besides the source: a selection, a channel write mask, a view transform.
struct Extras {
    Kernel::Counted<Raster::DynamicBuffer> mask;
    int channelMask = -1;
    Raster::AffineTransform::Params view;
};

// The render of source in tiles of tile × tile (0: whole), shifted off the origin, on the processor or, with
// a device, on the device for every tile.
Kernel::Counted<Raster::DynamicBuffer> Render(const RasterMotionBlurCommand& command,
                                              const Kernel::Counted<Raster::DynamicBuffer>& source, int tile,
                                              const Kernel::Counted<Raster::HardwareDevice>& device = nullptr,
                                              const Extras& extras = {}) {
    RasterTools::RenderTarget target;
    target.source.pixels = source;
    target.destination.pixels = PipelineTest::MakeDestination(command, *source);
    target.bounds = {0.0, 0.0, double(source->GetWidth()), double(source->GetHeight())};
    target.device = device;
    target.mask.pixels = extras.mask;
    target.channelMask = extras.channelMask;
    target.transform = extras.view;
    if (device) {
        EXPECT_TRUE(command.PrepareDevice(target)) << Raster::GetLastHardwareError();
    }
    const auto paths = PipelineTest::RenderTiled(command, target, tile, tile, tile ? 7 : 0, tile ? 3 : 0);
    EXPECT_EQ(paths.other, 0);
    EXPECT_EQ(device ? paths.processor : paths.device, 0) << "tiles took the other path";
    return target.destination.pixels;
}

TEST(MotionBlurTiling, WholeAndTiledRendersAgreeInEveryFormat) {
    for (const PixelFormat format : kLayerFormats)
        for (const auto& [radius, radians] : kCases) {
            const auto source = PipelineTest::MakeImage(format, 71, 53, 11);
            const RasterMotionBlurCommand command(false, radius, radians);
            const auto whole = Render(command, source, 0);
            for (const int tile : {16, 25}) {
                const auto difference = PipelineTest::Compare(*whole, *Render(command, source, tile));
                EXPECT_FALSE(difference)
                    << Raster::GetPixelFormatName(format) << " radius " << radius << " angle " << radians
                    << " tile " << tile << ": " << difference->Describe();
            }
        }
}

// Float sums round, so a running sum that started at a different row would differ in its last bits: every
// component of the source here carries a full mantissa, and the long window crosses several tiles.
TEST(MotionBlurTiling, FloatSumsAgreeInEveryTilingAtFullPrecision) {
    auto source = Raster::DynamicBuffer::Create(150, 110, PixelFormat::RGBAUF);
    ASSERT_TRUE(source);
    std::uint32_t state = 12345u;
    for (int y = 0; y < source->GetHeight(); ++y)
        for (int i = 0; i < source->GetWidth() * 4; ++i) {
            state = state * 1664525u + 1013904223u;
            source->Row<float>(y)[i] = float(state >> 8) / 16777216.0f * 1.37f;
        }
    for (const auto& [radius, radians] : {std::pair{12.0, 1.0}, std::pair{33.0, 0.3}, std::pair{7.25, 2.0}}) {
        const RasterMotionBlurCommand command(false, radius, radians);
        const auto whole = Render(command, source, 0);
        for (const int tile : {19, 37, 64}) {
            const auto difference = PipelineTest::Compare(*whole, *Render(command, source, tile));
            EXPECT_FALSE(difference) << "radius " << radius << " angle " << radians << " tile " << tile
                                     << ": " << difference->Describe();
        }
        if (const auto device = PipelineTest::OpenCLDevice()) {
            const auto difference = PipelineTest::Compare(*whole, *Render(command, source, 37, device));
            EXPECT_FALSE(difference) << "radius " << radius << " angle " << radians
                                     << " on the device: " << difference->Describe();
        }
    }
}

// Every row of the blurred intermediate image that the resample out reads (both neighbours of each bilinear
// sample, after clamping) lies in the rows worked out for its column, for rectangles and angles of all kinds.
TEST(MotionBlurTiling, TheRowsWorkedOutCoverEverySampleOfTheResampleOut) {
    const Kernel::RectT<int> rects[] = {
        {0, 0, 300, 200}, {37, 74, 74, 111}, {250, 3, 251, 190}, {5, 5, 6, 6}};
    for (const double radians : {0.0, 0.3, 1.5707963267948966, 2.0, 3.14159, -0.7, 4.0})
        for (const auto& rect : rects) {
            const RasterMotionBlurCommand command(false, 9.5, radians);
            const auto plan = command.MakePlan(rect, 300, 200, Raster::AffineTransform::Params{});
            const auto rows = RasterTools::MotionBlurRender::NeededRows(rect, plan);
            const int w = plan.box.Width(), h = plan.box.Height();
            for (int y = rect.top; y < rect.bottom; ++y)
                for (int x = rect.left; x < rect.right; ++x) {
                    const double mx = x + 0.5 - plan.pivotX, my = y + 0.5 - plan.pivotY;
                    const double sx =
                        std::clamp(plan.sine * my + plan.pivotX - 0.5 + plan.cosine * mx - plan.box.left, 0.0,
                                   double(w - 1));
                    const double sy =
                        std::clamp(plan.cosine * my + plan.pivotY - 0.5 - plan.sine * mx - plan.box.top, 0.0,
                                   double(h - 1));
                    const int x0 = int(sx), y0 = int(sy);
                    for (const int column : {x0, std::min(x0 + 1, w - 1)})
                        for (const int row : {y0, std::min(y0 + 1, h - 1)}) {
                            const auto range = rows[std::size_t(column)];
                            ASSERT_TRUE(row >= range.first && row < range.last)
                                << "angle " << radians << " pixel " << x << "," << y << " reads row " << row
                                << " of column " << column << " outside [" << range.first << ", "
                                << range.last << ")";
                        }
                }
        }
}

// The device's three steps give the processor's pixels: the copy of radius 0, the fractional and the
// whole-radius blur, through a selection and a channel write mask, under a zoom, and for floats over windows
// long enough that their sums restart inside the image.
TEST(MotionBlurTiling, TheDeviceGivesTheProcessorsPixels) {
    REQUIRE_OPENCL(device);
    Extras selected;
    selected.mask = PipelineTest::MakeImage(PixelFormat::MaskA8, 45, 170, 9);
    selected.channelMask = 0b1011; // for IA formats: grey and alpha
    Extras zoomed;
    zoomed.view.m = {2.0, 0.0, 0.0, 0.0, 2.0, 0.0};
    struct Case {
        double radius, radians;
        const Extras* extras;
    };
    const Case cases[] = {{0.0, 0.7, nullptr},  {3.5, 0.6, &selected}, {16.0, 1.5707963267948966, nullptr},
                          {40.0, 2.7, nullptr}, {6.25, -1.0, &zoomed}, {70.0, 1.45, &selected}};
    for (const PixelFormat format : kLayerFormats)
        for (const Case& c : cases) {
            const auto source = PipelineTest::MakeImage(format, 45, 170, 13);
            const RasterMotionBlurCommand command(false, c.radius, c.radians);
            const Extras extras = c.extras ? *c.extras : Extras{};
            const auto reference = Render(command, source, 0, nullptr, extras);
            for (const int tile : {0, 23}) {
                const auto difference =
                    PipelineTest::Compare(*reference, *Render(command, source, tile, device, extras));
                EXPECT_FALSE(difference)
                    << Raster::GetPixelFormatName(format) << " radius " << c.radius << " angle " << c.radians
                    << " tile " << tile << ": " << difference->Describe();
            }
        }
}

// Tiles on two threads take turns on the device (each holds the device-buffer semaphore for its three
// steps) and share the job's mirrors; the image is the processor's. Run under TSan as well.
TEST(MotionBlurTiling, TwoThreadsShareTheDevice) {
    REQUIRE_OPENCL(device);
    const auto source = PipelineTest::MakeImage(PixelFormat::RGBA16, 150, 120, 21);
    const RasterMotionBlurCommand command(false, 11.5, 0.4);
    const auto reference = Render(command, source, 0);
    auto destination = PipelineTest::MakeDestination(command, *source);
    RasterTools::RenderJobOptions options;
    options.tileSize = 32;
    options.threads = 2;
    options.device = device;
    const auto result = RasterTools::RenderImage(command, source, destination, nullptr, options);
    ASSERT_TRUE(result.complete) << result.error;
    EXPECT_EQ(result.processorTiles, 0);
    const auto difference = PipelineTest::Compare(*reference, *destination);
    EXPECT_FALSE(difference) << difference->Describe();
}

TEST(MotionBlurTiling, AnAbortEndsTheRenderAndFreesTheScratchImages) {
    const auto source = PipelineTest::MakeImage(PixelFormat::RGBA8, 700, 700, 2);
    const RasterMotionBlurCommand command(false, 40.0, 0.5);
    RasterTools::RenderTarget target;
    target.source.pixels = source;
    target.destination.pixels = Raster::DynamicBuffer::Create(700, 700, PixelFormat::RGBA8);
    target.rect = source->GetBounds();

    const auto start = std::chrono::steady_clock::now();
    ASSERT_EQ(command.Render(target), RasterTools::RenderPath::Processor);
    const auto full = std::chrono::steady_clock::now() - start;

    // Set from another thread at several points of the render; each must end as aborted or complete.
    int aborted = 0;
    for (const int eighths : {1, 2, 3, 4, 5, 6}) {
        bool abort = false;
        target.abort = &abort;
        std::thread setter([&] {
            std::this_thread::sleep_for(full * eighths / 8);
            Kernel::SetAborted(&abort);
        });
        const RasterTools::RenderPath path = command.Render(target);
        setter.join();
        EXPECT_TRUE(path == RasterTools::RenderPath::Aborted || path == RasterTools::RenderPath::Processor);
        aborted += path == RasterTools::RenderPath::Aborted;
    }
    EXPECT_GT(aborted, 0);
    bool set = true;
    target.abort = &set;
    EXPECT_EQ(command.Render(target), RasterTools::RenderPath::Aborted);
}

} // namespace
