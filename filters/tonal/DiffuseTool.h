#pragma once
// The diffuse tool: a drag sets how far pixels scatter, a click clears it.

#include "filters/tonal/Diffuse.h"
#include "frame/FilterTool.h"

namespace RasterTools {

class DiffuseTool final : public FilterTool<DiffuseFilter> {
public:
    explicit DiffuseTool(Kernel::NonCounted<DocumentController> controller);

    double GetIntensity() const noexcept { return m_Params.intensity; }
    void SetIntensity(double intensity) noexcept { m_Params.intensity = intensity; }

    // The end of a drag sets the intensity like every step of it.
    void OnEndDrag(const ToolPointSpread& point) override;
};

} // namespace RasterTools
