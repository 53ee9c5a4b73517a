#pragma once
// Shared by the add-noise, diffuse and edge detect tests: noise commands, and the pipeline tests' whole-image
// render on the processor or the OpenCL device, in tiles, under a view.

#include "PipelineTestSupport.h"
#include "filters/tonal/RasterAddNoiseCommand.h"

namespace NoiseTest {

using PipelineTest::Render;
using PipelineTest::View;

inline Kernel::Counted<RasterTools::RasterAddNoiseCommand> MakeNoise(double intensity, bool mono,
                                                                     bool gaussian) {
    return Kernel::Counted<RasterTools::RasterAddNoiseCommand>(
        new RasterTools::RasterAddNoiseCommand(false, intensity, mono, gaussian));
}

} // namespace NoiseTest
