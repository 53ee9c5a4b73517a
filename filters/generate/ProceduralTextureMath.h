#pragma once
// How an equation's result becomes a stored channel, written once: the processor expands it here and the
// kernel text pastes the same tokens (GetProceduralTextureMathText), so both paths store alike.
//
// The source is in the dialect of host/raster/KernelMath.h (OpenCL C, CUDA C++ and host C++ at once).

#include "host/raster/BlendModeMath.h"
#include "host/raster/KernelMath.h"

#include <string>

// The sampler block: the affine from output pixel centres to texture space (x' = x*p0 + y*p1 + p2,
// y' = x*p3 + y*p4 + p5), ox, oy, w, h, then the inputs (one float each, three for a vector), then the
// opacity and the blend mode.
#define RT_PROCEDURAL_INPUT_SLOTS 192
#define RT_PROCEDURAL_FIRST_INPUT 10
#define RT_PROCEDURAL_OPACITY_INDEX (RT_PROCEDURAL_FIRST_INPUT + RT_PROCEDURAL_INPUT_SLOTS)
#define RT_PROCEDURAL_BLEND_INDEX (RT_PROCEDURAL_OPACITY_INDEX + 1)
#define RT_PROCEDURAL_BLOCK_FLOATS (RT_PROCEDURAL_BLEND_INDEX + 1)

// An integer channel: the result scaled to the channel's range, mixed with the source value by the opacity
// (an opacity of 1 takes the result exactly), clamped, then truncated. NaN stores 0.
// A float channel keeps the result as it is; its alpha is clamped to 0..1 as the format's rule asks.
#define RT_PROCEDURAL_TEXTURE_SOURCE                                                                         \
    inline float ProceduralIntegerChannel(float value, float source, float maximum, float opacity) {         \
        float scaled = value * maximum;                                                                      \
        if (opacity != 1.0f) scaled = source + (scaled - source) * opacity;                                  \
        return rt_floor(rt_fmin(rt_fmax(scaled, 0.0f), maximum));                                            \
    }                                                                                                        \
    inline float ProceduralFloatChannel(float value, float source, float opacity, int isAlpha) {             \
        float mixed = value;                                                                                 \
        if (opacity != 1.0f) mixed = source + (value - source) * opacity;                                    \
        return isAlpha ? rt_fmin(rt_fmax(mixed, 0.0f), 1.0f) : mixed;                                        \
    }                                                                                                        \
    /* The texture's values t of the channels it writes (bit c of written for channel c) blended by the   */ \
    /* mode onto the layer's values s (normalised), before the opacity mixes the result in. The texture   */ \
    /* pixel is the layer's with the written channels replaced, clamped to 0..1 when bounded (as a stored */ \
    /* layer holds it). Alpha is replaced, never blended; the single channel of a mask is blended as a    */ \
    /* grey. CMYK blends the inks' complements (multiply darkens), and black follows the luminosity      */  \
    /* modes; Lab's separable modes blend lightness and keep the layer's a and b. Returns the channels to */ \
    /* store: a non-separable mode changes every colour channel. */                                          \
    inline uint ProceduralBlend(int mode, int colourFormat, uint written, int bounded, const float* s,       \
                                float* t) {                                                                  \
        const int colours = colourFormat == 1 ? 4 : colourFormat >= 3 ? 1 : 3;                               \
        const uint colourMask = (1u << colours) - 1u;                                                        \
        if (mode <= 0 || mode >= 16 || !(written & colourMask)) return written;                              \
        float tex[4];                                                                                        \
        for (int c = 0; c < colours; ++c) {                                                                  \
            const float v = (written & (1u << c)) ? t[c] : s[c];                                             \
            tex[c] = bounded ? rt_fmin(rt_fmax(v, 0.0f), 1.0f) : v;                                          \
        }                                                                                                    \
        if (mode < 12) {                                                                                     \
            for (int c = 0; c < colours; ++c) {                                                              \
                if (!(written & (1u << c))) continue;                                                        \
                if (colourFormat == 1)                                                                       \
                    t[c] = 1.0f - rt_blend_separable(mode, 1.0f - s[c], 1.0f - tex[c]);                      \
                else if (colourFormat == 2 && c > 0)                                                         \
                    t[c] = s[c];                                                                             \
                else                                                                                         \
                    t[c] = rt_blend_separable(mode, s[c], tex[c]);                                           \
            }                                                                                                \
            return written;                                                                                  \
        }                                                                                                    \
        if (colours == 1) {                                                                                  \
            t[0] = mode == 15 ? tex[0] : s[0];                                                               \
            return written;                                                                                  \
        }                                                                                                    \
        if (colourFormat == 2) {                                                                             \
            /* Lightness from one, chroma (a, b about the neutral middle) from the other or mixed. */        \
            const float middle = 32768.0f / 65535.0f;                                                        \
            const float la = s[1] - middle, lb = s[2] - middle;                                              \
            const float ta = tex[1] - middle, tb = tex[2] - middle;                                          \
            const float lc = rt_sqrt(la * la + lb * lb), tc = rt_sqrt(ta * ta + tb * tb);                    \
            t[0] = mode == 15 ? tex[0] : s[0];                                                               \
            if (mode == 15) {                                                                                \
                t[1] = s[1];                                                                                 \
                t[2] = s[2];                                                                                 \
            } else if (mode == 14) {                                                                         \
                t[1] = tex[1];                                                                               \
                t[2] = tex[2];                                                                               \
            } else if (mode == 12) {                                                                         \
                t[1] = tc > 0.0f ? middle + ta * lc / tc : middle;                                           \
                t[2] = tc > 0.0f ? middle + tb * lc / tc : middle;                                           \
            } else {                                                                                         \
                t[1] = lc > 0.0f ? middle + la * tc / lc : middle;                                           \
                t[2] = lc > 0.0f ? middle + lb * tc / lc : middle;                                           \
            }                                                                                                \
            return written | colourMask;                                                                     \
        }                                                                                                    \
        if (colourFormat == 1) {                                                                             \
            const float4 r =                                                                                 \
                rt_blend_non_separable(mode, make_float4(1.0f - s[0], 1.0f - s[1], 1.0f - s[2], 0.0f),       \
                                       make_float4(1.0f - tex[0], 1.0f - tex[1], 1.0f - tex[2], 0.0f));      \
            t[0] = 1.0f - r.x;                                                                               \
            t[1] = 1.0f - r.y;                                                                               \
            t[2] = 1.0f - r.z;                                                                               \
            t[3] = mode == 15 ? tex[3] : s[3];                                                               \
            return written | colourMask;                                                                     \
        }                                                                                                    \
        const float4 r = rt_blend_non_separable(mode, make_float4(s[0], s[1], s[2], 0.0f),                   \
                                                make_float4(tex[0], tex[1], tex[2], 0.0f));                  \
        t[0] = r.x;                                                                                          \
        t[1] = r.y;                                                                                          \
        t[2] = r.z;                                                                                          \
        return written | colourMask;                                                                         \
    }

namespace RasterTools::ProceduralTextureMath {

using namespace Raster::KernelMath;
RT_PROCEDURAL_TEXTURE_SOURCE

inline constexpr int FirstInputSlot = RT_PROCEDURAL_FIRST_INPUT;
inline constexpr int InputSlots = RT_PROCEDURAL_INPUT_SLOTS;
inline constexpr int OpacityIndex = RT_PROCEDURAL_OPACITY_INDEX;
inline constexpr int BlendIndex = RT_PROCEDURAL_BLEND_INDEX;
inline constexpr int BlockFloats = RT_PROCEDURAL_BLOCK_FLOATS;

// The source above as kernel text, guarded so that it is pasted once.
std::string GetProceduralTextureMathText();

} // namespace RasterTools::ProceduralTextureMath
