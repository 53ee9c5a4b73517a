#include "filters/distort/SphereTool.h"

#include "filters/distort/RasterSphereCommand.h"
#include "frame/Registration.h"

#include <algorithm>

namespace RasterTools {

namespace {
const ToolRegistration<SphereTool> kRegistration;
}

SphereTool::SphereTool(Kernel::NonCounted<DocumentController> controller)
    : CentredTool(controller) {}

Kernel::ReflectedList SphereTool::EnumerateReflecteds() {
    Kernel::ReflectedList list = CentredTool::EnumerateReflecteds();
    const auto find = [&](Kernel::FourCC code) {
        return std::find_if(list.begin(), list.end(),
                            [&](const Kernel::Counted<Kernel::Reflected>& property) {
                                return property->GetIdentifier() == code;
                            });
    };
    if (const auto centre = find(Kernel::MakeFourCC("cntr")); centre != list.end()) list.erase(centre);
    const auto intensity = find(Kernel::MakeFourCC("inte")), radius = find(Kernel::MakeFourCC("radi"));
    if (intensity != list.end() && radius != list.end() && radius > intensity)
        std::rotate(intensity, radius, radius + 1);
    return list;
}

} // namespace RasterTools
