#pragma once
// The diffuse command: replaces each pixel by a randomly chosen neighbour (frosted glass).

#include "filters/tonal/Diffuse.h"
#include "filters/tonal/DiffuseStages.h"
#include "frame/FilterCommand.h"
#include "pipeline/PipelineCommand.h"

namespace RasterTools {

class RasterDiffuseCommand final : public FilterCommand<DiffuseFilter>, public PipelineCommand {
public:
    RasterDiffuseCommand(bool liveEffect, double intensity);
    RasterDiffuseCommand(bool liveEffect, const DiffuseParameters& params);

    double GetIntensity() const noexcept { return m_Params.intensity; }

    bool GetLooksTerribleWhenPreviewingBecauseOfRetina() const override { return true; }
    // The chosen neighbour's alpha comes along.
    bool CanAffectAlpha() const override { return true; }
    // A pixel reads neighbours up to 512 × intensity away: every side grows by that, rounded up.
    void PrepareInputRectangle(Kernel::RectT<double>& rect) const override;
    // The written area grows by the same distance, unrounded.
    bool PrepareOutputRectangle(Kernel::RectT<double>& rect) const override;

    // The sampler block for a raster of the given bounds (document units) seen through view (raster pixels
    // to the view): the inverse of view as the sampler affine (a singular view collapses, see
    // Raster::AffineTransform::Invert), sigma = intensity × the view's scale, the bounds' width truncated.
    DiffuseSampler::Params GetSamplerParams(const Kernel::RectT<double>& bounds,
                                            const Raster::AffineTransform::Params& view) const noexcept;

    // Renders on the device or the processor, for every layer format (source and destination alike).
    RenderPath Render(const RenderTarget& target) const override;
    bool PrepareDevice(const RenderTarget& target) const override;
    // The whole raster (cut to the selection) on the processor.
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override;

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

private:
    friend class FilterCommand<DiffuseFilter>; // creates the default-constructed command for loading
    RasterDiffuseCommand() = default;
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
