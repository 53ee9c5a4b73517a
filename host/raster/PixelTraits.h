#pragma once
// Per-format pixel arithmetic for processor code: the stored pixel, its float accumulator and the rules
// (premultiplication, rounding, clamping, channel write masks) that the kernel traits fragments state in
// text.

#include "host/raster/KernelMath.h"
#include "host/raster/PixelFormat.h"

namespace Raster {

namespace Detail {

// What every format's traits share; Stored and Accumulator are kernel vector types (uchar4 and float4 for
// RGBA8). Accumulators hold the stored scale (0..Maximum).
template <class StoredT, class AccumulatorT, int MaximumV>
struct PixelArithmetic {
    using Stored = StoredT;
    using Accumulator = AccumulatorT;
    static constexpr float Maximum = float(MaximumV);

    static Accumulator Accumulate(Stored p) noexcept { return KernelMath::rt_accumulate(p); }
    static Accumulator Premultiplied(Stored p) noexcept { return KernelMath::rt_premultiplied(p); }
    // Colour divided by the normalised alpha, except where it is exactly 1 or below 1e-20 in magnitude.
    static Accumulator Postdivided(Accumulator a) noexcept { return KernelMath::rt_postdivided(a, Maximum); }
    // Straight interpolation from d towards s by m (0..1), in the accumulator.
    static Accumulator Mix(Accumulator d, Accumulator s, float m) noexcept {
        return KernelMath::rt_mix(d, s, m);
    }
};

} // namespace Detail

// Specialised for every format of PixelFormat.
template <PixelFormat F>
struct PixelTraits;

template <>
struct PixelTraits<PixelFormat::RGBA8>
    : Detail::PixelArithmetic<KernelMath::uchar4, KernelMath::float4, 255> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_uchar4(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};
template <>
struct PixelTraits<PixelFormat::RGBA16>
    : Detail::PixelArithmetic<KernelMath::ushort4, KernelMath::float4, 65535> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_ushort4(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};
// Unbounded colour: only alpha is clamped.
template <>
struct PixelTraits<PixelFormat::RGBAUF> : Detail::PixelArithmetic<KernelMath::float4, KernelMath::float4, 1> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_float4(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_alpha(a); }
};
template <>
struct PixelTraits<PixelFormat::IA8> : Detail::PixelArithmetic<KernelMath::uchar2, KernelMath::float2, 255> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_uchar2(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};
template <>
struct PixelTraits<PixelFormat::IA16>
    : Detail::PixelArithmetic<KernelMath::ushort2, KernelMath::float2, 65535> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_ushort2(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};
template <>
struct PixelTraits<PixelFormat::CMYKA8>
    : Detail::PixelArithmetic<KernelMath::cmyka8, KernelMath::float8, 255> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_cmyka8(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};
template <>
struct PixelTraits<PixelFormat::LabA16>
    : Detail::PixelArithmetic<KernelMath::ushort4, KernelMath::float4, 65535> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_ushort4(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};
template <>
struct PixelTraits<PixelFormat::MaskA8> : Detail::PixelArithmetic<KernelMath::uchar, float, 255> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_uchar(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};
template <>
struct PixelTraits<PixelFormat::MaskA16> : Detail::PixelArithmetic<KernelMath::ushort, float, 65535> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_ushort(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};
template <>
struct PixelTraits<PixelFormat::MaskAF> : Detail::PixelArithmetic<float, float, 1> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_float(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};
template <>
struct PixelTraits<PixelFormat::IntensityUF> : Detail::PixelArithmetic<float, float, 1> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_float(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_none(a); }
};
template <>
struct PixelTraits<PixelFormat::RGBAF> : Detail::PixelArithmetic<KernelMath::float4, KernelMath::float4, 1> {
    static Stored FromAccumulator(Accumulator a) noexcept { return KernelMath::rt_to_float4(a); }
    static Accumulator Clamp(Accumulator a) noexcept { return KernelMath::rt_clamp_all(a, Maximum); }
};

template <class C1, class C2, class C3, class C4, class C5>
using PixelTraitsOf = PixelTraits<FormatOf_v<C1, C2, C3, C4, C5>>;

template <PixelFormat F>
using StoredPixel = typename PixelTraits<F>::Stored;

// ---- Channel write masks: bit b of the mask lets channel b of a pixel be written, in channel order; a clear
// bit keeps the destination's value. Intensity formats write intensity for any of the three colour bits and
// alpha for bit 8, so that a colour-only mask (7) means the same in every format.

// The mask value that writes every channel of the format.
constexpr int AllChannelsMask(PixelFormat format) noexcept {
    switch (GetChannelCount(format)) {
    case 5:
        return 31;
    case 1:
        return 1;
    default:
        return 15;
    }
}

template <PixelFormat F>
inline void WriteChannels(StoredPixel<F>& target, const StoredPixel<F>& value, int mask) noexcept {
    if constexpr (F == PixelFormat::CMYKA8) {
        for (int c = 0; c < 4; ++c)
            if (mask & (1 << c)) target.cmyk[c] = value.cmyk[c];
        if (mask & 16) target.a = value.a;
    } else if constexpr (GetChannelCount(F) == 1) {
        if (mask & 1) target = value;
    } else if constexpr (GetChannelCount(F) == 2) {
        if (mask & 7) target.x = value.x;
        if (mask & 8) target.y = value.y;
    } else {
        if (mask & 1) target.x = value.x;
        if (mask & 2) target.y = value.y;
        if (mask & 4) target.z = value.z;
        if (mask & 8) target.w = value.w;
    }
}

// ---- Kernel traits text

// What the traits fragment of a format defines depends on the role the format plays in a kernel.
enum class KernelTraitsRole { Source, Dest, Mask, Sampler };

// The traits fragment for one format in one role: the shared kernel math, then the role's names (for the
// source role: source_type, source_accumulator_type, source_accumulator_literal, accumulator_from_source,
// premultiplied_accumulator_from_source, postdivide_source, source_from_accumulator,
// source_clamp_accumulator, source_maximum(), source_minimum(), source_middle(), source_channel_maximum();
// the destination role the same with dest_ and convert_dest; the mask role mask_type and normalise_mask; the
// sampler role, for a secondary sampler image, the same as the source with sampler_).
// Null for an unknown language.
const char* GetTraitsFragment(PixelFormat format, KernelTraitsRole role, HardwareKernelLanguage language);
// The mask traits of a kernel without a mask (mask_type is a byte, every weight 1).
const char* GetNoMaskTraitsFragment(HardwareKernelLanguage language);

template <class C1, class C2, class C3, class C4, class C5>
const char* GetSourceTraitsFragment(HardwareKernelLanguage language) {
    return GetTraitsFragment(FormatOf_v<C1, C2, C3, C4, C5>, KernelTraitsRole::Source, language);
}
template <class C1, class C2, class C3, class C4, class C5>
const char* GetDestTraitsFragment(HardwareKernelLanguage language) {
    return GetTraitsFragment(FormatOf_v<C1, C2, C3, C4, C5>, KernelTraitsRole::Dest, language);
}
// X1..X5 names a kernel without a mask.
template <class C1, class C2, class C3, class C4, class C5>
const char* GetMaskTraitsFragment(HardwareKernelLanguage language) {
    if constexpr (C1::IsPlaceholder)
        return GetNoMaskTraitsFragment(language);
    else
        return GetTraitsFragment(FormatOf_v<C1, C2, C3, C4, C5>, KernelTraitsRole::Mask, language);
}

} // namespace Raster
