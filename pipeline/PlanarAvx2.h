#pragma once
// The 8-bit formats' planar conversions written for AVX2, eight pixels per step: the operations of Planar's
// loops in the same order (max and min in the operand order that equals their selects, no fused
// multiply-add), so results are the same bit for bit. Formats without a form here use Planar's own loops,
// built for AVX2 by their caller. Only SpanConversions.cpp includes this, and calls it where the processor
// has AVX2.

#include "pipeline/PlanarConversions.h"

#include <immintrin.h>

#define RT_TARGET_AVX2 __attribute__((target("avx2")))

namespace RasterTools::PlanarConvert::Avx2 {

template <PixelFormat F>
struct Kit : Planar<F> {};

namespace Lanes {

// v > 0 ? v : 0, then low < 1 ? low : 1 (max and min return their second operand on NaN and on equal zeros).
RT_TARGET_AVX2 inline __m256 Clamp(__m256 v, float maximum) noexcept {
    return _mm256_min_ps(_mm256_max_ps(v, _mm256_setzero_ps()), _mm256_set1_ps(maximum));
}
RT_TARGET_AVX2 inline __m256i RoundInRange(__m256 v) noexcept {
    const __m256i truncated = _mm256_cvttps_epi32(v);
    const __m256 fraction = _mm256_sub_ps(v, _mm256_cvtepi32_ps(truncated));
    // The comparison's all-ones lanes are -1: subtracting them adds one.
    return _mm256_sub_epi32(truncated,
                            _mm256_castps_si256(_mm256_cmp_ps(fraction, _mm256_set1_ps(0.5f), _CMP_GE_OQ)));
}
RT_TARGET_AVX2 inline __m256i ToByte(__m256 v) noexcept {
    return RoundInRange(_mm256_mul_ps(Clamp(v, 1.0f), _mm256_set1_ps(255.0f)));
}
// Byte Index of every 32-bit lane, as a float.
template <int Index>
RT_TARGET_AVX2 inline __m256 Byte(__m256i words) noexcept {
    return _mm256_cvtepi32_ps(_mm256_and_si256(_mm256_srli_epi32(words, 8 * Index), _mm256_set1_epi32(0xff)));
}
RT_TARGET_AVX2 inline __m256i Pack(__m256i b0, __m256i b1, __m256i b2, __m256i b3) noexcept {
    return _mm256_or_si256(_mm256_or_si256(b0, _mm256_slli_epi32(b1, 8)),
                           _mm256_or_si256(_mm256_slli_epi32(b2, 16), _mm256_slli_epi32(b3, 24)));
}
// Eight 32-bit lanes of values up to 65535 to eight 16-bit ones.
RT_TARGET_AVX2 inline __m128i NarrowToWords(__m256i lanes) noexcept {
    return _mm_packus_epi32(_mm256_castsi256_si128(lanes), _mm256_extracti128_si256(lanes, 1));
}
// Eight 32-bit lanes of whole bytes to eight bytes.
RT_TARGET_AVX2 inline __m128i Narrow(__m256i bytes) noexcept {
    const __m128i words = NarrowToWords(bytes);
    return _mm_packus_epi16(words, words);
}

// Loads of eight elements of Size bytes from i on, and stores of eight; the last step moves only what is
// left of n, through a buffer.
template <class Vector, std::size_t Size, class Element>
RT_TARGET_AVX2 inline Vector Load(const Element* in, int i, int n) noexcept {
    static_assert(sizeof(Vector) == 8 * Size);
    Vector v;
    if (i + 8 <= n) {
        std::memcpy(&v, in + i, sizeof v);
    } else {
        alignas(32) unsigned char tail[sizeof(Vector)] = {};
        std::memcpy(tail, in + i, std::size_t(n - i) * Size);
        std::memcpy(&v, tail, sizeof v);
    }
    return v;
}
template <std::size_t Size, class Vector, class Element>
RT_TARGET_AVX2 inline void Store(Vector v, Element* out, int i, int n) noexcept {
    static_assert(sizeof(Vector) == 8 * Size);
    std::memcpy(out + i, &v, std::size_t(std::min(8, n - i)) * Size);
}

} // namespace Lanes

template <>
struct Kit<PixelFormat::RGBA8> {
    RT_TARGET_AVX2 static void ToWorking(const uchar4* in, WorkingPlanes& w, int n) noexcept {
        using namespace Lanes;
        const __m256 maximum = _mm256_set1_ps(255.0f);
        for (int i = 0; i < n; i += 8) {
            const auto words = Load<__m256i, sizeof(uchar4)>(in, i, n);
            _mm256_store_ps(w.r + i, _mm256_div_ps(Byte<0>(words), maximum));
            _mm256_store_ps(w.g + i, _mm256_div_ps(Byte<1>(words), maximum));
            _mm256_store_ps(w.b + i, _mm256_div_ps(Byte<2>(words), maximum));
            _mm256_store_ps(w.a + i, _mm256_div_ps(Byte<3>(words), maximum));
        }
    }
    RT_TARGET_AVX2 static void FromWorking(const WorkingPlanes& w, uchar4* out, int n) noexcept {
        using namespace Lanes;
        for (int i = 0; i < n; i += 8) {
            const __m256i words = Pack(ToByte(_mm256_load_ps(w.r + i)), ToByte(_mm256_load_ps(w.g + i)),
                                       ToByte(_mm256_load_ps(w.b + i)), ToByte(_mm256_load_ps(w.a + i)));
            Store<sizeof(uchar4)>(words, out, i, n);
        }
    }
};

template <>
struct Kit<PixelFormat::IA8> {
    RT_TARGET_AVX2 static void ToWorking(const uchar2* in, WorkingPlanes& w, int n) noexcept {
        using namespace Lanes;
        const __m256 maximum = _mm256_set1_ps(255.0f);
        for (int i = 0; i < n; i += 8) {
            const __m256i words = _mm256_cvtepu16_epi32(Load<__m128i, sizeof(uchar2)>(in, i, n));
            const __m256 intensity = _mm256_div_ps(Byte<0>(words), maximum);
            _mm256_store_ps(w.r + i, intensity);
            _mm256_store_ps(w.g + i, intensity);
            _mm256_store_ps(w.b + i, intensity);
            _mm256_store_ps(w.a + i, _mm256_div_ps(Byte<1>(words), maximum));
        }
    }
    RT_TARGET_AVX2 static void FromWorking(const WorkingPlanes& w, uchar2* out, int n) noexcept {
        using namespace Lanes;
        const __m256 maximum = _mm256_set1_ps(255.0f);
        for (int i = 0; i < n; i += 8) {
            const __m256 luminance =
                _mm256_add_ps(_mm256_add_ps(_mm256_mul_ps(_mm256_load_ps(w.r + i), _mm256_set1_ps(0.299f)),
                                            _mm256_mul_ps(_mm256_load_ps(w.g + i), _mm256_set1_ps(0.587f))),
                              _mm256_mul_ps(_mm256_load_ps(w.b + i), _mm256_set1_ps(0.114f)));
            const __m256i intensity = RoundInRange(Clamp(_mm256_mul_ps(maximum, luminance), 255.0f));
            const __m256i alpha =
                RoundInRange(Clamp(_mm256_mul_ps(_mm256_load_ps(w.a + i), maximum), 255.0f));
            const __m256i pairs = _mm256_or_si256(intensity, _mm256_slli_epi32(alpha, 8));
            Store<sizeof(uchar2)>(NarrowToWords(pairs), out, i, n);
        }
    }
};

template <>
struct Kit<PixelFormat::CMYKA8> {
    // 1 - min(1, ink (1 - k) + k).
    RT_TARGET_AVX2 static __m256 Colour(__m256 ink, __m256 k) noexcept {
        const __m256 one = _mm256_set1_ps(1.0f);
        return _mm256_sub_ps(one,
                             _mm256_min_ps(one, _mm256_add_ps(_mm256_mul_ps(ink, _mm256_sub_ps(one, k)), k)));
    }
    // (1 - colour - k) / divisor where inked, else 0.
    RT_TARGET_AVX2 static __m256 Ink(__m256 colour, __m256 k, __m256 inked, __m256 divisor) noexcept {
        const __m256 one = _mm256_set1_ps(1.0f);
        return _mm256_and_ps(inked, _mm256_div_ps(_mm256_sub_ps(_mm256_sub_ps(one, colour), k), divisor));
    }
    RT_TARGET_AVX2 static void ToWorking(const cmyka8* in, WorkingPlanes& w, int n) noexcept {
        using namespace Lanes;
        alignas(64) std::uint32_t inks[SpanLength];
        alignas(64) uchar alpha[SpanLength];
        SplitCMYKA8(in, inks, alpha, n);
        const __m256 scale = _mm256_set1_ps(0.003921569f);
        for (int i = 0; i < n; i += 8) {
            const __m256i words = _mm256_load_si256(reinterpret_cast<const __m256i*>(inks + i));
            const __m256 k = _mm256_mul_ps(Byte<3>(words), scale);
            _mm256_store_ps(w.r + i, Colour(_mm256_mul_ps(Byte<0>(words), scale), k));
            _mm256_store_ps(w.g + i, Colour(_mm256_mul_ps(Byte<1>(words), scale), k));
            _mm256_store_ps(w.b + i, Colour(_mm256_mul_ps(Byte<2>(words), scale), k));
            const __m128i alphaBytes = _mm_loadl_epi64(reinterpret_cast<const __m128i*>(alpha + i));
            _mm256_store_ps(w.a + i, _mm256_div_ps(_mm256_cvtepi32_ps(_mm256_cvtepu8_epi32(alphaBytes)),
                                                   _mm256_set1_ps(255.0f)));
        }
    }
    RT_TARGET_AVX2 static void FromWorking(const WorkingPlanes& w, cmyka8* out, int n) noexcept {
        using namespace Lanes;
        alignas(64) std::uint32_t inks[SpanLength];
        alignas(64) uchar alpha[SpanLength];
        const __m256 one = _mm256_set1_ps(1.0f);
        for (int i = 0; i < n; i += 8) {
            const __m256 r = Clamp(_mm256_load_ps(w.r + i), 1.0f);
            const __m256 g = Clamp(_mm256_load_ps(w.g + i), 1.0f);
            const __m256 b = Clamp(_mm256_load_ps(w.b + i), 1.0f);
            const __m256 k = _mm256_min_ps(_mm256_sub_ps(one, r),
                                           _mm256_min_ps(_mm256_sub_ps(one, g), _mm256_sub_ps(one, b)));
            const __m256 inked = _mm256_cmp_ps(k, one, _CMP_LT_OQ);
            const __m256 divisor = _mm256_blendv_ps(one, _mm256_sub_ps(one, k), inked);
            const __m256i words = Pack(ToByte(Ink(r, k, inked, divisor)), ToByte(Ink(g, k, inked, divisor)),
                                       ToByte(Ink(b, k, inked, divisor)), ToByte(k));
            _mm256_store_si256(reinterpret_cast<__m256i*>(inks + i), words);
            _mm_storel_epi64(reinterpret_cast<__m128i*>(alpha + i), Narrow(ToByte(_mm256_load_ps(w.a + i))));
        }
        MergeCMYKA8(inks, alpha, out, n);
    }
};

} // namespace RasterTools::PlanarConvert::Avx2
