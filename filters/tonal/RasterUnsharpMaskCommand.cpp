#include "filters/tonal/RasterUnsharpMaskCommand.h"

#include "frame/Registration.h"

#include <algorithm>
#include <cmath>

namespace RasterTools {

const Kernel::ClassProperties RasterUnsharpMaskCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RUSC"), &RasterUnsharpMaskCommand::CreateObject, 1,
    RasterUnsharpMaskCommand::__GetDefaultSerialisation(),
    &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

namespace {
const CommandRegistration<RasterUnsharpMaskCommand> kRegistration("RasterUnsharpMaskCommand");
}

RasterUnsharpMaskCommand::RasterUnsharpMaskCommand(bool liveEffect, double radius, double factor,
                                                   double threshold)
    : FilterCommand(liveEffect, UnsharpMaskParameters{radius, factor, threshold}) {}

RasterUnsharpMaskCommand::RasterUnsharpMaskCommand(bool liveEffect, const UnsharpMaskParameters& params)
    : FilterCommand(liveEffect, params) {}

int RasterUnsharpMaskCommand::GetMargin() const noexcept {
    // Radii are bounded far below the range of int; a hostile stream's value is clamped, not trusted.
    const double margin = std::ceil(std::clamp(m_Params.radius, 0.0, 1e6) / 3.0);
    return std::isfinite(margin) ? int(margin) : 0;
}

void RasterUnsharpMaskCommand::PrepareInputRectangle(Kernel::RectT<double>& rect) const {
    rect = rect.Inflated(GetMargin());
}

bool RasterUnsharpMaskCommand::PrepareOutputRectangle(Kernel::RectT<double>& rect) const {
    rect = rect.Inflated(GetMargin());
    return true;
}

} // namespace RasterTools
