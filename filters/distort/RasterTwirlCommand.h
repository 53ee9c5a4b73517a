#pragma once
// The twirl command: turns the pixels of a circle about its centre, by the full angle at the centre and less
// towards the rim.

#include "filters/distort/DistortCommand.h"
#include "filters/distort/Twirl.h"

namespace RasterTools {

class RasterTwirlCommand final : public DistortCommand<TwirlFilter, TwirlTransform> {
public:
    RasterTwirlCommand(bool liveEffect, double angle, double radius, Kernel::PointT<double> centre);
    RasterTwirlCommand(bool liveEffect, const TwirlParameters& params);

    double GetAngle() const noexcept { return m_Params.angle; }

    // The Transform stage's third float: the angle in degrees.
    static float StrengthOf(const TwirlParameters& params) noexcept { return float(params.angle); }

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

private:
    friend class FilterCommand<TwirlFilter>; // creates the default-constructed command for loading
    RasterTwirlCommand() = default;
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
