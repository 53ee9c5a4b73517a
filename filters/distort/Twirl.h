#pragma once
// The twirl filter's parameters, declared once for its tool and command.

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

#include <limits>

namespace RasterTools {

class TwirlTool;
class RasterTwirlCommand;

// A centre whose coordinates are not numbers is unset: renders place it at the middle of the raster's bounds
// (the command line's default). Tools always place it.
inline constexpr Kernel::PointT<double> UnsetCentre{std::numeric_limits<double>::quiet_NaN(),
                                                    std::numeric_limits<double>::quiet_NaN()};
// How far from the origin a centre may be typed.
inline constexpr double CentreLimit = 1e6;
// The largest radius accepted: wider than any layer from any centre within reach, and small enough that the
// mappings' squares stay far from the single-precision range (1e12 against 3.4e38).
inline constexpr double RadiusLimit = 1e6;

struct TwirlParameters {
    double angle = 0.0;                          // degrees of turn at the centre, falling to 0 at the radius
    double radius = 128.0;                       // of the affected circle, document pixels
    Kernel::PointT<double> centre = UnsetCentre; // document coordinates
};

struct TwirlFilter {
    using Params = TwirlParameters;
    using Tool = TwirlTool;
    using Command = RasterTwirlCommand;

    static constexpr std::string_view kName = "twirl";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterTwirlCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RTwC"); // in documents
    static constexpr std::string_view kToolClass = "TwirlTool";              // empty: no tool
    static constexpr std::string_view kDescription = "Twirl";
    static constexpr std::string_view kHint = "|DRAG| to set twirl centre.";
    static constexpr ToolID kToolID = ToolID::Twirl;
    static constexpr double kDragScale = 0.0; // a drag moves the centre

    // Turns both ways, wider than the image and off-centre, for the conformance tests.
    static constexpr std::array<Params, 3> kSamples{{
        {90.0, 20.0, {10.25, 7.75}},
        {-300.0, 50.0, {30.0, 20.0}},
        {45.0, 12.0, {-4.5, 3.0}},
    }};

    static constexpr std::array<Parameter<Params>, 3> kParameters{{
        {{.name = "angle",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Angl"),
          .reflected = Kernel::MakeFourCC("angl"),
          .toolLabel = "Angle",
          .commandLabel = "Twirl",
          .minimum = -720.0,
          .maximum = 720.0,
          .defaultValue = 0.0,
          .unit = Kernel::UnitKind::Degrees,
          .settingsName = "twirl"},
         &Params::angle},
        // The radius is reflected as "inte": panels and scripts already know it by that identifier.
        {{.name = "radius",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Radi"),
          .reflected = Kernel::MakeFourCC("inte"),
          .toolLabel = "Radius",
          .commandLabel = "Radius",
          .minimum = 0.0,
          .maximum = 1024.0,
          .defaultValue = 128.0,
          .unit = Kernel::UnitKind::Pixels,
          .hardMaximum = RadiusLimit},
         &Params::radius},
        {{.name = "centre",
          .type = ParameterType::Point,
          .code = Kernel::MakeFourCC("Orin"),
          .reflected = Kernel::MakeFourCC("cntr"),
          .toolLabel = "Centre",
          .commandLabel = "Centre",
          .minimum = -CentreLimit,
          .maximum = CentreLimit,
          .defaultValue = UnsetCentre,
          .persisted = false,
          .labelContext = "Twirl tool reflection"},
         &Params::centre},
    }};
};

} // namespace RasterTools
