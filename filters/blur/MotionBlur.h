#pragma once
// The motion blur's parameters, declared once for its tool and command.

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

namespace RasterTools {

class MotionBlurTool;
class RasterMotionBlurCommand;

struct MotionBlurParameters {
    double radius = 0.0;  // length of the smear on each side of a pixel, in document units
    double radians = 0.0; // direction of the motion (0: along rows, pi/2: along columns)
};

struct MotionBlurFilter {
    using Params = MotionBlurParameters;
    using Tool = MotionBlurTool;
    using Command = RasterMotionBlurCommand;

    static constexpr std::string_view kName = "motionblur";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterMotionBlurCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RMoB"); // in documents
    static constexpr std::string_view kToolClass = "MotionBlurTool";         // empty: no tool
    static constexpr std::string_view kDescription = "Motion Blur";
    static constexpr std::string_view kHint = "|DRAG| to set radius and direction. |CLICK| to reset.";
    static constexpr ToolID kToolID = ToolID::MotionBlur;
    // The drag shows the motion: its length is the radius, its direction the angle.
    static constexpr double kDragScale = 1.0;

    // The fractional blur, the whole-radius blur at an oblique angle and at a quarter turn, and a smear
    // longer than the image, for the conformance tests.
    static constexpr std::array<Params, 4> kSamples{{
        {2.5, 0.5},
        {16.0, 0.5236},
        {7.0, 1.5707963267948966},
        {45.0, 2.0},
    }};

    static constexpr std::array<Parameter<Params>, 2> kParameters{{
        {{.name = "radius",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Radi"),
          .reflected = Kernel::MakeFourCC("radi"),
          .toolLabel = "Radius",
          .commandLabel = "Radius",
          .minimum = 0.0,
          .maximum = 500.0,
          .defaultValue = 0.0},
         &Params::radius},
        {{.name = "radians",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Angl"),
          .reflected = Kernel::MakeFourCC("angl"),
          .toolLabel = "Angle",
          .commandLabel = "Angle",
          .minimum = 0.0,
          .maximum = 6.2832, // a whole turn, rounded up for display
          .defaultValue = 0.0,
          // Any direction, however written; far beyond these a double no longer tells one from the next.
          .hardMaximum = 1e6,
          .hardMinimum = -1e6,
          // Every angle people type is in degrees; a turn either way covers every direction.
          .shown = {.name = "angle",
                    .scale = 57.295779513082323, // 180 / pi
                    .unit = Kernel::UnitKind::Degrees,
                    .minimum = -360.0,
                    .maximum = 360.0}},
         &Params::radians},
    }};
};

} // namespace RasterTools
