#pragma once
// The vertical edge detect Sample stage for the processor (per pixel, and per span of 32 pixels with integer
// sums vectorised across components) and the command's kinds of render: one per layer format, source and
// destination alike, without or with a mask.

#include "pipeline/Pipeline.h"

#include <array>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <type_traits>

namespace RasterTools {

namespace EdgeDetectSpan {

// The gradient of n pixels of `channels` components whose rows above, at and below start at pixel x0 (pixel
// x0 - 1 and x0 + n readable in each): every component's |right column - left column| with weights 1, 2, 1,
// clamped to the component's range (float: unbounded), alpha (the last component) taken from row. Integer
// sums are exact, so they equal the accumulator's float sums; float sums keep the accumulation order.
// channels is 2, 4 or 5.
void Gradient(const std::uint8_t* above, const std::uint8_t* row, const std::uint8_t* below, int channels,
              int n, std::uint8_t* out) noexcept;
void Gradient(const std::uint16_t* above, const std::uint16_t* row, const std::uint16_t* below, int channels,
              int n, std::uint16_t* out) noexcept;
void Gradient(const float* above, const float* row, const float* below, int channels, int n,
              float* out) noexcept;

} // namespace EdgeDetectSpan

// The 3 × 3 horizontal gradient's taps in accumulation order, which the processor walks and the kernel text
// is generated from: (dx, dy, weight). The centre pixel is read after the first EdgeCentreAfter taps.
struct EdgeTap {
    int dx;
    int dy;
    float weight;
};
inline constexpr EdgeTap EdgeTaps[] = {{-1, -1, -1.0f}, {1, -1, 1.0f},  {-1, 0, -2.0f},
                                       {1, 0, 2.0f},    {-1, 1, -1.0f}, {1, 1, 1.0f}};
inline constexpr int EdgeCentreAfter = 3;

// The 3 × 3 horizontal gradient (-1 0 1 / -2 0 2 / -1 0 1) of every colour channel, its magnitude clamped by
// the format's rule and not normalised; the centre pixel's alpha stays.
struct EdgeDetectSampler {
    struct Params {};

    // A location moved by one, with the 32-bit wrap-around of the kernel text.
    static int Moved(int at, int offset) noexcept { return int(std::uint32_t(at) + std::uint32_t(offset)); }

    // One pixel, exactly as the kernel text does it: the accumulator starts at the minimum pixel (zero) and
    // takes the six weighted neighbours in a fixed order.
    template <class Transform, class Extend, class Image>
    static typename Image::Stored Sample(const Image& image, Raster::KernelMath::int2 location,
                                         const Raster::PreparedTransform<Transform>& t,
                                         const Params&) noexcept {
        constexpr Raster::PixelFormat F = Image::Format;
        using Component = Raster::FormatComponent<F>;
        constexpr int Channels = Raster::GetChannelCount(F);
        const auto read = [&](int dx, int dy) {
            const auto at = Raster::KernelMath::make_int2(Moved(location.x, dx), Moved(location.y, dy));
            const auto pixel = Extend::Read(image, Raster::TransformPixelCenterToInt<Transform>(at, t));
            Component components[Channels];
            std::memcpy(components, &pixel, sizeof components);
            return std::to_array(components);
        };
        float acc[Channels] = {};
        std::array<Component, Channels> initial{};
        for (int k = 0; k < int(std::size(EdgeTaps)); ++k) {
            if (k == EdgeCentreAfter) initial = read(0, 0);
            const EdgeTap tap = EdgeTaps[k];
            const auto p = read(tap.dx, tap.dy);
            for (int c = 0; c < Channels; ++c)
                acc[c] = tap.weight < 0.0f ? acc[c] - float(p[std::size_t(c)]) * -tap.weight
                                           : acc[c] + float(p[std::size_t(c)]) * tap.weight;
        }
        for (int c = 0; c < Channels - 1; ++c) { // the last channel is alpha
            const float magnitude = std::fabs(acc[c]);
            if constexpr (std::is_integral_v<Component>)
                initial[std::size_t(c)] = Component(std::fmin(magnitude, Raster::PixelTraits<F>::Maximum));
            else
                initial[std::size_t(c)] = magnitude;
        }
        typename Image::Stored result;
        std::memcpy(&result, initial.data(), sizeof result);
        return result;
    }

    // A span of up to 32 pixels under the identity transform: three row slices (through Extend at the
    // image's border) and the vectorised gradient. Other transforms go pixel by pixel.
    template <class Transform, class Extend, class Image>
    static void SampleSpan(const Image& image, const Raster::PreparedTransform<Transform>& t,
                           const Params& params, int x0, int y, int n, typename Image::Stored* out) noexcept {
        using Raster::KernelMath::make_int2;
        using Stored = typename Image::Stored;
        constexpr Raster::PixelFormat F = Image::Format;
        using Component = Raster::FormatComponent<F>;
        if constexpr (Raster::IsIdentityTransform<Transform>) {
            const Stored* rows[3];
            Stored padded[3][Raster::SpanLength + 2];
            const bool inside =
                y >= 1 && y + 1 < image.GetHeight() && x0 >= 1 && x0 + n + 1 <= image.GetWidth();
            for (int r = 0; r < 3; ++r) {
                if (inside) {
                    rows[r] = image.Row(y + r - 1) + x0;
                } else {
                    for (int i = 0; i < n + 2; ++i)
                        padded[r][i] = Extend::Read(image, make_int2(x0 - 1 + i, y + r - 1));
                    rows[r] = padded[r] + 1;
                }
            }
            EdgeDetectSpan::Gradient(reinterpret_cast<const Component*>(rows[0]),
                                     reinterpret_cast<const Component*>(rows[1]),
                                     reinterpret_cast<const Component*>(rows[2]), Raster::GetChannelCount(F),
                                     n, reinterpret_cast<Component*>(out));
        } else {
            for (int i = 0; i < n; ++i)
                out[i] = Sample<Transform, Extend>(image, make_int2(x0 + i, y), t, params);
        }
    }
};

namespace EdgeDetectStages {

// Border pixels take their missing neighbours from the nearest edge pixel (clamp to edge), so that the
// layer's own border is not seen as an edge.
template <Raster::PixelFormat F>
using Plain = PipelineStages<Raster::Copy, Raster::IdentityMask, EdgeDetectSampler, Raster::IdentityTransform,
                             Raster::Safe, FormatList<F>, FormatList<F>>;
template <Raster::PixelFormat F>
using Masked = PipelineStages<Raster::Copy, Raster::BitmapMask, EdgeDetectSampler, Raster::IdentityTransform,
                              Raster::Safe, FormatList<F>, FormatList<F>>;

} // namespace EdgeDetectStages

// The sampler's kernel text, per source format and language (null for an unknown language or a format that
// is not a layer format).
template <>
struct StageText<EdgeDetectSampler> {
    static const char* Get(HardwareKernelLanguage language, Raster::PixelFormat source);
};

} // namespace RasterTools

// One layer format's processor renders.
#define RT_INSTANTIATE_EDGE_DETECT(Format)                                                                   \
    RT_INSTANTIATE_PROCESSOR(RasterTools::EdgeDetectStages::Plain<Raster::PixelFormat::Format>, Format)      \
    RT_INSTANTIATE_PROCESSOR(RasterTools::EdgeDetectStages::Masked<Raster::PixelFormat::Format>, Format)
