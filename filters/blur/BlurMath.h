#pragma once
// The blurs' per-pixel arithmetic, written once: processor code expands it per format here (Blur::Math<F>)
// and the blurs' device steps paste the very same tokens (BlurKernelText.cpp), so that both paths
// premultiply, round, resolve, sample and blend alike.
//
// The dialect is the device steps': T is a stored component, ACC a premultiplied sum, RT_N the components of
// a pixel and RT_A alpha's place among them, RT_KIND 0, 1 or 2 for 8-bit, 16-bit and float components,
// RT_MAX the largest component, RT_PSCALE what a summed premultiplied colour is divided by to give colour
// units (8-bit sums hold colour × alpha). RT_BLUR_FUNCTION starts every function and GLOBAL marks pointers
// into device memory. The format choices are constant conditions, which every compiler folds.

#include "host/raster/PixelFormat.h"

#include <cmath>
#include <cstdint>
#include <type_traits>

// rt_premultiply: colour c of a pixel whose alpha is a; 16-bit colour × alpha / 65535 in integers, the colour
// itself where alpha is full; rt_premultiplied is component c of pixel p so (alpha as it is), as a float.
// rt_store rounds half up after clamping to the range (NaN gives 0). rt_resolve
// writes premultiplied sums over a total weight (inverse is 1 / weight): colour is divided by the normalised
// alpha unless that is exactly 1 or within 1e-20 of 0. rt_sharpen moves each colour of pixel p away from its
// premultiplied blur by factor where the difference (in colour units) exceeds threshold and alpha lets the
// colour be straightened; alpha stays. rt_channel_bit is component k's write-mask bit (grey
// answers to any of red, green and blue). rt_write_masked moves value toward it from the original pixel by
// weight / 255 (255: all the way) and writes the components that the channel mask lets through (negative:
// all). rt_bilinear_cell clamps a sample at (x, y) into the pixels left..lastX, top..lastY and gives the
// cell's corners (x0, y0, x1, y1) and fractions; it answers 1 where the sample sits on a pixel centre.
// rt_bilinear_mix weighs the cell's four pixels by alpha; where every one is transparent, by the plain
// weights, so that the colour stays defined. Alpha is the weighted sum itself.
#define RT_BLUR_SOURCE                                                                                       \
    RT_BLUR_FUNCTION ACC rt_premultiply(T c, T a) {                                                          \
        return RT_KIND == 0   ? (ACC)c * (ACC)a                                                              \
               : RT_KIND == 1 ? (a < (T)RT_MAX ? (ACC)c * (ACC)a / (ACC)65535 : (ACC)c)                      \
                              : (ACC)(c * a);                                                                \
    }                                                                                                        \
    RT_BLUR_FUNCTION float rt_premultiplied(GLOBAL const T* p, int c) {                                      \
        return c == RT_A ? (float)p[c] : (float)rt_premultiply(p[c], p[RT_A]);                               \
    }                                                                                                        \
    RT_BLUR_FUNCTION void rt_accumulate(ACC* sum, GLOBAL const T* p) {                                       \
        for (int c = 0; c < RT_N; ++c)                                                                       \
            sum[c] += c == RT_A ? (ACC)p[RT_A] : rt_premultiply(p[c], p[RT_A]);                              \
    }                                                                                                        \
    RT_BLUR_FUNCTION void rt_remove(ACC* sum, GLOBAL const T* p) {                                           \
        for (int c = 0; c < RT_N; ++c)                                                                       \
            sum[c] -= c == RT_A ? (ACC)p[RT_A] : rt_premultiply(p[c], p[RT_A]);                              \
    }                                                                                                        \
    RT_BLUR_FUNCTION T rt_store(float v) {                                                                   \
        return RT_KIND == 2 ? (T)v : (T)(int)(rt_fminf(rt_fmaxf(v, 0.0f), RT_MAX) + 0.5f);                   \
    }                                                                                                        \
    RT_BLUR_FUNCTION void rt_resolve(const float* sum, float inverse, GLOBAL T* out) {                       \
        const float alpha = sum[RT_A] * inverse / RT_MAX;                                                    \
        const int divide = alpha != 1.0f && !(alpha > -1e-20f && alpha < 1e-20f);                            \
        const float colourScale = inverse / RT_PSCALE / (divide ? alpha : 1.0f);                             \
        for (int c = 0; c < RT_N; ++c)                                                                       \
            out[c] = rt_store(c == RT_A ? sum[RT_A] * inverse : sum[c] * colourScale);                       \
    }                                                                                                        \
    RT_BLUR_FUNCTION void rt_sharpen(GLOBAL const T* p, const float* blur, float factor, float threshold,    \
                                     T* value) {                                                             \
        const float alpha = (float)p[RT_A] / RT_MAX;                                                         \
        const int divide = alpha != 1.0f && !(alpha > -1e-20f && alpha < 1e-20f);                            \
        const float back = 1.0f / RT_PSCALE / (divide ? alpha : 1.0f);                                       \
        for (int c = 0; c < RT_N; ++c) {                                                                     \
            value[c] = p[c];                                                                                 \
            if (c == RT_A) continue;                                                                         \
            const float difference = (float)rt_premultiply(p[c], p[RT_A]) - blur[c];                         \
            if (rt_fabsf(difference) / RT_PSCALE <= threshold || (!divide && alpha != 1.0f)) continue;       \
            value[c] = rt_store((float)p[c] + factor * difference * back);                                   \
        }                                                                                                    \
    }                                                                                                        \
    RT_BLUR_FUNCTION int rt_channel_bit(int k) {                                                             \
        return RT_N == 2 ? (k == 0 ? 7 : 8) : 1 << k;                                                        \
    }                                                                                                        \
    RT_BLUR_FUNCTION void rt_write_masked(T* value, GLOBAL const T* original, int weight, int channelMask,   \
                                          GLOBAL T* out) {                                                   \
        if (weight != 255) {                                                                                 \
            const float w = (float)weight / 255.0f;                                                          \
            for (int k = 0; k < RT_N; ++k)                                                                   \
                value[k] = rt_store((float)original[k] + ((float)value[k] - (float)original[k]) * w);        \
        }                                                                                                    \
        for (int k = 0; k < RT_N; ++k)                                                                       \
            if (channelMask < 0 || (channelMask & rt_channel_bit(k))) out[k] = value[k];                     \
    }                                                                                                        \
    RT_BLUR_FUNCTION int rt_bilinear_cell(double x, double y, int left, int top, int lastX, int lastY,       \
                                          int* cell, float* fraction) {                                      \
        x = x < (double)left ? (double)left : ((double)lastX < x ? (double)lastX : x);                       \
        y = y < (double)top ? (double)top : ((double)lastY < y ? (double)lastY : y);                         \
        const int x0 = (int)floor(x), y0 = (int)floor(y);                                                    \
        fraction[0] = (float)(x - (double)x0);                                                               \
        fraction[1] = (float)(y - (double)y0);                                                               \
        cell[0] = x0;                                                                                        \
        cell[1] = y0;                                                                                        \
        cell[2] = x0 + 1 < lastX ? x0 + 1 : lastX;                                                           \
        cell[3] = y0 + 1 < lastY ? y0 + 1 : lastY;                                                           \
        return fraction[0] == 0.0f && fraction[1] == 0.0f;                                                   \
    }                                                                                                        \
    RT_BLUR_FUNCTION void rt_bilinear_mix(GLOBAL const T* p0, GLOBAL const T* p1, GLOBAL const T* p2,        \
                                          GLOBAL const T* p3, float fx, float fy, T* out) {                  \
        float weight[4];                                                                                     \
        weight[0] = (1.0f - fx) * (1.0f - fy);                                                               \
        weight[1] = fx * (1.0f - fy);                                                                        \
        weight[2] = (1.0f - fx) * fy;                                                                        \
        weight[3] = fx * fy;                                                                                 \
        GLOBAL const T* corner[4];                                                                           \
        corner[0] = p0;                                                                                      \
        corner[1] = p1;                                                                                      \
        corner[2] = p2;                                                                                      \
        corner[3] = p3;                                                                                      \
        float alpha = 0.0f;                                                                                  \
        float colour[RT_N];                                                                                  \
        for (int c = 0; c < RT_N; ++c)                                                                       \
            colour[c] = 0.0f;                                                                                \
        for (int k = 0; k < 4; ++k) {                                                                        \
            const float a = (float)corner[k][RT_A] * weight[k];                                              \
            alpha += a;                                                                                      \
            for (int c = 0; c < RT_N; ++c)                                                                   \
                colour[c] += (float)corner[k][c] * a;                                                        \
        }                                                                                                    \
        const float alphaOut = alpha;                                                                        \
        if (!(rt_fabsf(alpha) >= 1e-20f)) {                                                                  \
            for (int c = 0; c < RT_N; ++c) {                                                                 \
                colour[c] = 0.0f;                                                                            \
                for (int k = 0; k < 4; ++k)                                                                  \
                    colour[c] += (float)corner[k][c] * weight[k];                                            \
            }                                                                                                \
            alpha = 1.0f;                                                                                    \
        }                                                                                                    \
        const float inverse = 1.0f / alpha;                                                                  \
        for (int c = 0; c < RT_N; ++c)                                                                       \
            out[c] = c == RT_A ? rt_store(alphaOut) : rt_store(colour[c] * inverse);                         \
    }

// The motion blur's rotation about the pivot (px, py) by the angle whose cosine and sine are c and s:
// rt_turn_in gives the source position that intermediate pixel (column, row) samples, rt_turn_out the
// intermediate position that destination pixel (x, y) samples. Positions are continuous indices (pixel i's
// centre at i), worked out from the pixel alone, never stepped, so that no pixel depends on the tile.
#define RT_BLUR_TURN_SOURCE                                                                                  \
    RT_BLUR_FUNCTION void rt_turn_in(double c, double s, double px, double py, int column, int row,          \
                                     double* x, double* y) {                                                 \
        const double mx = (double)column + 0.5 - px;                                                         \
        const double my = (double)row + 0.5 - py;                                                            \
        *x = (-s * my + px - 0.5) + c * mx;                                                                  \
        *y = (c * my + py - 0.5) + s * mx;                                                                   \
    }                                                                                                        \
    RT_BLUR_FUNCTION void rt_turn_out(double c, double s, double px, double py, int x, int y, double* sx,    \
                                      double* sy) {                                                          \
        const double my = (double)y + 0.5 - py;                                                              \
        const double mx = (double)x + 0.5 - px;                                                              \
        *sx = (s * my + px - 0.5) + c * mx;                                                                  \
        *sy = (c * my + py - 0.5) - s * mx;                                                                  \
    }

namespace RasterTools::Blur {

namespace Turn {
#define RT_BLUR_FUNCTION inline
RT_BLUR_TURN_SOURCE
#undef RT_BLUR_FUNCTION
} // namespace Turn

// The source above for the layer format F (which must have alpha).
template <Raster::PixelFormat F>
struct Math {
    static constexpr bool IsFloat = Raster::IsFloatFormat(F);
    static constexpr int Bytes = Raster::GetBytesPerComponent(F);
    using T = std::conditional_t<IsFloat, float, std::conditional_t<Bytes == 1, std::uint8_t, std::uint16_t>>;
    // Sums are exact integers for integer formats (at most 2^32 / 65535 terms) and doubles for floats.
    using ACC = std::conditional_t<IsFloat, double, std::uint32_t>;
    static constexpr int RT_N = Raster::GetChannelCount(F);
    static constexpr int RT_A = Raster::GetPixelFormatInfo(F).alphaIndex;
    static constexpr int RT_KIND = IsFloat ? 2 : Bytes == 1 ? 0 : 1;
    static constexpr float RT_MAX = IsFloat ? 1.0f : Bytes == 1 ? 255.0f : 65535.0f;
    static constexpr float RT_PSCALE = RT_KIND == 0 ? 255.0f : 1.0f;
    static_assert(RT_A >= 0 && RT_A < RT_N, "blurs need a format with alpha");

    // The devices' fmin, fmax and fabs for the values the source hands them (the second operand is never
    // NaN).
    static float rt_fminf(float a, float b) noexcept { return a < b ? a : b; }
    static float rt_fmaxf(float a, float b) noexcept { return a > b ? a : b; }
    static float rt_fabsf(float a) noexcept { return std::fabs(a); }

#define RT_BLUR_FUNCTION static
#define GLOBAL
    RT_BLUR_SOURCE
#undef GLOBAL
#undef RT_BLUR_FUNCTION
};

// The source as kernel text (one line; T, ACC, the RT_ constants, RT_BLUR_FUNCTION, GLOBAL, rt_fminf,
// rt_fmaxf and rt_fabsf left for the including text to define).
const char* GetBlurSourceText();
// The rotation source as kernel text (RT_BLUR_FUNCTION left to define).
const char* GetBlurTurnText();

} // namespace RasterTools::Blur
