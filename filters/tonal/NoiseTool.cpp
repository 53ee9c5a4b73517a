#include "filters/tonal/NoiseTool.h"

#include "filters/tonal/RasterAddNoiseCommand.h"
#include "frame/Registration.h"

namespace RasterTools {

namespace {
const ToolRegistration<NoiseTool> kRegistration;
}

NoiseTool::NoiseTool(Kernel::NonCounted<DocumentController> controller)
    : FilterTool(controller) {}

void NoiseTool::Preview(bool) {
    Kernel::Counted<Command> command = MakeCommand();
    if (GetEditingLiveEffect()) {
        EnqueueCommand(std::move(command), false);
        return;
    }
    EnqueueCommand(Kernel::Counted<Command>(new PreviewCommand(std::move(command), false, true)), false);
}

} // namespace RasterTools
