// Parsing filter names and parameters the same way for every subcommand.
#include "app/FilterArguments.h"

#include "app/Options.h"
#include "pipeline/Formats.h"

#include <algorithm>
#include <charconv>
#include <cstdio>
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

int ParseCount(const std::string& option, const std::string& text, int minimum, int maximum) {
    int value = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error != std::errc() || end != text.data() + text.size() || value < minimum || value > maximum)
        throw UsageError(option + " needs a whole number from " + std::to_string(minimum) + " to " +
                         std::to_string(maximum) + ", not " + QuoteExcerpt(text));
    return value;
}

int ParseTileSize(const std::string& text) {
    return ParseCount("--tile", text, kMinimumTileSize, kMaximumTileSize);
}

int ParseThreadCount(const std::string& text) {
    return ParseCount("--threads", text, 0, kMaximumThreads);
}

std::string EscapeBytes(std::string_view text) {
    static constexpr char kHex[] = "0123456789abcdef";
    std::string escaped;
    for (const char c : text) {
        const auto byte = static_cast<unsigned char>(c);
        if (byte >= 0x20 && byte < 0x7F) {
            escaped += c;
        } else {
            escaped += "\\x";
            escaped += kHex[byte >> 4];
            escaped += kHex[byte & 15];
        }
    }
    return escaped;
}

std::string QuoteExcerpt(std::string_view text, std::size_t limit) {
    return "\"" + EscapeBytes(text.substr(0, limit)) + (text.size() > limit ? "\"..." : "\"");
}

ShownParameter GetShownParameter(const RasterTools::ParameterSpec& spec) {
    ShownParameter shown;
    shown.flag = std::string(spec.shown.name.empty() ? spec.name : spec.shown.name);
    shown.scale = spec.shown.scale;
    shown.unit = spec.shown.unit != Kernel::UnitKind::None ? spec.shown.unit : spec.unit;
    if (spec.shown.minimum < spec.shown.maximum) {
        shown.displayMinimum = shown.lowest = spec.shown.minimum;
        shown.displayMaximum = shown.highest = spec.shown.maximum;
    } else {
        shown.displayMinimum = spec.minimum * shown.scale;
        shown.displayMaximum = spec.maximum * shown.scale;
        shown.lowest = RasterTools::LowestValue(spec) * shown.scale;
        shown.highest = RasterTools::HighestValue(spec) * shown.scale;
    }
    return shown;
}

std::string UnitSuffix(Kernel::UnitKind unit) {
    switch (unit) {
    case Kernel::UnitKind::Percent:
        return " %";
    case Kernel::UnitKind::Degrees:
        return " degrees";
    case Kernel::UnitKind::Pixels:
        return " pixels";
    case Kernel::UnitKind::None:
        break;
    }
    return {};
}

std::string FormatShownNumber(double value) {
    // Twelve digits hide the last bits a unit conversion disturbs and keep every value a person types.
    char text[32];
    std::snprintf(text, sizeof text, "%.12g", value);
    return text;
}

std::string FormatShownValue(const RasterTools::ParameterSpec& spec,
                             const RasterTools::ParameterValue& stored) {
    if (spec.shown.scale == 1.0) return RasterTools::FormatParameterValue(stored);
    if (const double* number = std::get_if<double>(&stored))
        return FormatShownNumber(*number * spec.shown.scale);
    if (const auto* point = std::get_if<Kernel::PointT<double>>(&stored))
        return FormatShownNumber(point->x * spec.shown.scale) + "," +
               FormatShownNumber(point->y * spec.shown.scale);
    return RasterTools::FormatParameterValue(stored);
}

std::string DescribeShownRange(const RasterTools::ParameterSpec& spec) {
    if (spec.shown.scale == 1.0 && !(spec.shown.minimum < spec.shown.maximum))
        return RasterTools::DescribeAcceptedValues(spec);
    const ShownParameter shown = GetShownParameter(spec);
    return "must lie within " + FormatShownNumber(shown.lowest) + " .. " + FormatShownNumber(shown.highest) +
           UnitSuffix(shown.unit) + (spec.type == RasterTools::ParameterType::Point ? " on both axes" : "");
}

namespace {

std::string TypeWords(RasterTools::ParameterType type) {
    switch (type) {
    case RasterTools::ParameterType::Double:
        return "a number";
    case RasterTools::ParameterType::Int:
        return "a whole number";
    case RasterTools::ParameterType::Bool:
        return "true or false";
    case RasterTools::ParameterType::Point:
        return "a point (X,Y, or one number for both)";
    }
    return "a value";
}

bool WithinShown(const ShownParameter& shown, double value) {
    return value >= shown.lowest && value <= shown.highest;
}

} // namespace

RasterTools::ParameterValue ParseShownValue(const RasterTools::ParameterSpec& spec, const std::string& text,
                                            const std::string& label) {
    const auto value = ParseValue(spec, text);
    if (!value) throw UsageError(label + ": " + QuoteExcerpt(text) + " is not " + TypeWords(spec.type));
    const ShownParameter shown = GetShownParameter(spec);
    const bool ownRange = spec.shown.minimum < spec.shown.maximum;
    RasterTools::ParameterValue stored = *value;
    bool accepted = true;
    if (double* number = std::get_if<double>(&stored)) {
        accepted = !ownRange || WithinShown(shown, *number);
        *number /= shown.scale;
    } else if (auto* point = std::get_if<Kernel::PointT<double>>(&stored)) {
        accepted = !ownRange || (WithinShown(shown, point->x) && WithinShown(shown, point->y));
        point->x /= shown.scale;
        point->y /= shown.scale;
    }
    if (!accepted || !RasterTools::IsAcceptedValue(spec, stored))
        throw UsageError(label + " " + DescribeShownRange(spec));
    return stored;
}

const RasterTools::ParameterSpec* FindShownParameter(const RasterTools::FilterInfo& filter,
                                                     std::string_view name) {
    for (const auto& spec : filter.parameters)
        if (GetShownParameter(spec).flag == name) return &spec;
    if (const auto code = Kernel::ParseFourCC(name))
        for (const auto& spec : filter.parameters)
            if (spec.reflected == *code) return &spec;
    return nullptr;
}

std::string ParameterFlags(const RasterTools::FilterInfo& filter) {
    std::string known;
    for (const auto& spec : filter.parameters)
        known += (known.empty() ? "--" : ", --") + GetShownParameter(spec).flag;
    return known;
}

const RasterTools::FilterInfo& RequireFilter(const std::string& name) {
    if (const RasterTools::FilterInfo* filter = RasterTools::FindFilter(name)) return *filter;
    std::string known;
    for (const auto& info : RasterTools::GetFilterCatalogue())
        known += (known.empty() ? "" : ", ") + std::string(info.name);
    throw UsageError("unknown filter " + QuoteExcerpt(name) + " (filters: " + known + ")");
}

std::vector<RasterTools::ParameterValue>
ParseFilterParameters(const RasterTools::FilterInfo& filter,
                      const std::vector<std::pair<std::string, std::string>>& parameters) {
    std::vector<RasterTools::ParameterValue> values;
    for (const auto& spec : filter.parameters)
        values.push_back(spec.defaultValue);
    std::vector<bool> given(filter.parameters.size(), false);
    for (const auto& [name, text] : parameters) {
        std::size_t index = 0;
        while (index < filter.parameters.size() && GetShownParameter(filter.parameters[index]).flag != name)
            ++index;
        if (index == filter.parameters.size()) {
            const std::string known = ParameterFlags(filter);
            throw UsageError(std::string(filter.name) + " has no parameter --" +
                             EscapeBytes(std::string_view(name).substr(0, 40)) + " (it takes " +
                             (known.empty() ? std::string("none") : known) + ")");
        }
        // Which of two values was meant cannot be guessed.
        if (given[index]) throw UsageError("--" + name + " is given more than once");
        given[index] = true;
        const auto& spec = filter.parameters[index];
        if (spec.name == "format") {
            const auto value = ParseValue(spec, text);
            if (!value || !RasterTools::IsAcceptedValue(spec, *value))
                throw UsageError("--format: " + QuoteExcerpt(text) + " is not a layer format (" +
                                 LayerFormatNames() + ")");
            values[index] = *value;
            continue;
        }
        values[index] = ParseShownValue(spec, text, "--" + name);
    }
    return values;
}

std::string DescribeParameterValues(const RasterTools::FilterInfo& filter,
                                    const std::vector<RasterTools::ParameterValue>& values) {
    std::string text;
    for (std::size_t i = 0; i < values.size() && i < filter.parameters.size(); ++i)
        text += (text.empty() ? "" : " ") + GetShownParameter(filter.parameters[i]).flag + "=" +
                FormatShownValue(filter.parameters[i], values[i]);
    return text;
}

} // namespace App

namespace App {

bool IsTextFlag(const std::string& filterName, std::string_view flag) {
    const RasterTools::FilterInfo* filter = RasterTools::FindFilter(filterName);
    return filter &&
           std::find(filter->textFlags.begin(), filter->textFlags.end(), flag) != filter->textFlags.end();
}

Kernel::Counted<RasterCommand>
MakeFilterCommand(const RasterTools::FilterInfo& filter, bool liveEffect,
                  const std::vector<std::pair<std::string, std::string>>& parameters) {
    std::vector<std::pair<std::string, std::string>> table, texts;
    for (const auto& parameter : parameters)
        (IsTextFlag(std::string(filter.name), parameter.first) ? texts : table).push_back(parameter);
    const auto values = ParseFilterParameters(filter, table);
    if (!filter.makeCommandWithText) return filter.makeCommand(liveEffect, values);
    std::string error;
    auto command = filter.makeCommandWithText(liveEffect, values, texts, error);
    if (!command) throw Error(std::string(filter.name) + ": " + error);
    return command;
}

} // namespace App
