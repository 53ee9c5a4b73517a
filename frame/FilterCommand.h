#pragma once
// Shared behaviour of filter commands whose parameters are a declared table: serialisation, cloning,
// merging into a live layer's history entry, reflection and the common answers.

#include "frame/Parameters.h"
#include "host/document/Command.h"

#include <algorithm>

namespace RasterTools {

// Filter::Command's entry in the host's class registry, under the class code its table declares, below the
// host class Parent. Filter::Command must be default-constructible (for loading, which then sets its fields).
template <class Filter, class Parent>
struct FilterClassEntry {
    static Kernel::Counted<Kernel::Serialisable> CreateObject() {
        return Kernel::Counted<Kernel::Serialisable>(new typename Filter::Command());
    }
    // No property of a filter command declares a default value: one empty item.
    static const Kernel::ClassPropertiesBase::DefaultItem* DefaultSerialisation() {
        static const Kernel::ClassPropertiesBase::DefaultItem items[] = {{}};
        return items;
    }
    // Version 1 unless the table declares kClassVersion (raise it when the saved form changes).
    static constexpr unsigned short Version() {
        if constexpr (requires { Filter::kClassVersion; })
            return Filter::kClassVersion;
        else
            return 1;
    }
    // Constructed when the library loads, which registers the class for reading documents.
    static inline const Kernel::ClassProperties properties{Filter::kClassCode, &CreateObject, Version(),
                                                           DefaultSerialisation(),
                                                           &Parent::GetTypeClassProperties()};
};

// Filter describes the filter (its Params record, parameter table, description, tool identifier, class code
// and Command class); Filter::Command derives from FilterCommand<Filter>.
template <class Filter>
class FilterCommand : public RasterDevicePreviewableFilterLayerCommand {
    using Entry = FilterClassEntry<Filter, RasterDevicePreviewableFilterLayerCommand>;

public:
    using Params = typename Filter::Params;

    FilterCommand(bool liveEffect, const Params& params)
        : RasterDevicePreviewableFilterLayerCommand(liveEffect)
        , m_Params(params) {
        BoundParameters(m_Params, Filter::kParameters);
    }

    const Params& GetParameters() const noexcept { return m_Params; }

    Kernel::LocalisedString GetDescription() const override {
        return Kernel::LocalisedString(std::string(Filter::kDescription), "Command description");
    }

    bool Merge(Kernel::Counted<const Command> other) override {
        const auto* same = dynamic_cast<const typename Filter::Command*>(other.Get());
        if (!same || !IsLiveEffect()) return false;
        const auto& selection = GetSelection();
        if (HasSelection() && std::none_of(selection.begin(), selection.end(),
                                           [](const SelectedNode& node) { return node.isFilterLayer; }))
            return false;
        if (!SelectionCommandBase::IsSelectionEqualTo(this, same->GetSelection())) return false;
        m_Params = same->GetParameters();
        SetRenderCache(same->GetRenderCache());
        return true;
    }

    DomainCommand::ProgressType GetProgressType() const override {
        return DomainCommand::ProgressType::Fraction;
    }

    Kernel::ReflectedList EnumerateReflecteds() override {
        return ReflectParameters(Kernel::Counted<Kernel::Countable>(this), &m_Params, Filter::kParameters,
                                 Panel::Command);
    }

    Kernel::Counted<DocumentCommand> Clone() const override {
        return Kernel::Counted<DocumentCommand>(new typename Filter::Command(IsLiveEffect(), m_Params));
    }

    bool CanRepeat() const override { return !IsLiveEffect(); }
    ToolID GetAssociatedToolID() const override { return Filter::kToolID; }
    bool PrefersToProtectAlpha() const override { return false; }

    // The filter's own properties first, then the base's data.
    void Save(Kernel::OutSerialiser& out) const override {
        SaveParameters(out, m_Params, Filter::kParameters);
        RasterDevicePreviewableFilterLayerCommand::Save(out);
    }

    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override {
        LoadParameters(in, m_Params, Filter::kParameters);
        // A document may hold any value; the renderers only ever see bounded ones.
        BoundParameters(m_Params, Filter::kParameters);
        return RasterDevicePreviewableFilterLayerCommand::Load(in, store, version);
    }

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return Entry::properties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return Entry::properties; }

protected:
    // Only for loading: the fields are then set by Load.
    FilterCommand()
        : RasterDevicePreviewableFilterLayerCommand(false)
        , m_Params(DefaultParameters(Filter::kParameters)) {}

    Params m_Params;
};

} // namespace RasterTools
