#pragma once
// The blurs' premultiplied bilinear samples eight at a time with AVX2, in every layer format:
// SampleBilinear's operations in the same order on eight lanes (no fused multiply-add, max and min in the
// operand order of the selects they stand for), so every sample is bit for bit what it gives. Corners are
// fetched with plain loads. Also the running sums' resolve of four-component integer formats, eight rows at
// once. Called only where the processor has AVX2.

#include "host/kernel/Simd.h"
#include "host/kernel/UnalignedBytes.h"
#include "host/raster/PixelFormat.h"
#include "pipeline/Avx2Lanes.h"

#include <cstddef>
#include <cstdint>
#include <type_traits>

#if RT_AVX2_BUILD
#include <immintrin.h>
#endif

namespace RasterTools::Blur::Avx2 {

// Where a grid's pixels lie: pixel (x, y) of the grid's frame starts (x - left) × xStride + (y - top) ×
// yStride bytes after base. A buffer holds at most 2 GiB, so every offset within it fits 32 bits.
struct Access {
    const std::byte* base = nullptr;
    int xStride = 0, yStride = 0;
    int left = 0, top = 0, lastX = 0, lastY = 0;
};

#if RT_AVX2_BUILD

namespace Detail {

// Eight rounded results as Layout::Store rounds them: clamped to [0, maximum], plus a half, truncated.
RT_TARGET_AVX2 inline __m256i Round(__m256 v, float maximum) noexcept {
    const __m256 clamped = _mm256_min_ps(_mm256_max_ps(v, _mm256_setzero_ps()), _mm256_set1_ps(maximum));
    return _mm256_cvttps_epi32(_mm256_add_ps(clamped, _mm256_set1_ps(0.5f)));
}

// The four bytes of each lane, lowest first, as floats in c[0] to c[3].
RT_TARGET_AVX2 inline void SplitBytes(__m256i v, __m256* c) noexcept {
    c[0] = Avx2Lanes::Byte<0>(v);
    c[1] = Avx2Lanes::Byte<1>(v);
    c[2] = Avx2Lanes::Byte<2>(v);
    c[3] = Avx2Lanes::Byte<3>(v);
}

// Eight pixels are fetched from their byte offsets with plain loads rather than the gather instructions:
// on recent processors a gather costs more than the loads it stands for (the motion blur renders an eighth
// faster without them).
template <class Read>
[[gnu::always_inline]] RT_TARGET_AVX2 inline __m128i FourLanes(__m128i at, const Read& read) noexcept {
    const __m128i v = _mm_cvtsi32_si128(read(_mm_cvtsi128_si32(at)));
    return _mm_insert_epi32(_mm_insert_epi32(_mm_insert_epi32(v, read(_mm_extract_epi32(at, 1)), 1),
                                             read(_mm_extract_epi32(at, 2)), 2),
                            read(_mm_extract_epi32(at, 3)), 3);
}

// read(offset) for each lane's offset. The offsets leave through extracts: a store and reloads would stall
// on store forwarding.
template <class Read>
[[gnu::always_inline]] RT_TARGET_AVX2 inline __m256i EachLane(__m256i offset, const Read& read) noexcept {
    return _mm256_set_m128i(FourLanes(_mm256_extracti128_si256(offset, 1), read),
                            FourLanes(_mm256_castsi256_si128(offset), read));
}

// The 32-bit word at each offset, unaligned.
[[gnu::always_inline]] RT_TARGET_AVX2 inline __m256i Load32(const std::byte* base, __m256i offset) noexcept {
    return EachLane(offset, [base](std::int32_t at) { return Kernel::LoadBytes<std::int32_t>(base + at); });
}

// Two neighbouring 4-byte pixels at each lane's offset: the first of each pair in first, the second in
// second. Half the loads of fetching the two corners apart.
[[gnu::always_inline]] RT_TARGET_AVX2 inline void LoadPairs(const std::byte* base, __m256i offset,
                                                            __m256i& first, __m256i& second) noexcept {
    auto pair = [base](std::int32_t at) { return Kernel::LoadBytes<std::int64_t>(base + at); };
    const __m128i low = _mm256_castsi256_si128(offset), high = _mm256_extracti128_si256(offset, 1);
    // Lanes 0, 1 | 4, 5 and 2, 3 | 6, 7, each pixel pair in one 64-bit half.
    const __m256i even = _mm256_set_m128i(_mm_insert_epi64(_mm_cvtsi64_si128(pair(_mm_cvtsi128_si32(high))),
                                                           pair(_mm_extract_epi32(high, 1)), 1),
                                          _mm_insert_epi64(_mm_cvtsi64_si128(pair(_mm_cvtsi128_si32(low))),
                                                           pair(_mm_extract_epi32(low, 1)), 1));
    const __m256i odd = _mm256_set_m128i(_mm_insert_epi64(_mm_cvtsi64_si128(pair(_mm_extract_epi32(high, 2))),
                                                          pair(_mm_extract_epi32(high, 3)), 1),
                                         _mm_insert_epi64(_mm_cvtsi64_si128(pair(_mm_extract_epi32(low, 2))),
                                                          pair(_mm_extract_epi32(low, 3)), 1));
    first = _mm256_castps_si256(
        _mm256_shuffle_ps(_mm256_castsi256_ps(even), _mm256_castsi256_ps(odd), _MM_SHUFFLE(2, 0, 2, 0)));
    second = _mm256_castps_si256(
        _mm256_shuffle_ps(_mm256_castsi256_ps(even), _mm256_castsi256_ps(odd), _MM_SHUFFLE(3, 1, 3, 1)));
}

// Eight pixels of a format: gathered from their byte offsets, split into float components, and the results
// rounded, packed and stored. Raw holds eight pixels as stored, so that exact copies keep their bits. N is
// the number of components, A alpha's.
template <class Component>
struct Pixels;

template <>
struct Pixels<std::uint8_t> {
    using T = std::uint8_t;
    static constexpr int N = 4, A = 3;
    struct Raw {
        __m256i v;
    };
    RT_TARGET_AVX2 static Raw Gather(const std::byte* base, __m256i offset) noexcept {
        return {Load32(base, offset)};
    }
    RT_TARGET_AVX2 static void Components(const Raw& raw, __m256 (&c)[N]) noexcept { SplitBytes(raw.v, c); }
    RT_TARGET_AVX2 static Raw Finish(const __m256 (&v)[N]) noexcept {
        return {Avx2Lanes::Pack(Round(v[0], 255.0f), Round(v[1], 255.0f), Round(v[2], 255.0f),
                                Round(v[3], 255.0f))};
    }
    RT_TARGET_AVX2 static Raw Select(const Raw& computed, const Raw& copied, __m256i copy) noexcept {
        return {_mm256_blendv_epi8(computed.v, copied.v, copy)};
    }
    RT_TARGET_AVX2 static void Store(const Raw& raw, T* out) noexcept {
        _mm256_storeu_si256(reinterpret_cast<__m256i*>(out), raw.v);
    }
};

template <>
struct Pixels<std::uint16_t> {
    using T = std::uint16_t;
    static constexpr int N = 4, A = 3;
    struct Raw {
        __m256i low, high; // components 0 | 1 << 16 and 2 | 3 << 16
    };
    RT_TARGET_AVX2 static Raw Gather(const std::byte* base, __m256i offset) noexcept {
        return {Load32(base, offset), Load32(base + 4, offset)};
    }
    RT_TARGET_AVX2 static void Components(const Raw& raw, __m256 (&c)[N]) noexcept {
        const __m256i word = _mm256_set1_epi32(0xFFFF);
        c[0] = _mm256_cvtepi32_ps(_mm256_and_si256(raw.low, word));
        c[1] = _mm256_cvtepi32_ps(_mm256_srli_epi32(raw.low, 16));
        c[2] = _mm256_cvtepi32_ps(_mm256_and_si256(raw.high, word));
        c[3] = _mm256_cvtepi32_ps(_mm256_srli_epi32(raw.high, 16));
    }
    RT_TARGET_AVX2 static Raw Finish(const __m256 (&v)[N]) noexcept {
        return {_mm256_or_si256(Round(v[0], 65535.0f), _mm256_slli_epi32(Round(v[1], 65535.0f), 16)),
                _mm256_or_si256(Round(v[2], 65535.0f), _mm256_slli_epi32(Round(v[3], 65535.0f), 16))};
    }
    RT_TARGET_AVX2 static Raw Select(const Raw& computed, const Raw& copied, __m256i copy) noexcept {
        return {_mm256_blendv_epi8(computed.low, copied.low, copy),
                _mm256_blendv_epi8(computed.high, copied.high, copy)};
    }
    RT_TARGET_AVX2 static void Store(const Raw& raw, T* out) noexcept {
        Avx2Lanes::StorePairs(raw.low, raw.high, out);
    }
};

template <>
struct Pixels<float> {
    using T = float;
    static constexpr int N = 4, A = 3;
    struct Raw {
        __m256 c[4];
    };
    RT_TARGET_AVX2 static Raw Gather(const std::byte* base, __m256i offset) noexcept {
        Raw raw;
        for (int m = 0; m < 4; ++m)
            raw.c[m] = _mm256_castsi256_ps(Load32(base + 4 * m, offset));
        return raw;
    }
    RT_TARGET_AVX2 static void Components(const Raw& raw, __m256 (&c)[N]) noexcept {
        for (int m = 0; m < 4; ++m)
            c[m] = raw.c[m];
    }
    RT_TARGET_AVX2 static Raw Finish(const __m256 (&v)[N]) noexcept { return {{v[0], v[1], v[2], v[3]}}; }
    RT_TARGET_AVX2 static Raw Select(const Raw& computed, const Raw& copied, __m256i copy) noexcept {
        Raw raw;
        for (int m = 0; m < 4; ++m)
            raw.c[m] = _mm256_blendv_ps(computed.c[m], copied.c[m], _mm256_castsi256_ps(copy));
        return raw;
    }
    RT_TARGET_AVX2 static void Store(const Raw& raw, T* out) noexcept {
        // Components to pixels: the in-half transpose gives pixels 0 | 4, 1 | 5, 2 | 6 and 3 | 7.
        __m256 p04 = raw.c[0], p15 = raw.c[1], p26 = raw.c[2], p37 = raw.c[3];
        Avx2Lanes::Transpose(p04, p15, p26, p37);
        _mm256_storeu_ps(out, _mm256_permute2f128_ps(p04, p15, 0x20));
        _mm256_storeu_ps(out + 8, _mm256_permute2f128_ps(p26, p37, 0x20));
        _mm256_storeu_ps(out + 16, _mm256_permute2f128_ps(p04, p15, 0x31));
        _mm256_storeu_ps(out + 24, _mm256_permute2f128_ps(p26, p37, 0x31));
    }
};

// Intensity and alpha, 8 or 16 bits each: a pixel is one 16- or 32-bit word, kept in the low bits of a lane.
template <class Component>
struct IntensityPixels {
    using T = Component;
    static constexpr int N = 2, A = 1;
    static constexpr int Bits = 8 * int(sizeof(T));
    static constexpr float Max = Bits == 8 ? 255.0f : 65535.0f;
    struct Raw {
        __m256i v;
    };
    RT_TARGET_AVX2 static Raw Gather(const std::byte* base, __m256i offset) noexcept {
        if constexpr (Bits == 16) {
            return {Load32(base, offset)};
        } else {
            return {EachLane(offset, [base](std::int32_t at) {
                return std::int32_t(Kernel::LoadBytes<std::uint16_t>(base + at));
            })};
        }
    }
    RT_TARGET_AVX2 static void Components(const Raw& raw, __m256 (&c)[N]) noexcept {
        c[0] = _mm256_cvtepi32_ps(_mm256_and_si256(raw.v, _mm256_set1_epi32(Bits == 8 ? 0xFF : 0xFFFF)));
        c[1] = _mm256_cvtepi32_ps(_mm256_srli_epi32(raw.v, Bits));
    }
    RT_TARGET_AVX2 static Raw Finish(const __m256 (&v)[N]) noexcept {
        return {_mm256_or_si256(Round(v[0], Max), _mm256_slli_epi32(Round(v[1], Max), Bits))};
    }
    RT_TARGET_AVX2 static Raw Select(const Raw& computed, const Raw& copied, __m256i copy) noexcept {
        return {_mm256_blendv_epi8(computed.v, copied.v, copy)};
    }
    RT_TARGET_AVX2 static void Store(const Raw& raw, T* out) noexcept {
        if constexpr (Bits == 16) {
            _mm256_storeu_si256(reinterpret_cast<__m256i*>(out), raw.v);
        } else {
            _mm_storeu_si128(reinterpret_cast<__m128i*>(out), Avx2Lanes::NarrowToWords(raw.v));
        }
    }
};

// Four inks and alpha, a byte each: the inks as one 32-bit word, alpha in a lane of its own.
struct CmykaPixels {
    using T = std::uint8_t;
    static constexpr int N = 5, A = 4;
    struct Raw {
        __m256i inks, alpha;
    };
    RT_TARGET_AVX2 static Raw Gather(const std::byte* base, __m256i offset) noexcept {
        return {Load32(base, offset), EachLane(offset, [base](std::int32_t at) {
                    return std::int32_t(std::uint8_t(base[at + 4]));
                })};
    }
    RT_TARGET_AVX2 static void Components(const Raw& raw, __m256 (&c)[N]) noexcept {
        SplitBytes(raw.inks, c);
        c[4] = _mm256_cvtepi32_ps(raw.alpha);
    }
    RT_TARGET_AVX2 static Raw Finish(const __m256 (&v)[N]) noexcept {
        const __m256 four[4] = {v[0], v[1], v[2], v[3]};
        return {Pixels<std::uint8_t>::Finish(four).v, Round(v[4], 255.0f)};
    }
    RT_TARGET_AVX2 static Raw Select(const Raw& computed, const Raw& copied, __m256i copy) noexcept {
        return {_mm256_blendv_epi8(computed.inks, copied.inks, copy),
                _mm256_blendv_epi8(computed.alpha, copied.alpha, copy)};
    }
    RT_TARGET_AVX2 static void Store(const Raw& raw, T* out) noexcept {
        alignas(32) std::uint32_t inks[8], alpha[8];
        _mm256_store_si256(reinterpret_cast<__m256i*>(inks), raw.inks);
        _mm256_store_si256(reinterpret_cast<__m256i*>(alpha), raw.alpha);
        for (int i = 0; i < 8; ++i) {
            __builtin_memcpy(out + 5 * i, &inks[i], 4);
            out[5 * i + 4] = T(alpha[i]);
        }
    }
};

// The pixels of each layer format.
template <Raster::PixelFormat F>
struct FormatPixels;
template <>
struct FormatPixels<Raster::PixelFormat::RGBA8> : Pixels<std::uint8_t> {};
template <>
struct FormatPixels<Raster::PixelFormat::RGBA16> : Pixels<std::uint16_t> {};
template <>
struct FormatPixels<Raster::PixelFormat::LabA16> : Pixels<std::uint16_t> {};
template <>
struct FormatPixels<Raster::PixelFormat::RGBAUF> : Pixels<float> {};
template <>
struct FormatPixels<Raster::PixelFormat::IA8> : IntensityPixels<std::uint8_t> {};
template <>
struct FormatPixels<Raster::PixelFormat::IA16> : IntensityPixels<std::uint16_t> {};
template <>
struct FormatPixels<Raster::PixelFormat::CMYKA8> : CmykaPixels {};

// Clamps four locations to the grid's edges as std::clamp does and splits them into whole and fractional
// parts as SampleBilinear does.
RT_TARGET_AVX2 inline void Split(const double* at, double low, double high, __m128i& whole,
                                 __m128& fraction) noexcept {
    const __m256d clamped =
        _mm256_min_pd(_mm256_set1_pd(high), _mm256_max_pd(_mm256_set1_pd(low), _mm256_loadu_pd(at)));
    const __m256d floor = _mm256_floor_pd(clamped);
    whole = _mm256_cvttpd_epi32(floor);
    fraction = _mm256_cvtpd_ps(_mm256_sub_pd(clamped, floor));
}

// Fills corners (x0, y0), (x1, y0), (x0, y1), (x1, y1) of four-byte pixels from pairs where the grid's
// pixels lie next to each other along an axis; false, filling nothing, where they do not. A pair starts one
// pixel short of the grid's last, so that it stays within the grid; where the corner is the last pixel, the
// pair's second stands for both, as the clamped x1 or y1 does.
template <class P>
[[gnu::always_inline]] RT_TARGET_AVX2 inline bool
PairedCorners(const Access& grid, __m256i x0, __m256i y0, __m256i column0, __m256i column1, __m256i row0,
              __m256i row1, typename P::Raw (&corners)[4]) noexcept {
    if constexpr (sizeof(typename P::Raw) != sizeof(__m256i)) {
        return false;
    } else {
        const bool alongX = grid.xStride == 4 && grid.lastX > grid.left;
        if (!alongX && !(grid.yStride == 4 && grid.lastY > grid.top)) return false;
        const __m256i whole = alongX ? x0 : y0;
        const __m256i start =
            _mm256_min_epi32(whole, _mm256_set1_epi32((alongX ? grid.lastX : grid.lastY) - 1));
        const __m256i offset =
            _mm256_mullo_epi32(_mm256_sub_epi32(start, _mm256_set1_epi32(alongX ? grid.left : grid.top)),
                               _mm256_set1_epi32(alongX ? grid.xStride : grid.yStride));
        const __m256i last = _mm256_cmpgt_epi32(whole, start);
        // Along x the pairs are rows 0 and 1 (corners 0, 1 and 2, 3); along y columns 0 and 1 (0, 2 and 1,
        // 3).
        const int second = alongX ? 1 : 2;
        for (int k = 0; k < 2; ++k) {
            const int first = alongX ? 2 * k : k;
            __m256i a, b;
            LoadPairs(grid.base,
                      _mm256_add_epi32(offset, alongX ? (k ? row1 : row0) : (k ? column1 : column0)), a, b);
            corners[first].v = _mm256_blendv_epi8(a, b, last);
            corners[first + second].v = b;
        }
        return true;
    }
}

template <Raster::PixelFormat F>
[[gnu::always_inline]] RT_TARGET_AVX2 inline void
Sample8(const Access& grid, const double* xs, const double* ys, typename FormatPixels<F>::T* out) noexcept {
    using P = FormatPixels<F>;
    constexpr int N = P::N, A = P::A;
    __m128i x0Low, x0High, y0Low, y0High;
    __m128 fxLow, fxHigh, fyLow, fyHigh;
    Split(xs, grid.left, grid.lastX, x0Low, fxLow);
    Split(xs + 4, grid.left, grid.lastX, x0High, fxHigh);
    Split(ys, grid.top, grid.lastY, y0Low, fyLow);
    Split(ys + 4, grid.top, grid.lastY, y0High, fyHigh);
    const __m256i x0 = _mm256_set_m128i(x0High, x0Low), y0 = _mm256_set_m128i(y0High, y0Low);
    const __m256 fx = _mm256_set_m128(fxHigh, fxLow), fy = _mm256_set_m128(fyHigh, fyLow);
    const __m256i one = _mm256_set1_epi32(1);
    const __m256i x1 = _mm256_min_epi32(_mm256_add_epi32(x0, one), _mm256_set1_epi32(grid.lastX));
    const __m256i y1 = _mm256_min_epi32(_mm256_add_epi32(y0, one), _mm256_set1_epi32(grid.lastY));
    const __m256i xStride = _mm256_set1_epi32(grid.xStride), yStride = _mm256_set1_epi32(grid.yStride);
    const __m256i left = _mm256_set1_epi32(grid.left), top = _mm256_set1_epi32(grid.top);
    const __m256i column0 = _mm256_mullo_epi32(_mm256_sub_epi32(x0, left), xStride);
    const __m256i column1 = _mm256_mullo_epi32(_mm256_sub_epi32(x1, left), xStride);
    const __m256i row0 = _mm256_mullo_epi32(_mm256_sub_epi32(y0, top), yStride);
    const __m256i row1 = _mm256_mullo_epi32(_mm256_sub_epi32(y1, top), yStride);

    // The corners as stored; their components are taken out where they are used, which keeps the
    // registers free.
    typename P::Raw corners[4];
    if (!PairedCorners<P>(grid, x0, y0, column0, column1, row0, row1, corners)) {
        corners[0] = P::Gather(grid.base, _mm256_add_epi32(column0, row0));
        corners[1] = P::Gather(grid.base, _mm256_add_epi32(column1, row0));
        corners[2] = P::Gather(grid.base, _mm256_add_epi32(column0, row1));
        corners[3] = P::Gather(grid.base, _mm256_add_epi32(column1, row1));
    }
    const __m256 unit = _mm256_set1_ps(1.0f);
    const __m256 gx = _mm256_sub_ps(unit, fx), gy = _mm256_sub_ps(unit, fy);
    const __m256 weight[4] = {_mm256_mul_ps(gx, gy), _mm256_mul_ps(fx, gy), _mm256_mul_ps(gx, fy),
                              _mm256_mul_ps(fx, fy)};
    // Colour sums for every component; alpha's is not used, as in SampleBilinear.
    __m256 alpha = _mm256_setzero_ps(), sum[N];
    for (int m = 0; m < N; ++m)
        sum[m] = _mm256_setzero_ps();
    for (int k = 0; k < 4; ++k) {
        __m256 c[N];
        P::Components(corners[k], c);
        const __m256 a = _mm256_mul_ps(c[A], weight[k]);
        alpha = _mm256_add_ps(alpha, a);
        for (int m = 0; m < N; ++m)
            if (m != A) sum[m] = _mm256_add_ps(sum[m], _mm256_mul_ps(c[m], a));
    }
    // Where every neighbour is transparent the colour is the plain weighted average.
    const __m256 weighted =
        _mm256_cmp_ps(_mm256_andnot_ps(_mm256_set1_ps(-0.0f), alpha), _mm256_set1_ps(1e-20f), _CMP_GE_OQ);
    if (_mm256_movemask_ps(weighted) != 0xFF) {
        __m256 plain[N];
        for (int m = 0; m < N; ++m)
            plain[m] = _mm256_setzero_ps();
        for (int k = 0; k < 4; ++k) {
            __m256 c[N];
            P::Components(corners[k], c);
            for (int m = 0; m < N; ++m)
                if (m != A) plain[m] = _mm256_add_ps(plain[m], _mm256_mul_ps(c[m], weight[k]));
        }
        for (int m = 0; m < N; ++m)
            sum[m] = _mm256_blendv_ps(plain[m], sum[m], weighted);
    }
    // Alpha is the weighted sum itself, not divided.
    const __m256 inverse = _mm256_div_ps(unit, _mm256_blendv_ps(unit, alpha, weighted));
    __m256 result[N];
    for (int m = 0; m < N; ++m)
        result[m] = m == A ? alpha : _mm256_mul_ps(sum[m], inverse);
    typename P::Raw pixels = P::Finish(result);
    // A sample on a pixel centre copies that pixel.
    const __m256 exact = _mm256_and_ps(_mm256_cmp_ps(fx, _mm256_setzero_ps(), _CMP_EQ_OQ),
                                       _mm256_cmp_ps(fy, _mm256_setzero_ps(), _CMP_EQ_OQ));
    if (_mm256_movemask_ps(exact) != 0) pixels = P::Select(pixels, corners[0], _mm256_castps_si256(exact));
    P::Store(pixels, out);
}

// The exact float of a 32-bit unsigned sum: both 16-bit halves convert exactly, and the one addition rounds
// as a direct conversion would.
RT_TARGET_AVX2 inline __m256 ExactFloat(__m256i v) noexcept {
    const __m256 high = _mm256_mul_ps(_mm256_cvtepi32_ps(_mm256_srli_epi32(v, 16)), _mm256_set1_ps(65536.0f));
    return _mm256_add_ps(high, _mm256_cvtepi32_ps(_mm256_and_si256(v, _mm256_set1_epi32(0xFFFF))));
}

// Eight pixels' four sums as floats, one component per register. Pixels i and i + 4 share a register, one
// per 128-bit half, so that an in-half transpose gives the components in pixel order.
RT_TARGET_AVX2 inline void SumComponents(const std::uint32_t (*from)[4], __m256 (&c)[4]) noexcept {
    for (int i = 0; i < 4; ++i)
        c[i] = ExactFloat(_mm256_set_m128i(_mm_loadu_si128(reinterpret_cast<const __m128i*>(from[i + 4])),
                                           _mm_loadu_si128(reinterpret_cast<const __m128i*>(from[i]))));
    Avx2Lanes::Transpose(c[0], c[1], c[2], c[3]);
}

} // namespace Detail

// The premultiplied components of row row of a line of pixels of four integer components with alpha last, as
// Layout::Premultiplied4 gives them: colour × alpha for 8 bits, colour × alpha / 65535 for 16 bits.
template <class T>
RT_TARGET_AVX2 inline __m128i Premultiplied(const T* line, int row) noexcept {
    const T* p = line + std::ptrdiff_t(row) * 4;
    if constexpr (sizeof(T) == 1) {
        std::int32_t word;
        __builtin_memcpy(&word, p, sizeof word);
        const __m128i v = _mm_cvtepu8_epi32(_mm_cvtsi32_si128(word));
        return _mm_mullo_epi32(v, _mm_blend_epi32(_mm_shuffle_epi32(v, 0xFF), _mm_set1_epi32(1), 0x8));
    } else {
        const __m128i v = _mm_cvtepu16_epi32(_mm_loadl_epi64(reinterpret_cast<const __m128i*>(p)));
        const __m128i product =
            _mm_mullo_epi32(v, _mm_blend_epi32(_mm_shuffle_epi32(v, 0xFF), _mm_set1_epi32(65535), 0x8));
        // floor(x / 65535) = (x + (x >> 16) + 1) >> 16 for every x up to 65535², without overflow.
        return _mm_srli_epi32(
            _mm_add_epi32(_mm_add_epi32(product, _mm_srli_epi32(product, 16)), _mm_set1_epi32(1)), 16);
    }
}

// Eight pixels' premultiplied sums resolved as Layout::Resolve resolves them: each sum converted to float
// (plus fraction × the outer rows' sum where outers is not null), the colour divided by the normalised
// alpha unless that is exactly 1 or within 1e-20 of 0, everything over weight.
template <class T>
RT_TARGET_AVX2 inline void ResolveSums8(const std::uint32_t (*sums)[4], const std::uint32_t (*outers)[4],
                                        float fraction, float weight, T* out) noexcept {
    constexpr float Max = sizeof(T) == 1 ? 255.0f : 65535.0f;
    constexpr float PremultipliedScale = sizeof(T) == 1 ? 255.0f : 1.0f;
    __m256 c[4];
    Detail::SumComponents(sums, c);
    if (outers) {
        __m256 outer[4];
        Detail::SumComponents(outers, outer);
        for (int m = 0; m < 4; ++m)
            c[m] = _mm256_add_ps(c[m], _mm256_mul_ps(_mm256_set1_ps(fraction), outer[m]));
    }
    const float inverse = 1.0f / weight;
    const float scaled = inverse / PremultipliedScale;
    const __m256 alpha = _mm256_div_ps(_mm256_mul_ps(c[3], _mm256_set1_ps(inverse)), _mm256_set1_ps(Max));
    const __m256 tiny = _mm256_and_ps(_mm256_cmp_ps(alpha, _mm256_set1_ps(-1e-20f), _CMP_GT_OQ),
                                      _mm256_cmp_ps(alpha, _mm256_set1_ps(1e-20f), _CMP_LT_OQ));
    const __m256 unit = _mm256_set1_ps(1.0f);
    const __m256 divide = _mm256_andnot_ps(tiny, _mm256_cmp_ps(alpha, unit, _CMP_NEQ_UQ));
    const __m256 colourScale = _mm256_div_ps(_mm256_set1_ps(scaled), _mm256_blendv_ps(unit, alpha, divide));
    const __m256 result[4] = {_mm256_mul_ps(c[0], colourScale), _mm256_mul_ps(c[1], colourScale),
                              _mm256_mul_ps(c[2], colourScale), _mm256_mul_ps(c[3], _mm256_set1_ps(inverse))};
    Detail::Pixels<T>::Store(Detail::Pixels<T>::Finish(result), out);
}

// Samples indices first..last - 1 into out (index i's pixel at out + N × i); position(i, x, y) gives index
// i's location. Locations are worked out a batch at a time, in this build too, so that their loop can use the
// wide registers. A last part of fewer than eight repeats its final location and keeps what it needs.
template <Raster::PixelFormat F, class Position>
RT_TARGET_AVX2 void SampleRun(const Access& grid, int first, int last, const Position& position,
                              typename Detail::FormatPixels<F>::T* out) noexcept {
    using T = typename Detail::FormatPixels<F>::T;
    constexpr int N = Detail::FormatPixels<F>::N;
    constexpr int Batch = 64;
    double xs[Batch + 8], ys[Batch + 8];
    for (int i = first; i < last;) {
        const int count = last - i >= Batch ? Batch : last - i;
        for (int k = 0; k < count; ++k)
            position(i + k, xs[k], ys[k]);
        int k = 0;
        for (; k + 8 <= count; k += 8)
            Detail::Sample8<F>(grid, xs + k, ys + k, out + std::ptrdiff_t(i + k) * N);
        if (k < count) {
            for (int e = count; e < k + 8; ++e) {
                xs[e] = xs[count - 1];
                ys[e] = ys[count - 1];
            }
            T pixels[8 * N];
            Detail::Sample8<F>(grid, xs + k, ys + k, pixels);
            for (int e = 0; e < (count - k) * N; ++e)
                out[std::ptrdiff_t(i + k) * N + e] = pixels[e];
        }
        i += count;
    }
}

#endif

} // namespace RasterTools::Blur::Avx2
