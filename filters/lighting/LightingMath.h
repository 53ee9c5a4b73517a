#pragma once
// The per-pixel lighting model, written once: processor code expands it here and the Sample stage's kernel
// text pastes the very same tokens (LightingMath::GetSourceText), so both paths light alike.
//
// The source is in the dialect of host/raster/KernelMath.h (OpenCL C, CUDA C++ and host C++ at once), scalar
// arithmetic only so that every operation happens in the same order on both paths. RT_LIGHTING_FUNCTION
// starts every function and RT_LIGHTING_SQRT names the language's single-precision square root (correctly
// rounded on the processor and on the devices the tests use); params_address_space is the kernels' address
// space of the parameter array. The specular power is taken by repeated squaring of a whole exponent, not by
// the languages' pow, which rounds differently from one library to the next.

#include "host/raster/KernelMath.h"

#include <cmath>

// The sampler block's floats by name (a light's floats follow from LightingFirstLight, LightingLightFloats
// each). The processor's enum and the kernel text's constants are both made from this list.
#define RT_LIGHTING_INDICES(X)                                                                               \
    X(LightingAmbientColour, 0)                                                                              \
    X(LightingAmbientAmount, 4)                                                                              \
    X(LightingSpecularColour, 5)                                                                             \
    X(LightingSpecularAmount, 9)                                                                             \
    X(LightingSurfaceAffine, 10)                                                                             \
    X(LightingBumpAffine, 16)                                                                                \
    X(LightingDiffuseAmount, 22)                                                                             \
    X(LightingNormalZ, 23)                                                                                   \
    X(LightingHeightSense, 24)                                                                               \
    X(LightingLightCount, 25)                                                                                \
    X(LightingFirstLight, 26)                                                                                \
    X(LightingLightFloats, 15)                                                                               \
    X(LightingLightType, 0)                                                                                  \
    X(LightingLightColour, 1)                                                                                \
    X(LightingLightPosition, 5)                                                                              \
    X(LightingLightDirection, 8)                                                                             \
    X(LightingInnerThreshold, 11)                                                                            \
    X(LightingOuterThreshold, 12)                                                                            \
    X(LightingLightExponent, 13)                                                                             \
    X(LightingFlatSpecular, 14)

// LightingSurface: the surface position of a pixel location (the first affine, x' = a x + b y + c,
// y' = d x + e y + f). LightingBumpAt: the height-map position of a surface position (the second affine)
// moved by (dx, dy), each coordinate truncated toward zero.
// LightingNormal: from the heights above, below, left and right of the height-map position, the unit normal
// (x, y, z in a float4, w unused); with the normal z of 0 (no relief) the flat (0, 0, 1).
// LightingPointTerms (spot and point lights; cone: the spot's) and LightingDirectionalTerms: one light's
// diffuse term ta, the base rz of its specular power (0 where it has none) and the factor on that power (the
// spot's attenuation); a flat surface under a directional light takes the light's flat specular term
// outright (fixed). LightingSpecularTerm: the specular term from those. Every value is chosen by selects, so
// that a span can take them for many pixels at once.
// LightingShade: every light's diffuse and specular terms accumulated in light order (unknown types skipped),
// then LightingFinish: scaled by the amounts, with the ambient colour added to the diffuse; colour components
// r, g, b, a in float4s.
// LightingLit: pixel × diffuse + specular in the colour channels, alpha kept.
// LightingLuminance: the height a working pixel gives when the layer is its own height map (Rec. 709
// weights of the colour, alpha ignored).
#define RT_LIGHTING_SOURCE                                                                                   \
    RT_LIGHTING_FUNCTION float2 LightingSurface(int2 location, params_address_space float* p) {              \
        const float x = (float)location.x;                                                                   \
        const float y = (float)location.y;                                                                   \
        params_address_space float* a = p + LightingSurfaceAffine;                                           \
        return float2_literal(a[0] * x + a[1] * y + a[2], a[3] * x + a[4] * y + a[5]);                       \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION int2 LightingBumpAt(float2 v, float dx, float dy, params_address_space float* p) {  \
        params_address_space float* a = p + LightingBumpAffine;                                              \
        const float hx = a[0] * v.x + a[1] * v.y + a[2];                                                     \
        const float hy = a[3] * v.x + a[4] * v.y + a[5];                                                     \
        return make_int2(rt_sat_int(hx + dx), rt_sat_int(hy + dy));                                          \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION float4 LightingNormal(float above, float below, float left, float right,            \
                                               params_address_space float* p) {                              \
        const float nz = p[LightingNormalZ];                                                                 \
        const float sign = p[LightingHeightSense] == 1.0f ? -1.0f : 1.0f; /* exact: a - b is -(b - a) */     \
        const float nx = (right - left) * sign;                                                              \
        const float ny = (below - above) * sign;                                                             \
        const float scale = 1.0f / RT_LIGHTING_SQRT(nx * nx + ny * ny + nz * nz);                            \
        const int flat = nz == 0.0f;                                                                         \
        return make_float4(flat ? 0.0f : nx * scale, flat ? 0.0f : ny * scale, flat ? 1.0f : nz * scale,     \
                           0.0f);                                                                            \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION float LightingPower(float x, float exponent) {                                      \
        int e = rt_sat_int(exponent);                                                                        \
        float result = 1.0f;                                                                                 \
        float base = x;                                                                                      \
        while (e > 0) {                                                                                      \
            if (e & 1) result = result * base;                                                               \
            base = base * base;                                                                              \
            e = e >> 1;                                                                                      \
        }                                                                                                    \
        return result;                                                                                       \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION float LightingPointTerms(float2 v, float4 n, params_address_space float* light,     \
                                                  int cone, float* ta, float* rz) {                          \
        params_address_space float* position = light + LightingLightPosition;                                \
        params_address_space float* direction = light + LightingLightDirection;                              \
        const float x = position[0] - v.x;                                                                   \
        const float y = position[1] - v.y;                                                                   \
        const float z = -position[2];                                                                        \
        const float length2 = x * x + y * y + z * z;                                                         \
        const float scale = 1.0f / RT_LIGHTING_SQRT(length2);                                                \
        const float lx = x * scale;                                                                          \
        const float ly = y * scale;                                                                          \
        const float lz = z * scale;                                                                          \
        const float dot = -(n.x * lx + n.y * ly + n.z * lz);                                                 \
        const float dot2 = direction[0] * lx + direction[1] * ly + direction[2] * lz;                        \
        const float inner = light[LightingInnerThreshold];                                                   \
        const float outer = light[LightingOuterThreshold];                                                   \
        const float fade = (dot2 - outer) / (inner - outer);                                                 \
        const float ramp = dot2 > inner ? 1.0f : dot2 > outer ? fade : 0.0f;                                 \
        const float attenuation = ((length2 > 0.0f) & (dot > 0.0f)) ? (cone ? ramp : 1.0f) : 0.0f;           \
        const int lit = attenuation > 0.0f;                                                                  \
        *ta = lit ? dot * attenuation : 0.0f;                                                                \
        *rz = lit ? 2.0f * n.z * dot + lz : 0.0f;                                                            \
        return attenuation;                                                                                  \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION float LightingDirectionalTerms(float4 n, params_address_space float* light,         \
                                                        float* ta, float* rz, float* fixed) {                \
        params_address_space float* direction = light + LightingLightDirection;                              \
        const int flat = (n.x == 0.0f) & (n.y == 0.0f);                                                      \
        const float dot = -(n.x * direction[0] + n.y * direction[1] + n.z * direction[2]);                   \
        const int lit = (!flat) & (dot > 0.0f);                                                              \
        *ta = flat ? -direction[2] : lit ? dot : 0.0f;                                                       \
        *rz = lit ? 2.0f * n.z * dot + direction[2] : 0.0f;                                                  \
        *fixed = flat ? light[LightingFlatSpecular] : 0.0f;                                                  \
        return 1.0f;                                                                                         \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION float LightingSpecularTerm(float rz, float power, float factor, float fixed) {      \
        return rz > 0.0f ? power * factor : fixed;                                                           \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION void LightingFinish(float dr, float dg, float db, float da, float sr, float sg,     \
                                             float sb, float sa, params_address_space float* p, float4* lit, \
                                             float4* shine) {                                                \
        const float kd = p[LightingDiffuseAmount];                                                           \
        params_address_space float* ac = p + LightingAmbientColour;                                          \
        const float ka = p[LightingAmbientAmount];                                                           \
        params_address_space float* sc = p + LightingSpecularColour;                                         \
        const float ks = p[LightingSpecularAmount];                                                          \
        *lit = make_float4(dr * kd + ac[0] * ka, dg * kd + ac[1] * ka, db * kd + ac[2] * ka,                 \
                           da * kd + ac[3] * ka);                                                            \
        *shine = make_float4(sr * (sc[0] * ks), sg * (sc[1] * ks), sb * (sc[2] * ks), sa * (sc[3] * ks));    \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION void LightingShade(float2 v, float4 n, params_address_space float* p, float4* lit,  \
                                            float4* shine) {                                                 \
        float dr = 0.0f, dg = 0.0f, db = 0.0f, da = 0.0f;                                                    \
        float sr = 0.0f, sg = 0.0f, sb = 0.0f, sa = 0.0f;                                                    \
        const int count = rt_sat_int(p[LightingLightCount]);                                                 \
        for (int i = 0; i < count; ++i) {                                                                    \
            params_address_space float* light = p + LightingFirstLight + LightingLightFloats * i;            \
            const float type = light[LightingLightType];                                                     \
            if (type != 0.0f && type != 1.0f && type != 2.0f) continue;                                      \
            float ta = 0.0f;                                                                                 \
            float rz = 0.0f;                                                                                 \
            float fixed = 0.0f;                                                                              \
            const float factor = type == 2.0f ? LightingDirectionalTerms(n, light, &ta, &rz, &fixed)         \
                                              : LightingPointTerms(v, n, light, type == 0.0f, &ta, &rz);     \
            const float tb =                                                                                 \
                LightingSpecularTerm(rz, LightingPower(rz, light[LightingLightExponent]), factor, fixed);    \
            params_address_space float* c = light + LightingLightColour;                                     \
            dr = dr + c[0] * ta;                                                                             \
            dg = dg + c[1] * ta;                                                                             \
            db = db + c[2] * ta;                                                                             \
            da = da + c[3] * ta;                                                                             \
            sr = sr + c[0] * tb;                                                                             \
            sg = sg + c[1] * tb;                                                                             \
            sb = sb + c[2] * tb;                                                                             \
            sa = sa + c[3] * tb;                                                                             \
        }                                                                                                    \
        LightingFinish(dr, dg, db, da, sr, sg, sb, sa, p, lit, shine);                                       \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION float4 LightingLit(float4 pixel, float4 lit, float4 shine) {                        \
        return make_float4(pixel.x * lit.x + shine.x, pixel.y * lit.y + shine.y, pixel.z * lit.z + shine.z,  \
                           pixel.w);                                                                         \
    }                                                                                                        \
    RT_LIGHTING_FUNCTION float LightingLuminance(float4 pixel) {                                             \
        return pixel.x * 0.2126f + pixel.y * 0.7152f + pixel.z * 0.0722f;                                    \
    }

namespace RasterTools::LightingMath {

using namespace Raster::KernelMath;

// The sampler block's floats, by index.
enum LightingIndex : int {
#define RT_LIGHTING_ENUMERATOR(name, value) name = value,
    RT_LIGHTING_INDICES(RT_LIGHTING_ENUMERATOR)
#undef RT_LIGHTING_ENUMERATOR
};

#define RT_LIGHTING_FUNCTION inline
#define RT_LIGHTING_SQRT std::sqrt
#define params_address_space const
RT_LIGHTING_SOURCE
#undef params_address_space
#undef RT_LIGHTING_SQRT
#undef RT_LIGHTING_FUNCTION

// The most lights a render takes: their floats and the rest of the block stay well inside a kernel's
// parameter array.
inline constexpr int MaxLights = 16;
inline constexpr int BlockFloats = LightingFirstLight + LightingLightFloats * MaxLights;

// The source as kernel text, after an enum of the block's names (RT_LIGHTING_FUNCTION, RT_LIGHTING_SQRT and
// params_address_space left for the including text to define).
const char* GetSourceText();

} // namespace RasterTools::LightingMath
