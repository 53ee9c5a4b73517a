#include "filters/distort/TwirlTool.h"

#include "filters/distort/RasterTwirlCommand.h"
#include "frame/Registration.h"

namespace RasterTools {

namespace {
const ToolRegistration<TwirlTool> kRegistration;
}

TwirlTool::TwirlTool(Kernel::NonCounted<DocumentController> controller)
    : CentredTool(controller) {}

} // namespace RasterTools
