#include "filters/tonal/RasterAddNoiseCommand.h"

#include "frame/Registration.h"

namespace RasterTools {

const Kernel::ClassProperties RasterAddNoiseCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RANC"), &RasterAddNoiseCommand::CreateObject, 1,
    RasterAddNoiseCommand::__GetDefaultSerialisation(),
    &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

namespace {
const CommandRegistration<RasterAddNoiseCommand> kRegistration("RasterAddNoiseCommand");
}

RasterAddNoiseCommand::RasterAddNoiseCommand(bool liveEffect, double intensity, bool mono, bool gaussian)
    : FilterCommand(liveEffect, AddNoiseParameters{intensity, mono, gaussian}) {}

RasterAddNoiseCommand::RasterAddNoiseCommand(bool liveEffect, const AddNoiseParameters& params)
    : FilterCommand(liveEffect, params) {}

} // namespace RasterTools
