// The pixel brush: dabs per second straight into a layer, per layer format and brush size; a whole stroke
// through a document's history; and what a snapshot of a 4096 × 4096 document costs in memory once a stroke
// changes it.
//
//   brush_bench [--benchmark_filter=...]
//
// Counters: dabs/s (dab rate), kept_MiB (the snapshot's memory after the stroke), layer_MiB (the layer's).

#include "bench/BenchSupport.h"
#include "brushes/RasterPixelBrushCommand.h"
#include "host/document/DocumentController.h"
#include "host/document/PixelEffect.h"

#include <string>

namespace {

using Raster::PixelFormat;

constexpr int Side = 4096;

Kernel::Counted<Raster::RasterBrush> Brush(double size) {
    Kernel::Counted<Raster::RasterBrush> brush(new Raster::SquareRasterBrush());
    brush->SetSize(size);
    return brush;
}

// A diagonal stroke of whole-pixel dabs across the image.
std::vector<Raster::BrushNozzle> Diagonal(int count, double size) {
    std::vector<Raster::BrushNozzle> nozzles(static_cast<std::size_t>(count));
    for (int i = 0; i < count; ++i)
        nozzles[std::size_t(i)].rect = {double(i), double(i), double(i) + size, double(i) + size};
    return nozzles;
}

void Dabs(benchmark::State& state, PixelFormat format, double size) {
    const auto image = Bench::MakeImage(Side, format);
    const int count = 2048;
    const RasterTools::RasterPixelBrushCommand command({0.9f, 0.2f, 0.4f, 1.0f}, Diagonal(count, size), {},
                                                       Brush(size));
    for (auto _ : state)
        for (const auto& stored : command.GetNozzles()) {
            Raster::BrushNozzle nozzle = stored;
            nozzle.bitmap = image;
            command.PerformNozzle(nozzle);
        }
    state.counters["dabs/s"] =
        benchmark::Counter(double(count), benchmark::Counter::kIsIterationInvariantRate);
}

// The stroke through history: a working copy of the layer, the dabs, and the changed rectangle kept for undo.
void StrokeThroughHistory(benchmark::State& state) {
    auto document = Kernel::MakeCounted<Document>();
    auto layer = Kernel::MakeCounted<RasterNode>("layer", Bench::MakeImage(Side, PixelFormat::RGBA8));
    document->InsertLayer(0, layer);
    document->SetSelection({layer});
    const Kernel::Counted<RasterCommand> command(
        new RasterTools::RasterPixelBrushCommand({1, 0, 0, 1}, Diagonal(512, 3), {}, Brush(3)));
    for (auto _ : state) {
        if (ApplyPixelCommand(*document, command)) state.SkipWithError("the stroke was not applied");
        document->Undo();
    }
}

void SnapshotMemory(benchmark::State& state) {
    auto document = Kernel::MakeCounted<Document>();
    auto layer = Kernel::MakeCounted<RasterNode>("layer", Bench::MakeImage(Side, PixelFormat::RGBA8));
    document->InsertLayer(0, layer);
    document->SetSelection({layer});
    auto controller = Kernel::MakeCounted<DocumentController>(document);
    const int length = int(state.range(0));
    const Kernel::Counted<RasterCommand> command(
        new RasterTools::RasterPixelBrushCommand({1, 0, 0, 1}, Diagonal(length, 1), {}, Brush(1)));
    std::size_t kept = 0;
    for (auto _ : state) {
        const auto snapshot = controller->NominateSnapshot();
        if (ApplyPixelCommand(*document, command)) state.SkipWithError("the stroke was not applied");
        kept = snapshot->GetKeptBytes();
        document->Undo();
        controller->SetCurrentSnapshot({});
    }
    state.counters["kept_MiB"] = double(kept) / double(1 << 20);
    state.counters["layer_MiB"] = double(layer->GetPixels()->GetStorageBytes()) / double(1 << 20);
}

void Register() {
    for (PixelFormat format : Bench::LayerFormats)
        for (const double size : {1.0, 16.0, 64.0}) {
            const std::string name = "brush/dabs/" + std::string(Raster::GetPixelFormatName(format)) +
                                     "/size" + std::to_string(int(size));
            benchmark::RegisterBenchmark(name.c_str(), Dabs, format, size)->Unit(benchmark::kMillisecond);
        }
    benchmark::RegisterBenchmark("brush/stroke-through-history/rgba8/4096", StrokeThroughHistory)
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
    // A diagonal stroke of 10, 1000 and 4096 pixels: its bounding box decides the tiles kept.
    benchmark::RegisterBenchmark("brush/snapshot-memory/rgba8/4096", SnapshotMemory)
        ->Arg(10)
        ->Arg(1000)
        ->Arg(4096)
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
