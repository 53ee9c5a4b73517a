#pragma once
// Shared behaviour of filter commands whose parameters are a declared table: serialisation, cloning,
// merging into a live layer's history entry, reflection and the common answers.

#include "frame/Parameters.h"
#include "host/document/Command.h"

#include <algorithm>

namespace RasterTools {

// Filter describes the filter (its Params record, parameter table, description, tool identifier, class code
// and Command class); Filter::Command derives from FilterCommand<Filter>.
template <class Filter>
class FilterCommand : public RasterDevicePreviewableFilterLayerCommand {
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
        m_Params = same->m_Params;
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

    // The class registry's factory: a command with default fields, which Load then sets.
    static Kernel::Counted<Kernel::Serialisable> CreateObject() {
        return Kernel::Counted<Kernel::Serialisable>(new typename Filter::Command());
    }

    // No property of a filter command declares a default value: one empty item.
    static const Kernel::ClassPropertiesBase::DefaultItem* __GetDefaultSerialisation() {
        static const Kernel::ClassPropertiesBase::DefaultItem items[] = {{}};
        return items;
    }

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

protected:
    // Only for loading: the fields are then set by Load.
    FilterCommand()
        : RasterDevicePreviewableFilterLayerCommand(false)
        , m_Params(DefaultParameters(Filter::kParameters)) {}

    Params m_Params;

private:
    // The table's class code, version 1 unless it declares kClassVersion (raise it when the saved form
    // changes). Constructed when the library loads, which registers the class for reading documents.
    static constexpr unsigned short ClassVersion() {
        if constexpr (requires { Filter::kClassVersion; })
            return Filter::kClassVersion;
        else
            return 1;
    }
    static inline const Kernel::ClassProperties ms_ClassProperties{
        Filter::kClassCode, &CreateObject, ClassVersion(), __GetDefaultSerialisation(),
        &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties()};
};

} // namespace RasterTools
