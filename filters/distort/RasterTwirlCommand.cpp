#include "filters/distort/RasterTwirlCommand.h"

#include "frame/Registration.h"

namespace RasterTools {

const Kernel::ClassProperties RasterTwirlCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RTwC"), &RasterTwirlCommand::CreateObject, 1,
    RasterTwirlCommand::__GetDefaultSerialisation(),
    &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

namespace {
const FilterRegistration<TwirlFilter> kRegistration;
}

RasterTwirlCommand::RasterTwirlCommand(bool liveEffect, double angle, double radius,
                                       Kernel::PointT<double> centre)
    : DistortCommand(liveEffect, TwirlParameters{angle, radius, centre}) {}

RasterTwirlCommand::RasterTwirlCommand(bool liveEffect, const TwirlParameters& params)
    : DistortCommand(liveEffect, params) {}

} // namespace RasterTools
