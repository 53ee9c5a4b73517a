// Diffuse and vertical edge detect in megapixels per second, per layer format, on the processor with 1 and 2
// threads and on the OpenCL device.
//
//   diffuse_edge_bench [--benchmark_filter=...]
//
// Every render is a whole 4096 × 4096 image through RenderImage in 256-pixel tiles; device renders include
// copying the source to the device and the result back. Diffuse scatters up to 5 pixels (intensity 0.01),
// as far as ImageMagick's -spread 5 in bench/compare_peers.sh.

#include "bench/BenchSupport.h"
#include "filters/tonal/RasterDiffuseCommand.h"
#include "filters/tonal/RasterVerticalEdgeDetectCommand.h"

#include <string>

namespace {

using Raster::PixelFormat;

constexpr int Side = 4096;

void Render(benchmark::State& state, const RasterTools::PipelineCommand* command, PixelFormat format,
            Bench::Path path) {
    Bench::RenderWhole(state, *command, Bench::MakeImage(Side, format), format, Bench::SetupFor(path));
}

void Register() {
    // Kept for the process: the benchmarks hold plain pointers to them.
    static const auto diffuse = Kernel::MakeCounted<RasterTools::RasterDiffuseCommand>(false, 0.01);
    static const auto edge = Kernel::MakeCounted<RasterTools::RasterVerticalEdgeDetectCommand>();
    const std::pair<const RasterTools::PipelineCommand*, const char*> commands[] = {
        {diffuse.Get(), "diffuse"}, {edge.Get(), "edge"}};
    for (const auto& [command, name] : commands)
        for (PixelFormat format : Bench::LayerFormats)
            for (const auto& [path, label] : Bench::Paths) {
                const std::string full =
                    std::string(name) + "/" + std::string(Raster::GetPixelFormatName(format)) + "/" + label;
                benchmark::RegisterBenchmark(full.c_str(), Render, command, format, path)
                    ->Unit(benchmark::kMillisecond)
                    ->UseRealTime();
            }
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
