#include "frame/Parameters.h"

#include <charconv>
#include <cmath>

namespace RasterTools {

std::string_view ParameterTypeName(ParameterType type) {
    switch (type) {
    case ParameterType::Double:
        return "double";
    case ParameterType::Bool:
        return "bool";
    case ParameterType::Int:
        return "int";
    case ParameterType::Point:
        return "point";
    }
    return "unknown";
}

namespace {
std::string FormatDouble(double value) {
    char buffer[32];
    const auto result = std::to_chars(buffer, buffer + sizeof buffer, value);
    return std::string(buffer, result.ptr);
}

bool ParseDouble(std::string_view text, double& value) {
    const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
    return result.ec == std::errc() && result.ptr == text.data() + text.size() && std::isfinite(value);
}
} // namespace

std::string FormatParameterValue(const ParameterValue& value) {
    struct Formatter {
        std::string operator()(double v) const { return FormatDouble(v); }
        std::string operator()(bool v) const { return v ? "true" : "false"; }
        std::string operator()(int v) const { return std::to_string(v); }
        std::string operator()(Kernel::PointT<double> v) const {
            return FormatDouble(v.x) + "," + FormatDouble(v.y);
        }
    };
    return std::visit(Formatter{}, value);
}

std::optional<ParameterValue> ParseParameterValue(ParameterType type, std::string_view text) {
    switch (type) {
    case ParameterType::Double: {
        double value = 0;
        if (ParseDouble(text, value)) return value;
        return std::nullopt;
    }
    case ParameterType::Bool:
        if (text == "true" || text == "1" || text == "yes" || text == "on") return true;
        if (text == "false" || text == "0" || text == "no" || text == "off") return false;
        return std::nullopt;
    case ParameterType::Int: {
        int value = 0;
        const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
        if (result.ec == std::errc() && result.ptr == text.data() + text.size()) return value;
        return std::nullopt;
    }
    case ParameterType::Point: {
        const auto comma = text.find(',');
        Kernel::PointT<double> point;
        if (comma == std::string_view::npos || !ParseDouble(text.substr(0, comma), point.x) ||
            !ParseDouble(text.substr(comma + 1), point.y))
            return std::nullopt;
        return point;
    }
    }
    return std::nullopt;
}

std::string SettingsKey(std::string_view filterName, const ParameterSpec& spec) {
    return "tools." + std::string(filterName) + "." + std::string(spec.name);
}

} // namespace RasterTools
