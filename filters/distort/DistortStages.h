#pragma once
// The twirl and sphere Transform stages for the processor, a bilinear sampler that maps a whole span before
// it interpolates (so that the mapping vectorises across pixels), and the distortions' kinds of render: one
// per layer format, source and destination alike, without or with a mask.

#include "filters/distort/BilinearRGBA8.h"
#include "filters/distort/DistortMath.h"
#include "pipeline/Pipeline.h"

namespace RasterTools {

// A Transform stage whose block is four floats, read by a mapping of DistortMath.
template <Raster::KernelMath::float2 (*Map)(Raster::KernelMath::float2, const float*)>
struct DistortTransform {
    struct Params {
        float block[4] = {0.0f, 0.0f, 0.0f, 0.0f};
    };
    static Params Prepare(const Params& p) noexcept { return p; }
    static Raster::KernelMath::float2 Transform(Raster::KernelMath::float2 location,
                                                const Params& p) noexcept {
        return Map(location, p.block);
    }
};

// [centre x, centre y, angle in degrees, radius]
using TwirlTransform = DistortTransform<&DistortMath::TwirlMap>;
// [centre x, centre y, intensity / 100, radius]
using SphereTransform = DistortTransform<&DistortMath::SphereMap>;

namespace DistortStages {

// The view's affine (output pixels to source pixels), then the distortion in source pixels.
template <class Map>
using Chain = Raster::ChainedTransform<Raster::AffineTransform, Map>;

// The source locations of the 32 pixel centres from (x0, y), less half a pixel: one loop that the compiler
// vectorises. The twirl's and the sphere's are built for AVX2 and for any x86-64 (DistortSpans.cpp).
template <class Transform>
inline void MapSpanInline(const Raster::PreparedTransform<Transform>& t, int x0, int y, float* xs,
                          float* ys) noexcept {
    using namespace Raster::KernelMath;
    const float centreY = (float)y + 0.5f;
    for (int i = 0; i < Raster::SpanLength; ++i) {
        const float2 at = Transform::Transform(make_float2((float)(x0 + i) + 0.5f, centreY), t);
        xs[i] = at.x - 0.5f;
        ys[i] = at.y - 0.5f;
    }
}
void MapSpan(const Raster::PreparedTransform<Chain<TwirlTransform>>& t, int x0, int y, float* xs,
             float* ys) noexcept;
void MapSpan(const Raster::PreparedTransform<Chain<SphereTransform>>& t, int x0, int y, float* xs,
             float* ys) noexcept;

} // namespace DistortStages

// Bilinear sampling as Raster::BilinearSampler (whose kernel text it wraps), except that a location on a
// pixel centre reads that pixel as it is: the premultiplied round trip would move partly transparent pixels
// that the distortion leaves in place. The span's locations are transformed in one loop of their own before
// the reads.
struct SpanBilinearSampler {
    struct Params {};

    // flocation is a transformed pixel centre less half a pixel.
    template <class Extend, class Image>
    static typename Image::Stored At(const Image& image, Raster::KernelMath::float2 flocation) noexcept {
        using namespace Raster::KernelMath;
        int ix = rt_sat_int(flocation.x);
        if (flocation.x < 0.0f) ix -= 1;
        int iy = rt_sat_int(flocation.y);
        if (flocation.y < 0.0f) iy -= 1;
        if (flocation.x - (float)ix == 0.0f && flocation.y - (float)iy == 0.0f)
            return Extend::Read(image, make_int2(ix, iy));
        return Raster::BilinearSampler::Interpolate<Extend>(image, flocation);
    }

    template <class Transform, class Extend, class Image>
    static typename Image::Stored Sample(const Image& image, Raster::KernelMath::int2 location,
                                         const Raster::PreparedTransform<Transform>& t) noexcept {
        using namespace Raster::KernelMath;
        float2 flocation = Raster::TransformPixelCenterToFloat<Transform>(location, t);
        flocation -= 0.5f;
        return At<Extend>(image, flocation);
    }

    template <class Transform, class Extend, class Image>
    static void SampleSpan(const Image& image, const Raster::PreparedTransform<Transform>& t, const Params&,
                           int x0, int y, int n, typename Image::Stored* out) noexcept {
        using namespace Raster::KernelMath;
        alignas(64) float xs[Raster::SpanLength];
        alignas(64) float ys[Raster::SpanLength];
        // All 32 lanes, whatever n is: a fixed trip count; the extra lanes are never read.
        if constexpr (requires { DistortStages::MapSpan(t, x0, y, xs, ys); })
            DistortStages::MapSpan(t, x0, y, xs, ys);
        else
            DistortStages::MapSpanInline<Transform>(t, x0, y, xs, ys);
        int i = 0;
        if constexpr (Image::Format == Raster::PixelFormat::RGBA8 && std::is_same_v<Extend, Raster::Safe>) {
            for (; i + 4 <= n; i += 4)
                if (!BilinearRGBA8::SampleSafe4(image, xs + i, ys + i, out + i))
                    for (int k = i; k < i + 4; ++k)
                        out[k] = At<Extend>(image, make_float2(xs[k], ys[k]));
        }
        for (; i < n; ++i)
            out[i] = At<Extend>(image, make_float2(xs[i], ys[i]));
    }
};

namespace DistortStages {

// Edge pixels continue outwards, so that locations mapped beyond the image do not fade into transparency.
template <class Map, Raster::PixelFormat F>
using Plain = PipelineStages<Raster::Copy, Raster::IdentityMask, SpanBilinearSampler, Chain<Map>,
                             Raster::Safe, FormatList<F>, FormatList<F>>;
template <class Map, Raster::PixelFormat F>
using Masked = PipelineStages<Raster::Copy, Raster::BitmapMask, SpanBilinearSampler, Chain<Map>, Raster::Safe,
                              FormatList<F>, FormatList<F>>;

template <Raster::PixelFormat F>
using TwirlPlain = Plain<TwirlTransform, F>;
template <Raster::PixelFormat F>
using TwirlMasked = Masked<TwirlTransform, F>;
template <Raster::PixelFormat F>
using SpherePlain = Plain<SphereTransform, F>;
template <Raster::PixelFormat F>
using SphereMasked = Masked<SphereTransform, F>;

} // namespace DistortStages

// The kernel texts: the Transform stages over DistortMath's source, and the sampler's around the bilinear
// Sample.
template <>
struct StageText<TwirlTransform> {
    static const char* Get(HardwareKernelLanguage language);
};
template <>
struct StageText<SphereTransform> {
    static const char* Get(HardwareKernelLanguage language);
};
template <>
struct StageText<SpanBilinearSampler> {
    static const char* Get(HardwareKernelLanguage language);
};

} // namespace RasterTools

// One layer format's processor renders of a distortion (Twirl or Sphere).
#define RT_INSTANTIATE_DISTORT(Name, Format)                                                                 \
    RT_INSTANTIATE_PROCESSOR(RasterTools::DistortStages::Name##Plain<Raster::PixelFormat::Format>, Format)   \
    RT_INSTANTIATE_PROCESSOR(RasterTools::DistortStages::Name##Masked<Raster::PixelFormat::Format>, Format)
#define RT_INSTANTIATE_TWIRL(Format) RT_INSTANTIATE_DISTORT(Twirl, Format)
#define RT_INSTANTIATE_SPHERE(Format) RT_INSTANTIATE_DISTORT(Sphere, Format)
