// The blurs' pixel arithmetic as kernel text: the tokens of BlurMath.h, which the processor compiles, with
// the types of the format and the device's addressing.
#include "filters/blur/BlurKernelText.h"

#include "filters/blur/BlurMath.h"
#include "host/raster/KernelText.h"
#include "pipeline/DeviceSteps.h"

namespace RasterTools::Blur {

const char* GetBlurSourceText() {
    static const char* const text = RASTER_KERNEL_STRINGIFY(RT_BLUR_SOURCE);
    return text;
}

const char* GetBlurTurnText() {
    static const char* const text = RASTER_KERNEL_STRINGIFY(RT_BLUR_TURN_SOURCE);
    return text;
}

namespace {

// The component types of each kind; the arithmetic comes from BlurMath.h.
constexpr const char* TypesText = R"(
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
#define RT_BLUR_FUNCTION inline
)";

// Device addressing around the shared sampler.
constexpr const char* AccessText = R"(
// Pixel (x, y) of a grid whose pixel (left, top) is at pixels[0], x and y steps apart in pixels.
inline GLOBAL const T* rt_at(GLOBAL const T* pixels, int left, int top, rt_index xStep, rt_index yStep, int x,
                             int y) {
    return pixels + ((rt_index)(x - left) * xStep + (rt_index)(y - top) * yStep) * RT_N;
}

// Premultiplied bilinear sample at continuous index (x, y) (pixel i's centre at i), clamped to the grid's
// width × height pixels; a sample on a pixel centre copies that pixel.
inline void rt_sample_bilinear(GLOBAL const T* pixels, int left, int top, int width, int height,
                               rt_index xStep, rt_index yStep, double x, double y, T* out) {
    int cell[4];
    float fraction[2];
    if (rt_bilinear_cell(x, y, left, top, left + width - 1, top + height - 1, cell, fraction)) {
        GLOBAL const T* p = rt_at(pixels, left, top, xStep, yStep, cell[0], cell[1]);
        for (int c = 0; c < RT_N; ++c)
            out[c] = p[c];
        return;
    }
    rt_bilinear_mix(rt_at(pixels, left, top, xStep, yStep, cell[0], cell[1]),
                    rt_at(pixels, left, top, xStep, yStep, cell[2], cell[1]),
                    rt_at(pixels, left, top, xStep, yStep, cell[0], cell[3]),
                    rt_at(pixels, left, top, xStep, yStep, cell[2], cell[3]), fraction[0], fraction[1], out);
}
)";

} // namespace

std::string PixelsKernelText(Raster::HardwareKernelLanguage language, Raster::PixelFormat format) {
    const int alpha = Raster::GetPixelFormatInfo(format).alphaIndex;
    const int kind = Raster::IsFloatFormat(format) ? 2 : Raster::GetBytesPerComponent(format) == 1 ? 0 : 1;
    std::string text = DeviceStepsPrelude(language);
    text += "#define RT_N " + std::to_string(Raster::GetChannelCount(format)) + "\n#define RT_A " +
            std::to_string(alpha) + "\n#define RT_KIND " + std::to_string(kind) + "\n";
    text += TypesText;
    text += GetBlurSourceText();
    text += AccessText;
    return text;
}

} // namespace RasterTools::Blur
