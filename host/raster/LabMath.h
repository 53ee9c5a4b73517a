#pragma once
// The built-in Lab conversions (working sRGB <-> CIE L*a*b* D50), written once: the processor expands
// RT_LAB_SOURCE here and the LabA16 traits paste the very same tokens into both kernel languages
// (GetLabConversionFragment), so that every path computes the same floats.
//
// The source is single-precision arithmetic only: additions, subtractions and multiplications (no division,
// no fused multiply-add) and integer operations on the bits of a float. It calls none of the languages' own
// pow or cbrt, which round differently from one maths library to the next: x^p is 2^(p log2 x), log2 taken
// from the float's exponent and a polynomial on its mantissa, 2^y assembled from an exponent and a polynomial
// (log2 within 4 units of the last place, 2^y within 1.5; x^2.4 within 2e-6 relative up to x = 64, far
// finer than a LabA16 step). IEEE single precision then makes every path agree bit for bit.
//
// The includer defines RT_LAB_FUNCTION (what starts a function), RT_LAB_AS_INT and RT_LAB_AS_FLOAT (a float's
// bits as an int and back) and RT_LAB_FLOAT4 (a float4 from four floats).
//
// Working RGB is sRGB-encoded (the sRGB primaries and D65 white, the sRGB curve continued beyond 0..1: the
// linear segment on into negative values, the power segment on above 1). Lab is relative to the ICC D50
// white; D65 is adapted to D50 with the Bradford transform, as ICC matrix/shaper profiles do. Both functions
// take and give components scaled as the LabA16 traits use them: L / 100 and (a or b + 128) * 256 / 65535.
//
// rgbauf_to_labaf: a NaN colour component counts as 0 and every colour component is limited to
// -2^20 .. 2^20 first, so infinities act as that and nothing downstream overflows; the results are
// clamped to 0..1 (what LabA16 stores), alpha too (NaN alpha to 0). labaf_to_rgbauf: alpha passes through.
//
// The constants are the closed-form values rounded to float, each checked against its derivation
// from the chromaticities and the Bradford matrix (ICCManager.h) at compile time, in LabFragments.cpp.

#include "host/raster/KernelMath.h"

#include <bit>

// log2 of a positive normal float: e + log2(m) with m in [sqrt(1/2), sqrt(2)), log2(1 + u) = u P(u) a
// degree-9 fit (error below 5e-9 before rounding). exp2 for y in [-125, 127]: 2^n times a degree-6 fit of
// 2^f on f = y - n in [-0.5, 0.5] (relative error below 2e-9 before rounding); y is limited to that range, so
// that no result is denormal (which some devices flush to zero). The polynomials are evaluated in pairs of
// terms and powers of the argument (Estrin's scheme) rather than by Horner's rule: the chain of dependent
// operations is a third as long, which is what bounds a pixel's time on the processor.
#define RT_LAB_SOURCE                                                                                        \
    RT_LAB_FUNCTION float rt_lab_log2(float x) {                                                             \
        const int bits = RT_LAB_AS_INT(x);                                                                   \
        const int mantissa = bits & 0x007fffff;                                                              \
        const int high = mantissa > 0x003504f3;                                                              \
        const float m = RT_LAB_AS_FLOAT(mantissa | (high ? 0x3f000000 : 0x3f800000));                        \
        const float e = (float)(((bits >> 23) & 255) - 127 + high);                                          \
        const float u = m - 1.0f;                                                                            \
        const float u2 = u * u;                                                                              \
        const float u4 = u2 * u2;                                                                            \
        const float low = (1.442695f + u * -0.7213473f) + (0.48089853f + u * -0.36069655f) * u2;             \
        const float middle = (0.28855255f + u * -0.23960812f) + (0.20485765f + u * -0.19138838f) * u2;       \
        const float p = (low + middle * u4) + (0.18476033f + u * -0.10749789f) * (u4 * u4);                  \
        return e + u * p;                                                                                    \
    }                                                                                                        \
    RT_LAB_FUNCTION float rt_lab_exp2(float y) {                                                             \
        const float c = !(y >= -125.0f) ? -125.0f : y > 127.0f ? 127.0f : y;                                 \
        const int n = (int)(c + 125.5f) - 125;                                                               \
        const float f = c - (float)n;                                                                        \
        const float f2 = f * f;                                                                              \
        const float low = (1.0f + f * 0.6931472f) + (0.2402265f + f * 0.05550327f) * f2;                     \
        const float high = (0.009618057f + f * 0.0013400428f) + 0.00015461445f * f2;                         \
        const float p = low + high * (f2 * f2);                                                              \
        return p * RT_LAB_AS_FLOAT((n + 127) << 23);                                                         \
    }                                                                                                        \
    /* x^p for x at least 0.003 and p in 0.33 .. 2.4: the exponent stays well inside exp2's range. */        \
    RT_LAB_FUNCTION float rt_lab_pow(float x, float p) {                                                     \
        return rt_lab_exp2(p * rt_lab_log2(x));                                                              \
    }                                                                                                        \
    RT_LAB_FUNCTION float rt_lab_clamp01(float v) {                                                          \
        return v > 0.0f ? (v < 1.0f ? v : 1.0f) : 0.0f;                                                      \
    }                                                                                                        \
    RT_LAB_FUNCTION float rt_lab_finite(float v) {                                                           \
        return v != v ? 0.0f : v < -1048576.0f ? -1048576.0f : v > 1048576.0f ? 1048576.0f : v;              \
    }                                                                                                        \
    /* sRGB-encoded to linear: ((v + 0.055) / 1.055)^2.4 from 0.04045 up, v / 12.92 below. */                \
    RT_LAB_FUNCTION float rt_lab_decode(float v) {                                                           \
        return v >= 0.04045f ? rt_lab_pow(v * 0.9478673f + 0.0521327f, 2.4f) : v * 0.07739938f;              \
    }                                                                                                        \
    /* Linear to sRGB-encoded: 1.055 v^(1/2.4) - 0.055 from 0.04045 / 12.92 up, 12.92 v below. */            \
    RT_LAB_FUNCTION float rt_lab_encode(float v) {                                                           \
        return v >= 0.003130805f ? rt_lab_pow(v, 0.41666666f) * 1.055f - 0.055f : v * 12.92f;                \
    }                                                                                                        \
    /* CIE f(t): the cube root above (6/29)^3, t (29/6)^2 / 3 + 4/29 below (negative t too). */              \
    RT_LAB_FUNCTION float rt_lab_f(float t) {                                                                \
        return t > 0.008856452f ? rt_lab_pow(t, 0.33333334f) : t * 7.787037f + 0.13793103f;                  \
    }                                                                                                        \
    RT_LAB_FUNCTION float rt_lab_finv(float t) {                                                             \
        return t > 0.20689656f ? t * t * t : (t - 0.13793103f) * 0.12841855f;                                \
    }                                                                                                        \
    /* Working RGB to L / 100, (a + 128) 256 / 65535, (b + 128) 256 / 65535, alpha. */                       \
    RT_LAB_FUNCTION float4 rgbauf_to_labaf(float4 rgb) {                                                     \
        const float r = rt_lab_decode(rt_lab_finite(rgb.x));                                                 \
        const float g = rt_lab_decode(rt_lab_finite(rgb.y));                                                 \
        const float b = rt_lab_decode(rt_lab_finite(rgb.z));                                                 \
        const float fx = rt_lab_f(0.45223114f * r + 0.39941186f * g + 0.14835702f * b);                      \
        const float fy = rt_lab_f(0.22248454f * r + 0.71690506f * g + 0.06061038f * b);                      \
        const float fz = rt_lab_f(0.016875f * r + 0.11767152f * g + 0.8654535f * b);                         \
        return RT_LAB_FLOAT4(rt_lab_clamp01(fy * 1.16f - 0.16f),                                             \
                             rt_lab_clamp01((fx - fy) * 1.9531548f + 0.5000076f),                            \
                             rt_lab_clamp01((fy - fz) * 0.7812619f + 0.5000076f), rt_lab_clamp01(rgb.w));    \
    }                                                                                                        \
    /* The reverse, unbounded. The neutral literal is the float nearest 32768 / 65535, as the stored value   \
       divided by 65535 is, so a neutral a or b gives exactly no chroma. */                                  \
    RT_LAB_FUNCTION float4 labaf_to_rgbauf(float4 lab) {                                                     \
        const float fy = lab.x * 0.86206895f + 0.13793103f;                                                  \
        const float x = rt_lab_finv(fy + (lab.y - 0.5000076f) * 0.5119922f);                                 \
        const float y = rt_lab_finv(fy);                                                                     \
        const float z = rt_lab_finv(fy - (lab.z - 0.5000076f) * 1.2799804f);                                 \
        return RT_LAB_FLOAT4(rt_lab_encode(3.0219824f * x - 1.617209f * y - 0.40477353f * z),                \
                             rt_lab_encode(-0.9437093f * x + 1.9161301f * y + 0.02757921f * z),              \
                             rt_lab_encode(0.06938762f * x - 0.22899388f * y + 1.1596062f * z), lab.w);      \
    }

namespace Raster::KernelMath {

#define RT_LAB_FUNCTION [[gnu::always_inline]] inline
#define RT_LAB_AS_INT(x) std::bit_cast<int>(x)
#define RT_LAB_AS_FLOAT(i) std::bit_cast<float>(i)
#define RT_LAB_FLOAT4 make_float4
RT_LAB_SOURCE
#undef RT_LAB_FLOAT4
#undef RT_LAB_AS_FLOAT
#undef RT_LAB_AS_INT
#undef RT_LAB_FUNCTION

} // namespace Raster::KernelMath

namespace Raster::LabMath {

// The source as kernel text (one line; the RT_LAB_ macros left for the including text to define).
const char* GetSourceText();

} // namespace Raster::LabMath
