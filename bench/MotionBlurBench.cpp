// Motion blur in megapixels per second on a 4096 × 4096 RGBA8 image at 30 degrees, radius 10, 50 and 200, on
// the processor (one thread over the whole image, and 1024-pixel tiles on 1 and 2 threads) and on the OpenCL
// device in 1024-pixel tiles; and the unsharp mask on both. The cost should not grow with the radius. Device
// renders include copying the source to the device and the result back.
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

void Render(benchmark::State& state, const RasterTools::PipelineCommand& command,
            const Bench::RenderSetup& setup) {
    static const auto source = Bench::MakeImage(Side, PixelFormat::RGBA8);
    Bench::RenderWhole(state, command, source, PixelFormat::RGBA8, setup);
}

// A layout's name and render setup: tile 0 is the whole image.
std::string LayoutName(const Bench::RenderSetup& setup) {
    return "tile:" + std::to_string(setup.tileSize) +
           (setup.opencl ? std::string("/opencl") : "/threads:" + std::to_string(setup.threads));
}

void Register() {
    const Bench::RenderSetup layouts[] = {{.tileSize = 0, .threads = 1},
                                          {.tileSize = 1024, .threads = 1},
                                          {.tileSize = 1024, .threads = 2},
                                          {.tileSize = 1024, .threads = 1, .opencl = true}};
    for (const double radius : {10.0, 50.0, 200.0})
        for (const auto& setup : layouts) {
            const std::string name =
                "MotionBlur/rgba8/radius:" + std::to_string(int(radius)) + "/angle:30/" + LayoutName(setup);
            benchmark::RegisterBenchmark(name.c_str(),
                                         [radius, setup](benchmark::State& state) {
                                             const RasterTools::RasterMotionBlurCommand command(
                                                 false, radius, std::numbers::pi / 6);
                                             Render(state, command, setup);
                                         })
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
        }
    for (const double radius : {3.0, 12.0, 30.0})
        for (const bool opencl : {false, true}) {
            const Bench::RenderSetup setup{.tileSize = opencl ? 1024 : 256, .threads = 1, .opencl = opencl};
            const std::string name =
                "UnsharpMask/rgba8/radius:" + std::to_string(int(radius)) + "/" + LayoutName(setup);
            benchmark::RegisterBenchmark(name.c_str(),
                                         [radius, setup](benchmark::State& state) {
                                             const RasterTools::RasterUnsharpMaskCommand command(
                                                 false, radius, 0.8, 0.0);
                                             Render(state, command, setup);
                                         })
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
        }
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
