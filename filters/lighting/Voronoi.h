#pragma once
// The Voronoi filter's parameters, declared once for its tool and command.

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

namespace RasterTools {

class VoronoiTool;
class RasterVoronoiCommand;

struct VoronoiParameters {
    double size = 32.0;      // grid cell size in layer pixels: the spacing of the sites
    double lineWidth = 10.0; // border lines as a percentage of the cell size; 0 draws none
};

struct VoronoiFilter {
    using Params = VoronoiParameters;
    using Tool = VoronoiTool;
    using Command = RasterVoronoiCommand;

    static constexpr std::string_view kName = "voronoi";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterVoronoiCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RVoC"); // in documents
    static constexpr std::string_view kToolClass = "VoronoiTool";            // empty: no tool
    static constexpr std::string_view kDescription = "Voronoi";
    static constexpr std::string_view kHint = "|DRAG| to set cell size. |CLICK| to reset.";
    static constexpr ToolID kToolID = ToolID::Voronoi;
    static constexpr double kDragScale = 1.0; // the dragged distance is the cell size
    // Cells wider than any layer are accepted from documents and the command line; beyond this the grid's
    // single-precision arithmetic would lose whole pixels.
    static constexpr double kSizeLimit = 65536.0;

    // Small cells with and without lines, and wide lines, so that the sweeps' small images hold many cells
    // (the table's default of 32 pixels gives one or two).
    static constexpr std::array<Params, 4> kSamples{{
        {5.0, 20.0},
        {7.5, 0.0},
        {3.0, 60.0},
        {11.0, 100.0},
    }};

    static constexpr std::array<Parameter<Params>, 2> kParameters{{
        {{.name = "size",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Size"),
          .reflected = Kernel::MakeFourCC("size"),
          .toolLabel = "Size",
          .commandLabel = "Size",
          .minimum = 0.0,
          .maximum = 512.0,
          .defaultValue = 32.0,
          .unit = Kernel::UnitKind::Pixels,
          .hardMaximum = kSizeLimit},
         &Params::size},
        {{.name = "line-width",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Widt"),
          .reflected = Kernel::MakeFourCC("widt"),
          .toolLabel = "Line Width",
          .commandLabel = "Line Width",
          .minimum = 0.0,
          .maximum = 100.0,
          .defaultValue = 10.0,
          .unit = Kernel::UnitKind::Percent,
          .settingsName = "linewidth"},
         &Params::lineWidth},
    }};
};

} // namespace RasterTools
