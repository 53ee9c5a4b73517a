#include "frame/Parameters.h"

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

std::string SettingsKey(std::string_view filterName, const ParameterSpec& spec) {
    return "tools." + std::string(filterName) + "." +
           std::string(spec.settingsName.empty() ? spec.name : spec.settingsName);
}

} // namespace RasterTools
