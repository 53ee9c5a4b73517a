#pragma once
// The copy command's parameters, declared once: a plain, scaled or format-converting copy of a layer.

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

namespace RasterTools {

class RasterCopyCommand;

struct CopyParameters {
    int format = -1; // the destination's pixel format (Raster::PixelFormat); -1 keeps the source's
    Kernel::PointT<double> scale{1.0, 1.0}; // output size over input size, per axis
};

struct CopyFilter {
    using Params = CopyParameters;
    using Command = RasterCopyCommand;

    static constexpr std::string_view kName = "copy";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterCopyCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RCpy"); // in documents
    static constexpr std::string_view kToolClass = "";                       // empty: no tool
    static constexpr std::string_view kDescription = "Copy";
    static constexpr ToolID kToolID = ToolID::None;
    // Scales beyond these make no sense for a copy and would only make huge or empty images.
    static constexpr double kMinimumScale = 0.125;
    static constexpr double kMaximumScale = 8.0;

    static constexpr std::array<Parameter<Params>, 2> kParameters{{
        {{.name = "format",
          .type = ParameterType::Int,
          .code = Kernel::MakeFourCC("Frmt"),
          .reflected = Kernel::MakeFourCC("frmt"),
          .toolLabel = "Format",
          .commandLabel = "Format",
          .minimum = -1.0,
          .maximum = 6.0,
          .defaultValue = -1,
          .persisted = false},
         &Params::format},
        {{.name = "scale",
          .type = ParameterType::Point,
          .code = Kernel::MakeFourCC("Scal"),
          .reflected = Kernel::MakeFourCC("scal"),
          .toolLabel = "Scale",
          .commandLabel = "Scale",
          .minimum = kMinimumScale,
          .maximum = kMaximumScale,
          .defaultValue = Kernel::PointT<double>{1.0, 1.0},
          .persisted = false},
         &Params::scale},
    }};
};

} // namespace RasterTools
