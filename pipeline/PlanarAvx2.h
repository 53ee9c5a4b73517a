#pragma once
// The planar conversions written for AVX2, eight pixels per step, with results the same as Planar's loops bit
// for bit: the same operations in the same order (max and min in the operand order that equals their
// selects, no fused multiply-add), except where a shorter form gives the same for every value that can reach
// it (RoundInRange, the CMYKA8 inks), which the tests check. Pixels are moved between their stored order and
// the planes by shuffles, which keep every bit (NaN payloads included). Formats without a form here use
// Planar's own loops, built for AVX2 by their caller. SpanConversions.cpp and the tests include this, and
// call it where the processor has AVX2.

#include "host/kernel/Simd.h"
#include "pipeline/Avx2Lanes.h"
#include "pipeline/PlanarConversions.h"

#include <array>
#include <immintrin.h>

namespace RasterTools::PlanarConvert::Avx2 {

template <PixelFormat F>
struct Kit : Planar<F> {};

namespace Lanes {

using Avx2Lanes::Byte;
using Avx2Lanes::NarrowToWords;
using Avx2Lanes::Pack;
using Avx2Lanes::StorePairs;
using Avx2Lanes::Transpose;

// v > 0 ? v : 0, then low < maximum ? low : maximum (max and min return their second operand on NaN and on
// equal zeros).
RT_TARGET_AVX2 inline __m256 Clamp(__m256 v, float maximum) noexcept {
    return _mm256_min_ps(_mm256_max_ps(v, _mm256_setzero_ps()), _mm256_set1_ps(maximum));
}
// rt_round for v within [0, 65535], as truncated + (fraction >= 0.5) but in two steps: adding the float just
// below a half rounds the sum up to the next whole number exactly when v's fraction is at least a half (v's
// spacing there is at least as wide as the sum's, so no lower fraction can round up), and 0.5 itself goes up
// as a tie to even. Truncating the sum gives the rounded value; the tests check every float of the range.
RT_TARGET_AVX2 inline __m256i RoundInRange(__m256 v) noexcept {
    return _mm256_cvttps_epi32(_mm256_add_ps(v, _mm256_set1_ps(0.49999997f)));
}
// RoundInRange(Clamp01(v) * maximum).
RT_TARGET_AVX2 inline __m256i Scale(__m256 v, float maximum) noexcept {
    return RoundInRange(_mm256_mul_ps(Clamp(v, 1.0f), _mm256_set1_ps(maximum)));
}
RT_TARGET_AVX2 inline __m256i ToByte(__m256 v) noexcept {
    return Scale(v, 255.0f);
}

// Loads of eight elements of Size bytes from i on, and stores of eight; the last step moves only what is
// left of n, through a buffer. Whole steps move the vector directly, so that it stays in a register.
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
    if (i + 8 <= n)
        std::memcpy(out + i, &v, sizeof v);
    else
        std::memcpy(out + i, &v, std::size_t(n - i) * Size);
}

// The bytes of eight pixels from i on: in place when all eight are there, else the rest of n copied into
// tail with zeros after.
template <class Element, std::size_t Bytes>
RT_TARGET_AVX2 inline const unsigned char* Block(const Element* in, int i, int n,
                                                 unsigned char (&tail)[Bytes]) noexcept {
    static_assert(Bytes >= 8 * sizeof(Element));
    if (i + 8 <= n) return reinterpret_cast<const unsigned char*>(in + i);
    std::memset(tail, 0, Bytes);
    std::memcpy(tail, in + i, std::size_t(n - i) * sizeof(Element));
    return tail;
}
// Where eight pixels from i on are written: in place when all eight fit, else tail, which Finish copies out.
template <class Element, std::size_t Bytes>
RT_TARGET_AVX2 inline unsigned char* Target(Element* out, int i, int n,
                                            unsigned char (&tail)[Bytes]) noexcept {
    static_assert(Bytes >= 8 * sizeof(Element));
    return i + 8 <= n ? reinterpret_cast<unsigned char*>(out + i) : tail;
}
template <class Element, std::size_t Bytes>
RT_TARGET_AVX2 inline void Finish(Element* out, int i, int n, const unsigned char (&tail)[Bytes]) noexcept {
    if (i + 8 > n) std::memcpy(out + i, tail, std::size_t(n - i) * sizeof(Element));
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

// Four 16-bit components a pixel: two pixels to each 128 bits.
template <>
struct Kit<PixelFormat::RGBA16> {
    RT_TARGET_AVX2 static __m256 Plane(__m256i components) noexcept {
        return _mm256_div_ps(_mm256_cvtepi32_ps(components), _mm256_set1_ps(65535.0f));
    }
    RT_TARGET_AVX2 static void ToWorking(const ushort4* in, WorkingPlanes& w, int n) noexcept {
        using namespace Lanes;
        const __m256i zero = _mm256_setzero_si256();
        for (int i = 0; i < n; i += 8) {
            alignas(32) unsigned char tail[8 * sizeof(ushort4)];
            const unsigned char* bytes = Block(in, i, n, tail);
            const __m256i first = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(bytes));
            const __m256i second = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(bytes + 32));
            // Pixels 0 1 | 4 5 and 2 3 | 6 7, interleaved twice: x0-3 y0-3 | x4-7 y4-7 and the same of z, w.
            const __m256i even = _mm256_permute2x128_si256(first, second, 0x20);
            const __m256i odd = _mm256_permute2x128_si256(first, second, 0x31);
            const __m256i low = _mm256_unpacklo_epi16(even, odd), high = _mm256_unpackhi_epi16(even, odd);
            const __m256i xy = _mm256_unpacklo_epi16(low, high), zw = _mm256_unpackhi_epi16(low, high);
            _mm256_store_ps(w.r + i, Plane(_mm256_unpacklo_epi16(xy, zero)));
            _mm256_store_ps(w.g + i, Plane(_mm256_unpackhi_epi16(xy, zero)));
            _mm256_store_ps(w.b + i, Plane(_mm256_unpacklo_epi16(zw, zero)));
            _mm256_store_ps(w.a + i, Plane(_mm256_unpackhi_epi16(zw, zero)));
        }
    }
    RT_TARGET_AVX2 static void FromWorking(const WorkingPlanes& w, ushort4* out, int n) noexcept {
        using namespace Lanes;
        for (int i = 0; i < n; i += 8) {
            const __m256i r = Scale(_mm256_load_ps(w.r + i), 65535.0f);
            const __m256i g = Scale(_mm256_load_ps(w.g + i), 65535.0f);
            const __m256i b = Scale(_mm256_load_ps(w.b + i), 65535.0f);
            const __m256i a = Scale(_mm256_load_ps(w.a + i), 65535.0f);
            const __m256i rg = _mm256_or_si256(r, _mm256_slli_epi32(g, 16));
            const __m256i ba = _mm256_or_si256(b, _mm256_slli_epi32(a, 16));
            alignas(32) unsigned char tail[8 * sizeof(ushort4)];
            StorePairs(rg, ba, Target(out, i, n, tail));
            Finish(out, i, n, tail);
        }
    }
};

// One float4 a pixel: pixels 0-3 go through the low halves and 4-7 through the high ones, so that the
// transposed halves are the planes in order. The way back keeps Planar's loop, which the compiler already
// builds from whole-vector shuffles and stores, and which measured as fast where the 16-byte pixels' writes
// to memory bound the step.
template <>
struct Kit<PixelFormat::RGBAUF> : Planar<PixelFormat::RGBAUF> {
    RT_TARGET_AVX2 static void ToWorking(const float4* in, WorkingPlanes& w, int n) noexcept {
        using namespace Lanes;
        for (int i = 0; i < n; i += 8) {
            alignas(32) unsigned char tail[8 * sizeof(float4)];
            const auto* floats = reinterpret_cast<const float*>(Block(in, i, n, tail));
            __m256 r = _mm256_loadu2_m128(floats + 16, floats);
            __m256 g = _mm256_loadu2_m128(floats + 20, floats + 4);
            __m256 b = _mm256_loadu2_m128(floats + 24, floats + 8);
            __m256 a = _mm256_loadu2_m128(floats + 28, floats + 12);
            Transpose(r, g, b, a);
            _mm256_store_ps(w.r + i, r);
            _mm256_store_ps(w.g + i, g);
            _mm256_store_ps(w.b + i, b);
            _mm256_store_ps(w.a + i, a);
        }
    }
};

// Intensity and alpha in one 32-bit lane a pixel, for 8- and 16-bit components.
template <class Pixel, int Maximum>
struct KitIA {
    static constexpr int Bits = 8 * int(sizeof(Pixel)) / 2;
    RT_TARGET_AVX2 static void ToWorking(const Pixel* in, WorkingPlanes& w, int n) noexcept {
        using namespace Lanes;
        const __m256 maximum = _mm256_set1_ps(float(Maximum));
        for (int i = 0; i < n; i += 8) {
            __m256i pairs;
            if constexpr (Bits == 8)
                pairs = _mm256_cvtepu16_epi32(Load<__m128i, sizeof(Pixel)>(in, i, n));
            else
                pairs = Load<__m256i, sizeof(Pixel)>(in, i, n);
            const __m256 intensity = _mm256_div_ps(
                _mm256_cvtepi32_ps(_mm256_and_si256(pairs, _mm256_set1_epi32(Maximum))), maximum);
            _mm256_store_ps(w.r + i, intensity);
            _mm256_store_ps(w.g + i, intensity);
            _mm256_store_ps(w.b + i, intensity);
            _mm256_store_ps(w.a + i,
                            _mm256_div_ps(_mm256_cvtepi32_ps(_mm256_srli_epi32(pairs, Bits)), maximum));
        }
    }
    RT_TARGET_AVX2 static void FromWorking(const WorkingPlanes& w, Pixel* out, int n) noexcept {
        using namespace Lanes;
        const __m256 maximum = _mm256_set1_ps(float(Maximum));
        for (int i = 0; i < n; i += 8) {
            const __m256 luminance =
                _mm256_add_ps(_mm256_add_ps(_mm256_mul_ps(_mm256_load_ps(w.r + i), _mm256_set1_ps(0.299f)),
                                            _mm256_mul_ps(_mm256_load_ps(w.g + i), _mm256_set1_ps(0.587f))),
                              _mm256_mul_ps(_mm256_load_ps(w.b + i), _mm256_set1_ps(0.114f)));
            const __m256i intensity = RoundInRange(Clamp(_mm256_mul_ps(maximum, luminance), float(Maximum)));
            const __m256i alpha =
                RoundInRange(Clamp(_mm256_mul_ps(_mm256_load_ps(w.a + i), maximum), float(Maximum)));
            const __m256i pairs = _mm256_or_si256(intensity, _mm256_slli_epi32(alpha, Bits));
            if constexpr (Bits == 8)
                Store<sizeof(Pixel)>(NarrowToWords(pairs), out, i, n);
            else
                Store<sizeof(Pixel)>(pairs, out, i, n);
        }
    }
};

template <>
struct Kit<PixelFormat::IA8> : KitIA<uchar2, 255> {};
template <>
struct Kit<PixelFormat::IA16> : KitIA<ushort2, 65535> {};

// Eight five-byte pixels are 40 bytes: four pixels (20 bytes) to each 128-bit half, moved as two
// overlapping 16 bytes, from the half's first byte and from its fifth. Byte shuffles take them apart into
// 32-bit lanes of inks (cyan lowest) and of alpha, and put them back together.
namespace Cmyka {

// The shuffle control that gathers, for each of the four pixels of a half, its inks (or its alpha, in the
// lowest byte) from 16 stored bytes that start at byte Offset of the pixels; bytes outside them are zero.
template <int Offset, bool Alpha>
inline constexpr auto SplitControl = [] {
    std::array<char, 32> control{};
    for (int k = 0; k < 16; ++k) {
        const int pixel = k / 4, component = Alpha ? (k % 4 == 0 ? 4 : -1) : k % 4;
        const int from = 5 * pixel + component - Offset;
        control[k] = control[k + 16] = char(component >= 0 && from >= 0 && from < 16 ? from : -1);
    }
    return control;
}();
// The shuffle control that writes stored bytes Offset to Offset + 15 of four pixels from their lanes of
// inks (or of alpha); the other source's bytes are zero.
template <int Offset, bool Alpha>
inline constexpr auto MergeControl = [] {
    std::array<char, 32> control{};
    for (int k = 0; k < 16; ++k) {
        const int pixel = (k + Offset) / 5, component = (k + Offset) % 5;
        const bool isAlpha = component == 4;
        control[k] = control[k + 16] = char(isAlpha == Alpha ? 4 * pixel + (isAlpha ? 0 : component) : -1);
    }
    return control;
}();
template <const std::array<char, 32>& Control>
RT_TARGET_AVX2 inline __m256i Shuffle(__m256i v) noexcept {
    return _mm256_shuffle_epi8(v, _mm256_loadu_si256(reinterpret_cast<const __m256i*>(Control.data())));
}

} // namespace Cmyka

template <>
struct Kit<PixelFormat::CMYKA8> {
    // 1 - min(1, ink (1 - k) + k).
    RT_TARGET_AVX2 static __m256 Colour(__m256 ink, __m256 k) noexcept {
        const __m256 one = _mm256_set1_ps(1.0f);
        return _mm256_sub_ps(one,
                             _mm256_min_ps(one, _mm256_add_ps(_mm256_mul_ps(ink, _mm256_sub_ps(one, k)), k)));
    }
    // ToByte((1 - colour - k) / divisor): 1 - colour is at least k, and at most 1, so the quotient is within
    // [+0, 1] and needs no clamp. Where not inked it is masked to the zero Planar selects.
    RT_TARGET_AVX2 static __m256i InkByte(__m256 colour, __m256 k, __m256 divisor, __m256 inked) noexcept {
        const __m256 ink = _mm256_and_ps(
            _mm256_div_ps(_mm256_sub_ps(_mm256_sub_ps(_mm256_set1_ps(1.0f), colour), k), divisor), inked);
        return Lanes::RoundInRange(_mm256_mul_ps(ink, _mm256_set1_ps(255.0f)));
    }
    RT_TARGET_AVX2 static void ToWorking(const cmyka8* in, WorkingPlanes& w, int n) noexcept {
        using namespace Lanes;
        using namespace Cmyka;
        const __m256 scale = _mm256_set1_ps(0.003921569f);
        for (int i = 0; i < n; i += 8) {
            alignas(32) unsigned char tail[8 * sizeof(cmyka8)];
            const unsigned char* bytes = Block(in, i, n, tail);
            // Bytes 0-15 | 20-35 and 4-19 | 24-39 of the eight pixels.
            const __m256i first = _mm256_loadu2_m128i(reinterpret_cast<const __m128i*>(bytes + 20),
                                                      reinterpret_cast<const __m128i*>(bytes));
            const __m256i fifth = _mm256_loadu2_m128i(reinterpret_cast<const __m128i*>(bytes + 24),
                                                      reinterpret_cast<const __m128i*>(bytes + 4));
            const __m256i words = _mm256_or_si256(Shuffle<SplitControl<0, false>>(first),
                                                  Shuffle<SplitControl<4, false>>(fifth));
            const __m256i alpha = Shuffle<SplitControl<4, true>>(fifth);
            const __m256 k = _mm256_mul_ps(Byte<3>(words), scale);
            _mm256_store_ps(w.r + i, Colour(_mm256_mul_ps(Byte<0>(words), scale), k));
            _mm256_store_ps(w.g + i, Colour(_mm256_mul_ps(Byte<1>(words), scale), k));
            _mm256_store_ps(w.b + i, Colour(_mm256_mul_ps(Byte<2>(words), scale), k));
            _mm256_store_ps(w.a + i, _mm256_div_ps(_mm256_cvtepi32_ps(alpha), _mm256_set1_ps(255.0f)));
        }
    }
    RT_TARGET_AVX2 static void FromWorking(const WorkingPlanes& w, cmyka8* out, int n) noexcept {
        using namespace Lanes;
        using namespace Cmyka;
        const __m256 one = _mm256_set1_ps(1.0f);
        for (int i = 0; i < n; i += 8) {
            const __m256 r = Clamp(_mm256_load_ps(w.r + i), 1.0f);
            const __m256 g = Clamp(_mm256_load_ps(w.g + i), 1.0f);
            const __m256 b = Clamp(_mm256_load_ps(w.b + i), 1.0f);
            const __m256 k = _mm256_min_ps(_mm256_sub_ps(one, r),
                                           _mm256_min_ps(_mm256_sub_ps(one, g), _mm256_sub_ps(one, b)));
            const __m256 inked =
                _mm256_cmp_ps(_mm256_mul_ps(k, _mm256_set1_ps(255.0f)), _mm256_set1_ps(254.5f), _CMP_LT_OQ);
            const __m256 divisor = _mm256_blendv_ps(one, _mm256_sub_ps(one, k), inked);
            // k is within [+0, 1] too.
            const __m256i words =
                Pack(InkByte(r, k, divisor, inked), InkByte(g, k, divisor, inked),
                     InkByte(b, k, divisor, inked), RoundInRange(_mm256_mul_ps(k, _mm256_set1_ps(255.0f))));
            const __m256i alpha = ToByte(_mm256_load_ps(w.a + i));
            alignas(32) unsigned char tail[8 * sizeof(cmyka8)];
            unsigned char* bytes = Target(out, i, n, tail);
            // Bytes 0-15 | 20-35, then 4-19 | 24-39 (the overlap written twice, the same).
            _mm256_storeu2_m128i(reinterpret_cast<__m128i*>(bytes + 20), reinterpret_cast<__m128i*>(bytes),
                                 _mm256_or_si256(Shuffle<MergeControl<0, false>>(words),
                                                 Shuffle<MergeControl<0, true>>(alpha)));
            _mm256_storeu2_m128i(reinterpret_cast<__m128i*>(bytes + 24),
                                 reinterpret_cast<__m128i*>(bytes + 4),
                                 _mm256_or_si256(Shuffle<MergeControl<4, false>>(words),
                                                 Shuffle<MergeControl<4, true>>(alpha)));
            Finish(out, i, n, tail);
        }
    }
};

} // namespace RasterTools::PlanarConvert::Avx2
