// Motion blur in megapixels per second on a 4096 × 4096 RGBA8 image at 30 degrees, radius 10, 50 and 200, on
// the processor: one thread over the whole image, and 1024-pixel tiles on 1 and 2 threads. The cost should
// not grow with the radius.
//
//   motion_blur_bench [--benchmark_filter=...]

#include "filters/blur/RasterMotionBlurCommand.h"
#include "filters/tonal/RasterUnsharpMaskCommand.h"
#include "pipeline/RenderJob.h"

#include <benchmark/benchmark.h>

#include <numbers>
#include <string>

namespace {

using Raster::PixelFormat;

constexpr int Side = 4096;

Kernel::Counted<Raster::DynamicBuffer> Image() {
    auto image = Raster::DynamicBuffer::Create(Side, Side, PixelFormat::RGBA8);
    std::uint32_t state = 12345;
    for (int y = 0; y < Side; ++y) {
        auto* row = reinterpret_cast<unsigned char*>(image->RowBytes(y));
        for (std::size_t i = 0; i < image->GetRowBytes(); ++i)
            row[i] = static_cast<unsigned char>((state = state * 1664525u + 1013904223u) >> 24);
    }
    return image;
}

void Render(benchmark::State& state, const RasterTools::PipelineCommand& command, int tile, int threads) {
    static const auto source = Image();
    auto destination = Raster::DynamicBuffer::Create(Side, Side, PixelFormat::RGBA8);
    RasterTools::RenderJobOptions options;
    options.tileSize = tile;
    options.threads = threads;
    for (auto _ : state) {
        const auto result = RasterTools::RenderImage(command, source, destination, nullptr, options);
        if (!result.complete) {
            state.SkipWithError(result.error.c_str());
            return;
        }
    }
    state.counters["Mpx/s"] =
        benchmark::Counter(double(state.iterations()) * Side * Side / 1e6, benchmark::Counter::kIsRate);
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
    Register();
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
