#pragma once
// Per-format pixel arithmetic shared by the blurs: component layout, premultiplied sums with integer rules
// for 8- and 16-bit formats, stores with rounding, and premultiplied bilinear sampling.

#include "host/raster/DynamicBuffer.h"
#include "host/raster/PixelFormat.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <type_traits>

namespace RasterTools::Blur {

template <Raster::PixelFormat F>
struct Layout {
    static constexpr int N = Raster::GetChannelCount(F);
    static constexpr int A = Raster::GetPixelFormatInfo(F).alphaIndex;
    static constexpr bool IsFloat = Raster::IsFloatFormat(F);
    static constexpr int Bytes = Raster::GetBytesPerComponent(F);
    using T = std::conditional_t<IsFloat, float, std::conditional_t<Bytes == 1, std::uint8_t, std::uint16_t>>;
    // Sums are exact integers for integer formats (at most 2^32 / 65535 terms) and doubles for floats.
    using Acc = std::conditional_t<IsFloat, double, std::uint32_t>;
    static constexpr float Max = IsFloat ? 1.0f : Bytes == 1 ? 255.0f : 65535.0f;
    // What a summed premultiplied colour is divided by to give colour units: 8-bit sums hold colour × alpha.
    static constexpr float PremultipliedScale = Bytes == 1 && !IsFloat ? 255.0f : 1.0f;
    static_assert(A >= 0 && A < N, "blurs need a format with alpha");

    // The premultiplied value of colour component c of a pixel whose alpha is a.
    static Acc Premultiply(T c, T a) noexcept {
        if constexpr (IsFloat)
            return double(c * a);
        else if constexpr (Bytes == 1)
            return Acc(c) * Acc(a);
        else
            return a < 65535 ? Acc(c) * Acc(a) / 65535u : Acc(c);
    }

    // Four integer components with alpha last are premultiplied as one vector: for 16 bits, dividing by
    // 65535 where alpha is 65535 gives the colour back, so the division can apply to every pixel.
    static constexpr bool Vectorised = !IsFloat && N == 4 && A == 3;

    // Adds the premultiplied components of pixel p to sum.
    static void Accumulate(Acc* sum, const T* p) noexcept {
        if constexpr (Vectorised) {
            Store4(sum, Load4(sum) + Premultiplied4(p));
        } else {
            for (int c = 0; c < N; ++c)
                sum[c] += c == A ? Acc(p[A]) : Premultiply(p[c], p[A]);
        }
    }
    static void Remove(Acc* sum, const T* p) noexcept {
        if constexpr (Vectorised) {
            Store4(sum, Load4(sum) - Premultiplied4(p));
        } else {
            for (int c = 0; c < N; ++c)
                sum[c] -= c == A ? Acc(p[A]) : Premultiply(p[c], p[A]);
        }
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

    static T Store(float v) noexcept {
        if constexpr (IsFloat)
            return v;
        else
            return T(int(std::clamp(v, 0.0f, Max) + 0.5f)); // round half up: no library call per component
    }

    // Writes the pixel of premultiplied sums colour[] and alpha (in stored units) over total weight: colour
    // is divided by the normalised alpha unless that is exactly 1 or within 1e-20 of 0.
    static void Resolve(const float* sum, float weight, T* out) noexcept {
        const float inverse = 1.0f / weight;
        const float alpha = sum[A] * inverse / Max;
        const bool divide = alpha != 1.0f && !(alpha > -1e-20f && alpha < 1e-20f);
        const float colourScale = inverse / PremultipliedScale / (divide ? alpha : 1.0f);
        for (int c = 0; c < N; ++c)
            out[c] = Store(c == A ? sum[A] * inverse : sum[c] * colourScale);
    }
};

// Premultiplied bilinear sample of image at continuous index (x, y) (pixel i's centre is at i), clamped to
// the image's edges. A sample exactly on a pixel centre copies that pixel, so quarter turns are exact.
template <Raster::PixelFormat F>
inline void SampleBilinear(const Raster::DynamicBuffer& image, double x, double y,
                           typename Layout<F>::T* out) noexcept {
    using L = Layout<F>;
    using T = typename L::T;
    const int w = image.GetWidth(), h = image.GetHeight();
    x = std::clamp(x, 0.0, double(w - 1));
    y = std::clamp(y, 0.0, double(h - 1));
    const int x0 = int(x), y0 = int(y);
    const float fx = float(x - x0), fy = float(y - y0);
    const T* r0 = image.Row<T>(y0);
    if (fx == 0.0f && fy == 0.0f) {
        std::copy_n(r0 + std::size_t(x0) * L::N, L::N, out);
        return;
    }
    const int x1 = std::min(x0 + 1, w - 1), y1 = std::min(y0 + 1, h - 1);
    const T* r1 = image.Row<T>(y1);
    const T* p[4] = {r0 + std::size_t(x0) * L::N, r0 + std::size_t(x1) * L::N, r1 + std::size_t(x0) * L::N,
                     r1 + std::size_t(x1) * L::N};
    const float weight[4] = {(1.0f - fx) * (1.0f - fy), fx * (1.0f - fy), (1.0f - fx) * fy, fx * fy};
    if constexpr (L::N == 4 && L::A == 3) {
        // The same arithmetic on all four components at once.
        using V4 = float __attribute__((vector_size(16)));
        V4 sum{};
        float alpha = 0.0f;
        for (int k = 0; k < 4; ++k) {
            const V4 v{float(p[k][0]), float(p[k][1]), float(p[k][2]), float(p[k][3])};
            const float a = v[3] * weight[k];
            alpha += a;
            sum += v * a;
        }
        const T alphaOut = L::Store(alpha);
        if (!(std::fabs(alpha) >= 1e-20f)) {
            sum = V4{};
            for (int k = 0; k < 4; ++k)
                sum += V4{float(p[k][0]), float(p[k][1]), float(p[k][2]), float(p[k][3])} * weight[k];
            alpha = 1.0f;
        }
        sum *= 1.0f / alpha;
        out[0] = L::Store(sum[0]);
        out[1] = L::Store(sum[1]);
        out[2] = L::Store(sum[2]);
        out[3] = alphaOut;
        return;
    }
    float alpha = 0.0f;
    float colour[L::N] = {};
    for (int k = 0; k < 4; ++k) {
        const float a = float(p[k][L::A]) * weight[k];
        alpha += a;
        for (int c = 0; c < L::N; ++c)
            colour[c] += float(p[k][c]) * a;
    }
    const T alphaOut = L::Store(alpha);
    // Where every neighbour is transparent the colour has no weight; the plain average keeps it defined.
    if (!(std::fabs(alpha) >= 1e-20f)) {
        for (int c = 0; c < L::N; ++c) {
            colour[c] = 0.0f;
            for (int k = 0; k < 4; ++k)
                colour[c] += float(p[k][c]) * weight[k];
        }
        alpha = 1.0f;
    }
    const float inverse = 1.0f / alpha;
    for (int c = 0; c < L::N; ++c)
        out[c] = c == L::A ? alphaOut : L::Store(colour[c] * inverse);
}

// The write-mask bit of component c of a pixel of F (see Raster::WriteChannels).
template <Raster::PixelFormat F>
constexpr int ChannelBit(int c) noexcept {
    if constexpr (Layout<F>::N == 2)
        return c == 0 ? 7 : 8;
    else
        return 1 << c;
}

} // namespace RasterTools::Blur
