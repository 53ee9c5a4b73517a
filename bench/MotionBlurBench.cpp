// Motion blur in megapixels per second on a 4096 × 4096 RGBA8 image at 30 degrees, radius 10, 50 and 200, on
// the processor: one thread over the whole image, and 1024-pixel tiles on 1 and 2 threads. The cost should
// not grow with the radius.
//
//   motion_blur_bench [--benchmark_filter=...]

#include "bench/BenchSupport.h"
#include "filters/blur/RasterMotionBlurCommand.h"
#include "filters/tonal/RasterUnsharpMaskCommand.h"

#include <numbers>
#include <string>

namespace {

using Raster::PixelFormat;

constexpr int Side = 4096;

void Render(benchmark::State& state, const RasterTools::PipelineCommand& command, int tile, int threads) {
    static const auto source = Bench::MakeImage(Side, PixelFormat::RGBA8);
    Bench::RenderWhole(state, command, source, PixelFormat::RGBA8, {.tileSize = tile, .threads = threads});
}

void Register() {
    const std::pair<int, int> layouts[] = {{0, 1}, {1024, 1}, {1024, 2}};
    for (const double radius : {10.0, 50.0, 200.0})
        for (const auto& [tile, threads] : layouts) {
            const std::string name = "MotionBlur/rgba8/radius:" + std::to_string(int(radius)) +
                                     "/angle:30/tile:" + std::to_string(tile) +
                                     "/threads:" + std::to_string(threads);
            benchmark::RegisterBenchmark(name.c_str(),
                                         [radius, tile, threads](benchmark::State& state) {
                                             const RasterTools::RasterMotionBlurCommand command(
                                                 false, radius, std::numbers::pi / 6);
                                             Render(state, command, tile, threads);
                                         })
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
        }
    for (const double radius : {3.0, 12.0, 30.0}) {
        const std::string name =
            "UnsharpMask/rgba8/radius:" + std::to_string(int(radius)) + "/tile:256/threads:1";
        benchmark::RegisterBenchmark(name.c_str(),
                                     [radius](benchmark::State& state) {
                                         const RasterTools::RasterUnsharpMaskCommand command(false, radius,
                                                                                             0.8, 0.0);
                                         Render(state, command, 256, 1);
                                     })
            ->Unit(benchmark::kMillisecond)
            ->UseRealTime();
    }
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
