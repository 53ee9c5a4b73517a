#pragma once
// A filter's parameters declared once: the table that feeds settings, serialisation, reflection and the
// command line.

#include "host/kernel/FourCC.h"
#include "host/kernel/Geometry.h"
#include "host/kernel/Reflection.h"
#include "host/kernel/Serialiser.h"

#include <array>
#include <bit>
#include <limits>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace RasterTools {

// Values are written as their in-memory bytes; the tagged format is little-endian.
static_assert(std::endian::native == std::endian::little,
              "serialised parameters assume a little-endian host");

enum class ParameterType { Double, Bool, Int, Point };
using ParameterValue = std::variant<double, bool, int, Kernel::PointT<double>>;

std::string_view ParameterTypeName(ParameterType type);
std::string FormatParameterValue(const ParameterValue& value);
// Parses text as a value of the given type; nothing when it does not parse.
std::optional<ParameterValue> ParseParameterValue(ParameterType type, std::string_view text);

// How people type and read a value whose stored number is not what they think in (the command line, its
// help, play scripts): shown = stored x scale, in unit, under the flag name.
struct ShownAs {
    std::string_view name{}; // the flag; empty: the parameter's name
    double scale = 1.0;
    Kernel::UnitKind unit = Kernel::UnitKind::None; // None: the parameter's own unit
    // The values offered and accepted, in shown units, where they are narrower than the accepted stored
    // values (minimum < maximum); otherwise those scaled.
    double minimum = 0.0;
    double maximum = 0.0;
};

// Everything the host contract fixes about one parameter.
struct ParameterSpec {
    std::string_view name;         // settings-key leaf and command-line flag, e.g. "intensity"
    ParameterType type;            // value type
    Kernel::FourCC code;           // serialised property code, e.g. "Inte"
    Kernel::FourCC reflected;      // reflected identifier, e.g. "inte"
    std::string_view toolLabel;    // label on the tool's panel
    std::string_view commandLabel; // label on the live filter layer's panel
    double minimum = 0.0;          // display range of numbers, and the values accepted (but see hardMaximum)
    double maximum = 0.0;
    ParameterValue defaultValue{}; // value when the settings store has none, and after Reset
    std::string_view image{};      // tool panel icon, if any
    Kernel::UnitKind unit = Kernel::UnitKind::None;
    bool persisted = true;           // kept under "tools.<filter>.<name>"
    std::string_view settingsName{}; // the settings-key leaf when it differs from name
    std::string_view labelContext{}; // the labels' localisation context; empty: "Reflected property"
    // Where the display range ends the panel only: values beyond it are accepted down to hardMinimum and up
    // to hardMaximum, which keep the work and the arithmetic of a render bounded.
    double hardMaximum = -std::numeric_limits<double>::infinity();
    double hardMinimum = std::numeric_limits<double>::infinity();
    ShownAs shown{};
};

// The lowest and highest numbers (a point's coordinates) a parameter accepts from any route: panels, drags,
// settings, loaded commands and the command line.
double LowestValue(const ParameterSpec& spec);
double HighestValue(const ParameterSpec& spec);
// Whether value lies within the accepted values (booleans always do; a point's coordinates each).
bool IsAcceptedValue(const ParameterSpec& spec, const ParameterValue& value);
// "must lie within 0 .. 100" and the like, for messages about a value that is not accepted.
std::string DescribeAcceptedValues(const ParameterSpec& spec);
// value brought within the accepted values: numbers clamped, a NaN number replaced by the default; a point
// with a NaN coordinate is the default (which may be the unset point).
double BoundNumber(const ParameterSpec& spec, double value);
int BoundNumber(const ParameterSpec& spec, int value);
inline bool BoundNumber(const ParameterSpec&, bool value) {
    return value;
}
Kernel::PointT<double> BoundNumber(const ParameterSpec& spec, Kernel::PointT<double> value);

std::string SettingsKey(std::string_view filterName, const ParameterSpec& spec);

// One parameter bound to its field in a filter's parameter record.
template <class Params>
struct Parameter {
    using Field =
        std::variant<double Params::*, bool Params::*, int Params::*, Kernel::PointT<double> Params::*>;
    ParameterSpec spec;
    Field field;
};

template <class Params>
ParameterValue GetParameter(const Params& params, const Parameter<Params>& parameter) {
    return std::visit([&](auto member) { return ParameterValue(params.*member); }, parameter.field);
}

// The field variant names every value type for every record, so GCC's -O3 bounds check also looks at
// alternatives that a small record never holds (writing a point into an 8-byte record) and warns.
#if defined(__GNUC__) && !defined(__clang__)
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Warray-bounds"
#endif

// Stores value, converting between the numeric types; false when the kinds do not match.
template <class Params>
bool SetParameter(Params& params, const Parameter<Params>& parameter, const ParameterValue& value) {
    return std::visit(
        [&](auto member) {
            using T = std::remove_reference_t<decltype(params.*member)>;
            if (const T* exact = std::get_if<T>(&value)) {
                params.*member = *exact;
                return true;
            }
            if constexpr (std::is_same_v<T, double>) {
                if (const int* whole = std::get_if<int>(&value)) {
                    params.*member = double(*whole);
                    return true;
                }
            }
            return false;
        },
        parameter.field);
}

template <class Params, std::size_t N>
Params DefaultParameters(const std::array<Parameter<Params>, N>& table) {
    Params params{};
    for (const auto& parameter : table)
        SetParameter(params, parameter, parameter.spec.defaultValue);
    return params;
}

// Writes each parameter in table order: doubles, ints and points as tagged values, booleans typed.
template <class Params, std::size_t N>
void SaveParameters(Kernel::OutSerialiser& out, const Params& params,
                    const std::array<Parameter<Params>, N>& table) {
    for (const auto& parameter : table) {
        const auto code = parameter.spec.code;
        std::visit(
            [&](auto member) {
                const auto& value = params.*member;
                using T = std::remove_cvref_t<decltype(value)>;
                if constexpr (std::is_same_v<T, bool>)
                    out.SaveType(code, value);
                else if constexpr (std::is_same_v<T, double>)
                    out.SaveTypeI(code, Kernel::TypeTag::Double, &value, sizeof value);
                else if constexpr (std::is_same_v<T, int>)
                    out.SaveTypeI(code, Kernel::TypeTag::Int32, &value, sizeof value);
                else
                    out.SaveTypeI(code, Kernel::TypeTag::Point, &value, sizeof value);
            },
            parameter.field);
    }
}

// Reads each parameter present in the stream; absent ones keep their value.
template <class Params, std::size_t N>
void LoadParameters(const Kernel::InSerialiser& in, Params& params,
                    const std::array<Parameter<Params>, N>& table) {
    for (const auto& parameter : table) {
        const auto code = parameter.spec.code;
        std::visit(
            [&](auto member) {
                auto& value = params.*member;
                using T = std::remove_cvref_t<decltype(value)>;
                if constexpr (std::is_same_v<T, bool>)
                    in.LoadType(code, value);
                else if constexpr (std::is_same_v<T, double>)
                    in.LoadTypeI(code, Kernel::TypeTag::Double, &value, sizeof value);
                else if constexpr (std::is_same_v<T, int>)
                    in.LoadTypeI(code, Kernel::TypeTag::Int32, &value, sizeof value);
                else
                    in.LoadTypeI(code, Kernel::TypeTag::Point, &value, sizeof value);
            },
            parameter.field);
    }
}

// Brings every parameter within its accepted values; every route by which values reach a command ends here.
template <class Params, std::size_t N>
void BoundParameters(Params& params, const std::array<Parameter<Params>, N>& table) {
    for (const auto& parameter : table)
        std::visit([&](auto member) { params.*member = BoundNumber(parameter.spec, params.*member); },
                   parameter.field);
}

#if defined(__GNUC__) && !defined(__clang__)
#pragma GCC diagnostic pop
#endif

// Reads the persisted parameters, with the table's defaults for absent keys.
template <class Params, std::size_t N>
void ReadSettings(Params& params, std::string_view filterName, const std::array<Parameter<Params>, N>& table);
// Writes the persisted parameters.
template <class Params, std::size_t N>
void WriteSettings(const Params& params, std::string_view filterName,
                   const std::array<Parameter<Params>, N>& table);

// Which panel a reflected property list is for: the tool's, or the live filter layer's.
enum class Panel { Tool, Command };

// Reflected properties bound to the fields of params, which owner keeps alive.
template <class Params, std::size_t N>
Kernel::ReflectedList ReflectParameters(Kernel::Counted<Kernel::Countable> owner, Params* params,
                                        const std::array<Parameter<Params>, N>& table, Panel panel);

} // namespace RasterTools

#include "frame/Parameters.inl"
