#include "host/document/DocumentController.h"

#include "host/document/Notifications.h"
#include "host/document/PixelEffect.h"

#include <mutex>

namespace {
struct ToolRegistry {
    std::mutex mutex;
    std::vector<DocumentController::ToolFactory> factories;
};

// Function-local so that libraries loading during static initialisation find it constructed.
ToolRegistry& GetToolRegistry() {
    static ToolRegistry registry;
    return registry;
}

// Notifications may cause notifications; beyond this depth they are reported but not delivered.
constexpr int kMaxNotifyDepth = 8;
} // namespace

void DocumentController::RegisterTool(ToolFactory factory) {
    auto& registry = GetToolRegistry();
    std::lock_guard lock(registry.mutex);
    registry.factories.push_back(std::move(factory));
}

std::size_t DocumentController::GetRegisteredToolCount() {
    auto& registry = GetToolRegistry();
    std::lock_guard lock(registry.mutex);
    return registry.factories.size();
}

DocumentController::DocumentController(Kernel::Counted<Document> document)
    : m_Document(std::move(document)) {}

void DocumentController::CreateTools() {
    std::vector<ToolFactory> factories;
    {
        auto& registry = GetToolRegistry();
        std::lock_guard lock(registry.mutex);
        factories = registry.factories;
    }
    for (const auto& factory : factories)
        factory(this);
}

void DocumentController::AddTool(Kernel::Counted<Tool> tool) {
    if (tool) m_Tools.push_back(std::move(tool));
}

Kernel::Counted<Tool> DocumentController::FindTool(ToolID id) const {
    for (const auto& tool : m_Tools)
        if (tool->GetToolID() == id) return tool;
    return {};
}

Kernel::Counted<Tool> DocumentController::SetActiveTool(Kernel::Counted<Tool> tool) {
    return std::exchange(m_ActiveTool, std::move(tool));
}

DocumentSnapshot::DocumentSnapshot(Document::NodeList layers, Document::NodeList selection)
    : m_Layers(std::move(layers))
    , m_Selection(std::move(selection)) {
    for (const auto& node : m_Layers)
        if (auto raster = Kernel::CountedCast<RasterNode>(node))
            m_Pixels.push_back(Kernel::MakeCounted<LayerSnapshot>(raster));
}

const LayerSnapshot* DocumentSnapshot::FindLayer(std::uint64_t layerId) const {
    for (const auto& layer : m_Pixels)
        if (layer->GetLayer()->GetId() == layerId) return layer.Get();
    return nullptr;
}

Kernel::Counted<Raster::DynamicBuffer> DocumentSnapshot::ReadLayerPixels(std::uint64_t layerId,
                                                                         Kernel::RectT<int> rect) const {
    const LayerSnapshot* layer = FindLayer(layerId);
    return layer ? layer->Read(rect) : nullptr;
}

std::size_t DocumentSnapshot::GetKeptBytes() const noexcept {
    std::size_t bytes = 0;
    for (const auto& layer : m_Pixels)
        bytes += layer->GetKeptBytes();
    return bytes;
}

void DocumentController::SetCurrentSnapshot(Kernel::Counted<DocumentSnapshot> snapshot) {
    m_CurrentSnapshot = std::move(snapshot);
    Report(m_CurrentSnapshot ? "snapshot nominated" : "snapshot cleared");
}

const Kernel::Counted<DocumentSnapshot>& DocumentController::NominateSnapshot() {
    SetCurrentSnapshot(TakeSnapshot());
    return m_CurrentSnapshot;
}

void DocumentController::SelectPrimaryColourContext(bool primary) {
    m_PrimaryColourContext = primary;
    Report(primary ? "colour context primary" : "colour context secondary");
}

void DocumentController::SetFillForContext(int context, const Renderer::ConsolidatedColour& colour) {
    if (context != 1 && context != 2) return;
    (context == 2 ? m_Defaults.foreground : m_Defaults.background) = colour;
    Report(std::string(context == 2 ? "foreground" : "background") + " colour " +
           Kernel::ReflectedValueTraits<Renderer::ConsolidatedColour>::Format(colour));
}

int DocumentController::GetFormat() const {
    if (!m_Document) return 0;
    for (const auto& layer : GetPixelTargets(*m_Document))
        if (layer->GetPixels()) return int(layer->GetPixels()->GetFormat());
    return 0;
}

void DocumentController::SetDocument(Kernel::Counted<Document> document) {
    if (!document) return;
    EndLiveEffectEdit();
    // A snapshot names layers of the document it was taken from.
    m_CurrentSnapshot = {};
    m_Document = std::move(document);
    Report("document replaced");
    Post(Kernel::MakeCounted<NewSelectionNotification>(this));
    Post(Kernel::MakeCounted<DocumentHistoryChangedNotification>(this));
}

Kernel::Counted<DocumentSnapshot> DocumentController::TakeSnapshot() const {
    return Kernel::MakeCounted<DocumentSnapshot>(m_Document->GetLayers(), m_Document->GetSelection());
}

void DocumentController::RestoreSnapshot(const DocumentSnapshot& snapshot) {
    while (!m_Document->GetLayers().empty())
        m_Document->RemoveLayer(m_Document->GetLayers().back());
    for (std::size_t i = 0; i < snapshot.GetLayers().size(); ++i)
        m_Document->InsertLayer(i, snapshot.GetLayers()[i]);
    Report("snapshot restored");
    SetSelection(snapshot.GetSelection());
}

void DocumentController::SetSelection(Document::NodeList selection) {
    m_Document->SetSelection(std::move(selection));
    Post(Kernel::MakeCounted<NewSelectionNotification>(this));
}

void DocumentController::BeginLiveEffectEdit(Kernel::Counted<FilterRasterNode> node) {
    m_EditingLiveEffect = true;
    Report("edit live filter layer \"" + node->GetName() + "\"");
    SetSelection({Kernel::Counted<Node>(node)});
}

void DocumentController::EndLiveEffectEdit() {
    if (!m_EditingLiveEffect) return;
    m_EditingLiveEffect = false;
    Report("end live filter edit");
}

void DocumentController::EnqueueCommand(Kernel::Counted<Command> command, bool transient) {
    if (!command) {
        Report("enqueue nothing (null command ignored)");
        return;
    }
    if (auto* wrapper = dynamic_cast<PreviewCommand*>(command.Get())) {
        Report("enqueue preview " +
               (wrapper->GetCommand() ? DescribeCommand(*wrapper->GetCommand()) : "nothing"));
        m_Document->SetPreview(wrapper->GetCommand());
        return;
    }
    if (transient) {
        Report("enqueue transient " + DescribeCommand(*command));
        m_Document->SetPreview(command);
        return;
    }
    Report("enqueue " + DescribeCommand(*command));
    m_Document->SetPreview({});
    if (auto* selective = dynamic_cast<SelectionCommandBase*>(command.Get()))
        selective->SetSelection(m_Document->GetSelection());

    // A command merges only into the newest entry, and only while nothing has been undone.
    const auto& history = m_Document->GetHistory();
    const std::size_t cursor = m_Document->GetHistoryCursor();
    if (cursor > 0 && cursor == history.size() && history.back().command->Merge(command)) {
        Report("merge into " + DescribeCommand(*history.back().command));
        Post(Kernel::MakeCounted<DocumentHistoryChangedNotification>(this));
        return;
    }
    ApplyToDocument(command);
    Post(Kernel::MakeCounted<DocumentHistoryChangedNotification>(this));
}

void DocumentController::ApplyToDocument(const Kernel::Counted<Command>& command) {
    auto filter = Kernel::CountedCast<RasterDevicePreviewableFilterLayerCommand>(command);
    if (filter && filter->IsLiveEffect()) {
        if (auto node = m_EditingLiveEffect ? m_Document->GetSingleSelectedFilterNode() : nullptr) {
            // New parameters for the layer being edited.
            m_Document->PushHistory({.kind = HistoryEntry::Kind::LiveFilterChanged,
                                     .command = command,
                                     .layer = node,
                                     .index = std::size_t(m_Document->IndexOf(*node)),
                                     .previousFilter = node->GetFilter()});
            Report("history: live filter of \"" + node->GetName() + "\" changed");
            return;
        }
        // A live command outside a live edit becomes a new live filter layer above the selection.
        std::size_t index = m_Document->GetLayers().size();
        for (const auto& selected : m_Document->GetSelection()) {
            const int at = m_Document->IndexOf(*selected);
            if (at >= 0) index = std::size_t(at) + 1;
        }
        Kernel::Counted<Node> node(new FilterRasterNode(command->GetDescription().Localise(), filter));
        m_Document->PushHistory(
            {.kind = HistoryEntry::Kind::LiveLayerAdded, .command = command, .layer = node, .index = index});
        Report("history: live filter layer \"" + node->GetName() + "\" added at " + std::to_string(index));
        return;
    }
    if (auto raster = Kernel::CountedCast<RasterCommand>(command)) {
        // The command changes the selected layers' pixels now; the entry keeps what undo needs.
        if (auto error = ApplyPixelCommand(*m_Document, raster)) {
            Report("not applied: " + *error);
            return;
        }
    } else {
        m_Document->PushHistory({.kind = HistoryEntry::Kind::PixelChange, .command = command});
    }
    Report("history: " + command->GetDescription().Localise() + " applied");
}

void DocumentController::CancelPreview() {
    if (!m_Document->GetPreview()) return;
    m_Document->SetPreview({});
    Report("preview dropped");
}

bool DocumentController::Undo() {
    if (!m_Document->Undo()) return false;
    Report("undo " + DescribeCommand(*m_Document->GetHistory()[m_Document->GetHistoryCursor()].command));
    Post(Kernel::MakeCounted<DocumentHistoryChangedNotification>(this));
    return true;
}

bool DocumentController::Redo() {
    if (!m_Document->Redo()) return false;
    Report("redo " + DescribeCommand(*m_Document->GetHistory()[m_Document->GetHistoryCursor() - 1].command));
    Post(Kernel::MakeCounted<DocumentHistoryChangedNotification>(this));
    return true;
}

void DocumentController::Post(Kernel::Counted<Kernel::Notification> notification) {
    if (!notification) return;
    Report("notify " + notification->Describe());
    if (!m_ActiveTool || m_NotifyDepth >= kMaxNotifyDepth) return;
    ++m_NotifyDepth;
    const Kernel::Counted<Tool> tool = m_ActiveTool; // the tool may be replaced while it handles this
    tool->OnNotify(std::move(notification));
    --m_NotifyDepth;
}

void DocumentController::SetHintline(std::string hint) {
    m_Hintline = std::move(hint);
    Report("hint " + m_Hintline);
}

void DocumentController::SetCursor(int cursor) {
    m_Cursor = cursor;
    Report("cursor " + std::to_string(cursor));
}

void DocumentController::Report(const std::string& event) const {
    if (m_Observer) m_Observer(event);
}

std::string DescribeCommand(const Command& command) {
    std::string text = command.GetDescription().Localise();
    // Enumerating binds getters and setters; only the getters are used here.
    if (auto* raster = dynamic_cast<RasterCommand*>(const_cast<Command*>(&command))) {
        for (const auto& property : raster->EnumerateReflecteds())
            text += " " + Kernel::FourCCToString(property->GetIdentifier()) + "=" + property->GetValueText();
        if (auto* filter = dynamic_cast<const RasterDevicePreviewableFilterLayerCommand*>(raster))
            text += filter->IsLiveEffect() ? " (live)" : "";
    }
    return text;
}

Raster::ColourProfiles DocumentController::GetProfiles() const {
    return m_Document ? m_Document->GetProfiles() : Raster::ColourProfiles{};
}
