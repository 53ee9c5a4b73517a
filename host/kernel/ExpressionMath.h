#pragma once
// The expression language's scalar functions, written once and compiled into the processor's bytecode
// interpreter and pasted into device kernel text, so that every path computes the same bits.
//
// The source below is a macro body in a dialect that is OpenCL C, CUDA C++ and host C++ at once: plain C
// functions on float, selects instead of branches where a loop should vectorise, and a handful of primitives
// that each language supplies beforehand (ex_inline, ex_uint, ex_bits, ex_from_bits, ex_floor_p, ex_sqrt_p).
// Only
// + - * / and sqrt, all correctly rounded on every path, and exact operations (floor, bit moves, selects) are
// used; the transcendental functions are the project's own polynomials, not a library's.

#include <bit>
#include <cmath>
#include <cstdint>

// clang-format off
#define KERNEL_EXPRESSION_MATH_SOURCE                                                                        \
    ex_inline float ex_lt(float a, float b) { return a < b ? 1.0f : 0.0f; }                                     \
    ex_inline float ex_le(float a, float b) { return a <= b ? 1.0f : 0.0f; }                                    \
    ex_inline float ex_gt(float a, float b) { return a > b ? 1.0f : 0.0f; }                                     \
    ex_inline float ex_ge(float a, float b) { return a >= b ? 1.0f : 0.0f; }                                    \
    ex_inline float ex_eq(float a, float b) { return a == b ? 1.0f : 0.0f; }                                    \
    ex_inline float ex_ne(float a, float b) { return a != b ? 1.0f : 0.0f; }                                    \
    ex_inline float ex_and(float a, float b) { return (a != 0.0f && b != 0.0f) ? 1.0f : 0.0f; }                 \
    ex_inline float ex_or(float a, float b) { return (a != 0.0f || b != 0.0f) ? 1.0f : 0.0f; }                  \
    ex_inline float ex_not(float a) { return a == 0.0f ? 1.0f : 0.0f; }                                         \
    ex_inline float ex_select(float c, float a, float b) { return c != 0.0f ? a : b; }                          \
    ex_inline float ex_abs(float a) { return ex_from_bits(ex_bits(a) & 0x7fffffffu); }                          \
    ex_inline float ex_sign(float a) { return a > 0.0f ? 1.0f : (a < 0.0f ? -1.0f : a); }                       \
    ex_inline float ex_min(float a, float b) { return a != a ? b : (b < a ? b : a); }                           \
    ex_inline float ex_max(float a, float b) { return a != a ? b : (b > a ? b : a); }                           \
    ex_inline float ex_clamp(float v, float lo, float hi) { return ex_min(ex_max(v, lo), hi); }                 \
    ex_inline float ex_floor(float a) { return ex_floor_p(a); }                                                 \
    ex_inline float ex_ceil(float a) { return -ex_floor_p(-a); }                                                \
    ex_inline float ex_trunc(float a) { return a < 0.0f ? -ex_floor_p(-a) : ex_floor_p(a); }                    \
    /* Halves away from zero; a - t is exact wherever a has a fraction. */                                   \
    ex_inline float ex_round(float a) {                                                                         \
        const float t = ex_trunc(a);                                                                         \
        const float d = ex_abs(a - t);                                                                       \
        return d >= 0.5f ? t + (a < 0.0f ? -1.0f : 1.0f) : t;                                                \
    }                                                                                                        \
    /* Never 1: the largest float below 1 where a - floor(a) would round up to it. */                        \
    ex_inline float ex_fract(float a) {                                                                         \
        const float r = a - ex_floor_p(a);                                                                   \
        return r < 1.0f ? r : (r == r ? 0.99999994039535522f : r);                                           \
    }                                                                                                        \
    /* Floored: the result takes the sign of b, so patterns repeat across zero. */                           \
    ex_inline float ex_mod(float a, float b) { return a - b * ex_floor_p(a / b); }                              \
    ex_inline float ex_sqrt(float a) { return ex_sqrt_p(a); }                                                   \
    ex_inline float ex_mix(float a, float b, float t) { return a + (b - a) * t; }                               \
    ex_inline float ex_step(float edge, float v) { return v < edge ? 0.0f : 1.0f; }                             \
    ex_inline float ex_smoothstep(float e0, float e1, float v) {                                                \
        const float t = ex_clamp((v - e0) / (e1 - e0), 0.0f, 1.0f);                                          \
        return t * t * (3.0f - 2.0f * t);                                                                    \
    }                                                                                                        \
    /* Scaled by the larger magnitude, so that squares neither overflow nor underflow. */                    \
    ex_inline float ex_hypot(float a, float b) {                                                                \
        const float x = ex_abs(a), y = ex_abs(b);                                                            \
        const float big = ex_max(x, y), small = ex_min(x, y);                                                \
        const float r = big > 0.0f ? small / big : 0.0f;                                                     \
        const float h = big * ex_sqrt_p(1.0f + r * r);                                                       \
        return big > 3.402823466e38f ? big : h;                                                              \
    }                                                                                                        \
    /* Float to int without undefined behaviour: NaN gives 0, magnitudes stop at 2^30. */                    \
    ex_inline int ex_to_int(float a) { return a != a ? 0 : (int)ex_clamp(a, -1073741824.0f, 1073741824.0f); }   \
    /* Sine and cosine: reduction by pi/4 in three parts, then one of two polynomials on [-pi/4, pi/4]. */   \
    ex_inline float ex_sin_poly(float r, float z) {                                                             \
        return ((-1.9515295891e-4f * z + 8.3321608736e-3f) * z - 1.6666654611e-1f) * z * r + r;             \
    }                                                                                                        \
    ex_inline float ex_cos_poly(float z) {                                                                      \
        return ((2.443315711809948e-5f * z - 1.388731625493765e-3f) * z + 4.166664568298827e-2f) * z * z -   \
               0.5f * z + 1.0f;                                                                              \
    }                                                                                                        \
    /* |a| = j pi/4 + r with j even and |r| <= pi/4; |a| beyond 2^23 carries no phase and reduces to 0. */  \
    ex_inline float ex_reduced(float a) {                                                                    \
        const float x = ex_abs(a);                                                                           \
        return x < 8388608.0f ? x : 0.0f;                                                                    \
    }                                                                                                        \
    ex_inline int ex_octant(float a) {                                                                       \
        const int j = ex_to_int(ex_floor_p(ex_reduced(a) * 1.27323954473516268f));                           \
        return j + (j & 1);                                                                                  \
    }                                                                                                        \
    ex_inline float ex_remainder(float a, int j) {                                                           \
        const float y = (float)j;                                                                            \
        return ((ex_reduced(a) - y * 0.78515625f) - y * 2.4187564849853515625e-4f) -                         \
               y * 3.77489497744594108e-8f;                                                                  \
    }                                                                                                        \
    ex_inline float ex_sin(float a) {                                                                           \
        const int j = ex_octant(a);                                                                          \
        const int q = (j >> 1) & 3;                                                                          \
        const float r = ex_remainder(a, j);                                                                  \
        const float z = r * r;                                                                               \
        const float s = ex_sin_poly(r, z), c = ex_cos_poly(z);                                               \
        const float v = (q & 1) ? c : s;                                                                     \
        const float m = (q & 2) ? -v : v;                                                                    \
        const float res = a < 0.0f ? -m : m;                                                                 \
        return a - a != 0.0f ? a - a : res;                                                                  \
    }                                                                                                        \
    ex_inline float ex_cos(float a) {                                                                           \
        const int j = ex_octant(a);                                                                          \
        const int q = (j >> 1) & 3;                                                                          \
        const float r = ex_remainder(a, j);                                                                  \
        const float z = r * r;                                                                               \
        const float s = ex_sin_poly(r, z), c = ex_cos_poly(z);                                               \
        const float v = (q & 1) ? s : c;                                                                     \
        const float res = (q == 1 || q == 2) ? -v : v;                                                       \
        return a - a != 0.0f ? a - a : res;                                                                  \
    }                                                                                                        \
    ex_inline float ex_tan(float a) { return ex_sin(a) / ex_cos(a); }                                           \
    /* e^a: a = n ln2 + r with ln2 in two parts, a polynomial on r, then 2^n in two steps so that n = 128   \
       does not overflow the exponent field early. */                                                        \
    ex_inline float ex_exp(float a) {                                                                           \
        const float x = ex_clamp(a, -87.3365478515625f, 88.72283935546875f);                                 \
        const float n = ex_floor_p(x * 1.44269504088896341f + 0.5f);                                         \
        const float r = (x - n * 0.693359375f) - n * -2.12194440e-4f;                                        \
        const float z = r * r;                                                                               \
        const float p = (((((1.9875691500e-4f * r + 1.3981999507e-3f) * r + 8.3334519073e-3f) * r +          \
                           4.1665795894e-2f) * r + 1.6666665459e-1f) * r + 5.0000001201e-1f) * z + r + 1.0f; \
        const int ni = (int)n;                                                                               \
        const int n1 = ni >> 1;                                                                              \
        const int n2 = ni - n1;                                                                              \
        const float v = p * ex_from_bits((ex_uint)(n1 + 127) << 23) * ex_from_bits((ex_uint)(n2 + 127) << 23); \
        return a != a ? a : (a > 88.72283935546875f ? ex_from_bits(0x7f800000u)                              \
                                                    : (a < -87.3365478515625f ? 0.0f : v));                  \
    }                                                                                                        \
    /* ln a: a = m 2^e with m in [sqrt(1/2), sqrt(2)), a polynomial in m - 1, and e ln2 in two parts. */     \
    ex_inline float ex_log(float a) {                                                                           \
        const int tiny = a < 1.17549435e-38f;                                                                \
        const float x = tiny ? a * 8388608.0f : a;                                                           \
        const ex_uint b = ex_bits(x);                                                                        \
        const int e = (int)((b >> 23) & 0xffu) - 126 - (tiny ? 23 : 0);                                      \
        const float m = ex_from_bits((b & 0x007fffffu) | 0x3f000000u);                                       \
        const int low = m < 0.707106781186547524f;                                                           \
        const float ef = (float)(e - low);                                                                   \
        const float r = low ? (m + m) - 1.0f : m - 1.0f;                                                     \
        const float z = r * r;                                                                               \
        float y = ((((((((7.0376836292e-2f * r - 1.1514610310e-1f) * r + 1.1676998740e-1f) * r -             \
                        1.2420140846e-1f) * r + 1.4249322787e-1f) * r - 1.6668057665e-1f) * r +              \
                     2.0000714765e-1f) * r - 2.4999993993e-1f) * r + 3.3333331174e-1f) * r * z;              \
        y = y + -2.12194440e-4f * ef;                                                                        \
        y = y - 0.5f * z;                                                                                    \
        const float v = (r + y) + 0.693359375f * ef;                                                         \
        return a != a ? a                                                                                    \
               : a < 0.0f ? ex_from_bits(0x7fc00000u)                                                        \
               : a == 0.0f ? ex_from_bits(0xff800000u)                                                       \
               : a > 3.402823466e38f ? a : v;                                                                \
    }                                                                                                        \
    ex_inline float ex_log2(float a) { return ex_log(a) * 1.44269504088896341f; }                               \
    ex_inline float ex_log10(float a) { return ex_log(a) * 0.434294481903251828f; }                             \
    /* a^b through e^(b ln|a|); a negative base needs a whole exponent, whose parity gives the sign. */      \
    ex_inline float ex_pow(float a, float b) {                                                                  \
        const float v = ex_exp(b * ex_log(ex_abs(a)));                                                       \
        const int whole = ex_floor_p(b) == b;                                                                \
        const int odd = whole && ex_mod(b, 2.0f) == 1.0f;                                                    \
        const float s = a < 0.0f ? (whole ? (odd ? -v : v) : ex_from_bits(0x7fc00000u)) : v;                 \
        return (b == 0.0f || a == 1.0f) ? 1.0f : s;                                                          \
    }                                                                                                        \
    /* Arctangent: two reductions to |t| <= tan(pi/8), then an odd polynomial. */                            \
    ex_inline float ex_atan(float a) {                                                                          \
        const float x = ex_abs(a);                                                                           \
        const int big = x > 2.414213562373095f;                                                              \
        const int mid = x > 0.4142135623730950f;                                                             \
        const float base = big ? 1.57079632679489662f : (mid ? 0.785398163397448310f : 0.0f);                \
        const float t = big ? -1.0f / x : (mid ? (x - 1.0f) / (x + 1.0f) : x);                               \
        const float z = t * t;                                                                               \
        const float p = (((8.05374449538e-2f * z - 1.38776856032e-1f) * z + 1.99777106478e-1f) * z -         \
                         3.33329491539e-1f) * z * t + t;                                                     \
        const float r = base + p;                                                                            \
        return a < 0.0f ? -r : r;                                                                            \
    }                                                                                                        \
    ex_inline float ex_atan2(float y, float x) {                                                                \
        const float t = ex_atan(y / x);                                                                      \
        const float left = y < 0.0f ? t - 3.14159265358979324f : t + 3.14159265358979324f;                   \
        const float axis = y > 0.0f ? 1.57079632679489662f : (y < 0.0f ? -1.57079632679489662f : 0.0f);      \
        return (x != x || y != y) ? x + y : (x == 0.0f ? axis : (x < 0.0f ? left : t));                      \
    }                                                                                                        \
    ex_inline float ex_asin(float a) { return ex_atan2(a, ex_sqrt_p((1.0f - a) * (1.0f + a))); }               \
    ex_inline float ex_acos(float a) { return ex_atan2(ex_sqrt_p((1.0f - a) * (1.0f + a)), a); }               \
    /* A 32-bit integer mix with full avalanche. */                                                          \
    ex_inline ex_uint ex_hash(ex_uint h) {                                                                      \
        h = h ^ (h >> 16);                                                                                   \
        h = h * 0x7feb352du;                                                                                 \
        h = h ^ (h >> 15);                                                                                   \
        h = h * 0x846ca68bu;                                                                                 \
        return h ^ (h >> 16);                                                                                \
    }                                                                                                        \
    /* Uniform in [0, 1) from the bit patterns of the two arguments (adding 0 makes -0 the same as 0). */    \
    ex_inline float ex_rand(float x, float y) {                                                                 \
        const ex_uint h = ex_hash(ex_bits(x + 0.0f) ^ ex_hash(ex_bits(y + 0.0f) + 0x9e3779b9u));              \
        return (float)(h >> 8) * 5.9604644775390625e-8f;                                                     \
    }                                                                                                        \
    /* The gradient of lattice point (i, j), one of eight, dotted with the offset (dx, dy). */               \
    ex_inline float ex_grad(int i, int j, float dx, float dy) {                                                 \
        const ex_uint k = ex_hash(((ex_uint)i * 0x8da6b343u) ^ ((ex_uint)j * 0xd8163841u)) & 7u;             \
        const float sx = (k & 1u) ? -1.0f : 1.0f;                                                            \
        const float sy = (k & 2u) ? -1.0f : 1.0f;                                                            \
        const float gx = k < 4u ? sx : (k < 6u ? sx : 0.0f);                                                 \
        const float gy = k < 4u ? sy : (k < 6u ? 0.0f : sx);                                                 \
        return gx * dx + gy * dy;                                                                            \
    }                                                                                                        \
    ex_inline float ex_fade(float t) { return t * t * t * (t * (t * 6.0f - 15.0f) + 10.0f); }                   \
    /* Gradient noise: 0 on the integer lattice, smooth between, within -1..1. */                            \
    ex_inline float ex_noise(float x, float y) {                                                                \
        const float fx = ex_floor_p(x), fy = ex_floor_p(y);                                                  \
        const int i = ex_to_int(fx), j = ex_to_int(fy);                                                      \
        const float tx = x - fx, ty = y - fy;                                                                \
        const float n00 = ex_grad(i, j, tx, ty);                                                             \
        const float n10 = ex_grad(i + 1, j, tx - 1.0f, ty);                                                  \
        const float n01 = ex_grad(i, j + 1, tx, ty - 1.0f);                                                  \
        const float n11 = ex_grad(i + 1, j + 1, tx - 1.0f, ty - 1.0f);                                       \
        const float u = ex_fade(tx), v = ex_fade(ty);                                                        \
        const float r = ex_mix(ex_mix(n00, n10, u), ex_mix(n01, n11, u), v);                                 \
        return (x - x != 0.0f || y - y != 0.0f) ? 0.0f : r;                                                  \
    }                                                                                                        \
    /* Fractal sum: octave k has twice the frequency and half the weight of octave k - 1, shifted so that   \
       lattices do not line up; the sum is divided by the weights, so it stays within -1..1. */              \
    ex_inline float ex_fbm(float x, float y, float octaves) {                                                   \
        const int n = ex_to_int(ex_clamp(ex_floor_p(octaves), 1.0f, 12.0f));                                 \
        float sum = 0.0f, weight = 1.0f, total = 0.0f, scale = 1.0f;                                         \
        for (int k = 0; k < n; ++k) {                                                                        \
            const float shift = (float)k * 17.31f;                                                           \
            sum = sum + weight * ex_noise(x * scale + shift, y * scale - shift);                             \
            total = total + weight;                                                                          \
            weight = weight * 0.5f;                                                                          \
            scale = scale * 2.0f;                                                                            \
        }                                                                                                    \
        return sum / total;                                                                                  \
    }
// clang-format on

namespace Kernel::ExpressionMath {

using ex_uint = std::uint32_t;

// Forced, so that the interpreter's span loops vectorise whole functions instead of calling them per lane.
#define ex_inline inline __attribute__((always_inline))

inline ex_uint ex_bits(float v) noexcept {
    return std::bit_cast<ex_uint>(v);
}
inline float ex_from_bits(ex_uint v) noexcept {
    return std::bit_cast<float>(v);
}
// Exact, and written out so that loops over it vectorise without SSE4.1's rounding instruction: adding and
// subtracting 2^23 rounds to a whole number, one is taken off where that rounded up, and the sign of the
// argument is kept (floor(-0) is -0). Whole numbers, infinities and NaN pass through.
inline float ex_floor_p(float v) noexcept {
    const float m = v < 0.0f ? -8388608.0f : 8388608.0f;
    const float r = (v + m) - m;
    const float t = r > v ? r - 1.0f : r;
    const float s = ex_from_bits(ex_bits(t) | (ex_bits(v) & 0x80000000u));
    return std::fabs(v) < 8388608.0f ? s : v;
}
inline float ex_sqrt_p(float v) noexcept {
    return std::sqrt(v);
}

KERNEL_EXPRESSION_MATH_SOURCE

} // namespace Kernel::ExpressionMath
