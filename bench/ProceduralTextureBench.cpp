// Procedural textures in megapixels per second on a 4096 × 4096 RGBA8 image: a one-channel texture
// (R = sin(x / 20) * 0.5 + 0.5) and a three-channel one of about fifteen operations with a noise call, on the
// processor with 1 and 2 threads and on the OpenCL device.
//
//   procedural_texture_bench [--benchmark_filter=...]
//
// Every render is the whole image through RenderImage in 256-pixel tiles; device renders include copying the
// source to the device and the result back. The device's kernel is built once per texture and kept for the
// process, as a live layer's is: the first device render, which waits for the build, is made before timing
// and reported on its own ("first_s"). PoCL's thread count is its own: POCL_CPU_MAX_CU_NUM=1 (or
// POCL_MAX_PTHREAD_COUNT=1) gives it one thread.

#include "bench/BenchSupport.h"
#include "filters/generate/ProceduralTextureCommand.h"

#include "host/raster/device/Hardware.h"

#include <chrono>
#include <string>

namespace {

using Raster::PixelFormat;

constexpr int Side = 4096;

// The texts that bench/compare_peers.sh gives the peers too.
constexpr const char* OneChannel = "sin(x / 20) * 0.5 + 0.5";
constexpr const char* ThreeChannels = "t = noise(x / 64, y / 64); vec3(fract(x / 37 + t), abs(sin(y / 23 - t "
                                      "* 2)), clamp(x / w * 0.5 + t * 0.5, 0, 1))";

Kernel::Counted<RasterTools::ProceduralTextureCommand> Make(const char* text, std::uint32_t mask) {
    using Config = ProceduralTextureConfig;
    const auto config = Config::CreateEmpty(Config::RGB)
                            ->ChangeAnglesInRadians(true)
                            ->AddEquation(ProceduralTextureEquation(text, mask));
    return Kernel::MakeCounted<RasterTools::ProceduralTextureCommand>(false, Kernel::PointT<double>{}, 1.0, 0,
                                                                      config, nullptr);
}

void Register() {
    static const auto one = Make(OneChannel, 1);
    static const auto three = Make(ThreeChannels, 7);
    const Bench::NamedCommand commands[] = {{"texture/1-channel", one.Get()},
                                            {"texture/3-channel", three.Get()}};
    for (const auto& [name, command] : commands)
        for (const auto& [path, label] : Bench::Paths)
            benchmark::RegisterBenchmark(
                (std::string(name) + "/RGBA8/" + label).c_str(),
                [command, path](benchmark::State& state) {
                    const auto source = Bench::MakeImage(Side, PixelFormat::RGBA8);
                    const Bench::RenderSetup setup = Bench::SetupFor(path);
                    if (setup.opencl) {
                        const auto device = Raster::Hardware::GetDevice("opencl");
                        if (!device) {
                            state.SkipWithError("no OpenCL device");
                            return;
                        }
                        auto destination = Raster::DynamicBuffer::Create(Side, Side, PixelFormat::RGBA8);
                        RasterTools::RenderJobOptions options;
                        options.tileSize = setup.tileSize;
                        options.device = device;
                        const auto start = std::chrono::steady_clock::now();
                        RasterTools::RenderImage(*command, source, destination, nullptr, options);
                        state.counters["first_s"] =
                            std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
                    }
                    Bench::RenderWhole(state, *command, source, PixelFormat::RGBA8, setup);
                })
                ->Unit(benchmark::kMillisecond)
                ->UseRealTime();
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
