#include "filters/tonal/DiffuseTool.h"

#include "filters/tonal/RasterDiffuseCommand.h"
#include "frame/Registration.h"

namespace RasterTools {

namespace {
const ToolRegistration<DiffuseTool> kRegistration;
}

DiffuseTool::DiffuseTool(Kernel::NonCounted<DocumentController> controller)
    : FilterTool(controller) {}

void DiffuseTool::OnEndDrag(const ToolPointSpread& point) {
    Tool::OnEndDrag(point);
    DragTo(point);
}

} // namespace RasterTools
