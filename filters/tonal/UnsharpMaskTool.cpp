#include "filters/tonal/UnsharpMaskTool.h"

#include "filters/tonal/RasterUnsharpMaskCommand.h"
#include "frame/Registration.h"

namespace RasterTools {

namespace {
const ToolRegistration<UnsharpMaskTool> kRegistration;
}

UnsharpMaskTool::UnsharpMaskTool(Kernel::NonCounted<DocumentController> controller)
    : FilterTool(controller) {}

void UnsharpMaskTool::OnEndDrag(const ToolPointSpread& point) {
    Tool::OnEndDrag(point);
    DragTo(point);
}

void UnsharpMaskTool::MouseEntered() {
    FilterTool::MouseEntered();
}

void UnsharpMaskTool::MouseExited() {
    FilterTool::MouseExited();
}

} // namespace RasterTools
