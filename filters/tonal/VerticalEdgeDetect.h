#pragma once
// The vertical edge detect command's (empty) parameter table, declared once for the catalogue.

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

namespace RasterTools {

class RasterVerticalEdgeDetectCommand;

struct VerticalEdgeDetectParameters {};

struct VerticalEdgeDetectFilter {
    using Params = VerticalEdgeDetectParameters;
    using Command = RasterVerticalEdgeDetectCommand;

    static constexpr std::string_view kName = "verticaledgedetect";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterVerticalEdgeDetectCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RVEd"); // in documents
    static constexpr std::string_view kToolClass = "";                       // empty: no tool
    static constexpr std::string_view kDescription = "Vertical Edge Detect";
    static constexpr ToolID kToolID = ToolID::None;
    static constexpr std::array<Parameter<Params>, 0> kParameters{};
};

} // namespace RasterTools
