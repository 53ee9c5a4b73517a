#pragma once
// The blend modes' formulas (B(backdrop, source) on channel values in 0..1), written once in the dialect of
// host/raster/KernelMath.h: the processor expands them here and kernel texts paste the same tokens
// (GetBlendModeMathText), so that both paths blend alike, bit for bit.
//
// The modes are numbered as the host names them (Kernel::ReflectedBlendMode::GetBlendModeNames): 0 Normal,
// 1 Multiply, 2 Screen, 3 Overlay, 4 Darken, 5 Lighten, 6 Colour Dodge, 7 Colour Burn, 8 Hard Light,
// 9 Soft Light, 10 Difference, 11 Exclusion (separable: channel by channel), 12 Hue, 13 Saturation,
// 14 Colour, 15 Luminosity (non-separable: on the red, green, blue triple, luminosity 0.3 R + 0.59 G + 0.11
// B).

#include "host/raster/KernelMath.h"

#include <cmath>

#define RT_BLEND_MODE_SOURCE                                                                                 \
    inline float rt_blend_screen(float b, float s) {                                                         \
        return b + s - b * s;                                                                                \
    }                                                                                                        \
    inline float rt_blend_hard_light(float b, float s) {                                                     \
        return s <= 0.5f ? b * (2.0f * s) : rt_blend_screen(b, 2.0f * s - 1.0f);                             \
    }                                                                                                        \
    inline float rt_blend_soft_light(float b, float s) {                                                     \
        if (s <= 0.5f) return b - (1.0f - 2.0f * s) * b * (1.0f - b);                                        \
        const float d = b <= 0.25f ? ((16.0f * b - 12.0f) * b + 4.0f) * b : rt_sqrt(b);                      \
        return b + (2.0f * s - 1.0f) * (d - b);                                                              \
    }                                                                                                        \
    /* Modes 0 to 11 (any other gives the source: Normal). */                                                \
    inline float rt_blend_separable(int mode, float b, float s) {                                            \
        switch (mode) {                                                                                      \
        case 1:                                                                                              \
            return b * s;                                                                                    \
        case 2:                                                                                              \
            return rt_blend_screen(b, s);                                                                    \
        case 3:                                                                                              \
            return rt_blend_hard_light(s, b);                                                                \
        case 4:                                                                                              \
            return rt_fmin(b, s);                                                                            \
        case 5:                                                                                              \
            return rt_fmax(b, s);                                                                            \
        case 6:                                                                                              \
            return b == 0.0f ? 0.0f : s >= 1.0f ? 1.0f : rt_fmin(1.0f, b / (1.0f - s));                      \
        case 7:                                                                                              \
            return b == 1.0f ? 1.0f : s <= 0.0f ? 0.0f : 1.0f - rt_fmin(1.0f, (1.0f - b) / s);               \
        case 8:                                                                                              \
            return rt_blend_hard_light(b, s);                                                                \
        case 9:                                                                                              \
            return rt_blend_soft_light(b, s);                                                                \
        case 10:                                                                                             \
            return rt_fabs(b - s);                                                                           \
        case 11:                                                                                             \
            return b + s - 2.0f * b * s;                                                                     \
        default:                                                                                             \
            return s;                                                                                        \
        }                                                                                                    \
    }                                                                                                        \
    inline float rt_blend_lum(float4 c) {                                                                    \
        return 0.3f * c.x + 0.59f * c.y + 0.11f * c.z;                                                       \
    }                                                                                                        \
    inline float4 rt_blend_clip_colour(float4 c) {                                                           \
        const float l = rt_blend_lum(c);                                                                     \
        const float n = rt_fmin(rt_fmin(c.x, c.y), c.z);                                                     \
        const float x = rt_fmax(rt_fmax(c.x, c.y), c.z);                                                     \
        if (n < 0.0f && l - n > 0.0f)                                                                        \
            c = make_float4(l + (c.x - l) * l / (l - n), l + (c.y - l) * l / (l - n),                        \
                            l + (c.z - l) * l / (l - n), c.w);                                               \
        if (x > 1.0f && x - l > 0.0f)                                                                        \
            c = make_float4(l + (c.x - l) * (1.0f - l) / (x - l), l + (c.y - l) * (1.0f - l) / (x - l),      \
                            l + (c.z - l) * (1.0f - l) / (x - l), c.w);                                      \
        return c;                                                                                            \
    }                                                                                                        \
    inline float4 rt_blend_set_lum(float4 c, float l) {                                                      \
        const float d = l - rt_blend_lum(c);                                                                 \
        return rt_blend_clip_colour(make_float4(c.x + d, c.y + d, c.z + d, c.w));                            \
    }                                                                                                        \
    inline float rt_blend_sat(float4 c) {                                                                    \
        return rt_fmax(rt_fmax(c.x, c.y), c.z) - rt_fmin(rt_fmin(c.x, c.y), c.z);                            \
    }                                                                                                        \
    /* The largest component becomes s, the smallest 0, the middle one keeps its place between them. */      \
    inline float rt_blend_set_sat_1(float v, float n, float x, float s) {                                    \
        return x <= n ? 0.0f : v == x ? s : v == n ? 0.0f : (v - n) * s / (x - n);                           \
    }                                                                                                        \
    inline float4 rt_blend_set_sat(float4 c, float s) {                                                      \
        const float n = rt_fmin(rt_fmin(c.x, c.y), c.z);                                                     \
        const float x = rt_fmax(rt_fmax(c.x, c.y), c.z);                                                     \
        return make_float4(rt_blend_set_sat_1(c.x, n, x, s), rt_blend_set_sat_1(c.y, n, x, s),               \
                           rt_blend_set_sat_1(c.z, n, x, s), c.w);                                           \
    }                                                                                                        \
    /* Modes 12 to 15 on (r, g, b) in x, y, z (any other gives the source); w is the backdrop's. */          \
    inline float4 rt_blend_non_separable(int mode, float4 b, float4 s) {                                     \
        switch (mode) {                                                                                      \
        case 12:                                                                                             \
            return rt_blend_set_lum(rt_blend_set_sat(s, rt_blend_sat(b)), rt_blend_lum(b));                  \
        case 13:                                                                                             \
            return rt_blend_set_lum(rt_blend_set_sat(b, rt_blend_sat(s)), rt_blend_lum(b));                  \
        case 14:                                                                                             \
            return rt_blend_set_lum(make_float4(s.x, s.y, s.z, b.w), rt_blend_lum(b));                       \
        case 15:                                                                                             \
            return rt_blend_set_lum(b, rt_blend_lum(s));                                                     \
        default:                                                                                             \
            return make_float4(s.x, s.y, s.z, b.w);                                                          \
        }                                                                                                    \
    }

namespace Raster {

namespace KernelMath {

// Square roots are correctly rounded on both paths (the device is asked for it where it offers it).
inline float rt_sqrt(float v) {
    return std::sqrt(v);
}

#define RT_OVERLOAD
RT_BLEND_MODE_SOURCE
#undef RT_OVERLOAD

} // namespace KernelMath

inline constexpr int BlendModeCount = 16;
inline constexpr int FirstNonSeparableBlendMode = 12;

// The source above as kernel text for the language (0 or 1), guarded so that it is pasted once; it needs the
// shared numerics (GetKernelMathText) before it. Null for any other language.
const char* GetBlendModeMathText(HardwareKernelLanguage language);

} // namespace Raster
