#pragma once
// The unsharp mask's parameters, declared once for its tool and command.

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

namespace RasterTools {

class UnsharpMaskTool;
class RasterUnsharpMaskCommand;

struct UnsharpMaskParameters {
    double radius = 0.0;    // blur radius in pixels; 0 sharpens nothing
    double factor = 0.5;    // how much of the difference from the blur is added back
    double threshold = 0.0; // differences up to this (0..1 of the channel range) are left alone
};

struct UnsharpMaskFilter {
    using Params = UnsharpMaskParameters;
    using Tool = UnsharpMaskTool;
    using Command = RasterUnsharpMaskCommand;

    static constexpr std::string_view kName = "unsharpmask";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterUnsharpMaskCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RUSC"); // in documents
    static constexpr std::string_view kToolClass = "UnsharpMaskTool";        // empty: no tool
    static constexpr std::string_view kDescription = "Unsharp Mask";
    static constexpr std::string_view kHint = "|DRAG| to set radius. |CLICK| to reset.";
    static constexpr ToolID kToolID = ToolID::UnsharpMask;
    // The drag shows the radius: one document unit of drag per pixel of radius.
    static constexpr double kDragScale = 1.0;

    // A sharpening with every difference counted and one that leaves small differences alone, for the
    // conformance tests.
    static constexpr std::array<Params, 2> kSamples{{
        {5.0, 1.5, 0.0},
        {12.0, 0.8, 0.05},
    }};

    static constexpr std::array<Parameter<Params>, 3> kParameters{{
        {{.name = "radius",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Radi"),
          .reflected = Kernel::MakeFourCC("radi"),
          .toolLabel = "Radius",
          .commandLabel = "Radius",
          .minimum = 0.0,
          .maximum = 100.0,
          .defaultValue = 0.0},
         &Params::radius},
        {{.name = "factor",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Fact"),
          .reflected = Kernel::MakeFourCC("fact"),
          .toolLabel = "Factor",
          .commandLabel = "Factor",
          .minimum = 0.0,
          .maximum = 5.0,
          .defaultValue = 0.5},
         &Params::factor},
        {{.name = "threshold",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Thrs"),
          .reflected = Kernel::MakeFourCC("thrs"),
          .toolLabel = "Threshold",
          .commandLabel = "Threshold",
          .minimum = 0.0,
          .maximum = 1.0,
          .defaultValue = 0.0},
         &Params::threshold},
    }};
};

} // namespace RasterTools
