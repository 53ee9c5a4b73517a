// Twirl and sphere in megapixels per second on a 4096 × 4096 RGBA8 image: a 90-degree twirl and a sphere of
// intensity 50 over the whole image (radius 2048 about the middle), on the processor with 1 and 2 threads and
// on the OpenCL device.
//
//   distort_bench [--benchmark_filter=...]
//
// Every render is the whole image through RenderImage in 256-pixel tiles; device renders include copying the
// source to the device and the result back.

#include "filters/distort/RasterSphereCommand.h"
#include "filters/distort/RasterTwirlCommand.h"
#include "pipeline/RenderJob.h"

#include <benchmark/benchmark.h>

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

enum class Path { Processor1, Processor2, OpenCL };

void Render(benchmark::State& state, const RasterTools::PipelineCommand* command, Path path) {
    const auto source = Image();
    auto destination = Raster::DynamicBuffer::Create(Side, Side, PixelFormat::RGBA8);
    RasterTools::RenderJobOptions options;
    options.tileSize = 256;
    options.threads = path == Path::Processor2 ? 2 : 1;
    if (path == Path::OpenCL) {
        options.device = Raster::Hardware::GetDevice("opencl");
        if (!options.device) {
            state.SkipWithError("no OpenCL device");
            return;
        }
    }
    long processorTiles = 0;
    for (auto _ : state) {
        const auto result = RasterTools::RenderImage(*command, source, destination, nullptr, options);
        if (!result.complete) {
            state.SkipWithError(result.error.c_str());
            return;
        }
        processorTiles += result.processorTiles;
    }
    if (path == Path::OpenCL && processorTiles > 0) state.SkipWithError("tiles fell back to the processor");
    state.counters["Mpx/s"] =
        benchmark::Counter(double(state.iterations()) * Side * Side / 1e6, benchmark::Counter::kIsRate);
}

void Register() {
    static const Kernel::Counted<RasterTools::RasterTwirlCommand> twirl(
        new RasterTools::RasterTwirlCommand(false, 90.0, Side / 2.0, RasterTools::UnsetCentre));
    static const Kernel::Counted<RasterTools::RasterSphereCommand> sphere(
        new RasterTools::RasterSphereCommand(false, 50.0, Side / 2.0, RasterTools::UnsetCentre));
    const std::pair<const char*, const RasterTools::PipelineCommand*> commands[] = {
        {"twirl/90", twirl.Get()}, {"sphere/50", sphere.Get()}};
    const std::pair<Path, const char*> paths[] = {{Path::Processor1, "processor/threads:1"},
                                                  {Path::Processor2, "processor/threads:2"},
                                                  {Path::OpenCL, "opencl"}};
    for (const auto& [name, command] : commands)
        for (const auto& [path, label] : paths)
            benchmark::RegisterBenchmark((std::string(name) + "/RGBA8/" + label).c_str(), Render, command,
                                         path)
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
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
