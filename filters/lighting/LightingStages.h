#pragma once
// The lighting Sample stage for the processor and the lighting command's kinds of render: one per layer
// format, source and destination alike, without or with a mask.

#include "filters/lighting/LightingMath.h"
#include "pipeline/Conversions.h"
#include "pipeline/Pipeline.h"

#include <algorithm>

namespace RasterTools {

// Lights the source pixel (read through Transform and Extend, in the working pixel) by LightingMath's model.
// The heights above, below, left and right of the height position come from the render's sampler image, a
// bump map of one float per pixel, when it has one; otherwise the layer is its own height map (its
// luminance). Outside either the height is 0, so that the relief slopes to 0 at its border.
struct LightingSampler {
    // The sampler block (see LightingMath's indices): no lights and identity affines by default.
    struct Params {
        float block[LightingMath::BlockFloats] = {
            1.0f, 1.0f, 1.0f, 1.0f, 1.0f,       // ambient colour and amount
            1.0f, 1.0f, 1.0f, 1.0f, 0.0f,       // specular colour and amount
            1.0f, 0.0f, 0.0f, 0.0f, 1.0f, 0.0f, // surface affine
            1.0f, 0.0f, 0.0f, 0.0f, 1.0f, 0.0f, // height-map affine
            1.0f, 0.0f, 0.0f, 0.0f};            // diffuse, normal z, sense, light count
    };

    template <class Image>
    static float HeightAt(const Image& image, Raster::KernelMath::int2 at) noexcept {
        if (at.x < 0 || at.y < 0 || at.x >= image.GetWidth() || at.y >= image.GetHeight()) return 0.0f;
        return LightingMath::LightingLuminance(ToWorking<Image::Format>(image.Row(at.y)[at.x]));
    }

    static float BumpHeightAt(const Raster::DynamicBuffer& bump, Raster::KernelMath::int2 at) noexcept {
        if (at.x < 0 || at.y < 0 || at.x >= bump.GetWidth() || at.y >= bump.GetHeight()) return 0.0f;
        return reinterpret_cast<const float*>(bump.RowBytes(at.y))[at.x];
    }

    // One pixel, exactly as the kernel text does it; bump is the sampler image (null: none).
    template <class Transform, class Extend, class Image>
    static typename Image::Stored Sample(const Image& image, Raster::KernelMath::int2 location,
                                         const Raster::PreparedTransform<Transform>& t, const Params& params,
                                         const Raster::DynamicBuffer* bump = nullptr) noexcept {
        using namespace LightingMath;
        const float* p = params.block;
        const float2 v = LightingSurface(location, p);
        float4 n = make_float4(0.0f, 0.0f, 1.0f, 0.0f);
        const auto height = [&](float dx, float dy) {
            const int2 at = LightingBumpAt(v, dx, dy, p);
            return bump ? BumpHeightAt(*bump, at) : HeightAt(image, at);
        };
        if (p[LightingNormalZ] != 0.0f)
            n = LightingNormal(height(0.0f, -1.0f), height(0.0f, 1.0f), height(-1.0f, 0.0f),
                               height(1.0f, 0.0f), p);
        float4 lit, shine;
        LightingShade(v, n, p, &lit, &shine);
        const auto pixel = Extend::Read(image, Raster::TransformPixelCenterToInt<Transform>(location, t));
        return FromWorking<Image::Format>(LightingLit(ToWorking<Image::Format>(pixel), lit, shine));
    }

    // Whether both affines are the identity, so that a pixel's height position is its own location.
    static bool MapsOntoItself(const float* p) noexcept {
        const float identity[6] = {1.0f, 0.0f, 0.0f, 0.0f, 1.0f, 0.0f};
        for (int i = 0; i < 6; ++i)
            if (p[LightingMath::LightingSurfaceAffine + i] != identity[i] ||
                p[LightingMath::LightingBumpAffine + i] != identity[i])
                return false;
        return true;
    }

    // A span of up to 32 pixels: where the pixels are their own height positions, the heights of the rows
    // above, at and below are taken once each (every height serves four neighbours) and every step of the
    // model runs for the whole span at once, so that it vectorises; the same functions in the same order as
    // Sample's, so the pixels are Sample's. Otherwise, and over a bump map, pixel by pixel.
    template <class Transform, class Extend, class Image>
    static void SampleSpan(const Image& image, const Raster::PreparedTransform<Transform>& t,
                           const Params& params, const Raster::DynamicBuffer* bump, int x0, int y, int n,
                           typename Image::Stored* out) noexcept {
        using namespace LightingMath;
        const float* p = params.block;
        if (bump || !Raster::IsIdentityTransform<Transform> || !MapsOntoItself(p)) {
            for (int i = 0; i < n; ++i)
                out[i] = Sample<Transform, Extend>(image, make_int2(x0 + i, y), t, params, bump);
            return;
        }
        constexpr int Span = Raster::SpanLength;
        const bool relief = p[LightingNormalZ] != 0.0f;
        float heights[3][Span + 2];
        if (relief)
            for (int r = 0; r < 3; ++r) {
                // HeightAt for a row, in a loop without exits.
                const int row = y - 1 + r;
                if (row < 0 || row >= image.GetHeight()) {
                    std::fill_n(heights[r], n + 2, 0.0f);
                    continue;
                }
                const auto* pixels = image.Row(row);
                const int width = image.GetWidth();
#pragma omp simd
                for (int i = 0; i < n + 2; ++i) {
                    const int x = x0 - 1 + i;
                    const bool inside = x >= 0 && x < width;
                    const float h = LightingLuminance(ToWorking<Image::Format>(pixels[inside ? x : 0]));
                    heights[r][i] = inside ? h : 0.0f;
                }
            }
        // Each step for every pixel of the span at once, light after light, in LightingShade's order.
        alignas(64) float2 v[Span];
        alignas(64) float4 normal[Span];
#pragma omp simd
        for (int i = 0; i < n; ++i)
            v[i] = LightingSurface(make_int2(x0 + i, y), p);
        if (relief) {
#pragma omp simd
            for (int i = 0; i < n; ++i)
                normal[i] =
                    LightingNormal(heights[0][i + 1], heights[2][i + 1], heights[1][i], heights[1][i + 2], p);
        } else {
            std::fill_n(normal, n, make_float4(0.0f, 0.0f, 1.0f, 0.0f));
        }
        alignas(64) float sums[8][Span] = {};
        const int count = rt_sat_int(p[LightingLightCount]);
        for (int l = 0; l < count; ++l) {
            const float* light = p + LightingFirstLight + LightingLightFloats * l;
            const float type = light[LightingLightType];
            if (type != 0.0f && type != 1.0f && type != 2.0f) continue;
            alignas(64) float ta[Span], rz[Span], factor[Span], fixed[Span], power[Span], base[Span];
            if (type == 2.0f) {
#pragma omp simd
                for (int i = 0; i < n; ++i)
                    factor[i] = LightingDirectionalTerms(normal[i], light, &ta[i], &rz[i], &fixed[i]);
            } else {
                const int cone = type == 0.0f;
#pragma omp simd
                for (int i = 0; i < n; ++i) {
                    fixed[i] = 0.0f;
                    factor[i] = LightingPointTerms(v[i], normal[i], light, cone, &ta[i], &rz[i]);
                }
            }
            // LightingPower's squarings, for every pixel at once.
            for (int i = 0; i < n; ++i) {
                power[i] = 1.0f;
                base[i] = rz[i];
            }
            for (int e = rt_sat_int(light[LightingLightExponent]); e > 0; e >>= 1) {
                if (e & 1)
#pragma omp simd
                    for (int i = 0; i < n; ++i)
                        power[i] = power[i] * base[i];
#pragma omp simd
                for (int i = 0; i < n; ++i)
                    base[i] = base[i] * base[i];
            }
            const float* c = light + LightingLightColour;
#pragma omp simd
            for (int i = 0; i < n; ++i) {
                const float tb = LightingSpecularTerm(rz[i], power[i], factor[i], fixed[i]);
                for (int k = 0; k < 4; ++k) {
                    sums[k][i] = sums[k][i] + c[k] * ta[i];
                    sums[4 + k][i] = sums[4 + k][i] + c[k] * tb;
                }
            }
        }
        alignas(64) float4 working[Span];
        for (int i = 0; i < n; ++i)
            working[i] = ToWorking<Image::Format>(Extend::Read(image, make_int2(x0 + i, y)));
#pragma omp simd
        for (int i = 0; i < n; ++i) {
            float4 lit, shine;
            LightingFinish(sums[0][i], sums[1][i], sums[2][i], sums[3][i], sums[4][i], sums[5][i], sums[6][i],
                           sums[7][i], p, &lit, &shine);
            working[i] = LightingLit(working[i], lit, shine);
        }
        for (int i = 0; i < n; ++i)
            out[i] = FromWorking<Image::Format>(working[i]);
    }
};

namespace LightingStages {

// Reads beyond the layer are transparent black; the height reads make their own border (0).
template <Raster::PixelFormat F>
using Plain = PipelineStages<Raster::Copy, Raster::IdentityMask, LightingSampler, Raster::IdentityTransform,
                             Raster::Zero, FormatList<F>, FormatList<F>>;
template <Raster::PixelFormat F>
using Masked = PipelineStages<Raster::Copy, Raster::BitmapMask, LightingSampler, Raster::IdentityTransform,
                              Raster::Zero, FormatList<F>, FormatList<F>>;

} // namespace LightingStages

// The sampler's kernel text: per source format and language (null for an unknown language or a format that
// is not a layer format).
template <>
struct StageText<LightingSampler> {
    static const char* Get(HardwareKernelLanguage language, Raster::PixelFormat source);
};

} // namespace RasterTools

// One layer format's processor renders.
#define RT_INSTANTIATE_LIGHTING(Format)                                                                      \
    RT_INSTANTIATE_PROCESSOR(RasterTools::LightingStages::Plain<Raster::PixelFormat::Format>, Format)        \
    RT_INSTANTIATE_PROCESSOR(RasterTools::LightingStages::Masked<Raster::PixelFormat::Format>, Format)
