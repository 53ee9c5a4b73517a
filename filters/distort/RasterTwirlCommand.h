#pragma once
// The twirl command: turns the pixels of a circle about its centre, by the full angle at the centre and less
// towards the rim.

#include "filters/distort/DistortCommand.h"
#include "filters/distort/Twirl.h"

namespace RasterTools {

class RasterTwirlCommand final : public DistortCommand<TwirlFilter, TwirlTransform> {
public:
    // For loading: Load then sets the fields.
    RasterTwirlCommand() = default;
    RasterTwirlCommand(bool liveEffect, double angle, double radius, Kernel::PointT<double> centre)
        : DistortCommand(liveEffect, TwirlParameters{angle, radius, centre}) {}
    RasterTwirlCommand(bool liveEffect, const TwirlParameters& params)
        : DistortCommand(liveEffect, params) {}

    double GetAngle() const noexcept { return m_Params.angle; }

    // The Transform stage's third float: the angle in degrees.
    static float StrengthOf(const TwirlParameters& params) noexcept { return float(params.angle); }
};

} // namespace RasterTools
