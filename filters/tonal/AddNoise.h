#pragma once
// The add-noise filter's parameters, declared once for its tool and command.

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

namespace RasterTools {

class NoiseTool;
class RasterAddNoiseCommand;

struct AddNoiseParameters {
    double intensity = 0.0; // noise amount; 0 adds none
    bool mono = false;      // one noise value for all colour channels of a pixel
    bool gaussian = true;   // gaussian rather than uniform distribution
};

struct AddNoiseFilter {
    using Params = AddNoiseParameters;
    using Tool = NoiseTool;
    using Command = RasterAddNoiseCommand;

    static constexpr std::string_view kName = "addnoise";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterAddNoiseCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RANC"); // in documents
    static constexpr std::string_view kToolClass = "NoiseTool";              // empty: no tool
    static constexpr std::string_view kDescription = "Add Noise";
    static constexpr std::string_view kHint = "|DRAG| to set intensity. |CLICK| to reset.";
    static constexpr ToolID kToolID = ToolID::AddNoise;
    static constexpr double kDragScale = 0.001953125; // 512 document units of drag give intensity 1

    // Moderate noise of every kind, for the conformance tests (the table's corners are 0 and 100, which
    // leave integer channels unchanged or saturated).
    static constexpr std::array<Params, 4> kSamples{{
        {0.3, false, true},
        {0.3, true, true},
        {0.3, false, false},
        {0.3, true, false},
    }};

    static constexpr std::array<Parameter<Params>, 3> kParameters{{
        {{.name = "intensity",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Inte"),
          .reflected = Kernel::MakeFourCC("inte"),
          .toolLabel = "Intensity",
          .commandLabel = "Intensity",
          .minimum = 0.0,
          .maximum = 100.0,
          .defaultValue = 0.0,
          // People think of strength in percent: 100 % is a spread of one whole channel range.
          .shown = {.scale = 100.0, .unit = Kernel::UnitKind::Percent, .minimum = 0.0, .maximum = 100.0}},
         &Params::intensity},
        {{.name = "mono",
          .type = ParameterType::Bool,
          .code = Kernel::MakeFourCC("Mono"),
          .reflected = Kernel::MakeFourCC("mono"),
          .toolLabel = "Monochrome",
          .commandLabel = "Mono",
          .defaultValue = false,
          .image = "monochromatic"},
         &Params::mono},
        {{.name = "gaussian",
          .type = ParameterType::Bool,
          .code = Kernel::MakeFourCC("Gaus"),
          .reflected = Kernel::MakeFourCC("gaus"),
          .toolLabel = "Gaussian",
          .commandLabel = "Gaussian",
          .defaultValue = true,
          .image = "gaussian"},
         &Params::gaussian},
    }};
};

} // namespace RasterTools
