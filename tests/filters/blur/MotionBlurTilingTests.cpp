// Motion blur renders of every layer format agree whole and in tiles, with or without a device, and an
// abort in the middle of a render ends it cleanly (the scratch images are freed: run under ASan).
#include "PipelineTestSupport.h"
#include "filters/blur/RasterMotionBlurCommand.h"
#include "pipeline/RenderJob.h"

#include <gtest/gtest.h>

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

Kernel::Counted<Raster::DynamicBuffer>
Render(const RasterMotionBlurCommand& command, const Kernel::Counted<Raster::DynamicBuffer>& source, int tile,
       const Kernel::Counted<Raster::HardwareDevice>& device = nullptr) {
    RasterTools::RenderTarget target;
    target.source.pixels = source;
    target.destination.pixels = PipelineTest::MakeDestination(command, *source);
    target.bounds = {0.0, 0.0, double(source->GetWidth()), double(source->GetHeight())};
    target.device = device;
    const auto paths = PipelineTest::RenderTiled(command, target, tile, tile, tile ? 7 : 0, tile ? 3 : 0);
    EXPECT_EQ(paths.other, 0);
    EXPECT_EQ(paths.device, 0) << "there is no kernel: every tile renders on the processor";
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

TEST(MotionBlurTiling, ADeviceChangesNothing) {
    REQUIRE_OPENCL(device);
    for (const PixelFormat format : {PixelFormat::RGBA8, PixelFormat::RGBAUF, PixelFormat::LabA16}) {
        const auto source = PipelineTest::MakeImage(format, 64, 40, 5);
        const RasterMotionBlurCommand command(false, 6.0, 0.8);
        EXPECT_FALSE(command.PrepareDevice({}));
        EXPECT_FALSE(
            PipelineTest::Compare(*Render(command, source, 32), *Render(command, source, 32, device)))
            << Raster::GetPixelFormatName(format);
    }
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
