#pragma once
// The sphere tool: a drag places the sphere's centre; the radius and intensity come from the panel.

#include "filters/distort/CentredTool.h"
#include "filters/distort/Sphere.h"

namespace RasterTools {

class SphereTool final : public CentredTool<SphereFilter> {
public:
    explicit SphereTool(Kernel::NonCounted<DocumentController> controller);

    double GetIntensity() const noexcept { return m_Params.intensity; }
    void SetIntensity(double intensity) noexcept { m_Params.intensity = intensity; }
    double GetRadius() const noexcept { return m_Params.radius; }
    void SetRadius(double radius) noexcept { m_Params.radius = radius; }

    // The panel shows the radius, then the intensity; the centre is placed on the canvas only.
    Kernel::ReflectedList EnumerateReflecteds() override;
};

} // namespace RasterTools
