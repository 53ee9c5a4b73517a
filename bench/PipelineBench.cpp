// The pixel pipeline's throughput in megapixels per second: same-format copies and format conversions on the
// processor (1 and 2 threads) and on the OpenCL device, and memcpy of the same bytes for scale.
//
//   pipeline_bench [--benchmark_filter=...]
//
// Every render is a whole 2048 × 2048 image through RenderImage in 256-pixel tiles; device renders include
// copying the source to the device and the result back.

#include "filters/copy/RasterCopyCommand.h"
#include "pipeline/RenderJob.h"

#include <benchmark/benchmark.h>

#include <cstring>
#include <vector>

namespace {

using Raster::PixelFormat;
using RasterTools::RasterCopyCommand;

constexpr int Side = 2048;

Kernel::Counted<Raster::DynamicBuffer> Image(PixelFormat format) {
    auto image = Raster::DynamicBuffer::Create(Side, Side, format);
    std::uint32_t state = 12345;
    for (int y = 0; y < Side; ++y) {
        auto* row = reinterpret_cast<unsigned char*>(image->RowBytes(y));
        if (Raster::IsFloatFormat(format)) {
            auto* values = reinterpret_cast<float*>(row);
            for (std::size_t i = 0; i < image->GetRowBytes() / 4; ++i)
                values[i] = float((state = state * 214013u + 2531011u) >> 16) / 65535.0f;
        } else {
            for (std::size_t i = 0; i < image->GetRowBytes(); ++i)
                row[i] = static_cast<unsigned char>((state = state * 214013u + 2531011u) >> 16);
        }
    }
    return image;
}

void ReportPixels(benchmark::State& state) {
    state.counters["Mpx/s"] =
        benchmark::Counter(double(state.iterations()) * Side * Side / 1e6, benchmark::Counter::kIsRate);
}

// memcpy of as many bytes as one image of the format.
void Memcpy(benchmark::State& state, PixelFormat format) {
    const auto from = Image(format);
    auto to = Raster::DynamicBuffer::Create(Side, Side, format);
    for (auto _ : state) {
        std::memcpy(to->RowBytes(0), from->RowBytes(0), from->GetStorageBytes());
        benchmark::DoNotOptimize(to->RowBytes(0));
        benchmark::ClobberMemory();
    }
    ReportPixels(state);
}

enum class Path { Processor1, Processor2, OpenCL };

void Render(benchmark::State& state, PixelFormat from, PixelFormat to, Path path) {
    const auto source = Image(from);
    auto destination = Raster::DynamicBuffer::Create(Side, Side, to);
    const RasterCopyCommand command(false, int(to), Kernel::PointT<double>{1.0, 1.0});
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
        const auto result = RasterTools::RenderImage(command, source, destination, nullptr, options);
        if (!result.complete) {
            state.SkipWithError(result.error.c_str());
            return;
        }
        processorTiles += result.processorTiles;
    }
    if (path == Path::OpenCL && processorTiles > 0) state.SkipWithError("tiles fell back to the processor");
    ReportPixels(state);
}

void Register() {
    const PixelFormat layers[] = {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF,
                                  PixelFormat::IA8,   PixelFormat::IA16,   PixelFormat::CMYKA8,
                                  PixelFormat::LabA16};
    const std::pair<PixelFormat, PixelFormat> conversions[] = {
        {PixelFormat::RGBA8, PixelFormat::RGBA16}, {PixelFormat::RGBA16, PixelFormat::RGBA8},
        {PixelFormat::RGBA8, PixelFormat::RGBAUF}, {PixelFormat::RGBAUF, PixelFormat::RGBA8},
        {PixelFormat::RGBA8, PixelFormat::IA8},    {PixelFormat::RGBA8, PixelFormat::CMYKA8},
        {PixelFormat::CMYKA8, PixelFormat::RGBA8}, {PixelFormat::RGBA16, PixelFormat::LabA16},
        {PixelFormat::LabA16, PixelFormat::RGBA16}};
    const std::pair<Path, const char*> paths[] = {{Path::Processor1, "processor/threads:1"},
                                                  {Path::Processor2, "processor/threads:2"},
                                                  {Path::OpenCL, "opencl"}};
    for (PixelFormat format : layers) {
        const std::string name(Raster::GetPixelFormatName(format));
        benchmark::RegisterBenchmark(("memcpy/" + name).c_str(), Memcpy, format)
            ->Unit(benchmark::kMillisecond);
        for (const auto& [path, label] : paths)
            benchmark::RegisterBenchmark(("copy/" + name + "/" + label).c_str(), Render, format, format, path)
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
    }
    for (const auto& [from, to] : conversions) {
        const std::string name = std::string(Raster::GetPixelFormatName(from)) + "->" +
                                 std::string(Raster::GetPixelFormatName(to));
        for (const auto& [path, label] : paths)
            benchmark::RegisterBenchmark(("convert/" + name + "/" + label).c_str(), Render, from, to, path)
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
