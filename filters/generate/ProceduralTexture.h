#pragma once
// The procedural texture filter's table: the parameters a command line or sweep can give (a starter preset,
// the texture origin and the opacity), the class names and codes, and the sample sets for the sweeps. The
// equations themselves live in the config (host/document/ProceduralTexture.h).

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

#include <array>
#include <limits>

namespace RasterTools {

class ProceduralTextureTool;
class ProceduralTextureCommand;

inline constexpr double ProceduralOriginLimit = 1e6;

struct ProceduralTextureParameters {
    int preset = 0;                  // the starter preset a command made from the table renders
    Kernel::PointT<double> origin{}; // the texture origin (ox, oy), document pixels
    double opacity = 1.0;            // 0 keeps the layer, 1 shows only the texture
};

struct ProceduralTextureFilter {
    using Params = ProceduralTextureParameters;
    using Tool = ProceduralTextureTool;
    using Command = ProceduralTextureCommand;

    static constexpr std::string_view kName = "proceduraltexture";
    static constexpr std::string_view kCommandClass = "ProceduralTextureCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("PrTx"); // in documents
    static constexpr std::string_view kToolClass = "ProceduralTextureTool";
    static constexpr std::string_view kDescription = "Procedural Texture";
    static constexpr std::string_view kHint = "|CLICK| or |DRAG| to set texture origin (ox, oy).";
    static constexpr ToolID kToolID = ToolID::ProceduralTexture;
    static constexpr int kStarterPresetCount = 5;
    // --config FILE.json, or --eq CHANNELS=EXPRESSION (repeatable) with --colour FORMAT, --angles deg|rad and
    // --input NAME=VALUE (repeatable; a new input is a real number); --blend MODE names the blend mode
    // ("multiply", "colour-dodge", ...).
    static constexpr std::array<std::string_view, 6> kTextFlags{"config", "eq",    "colour",
                                                                "angles", "input", "blend"};
    static constexpr std::array<std::string_view, 6> kTextFlagHelp{
        "FILE.json: the whole texture (equations, inputs, units, colour format)",
        "CHANNELS=EXPRESSION: an equation, e.g. rgb=sin(x / 8); may be given more than once",
        "FORMAT: the colour format the equations write (RGB, CMYK, Lab, Intensity or Alpha)",
        "deg|rad: the unit of angles in the equations",
        "NAME=VALUE: an input's value (a new name adds a real input); may be given more than once",
        "MODE: how the texture blends with the layer (normal, multiply, screen, ...)"};

    // Every starter preset, at an origin off the pixel grid, and one half-transparent.
    static constexpr std::array<Params, 6> kSamples{{
        {0, {13.5, -7.25}, 1.0},
        {1, {40.0, 30.0}, 1.0},
        {2, {3.0, 5.0}, 1.0},
        {3, {0.0, 0.0}, 1.0},
        {4, {-20.0, 10.0}, 1.0},
        {1, {20.0, 12.0}, 0.5},
    }};

    static constexpr std::array<Parameter<Params>, 3> kParameters{{
        {{.name = "preset",
          .type = ParameterType::Int,
          .code = Kernel::MakeFourCC("Prst"),
          .reflected = Kernel::MakeFourCC("prst"),
          .toolLabel = "Preset",
          .commandLabel = "Preset",
          .minimum = 0,
          .maximum = kStarterPresetCount - 1,
          .defaultValue = 0,
          .persisted = false},
         &Params::preset},
        {{.name = "origin",
          .type = ParameterType::Point,
          .code = Kernel::MakeFourCC("Orgn"),
          .reflected = Kernel::MakeFourCC("Orgn"),
          .toolLabel = "Origin",
          .commandLabel = "Origin",
          .minimum = -ProceduralOriginLimit,
          .maximum = ProceduralOriginLimit,
          .defaultValue = Kernel::PointT<double>{0.0, 0.0},
          .persisted = false},
         &Params::origin},
        {{.name = "opacity",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Opac"),
          .reflected = Kernel::MakeFourCC("Opac"),
          .toolLabel = "Opacity",
          .commandLabel = "Opacity",
          .minimum = 0.0,
          .maximum = 1.0,
          .defaultValue = 1.0,
          .persisted = false},
         &Params::opacity},
    }};
};

} // namespace RasterTools
