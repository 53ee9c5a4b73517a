// Voronoi in megapixels per second on a 4096 × 4096 RGBA8 image: cells of 32 pixels with lines of 10% and
// without lines, on the processor with 1 and 2 threads and on the OpenCL device.
//
//   voronoi_bench [--benchmark_filter=...]
//
// Every render is the whole image through RenderImage in 256-pixel tiles; device renders include copying the
// source to the device and the result back.

#include "bench/BenchSupport.h"
#include "filters/lighting/RasterVoronoiCommand.h"

#include <string>

namespace {

using Raster::PixelFormat;

constexpr int Side = 4096;

void Register() {
    static const Kernel::Counted<RasterTools::RasterVoronoiCommand> lines(
        new RasterTools::RasterVoronoiCommand(false, 32.0, 10.0));
    static const Kernel::Counted<RasterTools::RasterVoronoiCommand> plain(
        new RasterTools::RasterVoronoiCommand(false, 32.0, 0.0));
    const Bench::NamedCommand commands[] = {{"voronoi/32/lines10", lines.Get()},
                                            {"voronoi/32/nolines", plain.Get()}};
    Bench::RegisterRGBA8Renders(Side, commands);
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
