#pragma once
// The diffuse Sample stage for the processor (per pixel, and per span of 32 pixels) and the diffuse
// command's kinds of render: one per layer format, source and destination alike, without or with a mask.

#include "filters/tonal/NoiseGenerator.h"
#include "pipeline/Pipeline.h"

#include <cmath>
#include <cstdint>

namespace RasterTools {

// Replaces the pixel by a source pixel at most 512 × sigma away on each axis, chosen by two draws of the
// noise generator seeded by the pixel's place under the sampler affine. The whole pixel, alpha included,
// comes through the extend stage; nothing is blended.
struct DiffuseSampler {
    // The sampler block's eight floats, by index.
    enum Index : int {
        AffineIndex = 0, // six: x' = x*p0 + y*p1 + p2, y' = x*p3 + y*p4 + p5 (as the noise generator reads)
        SigmaIndex = 6,  // intensity × the view's scale
        WidthIndex = 7,  // the raster's width, for the seed
        FloatCount = 8,
    };
    static_assert(int(SigmaIndex) == int(NoiseGenerator::SigmaIndex) &&
                      int(WidthIndex) == int(NoiseGenerator::WidthIndex),
                  "the seed is read from the generator's places");

    struct Params {
        float block[FloatCount] = {1.0f, 0.0f, 0.0f, 0.0f, 1.0f, 0.0f, 0.0f, 0.0f};
    };

    // One pixel, with the generator's DiffuseMoved as the kernel text calls it.
    template <class Transform, class Extend, class Image>
    static typename Image::Stored Sample(const Image& image, Raster::KernelMath::int2 location,
                                         const Raster::PreparedTransform<Transform>& t,
                                         const Params& params) noexcept {
        using namespace NoiseGenerator;
        const Raster::KernelMath::int2 at = Raster::TransformPixelCenterToInt<Transform>(location, t);
        const Raster::KernelMath::int2 moved = DiffuseMoved(location, at, params.block);
        return Extend::Read(image, Raster::TransformPixelCenterToInt<Transform>(moved, t));
    }

    // A span of up to 32 pixels: seeds and draws across pixels (NoiseGenerator's span kernels), then one read
    // per pixel. Under the identity transform only, and only for offsets and places small enough that the
    // shortcuts below are exact; elsewhere pixel by pixel.
    template <class Transform, class Extend, class Image>
    static void SampleSpan(const Image& image, const Raster::PreparedTransform<Transform>& t,
                           const Params& params, int x0, int y, int n, typename Image::Stored* out) noexcept {
        using namespace NoiseGenerator;
        using Raster::KernelMath::make_int2;
        if constexpr (Raster::IsIdentityTransform<Transform>) {
            const float sigma = params.block[SigmaIndex];
            // Offsets below 2^22 need no saturation (a plain truncation, which vectorises), and the moved
            // coordinates, below 2^23, survive the identity's round trip through (v + 0.5) in float.
            constexpr float Small = 4194304.0f; // 2^22
            constexpr int Near = 1 << 21;
            if (std::fabs(sigma) * 512.0f < Small && x0 > -Near && x0 < Near && y > -Near && y < Near) {
                alignas(64) std::uint32_t seeds[SpanPixels];
                alignas(64) float draws[2][SpanPixels];
                alignas(64) int xs[SpanPixels], ys[SpanPixels];
                SpanDiffuseSeeds(x0, y, params.block, seeds);
                SpanUnitDraws(seeds, 2, draws);
                for (int i = 0; i < SpanPixels; ++i) {
                    xs[i] = x0 + i + int((draws[0][i] * 1024.0f - 512.0f) * sigma);
                    ys[i] = y + int((draws[1][i] * 1024.0f - 512.0f) * sigma);
                }
                for (int i = 0; i < n; ++i)
                    out[i] = Extend::Read(image, make_int2(xs[i], ys[i]));
                return;
            }
        }
        for (int i = 0; i < n; ++i)
            out[i] = Sample<Transform, Extend>(image, make_int2(x0 + i, y), t, params);
    }
};

namespace DiffuseStages {

// Edge pixels continue outwards: a neighbour chosen beyond the layer is the nearest edge pixel, so the
// border does not scatter transparency into the image.
template <Raster::PixelFormat F>
using Plain = PipelineStages<Raster::Copy, Raster::IdentityMask, DiffuseSampler, Raster::IdentityTransform,
                             Raster::Safe, FormatList<F>, FormatList<F>>;
template <Raster::PixelFormat F>
using Masked = PipelineStages<Raster::Copy, Raster::BitmapMask, DiffuseSampler, Raster::IdentityTransform,
                              Raster::Safe, FormatList<F>, FormatList<F>>;

} // namespace DiffuseStages

// The sampler's kernel text (the same for every format).
template <>
struct StageText<DiffuseSampler> {
    static const char* Get(HardwareKernelLanguage language);
};

} // namespace RasterTools

// One layer format's processor renders.
#define RT_INSTANTIATE_DIFFUSE(Format)                                                                       \
    RT_INSTANTIATE_PROCESSOR(RasterTools::DiffuseStages::Plain<Raster::PixelFormat::Format>, Format)         \
    RT_INSTANTIATE_PROCESSOR(RasterTools::DiffuseStages::Masked<Raster::PixelFormat::Format>, Format)
