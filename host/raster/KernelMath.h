#pragma once
// The kernel languages' vector types, conversions and shared numerics, compiled into processor code and
// pasted into kernel text from the same source, so that both execution paths round and clamp alike.
//
// The shared parts are written once, as macro bodies, in a small dialect that is at the same time OpenCL C,
// CUDA C++ and host C++: C syntax, vector types with .x/.s0 fields, make_<type>(...) constructors,
// convert_<type>(...) conversions (always saturating, rounding toward zero), rt_* scalar helpers, and
// RT_OVERLOAD on every function with overloads (OpenCL C needs the attribute). Processor code expands them
// here, in namespace Raster::KernelMath; GetKernelMathText() stringifies the very same tokens for kernels.

#include <cmath>
#include <cstdint>

// All languages, first: the CMYKA8 pixel and saturating float-to-integer conversions (NaN gives 0: fmax
// returns the other argument).
#define RASTER_KERNEL_SCALAR_SOURCE                                                                          \
    typedef struct {                                                                                         \
        uchar cmyk[4];                                                                                       \
        uchar a;                                                                                             \
    } cmyka8;                                                                                                \
    inline uchar rt_sat_uchar(float v) {                                                                     \
        return (uchar)(int)rt_fmin(rt_fmax(v, 0.0f), 255.0f);                                                \
    }                                                                                                        \
    inline ushort rt_sat_ushort(float v) {                                                                   \
        return (ushort)(int)rt_fmin(rt_fmax(v, 0.0f), 65535.0f);                                             \
    }                                                                                                        \
    inline int rt_sat_int(float v) {                                                                         \
        return v != v                ? 0                                                                     \
               : v >= 2147483647.0f  ? 2147483647                                                            \
               : v <= -2147483648.0f ? (-2147483647 - 1)                                                     \
                                     : (int)v;                                                               \
    }                                                                                                        \
    inline int rt_clampi(int v, int lo, int hi) {                                                            \
        return v < lo ? lo : v > hi ? hi : v;                                                                \
    }                                                                                                        \
    inline int rt_wrapi(int v, int n) {                                                                      \
        return (v % n + n) % n;                                                                              \
    }                                                                                                        \
    inline int rt_mirrori(int v, int n) {                                                                    \
        const int m = rt_wrapi(v, 2 * n);                                                                    \
        return m < n ? m : 2 * n - 1 - m;                                                                    \
    }                                                                                                        \
    inline cmyka8 rt_make_cmyka8(uchar c, uchar m, uchar y, uchar k, uchar a) {                              \
        cmyka8 p;                                                                                            \
        p.cmyk[0] = c;                                                                                       \
        p.cmyk[1] = m;                                                                                       \
        p.cmyk[2] = y;                                                                                       \
        p.cmyk[3] = k;                                                                                       \
        p.a = a;                                                                                             \
        return p;                                                                                            \
    }

// Both kernel languages and the processor, after the above: literals, accumulators and their rules.
// An accumulator is a float vector in the stored scale (0..255 for 8-bit components): colour sums, blends
// and premultiplied samples are computed in it.
#define RASTER_KERNEL_SHARED_SOURCE                                                                          \
    typedef float4 rgbauf_type;                                                                              \
                                                                                                             \
    inline RT_OVERLOAD float4 rgbauf_literal(float r, float g, float b, float a) {                           \
        return make_float4(r, g, b, a);                                                                      \
    }                                                                                                        \
    inline RT_OVERLOAD float2 float2_literal(float a, float b) {                                             \
        return make_float2(a, b);                                                                            \
    }                                                                                                        \
    inline RT_OVERLOAD ushort2 ushort2_literal(float a, float b) {                                           \
        return make_ushort2(rt_sat_ushort(a), rt_sat_ushort(b));                                             \
    }                                                                                                        \
    inline float4 saturate(float4 v) {                                                                       \
        return clamp(v, 0.0f, 1.0f);                                                                         \
    }                                                                                                        \
                                                                                                             \
    inline RT_OVERLOAD float4 rt_accumulate(uchar4 p) {                                                      \
        return convert_float4(p);                                                                            \
    }                                                                                                        \
    inline RT_OVERLOAD float4 rt_accumulate(ushort4 p) {                                                     \
        return convert_float4(p);                                                                            \
    }                                                                                                        \
    inline RT_OVERLOAD float4 rt_accumulate(float4 p) {                                                      \
        return p;                                                                                            \
    }                                                                                                        \
    inline RT_OVERLOAD float2 rt_accumulate(uchar2 p) {                                                      \
        return convert_float2(p);                                                                            \
    }                                                                                                        \
    inline RT_OVERLOAD float2 rt_accumulate(ushort2 p) {                                                     \
        return convert_float2(p);                                                                            \
    }                                                                                                        \
    inline RT_OVERLOAD float8 rt_accumulate(cmyka8 p) {                                                      \
        return make_float8((float)p.cmyk[0], (float)p.cmyk[1], (float)p.cmyk[2], (float)p.cmyk[3],           \
                           (float)p.a, 0.0f, 0.0f, 0.0f);                                                    \
    }                                                                                                        \
    inline RT_OVERLOAD float rt_accumulate(uchar p) {                                                        \
        return (float)p;                                                                                     \
    }                                                                                                        \
    inline RT_OVERLOAD float rt_accumulate(ushort p) {                                                       \
        return (float)p;                                                                                     \
    }                                                                                                        \
    inline RT_OVERLOAD float rt_accumulate(float p) {                                                        \
        return p;                                                                                            \
    }                                                                                                        \
                                                                                                             \
    inline float rt_premultiply8(uchar c, float a) {                                                         \
        return (float)c * a / 255.0f;                                                                        \
    }                                                                                                        \
    inline float rt_premultiply16(ushort c, uint a) {                                                        \
        return a < 65535u ? (float)((uint)c * a / 65535u) : (float)c;                                        \
    }                                                                                                        \
    inline RT_OVERLOAD float4 rt_premultiplied(uchar4 p) {                                                   \
        const float a = (float)p.w;                                                                          \
        return make_float4(rt_premultiply8(p.x, a), rt_premultiply8(p.y, a), rt_premultiply8(p.z, a), a);    \
    }                                                                                                        \
    inline RT_OVERLOAD float4 rt_premultiplied(ushort4 p) {                                                  \
        const uint a = p.w;                                                                                  \
        return make_float4(rt_premultiply16(p.x, a), rt_premultiply16(p.y, a), rt_premultiply16(p.z, a),     \
                           (float)a);                                                                        \
    }                                                                                                        \
    inline RT_OVERLOAD float4 rt_premultiplied(float4 p) {                                                   \
        return make_float4(p.x * p.w, p.y * p.w, p.z * p.w, p.w);                                            \
    }                                                                                                        \
    inline RT_OVERLOAD float2 rt_premultiplied(uchar2 p) {                                                   \
        const float a = (float)p.y;                                                                          \
        return make_float2(rt_premultiply8(p.x, a), a);                                                      \
    }                                                                                                        \
    inline RT_OVERLOAD float2 rt_premultiplied(ushort2 p) {                                                  \
        return make_float2(rt_premultiply16(p.x, p.y), (float)p.y);                                          \
    }                                                                                                        \
    inline RT_OVERLOAD float8 rt_premultiplied(cmyka8 p) {                                                   \
        const float a = (float)p.a;                                                                          \
        return make_float8(rt_premultiply8(p.cmyk[0], a), rt_premultiply8(p.cmyk[1], a),                     \
                           rt_premultiply8(p.cmyk[2], a), rt_premultiply8(p.cmyk[3], a), a, 0.0f, 0.0f,      \
                           0.0f);                                                                            \
    }                                                                                                        \
    inline RT_OVERLOAD float rt_premultiplied(uchar p) {                                                     \
        return (float)p;                                                                                     \
    }                                                                                                        \
    inline RT_OVERLOAD float rt_premultiplied(ushort p) {                                                    \
        return (float)p;                                                                                     \
    }                                                                                                        \
    inline RT_OVERLOAD float rt_premultiplied(float p) {                                                     \
        return p;                                                                                            \
    }                                                                                                        \
                                                                                                             \
    inline float rt_coverage(float alpha, float maximum) {                                                   \
        return alpha / maximum;                                                                              \
    }                                                                                                        \
    inline int rt_keeps_premultiplied(float coverage) {                                                      \
        return coverage == 1.0f || rt_fabs(coverage) < 1e-20f;                                               \
    }                                                                                                        \
    inline RT_OVERLOAD float4 rt_postdivided(float4 acc, float maximum) {                                    \
        const float a = rt_coverage(acc.w, maximum);                                                         \
        if (rt_keeps_premultiplied(a)) return acc;                                                           \
        return make_float4(acc.x / a, acc.y / a, acc.z / a, acc.w);                                          \
    }                                                                                                        \
    inline RT_OVERLOAD float2 rt_postdivided(float2 acc, float maximum) {                                    \
        const float a = rt_coverage(acc.y, maximum);                                                         \
        if (rt_keeps_premultiplied(a)) return acc;                                                           \
        return make_float2(acc.x / a, acc.y);                                                                \
    }                                                                                                        \
    inline RT_OVERLOAD float8 rt_postdivided(float8 acc, float maximum) {                                    \
        const float a = rt_coverage(acc.s4, maximum);                                                        \
        if (rt_keeps_premultiplied(a)) return acc;                                                           \
        return make_float8(acc.s0 / a, acc.s1 / a, acc.s2 / a, acc.s3 / a, acc.s4, 0.0f, 0.0f, 0.0f);        \
    }                                                                                                        \
    inline RT_OVERLOAD float rt_postdivided(float acc, float maximum) {                                      \
        (void)maximum;                                                                                       \
        return acc;                                                                                          \
    }                                                                                                        \
                                                                                                             \
    inline uchar4 rt_to_uchar4(float4 acc) {                                                                 \
        return convert_uchar4(round(acc));                                                                   \
    }                                                                                                        \
    inline ushort4 rt_to_ushort4(float4 acc) {                                                               \
        return convert_ushort4(round(acc));                                                                  \
    }                                                                                                        \
    inline float4 rt_to_float4(float4 acc) {                                                                 \
        return acc;                                                                                          \
    }                                                                                                        \
    inline uchar2 rt_to_uchar2(float2 acc) {                                                                 \
        return convert_uchar2(round(acc));                                                                   \
    }                                                                                                        \
    inline ushort2 rt_to_ushort2(float2 acc) {                                                               \
        return convert_ushort2(round(acc));                                                                  \
    }                                                                                                        \
    inline cmyka8 rt_to_cmyka8(float8 acc) {                                                                 \
        cmyka8 p;                                                                                            \
        p.cmyk[0] = rt_sat_uchar(rt_round(acc.s0));                                                          \
        p.cmyk[1] = rt_sat_uchar(rt_round(acc.s1));                                                          \
        p.cmyk[2] = rt_sat_uchar(rt_round(acc.s2));                                                          \
        p.cmyk[3] = rt_sat_uchar(rt_round(acc.s3));                                                          \
        p.a = rt_sat_uchar(rt_round(acc.s4));                                                                \
        return p;                                                                                            \
    }                                                                                                        \
    inline uchar rt_to_uchar(float acc) {                                                                    \
        return rt_sat_uchar(rt_round(acc));                                                                  \
    }                                                                                                        \
    inline ushort rt_to_ushort(float acc) {                                                                  \
        return rt_sat_ushort(rt_round(acc));                                                                 \
    }                                                                                                        \
    inline float rt_to_float(float acc) {                                                                    \
        return acc;                                                                                          \
    }                                                                                                        \
                                                                                                             \
    inline RT_OVERLOAD float4 rt_clamp_all(float4 acc, float maximum) {                                      \
        return clamp(acc, 0.0f, maximum);                                                                    \
    }                                                                                                        \
    inline RT_OVERLOAD float2 rt_clamp_all(float2 acc, float maximum) {                                      \
        return clamp(acc, 0.0f, maximum);                                                                    \
    }                                                                                                        \
    inline RT_OVERLOAD float8 rt_clamp_all(float8 acc, float maximum) {                                      \
        return clamp(acc, 0.0f, maximum);                                                                    \
    }                                                                                                        \
    inline RT_OVERLOAD float rt_clamp_all(float acc, float maximum) {                                        \
        return rt_fmin(rt_fmax(acc, 0.0f), maximum);                                                         \
    }                                                                                                        \
    inline float4 rt_clamp_alpha(float4 acc) {                                                               \
        return make_float4(acc.x, acc.y, acc.z, rt_fmin(rt_fmax(acc.w, 0.0f), 1.0f));                        \
    }                                                                                                        \
    inline float rt_clamp_none(float acc) {                                                                  \
        return acc;                                                                                          \
    }                                                                                                        \
                                                                                                             \
    inline RT_OVERLOAD float4 rt_mix(float4 d, float4 s, float m) {                                          \
        return d + (s - d) * m;                                                                              \
    }                                                                                                        \
    inline RT_OVERLOAD float2 rt_mix(float2 d, float2 s, float m) {                                          \
        return d + (s - d) * m;                                                                              \
    }                                                                                                        \
    inline RT_OVERLOAD float8 rt_mix(float8 d, float8 s, float m) {                                          \
        return d + (s - d) * m;                                                                              \
    }                                                                                                        \
    inline RT_OVERLOAD float rt_mix(float d, float s, float m) {                                             \
        return d + (s - d) * m;                                                                              \
    }                                                                                                        \
                                                                                                             \
    inline uint RandomGet(uint* state) {                                                                     \
        *state = *state * 214013u + 2531011u;                                                                \
        return *state >> 16;                                                                                 \
    }

// CUDA C++ and the processor only: what OpenCL C has built in (operators, clamp, round and floor of vectors,
// the conversions) and the eight-float vector that holds a CMYKA8 accumulator.
#define RASTER_KERNEL_CPP_SOURCE                                                                             \
    struct float8 {                                                                                          \
        float s0, s1, s2, s3, s4, s5, s6, s7;                                                                \
    };                                                                                                       \
    inline float8 make_float8(float a, float b, float c, float d, float e, float f, float g, float h) {      \
        float8 v = {a, b, c, d, e, f, g, h};                                                                 \
        return v;                                                                                            \
    }                                                                                                        \
    inline float2 operator+(float2 a, float2 b) {                                                            \
        return make_float2(a.x + b.x, a.y + b.y);                                                            \
    }                                                                                                        \
    inline float2 operator-(float2 a, float2 b) {                                                            \
        return make_float2(a.x - b.x, a.y - b.y);                                                            \
    }                                                                                                        \
    inline float2 operator*(float2 a, float2 b) {                                                            \
        return make_float2(a.x * b.x, a.y * b.y);                                                            \
    }                                                                                                        \
    inline float2 operator/(float2 a, float2 b) {                                                            \
        return make_float2(a.x / b.x, a.y / b.y);                                                            \
    }                                                                                                        \
    inline float2 operator+(float2 a, float s) {                                                             \
        return make_float2(a.x + s, a.y + s);                                                                \
    }                                                                                                        \
    inline float2 operator-(float2 a, float s) {                                                             \
        return make_float2(a.x - s, a.y - s);                                                                \
    }                                                                                                        \
    inline float2 operator*(float2 a, float s) {                                                             \
        return make_float2(a.x * s, a.y * s);                                                                \
    }                                                                                                        \
    inline float2 operator/(float2 a, float s) {                                                             \
        return make_float2(a.x / s, a.y / s);                                                                \
    }                                                                                                        \
    inline float2 operator*(float s, float2 a) {                                                             \
        return make_float2(s * a.x, s * a.y);                                                                \
    }                                                                                                        \
    inline float2& operator+=(float2& a, float2 b) {                                                         \
        return a = a + b;                                                                                    \
    }                                                                                                        \
    inline float2& operator-=(float2& a, float2 b) {                                                         \
        return a = a - b;                                                                                    \
    }                                                                                                        \
    inline float2& operator-=(float2& a, float s) {                                                          \
        return a = a - s;                                                                                    \
    }                                                                                                        \
    inline float2& operator*=(float2& a, float s) {                                                          \
        return a = a * s;                                                                                    \
    }                                                                                                        \
    inline float4 operator+(float4 a, float4 b) {                                                            \
        return make_float4(a.x + b.x, a.y + b.y, a.z + b.z, a.w + b.w);                                      \
    }                                                                                                        \
    inline float4 operator-(float4 a, float4 b) {                                                            \
        return make_float4(a.x - b.x, a.y - b.y, a.z - b.z, a.w - b.w);                                      \
    }                                                                                                        \
    inline float4 operator*(float4 a, float4 b) {                                                            \
        return make_float4(a.x * b.x, a.y * b.y, a.z * b.z, a.w * b.w);                                      \
    }                                                                                                        \
    inline float4 operator/(float4 a, float4 b) {                                                            \
        return make_float4(a.x / b.x, a.y / b.y, a.z / b.z, a.w / b.w);                                      \
    }                                                                                                        \
    inline float4 operator+(float4 a, float s) {                                                             \
        return make_float4(a.x + s, a.y + s, a.z + s, a.w + s);                                              \
    }                                                                                                        \
    inline float4 operator-(float4 a, float s) {                                                             \
        return make_float4(a.x - s, a.y - s, a.z - s, a.w - s);                                              \
    }                                                                                                        \
    inline float4 operator*(float4 a, float s) {                                                             \
        return make_float4(a.x * s, a.y * s, a.z * s, a.w * s);                                              \
    }                                                                                                        \
    inline float4 operator/(float4 a, float s) {                                                             \
        return make_float4(a.x / s, a.y / s, a.z / s, a.w / s);                                              \
    }                                                                                                        \
    inline float4 operator*(float s, float4 a) {                                                             \
        return make_float4(s * a.x, s * a.y, s * a.z, s * a.w);                                              \
    }                                                                                                        \
    inline float4& operator+=(float4& a, float4 b) {                                                         \
        return a = a + b;                                                                                    \
    }                                                                                                        \
    inline float4& operator-=(float4& a, float4 b) {                                                         \
        return a = a - b;                                                                                    \
    }                                                                                                        \
    inline float4& operator*=(float4& a, float s) {                                                          \
        return a = a * s;                                                                                    \
    }                                                                                                        \
    inline float8 operator+(float8 a, float8 b) {                                                            \
        return make_float8(a.s0 + b.s0, a.s1 + b.s1, a.s2 + b.s2, a.s3 + b.s3, a.s4 + b.s4, a.s5 + b.s5,     \
                           a.s6 + b.s6, a.s7 + b.s7);                                                        \
    }                                                                                                        \
    inline float8 operator-(float8 a, float8 b) {                                                            \
        return make_float8(a.s0 - b.s0, a.s1 - b.s1, a.s2 - b.s2, a.s3 - b.s3, a.s4 - b.s4, a.s5 - b.s5,     \
                           a.s6 - b.s6, a.s7 - b.s7);                                                        \
    }                                                                                                        \
    inline float8 operator*(float8 a, float8 b) {                                                            \
        return make_float8(a.s0 * b.s0, a.s1 * b.s1, a.s2 * b.s2, a.s3 * b.s3, a.s4 * b.s4, a.s5 * b.s5,     \
                           a.s6 * b.s6, a.s7 * b.s7);                                                        \
    }                                                                                                        \
    inline float8 operator*(float8 a, float s) {                                                             \
        return make_float8(a.s0 * s, a.s1 * s, a.s2 * s, a.s3 * s, a.s4 * s, a.s5 * s, a.s6 * s, a.s7 * s);  \
    }                                                                                                        \
    inline float8 operator/(float8 a, float s) {                                                             \
        return make_float8(a.s0 / s, a.s1 / s, a.s2 / s, a.s3 / s, a.s4 / s, a.s5 / s, a.s6 / s, a.s7 / s);  \
    }                                                                                                        \
    inline float8 operator*(float s, float8 a) {                                                             \
        return a * s;                                                                                        \
    }                                                                                                        \
    inline float8& operator+=(float8& a, float8 b) {                                                         \
        return a = a + b;                                                                                    \
    }                                                                                                        \
    inline float8& operator-=(float8& a, float8 b) {                                                         \
        return a = a - b;                                                                                    \
    }                                                                                                        \
    inline int2 operator+(int2 a, int2 b) {                                                                  \
        return make_int2(a.x + b.x, a.y + b.y);                                                              \
    }                                                                                                        \
    inline int2 operator-(int2 a, int2 b) {                                                                  \
        return make_int2(a.x - b.x, a.y - b.y);                                                              \
    }                                                                                                        \
                                                                                                             \
    inline float rt_clamp1(float v, float lo, float hi) {                                                    \
        return rt_fmin(rt_fmax(v, lo), hi);                                                                  \
    }                                                                                                        \
    inline float2 clamp(float2 v, float lo, float hi) {                                                      \
        return make_float2(rt_clamp1(v.x, lo, hi), rt_clamp1(v.y, lo, hi));                                  \
    }                                                                                                        \
    inline float4 clamp(float4 v, float lo, float hi) {                                                      \
        return make_float4(rt_clamp1(v.x, lo, hi), rt_clamp1(v.y, lo, hi), rt_clamp1(v.z, lo, hi),           \
                           rt_clamp1(v.w, lo, hi));                                                          \
    }                                                                                                        \
    inline float8 clamp(float8 v, float lo, float hi) {                                                      \
        return make_float8(rt_clamp1(v.s0, lo, hi), rt_clamp1(v.s1, lo, hi), rt_clamp1(v.s2, lo, hi),        \
                           rt_clamp1(v.s3, lo, hi), rt_clamp1(v.s4, lo, hi), rt_clamp1(v.s5, lo, hi),        \
                           rt_clamp1(v.s6, lo, hi), rt_clamp1(v.s7, lo, hi));                                \
    }                                                                                                        \
    inline float2 round(float2 v) {                                                                          \
        return make_float2(rt_round(v.x), rt_round(v.y));                                                    \
    }                                                                                                        \
    inline float4 round(float4 v) {                                                                          \
        return make_float4(rt_round(v.x), rt_round(v.y), rt_round(v.z), rt_round(v.w));                      \
    }                                                                                                        \
    inline float2 floor(float2 v) {                                                                          \
        return make_float2(rt_floor(v.x), rt_floor(v.y));                                                    \
    }                                                                                                        \
    inline float4 floor(float4 v) {                                                                          \
        return make_float4(rt_floor(v.x), rt_floor(v.y), rt_floor(v.z), rt_floor(v.w));                      \
    }                                                                                                        \
    inline float2 convert_float2(int2 v) {                                                                   \
        return make_float2((float)v.x, (float)v.y);                                                          \
    }                                                                                                        \
    inline float2 convert_float2(uchar2 v) {                                                                 \
        return make_float2((float)v.x, (float)v.y);                                                          \
    }                                                                                                        \
    inline float2 convert_float2(ushort2 v) {                                                                \
        return make_float2((float)v.x, (float)v.y);                                                          \
    }                                                                                                        \
    inline float2 convert_float2(float2 v) {                                                                 \
        return v;                                                                                            \
    }                                                                                                        \
    inline float4 convert_float4(uchar4 v) {                                                                 \
        return make_float4((float)v.x, (float)v.y, (float)v.z, (float)v.w);                                  \
    }                                                                                                        \
    inline float4 convert_float4(ushort4 v) {                                                                \
        return make_float4((float)v.x, (float)v.y, (float)v.z, (float)v.w);                                  \
    }                                                                                                        \
    inline float4 convert_float4(float4 v) {                                                                 \
        return v;                                                                                            \
    }                                                                                                        \
    inline int2 convert_int2(float2 v) {                                                                     \
        return make_int2(rt_sat_int(v.x), rt_sat_int(v.y));                                                  \
    }                                                                                                        \
    inline uchar2 convert_uchar2(float2 v) {                                                                 \
        return make_uchar2(rt_sat_uchar(v.x), rt_sat_uchar(v.y));                                            \
    }                                                                                                        \
    inline ushort2 convert_ushort2(float2 v) {                                                               \
        return make_ushort2(rt_sat_ushort(v.x), rt_sat_ushort(v.y));                                         \
    }                                                                                                        \
    inline uchar4 convert_uchar4(float4 v) {                                                                 \
        return make_uchar4(rt_sat_uchar(v.x), rt_sat_uchar(v.y), rt_sat_uchar(v.z), rt_sat_uchar(v.w));      \
    }                                                                                                        \
    inline ushort4 convert_ushort4(float4 v) {                                                               \
        return make_ushort4(rt_sat_ushort(v.x), rt_sat_ushort(v.y), rt_sat_ushort(v.z), rt_sat_ushort(v.w)); \
    }

namespace Raster {

enum class HardwareKernelLanguage : int;

namespace KernelMath {

using uchar = std::uint8_t;
using ushort = std::uint16_t;
using uint = std::uint32_t;

// The built-in vector types of the kernel languages (CUDA names their constructors make_<type>).
struct alignas(8) float2 {
    float x, y;
};
struct alignas(16) float4 {
    float x, y, z, w;
};
struct alignas(8) int2 {
    int x, y;
};
struct alignas(8) uint2 {
    uint x, y;
};
struct alignas(2) uchar2 {
    uchar x, y;
};
struct alignas(4) uchar4 {
    uchar x, y, z, w;
};
struct alignas(4) ushort2 {
    ushort x, y;
};
struct alignas(8) ushort4 {
    ushort x, y, z, w;
};

constexpr float2 make_float2(float x, float y) {
    return {x, y};
}
constexpr float4 make_float4(float x, float y, float z, float w) {
    return {x, y, z, w};
}
constexpr int2 make_int2(int x, int y) {
    return {x, y};
}
constexpr uint2 make_uint2(uint x, uint y) {
    return {x, y};
}
constexpr uchar2 make_uchar2(uchar x, uchar y) {
    return {x, y};
}
constexpr uchar4 make_uchar4(uchar x, uchar y, uchar z, uchar w) {
    return {x, y, z, w};
}
constexpr ushort2 make_ushort2(ushort x, ushort y) {
    return {x, y};
}
constexpr ushort4 make_ushort4(ushort x, ushort y, ushort z, ushort w) {
    return {x, y, z, w};
}

// Scalar functions as the kernel languages define them, written out so that they compile inline instead of
// as calls into the C library (which would cost more than the rest of a conversion): round takes halves away
// from zero, fmin and fmax return the other argument when one is NaN. Each gives what the C function gives.
inline float rt_fabs(float v) {
    return std::fabs(v);
}
inline float rt_fmin(float a, float b) {
    return b != b ? a : a < b ? a : b;
}
inline float rt_fmax(float a, float b) {
    return b != b ? a : a > b ? a : b;
}
// Selects rather than branches, so that the compiler can keep random data free of mispredictions.
inline float rt_round(float v) {
    const float a = std::fabs(v);
    const bool whole = !(a < 8388608.0f); // 2^23 and up, infinite or NaN: nothing to round
    const int truncated = int(whole ? 0.0f : a);
    const int rounded = truncated + int(a - float(truncated) >= 0.5f); // the difference is exact
    return whole ? v : std::copysign(float(rounded), v);
}
inline float rt_floor(float v) {
    const bool whole = !(std::fabs(v) < 8388608.0f) || v == 0.0f;
    const float truncated = float(int(whole ? 0.0f : v)); // toward zero
    return whole ? v : truncated - float(truncated > v);
}
// The names fixed kernel texts call on scalars.
inline float round(float v) {
    return rt_round(v);
}
inline float floor(float v) {
    return rt_floor(v);
}
inline float fmin(float a, float b) {
    return rt_fmin(a, b);
}

#define RT_OVERLOAD
RASTER_KERNEL_SCALAR_SOURCE
RASTER_KERNEL_CPP_SOURCE
RASTER_KERNEL_SHARED_SOURCE
#undef RT_OVERLOAD

inline constexpr uint RandomMax = 65535u;

// Value equality of the vector types, for tests and span comparisons.
#define RASTER_KERNEL_MATH_EQUALITY(T)                                                                       \
    inline bool operator==(const T& a, const T& b) noexcept {                                                \
        static_assert(sizeof(T) % sizeof(a.x) == 0);                                                         \
        return __builtin_memcmp(&a, &b, sizeof(T)) == 0;                                                     \
    }
RASTER_KERNEL_MATH_EQUALITY(uchar2)
RASTER_KERNEL_MATH_EQUALITY(uchar4)
RASTER_KERNEL_MATH_EQUALITY(ushort2)
RASTER_KERNEL_MATH_EQUALITY(ushort4)
RASTER_KERNEL_MATH_EQUALITY(int2)
#undef RASTER_KERNEL_MATH_EQUALITY
inline bool operator==(const cmyka8& a, const cmyka8& b) noexcept {
    return a.cmyk[0] == b.cmyk[0] && a.cmyk[1] == b.cmyk[1] && a.cmyk[2] == b.cmyk[2] &&
           a.cmyk[3] == b.cmyk[3] && a.a == b.a;
}

} // namespace KernelMath

// The shared definitions above as kernel text for the language (0 or 1), prelude included: the language's
// type names, address-space macros and helpers, then the shared source. Guarded, so that every traits
// fragment can carry it. Null for any other language.
const char* GetKernelMathText(HardwareKernelLanguage language);

} // namespace Raster
