#pragma once
// The sphere filter's parameters, declared once for its tool and command.

#include "filters/distort/Twirl.h"

namespace RasterTools {

class SphereTool;
class RasterSphereCommand;

struct SphereParameters {
    // Percent, -100 to 100: positive bulges, negative pinches. Half strength by default, so that the tool
    // shows a sphere as soon as it is picked.
    double intensity = 50.0;
    double radius = 128.0;                       // of the sphere, document pixels
    Kernel::PointT<double> centre = UnsetCentre; // document coordinates
};

struct SphereFilter {
    using Params = SphereParameters;
    using Tool = SphereTool;
    using Command = RasterSphereCommand;

    static constexpr std::string_view kName = "sphere";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterSphereCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RSpC"); // in documents
    static constexpr std::string_view kToolClass = "SphereTool";             // empty: no tool
    static constexpr std::string_view kDescription = "Sphere";
    static constexpr std::string_view kHint = "|DRAG| to set sphere centre.";
    static constexpr ToolID kToolID = ToolID::Sphere;
    static constexpr double kDragScale = 0.0; // a drag moves the centre

    // Bulges and pinches, off-centre and wider than the image, for the conformance tests.
    static constexpr std::array<Params, 3> kSamples{{
        {50.0, 20.0, {10.25, 7.75}},
        {-60.0, 40.0, {25.0, 12.0}},
        {100.0, 9.0, {18.0, 14.0}},
    }};

    // No settings: the sphere tool starts from these each time.
    static constexpr std::array<Parameter<Params>, 3> kParameters{{
        {{.name = "intensity",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Inte"),
          .reflected = Kernel::MakeFourCC("inte"),
          .toolLabel = "Intensity",
          .commandLabel = "Intensity",
          .minimum = -100.0,
          .maximum = 100.0,
          .defaultValue = 50.0,
          .unit = Kernel::UnitKind::Percent,
          .persisted = false},
         &Params::intensity},
        {{.name = "radius",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Radi"),
          .reflected = Kernel::MakeFourCC("radi"),
          .toolLabel = "Radius",
          .commandLabel = "Radius",
          .minimum = 0.0,
          .maximum = 1024.0,
          .defaultValue = 128.0,
          .unit = Kernel::UnitKind::Pixels,
          .persisted = false,
          .hardMaximum = RadiusLimit},
         &Params::radius},
        {{.name = "centre",
          .type = ParameterType::Point,
          .code = Kernel::MakeFourCC("Orig"),
          .reflected = Kernel::MakeFourCC("cntr"),
          .toolLabel = "Centre",
          .commandLabel = "Centre",
          .minimum = -CentreLimit,
          .maximum = CentreLimit,
          .defaultValue = UnsetCentre,
          .persisted = false},
         &Params::centre},
    }};
};

} // namespace RasterTools
