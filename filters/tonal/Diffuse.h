#pragma once
// The diffuse filter's parameters, declared once for its tool and command.

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

namespace RasterTools {

class DiffuseTool;
class RasterDiffuseCommand;

struct DiffuseParameters {
    double intensity = 0.0; // scatter distance: a pixel moves by at most 512 × intensity on each axis
};

struct DiffuseFilter {
    using Params = DiffuseParameters;
    using Tool = DiffuseTool;
    using Command = RasterDiffuseCommand;

    static constexpr std::string_view kName = "diffuse";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterDiffuseCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RDf2"); // in documents
    static constexpr std::string_view kToolClass = "DiffuseTool";            // empty: no tool
    static constexpr std::string_view kDescription = "Diffuse";
    static constexpr std::string_view kHint = "|DRAG| to set diffusion. |CLICK| to reset.";
    static constexpr ToolID kToolID = ToolID::Diffuse;
    static constexpr double kDragScale = 1.0 / 512.0;
    // A scatter of up to 32768 pixels, wider than any layer: a drag may go past the panel's range, but the
    // offsets stay well inside single precision.
    static constexpr double kIntensityLimit = 64.0;

    static constexpr std::array<Parameter<Params>, 1> kParameters{{
        {{.name = "intensity",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Inte"),
          .reflected = Kernel::MakeFourCC("inte"),
          .toolLabel = "Intensity",
          .commandLabel = "Intensity",
          .minimum = 0.0,
          .maximum = 1.0,
          .defaultValue = 0.0,
          .hardMaximum = kIntensityLimit},
         &Params::intensity},
    }};
};

} // namespace RasterTools
