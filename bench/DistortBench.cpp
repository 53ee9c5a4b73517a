// Twirl and sphere in megapixels per second on a 4096 × 4096 RGBA8 image: a 90-degree twirl and a sphere of
// intensity 50 over the whole image (radius 2048 about the middle), on the processor with 1 and 2 threads and
// on the OpenCL device.
//
//   distort_bench [--benchmark_filter=...]
//
// Every render is the whole image through RenderImage in 256-pixel tiles; device renders include copying the
// source to the device and the result back.

#include "bench/BenchSupport.h"
#include "filters/distort/RasterSphereCommand.h"
#include "filters/distort/RasterTwirlCommand.h"

#include <string>

namespace {

using Raster::PixelFormat;

constexpr int Side = 4096;

void Register() {
    static const Kernel::Counted<RasterTools::RasterTwirlCommand> twirl(
        new RasterTools::RasterTwirlCommand(false, 90.0, Side / 2.0, RasterTools::UnsetCentre));
    static const Kernel::Counted<RasterTools::RasterSphereCommand> sphere(
        new RasterTools::RasterSphereCommand(false, 50.0, Side / 2.0, RasterTools::UnsetCentre));
    const Bench::NamedCommand commands[] = {{"twirl/90", twirl.Get()}, {"sphere/50", sphere.Get()}};
    Bench::RegisterRGBA8Renders(Side, commands);
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
