#include "frame/Parameters.h"

#include <algorithm>
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

std::string FormatParameterValue(const ParameterValue& value) {
    return std::visit(
        [](const auto& v) {
            return Kernel::ReflectedValueTraits<std::remove_cvref_t<decltype(v)>>::Format(v);
        },
        value);
}

namespace {
template <class T>
std::optional<ParameterValue> Parse(std::string_view text) {
    T value{};
    if (!Kernel::ReflectedValueTraits<T>::Parse(text, value)) return std::nullopt;
    return value;
}
} // namespace

std::optional<ParameterValue> ParseParameterValue(ParameterType type, std::string_view text) {
    switch (type) {
    case ParameterType::Double:
        return Parse<double>(text);
    case ParameterType::Bool:
        return Parse<bool>(text);
    case ParameterType::Int:
        return Parse<int>(text);
    case ParameterType::Point:
        return Parse<Kernel::PointT<double>>(text);
    }
    return std::nullopt;
}

double LowestValue(const ParameterSpec& spec) {
    return std::min(spec.minimum, spec.hardMinimum);
}

double HighestValue(const ParameterSpec& spec) {
    return std::max(spec.maximum, spec.hardMaximum);
}

double BoundNumber(const ParameterSpec& spec, double value) {
    if (std::isnan(value)) {
        const double* fallback = std::get_if<double>(&spec.defaultValue);
        value = fallback ? *fallback : LowestValue(spec);
    }
    return std::clamp(value, LowestValue(spec), HighestValue(spec));
}

int BoundNumber(const ParameterSpec& spec, int value) {
    return int(std::clamp(double(value), std::ceil(LowestValue(spec)), std::floor(HighestValue(spec))));
}

Kernel::PointT<double> BoundNumber(const ParameterSpec& spec, Kernel::PointT<double> value) {
    if (std::isnan(value.x) || std::isnan(value.y)) {
        // A point that is not one is the default; an unset default (NaN) stays unset.
        const auto* fallback = std::get_if<Kernel::PointT<double>>(&spec.defaultValue);
        return fallback ? *fallback : Kernel::PointT<double>{LowestValue(spec), LowestValue(spec)};
    }
    return {std::clamp(value.x, LowestValue(spec), HighestValue(spec)),
            std::clamp(value.y, LowestValue(spec), HighestValue(spec))};
}

bool IsAcceptedValue(const ParameterSpec& spec, const ParameterValue& value) {
    const auto within = [&](double v) { return v >= LowestValue(spec) && v <= HighestValue(spec); };
    return std::visit(
        [&](const auto& v) {
            using T = std::remove_cvref_t<decltype(v)>;
            if constexpr (std::is_same_v<T, bool>)
                return true;
            else if constexpr (std::is_same_v<T, Kernel::PointT<double>>)
                return within(v.x) && within(v.y);
            else
                return within(double(v));
        },
        value);
}

std::string DescribeAcceptedValues(const ParameterSpec& spec) {
    return "must lie within " + FormatParameterValue(LowestValue(spec)) + " .. " +
           FormatParameterValue(HighestValue(spec)) +
           (spec.type == ParameterType::Point ? " on both axes" : "");
}

std::string SettingsKey(std::string_view filterName, const ParameterSpec& spec) {
    return "tools." + std::string(filterName) + "." +
           std::string(spec.settingsName.empty() ? spec.name : spec.settingsName);
}

} // namespace RasterTools
