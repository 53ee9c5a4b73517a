#pragma once
// Shared by the twirl and sphere tests: commands, and the pipeline tests' whole-image render on the processor
// or the OpenCL device, in tiles, under a view.

#include "PipelineTestSupport.h"
#include "filters/distort/RasterSphereCommand.h"
#include "filters/distort/RasterTwirlCommand.h"

namespace DistortTest {

using PipelineTest::Render;
using PipelineTest::View;

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
