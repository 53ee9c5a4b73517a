#include "filters/distort/RasterSphereCommand.h"

#include "frame/Registration.h"

namespace RasterTools {

const Kernel::ClassProperties RasterSphereCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RSpC"), &RasterSphereCommand::CreateObject, 1,
    RasterSphereCommand::__GetDefaultSerialisation(),
    &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

namespace {
const FilterRegistration<SphereFilter> kRegistration;
}

RasterSphereCommand::RasterSphereCommand(bool liveEffect, double intensity, double radius,
                                         Kernel::PointT<double> centre)
    : DistortCommand(liveEffect, SphereParameters{intensity, radius, centre}) {}

RasterSphereCommand::RasterSphereCommand(bool liveEffect, const SphereParameters& params)
    : DistortCommand(liveEffect, params) {}

} // namespace RasterTools
