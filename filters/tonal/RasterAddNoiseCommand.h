#pragma once
// The add-noise command: adds uniform or gaussian noise to colour channels, never to alpha.

#include "filters/tonal/AddNoise.h"
#include "frame/FilterCommand.h"

namespace RasterTools {

class RasterAddNoiseCommand final : public FilterCommand<AddNoiseFilter> {
public:
    RasterAddNoiseCommand(bool liveEffect, double intensity, bool mono, bool gaussian);
    RasterAddNoiseCommand(bool liveEffect, const AddNoiseParameters& params);

    double GetIntensity() const noexcept { return m_Params.intensity; }
    bool GetMono() const noexcept { return m_Params.mono; }
    bool GetGaussian() const noexcept { return m_Params.gaussian; }

    bool GetLooksTerribleWhenPreviewingBecauseOfRetina() const override { return true; }
    bool CanAffectAlpha() const override { return false; }
    bool CanRequireInflation() const override { return false; }
    // Noise reads and writes exactly the output pixel.
    void PrepareInputRectangle(Kernel::RectT<double>&) const override {}
    bool PrepareOutputRectangle(Kernel::RectT<double>&) const override { return true; }

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

private:
    friend class FilterCommand<AddNoiseFilter>; // creates the default-constructed command for loading
    RasterAddNoiseCommand() = default;
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
