// The pixel pipeline's throughput in megapixels per second: same-format copies and format conversions on the
// processor (1 and 2 threads) and on the OpenCL device, and memcpy of the same bytes for scale.
//
//   pipeline_bench [--benchmark_filter=...]        (the Lab pairs alone: --benchmark_filter='convert/.*Lab')
//
// Every render is a whole 2048 × 2048 image through RenderImage in 256-pixel tiles; device renders include
// copying the source to the device and the result back.

#include "bench/BenchSupport.h"
#include "filters/copy/RasterCopyCommand.h"

#include <cstring>
#include <vector>

namespace {

using Raster::PixelFormat;
using RasterTools::RasterCopyCommand;

constexpr int Side = 2048;

// memcpy of as many bytes as one image of the format.
void Memcpy(benchmark::State& state, PixelFormat format) {
    const auto from = Bench::MakeImage(Side, format);
    auto to = Raster::DynamicBuffer::Create(Side, Side, format);
    for (auto _ : state) {
        std::memcpy(to->RowBytes(0), from->RowBytes(0), from->GetStorageBytes());
        benchmark::DoNotOptimize(to->RowBytes(0));
        benchmark::ClobberMemory();
    }
    Bench::ReportPixels(state, Side);
}

void Render(benchmark::State& state, PixelFormat from, PixelFormat to, Bench::Path path) {
    const RasterCopyCommand command(false, int(to), Kernel::PointT<double>{1.0, 1.0});
    Bench::RenderWhole(state, command, Bench::MakeImage(Side, from), to, Bench::SetupFor(path));
}

void Register() {
    const std::pair<PixelFormat, PixelFormat> conversions[] = {
        {PixelFormat::RGBA8, PixelFormat::RGBA16},  {PixelFormat::RGBA16, PixelFormat::RGBA8},
        {PixelFormat::RGBA8, PixelFormat::RGBAUF},  {PixelFormat::RGBAUF, PixelFormat::RGBA8},
        {PixelFormat::RGBA8, PixelFormat::IA8},     {PixelFormat::RGBA8, PixelFormat::CMYKA8},
        {PixelFormat::CMYKA8, PixelFormat::RGBA8},  {PixelFormat::RGBA16, PixelFormat::LabA16},
        {PixelFormat::LabA16, PixelFormat::RGBA16}, {PixelFormat::RGBA8, PixelFormat::LabA16},
        {PixelFormat::LabA16, PixelFormat::RGBA8},  {PixelFormat::RGBAUF, PixelFormat::LabA16},
        {PixelFormat::LabA16, PixelFormat::RGBAUF}, {PixelFormat::CMYKA8, PixelFormat::LabA16},
        {PixelFormat::LabA16, PixelFormat::CMYKA8}};
    for (PixelFormat format : Bench::LayerFormats) {
        const std::string name(Raster::GetPixelFormatName(format));
        benchmark::RegisterBenchmark(("memcpy/" + name).c_str(), Memcpy, format)
            ->Unit(benchmark::kMillisecond);
        for (const auto& [path, label] : Bench::Paths)
            benchmark::RegisterBenchmark(("copy/" + name + "/" + label).c_str(), Render, format, format, path)
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
    }
    for (const auto& [from, to] : conversions) {
        const std::string name = std::string(Raster::GetPixelFormatName(from)) + "->" +
                                 std::string(Raster::GetPixelFormatName(to));
        for (const auto& [path, label] : Bench::Paths)
            benchmark::RegisterBenchmark(("convert/" + name + "/" + label).c_str(), Render, from, to, path)
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
    }
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
