// Template bodies of Parameters.h that need the host's settings store and reflection classes.

#include "host/document/VeyraController.h"

namespace RasterTools {

template <class Params, std::size_t N>
void ReadSettings(Params& params, std::string_view filterName,
                  const std::array<Parameter<Params>, N>& table) {
    auto& store = VeyraController::GetInstance();
    for (const auto& parameter : table) {
        const ParameterSpec& spec = parameter.spec;
        if (!spec.persisted) continue;
        const std::string key = SettingsKey(filterName, spec);
        std::visit(
            [&](auto member) {
                auto& value = params.*member;
                using T = std::remove_cvref_t<decltype(value)>;
                const T fallback = std::get<T>(spec.defaultValue);
                if constexpr (std::is_same_v<T, bool>)
                    value = store.GetBoolForKey(key, fallback);
                else if constexpr (std::is_same_v<T, double>)
                    value = store.GetDoubleForKey(key, fallback);
                else if constexpr (std::is_same_v<T, int>)
                    value = store.GetIntForKey(key, fallback);
                else
                    value = fallback; // points are placed by the tool, not remembered
                // The store is a file anyone may edit: its values are taken only within bounds.
                value = BoundNumber(spec, value);
            },
            parameter.field);
    }
}

template <class Params, std::size_t N>
void WriteSettings(const Params& params, std::string_view filterName,
                   const std::array<Parameter<Params>, N>& table) {
    auto& store = VeyraController::GetInstance();
    for (const auto& parameter : table) {
        const ParameterSpec& spec = parameter.spec;
        if (!spec.persisted) continue;
        const std::string key = SettingsKey(filterName, spec);
        std::visit(
            [&](auto member) {
                const auto& value = params.*member;
                using T = std::remove_cvref_t<decltype(value)>;
                if constexpr (std::is_same_v<T, bool>)
                    store.SetBoolForKey(key, value);
                else if constexpr (std::is_same_v<T, double>)
                    store.SetDoubleForKey(key, value);
                else if constexpr (std::is_same_v<T, int>)
                    store.SetIntForKey(key, value);
            },
            parameter.field);
    }
}

template <class Params, std::size_t N>
Kernel::ReflectedList ReflectParameters(Kernel::Counted<Kernel::Countable> owner, Params* params,
                                        const std::array<Parameter<Params>, N>& table, Panel panel) {
    Kernel::ReflectedList list;
    for (const auto& parameter : table) {
        const ParameterSpec& spec = parameter.spec;
        Kernel::LocalisedString label(std::string(panel == Panel::Tool ? spec.toolLabel : spec.commandLabel),
                                      spec.labelContext.empty() ? std::string("Reflected property")
                                                                : std::string(spec.labelContext));
        Kernel::AttributeList attributes;
        if (panel == Panel::Tool && !spec.image.empty())
            attributes.emplace_back(new Kernel::ImageAttribute(std::string(spec.image)));
        if (spec.unit != Kernel::UnitKind::None)
            attributes.emplace_back(new Kernel::ValueTypeAttribute(spec.unit));
        std::visit(
            [&](auto member) {
                using T = std::remove_cvref_t<decltype(params->*member)>;
                // The getter and setter keep the owner alive for as long as a panel holds the property.
                auto get = [owner, params, member] { return params->*member; };
                auto set = [owner, params, member, &spec](T value) {
                    params->*member = BoundNumber(spec, value);
                };
                if constexpr (std::is_same_v<T, double>)
                    list.emplace_back(new Kernel::ReflectedUnitRangeBinding(spec.reflected, std::move(label),
                                                                            spec.minimum, spec.maximum, get,
                                                                            set, std::move(attributes)));
                else
                    list.emplace_back(new Kernel::ReflectedBinding<T>(spec.reflected, std::move(label), get,
                                                                      set, std::move(attributes)));
            },
            parameter.field);
    }
    return list;
}

} // namespace RasterTools
