#pragma once
// The sphere command: bulges (positive intensity) or pinches (negative) the pixels of a circle, as if
// seen through a lens; the rim stays in place.

#include "filters/distort/DistortCommand.h"
#include "filters/distort/Sphere.h"

namespace RasterTools {

class RasterSphereCommand final : public DistortCommand<SphereFilter, SphereTransform> {
public:
    // For loading: Load then sets the fields.
    RasterSphereCommand() = default;
    RasterSphereCommand(bool liveEffect, double intensity, double radius, Kernel::PointT<double> centre)
        : DistortCommand(liveEffect, SphereParameters{intensity, radius, centre}) {}
    RasterSphereCommand(bool liveEffect, const SphereParameters& params)
        : DistortCommand(liveEffect, params) {}

    double GetIntensity() const noexcept { return m_Params.intensity; }

    // The Transform stage's third float: intensity / 100.
    static float StrengthOf(const SphereParameters& params) noexcept {
        return float(params.intensity / 100.0);
    }
};

} // namespace RasterTools
