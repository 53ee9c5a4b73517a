#pragma once
// The lighting tool: a drag places the light's centre (where it points); the light's kind, angles and the
// surface's response come from the panel.

#include "filters/distort/CentredTool.h"
#include "filters/lighting/Lighting.h"

namespace RasterTools {

class LightingTool final : public CentredTool<LightingFilter> {
public:
    explicit LightingTool(Kernel::NonCounted<DocumentController> controller);

    double GetAmbient() const noexcept { return m_Params.ambient; }
    void SetAmbient(double ambient);
    double GetDiffuse() const noexcept { return m_Params.diffuse; }
    void SetDiffuse(double diffuse);
    double GetSpecular() const noexcept { return m_Params.specular; }
    void SetSpecular(double specular);
    double GetShininess() const noexcept { return m_Params.shininess; }
    void SetShininess(double shininess);
    double GetDepth() const noexcept { return m_Params.depth; }
    void SetDepth(double depth);
    double GetBumpMapOpacity() const noexcept { return m_Params.bumpOpacity; }
    void SetBumpMapOpacity(double opacity);

private:
    // Bounds the parameters and refreshes the preview, as every setter does.
    void Changed();
};

} // namespace RasterTools
