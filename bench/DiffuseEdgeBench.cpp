// Diffuse and vertical edge detect in megapixels per second, per layer format, on the processor with 1 and 2
// threads and on the OpenCL device.
//
//   diffuse_edge_bench [--benchmark_filter=...]
//
// Every render is a whole 4096 × 4096 image through RenderImage in 256-pixel tiles; device renders include
// copying the source to the device and the result back. Diffuse scatters up to 5 pixels (intensity 0.01),
// as far as ImageMagick's -spread 5 in bench/compare_peers.sh.

#include "filters/tonal/RasterDiffuseCommand.h"
#include "filters/tonal/RasterVerticalEdgeDetectCommand.h"
#include "pipeline/RenderJob.h"

#include <benchmark/benchmark.h>

#include <string>

namespace {

using Raster::PixelFormat;

constexpr int Side = 4096;

Kernel::Counted<Raster::DynamicBuffer> Image(PixelFormat format) {
    auto image = Raster::DynamicBuffer::Create(Side, Side, format);
    std::uint32_t state = 12345;
    for (int y = 0; y < Side; ++y) {
        auto* row = reinterpret_cast<unsigned char*>(image->RowBytes(y));
        if (Raster::IsFloatFormat(format)) {
            auto* values = reinterpret_cast<float*>(row);
            for (std::size_t i = 0; i < image->GetRowBytes() / 4; ++i)
                values[i] = float((state = state * 1664525u + 1013904223u) >> 16) / 65535.0f;
        } else {
            for (std::size_t i = 0; i < image->GetRowBytes(); ++i)
                row[i] = static_cast<unsigned char>((state = state * 1664525u + 1013904223u) >> 24);
        }
    }
    return image;
}

enum class Path { Processor1, Processor2, OpenCL };

void Render(benchmark::State& state, const RasterTools::PipelineCommand* command, PixelFormat format,
            Path path) {
    const auto source = Image(format);
    auto destination = Raster::DynamicBuffer::Create(Side, Side, format);
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
    // Kept for the process: the benchmarks hold plain pointers to them.
    static const auto diffuse = Kernel::MakeCounted<RasterTools::RasterDiffuseCommand>(false, 0.01);
    static const auto edge = Kernel::MakeCounted<RasterTools::RasterVerticalEdgeDetectCommand>();
    const std::pair<const RasterTools::PipelineCommand*, const char*> commands[] = {
        {diffuse.Get(), "diffuse"}, {edge.Get(), "edge"}};
    const PixelFormat layers[] = {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF,
                                  PixelFormat::IA8,   PixelFormat::IA16,   PixelFormat::CMYKA8,
                                  PixelFormat::LabA16};
    const std::pair<Path, const char*> paths[] = {{Path::Processor1, "processor/threads:1"},
                                                  {Path::Processor2, "processor/threads:2"},
                                                  {Path::OpenCL, "opencl"}};
    for (const auto& [command, name] : commands)
        for (PixelFormat format : layers)
            for (const auto& [path, label] : paths) {
                const std::string full =
                    std::string(name) + "/" + std::string(Raster::GetPixelFormatName(format)) + "/" + label;
                benchmark::RegisterBenchmark(full.c_str(), Render, command, format, path)
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
