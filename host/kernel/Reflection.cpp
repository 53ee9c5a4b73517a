#include "host/kernel/Reflection.h"

#include <charconv>
#include <cmath>
#include <system_error>

namespace Kernel {

namespace {

// Shortest text that reads back as the same double.
std::string FormatDouble(double value) {
    char buffer[64];
    const auto result = std::to_chars(buffer, buffer + sizeof buffer, value);
    return std::string(buffer, result.ptr);
}

// The whole text as one finite double: no spaces, no '+', nothing after it.
bool ParseFiniteDouble(std::string_view text, double& value) {
    if (text.empty()) return false;
    double parsed = 0.0;
    const auto result = std::from_chars(text.data(), text.data() + text.size(), parsed);
    if (result.ec != std::errc() || result.ptr != text.data() + text.size() || !std::isfinite(parsed))
        return false;
    value = parsed;
    return true;
}

// The whole text as one int in range.
bool ParseInt(std::string_view text, int& value) {
    if (text.empty()) return false;
    int parsed = 0;
    const auto result = std::from_chars(text.data(), text.data() + text.size(), parsed);
    if (result.ec != std::errc() || result.ptr != text.data() + text.size()) return false;
    value = parsed;
    return true;
}

bool EqualsIgnoringAsciiCase(std::string_view a, std::string_view b) {
    if (a.size() != b.size()) return false;
    for (std::size_t i = 0; i < a.size(); ++i) {
        char x = a[i], y = b[i];
        if (x >= 'A' && x <= 'Z') x = char(x - 'A' + 'a');
        if (y >= 'A' && y <= 'Z') y = char(y - 'A' + 'a');
        if (x != y) return false;
    }
    return true;
}

} // namespace

std::string_view UnitKindName(UnitKind kind) {
    switch (kind) {
    case UnitKind::None:
        return "none";
    case UnitKind::Pixels:
        return "pixels";
    case UnitKind::Degrees:
        return "degrees";
    case UnitKind::Percent:
        return "percent";
    }
    return "none";
}

std::string SensitivityAttribute::Describe() const {
    return "sensitivity=" + FormatDouble(m_PerPixel);
}

// ---- Value traits ----

std::string ReflectedValueTraits<double>::Format(double value) {
    return FormatDouble(value);
}

bool ReflectedValueTraits<double>::Parse(std::string_view text, double& value) {
    return ParseFiniteDouble(text, value);
}

std::string ReflectedValueTraits<bool>::Format(bool value) {
    return value ? "true" : "false";
}

bool ReflectedValueTraits<bool>::Parse(std::string_view text, bool& value) {
    for (std::string_view yes : {"true", "1", "yes", "on"})
        if (EqualsIgnoringAsciiCase(text, yes)) {
            value = true;
            return true;
        }
    for (std::string_view no : {"false", "0", "no", "off"})
        if (EqualsIgnoringAsciiCase(text, no)) {
            value = false;
            return true;
        }
    return false;
}

std::string ReflectedValueTraits<int>::Format(int value) {
    return std::to_string(value);
}

bool ReflectedValueTraits<int>::Parse(std::string_view text, int& value) {
    return ParseInt(text, value);
}

std::string ReflectedValueTraits<PointT<double>>::Format(PointT<double> value) {
    return FormatDouble(value.x) + "," + FormatDouble(value.y);
}

bool ReflectedValueTraits<PointT<double>>::Parse(std::string_view text, PointT<double>& value) {
    const std::size_t comma = text.find(',');
    if (comma == std::string_view::npos) return false;
    PointT<double> parsed;
    // A second comma makes the y text fail to parse.
    if (!ParseFiniteDouble(text.substr(0, comma), parsed.x) ||
        !ParseFiniteDouble(text.substr(comma + 1), parsed.y))
        return false;
    value = parsed;
    return true;
}

// ---- ReflectedUnitRange ----

std::string ReflectedUnitRange::GetValueText() const {
    return FormatDouble(GetValue());
}

bool ReflectedUnitRange::SetValueText(std::string_view text) {
    double value = 0.0;
    if (!ParseFiniteDouble(text, value)) return false;
    // Not clamped to the display range: some properties have no hard limit.
    SetValue(value);
    return true;
}

std::string ReflectedUnitRange::DescribeRange() const {
    return "range=" + FormatDouble(m_Minimum) + ".." + FormatDouble(m_Maximum);
}

// ---- ReflectedEnum ----

ReflectedEnum::ReflectedEnum(FourCC identifier, LocalisedString label, std::vector<LocalisedString> choices,
                             std::function<int()> getter, std::function<void(int)> setter,
                             AttributeList attributes)
    : Reflected(identifier, std::move(label), std::move(attributes))
    , m_Choices(std::move(choices))
    , m_Getter(std::move(getter))
    , m_Setter(std::move(setter)) {}

std::string ReflectedEnum::GetValueText() const {
    const int index = GetValue();
    // An index outside the choices has no name.
    if (index < 0 || std::size_t(index) >= m_Choices.size()) return {};
    return m_Choices[std::size_t(index)].GetEnglish();
}

bool ReflectedEnum::SetValueText(std::string_view text) {
    for (std::size_t i = 0; i < m_Choices.size(); ++i)
        if (m_Choices[i].GetEnglish() == text) {
            SetValue(int(i));
            return true;
        }
    int index = 0;
    if (!ParseInt(text, index) || index < 0 || std::size_t(index) >= m_Choices.size()) return false;
    SetValue(index);
    return true;
}

std::string ReflectedEnum::DescribeRange() const {
    std::string text = "choices=";
    for (std::size_t i = 0; i < m_Choices.size(); ++i) {
        if (i != 0) text += '|';
        text += m_Choices[i].GetEnglish();
    }
    return text;
}

// ---- ReflectedBlendMode ----

ReflectedBlendMode::ReflectedBlendMode(FourCC identifier, LocalisedString label, std::function<int()> getter,
                                       std::function<void(int)> setter, AttributeList attributes)
    : ReflectedEnum(identifier, std::move(label), GetBlendModeNames(), std::move(getter), std::move(setter),
                    std::move(attributes)) {}

const std::vector<LocalisedString>& ReflectedBlendMode::GetBlendModeNames() {
    static const std::vector<LocalisedString> names = [] {
        std::vector<LocalisedString> list;
        for (const char* name : {"Normal", "Multiply", "Screen", "Overlay", "Darken", "Lighten",
                                 "Colour Dodge", "Colour Burn", "Hard Light", "Soft Light", "Difference",
                                 "Exclusion", "Hue", "Saturation", "Colour", "Luminosity"})
            list.emplace_back(name, "Blend mode");
        return list;
    }();
    return names;
}

} // namespace Kernel
