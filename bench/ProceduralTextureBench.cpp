// Procedural textures in megapixels per second on a 4096 × 4096 RGBA8 image: a one-channel texture
// (R = sin(x / 20) * 0.5 + 0.5) and a three-channel one of about fifteen operations with a noise call, on the
// processor with 1 and 2 threads and on the OpenCL device.
//
//   procedural_texture_bench [--benchmark_filter=...]
//
// Every render is the whole image through RenderImage in 256-pixel tiles; device renders include copying the
// source to the device and the result back.

#include "bench/BenchSupport.h"
#include "filters/generate/ProceduralTextureCommand.h"

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
    Bench::RegisterRGBA8Renders(Side, commands);
}

} // namespace

int main(int argc, char** argv) {
    return Bench::Main(argc, argv, Register);
}
