// The body of the motion blur's per-format render; included only by the files in instances/.
#include "filters/blur/BlurPixels.h"
#include "filters/blur/MotionBlurRender.h"
#include "host/kernel/Abort.h"

#include <algorithm>
#include <vector>

namespace RasterTools::MotionBlurRender {

// Side of the blocks that the two resamples walk, in pixels.
inline constexpr int Block = 64;

template <Raster::PixelFormat F>
RenderPath Run(const RenderTarget& target, const Kernel::RectT<int>& rect, const Plan& plan) {
    using L = Blur::Layout<F>;
    using T = typename L::T;
    using Acc = typename L::Acc;
    constexpr int N = L::N;
    const Raster::DynamicBuffer& source = *target.source.pixels;
    Raster::DynamicBuffer& destination = *target.destination.pixels;
    const Raster::DynamicBuffer* mask = target.mask ? target.mask.pixels.Get() : nullptr;
    const int reach = plan.Reach();
    const int width = plan.box.Width();
    const int height = plan.box.Height();
    const double c = plan.cosine, s = plan.sine, px = plan.pivotX, py = plan.pivotY;

    // Both scratch images live for this call only; the counted references free them on every way out.
    const Kernel::Counted<Raster::DynamicBuffer> rotated =
        Raster::DynamicBuffer::Create(width, height + 2 * reach, F);
    if (!rotated) return RenderPath::Failed;
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    const Kernel::Counted<Raster::DynamicBuffer> blurred = Raster::DynamicBuffer::Create(width, height, F);
    if (!blurred) return RenderPath::Failed;

    // 1. Resample the source into the rotated image. Every sample position is worked out from its own
    // intermediate coordinates, never stepped along the row, so a pixel's value does not depend on the tile.
    // Blocks of Block × Block pixels keep the source rows that a turned row crosses in the caches.
    for (int top = 0; top < rotated->GetHeight(); top += Block) {
        if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
        const int bottom = std::min(top + Block, rotated->GetHeight());
        for (int left = 0; left < width; left += Block) {
            const int right = std::min(left + Block, width);
            for (int row = top; row < bottom; ++row) {
                const double my = double(plan.box.top - reach + row) + 0.5 - py;
                const double baseX = -s * my + px - 0.5, baseY = c * my + py - 0.5;
                T* out = rotated->Row<T>(row);
                for (int i = left; i < right; ++i) {
                    const double mx = double(plan.box.left + i) + 0.5 - px;
                    Blur::SampleBilinear<F>(source, baseX + c * mx, baseY + s * mx, out + std::size_t(i) * N);
                }
            }
        }
    }
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;

    // 2. Blur down the columns: running premultiplied sums over 2·whole + 1 rows, so a pixel costs the same
    // whatever the radius; a fractional radius adds the two rows beyond at weight fraction. The sweep goes
    // row by row across all columns, so every write is a whole aligned row.
    const float weight = float(double(2 * plan.whole + 1) + 2.0 * double(plan.fraction));
    std::vector<Acc> sums(std::size_t(width) * N, Acc(0));
    std::vector<Acc> outer(plan.fraction > 0.0f ? std::size_t(width) * N : 0);
    for (int k = reach - plan.whole; k <= reach + plan.whole; ++k) {
        const T* in = rotated->Row<T>(k);
        for (int i = 0; i < width; ++i)
            L::Accumulate(&sums[std::size_t(i) * N], in + std::size_t(i) * N);
    }
    for (int row = 0; row < height; ++row) {
        if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
        const int centre = row + reach;
        if (row > 0) {
            const T* entering = rotated->Row<T>(centre + plan.whole);
            const T* leaving = rotated->Row<T>(centre - plan.whole - 1);
            for (int i = 0; i < width; ++i) {
                L::Accumulate(&sums[std::size_t(i) * N], entering + std::size_t(i) * N);
                L::Remove(&sums[std::size_t(i) * N], leaving + std::size_t(i) * N);
            }
        }
        if (!outer.empty()) {
            std::fill(outer.begin(), outer.end(), Acc(0));
            const T* above = rotated->Row<T>(centre - plan.whole - 1);
            const T* below = rotated->Row<T>(centre + plan.whole + 1);
            for (int i = 0; i < width; ++i) {
                L::Accumulate(&outer[std::size_t(i) * N], above + std::size_t(i) * N);
                L::Accumulate(&outer[std::size_t(i) * N], below + std::size_t(i) * N);
            }
        }
        T* out = blurred->Row<T>(row);
        for (int i = 0; i < width; ++i) {
            float total[N];
            for (int k = 0; k < N; ++k) {
                total[k] = float(sums[std::size_t(i) * N + std::size_t(k)]);
                if (!outer.empty())
                    total[k] += plan.fraction * float(outer[std::size_t(i) * N + std::size_t(k)]);
            }
            L::Resolve(total, weight, out + std::size_t(i) * N);
        }
    }
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;

    // 3. Resample the blurred image back into the destination through the inverse rotation, in blocks.
    const int channelMask = target.channelMask;
    for (int top = rect.top; top < rect.bottom; top += Block) {
        if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
        const int bottom = std::min(top + Block, rect.bottom);
        for (int left = rect.left; left < rect.right; left += Block) {
            const int right = std::min(left + Block, rect.right);
            for (int y = top; y < bottom; ++y) {
                const double my = double(y) + 0.5 - py;
                const double baseX = s * my + px - 0.5 - plan.box.left,
                             baseY = c * my + py - 0.5 - plan.box.top;
                T* out = destination.Row<T>(y);
                const T* original = source.Row<T>(y);
                const std::uint8_t* weights = mask ? mask->Row<std::uint8_t>(y) : nullptr;
                for (int x = left; x < right; ++x) {
                    const double mx = double(x) + 0.5 - px;
                    T value[N];
                    Blur::SampleBilinear<F>(*blurred, baseX + c * mx, baseY - s * mx, value);
                    T* pixel = out + std::size_t(x) * N;
                    if (weights && weights[x] != 255) {
                        const float w = float(weights[x]) / 255.0f;
                        const T* from = original + std::size_t(x) * N;
                        for (int k = 0; k < N; ++k)
                            value[k] = L::Store(float(from[k]) + (float(value[k]) - float(from[k])) * w);
                    }
                    for (int k = 0; k < N; ++k)
                        if (channelMask < 0 || (channelMask & Blur::ChannelBit<F>(k))) pixel[k] = value[k];
                }
            }
        }
    }
    return RenderPath::Processor;
}

} // namespace RasterTools::MotionBlurRender

#define RT_INSTANTIATE_MOTION_BLUR(FORMAT)                                                                   \
    template RasterTools::RenderPath RasterTools::MotionBlurRender::Run<Raster::PixelFormat::FORMAT>(        \
        const RasterTools::RenderTarget&, const Kernel::RectT<int>&,                                         \
        const RasterTools::MotionBlurRender::Plan&);
