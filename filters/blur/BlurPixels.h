#pragma once
// Per-format pixel arithmetic shared by the blurs: component layout, premultiplied sums with integer rules
// for 8- and 16-bit formats, stores with rounding, and premultiplied bilinear sampling. The scalar arithmetic
// is BlurMath.h's, which the device steps paste as text; the lane code here gives the same bytes (see the
// lane tests).

#include "filters/blur/BlurAvx2.h"
#include "filters/blur/BlurMath.h"
#include "host/raster/DynamicBuffer.h"
#include "host/raster/PixelFormat.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <emmintrin.h>
#include <type_traits>
#include <xmmintrin.h>

namespace RasterTools::Blur {

template <Raster::PixelFormat F>
struct Layout {
    using M = Math<F>;
    static constexpr int N = M::RT_N;
    static constexpr int A = M::RT_A;
    static constexpr bool IsFloat = M::IsFloat;
    static constexpr int Bytes = M::Bytes;
    using T = typename M::T;
    using Acc = typename M::ACC;
    static constexpr float Max = M::RT_MAX;
    static constexpr float PremultipliedScale = M::RT_PSCALE;

    // The premultiplied value of colour component c of a pixel whose alpha is a.
    static Acc Premultiply(T c, T a) noexcept { return M::rt_premultiply(c, a); }

    // Four integer components with alpha last are premultiplied as one vector: for 16 bits, dividing by
    // 65535 where alpha is 65535 gives the colour back, so the division can apply to every pixel.
    static constexpr bool Vectorised = !IsFloat && N == 4 && A == 3;

    // Adds the premultiplied components of pixel p to sum.
    static void Accumulate(Acc* sum, const T* p) noexcept {
        if constexpr (Vectorised)
            Store4(sum, Load4(sum) + Premultiplied4(p));
        else
            M::rt_accumulate(sum, p);
    }
    static void Remove(Acc* sum, const T* p) noexcept {
        if constexpr (Vectorised)
            Store4(sum, Load4(sum) - Premultiplied4(p));
        else
            M::rt_remove(sum, p);
    }

    using U4 = std::uint32_t __attribute__((vector_size(16)));
    static U4 Load4(const std::uint32_t* from) noexcept {
        U4 v;
        std::memcpy(&v, from, sizeof v);
        return v;
    }
    static void Store4(std::uint32_t* to, U4 v) noexcept { std::memcpy(to, &v, sizeof v); }
    static U4 Premultiplied4(const T* p) noexcept {
        const U4 v{p[0], p[1], p[2], p[3]};
        if constexpr (Bytes == 1) {
            const U4 m{p[3], p[3], p[3], 1u};
            return v * m;
        } else {
            const U4 m{p[3], p[3], p[3], 65535u};
            return v * m / 65535u;
        }
    }

    static T Store(float v) noexcept { return M::rt_store(v); }

    // Resolve for four pixels at once, one component per register, with the same arithmetic: formats of
    // four components with alpha last.
    static void Resolve4(const float (*sum)[N], float weight, T* out) noexcept;

    // Writes the pixel of premultiplied sums colour[] and alpha (in stored units) over total weight: colour
    // is divided by the normalised alpha unless that is exactly 1 or within 1e-20 of 0.
    static void Resolve(const float* sum, float weight, T* out) noexcept {
        M::rt_resolve(sum, 1.0f / weight, out);
    }
};

// The pixels a bilinear sample reads, by intermediate coordinates: RowGrid reads an image row by row;
// LineGrid reads an image stored transposed, each of its rows holding one column (a line along the motion).
// Both take coordinates in their own frame, where the image's first pixel is at (left, top): a sample's
// fractions then come from that frame's coordinates, whatever part of it the image holds.
template <Raster::PixelFormat F>
struct RowGrid {
    using T = typename Layout<F>::T;
    const Raster::DynamicBuffer& image;
    int left = 0, top = 0;
    int Width() const noexcept { return image.GetWidth(); }
    int Height() const noexcept { return image.GetHeight(); }
    const T* At(int x, int y) const noexcept {
        return image.Row<T>(y - top) + std::size_t(x - left) * Layout<F>::N;
    }
    Avx2::Access Locations() const noexcept {
        return {image.RowBytes(0),  image.GetBytesPerPixel(), int(image.Stride()), left, top,
                left + Width() - 1, top + Height() - 1};
    }
};
template <Raster::PixelFormat F>
struct LineGrid {
    using T = typename Layout<F>::T;
    const Raster::DynamicBuffer& lines;
    int left = 0, top = 0;
    int count = 0; // lines in use, from the first row of lines
    int Width() const noexcept { return count; }
    int Height() const noexcept { return lines.GetWidth(); }
    const T* At(int x, int y) const noexcept {
        return lines.Row<T>(x - left) + std::size_t(y - top) * Layout<F>::N;
    }
    Avx2::Access Locations() const noexcept {
        return {lines.RowBytes(0),  int(lines.Stride()), lines.GetBytesPerPixel(), left, top,
                left + Width() - 1, top + Height() - 1};
    }
};

namespace Detail {

// Four components with alpha last as floats, and back with the rounding of Layout::Store.
template <class T>
inline __m128 Load4(const T* p) noexcept {
    if constexpr (std::is_same_v<T, float>) {
        return _mm_loadu_ps(p);
    } else if constexpr (sizeof(T) == 1) {
        std::int32_t word;
        std::memcpy(&word, p, sizeof word);
        const __m128i zero = _mm_setzero_si128();
        const __m128i bytes = _mm_cvtsi32_si128(word);
        return _mm_cvtepi32_ps(_mm_unpacklo_epi16(_mm_unpacklo_epi8(bytes, zero), zero));
    } else {
        const __m128i words = _mm_loadl_epi64(reinterpret_cast<const __m128i*>(p));
        return _mm_cvtepi32_ps(_mm_unpacklo_epi16(words, _mm_setzero_si128()));
    }
}

template <class T>
inline void Store4(__m128 v, T* out) noexcept {
    if constexpr (std::is_same_v<T, float>) {
        _mm_storeu_ps(out, v);
    } else {
        constexpr float Max = sizeof(T) == 1 ? 255.0f : 65535.0f;
        v = _mm_add_ps(_mm_min_ps(_mm_max_ps(v, _mm_setzero_ps()), _mm_set1_ps(Max)), _mm_set1_ps(0.5f));
        const __m128i whole = _mm_cvttps_epi32(v);
        if constexpr (sizeof(T) == 1) {
            const __m128i words = _mm_packs_epi32(whole, whole);
            const std::int32_t word = _mm_cvtsi128_si32(_mm_packus_epi16(words, words));
            std::memcpy(out, &word, sizeof word);
        } else {
            // Signed packing saturates at 32767: move the range down and flip the top bit back.
            const __m128i shifted = _mm_sub_epi32(whole, _mm_set1_epi32(32768));
            const __m128i words = _mm_xor_si128(_mm_packs_epi32(shifted, shifted), _mm_set1_epi16(-32768));
            _mm_storel_epi64(reinterpret_cast<__m128i*>(out), words);
        }
    }
}

} // namespace Detail

template <Raster::PixelFormat F>
inline void Layout<F>::Resolve4(const float (*sum)[N], float weight, T* out) noexcept {
    static_assert(N == 4 && A == 3, "four components with alpha last");
    const float inverse = 1.0f / weight;
    const float scaled = inverse / PremultipliedScale;
    __m128 c0 = _mm_loadu_ps(sum[0]), c1 = _mm_loadu_ps(sum[1]), c2 = _mm_loadu_ps(sum[2]),
           a = _mm_loadu_ps(sum[3]);
    _MM_TRANSPOSE4_PS(c0, c1, c2, a);
    const __m128 one = _mm_set1_ps(1.0f);
    const __m128 alpha = _mm_div_ps(_mm_mul_ps(a, _mm_set1_ps(inverse)), _mm_set1_ps(Max));
    const __m128 tiny =
        _mm_and_ps(_mm_cmpgt_ps(alpha, _mm_set1_ps(-1e-20f)), _mm_cmplt_ps(alpha, _mm_set1_ps(1e-20f)));
    const __m128 divide = _mm_andnot_ps(tiny, _mm_cmpneq_ps(alpha, one));
    const __m128 divisor = _mm_or_ps(_mm_and_ps(divide, alpha), _mm_andnot_ps(divide, one));
    const __m128 colourScale = _mm_div_ps(_mm_set1_ps(scaled), divisor);
    c0 = _mm_mul_ps(c0, colourScale);
    c1 = _mm_mul_ps(c1, colourScale);
    c2 = _mm_mul_ps(c2, colourScale);
    a = _mm_mul_ps(a, _mm_set1_ps(inverse));
    _MM_TRANSPOSE4_PS(c0, c1, c2, a);
    Detail::Store4(c0, out);
    Detail::Store4(c1, out + 4);
    Detail::Store4(c2, out + 8);
    Detail::Store4(a, out + 12);
}

// The four pixels and the fractions of a bilinear sample at (x, y) (BlurMath's cell); true where the sample
// sits on the centre of p[0].
template <Raster::PixelFormat F, class Grid>
inline bool BilinearCell(const Grid& grid, double x, double y, const typename Layout<F>::T* (&p)[4],
                         float& fx, float& fy) noexcept {
    int cell[4];
    float fraction[2];
    const bool exact = Layout<F>::M::rt_bilinear_cell(x, y, grid.left, grid.top, grid.left + grid.Width() - 1,
                                                      grid.top + grid.Height() - 1, cell, fraction);
    p[0] = grid.At(cell[0], cell[1]);
    p[1] = grid.At(cell[2], cell[1]);
    p[2] = grid.At(cell[0], cell[3]);
    p[3] = grid.At(cell[2], cell[3]);
    fx = fraction[0];
    fy = fraction[1];
    return exact;
}

// The shared scalar sample alone, which the lane code below must equal (the lane tests).
template <Raster::PixelFormat F, class Grid>
inline void SampleBilinearScalar(const Grid& grid, double x, double y, typename Layout<F>::T* out) noexcept {
    const typename Layout<F>::T* p[4];
    float fx, fy;
    if (BilinearCell<F>(grid, x, y, p, fx, fy))
        std::copy_n(p[0], Layout<F>::N, out);
    else
        Layout<F>::M::rt_bilinear_mix(p[0], p[1], p[2], p[3], fx, fy, out);
}

// Premultiplied bilinear sample of grid at continuous index (x, y) of its frame (pixel i's centre is at i),
// clamped to the grid's edges. A sample exactly on a pixel centre copies that pixel, so quarter turns are
// exact.
template <Raster::PixelFormat F, class Grid>
inline void SampleBilinear(const Grid& grid, double x, double y, typename Layout<F>::T* out) noexcept {
    using L = Layout<F>;
    if constexpr (!(L::N == 4 && L::A == 3)) {
        SampleBilinearScalar<F>(grid, x, y, out);
    } else {
        // The shared mix on all four components at once, in the same order.
        const typename L::T* p[4];
        float fx, fy;
        if (BilinearCell<F>(grid, x, y, p, fx, fy)) {
            std::copy_n(p[0], L::N, out);
            return;
        }
        const float weight[4] = {(1.0f - fx) * (1.0f - fy), fx * (1.0f - fy), (1.0f - fx) * fy, fx * fy};
        __m128 v[4], sum = _mm_setzero_ps();
        float alpha = 0.0f;
        for (int k = 0; k < 4; ++k) {
            v[k] = Detail::Load4(p[k]);
            const float a = float(p[k][3]) * weight[k];
            alpha += a;
            sum = _mm_add_ps(sum, _mm_mul_ps(v[k], _mm_set1_ps(a)));
        }
        const float alphaOut = alpha;
        if (!(std::fabs(alpha) >= 1e-20f)) {
            sum = _mm_setzero_ps();
            for (int k = 0; k < 4; ++k)
                sum = _mm_add_ps(sum, _mm_mul_ps(v[k], _mm_set1_ps(weight[k])));
            alpha = 1.0f;
        }
        sum = _mm_mul_ps(sum, _mm_set1_ps(1.0f / alpha));
        // Alpha is the weighted sum itself, not divided.
        const __m128 last = _mm_castsi128_ps(_mm_set_epi32(-1, 0, 0, 0));
        sum = _mm_or_ps(_mm_and_ps(last, _mm_set1_ps(alphaOut)), _mm_andnot_ps(last, sum));
        Detail::Store4(sum, out);
    }
}

// Four samples at once, each exactly as SampleBilinear gives it: formats of four components with alpha last
// work the four pixels side by side, one component per register; others sample one by one. out receives the
// four pixels one after another.
template <Raster::PixelFormat F, class Grid>
inline void SampleBilinear4(const Grid& grid, const double* xs, const double* ys,
                            typename Layout<F>::T* out) noexcept {
    using L = Layout<F>;
    using T = typename L::T;
    if constexpr (!(L::N == 4 && L::A == 3)) {
        for (int i = 0; i < 4; ++i)
            SampleBilinear<F>(grid, xs[i], ys[i], out + i * L::N);
    } else {
        alignas(16) float fxs[4], fys[4];
        const T* p[4][4];
        int exact = 0; // pixels that sit on a pixel centre and copy it
        for (int i = 0; i < 4; ++i)
            if (BilinearCell<F>(grid, xs[i], ys[i], p[i], fxs[i], fys[i])) exact |= 1 << i;
        const __m128 one = _mm_set1_ps(1.0f);
        const __m128 fx = _mm_load_ps(fxs), fy = _mm_load_ps(fys);
        const __m128 gx = _mm_sub_ps(one, fx), gy = _mm_sub_ps(one, fy);
        const __m128 weight[4] = {_mm_mul_ps(gx, gy), _mm_mul_ps(fx, gy), _mm_mul_ps(gx, fy),
                                  _mm_mul_ps(fx, fy)};
        // Corner k of the four pixels, one component per register: c[k][component].
        __m128 c[4][4];
        for (int k = 0; k < 4; ++k) {
            __m128 r0 = Detail::Load4(p[0][k]), r1 = Detail::Load4(p[1][k]);
            __m128 r2 = Detail::Load4(p[2][k]), r3 = Detail::Load4(p[3][k]);
            _MM_TRANSPOSE4_PS(r0, r1, r2, r3);
            c[k][0] = r0;
            c[k][1] = r1;
            c[k][2] = r2;
            c[k][3] = r3;
        }
        __m128 alpha = _mm_setzero_ps(), sum[3] = {_mm_setzero_ps(), _mm_setzero_ps(), _mm_setzero_ps()};
        for (int k = 0; k < 4; ++k) {
            const __m128 a = _mm_mul_ps(c[k][3], weight[k]);
            alpha = _mm_add_ps(alpha, a);
            for (int m = 0; m < 3; ++m)
                sum[m] = _mm_add_ps(sum[m], _mm_mul_ps(c[k][m], a));
        }
        // Where every neighbour is transparent the colour is the plain weighted average.
        const __m128 absAlpha = _mm_andnot_ps(_mm_set1_ps(-0.0f), alpha);
        const __m128 weighted = _mm_cmpge_ps(absAlpha, _mm_set1_ps(1e-20f));
        if (_mm_movemask_ps(weighted) != 0xF) {
            __m128 plain[3] = {_mm_setzero_ps(), _mm_setzero_ps(), _mm_setzero_ps()};
            for (int k = 0; k < 4; ++k)
                for (int m = 0; m < 3; ++m)
                    plain[m] = _mm_add_ps(plain[m], _mm_mul_ps(c[k][m], weight[k]));
            for (int m = 0; m < 3; ++m)
                sum[m] = _mm_or_ps(_mm_and_ps(weighted, sum[m]), _mm_andnot_ps(weighted, plain[m]));
        }
        const __m128 divisor = _mm_or_ps(_mm_and_ps(weighted, alpha), _mm_andnot_ps(weighted, one));
        const __m128 inverse = _mm_div_ps(one, divisor);
        __m128 r0 = _mm_mul_ps(sum[0], inverse), r1 = _mm_mul_ps(sum[1], inverse);
        __m128 r2 = _mm_mul_ps(sum[2], inverse), r3 = alpha;
        _MM_TRANSPOSE4_PS(r0, r1, r2, r3);
        const __m128 pixels[4] = {r0, r1, r2, r3};
        for (int i = 0; i < 4; ++i) {
            if (exact & (1 << i))
                std::copy_n(p[i][0], 4, out + i * 4);
            else
                Detail::Store4(pixels[i], out + i * 4);
        }
    }
}

// Samples indices first..last - 1 into out (index i's pixel at out + i × N), four at a time and the rest one
// by one; position(i, x, y) gives index i's location.
template <Raster::PixelFormat F, class Grid, class Position>
inline void SampleBilinearRun(const Grid& grid, int first, int last, const Position& position,
                              typename Layout<F>::T* out) noexcept {
    constexpr int N = Layout<F>::N;
    int i = first;
#if RT_AVX2_BUILD
    if (Kernel::HasAvx2()) {
        Avx2::SampleRun<F>(grid.Locations(), first, last, position, out);
        return;
    }
#endif
    for (; i + 4 <= last; i += 4) {
        double xs[4], ys[4];
        for (int k = 0; k < 4; ++k)
            position(i + k, xs[k], ys[k]);
        SampleBilinear4<F>(grid, xs, ys, out + std::ptrdiff_t(i) * N);
    }
    for (; i < last; ++i) {
        double x, y;
        position(i, x, y);
        SampleBilinear<F>(grid, x, y, out + std::ptrdiff_t(i) * N);
    }
}

// The write-mask bit of component c of a pixel of F (see Raster::WriteChannels).
template <Raster::PixelFormat F>
int ChannelBit(int c) noexcept {
    return Math<F>::rt_channel_bit(c);
}

} // namespace RasterTools::Blur
