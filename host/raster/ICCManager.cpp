#include "host/raster/ICCManager.h"

#include "host/raster/LabMath.h"

#include <algorithm>
#include <cstring>

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
// 65535 in, and scaled, 0.5 added and truncated (saturating) out. Built for AVX2 and for any x86-64, picked
// when the library loads.
__attribute__((target_clones("avx2", "default"))) void ToStored(Planes& p, int n) noexcept {
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

__attribute__((target_clones("avx2", "default"))) void FromStored(Planes& p, int n) noexcept {
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

} // namespace

ICCManager& ICCManager::GetInstance() {
    // Never destroyed: a rendering thread may still convert while the process is shutting down.
    static ICCManager* const instance = new ICCManager();
    return *instance;
}

void ICCManager::DoRGBAFToLABA16Transform(unsigned char* in, unsigned char* out, int count) {
    Planes p;
    for (int done = 0; done < count; done += ChunkPixels) {
        const int n = std::min(ChunkPixels, count - done);
        for (int i = 0; i < n; ++i) {
            float4 rgb;
            std::memcpy(&rgb, in + std::size_t(done + i) * sizeof rgb, sizeof rgb);
            p.c[0][i] = rgb.x;
            p.c[1][i] = rgb.y;
            p.c[2][i] = rgb.z;
            p.c[3][i] = rgb.w;
        }
        ToStored(p, n);
        for (int i = 0; i < n; ++i) {
            // Whole numbers 0..65535, exact in float.
            const ushort4 lab =
                make_ushort4(ushort(p.c[0][i]), ushort(p.c[1][i]), ushort(p.c[2][i]), ushort(p.c[3][i]));
            std::memcpy(out + std::size_t(done + i) * sizeof lab, &lab, sizeof lab);
        }
    }
}

void ICCManager::DoLABA16ToRGBAFTransform(unsigned char* in, unsigned char* out, int count) {
    Planes p;
    for (int done = 0; done < count; done += ChunkPixels) {
        const int n = std::min(ChunkPixels, count - done);
        for (int i = 0; i < n; ++i) {
            ushort4 lab;
            std::memcpy(&lab, in + std::size_t(done + i) * sizeof lab, sizeof lab);
            const float4 stored = convert_float4(lab);
            p.c[0][i] = stored.x;
            p.c[1][i] = stored.y;
            p.c[2][i] = stored.z;
            p.c[3][i] = stored.w;
        }
        FromStored(p, n);
        for (int i = 0; i < n; ++i) {
            const float4 rgb = make_float4(p.c[0][i], p.c[1][i], p.c[2][i], p.c[3][i]);
            std::memcpy(out + std::size_t(done + i) * sizeof rgb, &rgb, sizeof rgb);
        }
    }
}

} // namespace Raster
