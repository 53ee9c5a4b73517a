#pragma once
// The twirl and sphere mappings, written once: processor code expands them here and the Transform stages'
// kernel text pastes the very same tokens (DistortMath::GetSourceText), so both paths map alike.
//
// The source is in the dialect of host/raster/KernelMath.h (OpenCL C, CUDA C++ and host C++ at once).
// RT_DISTORT_FUNCTION starts every function and RT_DISTORT_SQRT names the language's single-precision square
// root; params_address_space is the kernels' address space of the parameter array. Sine, cosine and arcsine
// are polynomials of plain multiplications and additions, not the languages' own functions, which round
// differently from one library to the next; and they vectorise on the processor.

#include "host/raster/KernelMath.h"

#include <cmath>

// Sine and cosine of x as (sin, cos): the quadrant q = round(x / (pi/2)) and the remainder r (pi/2 taken in
// three parts, so that q * part is exact), then Taylor polynomials on |r| <= pi/4 (error below 2e-9).
// Arcsine of 0 <= x <= 1: its series in x up to x^21 where x <= 0.5, otherwise through
// asin(x) = pi/2 - 2 asin(sqrt((1 - x) / 2)).
//
// TwirlMap: p = (centre x, centre y, angle in degrees, radius). A location at distance d from the centre
// turns by angle * ((radius - d) / radius)^2 in the negative sense; at or beyond the radius it stays.
// SphereMap: p = (centre x, centre y, intensity / 100, radius). Inside the circle, d the distance over the
// radius, a bulge (k > 0) reads from d + k (asin(d) 2/pi - d), a pinch from d + k (d - sin(d pi/2)); the
// exact centre maps onto itself (the formula's 0/0 has that limit). pi is 3.14159 in both mappings.
#define RT_DISTORT_SOURCE                                                                                    \
    RT_DISTORT_FUNCTION float DistortSinPolynomial(float r) {                                                \
        const float r2 = r * r;                                                                              \
        return r +                                                                                           \
               r * r2 * (-0.16666667f + r2 * (0.0083333333f + r2 * (-0.00019841270f + r2 * 2.7557319e-6f))); \
    }                                                                                                        \
    RT_DISTORT_FUNCTION float DistortCosPolynomial(float r) {                                                \
        const float r2 = r * r;                                                                              \
        return 1.0f +                                                                                        \
               r2 * (-0.5f + r2 * (0.041666667f +                                                            \
                                   r2 * (-0.0013888889f + r2 * (2.4801587e-5f + r2 * -2.7557319e-7f))));     \
    }                                                                                                        \
    RT_DISTORT_FUNCTION float2 DistortSinCos(float x) {                                                      \
        const float quarters = x * 0.63661977f;                                                              \
        const int q = rt_sat_int(quarters + (quarters < 0.0f ? -0.5f : 0.5f));                               \
        const float fq = (float)q;                                                                           \
        const float r = ((x - fq * 1.5703125f) - fq * 4.8375129699707031e-4f) - fq * 7.5497899548918821e-8f; \
        const float s = DistortSinPolynomial(r);                                                             \
        const float c = DistortCosPolynomial(r);                                                             \
        const float sine = (q & 1) ? c : s;                                                                  \
        const float cosine = (q & 1) ? s : c;                                                                \
        return float2_literal((q & 2) ? -sine : sine, (((q & 3) + 1) & 2) ? -cosine : cosine);               \
    }                                                                                                        \
    RT_DISTORT_FUNCTION float DistortAsin(float x) {                                                         \
        const int high = x > 0.5f;                                                                           \
        const float z = high ? (1.0f - x) * 0.5f : x * x;                                                    \
        const float t = high ? RT_DISTORT_SQRT(z) : x;                                                       \
        const float p =                                                                                      \
            t +                                                                                              \
            t * z *                                                                                          \
                (0.16666667f +                                                                               \
                 z * (0.075f + z * (0.044642857f +                                                           \
                                    z * (0.030381944f +                                                      \
                                         z * (0.022372159f +                                                 \
                                              z * (0.017352764f +                                            \
                                                   z * (0.013964844f +                                       \
                                                        z * (0.011551800f + z * (0.0097616095f +             \
                                                                                 z * 0.0083903358f))))))))); \
        return high ? 1.5707964f - 2.0f * p : p;                                                             \
    }                                                                                                        \
    RT_DISTORT_FUNCTION float2 TwirlMap(float2 location, params_address_space float* p) {                    \
        const float dx = location.x - p[0];                                                                  \
        const float dy = location.y - p[1];                                                                  \
        const float dd = dx * dx + dy * dy;                                                                  \
        const float radius = p[3];                                                                           \
        const float d = radius - RT_DISTORT_SQRT(dd);                                                        \
        const float ratio = d * d / (radius * radius);                                                       \
        const float2 sc = DistortSinCos(ratio * -p[2] * (3.14159f / 180.0f));                                \
        const float2 turned = float2_literal(p[0] + sc.y * dx - sc.x * dy, p[1] + sc.x * dx + sc.y * dy);    \
        return dd >= radius * radius ? location : turned;                                                    \
    }                                                                                                        \
    RT_DISTORT_FUNCTION float2 SphereMap(float2 location, params_address_space float* p) {                   \
        const float k = p[2];                                                                                \
        const float radius = p[3];                                                                           \
        const float dx = (location.x - p[0]) / radius;                                                       \
        const float dy = (location.y - p[1]) / radius;                                                       \
        const float dd = dx * dx + dy * dy;                                                                  \
        const float d = RT_DISTORT_SQRT(dd);                                                                 \
        const float delta = k > 0.0f ? k * (DistortAsin(d) * (2.0f / 3.14159f) - d)                          \
                                     : k * (d - DistortSinCos(d * (3.14159f / 2.0f)).x);                     \
        const float scale = 1.0f + delta / d;                                                                \
        const float2 moved = float2_literal(p[0] + dx * radius * scale, p[1] + dy * radius * scale);         \
        return k == 0.0f || radius == 0.0f || !(dd < 1.0f) || d == 0.0f ? location : moved;                  \
    }

namespace RasterTools::DistortMath {

using namespace Raster::KernelMath;

#define RT_DISTORT_FUNCTION inline
#define RT_DISTORT_SQRT std::sqrt
#define params_address_space const
RT_DISTORT_SOURCE
#undef params_address_space
#undef RT_DISTORT_SQRT
#undef RT_DISTORT_FUNCTION

// The names the source defines.
inline constexpr const char* DefinedNames[] = {
    "DistortSinPolynomial", "DistortCosPolynomial", "DistortSinCos", "DistortAsin", "TwirlMap", "SphereMap"};

// The source as kernel text (one line; RT_DISTORT_FUNCTION, RT_DISTORT_SQRT and params_address_space left for
// the including text to define).
const char* GetSourceText();

} // namespace RasterTools::DistortMath
