// The lighting command's command-line form: the JSON form of LightingParams for --params: the record's fields
// under their table names, angles in degrees as the short flags take them. Every key is checked, so that a
// misspelt one is an error rather than a silent default.

#include "filters/lighting/Lighting.h"
#include "filters/lighting/LightingParams.h"
#include "filters/lighting/RasterLightingCommand.h"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <fstream>
#include <stdexcept>
#include <string>

namespace RasterTools {

namespace {

using nlohmann::json;

constexpr double Radians = 3.14159265358979323846 / 180.0;

const ParameterSpec& Spec(std::string_view name) {
    for (const auto& parameter : LightingFilter::kParameters)
        if (parameter.spec.name == name) return parameter.spec;
    throw std::logic_error("no lighting parameter " + std::string(name));
}

// Reads one object's keys, each at most once, and says what was wrong with the first bad one.
class Reader {
public:
    Reader(const json& object, std::string where)
        : m_Object(object)
        , m_Where(std::move(where)) {}

    bool Ok() const noexcept { return m_Error.empty(); }
    const std::string& Error() const noexcept { return m_Error; }

    // A number within the accepted values of the table's parameter spec, times scale.
    void Number(const char* key, std::string_view spec, double& out, double scale = 1.0) {
        const json* value = Find(key);
        if (!value) return;
        const ParameterSpec& parameter = Spec(spec);
        if (!value->is_number()) return Fail(key, "expected a number");
        const double number = value->get<double>();
        if (!std::isfinite(number) || !IsAcceptedValue(parameter, ParameterValue(number)))
            return Fail(key, DescribeAcceptedValues(parameter));
        out = number * scale;
    }

    void Bool(const char* key, bool& out) {
        const json* value = Find(key);
        if (!value) return;
        if (!value->is_boolean()) return Fail(key, "expected true or false");
        out = value->get<bool>();
    }

    // [r, g, b] or [r, g, b, a], each within 0 .. 1000 (colours beyond 1 brighten).
    void Colour(const char* key, Renderer::ConsolidatedColour& out) {
        const json* value = Find(key);
        if (!value) return;
        float channels[4] = {1.0f, 1.0f, 1.0f, 1.0f};
        bool good = value->is_array() && (value->size() == 3 || value->size() == 4);
        for (std::size_t i = 0; good && i < value->size(); ++i) {
            const json& channel = (*value)[i];
            good = channel.is_number() && std::isfinite(channel.get<double>()) &&
                   channel.get<double>() >= 0.0 && channel.get<double>() <= 1000.0;
            if (good) channels[i] = channel.get<float>();
        }
        if (!good) return Fail(key, "expected [r, g, b] or [r, g, b, a], each 0 .. 1000");
        out = {channels[0], channels[1], channels[2], channels[3]};
    }

    void Point(const char* key, std::string_view spec, Kernel::PointT<double>& out) {
        const json* value = Find(key);
        if (!value) return;
        const ParameterSpec& parameter = Spec(spec);
        const bool pair =
            value->is_array() && value->size() == 2 && (*value)[0].is_number() && (*value)[1].is_number();
        const Kernel::PointT<double> point =
            pair ? Kernel::PointT<double>{(*value)[0].get<double>(), (*value)[1].get<double>()}
                 : Kernel::PointT<double>{};
        if (!pair || !std::isfinite(point.x) || !std::isfinite(point.y) ||
            !IsAcceptedValue(parameter, ParameterValue(point)))
            return Fail(key, "expected [x, y], each " + DescribeAcceptedValues(parameter));
        out = point;
    }

    void String(const char* key, std::string& out) {
        const json* value = Find(key);
        if (!value) return;
        if (!value->is_string() || value->get<std::string>().empty())
            return Fail(key, "expected a file name");
        out = value->get<std::string>();
    }

    const json* Find(const char* key) {
        m_Known.emplace_back(key);
        if (!Ok() || !m_Object.contains(key)) return nullptr;
        return &m_Object[key];
    }

    // After every key was asked for: a key nobody asked for is an error.
    bool Finish() {
        if (!Ok()) return false;
        for (const auto& [key, value] : m_Object.items())
            if (std::find(m_Known.begin(), m_Known.end(), key) == m_Known.end()) {
                std::string known;
                for (const auto& name : m_Known)
                    known += (known.empty() ? "" : ", ") + name;
                m_Error = m_Where + key + ": not a lighting setting (known: " + known + ")";
                return false;
            }
        return true;
    }

    void Fail(std::string_view key, const std::string& why) {
        if (Ok()) m_Error = m_Where + std::string(key) + ": " + why;
    }

private:
    const json& m_Object;
    std::string m_Where;
    std::vector<std::string> m_Known;
    std::string m_Error;
};

bool ReadLight(const json& object, const std::string& where, LightSource& light, std::string& error) {
    if (!object.is_object()) {
        error = where + ": expected an object";
        return false;
    }
    Reader reader(object, where + ".");
    if (const json* type = reader.Find("type")) {
        const std::string name = type->is_string() ? type->get<std::string>() : "";
        if (name == "spot")
            light.type = LightSource::Type::Spot;
        else if (name == "point")
            light.type = LightSource::Type::Point;
        else if (name == "directional")
            light.type = LightSource::Type::Directional;
        else
            reader.Fail("type", "expected \"spot\", \"point\" or \"directional\"");
    }
    reader.Colour("colour", light.colour);
    reader.Number("spin", "spin", light.spin, Radians);
    reader.Number("tilt", "tilt", light.tilt, Radians);
    reader.Point("centre", "centre", light.centre);
    reader.Number("distance", "distance", light.distance);
    reader.Number("outerCone", "outercone", light.outerCone, Radians);
    reader.Number("innerCone", "innercone", light.innerCone);
    if (!reader.Finish()) {
        error = reader.Error();
        return false;
    }
    return true;
}

} // namespace

std::optional<LightingJson> ReadLightingParamsJson(std::string_view text, std::string& error) {
    const json document = json::parse(text.begin(), text.end(), nullptr, false);
    if (document.is_discarded() || !document.is_object()) {
        error = "not a JSON object";
        return std::nullopt;
    }
    LightingJson result;
    LightingParams& params = result.params;
    Reader reader(document, "");
    reader.Number("ambient", "ambient", params.ambient);
    reader.Number("diffuse", "diffuse", params.diffuse);
    reader.Number("specular", "specular", params.specular);
    reader.Number("shininess", "shininess", params.exponent);
    reader.Colour("ambientColour", params.ambientColour);
    reader.Colour("specularColour", params.specularColour);
    reader.Number("depth", "depth", params.depth);
    reader.String("bump", result.bumpFile);
    reader.Bool("fitWidth", params.scaleXToFit);
    reader.Bool("fitHeight", params.scaleYToFit);
    reader.Number("bumpOpacity", "bumpopacity", params.bumpMapOpacity);
    // Without a list, one light aimed at the layer's middle from the default reach.
    LightSource unset;
    unset.centre = UnsetLightCentre;
    unset.distance = 0.0;
    params.lights = {unset};
    if (const json* lights = reader.Find("lights")) {
        if (!lights->is_array() || lights->size() > LightingParams::MaxRenderedLights) {
            reader.Fail("lights", "expected an array of at most " +
                                      std::to_string(LightingParams::MaxRenderedLights) + " lights");
        } else {
            params.lights.clear();
            for (std::size_t i = 0; i < lights->size(); ++i) {
                LightSource light = unset;
                if (!ReadLight((*lights)[i], "lights[" + std::to_string(i) + "]", light, error))
                    return std::nullopt;
                params.lights.push_back(light);
            }
        }
    }
    if (!reader.Finish()) {
        error = reader.Error();
        return std::nullopt;
    }
    return result;
}

namespace {

// "R,G,B": three numbers 0 .. 1000.
std::optional<Renderer::ConsolidatedColour> ParseColour(std::string_view text) {
    float channels[3] = {};
    for (int i = 0; i < 3; ++i) {
        const std::size_t comma = i < 2 ? text.find(',') : text.size();
        if (comma == std::string_view::npos || comma == 0) return std::nullopt;
        const std::string_view part = text.substr(0, comma);
        const auto result = std::from_chars(part.data(), part.data() + part.size(), channels[i]);
        if (result.ec != std::errc() || result.ptr != part.data() + part.size() ||
            !std::isfinite(channels[i]) || channels[i] < 0.0f || channels[i] > 1000.0f)
            return std::nullopt;
        text.remove_prefix(i < 2 ? comma + 1 : comma);
    }
    return Renderer::ConsolidatedColour{channels[0], channels[1], channels[2], 1.0f};
}

// The file's text, or nothing with why.
std::optional<std::string> ReadText(const std::string& path, std::string& error) {
    std::ifstream file(path, std::ios::binary);
    if (!file) {
        error = path + ": cannot be read";
        return std::nullopt;
    }
    constexpr std::size_t Limit = 1 << 20; // sixteen lights take a few kilobytes
    std::string contents(Limit + 1, '\0');
    file.read(contents.data(), std::streamsize(contents.size()));
    contents.resize(std::size_t(file.gcount()));
    if (contents.size() > Limit) {
        error = path + ": larger than lighting settings can be";
        return std::nullopt;
    }
    return contents;
}

} // namespace

Kernel::Counted<RasterCommand>
RasterLightingCommand::MakeCommandWithText(bool liveEffect, const std::vector<ParameterValue>& values,
                                           const std::vector<std::pair<std::string, std::string>>& texts,
                                           std::string& error) {
    const LightingParameters defaults = DefaultParameters(LightingFilter::kParameters);
    LightingParameters table = defaults;
    for (std::size_t i = 0; i < values.size() && i < LightingFilter::kParameters.size(); ++i)
        SetParameter(table, LightingFilter::kParameters[i], values[i]);
    BoundParameters(table, LightingFilter::kParameters);
    std::optional<std::string> paramsFile;
    std::optional<Renderer::ConsolidatedColour> colour;
    std::optional<std::string> bumpFile;
    for (const auto& [flag, text] : texts) {
        if (flag == "params") {
            if (paramsFile) {
                error = "--params is given more than once";
                return nullptr;
            }
            paramsFile = text;
        } else if (flag == "bump") {
            if (bumpFile) {
                error = "--bump is given more than once";
                return nullptr;
            }
            bumpFile = text;
        } else if (flag == "colour") {
            if (colour) {
                error = "--colour is given more than once";
                return nullptr;
            }
            colour = ParseColour(text);
            if (!colour) {
                error = "--colour: \"" + text + "\" is not R,G,B (three numbers 0 .. 1000, 1 full strength)";
                return nullptr;
            }
        }
    }
    if (!paramsFile) {
        LightingParams params = FromTable(table);
        if (colour) params.lights.front().colour = *colour;
        if (bumpFile) {
            params.bumpMap = ReadBumpMap(*bumpFile, error);
            if (!params.bumpMap) return nullptr;
        }
        return Kernel::Counted<RasterCommand>(new RasterLightingCommand(liveEffect, params));
    }
    // The file holds every setting; a flag beside it would be silently overruled or half applied.
    bool flagged = colour || bumpFile;
    for (const auto& parameter : LightingFilter::kParameters)
        flagged = flagged || FormatParameterValue(GetParameter(table, parameter)) !=
                                 FormatParameterValue(GetParameter(defaults, parameter));
    if (flagged) {
        error = "--params holds every setting: give the lights and the surface in the file, not as flags";
        return nullptr;
    }
    const auto text = ReadText(*paramsFile, error);
    if (!text) return nullptr;
    std::string why;
    const auto read = ReadLightingParamsJson(*text, why);
    if (!read) {
        error = *paramsFile + ": " + why;
        return nullptr;
    }
    LightingParams params = read->params;
    if (!read->bumpFile.empty()) {
        // A relative name is beside the settings file, so that the two travel together.
        std::filesystem::path bump(read->bumpFile);
        if (bump.is_relative()) bump = std::filesystem::path(*paramsFile).parent_path() / bump;
        params.bumpMap = ReadBumpMap(bump, error);
        if (!params.bumpMap) {
            error = *paramsFile + ": bump: " + error;
            return nullptr;
        }
    }
    return Kernel::Counted<RasterCommand>(new RasterLightingCommand(liveEffect, params));
}

} // namespace RasterTools
