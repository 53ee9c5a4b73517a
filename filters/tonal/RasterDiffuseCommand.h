#pragma once
// The diffuse command: replaces each pixel by a randomly chosen neighbour (frosted glass).

#include "filters/tonal/Diffuse.h"
#include "frame/FilterCommand.h"

namespace RasterTools {

class RasterDiffuseCommand final : public FilterCommand<DiffuseFilter> {
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

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

private:
    friend class FilterCommand<DiffuseFilter>; // creates the default-constructed command for loading
    RasterDiffuseCommand() = default;
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
