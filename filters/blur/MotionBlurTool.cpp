#include "filters/blur/MotionBlurTool.h"

#include "filters/blur/RasterMotionBlurCommand.h"
#include "frame/Registration.h"

#include <cmath>
#include <numbers>

namespace RasterTools {

namespace {
const ToolRegistration<MotionBlurTool> kRegistration;
}

MotionBlurTool::MotionBlurTool(Kernel::NonCounted<DocumentController> controller)
    : FilterTool(controller) {}

void MotionBlurTool::OnDrag(const ToolPointSpread& point) {
    Tool::OnDrag(point);
    const Kernel::PointT<double> at = point.GetSpreadPoint();
    const double dx = at.x - m_DragOrigin.x, dy = at.y - m_DragOrigin.y;
    m_Params.radius = std::hypot(dx, dy) * MotionBlurFilter::kDragScale;
    // A drag that has not moved keeps the previous direction rather than snapping to 0.
    if (dx != 0.0 || dy != 0.0) {
        const double angle = std::atan2(dy, dx);
        m_Params.radians = angle < 0.0 ? angle + 2.0 * std::numbers::pi : angle; // within the panel's range
    }
    PostParametersChanged();
    Preview(false);
}

} // namespace RasterTools
