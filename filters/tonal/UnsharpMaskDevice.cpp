// The unsharp mask's device steps: the same sums in the same order as the processor's two passes.
#include "filters/tonal/UnsharpMaskDevice.h"

#include "filters/blur/BlurKernelText.h"
#include "pipeline/DeviceSteps.h"

namespace RasterTools::UnsharpMaskDevice {

namespace {

constexpr const char* StepsText = R"(
// Step 1: the Gaussian across the rows that step 2 reads, premultiplied, edges repeated. Work item (i, row)
// is column left + i of image row top - margin + row, clamped into the image.
KERNEL(unsharp_mask_across)(GLOBAL const T* source, int width, int height, GLOBAL const float* taps,
                            int margin, GLOBAL float* across, int left, int top, int columns, int rows) {
    const int i = GLOBAL_X, row = GLOBAL_Y;
    if (i >= columns || row >= rows) return;
    int y = top - margin + row;
    y = y < 0 ? 0 : (y > height - 1 ? height - 1 : y);
    float sum[RT_N];
    for (int c = 0; c < RT_N; ++c)
        sum[c] = 0.0f;
    for (int k = 0; k <= 2 * margin; ++k) {
        int x = left + i - margin + k;
        x = x < 0 ? 0 : (x > width - 1 ? width - 1 : x);
        GLOBAL const T* p = source + ((rt_index)y * width + x) * RT_N;
        for (int c = 0; c < RT_N; ++c)
            sum[c] += taps[k] * rt_premultiplied(p, c);
    }
    GLOBAL float* to = across + ((rt_index)row * columns + i) * RT_N;
    for (int c = 0; c < RT_N; ++c)
        to[c] = sum[c];
}

// Step 2: the Gaussian down the columns, then source + factor × (source - blur) on premultiplied values
// where the difference exceeds the threshold; alpha is the source's. Work item (i, j) is pixel
// (left + i, top + j).
KERNEL(unsharp_mask_sharpen)(GLOBAL const float* across, GLOBAL const float* taps, int margin,
                             GLOBAL const T* source, GLOBAL T* dest, int width, GLOBAL const uchar* mask,
                             int maskWidth, int hasMask, int left, int top, int columns, int rows,
                             float factor, float threshold, int channelMask) {
    const int i = GLOBAL_X, j = GLOBAL_Y;
    if (i >= columns || j >= rows) return;
    float blur[RT_N];
    for (int c = 0; c < RT_N; ++c)
        blur[c] = 0.0f;
    for (int k = 0; k <= 2 * margin; ++k) {
        GLOBAL const float* q = across + ((rt_index)(j + k) * columns + i) * RT_N;
        for (int c = 0; c < RT_N; ++c)
            blur[c] += taps[k] * q[c];
    }
    const int x = left + i, y = top + j;
    const rt_index at = ((rt_index)y * width + x) * RT_N;
    T value[RT_N];
    rt_sharpen(source + at, blur, factor, threshold, value);
    rt_write_masked(value, source + at, hasMask ? (int)mask[(rt_index)y * maskWidth + x] : 255, channelMask,
                    dest + at);
}
)";

struct Kernels {
    DeviceKernelText across, sharpen;
};

Kernels Build(Raster::HardwareKernelLanguage language, Raster::PixelFormat format) {
    const std::string text = Blur::PixelsKernelText(language, format) + StepsText;
    return {{text, "unsharp_mask_across"}, {text, "unsharp_mask_sharpen"}};
}

DeviceKernelTable<Kernels> Programs(Build);

} // namespace

std::vector<DeviceKernelText> GetKernelTexts(Raster::HardwareKernelLanguage language,
                                             Raster::PixelFormat format) {
    const Kernels kernels = Build(language, format);
    return {kernels.across, kernels.sharpen};
}

bool KernelsReady(const RenderTarget& target, bool wait) {
    const Kernels* kernels = Programs.Find(target);
    return kernels &&
           DeviceKernelsReady(target.device.Get(), {&kernels->across, &kernels->sharpen}, wait, target.abort);
}

bool Run(const RenderTarget& target, const Kernel::RectT<int>& rect, const UnsharpMaskRender::Plan& plan) {
    if (!Raster::ShouldExecuteKernel(rect) || !KernelsReady(target, false)) return false;
    const Kernels& kernels = *Programs.Find(target);
    const Raster::PixelFormat format = target.destination.pixels->GetFormat();
    const Raster::DynamicBuffer& source = *target.source.pixels;
    const int margin = plan.Margin();
    const int columns = rect.Width(), rows = rect.Height() + 2 * margin;

    DeviceSteps steps(target, rect);
    if (!steps) return false;
    const auto taps = steps.Table(plan.taps.data(), int(plan.taps.size()));
    const auto across = steps.Scratch(columns, rows, Raster::GetChannelCount(format) * int(sizeof(float)));
    if (!taps || !across) return false;

    Raster::HardwareKernelArguments first;
    first.AddBuffer(steps.Source()).AddInt(source.GetWidth()).AddInt(source.GetHeight()).AddBuffer(taps);
    first.AddInt(margin).AddBuffer(across).AddInt(rect.left).AddInt(rect.top).AddInt(columns).AddInt(rows);
    if (!steps.Run(kernels.across, columns, rows, first)) return false;

    // The threshold in stored units, as the processor compares it.
    const float threshold = plan.threshold * (Raster::IsFloatFormat(format)               ? 1.0f
                                              : Raster::GetBytesPerComponent(format) == 1 ? 255.0f
                                                                                          : 65535.0f);
    Raster::HardwareKernelArguments second;
    second.AddBuffer(across).AddBuffer(taps).AddInt(margin).AddBuffer(steps.Source());
    second.AddBuffer(steps.Destination()).AddInt(source.GetWidth()).AddBuffer(steps.Mask());
    second.AddInt(target.mask ? target.mask.pixels->GetWidth() : 0).AddInt(target.mask ? 1 : 0);
    second.AddInt(rect.left).AddInt(rect.top).AddInt(columns).AddInt(rect.Height()).AddFloat(plan.factor);
    second.AddFloat(threshold).AddInt(target.channelMask);
    return steps.Run(kernels.sharpen, columns, rect.Height(), second) && steps.Finish();
}

} // namespace RasterTools::UnsharpMaskDevice
