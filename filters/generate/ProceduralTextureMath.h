#pragma once
// How an equation's result becomes a stored channel, written once: the processor expands it here and the
// kernel text pastes the same tokens (GetProceduralTextureMathText), so both paths store alike.
//
// The source is in the dialect of host/raster/KernelMath.h (OpenCL C, CUDA C++ and host C++ at once).

#include "host/raster/KernelMath.h"

#include <string>

// The sampler block: the affine from output pixel centres to texture space (x' = x*p0 + y*p1 + p2,
// y' = x*p3 + y*p4 + p5), ox, oy, w, h, then the inputs (one float each, three for a vector), then the
// opacity in the last slot.
#define RT_PROCEDURAL_INPUT_SLOTS 192
#define RT_PROCEDURAL_FIRST_INPUT 10
#define RT_PROCEDURAL_OPACITY_INDEX (RT_PROCEDURAL_FIRST_INPUT + RT_PROCEDURAL_INPUT_SLOTS)
#define RT_PROCEDURAL_BLOCK_FLOATS (RT_PROCEDURAL_OPACITY_INDEX + 1)

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
    }

namespace RasterTools::ProceduralTextureMath {

using namespace Raster::KernelMath;
RT_PROCEDURAL_TEXTURE_SOURCE

inline constexpr int FirstInputSlot = RT_PROCEDURAL_FIRST_INPUT;
inline constexpr int InputSlots = RT_PROCEDURAL_INPUT_SLOTS;
inline constexpr int OpacityIndex = RT_PROCEDURAL_OPACITY_INDEX;
inline constexpr int BlockFloats = RT_PROCEDURAL_BLOCK_FLOATS;

// The source above as kernel text, guarded so that it is pasted once.
std::string GetProceduralTextureMathText();

} // namespace RasterTools::ProceduralTextureMath
