// The body of the unsharp mask's per-format render; included only by the files in instances/.
#include "filters/blur/BlurPixels.h"
#include "filters/tonal/UnsharpMaskRender.h"
#include "host/kernel/Abort.h"

#include <algorithm>
#include <cmath>

namespace RasterTools::UnsharpMaskRender {

template <Raster::PixelFormat F>
RenderPath Run(const RenderTarget& target, const Kernel::RectT<int>& rect, const Plan& plan) {
    using L = Blur::Layout<F>;
    using T = typename L::T;
    constexpr int N = L::N;
    const Raster::DynamicBuffer& source = *target.source.pixels;
    Raster::DynamicBuffer& destination = *target.destination.pixels;
    const Raster::DynamicBuffer* mask = target.mask ? target.mask.pixels.Get() : nullptr;
    const int margin = plan.Margin();
    const int width = rect.Width();
    const int rows = rect.Height() + 2 * margin;
    const int lastX = source.GetWidth() - 1, lastY = source.GetHeight() - 1;

    // Horizontal pass over the rows the vertical pass reads, premultiplied, edges repeated. Premultiplied
    // sources are worked out once per pixel of the source's strip.
    std::vector<float> across(std::size_t(width) * std::size_t(rows) * N);
    std::vector<float> strip(std::size_t(width + 2 * margin) * N);
    for (int row = 0; row < rows; ++row) {
        if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
        const T* in = source.Row<T>(std::clamp(rect.top - margin + row, 0, lastY));
        for (int i = 0; i < width + 2 * margin; ++i) {
            const T* p = in + std::size_t(std::clamp(rect.left - margin + i, 0, lastX)) * N;
            for (int c = 0; c < N; ++c)
                strip[std::size_t(i) * N + c] = L::M::rt_premultiplied(p, c);
        }
        float* out = &across[std::size_t(row) * std::size_t(width) * N];
        for (int i = 0; i < width; ++i) {
            float sum[N] = {};
            for (int k = 0; k <= 2 * margin; ++k)
                for (int c = 0; c < N; ++c)
                    sum[c] += plan.taps[std::size_t(k)] * strip[std::size_t(i + k) * N + c];
            std::copy_n(sum, N, out + std::size_t(i) * N);
        }
    }

    // Vertical pass, then source + factor × (source − blur) on premultiplied values where the difference
    // exceeds the threshold; alpha is the source's.
    const float threshold = plan.threshold * L::Max;
    for (int y = rect.top; y < rect.bottom; ++y) {
        if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
        const T* in = source.Row<T>(y);
        T* out = destination.Row<T>(y);
        const std::uint8_t* weights = mask ? mask->Row<std::uint8_t>(y) : nullptr;
        const float* column = &across[std::size_t(y - rect.top) * std::size_t(width) * N];
        for (int i = 0; i < width; ++i) {
            float blur[N] = {};
            for (int k = 0; k <= 2 * margin; ++k)
                for (int c = 0; c < N; ++c)
                    blur[c] += plan.taps[std::size_t(k)] *
                               column[(std::size_t(k) * std::size_t(width) + std::size_t(i)) * N + c];
            const int x = rect.left + i;
            const T* p = in + std::size_t(x) * N;
            // The straight source plus the straightened difference: exact where the difference vanishes,
            // although 16-bit premultiplication rounds.
            T value[N];
            L::M::rt_sharpen(p, blur, plan.factor, threshold, value);
            L::M::rt_write_masked(value, p, weights ? weights[x] : 255, target.channelMask,
                                  out + std::size_t(x) * N);
        }
    }
    return RenderPath::Processor;
}

} // namespace RasterTools::UnsharpMaskRender

#define RT_INSTANTIATE_UNSHARP_MASK(FORMAT)                                                                  \
    template RasterTools::RenderPath RasterTools::UnsharpMaskRender::Run<Raster::PixelFormat::FORMAT>(       \
        const RasterTools::RenderTarget&, const Kernel::RectT<int>&,                                         \
        const RasterTools::UnsharpMaskRender::Plan&);
