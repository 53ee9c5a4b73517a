#pragma once
// The lighting filter's parameter table, declared once for its tool, command line and panels: the surface's
// response to light and the current light source, in degrees. The command's whole state, with every light,
// colours and the bump map, is a LightingParams (LightingParams.h); this table is its view of the first
// light.

#include "frame/Parameters.h"
#include "host/document/ToolID.h"

#include <limits>

namespace RasterTools {

class LightingTool;
class RasterLightingCommand;

// The kinds of light, as the light type parameter numbers them.
enum class LightType : int { Spot = 0, Point = 1, Directional = 2 };

// A light centre whose coordinates are not numbers is unset: renders place it at the middle of the raster's
// bounds. A distance of 0 is unset too: renders take 0.15 × the bounds' diagonal.
inline constexpr Kernel::PointT<double> UnsetLightCentre{std::numeric_limits<double>::quiet_NaN(),
                                                         std::numeric_limits<double>::quiet_NaN()};
// How far from the origin a light may be placed, and how high: far beyond any layer, and small enough that
// squared distances stay far from the single-precision range.
inline constexpr double LightPlaceLimit = 1e6;

struct LightingParameters {
    double ambient = 0.2;   // amount of the (white) ambient light
    double diffuse = 1.0;   // amount of the lights' diffuse term
    double specular = 0.5;  // amount of the lights' specular term
    double shininess = 5.0; // the specular exponent, a whole number when rendered
    double depth = 0.0; // height of the relief in pixels for a full step of the height map; negative sinks
    double bumpOpacity = 1.0; // scales the relief from flat (0) to full (1)
    int lightType = int(LightType::Spot);
    double spin = 135.0;                              // degrees: the light's direction in the layer's plane
    double tilt = 30.0;                               // degrees above the surface
    Kernel::PointT<double> centre = UnsetLightCentre; // document coordinates the light points at
    double distance = 0.0;   // document pixels from the centre to the light; 0: unset
    double outerCone = 30.0; // degrees: the spot's half angle
    double innerCone = 0.5;  // the full-strength part of the spot, as a fraction of the outer cone's angle
};

struct LightingFilter {
    using Params = LightingParameters;
    using Tool = LightingTool;
    using Command = RasterLightingCommand;

    static constexpr std::string_view kName = "lighting";
    // The host knows the classes by these names (coverage, documents, tool lists).
    static constexpr std::string_view kCommandClass = "RasterLightingCommand";
    static constexpr Kernel::FourCC kClassCode = Kernel::MakeFourCC("RLig"); // in documents
    static constexpr std::string_view kToolClass = "LightingTool";           // empty: no tool
    static constexpr std::string_view kDescription = "Lighting";
    static constexpr std::string_view kHint = "|DRAG| handles to position lights.";
    static constexpr ToolID kToolID = ToolID::Lighting;
    static constexpr double kDragScale = 0.0; // a drag moves the light's centre
    // --params FILE.json (the whole LightingParams), or --colour R,G,B for the short form's light and
    // --bump IMAGE for its bump map.
    static constexpr std::array<std::string_view, 3> kTextFlags{"params", "colour", "bump"};
    static constexpr std::array<std::string_view, 3> kTextFlagHelp{
        "FILE.json: the whole set-up (surface, every light, bump map), given alone",
        "R,G,B: the light's colour, each 0..1 (white)",
        "IMAGE: a picture whose luminance is the relief (the layer's own luminance)"};
    // 2: the command saves its whole LightingParams (colours, bump map, every light); 1 was this table.
    static constexpr unsigned short kClassVersion = 2;

    // Every kind of light over a relief both ways, off-centre, for the conformance tests (the table's corners
    // put the light far away or flatten the relief).
    static constexpr std::array<Params, 4> kSamples{{
        {0.2, 1.0, 0.5, 5.0, 3.0, 1.0, 0, 135.0, 40.0, {12.5, 9.0}, 30.0, 45.0, 0.5},
        {0.1, 0.8, 0.7, 12.0, -2.0, 0.6, 1, 20.0, 60.0, {30.0, 4.0}, 25.0, 30.0, 0.5},
        {0.3, 1.0, 0.4, 3.0, 5.0, 1.0, 2, 200.0, 35.0, UnsetLightCentre, 0.0, 30.0, 0.5},
        {0.0, 1.5, 1.0, 1.0, 1.0, 1.0, 0, -60.0, 75.0, {-3.0, 20.0}, 18.0, 80.0, 0.9},
    }};

    // Spin, tilt and the outer cone are kept in degrees here, so their codes are their own (a light source
    // record stores radians under other codes).
    static constexpr std::array<Parameter<Params>, 13> kParameters{{
        {{.name = "ambient",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Ambi"),
          .reflected = Kernel::MakeFourCC("ambi"),
          .toolLabel = "Ambient",
          .commandLabel = "Ambient",
          .minimum = 0.0,
          .maximum = 1.0,
          .defaultValue = 0.2,
          .hardMaximum = 100.0},
         &Params::ambient},
        {{.name = "diffuse",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Diff"),
          .reflected = Kernel::MakeFourCC("diff"),
          .toolLabel = "Diffuse",
          .commandLabel = "Diffuse",
          .minimum = 0.0,
          .maximum = 2.0,
          .defaultValue = 1.0,
          .hardMaximum = 100.0},
         &Params::diffuse},
        {{.name = "specular",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Spec"),
          .reflected = Kernel::MakeFourCC("spec"),
          .toolLabel = "Specular",
          .commandLabel = "Specular",
          .minimum = 0.0,
          .maximum = 2.0,
          .defaultValue = 0.5,
          .hardMaximum = 100.0},
         &Params::specular},
        {{.name = "shininess",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Expo"),
          .reflected = Kernel::MakeFourCC("shin"),
          .toolLabel = "Shininess",
          .commandLabel = "Shininess",
          .minimum = 1.0,
          .maximum = 128.0,
          .defaultValue = 5.0},
         &Params::shininess},
        {{.name = "depth",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Dept"),
          .reflected = Kernel::MakeFourCC("dept"),
          .toolLabel = "Depth",
          .commandLabel = "Depth",
          .minimum = -20.0,
          .maximum = 20.0,
          .defaultValue = 0.0,
          .unit = Kernel::UnitKind::Pixels,
          .hardMaximum = 10000.0,
          .hardMinimum = -10000.0},
         &Params::depth},
        {{.name = "bumpopacity",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("BMOp"),
          .reflected = Kernel::MakeFourCC("bmop"),
          .toolLabel = "Texture",
          .commandLabel = "Texture",
          .minimum = 0.0,
          .maximum = 1.0,
          .defaultValue = 1.0},
         &Params::bumpOpacity},
        {{.name = "light",
          .type = ParameterType::Int,
          .code = Kernel::MakeFourCC("Type"),
          .reflected = Kernel::MakeFourCC("ltyp"),
          .toolLabel = "Light Type",
          .commandLabel = "Light Type",
          .minimum = 0.0,
          .maximum = 2.0,
          .defaultValue = 0},
         &Params::lightType},
        {{.name = "spin",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("SpiD"),
          .reflected = Kernel::MakeFourCC("spin"),
          .toolLabel = "Spin",
          .commandLabel = "Spin",
          .minimum = -360.0,
          .maximum = 360.0,
          .defaultValue = 135.0,
          .unit = Kernel::UnitKind::Degrees},
         &Params::spin},
        {{.name = "tilt",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("TilD"),
          .reflected = Kernel::MakeFourCC("tilt"),
          .toolLabel = "Tilt",
          .commandLabel = "Tilt",
          .minimum = 0.0,
          .maximum = 90.0,
          .defaultValue = 30.0,
          .unit = Kernel::UnitKind::Degrees},
         &Params::tilt},
        {{.name = "centre",
          .type = ParameterType::Point,
          .code = Kernel::MakeFourCC("Cent"),
          .reflected = Kernel::MakeFourCC("cent"),
          .toolLabel = "Light",
          .commandLabel = "Light",
          .minimum = -LightPlaceLimit,
          .maximum = LightPlaceLimit,
          .defaultValue = UnsetLightCentre,
          .persisted = false},
         &Params::centre},
        {{.name = "distance",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("Dist"),
          .reflected = Kernel::MakeFourCC("dist"),
          .toolLabel = "Distance",
          .commandLabel = "Distance",
          .minimum = 0.0,
          .maximum = 4096.0,
          .defaultValue = 0.0,
          .unit = Kernel::UnitKind::Pixels,
          .hardMaximum = LightPlaceLimit},
         &Params::distance},
        {{.name = "outercone",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("OCoD"),
          .reflected = Kernel::MakeFourCC("ocon"),
          .toolLabel = "Cone",
          .commandLabel = "Cone",
          .minimum = 0.0,
          .maximum = 90.0,
          .defaultValue = 30.0,
          .unit = Kernel::UnitKind::Degrees},
         &Params::outerCone},
        {{.name = "innercone",
          .type = ParameterType::Double,
          .code = Kernel::MakeFourCC("ICon"),
          .reflected = Kernel::MakeFourCC("icon"),
          .toolLabel = "Inner Cone",
          .commandLabel = "Inner Cone",
          .minimum = 0.0,
          .maximum = 1.0,
          .defaultValue = 0.5},
         &Params::innerCone},
    }};
};

} // namespace RasterTools
