#include "NoiseTestSupport.h"

#include "pipeline/RenderJob.h"

namespace NoiseTest {

Kernel::Counted<Raster::DynamicBuffer>
Render(const RasterTools::PipelineCommand& command, const Kernel::Counted<Raster::DynamicBuffer>& source,
       int tileSize, const Kernel::Counted<Raster::HardwareDevice>& device, const View& view) {
    auto destination = PipelineTest::MakeDestination(command, *source);
    RasterTools::RenderJobOptions options;
    options.tileSize = tileSize;
    options.device = device;
    options.bounds = view.bounds;
    options.transform = view.transform;
    const auto result = RasterTools::RenderImage(command, source, destination, nullptr, options);
    EXPECT_TRUE(result.complete) << result.error;
    if (device) {
        EXPECT_EQ(result.processorTiles, 0) << "tiles fell back to the processor\n"
                                            << Raster::GetLastHardwareError();
    }
    return result.complete ? destination : nullptr;
}

} // namespace NoiseTest
