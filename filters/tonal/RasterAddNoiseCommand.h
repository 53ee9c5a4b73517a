#pragma once
// The add-noise command: adds uniform or gaussian noise to colour channels, never to alpha.

#include "filters/tonal/AddNoise.h"
#include "filters/tonal/NoiseStages.h"
#include "frame/SinglePassCommand.h"

namespace RasterTools {

class RasterAddNoiseCommand final : public SinglePassCommand<AddNoiseFilter> {
public:
    template <Raster::PixelFormat F>
    using PlainStages = NoiseStages::Plain<F>;
    template <Raster::PixelFormat F>
    using MaskedStages = NoiseStages::Masked<F>;

    // For loading: Load then sets the fields.
    RasterAddNoiseCommand() = default;
    RasterAddNoiseCommand(bool liveEffect, double intensity, bool mono, bool gaussian)
        : SinglePassCommand(liveEffect, AddNoiseParameters{intensity, mono, gaussian}) {}
    RasterAddNoiseCommand(bool liveEffect, const AddNoiseParameters& params)
        : SinglePassCommand(liveEffect, params) {}

    double GetIntensity() const noexcept { return m_Params.intensity; }
    bool GetMono() const noexcept { return m_Params.mono; }
    bool GetGaussian() const noexcept { return m_Params.gaussian; }

    bool GetLooksTerribleWhenPreviewingBecauseOfRetina() const override { return true; }
    bool CanAffectAlpha() const override { return false; }
    bool CanRequireInflation() const override { return false; }
    // Noise reads and writes exactly the output pixel: no Margin, the area answers are the base's.

    // The sampler block for a raster of the given bounds (document units) seen through view (raster pixels
    // to the view): the inverse of view as the sampler affine (a singular view gives the zero linear part
    // and the negated translation), sigma, the bounds' width truncated, mono and gaussian.
    NoiseSampler::Params GetSamplerParams(const Kernel::RectT<double>& bounds,
                                          const Raster::AffineTransform::Params& view) const noexcept {
        using namespace NoiseGenerator;
        // Uniform noise is scaled down so that its spread is comparable to the gaussian's at equal intensity.
        constexpr double UniformSpread = 0.341;
        const auto inverse = Raster::AffineTransform::Invert(view).m;
        NoiseSampler::Params params;
        for (int i = 0; i < 6; ++i)
            params.block[AffineIndex + i] = float(inverse[std::size_t(i)]);
        params.block[SigmaIndex] = float((m_Params.gaussian ? 1.0 : UniformSpread) * m_Params.intensity);
        params.block[WidthIndex] = TruncatedWidth(bounds.left, bounds.right);
        params.block[MonoIndex] = m_Params.mono ? 1.0f : 0.0f;
        params.block[GaussianIndex] = m_Params.gaussian ? 1.0f : 0.0f;
        return params;
    }

    template <class StageParams>
    void FillStageParams(StageParams& params, const Kernel::RectT<double>& bounds,
                         const Raster::AffineTransform::Params& view) const noexcept {
        params.sampler = GetSamplerParams(bounds, view);
    }
};

} // namespace RasterTools
