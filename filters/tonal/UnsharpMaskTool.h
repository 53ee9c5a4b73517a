#pragma once
// The unsharp-mask tool: a drag sets the blur radius, a click clears it.

#include "filters/tonal/UnsharpMask.h"
#include "frame/FilterTool.h"

namespace RasterTools {

class UnsharpMaskTool final : public FilterTool<UnsharpMaskFilter> {
public:
    explicit UnsharpMaskTool(Kernel::NonCounted<DocumentController> controller);

    double GetRadius() const noexcept { return m_Params.radius; }
    void SetRadius(double radius) noexcept { m_Params.radius = radius; }
    double GetFactor() const noexcept { return m_Params.factor; }
    void SetFactor(double factor) noexcept { m_Params.factor = factor; }
    double GetThreshold() const noexcept { return m_Params.threshold; }
    void SetThreshold(double threshold) noexcept { m_Params.threshold = threshold; }

    void OnEndDrag(const ToolPointSpread& point) override;
    void MouseEntered() override;
    void MouseExited() override;
};

} // namespace RasterTools
