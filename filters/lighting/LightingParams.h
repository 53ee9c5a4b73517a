#pragma once
// The lighting filter's saved records: one light source, and the surface's response with the list of lights
// and the optional bump map.

#include "host/kernel/FourCC.h"
#include "host/kernel/Geometry.h"
#include "host/kernel/Serialiser.h"
#include "host/raster/AffineTransform.h"
#include "host/raster/DynamicBuffer.h"
#include "host/renderer/Colour.h"

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace RasterTools {

// One light: its kind, colour, direction (spin in the layer's plane, tilt above it), the point it aims at
// and its distance from it, and for spots the cone.
class LightSource {
public:
    enum class Type : std::int32_t { Spot = 0, Point = 1, Directional = 2 };

    Type type = Type::Spot;
    Renderer::ConsolidatedColour colour{1.0f, 1.0f, 1.0f, 1.0f};
    double spin = 2.356194490192345;  // radians (135°)
    double tilt = 0.5235987755982988; // radians (30°)
    // Document coordinates. A centre whose coordinates are not numbers, and a distance that is not above 0,
    // are unset: a render places them from the raster's bounds as the rectangle constructor does.
    Kernel::PointT<double> centre{0.0, 0.0};
    double distance = 100.0;               // pixels
    double outerCone = 0.5235987755982988; // radians (30°): the spot's half angle
    double innerCone = 0.5;                // the full-strength part, as a fraction of the outer cone's angle

    LightSource() = default;
    // Aimed at the middle of a document of the given rectangle, from 0.15 × its diagonal away.
    explicit LightSource(const Kernel::RectT<double>& document);

    static Kernel::FourCC GetClassUID() noexcept { return Kernel::MakeFourCC("LSrc"); }
    static unsigned short GetSchemaVersion() noexcept { return 1; }
    void Save(Kernel::OutSerialiser& out) const;
    // False for another class or a newer version; fields absent from the stream keep their values.
    bool Load(const Kernel::InSerialiser& in, Kernel::FourCC classUID, unsigned short version);

    void ApplyTransform(const Raster::AffineTransform::Params& transform);
    // False, changing nothing, for a singular transform.
    bool ApplyInverseTransform(const Raster::AffineTransform::Params& transform);

    friend bool operator==(const LightSource&, const LightSource&) = default;
};

// The surface's response to light (ambient, diffuse and specular amounts and colours, the specular exponent),
// the relief (depth, the bump map and how it fits the layer) and the lights.
class LightingParams {
public:
    double ambient = 0.2;
    double diffuse = 1.0;
    double specular = 0.5;
    double exponent = 5.0; // the shininess: the specular power, rendered as a whole number 1 to 128
    Renderer::ConsolidatedColour ambientColour{1.0f, 1.0f, 1.0f, 1.0f};
    Renderer::ConsolidatedColour specularColour{1.0f, 1.0f, 1.0f, 1.0f};
    double depth = 0.0; // height of the relief in pixels for a full step of the height map; negative sinks
    // Heights, one float per pixel (IntensityUF); none: the layer's own luminance is the relief.
    Kernel::Counted<const Raster::DynamicBuffer> bumpMap;
    bool scaleXToFit = true; // the bump map is stretched across the layer's width
    bool scaleYToFit = true;
    double bumpMapOpacity = 1.0; // scales the relief from flat (0) to full (1)
    std::vector<LightSource> lights{LightSource()};

    // The most lights a render takes; more are kept but not rendered.
    static constexpr std::size_t MaxRenderedLights = 16;

    LightingParams() = default;
    // One light built from the document rectangle.
    explicit LightingParams(const Kernel::RectT<double>& document);

    static Kernel::FourCC GetClassUID() noexcept { return Kernel::MakeFourCC("LPar"); }
    static unsigned short GetSchemaVersion() noexcept { return 1; }
    // full: with the lights (a document's command); otherwise the surface alone (remembered settings).
    void Save(Kernel::OutSerialiser& out, bool full = true) const;
    // False for another class, a newer version, or a bump map or light list that does not read back.
    bool Load(const Kernel::InSerialiser& in, Kernel::FourCC classUID, unsigned short version,
              Kernel::FileStore& store);

    // Forwarded to every light.
    void ApplyTransform(const Raster::AffineTransform::Params& transform);
    bool ApplyInverseTransform(const Raster::AffineTransform::Params& transform);

    // Numbers brought within what a render accepts (finite, within the panels' hard limits).
    void Bound();

    // Equal values, the bump map compared by identity.
    friend bool operator==(const LightingParams&, const LightingParams&) = default;
};

// A LightingParams as its JSON form gives it, with the bump map's image file (empty: none), which the caller
// reads.
struct LightingJson {
    LightingParams params;
    std::string bumpFile;
};

// An image file's pixels as a bump map (IntensityUF): the luminance of each pixel's colour, alpha ignored;
// null, with error saying why, for a file that cannot be read.
Kernel::Counted<const Raster::DynamicBuffer> ReadBumpMap(const std::filesystem::path& path,
                                                         std::string& error);

// The JSON form (the README's lighting section): nothing, with error saying where and why, for text that is
// not a JSON object, a key the form does not have, or a value of the wrong kind or beyond its range.
std::optional<LightingJson> ReadLightingParamsJson(std::string_view text, std::string& error);

} // namespace RasterTools
