// Parsing filter names and parameters the same way for every subcommand.
#include "app/FilterArguments.h"

#include "app/Options.h"
#include "pipeline/Formats.h"

#include <charconv>
#include <optional>

namespace App {

namespace {

// A format parameter takes a format's name as well as its number.
std::optional<RasterTools::ParameterValue> ParseValue(const RasterTools::ParameterSpec& spec,
                                                      const std::string& text) {
    if (spec.name == "format")
        if (const auto format = Raster::ParsePixelFormat(text)) return static_cast<int>(*format);
    if (spec.type == RasterTools::ParameterType::Point && text.find(',') == std::string::npos) {
        // One number for both axes.
        if (const auto one = RasterTools::ParseParameterValue(RasterTools::ParameterType::Double, text)) {
            const double v = std::get<double>(*one);
            return Kernel::PointT<double>{v, v};
        }
    }
    return RasterTools::ParseParameterValue(spec.type, text);
}

} // namespace

std::string LayerFormatNames() {
    std::string names;
    for (const auto format : RasterTools::LayerFormats)
        names += (names.empty() ? "" : ", ") + std::string(Raster::GetPixelFormatName(format));
    return names;
}

int ParseCount(const std::string& option, const std::string& text, int minimum) {
    int value = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error != std::errc() || end != text.data() + text.size() || value < minimum)
        throw UsageError(option + " needs a whole number of at least " + std::to_string(minimum) +
                         ", not \"" + text + "\"");
    return value;
}

const RasterTools::FilterInfo& RequireFilter(const std::string& name) {
    if (const RasterTools::FilterInfo* filter = RasterTools::FindFilter(name)) return *filter;
    std::string known;
    for (const auto& info : RasterTools::GetFilterCatalogue())
        known += (known.empty() ? "" : ", ") + std::string(info.name);
    throw UsageError("unknown filter \"" + name + "\" (filters: " + known + ")");
}

std::vector<RasterTools::ParameterValue>
ParseFilterParameters(const RasterTools::FilterInfo& filter,
                      const std::vector<std::pair<std::string, std::string>>& parameters) {
    std::vector<RasterTools::ParameterValue> values;
    for (const auto& spec : filter.parameters)
        values.push_back(spec.defaultValue);
    for (const auto& [name, text] : parameters) {
        std::size_t index = 0;
        while (index < filter.parameters.size() && filter.parameters[index].name != name)
            ++index;
        if (index == filter.parameters.size()) {
            std::string known;
            for (const auto& spec : filter.parameters)
                known += (known.empty() ? "--" : ", --") + std::string(spec.name);
            throw UsageError(std::string(filter.name) + " has no parameter --" + name + " (it takes " +
                             (known.empty() ? std::string("none") : known) + ")");
        }
        const auto& spec = filter.parameters[index];
        const auto value = ParseValue(spec, text);
        if (!value)
            throw UsageError("--" + name + ": \"" + text + "\" is not a " +
                             std::string(RasterTools::ParameterTypeName(spec.type)) +
                             (spec.name == "format" ? " or a format name (" + LayerFormatNames() + ")" : ""));
        if (spec.type == RasterTools::ParameterType::Point) {
            const auto point = std::get<Kernel::PointT<double>>(*value);
            if (point.x < spec.minimum || point.x > spec.maximum || point.y < spec.minimum ||
                point.y > spec.maximum)
                throw UsageError("--" + name + " must lie within " +
                                 RasterTools::FormatParameterValue(spec.minimum) + " .. " +
                                 RasterTools::FormatParameterValue(spec.maximum) + " on both axes");
        } else if (spec.type != RasterTools::ParameterType::Bool) {
            const double number = spec.type == RasterTools::ParameterType::Int ? double(std::get<int>(*value))
                                                                               : std::get<double>(*value);
            if (number < spec.minimum || (number > spec.maximum && !spec.openMaximum))
                throw UsageError("--" + name + " must lie within " +
                                 RasterTools::FormatParameterValue(spec.minimum) + " .. " +
                                 RasterTools::FormatParameterValue(spec.maximum));
        }
        values[index] = *value;
    }
    return values;
}

std::string DescribeParameterValues(const RasterTools::FilterInfo& filter,
                                    const std::vector<RasterTools::ParameterValue>& values) {
    std::string text;
    for (std::size_t i = 0; i < values.size() && i < filter.parameters.size(); ++i)
        text += (text.empty() ? "" : " ") + std::string(filter.parameters[i].name) + "=" +
                RasterTools::FormatParameterValue(values[i]);
    return text;
}

} // namespace App
