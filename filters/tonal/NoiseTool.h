#pragma once
// The add-noise tool: a drag sets the noise intensity, a click clears it.

#include "filters/tonal/AddNoise.h"
#include "frame/FilterTool.h"

namespace RasterTools {

class NoiseTool final : public FilterTool<AddNoiseFilter> {
public:
    explicit NoiseTool(Kernel::NonCounted<DocumentController> controller);

    double GetIntensity() const noexcept { return m_Params.intensity; }
    void SetIntensity(double intensity) noexcept { m_Params.intensity = intensity; }
    bool GetMono() const noexcept { return m_Params.mono; }
    void SetMono(bool mono) noexcept { m_Params.mono = mono; }
    bool GetGaussian() const noexcept { return m_Params.gaussian; }
    void SetGaussian(bool gaussian) noexcept { m_Params.gaussian = gaussian; }

    // Unlike its siblings, the noise tool wraps pixel previews in a preview command and ignores final.
    void Preview(bool final) override;
};

} // namespace RasterTools
