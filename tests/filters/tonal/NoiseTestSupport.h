#pragma once
// Shared by the add-noise, diffuse and edge detect tests: rendering a pipeline command over a whole image,
// on the processor or the OpenCL device, in tiles, under a view.

#include "PipelineTestSupport.h"
#include "filters/tonal/RasterAddNoiseCommand.h"

namespace NoiseTest {

struct View {
    Kernel::RectT<double> bounds;              // empty: the image's own
    Raster::AffineTransform::Params transform; // raster pixels to the view
};

// The command's render of source into a fresh image of its format, in square tiles of tileSize (0: whole),
// on device when given (every tile must then run there). Null when the render did not complete.
Kernel::Counted<Raster::DynamicBuffer>
Render(const RasterTools::PipelineCommand& command, const Kernel::Counted<Raster::DynamicBuffer>& source,
       int tileSize, const Kernel::Counted<Raster::HardwareDevice>& device = nullptr, const View& view = {});

inline Kernel::Counted<RasterTools::RasterAddNoiseCommand> MakeNoise(double intensity, bool mono,
                                                                     bool gaussian) {
    return Kernel::Counted<RasterTools::RasterAddNoiseCommand>(
        new RasterTools::RasterAddNoiseCommand(false, intensity, mono, gaussian));
}

} // namespace NoiseTest
