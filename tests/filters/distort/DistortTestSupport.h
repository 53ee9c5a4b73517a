#pragma once
// Shared by the twirl and sphere tests: commands, and whole-image renders on the processor or the OpenCL
// device, in tiles, under a view.

#include "PipelineTestSupport.h"
#include "filters/distort/RasterSphereCommand.h"
#include "filters/distort/RasterTwirlCommand.h"

namespace DistortTest {

struct View {
    Kernel::RectT<double> bounds;              // empty: the image's own
    Raster::AffineTransform::Params transform; // raster pixels to the view
};

// The command's render of source into a fresh image of its format, in square tiles of tileSize (0: whole),
// on device when given (every tile must then run there). Null when the render did not complete.
Kernel::Counted<Raster::DynamicBuffer>
Render(const RasterTools::PipelineCommand& command, const Kernel::Counted<Raster::DynamicBuffer>& source,
       int tileSize, const Kernel::Counted<Raster::HardwareDevice>& device = nullptr, const View& view = {});

inline Kernel::Counted<RasterTools::RasterTwirlCommand> MakeTwirl(double angle, double radius,
                                                                  Kernel::PointT<double> centre) {
    return Kernel::Counted<RasterTools::RasterTwirlCommand>(
        new RasterTools::RasterTwirlCommand(false, angle, radius, centre));
}
inline Kernel::Counted<RasterTools::RasterSphereCommand> MakeSphere(double intensity, double radius,
                                                                    Kernel::PointT<double> centre) {
    return Kernel::Counted<RasterTools::RasterSphereCommand>(
        new RasterTools::RasterSphereCommand(false, intensity, radius, centre));
}

} // namespace DistortTest
