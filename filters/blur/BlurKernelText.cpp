// The blurs' pixel arithmetic as kernel text: the same operations in the same order as BlurPixels.h, so
// that the device's pixels equal the processor's.
#include "filters/blur/BlurKernelText.h"

#include "pipeline/DeviceSteps.h"

namespace RasterTools::Blur {

namespace {

constexpr const char* PixelsText = R"(
#if RT_KIND == 0
typedef uchar T;
typedef uint ACC;
#define RT_MAX 255.0f
#define RT_PSCALE 255.0f
#elif RT_KIND == 1
typedef ushort T;
typedef uint ACC;
#define RT_MAX 65535.0f
#define RT_PSCALE 1.0f
#else
typedef float T;
typedef double ACC;
#define RT_MAX 1.0f
#define RT_PSCALE 1.0f
#endif

// Colour c of a pixel whose alpha is a, premultiplied: 8-bit sums hold colour × alpha, 16-bit ones colour ×
// alpha / 65535 in integers (the colour itself where alpha is full), floats the product.
inline ACC rt_premultiply(T c, T a) {
#if RT_KIND == 0
    return (ACC)c * (ACC)a;
#elif RT_KIND == 1
    return a < 65535 ? (ACC)c * (ACC)a / 65535u : (ACC)c;
#else
    return (ACC)(c * a);
#endif
}

// Adds (sign 1) or removes (sign -1) pixel p's premultiplied components.
inline void rt_accumulate(ACC* sum, GLOBAL const T* p) {
    for (int c = 0; c < RT_N; ++c)
        sum[c] += c == RT_A ? (ACC)p[RT_A] : rt_premultiply(p[c], p[RT_A]);
}
inline void rt_remove(ACC* sum, GLOBAL const T* p) {
    for (int c = 0; c < RT_N; ++c)
        sum[c] -= c == RT_A ? (ACC)p[RT_A] : rt_premultiply(p[c], p[RT_A]);
}

// Rounds half up after clamping to the range; NaN gives 0, as on the processor.
inline T rt_store(float v) {
#if RT_KIND == 2
    return v;
#else
    return (T)(int)(rt_fminf(rt_fmaxf(v, 0.0f), RT_MAX) + 0.5f);
#endif
}

// The write-mask bit of component k: grey answers to any of red, green and blue.
inline int rt_channel_bit(int k) {
    return RT_N == 2 ? (k == 0 ? 7 : 8) : 1 << k;
}

// Pixel (x, y) of a grid whose pixel (left, top) is at pixels[0], x and y steps apart in pixels.
inline GLOBAL const T* rt_at(GLOBAL const T* pixels, int left, int top, rt_index xStep, rt_index yStep, int x,
                             int y) {
    return pixels + ((rt_index)(x - left) * xStep + (rt_index)(y - top) * yStep) * RT_N;
}

// Premultiplied bilinear sample at continuous index (x, y) (pixel i's centre at i), clamped to the grid's
// width × height pixels; a sample on a pixel centre copies that pixel.
inline void rt_sample_bilinear(GLOBAL const T* pixels, int left, int top, int width, int height,
                               rt_index xStep, rt_index yStep, double x, double y, T* out) {
    const int lastX = left + width - 1, lastY = top + height - 1;
    x = x < (double)left ? (double)left : ((double)lastX < x ? (double)lastX : x);
    y = y < (double)top ? (double)top : ((double)lastY < y ? (double)lastY : y);
    const int x0 = (int)floor(x), y0 = (int)floor(y);
    const float fx = (float)(x - (double)x0), fy = (float)(y - (double)y0);
    GLOBAL const T* p[4];
    p[0] = rt_at(pixels, left, top, xStep, yStep, x0, y0);
    if (fx == 0.0f && fy == 0.0f) {
        for (int c = 0; c < RT_N; ++c)
            out[c] = p[0][c];
        return;
    }
    const int x1 = x0 + 1 < lastX ? x0 + 1 : lastX, y1 = y0 + 1 < lastY ? y0 + 1 : lastY;
    p[1] = rt_at(pixels, left, top, xStep, yStep, x1, y0);
    p[2] = rt_at(pixels, left, top, xStep, yStep, x0, y1);
    p[3] = rt_at(pixels, left, top, xStep, yStep, x1, y1);
    float weight[4];
    weight[0] = (1.0f - fx) * (1.0f - fy);
    weight[1] = fx * (1.0f - fy);
    weight[2] = (1.0f - fx) * fy;
    weight[3] = fx * fy;
    float alpha = 0.0f;
    float colour[RT_N];
    for (int c = 0; c < RT_N; ++c)
        colour[c] = 0.0f;
    for (int k = 0; k < 4; ++k) {
        const float a = (float)p[k][RT_A] * weight[k];
        alpha += a;
        for (int c = 0; c < RT_N; ++c)
            colour[c] += (float)p[k][c] * a;
    }
    const float alphaOut = alpha;
    // Where every neighbour is transparent the colour has no weight; the plain average keeps it defined.
    if (!(rt_fabsf(alpha) >= 1e-20f)) {
        for (int c = 0; c < RT_N; ++c) {
            colour[c] = 0.0f;
            for (int k = 0; k < 4; ++k)
                colour[c] += (float)p[k][c] * weight[k];
        }
        alpha = 1.0f;
    }
    const float inverse = 1.0f / alpha;
    for (int c = 0; c < RT_N; ++c)
        out[c] = c == RT_A ? rt_store(alphaOut) : rt_store(colour[c] * inverse);
}
)";

} // namespace

std::string PixelsKernelText(Raster::HardwareKernelLanguage language, Raster::PixelFormat format) {
    const int alpha = Raster::GetPixelFormatInfo(format).alphaIndex;
    const int kind = Raster::IsFloatFormat(format) ? 2 : Raster::GetBytesPerComponent(format) == 1 ? 0 : 1;
    std::string text = DeviceStepsPrelude(language);
    text += "#define RT_N " + std::to_string(Raster::GetChannelCount(format)) + "\n#define RT_A " +
            std::to_string(alpha) + "\n#define RT_KIND " + std::to_string(kind) + "\n";
    text += PixelsText;
    return text;
}

} // namespace RasterTools::Blur
