#pragma once
// Bilinear sampling of RGBA8 pixels, four locations at once with one pixel per SSE lane, giving exactly what
// SpanBilinearSampler::At gives one location at a time: the same operations in the same order, so every
// pixel agrees bit for bit with the scalar path and the kernel text.

#include "host/raster/Bitmap.h"
#include "host/raster/KernelMath.h"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <emmintrin.h>

namespace RasterTools::BilinearRGBA8 {

namespace Detail {

inline __m128 Channel(__m128i pixels, int shift) noexcept {
    return _mm_cvtepi32_ps(_mm_and_si128(_mm_srli_epi32(pixels, shift), _mm_set1_epi32(0xFF)));
}

// rt_sat_uchar(rt_round(v)) for v that is not NaN: clamping first gives the same byte, and then the value is
// a non-negative float below 2^23, where rounding half away from zero is truncation plus one from .5 up.
inline __m128i ToByte(__m128 v) noexcept {
    const __m128 clamped = _mm_min_ps(_mm_max_ps(v, _mm_setzero_ps()), _mm_set1_ps(255.0f));
    const __m128i truncated = _mm_cvttps_epi32(clamped);
    const __m128 rest = _mm_sub_ps(clamped, _mm_cvtepi32_ps(truncated));
    const __m128i up = _mm_castps_si128(_mm_cmpge_ps(rest, _mm_set1_ps(0.5f)));
    return _mm_sub_epi32(truncated, up); // the mask is -1 where the value rounds up
}

// Colour times alpha over 255, as the premultiplication of one stored pixel.
inline __m128 Premultiply(__m128 colour, __m128 alpha) noexcept {
    return _mm_div_ps(_mm_mul_ps(colour, alpha), _mm_set1_ps(255.0f));
}

} // namespace Detail

// Samples the four locations (transformed pixel centres less half a pixel) with edge pixels continued
// outwards. Returns false, writing nothing, when a location is NaN or too far out for integer arithmetic:
// the caller samples those one by one.
template <class Image>
inline bool SampleSafe4(const Image& image, const float* xs, const float* ys,
                        Raster::KernelMath::uchar4* out) noexcept {
    const __m128 x = _mm_loadu_ps(xs), y = _mm_loadu_ps(ys);
    const __m128 limit = _mm_set1_ps(1073741824.0f);
    const __m128 absMask = _mm_castsi128_ps(_mm_set1_epi32(0x7FFFFFFF));
    const __m128 ordinary =
        _mm_and_ps(_mm_cmplt_ps(_mm_and_ps(x, absMask), limit), _mm_cmplt_ps(_mm_and_ps(y, absMask), limit));
    if (_mm_movemask_ps(ordinary) != 0xF) return false;

    // Truncation, then one less for negatives (the mask is -1 there).
    const __m128i ix =
        _mm_add_epi32(_mm_cvttps_epi32(x), _mm_castps_si128(_mm_cmplt_ps(x, _mm_setzero_ps())));
    const __m128i iy =
        _mm_add_epi32(_mm_cvttps_epi32(y), _mm_castps_si128(_mm_cmplt_ps(y, _mm_setzero_ps())));
    const __m128 fx = _mm_sub_ps(x, _mm_cvtepi32_ps(ix));
    const __m128 fy = _mm_sub_ps(y, _mm_cvtepi32_ps(iy));

    alignas(16) std::int32_t columns[4], rows[4];
    _mm_store_si128(reinterpret_cast<__m128i*>(columns), ix);
    _mm_store_si128(reinterpret_cast<__m128i*>(rows), iy);
    const int lastX = image.GetWidth() - 1, lastY = image.GetHeight() - 1;
    // corners[k][i]: corner k (top left, top right, bottom left, bottom right) of location i.
    alignas(16) std::uint32_t corners[4][4];
    for (int i = 0; i < 4; ++i) {
        const int x0 = std::clamp(columns[i], 0, lastX), x1 = std::clamp(columns[i] + 1, 0, lastX);
        const auto* top = image.Row(std::clamp(rows[i], 0, lastY));
        const auto* bottom = image.Row(std::clamp(rows[i] + 1, 0, lastY));
        std::memcpy(&corners[0][i], top + x0, 4);
        std::memcpy(&corners[1][i], top + x1, 4);
        std::memcpy(&corners[2][i], bottom + x0, 4);
        std::memcpy(&corners[3][i], bottom + x1, 4);
    }

    const __m128 one = _mm_set1_ps(1.0f);
    const __m128 gx = _mm_sub_ps(one, fx), gy = _mm_sub_ps(one, fy);
    const __m128 weights[4] = {_mm_mul_ps(gx, gy), _mm_mul_ps(fx, gy), _mm_mul_ps(fy, gx),
                               _mm_mul_ps(fy, fx)};
    __m128 sum[4];
    for (int k = 0; k < 4; ++k) {
        const __m128i pixels = _mm_load_si128(reinterpret_cast<const __m128i*>(corners[k]));
        const __m128i alphas = _mm_srli_epi32(pixels, 24);
        const __m128 alpha = _mm_cvtepi32_ps(alphas);
        __m128 channel[4] = {Detail::Channel(pixels, 0), Detail::Channel(pixels, 8),
                             Detail::Channel(pixels, 16), alpha};
        // Opaque pixels premultiply to themselves exactly (c × 255 / 255 = c), so the divisions can go.
        const __m128i opaque = _mm_cmpeq_epi32(alphas, _mm_set1_epi32(255));
        if (_mm_movemask_epi8(opaque) != 0xFFFF)
            for (int c = 0; c < 3; ++c)
                channel[c] = Detail::Premultiply(channel[c], alpha);
        for (int c = 0; c < 4; ++c) {
            const __m128 term = _mm_mul_ps(channel[c], weights[k]);
            sum[c] = k == 0 ? term : _mm_add_ps(sum[c], term);
        }
    }

    // Colour over the normalised alpha, except where that is exactly 1 or below 1e-20 in magnitude.
    const __m128 coverage = _mm_div_ps(sum[3], _mm_set1_ps(255.0f));
    const __m128 keeps = _mm_or_ps(_mm_cmpeq_ps(coverage, one),
                                   _mm_cmplt_ps(_mm_and_ps(coverage, absMask), _mm_set1_ps(1e-20f)));
    if (_mm_movemask_ps(keeps) != 0xF) {
        const __m128 divisor = _mm_or_ps(_mm_and_ps(keeps, one), _mm_andnot_ps(keeps, coverage));
        for (int c = 0; c < 3; ++c)
            sum[c] = _mm_div_ps(sum[c], divisor);
    }
    __m128i packed = Detail::ToByte(sum[0]);
    packed = _mm_or_si128(packed, _mm_slli_epi32(Detail::ToByte(sum[1]), 8));
    packed = _mm_or_si128(packed, _mm_slli_epi32(Detail::ToByte(sum[2]), 16));
    packed = _mm_or_si128(packed, _mm_slli_epi32(Detail::ToByte(sum[3]), 24));

    // A location on a pixel centre reads that pixel as it is.
    const __m128 exact = _mm_and_ps(_mm_cmpeq_ps(fx, _mm_setzero_ps()), _mm_cmpeq_ps(fy, _mm_setzero_ps()));
    const __m128i centre = _mm_castps_si128(exact);
    const __m128i original = _mm_load_si128(reinterpret_cast<const __m128i*>(corners[0]));
    packed = _mm_or_si128(_mm_and_si128(centre, original), _mm_andnot_si128(centre, packed));
    _mm_storeu_si128(reinterpret_cast<__m128i*>(out), packed);
    return true;
}

} // namespace RasterTools::BilinearRGBA8
