#pragma once
// The diffuse command: replaces each pixel by a randomly chosen neighbour (frosted glass).

#include "filters/tonal/Diffuse.h"
#include "filters/tonal/DiffuseStages.h"
#include "frame/SinglePassCommand.h"

namespace RasterTools {

class RasterDiffuseCommand final : public SinglePassCommand<DiffuseFilter> {
public:
    template <Raster::PixelFormat F>
    using PlainStages = DiffuseStages::Plain<F>;
    template <Raster::PixelFormat F>
    using MaskedStages = DiffuseStages::Masked<F>;

    RasterDiffuseCommand(bool liveEffect, double intensity);
    RasterDiffuseCommand(bool liveEffect, const DiffuseParameters& params);

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
                                            const Raster::AffineTransform::Params& view) const noexcept;

    template <class StageParams>
    void FillStageParams(StageParams& params, const Kernel::RectT<double>& bounds,
                         const Raster::AffineTransform::Params& view) const noexcept {
        params.sampler = GetSamplerParams(bounds, view);
    }

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

private:
    friend class FilterCommand<DiffuseFilter>; // creates the default-constructed command for loading
    RasterDiffuseCommand() = default;
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
