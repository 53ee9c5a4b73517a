#pragma once
// Processor conversions between stored pixels and the working pixel (rgbauf), compiled from the same bodies
// the kernels get, and the host's PixelConversion for every pair of different formats.

#include "host/raster/ICCManager.h"
#include "host/raster/Stages.h"
#include "pipeline/ConvertBodies.h"
#include "pipeline/PlanarConversions.h"

namespace RasterTools {

namespace ConvertCode {

using namespace Raster::KernelMath;
// The bodies call these by their kernel names; declaring them here keeps any global C function of the same
// name out of the lookup.
using Raster::KernelMath::clamp;
using Raster::KernelMath::convert_float4;
using Raster::KernelMath::convert_uchar2;
using Raster::KernelMath::convert_uchar4;
using Raster::KernelMath::convert_ushort4;
using Raster::KernelMath::float2_literal;
using Raster::KernelMath::rgbauf_literal;
using Raster::KernelMath::round;
using Raster::KernelMath::rt_fmin;
using Raster::KernelMath::rt_round;
using Raster::KernelMath::saturate;
using Raster::KernelMath::ushort2_literal;

// Stored <-> working for format F; the LabA16 pair goes through the colour manager (for a run of pixels, see
// ConvertLabSpan).
template <Raster::PixelFormat F>
struct Convert;

template <>
struct Convert<Raster::PixelFormat::RGBA8> {
    using source_type = uchar4;
    static uchar4 convert_dest(float4 v) noexcept { return convert_uchar4(v); }
    static rgbauf_type ToWorking(source_type source) noexcept { RT_RGBA8_TO_WORKING }
    static source_type FromWorking(rgbauf_type source) noexcept { RT_RGBA8_FROM_WORKING }
};
template <>
struct Convert<Raster::PixelFormat::RGBA16> {
    using source_type = ushort4;
    static ushort4 convert_dest(float4 v) noexcept { return convert_ushort4(v); }
    static rgbauf_type ToWorking(source_type source) noexcept { RT_RGBA16_TO_WORKING }
    static source_type FromWorking(rgbauf_type source) noexcept { RT_RGBA16_FROM_WORKING }
};
template <>
struct Convert<Raster::PixelFormat::RGBAUF> {
    using source_type = float4;
    static rgbauf_type ToWorking(source_type source) noexcept { RT_RGBAUF_TO_WORKING }
    static source_type FromWorking(rgbauf_type source) noexcept { RT_RGBAUF_FROM_WORKING }
};
template <>
struct Convert<Raster::PixelFormat::IA8> {
    using source_type = uchar2;
    static rgbauf_type ToWorking(source_type source) noexcept { RT_IA8_TO_WORKING }
    static source_type FromWorking(rgbauf_type source) noexcept {
        RT_IA8_FROM_WORKING_1
        RT_IA8_FROM_WORKING_2
    }
};
template <>
struct Convert<Raster::PixelFormat::IA16> {
    using source_type = ushort2;
    static rgbauf_type ToWorking(source_type source) noexcept { RT_IA16_TO_WORKING }
    static source_type FromWorking(rgbauf_type source) noexcept {
        RT_IA16_FROM_WORKING_1
        RT_IA16_FROM_WORKING_2
    }
};
template <>
struct Convert<Raster::PixelFormat::CMYKA8> {
    using source_type = cmyka8;
    static rgbauf_type ToWorking(source_type source) noexcept { RT_CMYKA8_TO_WORKING }
    static source_type FromWorking(rgbauf_type source) noexcept { RT_CMYKA8_FROM_WORKING }
};
template <>
struct Convert<Raster::PixelFormat::LabA16> {
    using source_type = ushort4;
    static rgbauf_type ToWorking(source_type source) noexcept {
        float4 working;
        Raster::ICCManager::GetInstance().DoLABA16ToRGBAFTransform(
            reinterpret_cast<unsigned char*>(&source), reinterpret_cast<unsigned char*>(&working), 1);
        return working;
    }
    static source_type FromWorking(rgbauf_type source) noexcept {
        ushort4 stored;
        Raster::ICCManager::GetInstance().DoRGBAFToLABA16Transform(
            reinterpret_cast<unsigned char*>(&source), reinterpret_cast<unsigned char*>(&stored), 1);
        return stored;
    }
};
template <>
struct Convert<Raster::PixelFormat::MaskA8> {
    using source_type = uchar;
    static uchar convert_dest(float v) noexcept { return rt_sat_uchar(v); }
    static rgbauf_type ToWorking(source_type source) noexcept { RT_MASKA8_TO_WORKING }
    static source_type FromWorking(rgbauf_type source) noexcept { RT_MASKA8_FROM_WORKING }
};
template <>
struct Convert<Raster::PixelFormat::MaskA16> {
    using source_type = ushort;
    static ushort convert_dest(float v) noexcept { return rt_sat_ushort(v); }
    static rgbauf_type ToWorking(source_type source) noexcept { RT_MASKA16_TO_WORKING }
    static source_type FromWorking(rgbauf_type source) noexcept { RT_MASKA16_FROM_WORKING }
};
template <>
struct Convert<Raster::PixelFormat::MaskAF> {
    using source_type = float;
    static rgbauf_type ToWorking(source_type source) noexcept { RT_MASKAF_TO_WORKING }
    static source_type FromWorking(rgbauf_type source) noexcept { RT_MASKAF_FROM_WORKING }
};

// The colour-only pair, for float colour (RGBAUF and scratch RGBAF pixels): no scaling, alpha forced to 1 on
// the way in and left as the caller had it on the way out.
inline rgbauf_type ColourOnlyToWorking(float4 source) noexcept {
    RT_COLOUR_ONLY_TO_WORKING
}
inline float4 ColourOnlyFromWorking(rgbauf_type source, float4 result) noexcept {
    result.x = source.x;
    result.y = source.y;
    result.z = source.z;
    return result;
}

} // namespace ConvertCode

template <Raster::PixelFormat F>
inline constexpr bool HasWorkingConversion = requires {
    ConvertCode::Convert<F>::ToWorking;
};

template <Raster::PixelFormat F>
inline Raster::KernelMath::float4 ToWorking(Raster::StoredPixel<F> p) noexcept {
    return ConvertCode::Convert<F>::ToWorking(p);
}
template <Raster::PixelFormat F>
inline Raster::StoredPixel<F> FromWorking(Raster::KernelMath::float4 p) noexcept {
    return ConvertCode::Convert<F>::FromWorking(p);
}

// n pixels to or from LabA16 through the working pixel, the Lab side a run at a time through the colour
// manager, which converts a run in vector lanes: the bits of ToWorking and FromWorking one pixel at a time.
template <Raster::PixelFormat Source, Raster::PixelFormat Dest>
void ConvertLabSpan(const Raster::StoredPixel<Source>* in, Raster::StoredPixel<Dest>* out, int n) noexcept {
    constexpr int Run = Raster::SpanLength;
    Raster::KernelMath::float4 working[Run];
    auto& manager = Raster::ICCManager::GetInstance();
    for (int done = 0; done < n; done += Run) {
        const int count = n - done < Run ? n - done : Run;
        if constexpr (Source == Raster::PixelFormat::LabA16) {
            manager.DoLABA16ToRGBAFTransform(
                reinterpret_cast<unsigned char*>(const_cast<Raster::StoredPixel<Source>*>(in + done)),
                reinterpret_cast<unsigned char*>(working), count);
            for (int i = 0; i < count; ++i)
                out[done + i] = FromWorking<Dest>(working[i]);
        } else {
            for (int i = 0; i < count; ++i)
                working[i] = ToWorking<Source>(in[done + i]);
            manager.DoRGBAFToLABA16Transform(reinterpret_cast<unsigned char*>(working),
                                             reinterpret_cast<unsigned char*>(out + done), count);
        }
    }
}

// CMYKA8 pixels straight to LabA16, one 32-pixel span at a time: the CMYK arithmetic of ToWorking, alpha by
// the reciprocal of 255, Lab alpha scaled with 0.5 added and truncated, colour through the colour manager.
// Interleaved spans hold 5-byte pixels; planar ones a plane of 32 components per channel.
void ConvertCMYKA8ToLabA16(const Raster::InterleavedPixelSpan<Raster::PixelFormat::CMYKA8>& in,
                           Raster::InterleavedPixelSpan<Raster::PixelFormat::LabA16>& out) noexcept;
void ConvertCMYKA8ToLabA16(const Raster::PlanarPixelSpan<Raster::PixelFormat::CMYKA8>& in,
                           Raster::PlanarPixelSpan<Raster::PixelFormat::LabA16>& out) noexcept;
// The same for n pixels (n at most 32) between plain arrays.
void ConvertCMYKA8ToLabA16(const Raster::KernelMath::cmyka8* in, Raster::KernelMath::ushort4* out,
                           int n) noexcept;

} // namespace RasterTools

// Every other pair goes through the working pixel.
template <Raster::PixelFormat Source, Raster::PixelFormat Dest>
requires(Source != Dest) struct Raster::PixelConversion<Source, Dest> {
    static constexpr bool IsIdentity = false;
    static StoredPixel<Dest> Convert(StoredPixel<Source> p) noexcept {
        return RasterTools::FromWorking<Dest>(RasterTools::ToWorking<Source>(p));
    }
    static void ConvertSpan(const StoredPixel<Source>* in, StoredPixel<Dest>* out,
                            int n) noexcept requires RasterTools::PlanarConvert::HasPlanarPair<Source, Dest> {
        RasterTools::PlanarConvert::ConvertSpan<Source, Dest>(in, out, n);
    }
    static void ConvertSpan(const StoredPixel<Source>* in, StoredPixel<Dest>* out, int n) noexcept
        requires(Source == PixelFormat::LabA16 || Dest == PixelFormat::LabA16) {
        RasterTools::ConvertLabSpan<Source, Dest>(in, out, n);
    }
};

template <>
struct Raster::PixelConversion<Raster::PixelFormat::CMYKA8, Raster::PixelFormat::LabA16> {
    static constexpr bool IsIdentity = false;
    static StoredPixel<PixelFormat::LabA16> Convert(StoredPixel<PixelFormat::CMYKA8> p) noexcept {
        StoredPixel<PixelFormat::LabA16> out;
        RasterTools::ConvertCMYKA8ToLabA16(&p, &out, 1);
        return out;
    }
    static void ConvertSpan(const StoredPixel<PixelFormat::CMYKA8>* in, StoredPixel<PixelFormat::LabA16>* out,
                            int n) noexcept {
        RasterTools::ConvertCMYKA8ToLabA16(in, out, n);
    }
};
