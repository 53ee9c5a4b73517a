#pragma once
// Span conversions through planes of working floats: the arithmetic of the Convert bodies, one channel
// plane at a time so that the compiler runs it across lanes of pixels. Results equal the per-pixel bodies
// bit for bit (the conformance tests compare both with the device).

#include "host/raster/Bitmap.h"
#include "host/raster/KernelMath.h"
#include "host/raster/PixelTraits.h"

#include <bit>
#include <cstdint>
#include <cstring>

namespace RasterTools::PlanarConvert {

using namespace Raster::KernelMath;
using Raster::PixelFormat;
using Raster::SpanLength;

// Red, green, blue and alpha planes of up to one span.
struct WorkingPlanes {
    alignas(64) float r[SpanLength];
    alignas(64) float g[SpanLength];
    alignas(64) float b[SpanLength];
    alignas(64) float a[SpanLength];
};

// The scalar steps of the bodies, written without branches so that they run across lanes; each equals the
// kernel helpers it stands for on every input, NaN and infinities included.

// clamp(v, 0, 1): NaN goes to 0, as rt_fmax(NaN, 0) does.
inline float Clamp01(float v) noexcept {
    const float low = v > 0.0f ? v : 0.0f;
    return low < 1.0f ? low : 1.0f;
}
// rt_round for v already within [0, maximum]: the fraction is exact there and halves go up.
inline int RoundInRange(float v) noexcept {
    const int truncated = static_cast<int>(v);
    return truncated + static_cast<int>(v - static_cast<float>(truncated) >= 0.5f);
}
// rt_sat(rt_round(v)) for a maximum of 255 or 65535: clamping first gives the same value, since rounding is
// monotonic and the bounds are whole.
inline int RoundSaturated(float v, float maximum) noexcept {
    const float low = v > 0.0f ? v : 0.0f;
    return RoundInRange(low < maximum ? low : maximum);
}
inline uchar ToByte(float v) noexcept { // convert_uchar(round(clamp(v, 0, 1) * 255))
    return static_cast<uchar>(RoundInRange(Clamp01(v) * 255.0f));
}
// rt_fmin for operands that are never NaN (stored inks, clamped colour).
inline float Min(float a, float b) noexcept {
    return a < b ? a : b;
}
inline float Luminance(float r, float g, float b) noexcept {
    return r * 0.299f + g * 0.587f + b * 0.114f;
}

// Formats without a planar form (LabA16, which goes through the colour manager) leave this undefined.
template <PixelFormat F>
struct Planar;

// Four components of Component, stored as value × Maximum.
template <class Pixel, class Component, int Maximum>
struct PlanarRGBA {
    static constexpr float Max = float(Maximum);
    static void ToWorking(const Pixel* in, WorkingPlanes& w, int n) noexcept {
#pragma omp simd
        for (int i = 0; i < n; ++i) {
            w.r[i] = in[i].x / Max;
            w.g[i] = in[i].y / Max;
            w.b[i] = in[i].z / Max;
            w.a[i] = in[i].w / Max;
        }
    }
    // The components are packed into 32-bit words (little-endian: the first component lowest), which the
    // compiler stores whole instead of component by component.
    static void FromWorking(const WorkingPlanes& w, Pixel* out, int n) noexcept {
        static_assert(std::endian::native == std::endian::little);
        constexpr int Words = int(sizeof(Pixel) / sizeof(std::uint32_t));
        constexpr int Shift = 32 / (4 / Words);
        alignas(64) std::uint32_t words[SpanLength * Words];
#pragma omp simd
        for (int i = 0; i < n; ++i) {
            const auto r = std::uint32_t(RoundInRange(Clamp01(w.r[i]) * Max));
            const auto g = std::uint32_t(RoundInRange(Clamp01(w.g[i]) * Max));
            const auto b = std::uint32_t(RoundInRange(Clamp01(w.b[i]) * Max));
            const auto a = std::uint32_t(RoundInRange(Clamp01(w.a[i]) * Max));
            if constexpr (Words == 1) {
                words[i] = r | g << Shift | b << 2 * Shift | a << 3 * Shift;
            } else {
                words[2 * i] = r | g << Shift;
                words[2 * i + 1] = b | a << Shift;
            }
        }
        std::memcpy(out, words, std::size_t(n) * sizeof(Pixel));
    }
};

// Intensity and alpha. Intensity is written from the unclamped colour (the bodies drop saturate's result);
// alpha is scaled and rounded on its own.
template <class Pixel, class Component, int Maximum>
struct PlanarIA {
    static constexpr float Max = float(Maximum);
    static void ToWorking(const Pixel* in, WorkingPlanes& w, int n) noexcept {
#pragma omp simd
        for (int i = 0; i < n; ++i) {
            const float intensity = in[i].x / Max;
            w.r[i] = w.g[i] = w.b[i] = intensity;
            w.a[i] = in[i].y / Max;
        }
    }
    static void FromWorking(const WorkingPlanes& w, Pixel* out, int n) noexcept {
#pragma omp simd
        for (int i = 0; i < n; ++i)
            out[i] = {Component(RoundSaturated(Max * Luminance(w.r[i], w.g[i], w.b[i]), Max)),
                      Component(RoundSaturated(w.a[i] * Max, Max))};
    }
};

template <>
struct Planar<PixelFormat::RGBA8> : PlanarRGBA<uchar4, uchar, 255> {};
template <>
struct Planar<PixelFormat::RGBA16> : PlanarRGBA<ushort4, ushort, 65535> {};
template <>
struct Planar<PixelFormat::IA8> : PlanarIA<uchar2, uchar, 255> {};
template <>
struct Planar<PixelFormat::IA16> : PlanarIA<ushort2, ushort, 65535> {};

template <>
struct Planar<PixelFormat::RGBAUF> {
    static void ToWorking(const float4* in, WorkingPlanes& w, int n) noexcept {
#pragma omp simd
        for (int i = 0; i < n; ++i) {
            w.r[i] = in[i].x;
            w.g[i] = in[i].y;
            w.b[i] = in[i].z;
            w.a[i] = in[i].w;
        }
    }
    static void FromWorking(const WorkingPlanes& w, float4* out, int n) noexcept {
#pragma omp simd
        for (int i = 0; i < n; ++i)
            out[i] = make_float4(w.r[i], w.g[i], w.b[i], w.a[i]);
    }
};

// CMYKA8 pixels are five bytes: the four inks are moved as one 32-bit word (little-endian, cyan lowest) and
// alpha on its own, so that the arithmetic runs on whole words. Pixels are read and written as 64-bit words
// at five-byte steps, each overlapping the next pixel (which is written after it); the last moves its own
// five.
static_assert(sizeof(cmyka8) == 5 && std::endian::native == std::endian::little);
inline void SplitCMYKA8(const cmyka8* in, std::uint32_t* inks, uchar* alpha, int n) noexcept {
    const auto* bytes = reinterpret_cast<const unsigned char*>(in);
    const auto split = [&](int i, std::size_t size) {
        std::uint64_t word = 0;
        std::memcpy(&word, bytes + 5 * i, size);
        inks[i] = std::uint32_t(word);
        alpha[i] = uchar(word >> 32);
    };
    for (int i = 0; i + 1 < n; ++i)
        split(i, sizeof(std::uint64_t));
    if (n > 0) split(n - 1, 5);
}
inline void MergeCMYKA8(const std::uint32_t* inks, const uchar* alpha, cmyka8* out, int n) noexcept {
    auto* bytes = reinterpret_cast<unsigned char*>(out);
    const auto merge = [&](int i, std::size_t size) {
        const std::uint64_t word = inks[i] | std::uint64_t(alpha[i]) << 32;
        std::memcpy(bytes + 5 * i, &word, size);
    };
    for (int i = 0; i + 1 < n; ++i)
        merge(i, sizeof(std::uint64_t));
    if (n > 0) merge(n - 1, 5);
}

template <>
struct Planar<PixelFormat::CMYKA8> {
    static float Ink(std::uint32_t inks, int channel) noexcept {
        return float((inks >> 8 * channel) & 0xffu);
    }
    static void ToWorking(const cmyka8* in, WorkingPlanes& w, int n) noexcept {
        alignas(64) std::uint32_t inks[SpanLength];
        alignas(64) uchar alpha[SpanLength];
        SplitCMYKA8(in, inks, alpha, n);
#pragma omp simd
        for (int i = 0; i < n; ++i) {
            const float c = Ink(inks[i], 0) * 0.003921569f;
            const float m = Ink(inks[i], 1) * 0.003921569f;
            const float y = Ink(inks[i], 2) * 0.003921569f;
            const float k = Ink(inks[i], 3) * 0.003921569f;
            w.r[i] = 1.0f - Min(1.0f, c * (1.0f - k) + k);
            w.g[i] = 1.0f - Min(1.0f, m * (1.0f - k) + k);
            w.b[i] = 1.0f - Min(1.0f, y * (1.0f - k) + k);
            w.a[i] = float(alpha[i]) / 255.0f;
        }
    }
    // Where black stores as full, divides by 1 and then selects zero inks, instead of branching.
    static void FromWorking(const WorkingPlanes& w, cmyka8* out, int n) noexcept {
        alignas(64) std::uint32_t inks[SpanLength];
        alignas(64) uchar alpha[SpanLength];
#pragma omp simd
        for (int i = 0; i < n; ++i) {
            const float r = Clamp01(w.r[i]), g = Clamp01(w.g[i]), b = Clamp01(w.b[i]);
            const float k = Min(1.0f - r, Min(1.0f - g, 1.0f - b));
            const bool inked = k * 255.0f < 254.5f;
            const float divisor = inked ? 1.0f - k : 1.0f;
            const float cInk = (1.0f - r - k) / divisor;
            const float mInk = (1.0f - g - k) / divisor;
            const float yInk = (1.0f - b - k) / divisor;
            const float c = inked ? cInk : 0.0f;
            const float m = inked ? mInk : 0.0f;
            const float y = inked ? yInk : 0.0f;
            inks[i] = std::uint32_t(ToByte(c)) | std::uint32_t(ToByte(m)) << 8 |
                      std::uint32_t(ToByte(y)) << 16 | std::uint32_t(ToByte(k)) << 24;
            alpha[i] = ToByte(w.a[i]);
        }
        MergeCMYKA8(inks, alpha, out, n);
    }
};

template <PixelFormat Source, PixelFormat Dest>
inline constexpr bool HasPlanarPair = requires {
    Planar<Source>::ToWorking;
    Planar<Dest>::FromWorking;
};

// Between the 8- and 16-bit forms of one layout the trip through working floats is integer arithmetic on
// each component: widening gives v × 257, narrowing rounds v / 257 (never a tie, 257 being odd), and an
// intensity's luminance of three equal channels comes back to the same value. The tests check every value.
template <PixelFormat Source, PixelFormat Dest>
inline constexpr bool IsWidening = (Source == PixelFormat::RGBA8 && Dest == PixelFormat::RGBA16) ||
                                   (Source == PixelFormat::IA8 && Dest == PixelFormat::IA16);
template <PixelFormat Source, PixelFormat Dest>
inline constexpr bool IsNarrowing = IsWidening<Dest, Source>;

// n (at most one span) pixels from Source to Dest through the working planes of Kit (Planar, or a kit of
// the same arithmetic for one instruction set).
template <PixelFormat Source, PixelFormat Dest, template <PixelFormat> class Kit = Planar>
requires HasPlanarPair<Source, Dest>
inline void ConvertSpanInline(const Raster::StoredPixel<Source>* in, Raster::StoredPixel<Dest>* out,
                              int n) noexcept {
    constexpr int Components = Raster::GetChannelCount(Source);
    if constexpr (IsWidening<Source, Dest>) {
        const auto* from = reinterpret_cast<const uchar*>(in);
        auto* to = reinterpret_cast<ushort*>(out);
#pragma omp simd
        for (int i = 0; i < n * Components; ++i)
            to[i] = ushort(from[i] * 257u);
    } else if constexpr (IsNarrowing<Source, Dest>) {
        const auto* from = reinterpret_cast<const ushort*>(in);
        auto* to = reinterpret_cast<uchar*>(out);
#pragma omp simd
        for (int i = 0; i < n * Components; ++i)
            to[i] = uchar((from[i] * 255u + 32895u) >> 16); // (v + 128) / 257 without a division
    } else {
        WorkingPlanes planes;
        Kit<Source>::ToWorking(in, planes, n);
        Kit<Dest>::FromWorking(planes, out, n);
    }
}

// The same, compiled once per pair (SpanConversions.cpp) for AVX2 and for any x86-64, picked at run time.
template <PixelFormat Source, PixelFormat Dest>
requires HasPlanarPair<Source, Dest>
void ConvertSpan(const Raster::StoredPixel<Source>* in, Raster::StoredPixel<Dest>* out, int n) noexcept;

} // namespace RasterTools::PlanarConvert
