// Add noise in megapixels per second: gaussian and uniform, mono and colour, per layer format, on the
// processor with 1 and 2 threads and on the OpenCL device.
//
//   noise_bench [--benchmark_filter=...]
//
// Every render is a whole 4096 × 4096 image through RenderImage in 256-pixel tiles; device renders include
// copying the source to the device and the result back.

#include "bench/BenchSupport.h"
#include "filters/tonal/RasterAddNoiseCommand.h"

#include <string>

namespace {

using Raster::PixelFormat;
using RasterTools::RasterAddNoiseCommand;

constexpr int Side = 4096;

void Render(benchmark::State& state, PixelFormat format, bool gaussian, bool mono, Bench::Path path) {
    const RasterAddNoiseCommand command(false, 0.3, mono, gaussian);
    Bench::RenderWhole(state, command, Bench::MakeImage(Side, format), format, Bench::SetupFor(path));
}

void Register() {
    for (PixelFormat format : Bench::LayerFormats)
        for (const bool gaussian : {true, false})
            for (const bool mono : {false, true})
                for (const auto& [path, label] : Bench::Paths) {
                    const std::string name = std::string("noise/") + (gaussian ? "gaussian/" : "uniform/") +
                                             (mono ? "mono/" : "colour/") +
                                             std::string(Raster::GetPixelFormatName(format)) + "/" + label;
                    benchmark::RegisterBenchmark(name.c_str(), Render, format, gaussian, mono, path)
                        ->Unit(benchmark::kMillisecond)
                        ->UseRealTime();
                }
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
