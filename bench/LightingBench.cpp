// Lighting in megapixels per second on a 4096 × 4096 RGBA8 image: one directional light on a flat surface,
// and a spot light over the relief of the layer's luminance, on the processor with 1 and 2 threads and on
// the OpenCL device.
//
//   lighting_bench [--benchmark_filter=...]
//
// Every render is the whole image through RenderImage in 256-pixel tiles; device renders include copying the
// source to the device and the result back.

#include "bench/BenchSupport.h"
#include "filters/lighting/RasterLightingCommand.h"

#include <string>

namespace {

using Raster::PixelFormat;
using RasterTools::LightingParameters;
using RasterTools::LightType;
using RasterTools::RasterLightingCommand;

constexpr int Side = 4096;

void Render(benchmark::State& state, LightingParameters params, Bench::Path path) {
    const RasterLightingCommand command(false, params);
    Bench::RenderWhole(state, command, Bench::MakeImage(Side, PixelFormat::RGBA8), PixelFormat::RGBA8,
                       Bench::SetupFor(path));
}

void Register() {
    LightingParameters directional;
    directional.lightType = int(LightType::Directional);
    LightingParameters spot;
    spot.depth = 5.0;
    spot.outerCone = 60.0;
    for (const auto& [name, params] : {std::pair{"directional", directional}, std::pair{"spot-relief", spot}})
        for (const auto& [path, label] : Bench::Paths)
            benchmark::RegisterBenchmark((std::string("lighting/") + name + "/RGBA8/" + label).c_str(),
                                         Render, params, path)
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
