// The procedural texture tool: editing operations, its own history, presets and origin gestures.
#include "filters/generate/ProceduralTextureTool.h"

#include "frame/Registration.h"
#include "host/document/Document.h"
#include "host/document/DocumentController.h"
#include "host/document/Notifications.h"
#include "host/kernel/Reflection.h"

#include <charconv>

namespace RasterTools {

[[maybe_unused]] const ToolRegistration<ProceduralTextureTool> kProceduralTextureToolRegistration;

using Kernel::Counted;

namespace {

const char* const HistoryLabels[ProceduralTextureTool::HistoryMessageCount] = {
    "Reset to empty",
    "Add equation",
    "Delete equation",
    "Change equation",
    "Change equation channel mask",
    "Add input",
    "Delete input",
    "Rename input",
    "Change input description",
    "Change input range minimum",
    "Change input range maximum",
    "Change input value",
    "Apply preset",
    "Apply inputs preset",
    "Use degrees for angles",
    "Use radians for angles",
};

// Values for a set: the old values of inputs that kept their name and kind, defaults for the others.
Counted<const ExpressionConstantValues> CarryValues(const ExpressionConstantSet& oldSet,
                                                    const ExpressionConstantValues* oldValues,
                                                    const ExpressionConstantSet& newSet) {
    auto values = ExpressionConstantValues::Create(newSet);
    if (!oldValues) return values;
    for (std::size_t i = 0; i < newSet.GetCount(); ++i) {
        const int old = oldSet.IndexOf(newSet.Get(i).GetConstant());
        if (old >= 0 && std::size_t(old) < oldValues->GetCount() &&
            oldSet.Get(std::size_t(old)).GetKind() == newSet.Get(i).GetKind())
            values->Set(i, oldValues->Get(std::size_t(old)));
    }
    return values;
}

} // namespace

const char* ProceduralTextureTool::GetHistoryLabel(int message) {
    return message >= 0 && message < HistoryMessageCount ? HistoryLabels[message] : nullptr;
}

void ProceduralTextureTool::CreateTool(Kernel::NonCounted<DocumentController> controller) {
    controller->AddTool(Counted<Tool>(new ProceduralTextureTool(controller)));
}

ProceduralTextureTool::ProceduralTextureTool(Kernel::NonCounted<DocumentController> controller)
    : FilterLayerEffectTool(controller) {
    const auto& preset = ProceduralTextureCommand::GetStarterPresets()[0];
    m_State = {preset.GetConfig(), preset.GetValues(), {}, -1};
    m_Property = ProceduralTextureConfigProperty(m_State.config, m_State.values);
    m_History.push_back({m_State, "Start"});
    m_HistoryIndex = 0;
}

const std::vector<std::pair<std::string, ProceduralTextureConfigProperty>>&
ProceduralTextureTool::GetPresets() {
    static const std::vector<std::pair<std::string, ProceduralTextureConfigProperty>> presets = [] {
        std::vector<std::pair<std::string, ProceduralTextureConfigProperty>> list;
        const auto& starters = ProceduralTextureCommand::GetStarterPresets();
        list.emplace_back("Default", starters[0]);
        const char* names[] = {"Stripes", "Rings", "Checkerboard", "Noise marble", "Colour gradient"};
        for (std::size_t i = 0; i < starters.size() && i < std::size(names); ++i)
            list.emplace_back(names[i], starters[i]);
        return list;
    }();
    return presets;
}

void ProceduralTextureTool::Push(State state, std::string label) {
    m_State = std::move(state);
    m_Property.SetConfig(m_State.config);
    m_Property.SetValues(m_State.values);
    m_History.resize(std::size_t(m_HistoryIndex + 1));
    m_History.push_back({m_State, std::move(label)});
    m_HistoryIndex = int(m_History.size()) - 1;
    Changed();
}

void ProceduralTextureTool::Restore(int index) {
    m_HistoryIndex = index;
    m_State = m_History[std::size_t(index)].state;
    m_Property.SetConfig(m_State.config);
    m_Property.SetValues(m_State.values);
    Changed();
}

void ProceduralTextureTool::Changed() {
    Notify(Counted<Kernel::Notification>(
        new ToolParametersChangedNotification(GetUnsafeDocumentController(), GetToolID())));
    Preview(false);
}

bool ProceduralTextureTool::AddEquation() {
    State next = m_State;
    next.config = m_State.config->AddEquation();
    Push(std::move(next), HistoryLabels[AddEquationMessage]);
    return true;
}

bool ProceduralTextureTool::DeleteEquation(std::size_t index) {
    if (index >= m_State.config->GetEquationCount()) return false;
    State next = m_State;
    next.config = m_State.config->DeleteEquation(index);
    Push(std::move(next), HistoryLabels[DeleteEquationMessage]);
    return true;
}

bool ProceduralTextureTool::ReplaceEquation(std::size_t index, const ProceduralTextureEquation& equation,
                                            bool maskOnly) {
    if (index >= m_State.config->GetEquationCount()) return false;
    const auto config = m_State.config->ReplaceEquation(index, equation);
    if (config == m_State.config) return false;
    State next = m_State;
    next.config = config;
    Push(std::move(next), HistoryLabels[maskOnly ? ChangeEquationChannelMask : ChangeEquation]);
    return true;
}

bool ProceduralTextureTool::SetAnglesInRadians(bool radians) {
    const auto config = m_State.config->ChangeAnglesInRadians(radians);
    if (config == m_State.config) return false;
    State next = m_State;
    next.config = config;
    Push(std::move(next), HistoryLabels[radians ? UseRadians : UseDegrees]);
    return true;
}

bool ProceduralTextureTool::ReplaceConstantSet(Counted<const ExpressionConstantSet> set,
                                               HistoryMessage message) {
    if (!set) return false;
    const auto config = m_State.config->ReplaceConstantSet(set);
    if (config == m_State.config) return false;
    State next = m_State;
    next.values = CarryValues(m_State.config->GetConstantSet(), m_State.values.Get(), *set);
    next.config = config;
    next.inputsPreset = -1;
    if (!GetHistoryLabel(message)) {
        m_State = std::move(next); // an unknown label records nothing
        Changed();
        return true;
    }
    Push(std::move(next), HistoryLabels[message]);
    return true;
}

bool ProceduralTextureTool::SetConstantValue(std::size_t index, ExpressionConstantValue value,
                                             bool pushHistory) {
    if (!m_State.values || index >= m_State.values->GetCount()) return false;
    if (m_State.values->Get(index) == value) return false;
    auto values = m_State.values->Clone();
    values->Set(index, value);
    m_State.values = values;
    return ConstantValueChanged(pushHistory);
}

bool ProceduralTextureTool::ConstantValueChanged(bool pushHistory) {
    m_State.inputsPreset = m_Property.FindPresetMatch(*m_State.values);
    if (!pushHistory) {
        Changed();
        return true;
    }
    Push(m_State, HistoryLabels[ChangeInputValue]);
    return true;
}

bool ProceduralTextureTool::CaptureConstantSet(int message) {
    const char* label = GetHistoryLabel(message);
    if (!label) return false;
    Push(m_State, label);
    return true;
}

bool ProceduralTextureTool::ApplyPreset(const ProceduralTextureConfigProperty& property) {
    if (!property.GetConfig()) return false;
    State next{property.GetConfig(),
               property.GetValues()
                   ? property.GetValues()
                   : ExpressionConstantValues::Create(property.GetConfig()->GetConstantSet()),
               m_State.origin, -1};
    if (next.config == m_State.config && next.values && m_State.values && *next.values == *m_State.values)
        return false;
    m_Property = property;
    Push(std::move(next), HistoryLabels[ApplyPresetMessage]);
    return true;
}

bool ProceduralTextureTool::BeginBlank() {
    const auto blank = Config::CreateEmpty(m_State.config->GetColourFormat());
    if (blank == m_State.config) return false;
    m_Property = ProceduralTextureConfigProperty(blank, nullptr);
    Push({blank, ExpressionConstantValues::Create(blank->GetConstantSet()), m_State.origin, -1},
         HistoryLabels[ResetToEmpty]);
    return true;
}

bool ProceduralTextureTool::SetOrigin(Kernel::PointT<double> origin, bool pushHistory) {
    if (!std::isfinite(origin.x) || !std::isfinite(origin.y)) return false;
    origin.x = std::clamp(origin.x, -ProceduralOriginLimit, ProceduralOriginLimit);
    origin.y = std::clamp(origin.y, -ProceduralOriginLimit, ProceduralOriginLimit);
    if (origin == m_State.origin && !(pushHistory && m_OriginMoved)) return false;
    m_State.origin = origin;
    if (pushHistory) {
        m_OriginMoved = false;
        Push(m_State, "Set origin");
    } else {
        m_OriginMoved = true;
        Changed();
    }
    return true;
}

bool ProceduralTextureTool::AddInputsPreset(const std::string& name) {
    if (!CanAddInputsPreset() || !m_State.values) return false;
    if (!m_Property.AddPreset(name, m_State.values->Clone())) return false;
    State next = m_State;
    next.inputsPreset = int(m_Property.GetPresets().size()) - 1;
    m_State = next;
    return true;
}

bool ProceduralTextureTool::ReplaceInputsPreset(int index) {
    if (index < 0 || !m_State.values) return false;
    if (!m_Property.ReplacePreset(std::size_t(index), m_State.values->Clone())) return false;
    m_State.inputsPreset = index;
    return true;
}

bool ProceduralTextureTool::DeleteInputsPreset() {
    if (!CanDeleteInputsPreset() || !m_Property.DeletePreset(std::size_t(m_State.inputsPreset))) return false;
    m_State.inputsPreset = -1;
    return true;
}

bool ProceduralTextureTool::RenameInputsPreset(const std::string& name) {
    return CanRenameInputsPreset() && m_Property.RenamePreset(std::size_t(m_State.inputsPreset), name);
}

bool ProceduralTextureTool::SelectInputsPreset(int index) {
    const auto& presets = m_Property.GetPresets();
    if (index < 0 || std::size_t(index) >= presets.size()) return false;
    const auto& values = presets[std::size_t(index)].values;
    if (index == m_State.inputsPreset && m_State.values && *values == *m_State.values) return false;
    State next = m_State;
    next.values = values;
    next.inputsPreset = index;
    Push(std::move(next), HistoryLabels[ApplyInputsPreset]);
    return true;
}

std::string ProceduralTextureTool::GetInputsPresetDisplayString() const {
    const auto& presets = m_Property.GetPresets();
    if (m_State.inputsPreset < 0 || std::size_t(m_State.inputsPreset) >= presets.size()) return "Custom";
    return presets[std::size_t(m_State.inputsPreset)].name;
}

Counted<ProceduralTextureConfigProperty> ProceduralTextureTool::CreatePresetProperty() const {
    auto property = Kernel::MakeCounted<ProceduralTextureConfigProperty>(m_Property);
    property->SetConfig(m_State.config);
    property->SetValues(m_State.values);
    return property;
}

bool ProceduralTextureTool::PropertyIsCompatible(const Kernel::Serialisable& property) {
    return dynamic_cast<const ProceduralTextureConfigProperty*>(&property) != nullptr;
}

bool ProceduralTextureTool::ApplyPresetProperty(const Kernel::Serialisable& property) {
    const auto* config = dynamic_cast<const ProceduralTextureConfigProperty*>(&property);
    return config && ApplyPreset(*config);
}

std::string ProceduralTextureTool::GetPresetDisplayString() const {
    for (const auto& [name, property] : GetPresets())
        if (property.GetConfig() == m_State.config) return name;
    return "Custom";
}

bool ProceduralTextureTool::Undo() {
    if (!CanUndo()) return false;
    Restore(m_HistoryIndex - 1);
    return true;
}

bool ProceduralTextureTool::Redo() {
    if (!CanRedo()) return false;
    Restore(m_HistoryIndex + 1);
    return true;
}

bool ProceduralTextureTool::SetHistoryIndex(int index) {
    if (index < 0 || index >= int(m_History.size()) || index == m_HistoryIndex) return false;
    Restore(index);
    return true;
}

std::string ProceduralTextureTool::GetHistoryDescription(int index) const {
    if (index < 0 || index >= int(m_History.size())) return {};
    return Kernel::LocalisedString(m_History[std::size_t(index)].label,
                                   "Procedural Texture tool history item")
        .Localise();
}

void ProceduralTextureTool::Start(Counted<Tool> previousTool) {
    if (GetEditingLiveEffect()) {
        if (const auto live = FindSelectedLiveFilter()) {
            m_State = {live->GetConfig(),
                       live->GetConstantValues()
                           ? live->GetConstantValues()
                           : ExpressionConstantValues::Create(live->GetConfig()->GetConstantSet()),
                       live->GetOrigin(), -1};
            m_Property = ProceduralTextureConfigProperty(m_State.config, m_State.values);
        }
    }
    m_History.clear();
    m_History.push_back({m_State, "Start"});
    m_HistoryIndex = 0;
    FilterLayerEffectTool::Start(std::move(previousTool));
}

void ProceduralTextureTool::UpdateHintline() {
    ChangeHintline(Kernel::LocalisedString(std::string(ProceduralTextureFilter::kHint), "Hintline"), 0);
}

bool ProceduralTextureTool::OnClicked(const ToolPointSpread& point, const Raster::AffineTransform::Params&) {
    SetOrigin(point.GetSpreadPoint(), true);
    return true;
}

void ProceduralTextureTool::OnBeginDrag(const ToolPointSpread& point) {
    Tool::OnBeginDrag(point);
    SetOrigin(point.GetSpreadPoint(), false);
}

void ProceduralTextureTool::OnDrag(const ToolPointSpread& point) {
    Tool::OnDrag(point);
    SetOrigin(point.GetSpreadPoint(), false);
}

void ProceduralTextureTool::OnEndDrag(const ToolPointSpread& point) {
    Tool::OnEndDrag(point);
    SetOrigin(point.GetSpreadPoint(), true);
}

bool ProceduralTextureTool::OnDoubleClicked(const ToolPointSpread& point) {
    return SetOrigin(point.GetSpreadPoint(), true);
}

bool ProceduralTextureTool::AutoCommitIfRequired(bool userInitiated) {
    // A texture that does not compile is never committed.
    if (!ProceduralTextureCommand::ValidateConfig(m_State.config, m_State.values)) return false;
    return FilterLayerEffectTool::AutoCommitIfRequired(userInitiated);
}

void ProceduralTextureTool::Commit() {
    EffectTool::Commit();
    EnqueueCommand(MakeCommand(), false);
}

void ProceduralTextureTool::Preview(bool final) {
    EnqueueCommand(MakeCommand(), final || !GetEditingLiveEffect());
}

void ProceduralTextureTool::Reset() {
    BeginBlank();
}

Counted<Command> ProceduralTextureTool::MakeCommand() const {
    return Counted<Command>(new ProceduralTextureCommand(GetEditingLiveEffect(), m_State.origin, 1.0, 0,
                                                         m_State.config, m_State.values));
}

Counted<ProceduralTextureCommand> ProceduralTextureTool::FindSelectedLiveFilter() const {
    const auto controller = GetSafeDocumentController();
    if (!controller) return {};
    const auto node = controller->GetDocument()->GetSingleSelectedFilterNode();
    return node ? Kernel::CountedCast<ProceduralTextureCommand>(node->GetFilter()) : nullptr;
}

// Besides the host's, the tool's panel: the origin, whole-config presets, one text per equation ("rgb=EXPR"
// style: the channel letters, '=', the text), the angle unit, input values ("name=value"), input presets and
// the history's undo and redo.
Kernel::ReflectedList ProceduralTextureTool::EnumerateReflecteds() {
    using namespace Kernel;
    ReflectedList list = FilterLayerEffectTool::EnumerateReflecteds();
    const Counted<Countable> owner(this);
    const auto label = [](const char* text) {
        return LocalisedString(text, "Procedural Texture tool reflection");
    };
    list.push_back(Counted<Reflected>(new ReflectedBinding<PointT<double>>(
        MakeFourCC("Orgn"), label("Origin"), [owner, this] { return m_State.origin; },
        [owner, this](PointT<double> origin) { SetOrigin(origin, true); })));
    std::vector<LocalisedString> names;
    for (const auto& [name, property] : GetPresets())
        names.emplace_back(name, "Procedural texture presets");
    list.push_back(Counted<Reflected>(new ReflectedEnum(
        MakeFourCC("Prst"), label("Presets"), names,
        [owner, this] {
            const auto& presets = GetPresets();
            for (std::size_t i = 1; i < presets.size(); ++i)
                if (presets[i].second.GetConfig() == m_State.config) return int(i);
            return 0;
        },
        [owner, this](int index) {
            const auto& presets = GetPresets();
            if (index >= 0 && std::size_t(index) < presets.size())
                ApplyPreset(presets[std::size_t(index)].second);
        })));
    list.push_back(Counted<Reflected>(
        new ReflectedAction(MakeFourCC("AdEq"), label("Add equation"), [owner, this] { AddEquation(); })));
    list.push_back(Counted<Reflected>(
        new ReflectedAction(MakeFourCC("Blnk"), label("Begin blank"), [owner, this] { BeginBlank(); })));
    for (std::size_t i = 0; i < m_State.config->GetEquationCount() && i < 9; ++i) {
        const FourCC code = MakeFourCC("Eq0 ") | FourCC('1' + i);
        list.push_back(Counted<Reflected>(new ReflectedBinding<UTF8String>(
            code, label("Equation"),
            [owner, this, i] {
                if (i >= m_State.config->GetEquationCount()) return UTF8String("");
                const auto& equation = *m_State.config->GetEquations()[i];
                return UTF8String(
                    ProceduralTextureCommand::FormatEquation(m_State.config->GetColourFormat(), equation));
            },
            [owner, this, i](UTF8String text) {
                const auto equation =
                    ProceduralTextureCommand::ParseEquation(m_State.config->GetColourFormat(), text.str());
                if (equation) ReplaceEquation(i, *equation, false);
            })));
    }
    list.push_back(Counted<Reflected>(
        new ReflectedAction(MakeFourCC("DlEq"), label("Delete last equation"), [owner, this] {
            if (m_State.config->GetEquationCount() > 0)
                DeleteEquation(m_State.config->GetEquationCount() - 1);
        })));
    list.push_back(Counted<Reflected>(new ReflectedBinding<bool>(
        MakeFourCC("Rads"), label("Angles in radians"),
        [owner, this] { return m_State.config->GetAnglesInRadians(); },
        [owner, this](bool radians) { SetAnglesInRadians(radians); })));
    list.push_back(Counted<Reflected>(new ReflectedBinding<UTF8String>(
        MakeFourCC("Inpt"), label("Input value"),
        [owner, this] {
            std::string text;
            const auto& set = m_State.config->GetConstantSet();
            for (std::size_t i = 0; i < set.GetCount() && m_State.values && i < m_State.values->GetCount();
                 ++i)
                text += (i ? " " : "") + set.Get(i).GetConstant() + "=" +
                        FormatParameterValue(ExpressionConstantValues::ToDouble(m_State.values->Get(i)));
            return UTF8String(text);
        },
        [owner, this](UTF8String text) {
            const std::string assignment = text.str();
            const auto equals = assignment.find('=');
            if (equals == std::string::npos) return;
            const int index = m_State.config->GetConstantSet().IndexOf(assignment.substr(0, equals));
            const auto value = ParseParameterValue(ParameterType::Double, assignment.substr(equals + 1));
            if (index < 0 || !value) return;
            const double number = std::get<double>(*value);
            const auto& input = m_State.config->GetConstantSet().Get(std::size_t(index));
            if (input.IsVector()) return;
            SetConstantValue(std::size_t(index),
                             input.GetKind() == ExpressionConstant::Integer
                                 ? ExpressionConstantValue(int(std::lround(number)))
                                 : ExpressionConstantValue(number),
                             true);
        })));
    list.push_back(Counted<Reflected>(new ReflectedBinding<UTF8String>(
        MakeFourCC("IPAd"), label("Add inputs preset"),
        [owner, this] { return UTF8String(GetInputsPresetDisplayString()); },
        [owner, this](UTF8String name) { AddInputsPreset(name.str()); })));
    list.push_back(Counted<Reflected>(new ReflectedBinding<int>(
        MakeFourCC("IPSl"), label("Inputs preset"), [owner, this] { return m_State.inputsPreset; },
        [owner, this](int index) { SelectInputsPreset(index); })));
    list.push_back(Counted<Reflected>(
        new ReflectedAction(MakeFourCC("TUnd"), label("Undo"), [owner, this] { Undo(); })));
    list.push_back(Counted<Reflected>(
        new ReflectedAction(MakeFourCC("TRed"), label("Redo"), [owner, this] { Redo(); })));
    list.push_back(Counted<Reflected>(new ReflectedBinding<UTF8String>(
        MakeFourCC("Hist"), label("History"),
        [owner, this] {
            std::string text;
            for (int i = 0; i < GetNumberOfHistoryStates(); ++i)
                text +=
                    std::string(i ? " | " : "") + (i == m_HistoryIndex ? "*" : "") + GetHistoryDescription(i);
            return UTF8String(text);
        },
        nullptr)));
    return list;
}

} // namespace RasterTools
