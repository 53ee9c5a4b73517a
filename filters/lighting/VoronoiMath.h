#pragma once
// The Voronoi cells' arithmetic, written once: processor code expands it here and the Sample stage's kernel
// text pastes the very same tokens (VoronoiMath::GetSourceText), so both paths place sites, find the closest
// one and weigh borders alike.
//
// The source is in the dialect of host/raster/KernelMath.h (OpenCL C, CUDA C++ and host C++ at once).
// RT_VORONOI_FUNCTION starts every function, RT_VORONOI_SQRT names the language's single-precision square
// root, RT_VORONOI_U64 and RT_VORONOI_I64 its 64-bit integers and RT_VORONOI_CONSTANT(x) an unsigned 64-bit
// literal. All 64-bit arithmetic wraps modulo 2^64 in every language.

#include "host/raster/KernelMath.h"

#include <cmath>
#include <cstdint>

// Sites sit on a grid of square cells of `cell` pixels whose corner (0, 0) is `origin`. Each grid cell (row,
// col) holds one site, jittered within the middle 60% of the cell by two draws of a 64-bit generator seeded
// from the cell's place on a square spiral (rings of growing radius around (0, 0)); the seed formula gives
// some cells of neighbouring rings the same seed ((1, 1) and (-2, -2) both 20), and that is kept. A site is
// always a pixel centre.
//
// A pixel's grid cell truncates toward zero; its closest site is the first smallest squared distance among
// the 3 × 3 cells around it, in row-major order. Its distance to the cell border is the smallest distance to
// the perpendicular bisectors between the closest site and the sites of the 8 cells around the closest one
// (an edge holds the bisector's midpoint and direction; its scale is one over the direction's length). A
// border line of width w covers that distance with a one-pixel linear ramp. Sites less than √2 pixels
// farther than the closest lend their colour with the weight (1 - dx)(1 - dy), which softens cell borders by
// about a pixel. Cell indices are limited to ±2^28, so that neighbours and seeds never overflow.
#define RT_VORONOI_SOURCE                                                                                    \
    RT_VORONOI_FUNCTION int VoronoiCellIndex(float coordinate, float origin, float cell) {                   \
        return rt_clampi(rt_sat_int((coordinate - origin) / cell), -268435456, 268435456);                   \
    }                                                                                                        \
    RT_VORONOI_FUNCTION RT_VORONOI_U64 VoronoiSeed(int row, int col) {                                       \
        const RT_VORONOI_I64 r = (RT_VORONOI_I64)row;                                                        \
        const RT_VORONOI_I64 c = (RT_VORONOI_I64)col;                                                        \
        const RT_VORONOI_I64 ar = r < 0 ? -r : r;                                                            \
        const RT_VORONOI_I64 ac = c < 0 ? -c : c;                                                            \
        const RT_VORONOI_I64 radius = ar > ac ? ar : ac;                                                     \
        if (radius == 0) return (RT_VORONOI_U64)2;                                                           \
        const RT_VORONOI_U64 d = (RT_VORONOI_U64)(2 * radius + 1);                                           \
        const RT_VORONOI_U64 seed = (RT_VORONOI_U64)1 + (d - (RT_VORONOI_U64)2) * (d - (RT_VORONOI_U64)2) +  \
                                    (RT_VORONOI_U64)(r + radius) * d + (RT_VORONOI_U64)(c + radius);         \
        return seed * (RT_VORONOI_U64)2;                                                                     \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float VoronoiRandom(RT_VORONOI_U64 v) {                                              \
        v = v * RT_VORONOI_CONSTANT(3935559000370003845);                                                    \
        v = v + RT_VORONOI_CONSTANT(2691343689449507681);                                                    \
        v = v ^ (v >> 21);                                                                                   \
        v = v ^ (v << 37);                                                                                   \
        v = v ^ (v >> 4);                                                                                    \
        v = v * RT_VORONOI_CONSTANT(4768777513237032717);                                                    \
        v = v ^ (v << 20);                                                                                   \
        v = v ^ (v >> 41);                                                                                   \
        v = v ^ (v << 5);                                                                                    \
        return 5.42101086242752217E-20f * (float)v;                                                          \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float2 VoronoiSite(int row, int col, float cell, float2 origin) {                    \
        const RT_VORONOI_U64 seed = VoronoiSeed(row, col);                                                   \
        const float jitterX = 0.5f + 0.6f * (VoronoiRandom(seed) - 0.5f);                                    \
        const float jitterY = 0.5f + 0.6f * (VoronoiRandom(seed + (RT_VORONOI_U64)1) - 0.5f);                \
        const float x = rt_floor(cell * ((float)col + jitterX)) + 0.5f;                                      \
        const float y = rt_floor(cell * ((float)row + jitterY)) + 0.5f;                                      \
        return float2_literal(origin.x + x, origin.y + y);                                                   \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float VoronoiDistance2(float2 site, float2 p) {                                      \
        const float dx = site.x - p.x;                                                                       \
        const float dy = site.y - p.y;                                                                       \
        return dx * dx + dy * dy;                                                                            \
    }                                                                                                        \
    RT_VORONOI_FUNCTION int VoronoiClosest(const float2* sites, float2 p, float* d2) {                       \
        int closest = 0;                                                                                     \
        for (int i = 0; i < 9; ++i) {                                                                        \
            d2[i] = VoronoiDistance2(sites[i], p);                                                           \
            if (d2[i] < d2[closest]) closest = i;                                                            \
        }                                                                                                    \
        return closest;                                                                                      \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float4 VoronoiEdge(float2 a, float2 b) {                                             \
        return make_float4((a.x + b.x) * 0.5f, (a.y + b.y) * 0.5f, b.x - a.x, b.y - a.y);                    \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float VoronoiEdgeScale(float4 edge) {                                                \
        return 1.0f / RT_VORONOI_SQRT(edge.z * edge.z + edge.w * edge.w);                                    \
    }                                                                                                        \
    RT_VORONOI_FUNCTION void VoronoiEdges(const float2* ring, float4* edges, float* scales) {                \
        int k = 0;                                                                                           \
        for (int i = 0; i < 9; ++i) {                                                                        \
            if (i == 4) continue;                                                                            \
            edges[k] = VoronoiEdge(ring[4], ring[i]);                                                        \
            scales[k] = VoronoiEdgeScale(edges[k]);                                                          \
            ++k;                                                                                             \
        }                                                                                                    \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float VoronoiEdgeDistance(float4 edge, float scale, float2 p) {                      \
        return rt_fabs((p.x - edge.x) * edge.z + (p.y - edge.y) * edge.w) * scale;                           \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float VoronoiBorderDistance(const float4* edges, const float* scales, float2 p) {    \
        float m = VoronoiEdgeDistance(edges[0], scales[0], p);                                               \
        for (int k = 1; k < 8; ++k)                                                                          \
            m = rt_fmin(m, VoronoiEdgeDistance(edges[k], scales[k], p));                                     \
        return m;                                                                                            \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float VoronoiLineWeight(float m, float lineWidth) {                                  \
        return 1.0f - rt_fmin(rt_fmax(m - lineWidth * 0.5f + 0.5f, 0.0f), 1.0f);                             \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float VoronoiMinDistance(float best) {                                               \
        return RT_VORONOI_SQRT(best);                                                                        \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float VoronoiThreshold(float minD) {                                                 \
        const float t = minD + 1.41421356f;                                                                  \
        return t * t;                                                                                        \
    }                                                                                                        \
    RT_VORONOI_FUNCTION float VoronoiBlendWeight(float d2, float best, float minD, float threshold,          \
                                                 float2 site, float2 p) {                                    \
        if (d2 == best) return 1.0f;                                                                         \
        if (!(d2 < threshold)) return 0.0f;                                                                  \
        const float scale = 1.0f - RT_VORONOI_SQRT(d2) / minD;                                               \
        const float dx = rt_fabs((site.x - p.x) * scale);                                                    \
        const float dy = rt_fabs((site.y - p.y) * scale);                                                    \
        return dx < 1.0f && dy < 1.0f ? (1.0f - dx) * (1.0f - dy) : 0.0f;                                    \
    }

namespace RasterTools::VoronoiMath {

using namespace Raster::KernelMath;
using Raster::KernelMath::make_float4;

// Inlined into the span loops: as calls they cost more than their arithmetic.
#define RT_VORONOI_FUNCTION [[gnu::always_inline]] inline
#define RT_VORONOI_SQRT std::sqrt
#define RT_VORONOI_U64 std::uint64_t
#define RT_VORONOI_I64 std::int64_t
#define RT_VORONOI_CONSTANT(x) x##ULL
RT_VORONOI_SOURCE
#undef RT_VORONOI_CONSTANT
#undef RT_VORONOI_I64
#undef RT_VORONOI_U64
#undef RT_VORONOI_SQRT
#undef RT_VORONOI_FUNCTION

// The sampler block's four floats.
enum SamplerIndex : int {
    CellIndex = 0,      // cell size in output pixels, at least 2
    LineWidthIndex = 1, // border line width in output pixels; 0 draws none
    OriginXIndex = 2,   // the grid's origin: where the layer's (0, 0) lands in the output
    OriginYIndex = 3,
    SamplerFloatCount = 4,
};

// The source as kernel text (one line; the macros named above left for the including text to define).
const char* GetSourceText();

} // namespace RasterTools::VoronoiMath
