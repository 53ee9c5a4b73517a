#pragma once
// The document controller: one document, its tools, its selection and how commands reach its history.

#include "host/document/Command.h"
#include "host/document/Document.h"
#include "host/document/LayerSnapshot.h"
#include "host/document/Tool.h"
#include "host/kernel/Countable.h"
#include "host/kernel/Notification.h"
#include "host/renderer/Colour.h"

#include <functional>
#include <string>
#include <vector>

// What a new document gets unless the user says otherwise.
struct DocumentDefaults {
    int width = 1024;
    int height = 768;
    double resolution = 72.0; // pixels per inch
    Renderer::ConsolidatedColour foreground{0.0f, 0.0f, 0.0f, 1.0f};
    Renderer::ConsolidatedColour background{1.0f, 1.0f, 1.0f, 1.0f};

    const Renderer::ConsolidatedColour& GetForegroundColour() const noexcept { return foreground; }
    const Renderer::ConsolidatedColour& GetBackgroundColour() const noexcept { return background; }
};

// The layer stack, selection and raster pixels at one moment. Layers are shared and pixels are kept a tile
// at a time only where they later change, so a snapshot costs memory only for what changes after it.
class DocumentSnapshot : public virtual Kernel::Countable {
public:
    DocumentSnapshot(Document::NodeList layers, Document::NodeList selection);
    const Document::NodeList& GetLayers() const noexcept { return m_Layers; }
    const Document::NodeList& GetSelection() const noexcept { return m_Selection; }

    // The snapshot's pixels of rect (layer pixels) of the raster layer with this id; null when the layer is
    // not in the snapshot or rect is not within the layer as it was.
    Kernel::Counted<Raster::DynamicBuffer> ReadLayerPixels(std::uint64_t layerId,
                                                           Kernel::RectT<int> rect) const;
    // The pixel format the layer had, if it is in the snapshot.
    const LayerSnapshot* FindLayer(std::uint64_t layerId) const;
    // Bytes of pixels kept because they changed after the snapshot was taken.
    std::size_t GetKeptBytes() const noexcept;

private:
    Document::NodeList m_Layers;
    Document::NodeList m_Selection;
    std::vector<Kernel::Counted<LayerSnapshot>> m_Pixels;
};

// Always held by Kernel::Counted: tools keep it alive through GetSafeDocumentController.
class DocumentController : public virtual Kernel::Countable {
public:
    using ToolFactory = std::function<void(Kernel::NonCounted<DocumentController>)>;
    using Observer = std::function<void(const std::string& event)>;

    // Called by libraries at load; the factories run when a controller creates its tools.
    static void RegisterTool(ToolFactory factory);
    static std::size_t GetRegisteredToolCount();

    explicit DocumentController(Kernel::Counted<Document> document);

    // Runs every registered tool factory once for this controller.
    void CreateTools();
    void AddTool(Kernel::Counted<Tool> tool);
    const std::vector<Kernel::Counted<Tool>>& GetTools() const noexcept { return m_Tools; }
    Kernel::Counted<Tool> FindTool(ToolID id) const;

    // Makes tool the current one without starting it; Start is the caller's (the host's) next step.
    Kernel::Counted<Tool> SetActiveTool(Kernel::Counted<Tool> tool);
    const Kernel::Counted<Tool>& GetActiveTool() const noexcept { return m_ActiveTool; }

    const Kernel::Counted<Document>& GetDocument() const noexcept { return m_Document; }
    // Puts another document in place of the current one (after loading), leaving any live edit.
    void SetDocument(Kernel::Counted<Document> document);

    // The document's colour profiles (Document::GetProfiles); an empty set when there is no document.
    Raster::ColourProfiles GetProfiles() const;

    const DocumentDefaults& GetDocumentDefaults() const noexcept { return m_Defaults; }
    void SetDocumentDefaults(const DocumentDefaults& defaults) { m_Defaults = defaults; }

    // The current layer stack and selection, to compare with or go back to later.
    Kernel::Counted<DocumentSnapshot> TakeSnapshot() const;
    // Puts the snapshot's layers and selection back; history is left as it is.
    void RestoreSnapshot(const DocumentSnapshot& snapshot);
    // The snapshot the user nominated for restoring from (the undo brush); null when none is.
    const Kernel::Counted<DocumentSnapshot>& GetCurrentSnapshot() const noexcept { return m_CurrentSnapshot; }
    void SetCurrentSnapshot(Kernel::Counted<DocumentSnapshot> snapshot);
    // Takes a snapshot of the document as it is now and nominates it.
    const Kernel::Counted<DocumentSnapshot>& NominateSnapshot();

    // Two colour contexts: the primary one paints with the foreground colour, the secondary one with the
    // background colour.
    bool IsPrimaryColourContextSelected() const noexcept { return m_PrimaryColourContext; }
    void SelectPrimaryColourContext(bool primary);
    // Sets the solid fill of colour context 2 (the foreground colour) or 1 (the background colour).
    void SetFillForContext(int context, const Renderer::ConsolidatedColour& colour);
    // The document's colour format: that of the first layer painted (GetPixelTargets), as an integer
    // PixelFormat; 0 without one.
    int GetFormat() const;

    // Replaces the layer selection and tells the active tool.
    void SetSelection(Document::NodeList selection);
    // Selects one live filter layer and edits its filter in place of pixels until the tool cancels.
    void BeginLiveEffectEdit(Kernel::Counted<FilterRasterNode> node);
    void EndLiveEffectEdit();
    bool IsEditingLiveEffect() const noexcept { return m_EditingLiveEffect; }

    // Transient commands replace the preview; the others are merged into or added to history.
    void EnqueueCommand(Kernel::Counted<Command> command, bool transient);
    void CancelPreview();
    bool Undo();
    bool Redo();

    // Delivers a notification to the observer and the active tool.
    void Post(Kernel::Counted<Kernel::Notification> notification);

    void SetHintline(std::string hint);
    const std::string& GetHintline() const noexcept { return m_Hintline; }
    void SetCursor(int cursor);
    int GetCursor() const noexcept { return m_Cursor; }

    // Receives one line for every notification, enqueued command, merge and history change.
    void SetObserver(Observer observer) { m_Observer = std::move(observer); }

private:
    void Report(const std::string& event) const;
    void ApplyToDocument(const Kernel::Counted<Command>& command);

    Kernel::Counted<Document> m_Document;
    DocumentDefaults m_Defaults;
    std::vector<Kernel::Counted<Tool>> m_Tools;
    Kernel::Counted<Tool> m_ActiveTool;
    bool m_EditingLiveEffect = false;
    std::string m_Hintline;
    int m_Cursor = 0;
    Observer m_Observer;
    int m_NotifyDepth = 0;
    Kernel::Counted<DocumentSnapshot> m_CurrentSnapshot;
    bool m_PrimaryColourContext = true;
};

// One line that names a command and its reflected parameters: "Add Noise inte=0.5 mono=false".
std::string DescribeCommand(const Command& command);
