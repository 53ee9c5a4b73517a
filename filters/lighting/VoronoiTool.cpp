#include "filters/lighting/VoronoiTool.h"

#include "filters/lighting/RasterVoronoiCommand.h"
#include "frame/Registration.h"

namespace RasterTools {

namespace {
const ToolRegistration<VoronoiTool> kRegistration;
}

VoronoiTool::VoronoiTool(Kernel::NonCounted<DocumentController> controller)
    : FilterTool(controller) {}

void VoronoiTool::OnEndDrag(const ToolPointSpread& point) {
    Tool::OnEndDrag(point);
    DragTo(point);
}

} // namespace RasterTools
