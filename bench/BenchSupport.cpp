// Shared pieces of the benchmark programs.
#include "bench/BenchSupport.h"

#include <cstdint>
#include <string>

namespace Bench {

Kernel::Counted<Raster::DynamicBuffer> MakeImage(int side, Raster::PixelFormat format) {
    auto image = Raster::DynamicBuffer::Create(side, side, format);
    std::uint32_t state = 12345;
    const auto next = [&state] { return state = state * 1664525u + 1013904223u; };
    for (int y = 0; y < side; ++y) {
        auto* row = reinterpret_cast<unsigned char*>(image->RowBytes(y));
        if (Raster::IsFloatFormat(format)) {
            auto* values = reinterpret_cast<float*>(row);
            for (std::size_t i = 0; i < image->GetRowBytes() / 4; ++i)
                values[i] = float(next() >> 16) / 65535.0f;
        } else {
            for (std::size_t i = 0; i < image->GetRowBytes(); ++i)
                row[i] = static_cast<unsigned char>(next() >> 24);
        }
    }
    return image;
}

RenderSetup SetupFor(Path path) {
    return {.tileSize = 256, .threads = path == Path::Processor2 ? 2 : 1, .opencl = path == Path::OpenCL};
}

void RenderWhole(benchmark::State& state, const RasterTools::PipelineCommand& command,
                 const Kernel::Counted<Raster::DynamicBuffer>& source, Raster::PixelFormat destFormat,
                 const RenderSetup& setup) {
    auto destination = Raster::DynamicBuffer::Create(source->GetWidth(), source->GetHeight(), destFormat);
    RasterTools::RenderJobOptions options;
    options.tileSize = setup.tileSize;
    options.threads = setup.threads;
    if (setup.opencl) {
        options.device = Raster::Hardware::GetDevice("opencl");
        if (!options.device) {
            state.SkipWithError("no OpenCL device");
            return;
        }
    }
    // One render before the timing: the destination's first touch and a device's kernel build belong to the
    // first render only, and slow filters run only a few timed iterations, which would count them as speed.
    if (const auto warmUp = RasterTools::RenderImage(command, source, destination, nullptr, options);
        !warmUp.complete) {
        state.SkipWithError(warmUp.error.c_str());
        return;
    }
    long processorTiles = 0;
    for (auto _ : state) {
        const auto result = RasterTools::RenderImage(command, source, destination, nullptr, options);
        if (!result.complete) {
            state.SkipWithError(result.error.c_str());
            return;
        }
        processorTiles += result.processorTiles;
    }
    if (setup.opencl && processorTiles > 0) state.SkipWithError("tiles fell back to the processor");
    ReportPixels(state, source->GetWidth());
}

void RegisterRGBA8Renders(int side, std::span<const NamedCommand> commands) {
    for (const auto& [name, command] : commands)
        for (const auto& [path, label] : Paths)
            benchmark::RegisterBenchmark((std::string(name) + "/RGBA8/" + label).c_str(),
                                         [side, command, path](benchmark::State& state) {
                                             RenderWhole(state, *command,
                                                         MakeImage(side, Raster::PixelFormat::RGBA8),
                                                         Raster::PixelFormat::RGBA8, SetupFor(path));
                                         })
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
}

void ReportPixels(benchmark::State& state, int side) {
    state.counters["Mpx/s"] =
        benchmark::Counter(double(state.iterations()) * side * side / 1e6, benchmark::Counter::kIsRate);
}

int Main(int argc, char** argv, void (*registerBenchmarks)()) {
    registerBenchmarks();
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}

} // namespace Bench
