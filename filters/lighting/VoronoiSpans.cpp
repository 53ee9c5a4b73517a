// The Voronoi runs' geometry, built for AVX2 and for any x86-64: blocks of eight pixels at once for the
// source positions, the distances to the sites and to the bisectors, with the same floats as the portable
// loops (no fused multiply-add, the same order of operations, and minima that treat not-a-number as rt_fmin
// and rt_fmax do). A last block may reach past the run into VoronoiRun's room; what it puts there is unused.
#include "filters/lighting/RasterVoronoiCommand.h"
#include "host/kernel/Simd.h"

#if RT_AVX2_BUILD
#include <immintrin.h>
#endif

namespace RasterTools {
namespace {

struct PlainRanges {
    static void Sources(const Raster::AffineTransform::Prepared& t, int x, int y, int count,
                        VoronoiRun& run) noexcept {
        VoronoiSourcesScalar(t, x, y, 0, count, run);
    }
    static void Closest(const float* sx, const float* dyy, int x, int count, VoronoiRun& run) noexcept {
        VoronoiClosestScalar(sx, dyy, x, 0, count, run);
    }
    static void Lines(VoronoiSpanCells& cells, int col, float py, int x, int count, float lineWidth,
                      VoronoiRun& run) noexcept {
        VoronoiLinesScalar(cells, col, py, x, count, lineWidth, run);
    }
};

#if RT_AVX2_BUILD && !defined(__SANITIZE_ADDRESS__)

// The x coordinates of pixels x + i .. x + i + 7.
RT_TARGET_AVX2 inline __m256 PixelsX(int x, int i) noexcept {
    return _mm256_cvtepi32_ps(
        _mm256_add_epi32(_mm256_set1_epi32(x + i), _mm256_setr_epi32(0, 1, 2, 3, 4, 5, 6, 7)));
}

// rt_fmin(a, b): a where b is not a number, else the smaller with a kept on ties.
RT_TARGET_AVX2 inline __m256 Fmin(__m256 a, __m256 b) noexcept {
    return _mm256_blendv_ps(_mm256_min_ps(a, b), a, _mm256_cmp_ps(b, b, _CMP_UNORD_Q));
}

// floor, then rt_sat_int: not-a-number to 0, beyond the ints to the nearest one.
RT_TARGET_AVX2 inline __m256i FloorToInt(__m256 v) noexcept {
    const __m256 whole = _mm256_floor_ps(v);
    __m256i r = _mm256_cvttps_epi32(whole); // INT_MIN for what lies beyond
    r = _mm256_blendv_epi8(
        r, _mm256_set1_epi32(2147483647),
        _mm256_castps_si256(_mm256_cmp_ps(whole, _mm256_set1_ps(2147483647.0f), _CMP_GE_OQ)));
    return _mm256_andnot_si256(_mm256_castps_si256(_mm256_cmp_ps(whole, whole, _CMP_UNORD_Q)), r);
}

// VoronoiEdgeDistance: |(x - midpoint x) × direction x + ey| × scale.
RT_TARGET_AVX2 inline __m256 BisectorDistance(__m256 px, float ex, float ez, float ey, float scale) noexcept {
    const __m256 along = _mm256_add_ps(
        _mm256_mul_ps(_mm256_sub_ps(px, _mm256_set1_ps(ex)), _mm256_set1_ps(ez)), _mm256_set1_ps(ey));
    const __m256 magnitude = _mm256_castsi256_ps(_mm256_set1_epi32(0x7fffffff));
    return _mm256_mul_ps(_mm256_and_ps(along, magnitude), _mm256_set1_ps(scale));
}

// VoronoiLineWeight of VoronoiBorderDistance: 1 - rt_fmin(rt_fmax(m - w / 2 + 0.5, 0), 1); max_ps and min_ps
// keep the second operand where the first is not a number, as rt_fmax and rt_fmin against a number do.
RT_TARGET_AVX2 inline __m256 LineWeight(const VoronoiBisectors& b, __m256 px, float lineWidth) noexcept {
    __m256 m = BisectorDistance(px, b.ex[0], b.ez[0], b.ey[0], b.scales[0]);
    for (int k = 1; k < 8; ++k)
        m = Fmin(m, BisectorDistance(px, b.ex[k], b.ez[k], b.ey[k], b.scales[k]));
    const __m256 ramp =
        _mm256_add_ps(_mm256_sub_ps(m, _mm256_set1_ps(lineWidth * 0.5f)), _mm256_set1_ps(0.5f));
    const __m256 clamped = _mm256_min_ps(_mm256_max_ps(ramp, _mm256_setzero_ps()), _mm256_set1_ps(1.0f));
    return _mm256_sub_ps(_mm256_set1_ps(1.0f), clamped);
}

struct Avx2Ranges {
    // TransformPixelCenterToInt: the centre (x + 0.5, y + 0.5) through x·p0 + y·p1 + p2, x·p3 + y·p4 + p5.
    RT_TARGET_AVX2 static void Sources(const Raster::AffineTransform::Prepared& t, int x, int y, int count,
                                       VoronoiRun& run) noexcept {
        const __m256 cy = _mm256_set1_ps((float)y + 0.5f);
        const __m256 yx = _mm256_mul_ps(cy, _mm256_set1_ps(t.p[1]));
        const __m256 yy = _mm256_mul_ps(cy, _mm256_set1_ps(t.p[4]));
        for (int i = 0; i < count; i += 8) {
            const __m256 cx = _mm256_add_ps(PixelsX(x, i), _mm256_set1_ps(0.5f));
            const __m256 sx = _mm256_add_ps(_mm256_add_ps(_mm256_mul_ps(cx, _mm256_set1_ps(t.p[0])), yx),
                                            _mm256_set1_ps(t.p[2]));
            const __m256 sy = _mm256_add_ps(_mm256_add_ps(_mm256_mul_ps(cx, _mm256_set1_ps(t.p[3])), yy),
                                            _mm256_set1_ps(t.p[5]));
            _mm256_storeu_si256(reinterpret_cast<__m256i*>(run.sourceX + i), FloorToInt(sx));
            _mm256_storeu_si256(reinterpret_cast<__m256i*>(run.sourceY + i), FloorToInt(sy));
        }
    }

    RT_TARGET_AVX2 static void Closest(const float* sx, const float* dyy, int x, int count,
                                       VoronoiRun& run) noexcept {
        for (int i = 0; i < count; i += 8) {
            const __m256 px = PixelsX(x, i);
            __m256 d2[9];
            for (int s = 0; s < 9; ++s) {
                const __m256 dx = _mm256_sub_ps(_mm256_set1_ps(sx[s]), px);
                d2[s] = _mm256_add_ps(_mm256_mul_ps(dx, dx), _mm256_set1_ps(dyy[s]));
            }
            __m256 best = d2[0];
            __m256i closest = _mm256_setzero_si256();
            for (int s = 1; s < 9; ++s) {
                const __m256 less = _mm256_cmp_ps(d2[s], best, _CMP_LT_OQ);
                closest = _mm256_blendv_epi8(closest, _mm256_set1_epi32(s), _mm256_castps_si256(less));
                best = _mm256_blendv_ps(best, d2[s], less);
            }
            const __m256 t = _mm256_add_ps(_mm256_sqrt_ps(best), _mm256_set1_ps(1.41421356f));
            const __m256 threshold = _mm256_mul_ps(t, t);
            __m256i near = _mm256_setzero_si256();
            for (int s = 0; s < 9; ++s)
                near =
                    _mm256_sub_epi32(near, _mm256_castps_si256(_mm256_cmp_ps(d2[s], threshold, _CMP_LT_OQ)));
            const __m256i alone =
                _mm256_and_si256(_mm256_castps_si256(_mm256_cmp_ps(best, threshold, _CMP_LT_OQ)),
                                 _mm256_cmpeq_epi32(near, _mm256_set1_epi32(1)));
            _mm256_storeu_si256(reinterpret_cast<__m256i*>(run.closest + i), closest);
            // alone is all ones or zero per lane: its low bytes, inverted, are the eight flags.
            const __m256i blend = _mm256_andnot_si256(alone, _mm256_set1_epi32(1));
            const __m128i words =
                _mm_packus_epi32(_mm256_castsi256_si128(blend), _mm256_extracti128_si256(blend, 1));
            _mm_storel_epi64(reinterpret_cast<__m128i*>(run.blend + i), _mm_packus_epi16(words, words));
        }
    }

    // A block of eight whose pixels have different closest sites takes each site's weights in turn for the
    // lanes that have it; the bisectors of each site are found once per run.
    RT_TARGET_AVX2 static void Lines(VoronoiSpanCells& cells, int col, float py, int x, int count,
                                     float lineWidth, VoronoiRun& run) noexcept {
        VoronoiBisectors bisectors[9];
        bool known[9] = {};
        for (int i = 0; i < count; i += 8) {
            const __m256i closest = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(run.closest + i));
            const __m256 px = PixelsX(x, i);
            __m256 line = _mm256_setzero_ps();
            __m256i left = _mm256_set1_epi32(-1);
            do {
                const int lane = __builtin_ctz((unsigned)_mm256_movemask_ps(_mm256_castsi256_ps(left)));
                const int site = run.closest[i + lane];
                if (!known[site]) {
                    VoronoiBisectorsOf(cells, col, site, py, bisectors[site]);
                    known[site] = true;
                }
                const __m256i mine = _mm256_cmpeq_epi32(closest, _mm256_set1_epi32(site));
                line = _mm256_blendv_ps(line, LineWeight(bisectors[site], px, lineWidth),
                                        _mm256_castsi256_ps(mine));
                left = _mm256_andnot_si256(mine, left);
            } while (!_mm256_testz_si256(left, left));
            _mm256_storeu_ps(run.line + i, line);
        }
    }
};

RT_TARGET_AVX2 void RunGeometryAvx2(VoronoiSpanCells& cells, const Raster::AffineTransform::Prepared& t,
                                    int col, int x, int y, int count, float lineWidth,
                                    VoronoiRun& run) noexcept {
    VoronoiRunGeometryWith<Avx2Ranges>(cells, t, col, x, y, count, lineWidth, run);
}

#endif

} // namespace

void VoronoiRunGeometry(VoronoiSpanCells& cells, const Raster::AffineTransform::Prepared& t, int col, int x,
                        int y, int count, float lineWidth, VoronoiRun& run) noexcept {
#if RT_AVX2_BUILD && !defined(__SANITIZE_ADDRESS__)
    if (Kernel::HasAvx2()) {
        RunGeometryAvx2(cells, t, col, x, y, count, lineWidth, run);
        return;
    }
#endif
    VoronoiRunGeometryWith<PlainRanges>(cells, t, col, x, y, count, lineWidth, run);
}

} // namespace RasterTools
