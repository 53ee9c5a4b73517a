#pragma once
// What the benchmark programs share: seeded test images, whole-image renders timed per iteration, and main.

#include "pipeline/RenderJob.h"

#include <benchmark/benchmark.h>

#include <span>
#include <utility>

namespace Bench {

// Where a render runs.
enum class Path { Processor1, Processor2, OpenCL };
inline constexpr std::pair<Path, const char*> Paths[] = {{Path::Processor1, "processor/threads:1"},
                                                         {Path::Processor2, "processor/threads:2"},
                                                         {Path::OpenCL, "opencl"}};

inline constexpr Raster::PixelFormat LayerFormats[] = {
    Raster::PixelFormat::RGBA8, Raster::PixelFormat::RGBA16, Raster::PixelFormat::RGBAUF,
    Raster::PixelFormat::IA8,   Raster::PixelFormat::IA16,   Raster::PixelFormat::CMYKA8,
    Raster::PixelFormat::LabA16};

// A side × side image of seeded noise: every byte for integer formats, values in 0..1 for float ones.
Kernel::Counted<Raster::DynamicBuffer> MakeImage(int side, Raster::PixelFormat format);

struct RenderSetup {
    int tileSize = 256;
    int threads = 1;
    bool opencl = false; // on the OpenCL device; a tile that falls back to the processor fails the benchmark
};
RenderSetup SetupFor(Path path);

// Renders all of source through command into one destination of destFormat, once per iteration, and reports
// megapixels per second. Skips with a message when the device is missing or a render fails.
void RenderWhole(benchmark::State& state, const RasterTools::PipelineCommand& command,
                 const Kernel::Counted<Raster::DynamicBuffer>& source, Raster::PixelFormat destFormat,
                 const RenderSetup& setup);

// Registers "NAME/RGBA8/PATH" for each named command and path: the whole of a side × side RGBA8 image of
// seeded noise rendered into RGBA8 (RenderWhole).
using NamedCommand = std::pair<const char*, const RasterTools::PipelineCommand*>;
void RegisterRGBA8Renders(int side, std::span<const NamedCommand> commands);

// The "Mpx/s" counter for one side × side image per iteration.
void ReportPixels(benchmark::State& state, int side);

// main: registers, then runs what the command line selects.
int Main(int argc, char** argv, void (*registerBenchmarks)());

} // namespace Bench
