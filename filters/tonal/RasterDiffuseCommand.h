#pragma once
// The diffuse command: replaces each pixel by a randomly chosen neighbour (frosted glass).

#include "filters/tonal/Diffuse.h"
#include "filters/tonal/DiffuseStages.h"
#include "frame/SinglePassCommand.h"

#include <cmath>

namespace RasterTools {

class RasterDiffuseCommand final : public SinglePassCommand<DiffuseFilter> {
public:
    template <Raster::PixelFormat F>
    using PlainStages = DiffuseStages::Plain<F>;
    template <Raster::PixelFormat F>
    using MaskedStages = DiffuseStages::Masked<F>;

    // For loading: Load then sets the fields.
    RasterDiffuseCommand() = default;
    RasterDiffuseCommand(bool liveEffect, double intensity)
        : SinglePassCommand(liveEffect, DiffuseParameters{intensity}) {}
    RasterDiffuseCommand(bool liveEffect, const DiffuseParameters& params)
        : SinglePassCommand(liveEffect, params) {}

    double GetIntensity() const noexcept { return m_Params.intensity; }

    bool GetLooksTerribleWhenPreviewingBecauseOfRetina() const override { return true; }
    // The chosen neighbour's alpha comes along.
    bool CanAffectAlpha() const override { return true; }
    // A pixel reads neighbours up to 512 × intensity away; the written area grows by as much.
    static double Margin(const DiffuseParameters& params) noexcept { return params.intensity * 512.0; }

    // The sampler block for a raster of the given bounds (document units) seen through view (raster pixels
    // to the view): the inverse of view as the sampler affine (a singular view collapses, see
    // Raster::AffineTransform::Invert), sigma = intensity × the view's scale, the bounds' width truncated.
    DiffuseSampler::Params GetSamplerParams(const Kernel::RectT<double>& bounds,
                                            const Raster::AffineTransform::Params& view) const noexcept {
        const auto inverse = Raster::AffineTransform::Invert(view).m;
        DiffuseSampler::Params params;
        for (int i = 0; i < 6; ++i)
            params.block[DiffuseSampler::AffineIndex + i] = float(inverse[std::size_t(i)]);
        // The scatter distance follows the view's scale: the length of the view's image of (1, 1), over √2.
        const auto& m = view.m;
        const double scale = std::sqrt(((m[0] + m[1]) * (m[0] + m[1]) + (m[3] + m[4]) * (m[3] + m[4])) * 0.5);
        params.block[DiffuseSampler::SigmaIndex] = float(m_Params.intensity * scale);
        params.block[DiffuseSampler::WidthIndex] = NoiseGenerator::TruncatedWidth(bounds.left, bounds.right);
        return params;
    }

    template <class StageParams>
    void FillStageParams(StageParams& params, const Kernel::RectT<double>& bounds,
                         const Raster::AffineTransform::Params& view) const noexcept {
        params.sampler = GetSamplerParams(bounds, view);
    }
};

} // namespace RasterTools
