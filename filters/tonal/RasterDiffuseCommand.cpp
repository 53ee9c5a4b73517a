#include "filters/tonal/RasterDiffuseCommand.h"

#include "frame/Registration.h"

#include <cmath>

namespace RasterTools {

const Kernel::ClassProperties RasterDiffuseCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RDf2"), &RasterDiffuseCommand::CreateObject, 1,
    RasterDiffuseCommand::__GetDefaultSerialisation(),
    &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

namespace {
const CommandRegistration<RasterDiffuseCommand> kRegistration("RasterDiffuseCommand");
}

RasterDiffuseCommand::RasterDiffuseCommand(bool liveEffect, double intensity)
    : FilterCommand(liveEffect, DiffuseParameters{intensity}) {}

RasterDiffuseCommand::RasterDiffuseCommand(bool liveEffect, const DiffuseParameters& params)
    : FilterCommand(liveEffect, params) {}

void RasterDiffuseCommand::PrepareInputRectangle(Kernel::RectT<double>& rect) const {
    rect = rect.Inflated(std::ceil(m_Params.intensity * 512.0));
}

bool RasterDiffuseCommand::PrepareOutputRectangle(Kernel::RectT<double>& rect) const {
    rect = rect.Inflated(m_Params.intensity * 512.0);
    return true;
}

} // namespace RasterTools
