#pragma once
// The motion blur tool: a drag sets the smear's length and direction, a click clears the length.

#include "filters/blur/MotionBlur.h"
#include "frame/FilterTool.h"

namespace RasterTools {

class MotionBlurTool final : public FilterTool<MotionBlurFilter> {
public:
    explicit MotionBlurTool(Kernel::NonCounted<DocumentController> controller);

    double GetRadius() const noexcept { return m_Params.radius; }
    void SetRadius(double radius) noexcept { m_Params.radius = radius; }
    double GetRadians() const noexcept { return m_Params.radians; }
    void SetRadians(double radians) noexcept { m_Params.radians = radians; }

    // The radius is the dragged distance and the angle the drag's direction, so the drag draws the motion.
    void OnDrag(const ToolPointSpread& point) override;
};

} // namespace RasterTools
