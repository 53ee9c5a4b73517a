#include "host/raster/ICCManager.h"

#include "host/kernel/Simd.h"
#include "host/raster/LabMath.h"

#include <algorithm>
#include <cstring>
#include <type_traits>

namespace Raster {

namespace {

using namespace KernelMath;

// Pixels go through planes of up to this many, across which the compiler runs the conversion in vector
// lanes (the same IEEE operations in every lane, so the results are those of one pixel at a time).
constexpr int ChunkPixels = 32;

struct Planes {
    alignas(64) float c[4][ChunkPixels];
};

// The LabA16 Convert bodies' expressions, so that the colour manager gives the kernels' values: stored /
// 65535 in, and scaled, 0.5 added and truncated (saturating) out. Built for AVX2 and for any x86-64 (see
// Kernel::HasAvx2).
inline void ToStoredBody(Planes& p, int n) noexcept {
#pragma omp simd
    for (int i = 0; i < n; ++i) {
        const ushort4 lab = convert_ushort4(
            rgbauf_to_labaf(make_float4(p.c[0][i], p.c[1][i], p.c[2][i], p.c[3][i])) * 65535.0f + 0.5f);
        p.c[0][i] = lab.x;
        p.c[1][i] = lab.y;
        p.c[2][i] = lab.z;
        p.c[3][i] = lab.w;
    }
}

inline void FromStoredBody(Planes& p, int n) noexcept {
#pragma omp simd
    for (int i = 0; i < n; ++i) {
        const float4 rgb = labaf_to_rgbauf(make_float4(p.c[0][i] / 65535.0f, p.c[1][i] / 65535.0f,
                                                       p.c[2][i] / 65535.0f, p.c[3][i] / 65535.0f));
        p.c[0][i] = rgb.x;
        p.c[1][i] = rgb.y;
        p.c[2][i] = rgb.z;
        p.c[3][i] = rgb.w;
    }
}

RT_AVX2_DISPATCH(ToStored, ToStoredBody, (Planes & p, int n), (p, n))
RT_AVX2_DISPATCH(FromStored, FromStoredBody, (Planes & p, int n), (p, n))

// Runs convert over count pixels a chunk at a time: each In pixel spread over the planes, each Out pixel
// gathered from them (whole numbers 0..65535 are exact in float, so the narrowing to ushort4 loses nothing).
template <class In, class Out>
void ConvertInChunks(const unsigned char* in, unsigned char* out, int count,
                     void (*convert)(Planes&, int) noexcept) {
    Planes p;
    for (int done = 0; done < count; done += ChunkPixels) {
        const int n = std::min(ChunkPixels, count - done);
        for (int i = 0; i < n; ++i) {
            In pixel;
            std::memcpy(&pixel, in + std::size_t(done + i) * sizeof pixel, sizeof pixel);
            float4 v;
            if constexpr (std::is_same_v<In, float4>)
                v = pixel;
            else
                v = convert_float4(pixel);
            p.c[0][i] = v.x;
            p.c[1][i] = v.y;
            p.c[2][i] = v.z;
            p.c[3][i] = v.w;
        }
        convert(p, n);
        for (int i = 0; i < n; ++i) {
            Out pixel;
            if constexpr (std::is_same_v<Out, float4>)
                pixel = make_float4(p.c[0][i], p.c[1][i], p.c[2][i], p.c[3][i]);
            else
                pixel =
                    make_ushort4(ushort(p.c[0][i]), ushort(p.c[1][i]), ushort(p.c[2][i]), ushort(p.c[3][i]));
            std::memcpy(out + std::size_t(done + i) * sizeof pixel, &pixel, sizeof pixel);
        }
    }
}

} // namespace

ICCManager& ICCManager::GetInstance() {
    // Never destroyed: a rendering thread may still convert while the process is shutting down.
    static ICCManager* const instance = new ICCManager();
    return *instance;
}

void ICCManager::DoRGBAFToLABA16Transform(unsigned char* in, unsigned char* out, int count) {
    ConvertInChunks<float4, ushort4>(in, out, count, ToStored);
}

void ICCManager::DoLABA16ToRGBAFTransform(unsigned char* in, unsigned char* out, int count) {
    ConvertInChunks<ushort4, float4>(in, out, count, FromStored);
}

} // namespace Raster
