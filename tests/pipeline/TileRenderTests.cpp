// Whole images through the host's tile renderer on several threads: the same pixels as one tile on one
// thread, on the processor and on the device. Run under the thread sanitizer to check the sharing.

#include "PipelineTestSupport.h"

#include "filters/copy/RasterCopyCommand.h"
#include "pipeline/RenderJob.h"

using namespace PipelineTest;
using namespace RasterTools;

namespace {

Kernel::Counted<Raster::DynamicBuffer> RenderWith(const RasterCopyCommand& command,
                                                  const Kernel::Counted<Raster::DynamicBuffer>& source,
                                                  const RenderJobOptions& options,
                                                  RenderJobResult* result = nullptr) {
    const auto destination = MakeDestination(command, *source);
    const RenderJobResult outcome = RenderImage(command, source, destination, nullptr, options);
    EXPECT_TRUE(outcome.complete) << outcome.error;
    if (result) *result = outcome;
    return destination;
}

TEST(TileRenderer, ThreadsAndTilesGiveTheSinglePassPixels) {
    const auto source = MakeImage(PixelFormat::RGBA8, 131, 77, 21u);
    const RasterCopyCommand scaled(false, int(PixelFormat::RGBA16), Kernel::PointT<double>{1.5, 0.75});
    const RasterCopyCommand plain(false, int(PixelFormat::CMYKA8), Kernel::PointT<double>{1.0, 1.0});
    for (const RasterCopyCommand* command : {&scaled, &plain}) {
        RenderJobOptions single;
        single.tileSize = 0;
        single.threads = 1;
        const auto reference = RenderWith(*command, source, single);

        RenderJobOptions threaded;
        threaded.tileSize = 24;
        threaded.threads = 4;
        const auto onProcessor = RenderWith(*command, source, threaded);
        const auto difference = Compare(*onProcessor, *reference);
        EXPECT_FALSE(difference) << "processor, 4 threads: " << difference->Describe();

        if (const auto device = OpenCLDevice()) {
            threaded.device = device;
            RenderJobResult result;
            const auto onDevice = RenderWith(*command, source, threaded, &result);
            EXPECT_GT(result.deviceTiles, 0);
            EXPECT_EQ(result.processorTiles, 0) << Raster::GetLastHardwareError();
            const auto deviceDifference = Compare(*onDevice, *reference);
            EXPECT_FALSE(deviceDifference) << "device, 4 threads: " << deviceDifference->Describe();
        }
    }
}

TEST(TileRenderer, AnAbortedJobReportsItAndIsNotComplete) {
    const auto source = MakeImage(PixelFormat::RGBA8, 64, 64, 1u);
    const RasterCopyCommand command(false, -1, Kernel::PointT<double>{1.0, 1.0});
    const bool abort = true;
    RenderJobOptions options;
    options.abort = &abort;
    options.threads = 2;
    options.tileSize = 16;
    const auto destination = MakeDestination(command, *source);
    const auto result = RenderImage(command, source, destination, nullptr, options);
    EXPECT_FALSE(result.complete);
    EXPECT_EQ(result.deviceTiles + result.processorTiles, 0);
    EXPECT_FALSE(Compare(*destination, *MakeDestination(command, *source)));
}

} // namespace
