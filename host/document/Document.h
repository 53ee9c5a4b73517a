#pragma once
// A layered document: a stack of raster layers and live filter layers, a layer selection, and its history.

#include "host/document/Command.h"
#include "host/document/RasterInterface.h"
#include "host/kernel/Countable.h"
#include "host/raster/AffineTransform.h"
#include "host/raster/DynamicBuffer.h"
#include "host/raster/ICCManager.h"
#include "host/raster/ImageMetadata.h"

#include <cstdint>
#include <string>
#include <vector>

class RasterNode;

// Told before a raster layer's pixels are changed in place, so that it can keep what was there.
class PixelWriteObserver {
public:
    virtual ~PixelWriteObserver() = default;
    // incoming: the pixels rect is about to receive (rect's size), or null when they are not known.
    virtual void WillWritePixels(const RasterNode& layer, Kernel::RectT<int> rect,
                                 const Raster::DynamicBuffer* incoming) = 0;
};

// One layer of a document. Nodes keep their identity for their whole life; history entries refer to them.
class Node : public virtual Kernel::Countable {
public:
    explicit Node(std::string name);
    std::uint64_t GetId() const noexcept { return m_Id; }
    const std::string& GetName() const noexcept { return m_Name; }
    void SetName(std::string name) { m_Name = std::move(name); }
    virtual std::string GetKindName() const = 0;

private:
    std::uint64_t m_Id;
    std::string m_Name;
};

// A layer of pixels in any layer format, placed in the document by a whole-pixel translation.
class RasterNode : public Node {
public:
    // A transparent RGBA8 layer; without pixels when the size is refused (GetPixels() is then null).
    RasterNode(std::string name, int width, int height);
    RasterNode(std::string name, Kernel::Counted<Raster::DynamicBuffer> pixels,
               Kernel::PointT<int> offset = {});

    int GetWidth() const noexcept { return m_Pixels ? m_Pixels->GetWidth() : 0; }
    int GetHeight() const noexcept { return m_Pixels ? m_Pixels->GetHeight() : 0; }
    std::string GetKindName() const override { return "raster"; }

    const Kernel::Counted<Raster::DynamicBuffer>& GetPixels() const noexcept { return m_Pixels; }
    // Replacing the buffer leaves the old one untouched, so observers of in-place writes need no word of it.
    void SetPixels(Kernel::Counted<Raster::DynamicBuffer> pixels) { m_Pixels = std::move(pixels); }
    // Whoever changes the pixels in place calls WillWritePixels first (rect in layer pixels).
    void AddWriteObserver(PixelWriteObserver* observer) { m_Observers.push_back(observer); }
    void RemoveWriteObserver(PixelWriteObserver* observer) { std::erase(m_Observers, observer); }
    void WillWritePixels(Kernel::RectT<int> rect, const Raster::DynamicBuffer* incoming = nullptr) const {
        for (PixelWriteObserver* observer : m_Observers)
            observer->WillWritePixels(*this, rect, incoming);
    }
    // Where the layer's top-left pixel sits in document pixels.
    Kernel::PointT<int> GetOffset() const noexcept { return m_Offset; }
    void SetOffset(Kernel::PointT<int> offset) noexcept { m_Offset = offset; }
    // Layer pixels to document pixels: the translation by the offset.
    Raster::AffineTransform::Params GetTransform() const noexcept;
    // The layer's rectangle in document pixels.
    Kernel::RectT<int> GetDocumentBounds() const noexcept;
    // The ICC profile of the pixels' numbers; empty for the built-in working space (see
    // Raster::ColourProfiles).
    const std::vector<std::byte>& GetColourProfile() const noexcept { return m_Profile; }
    void SetColourProfile(std::vector<std::byte> profile) { m_Profile = std::move(profile); }

private:
    Kernel::Counted<Raster::DynamicBuffer> m_Pixels;
    Kernel::PointT<int> m_Offset;
    std::vector<std::byte> m_Profile;
    std::vector<PixelWriteObserver*> m_Observers;
};

// Gives access to the filter command of a live filter layer.
class FilterParamsInterface {
public:
    virtual ~FilterParamsInterface() = default;
    virtual Kernel::Counted<RasterDevicePreviewableFilterLayerCommand> GetFilter() const = 0;
};

// A live filter layer: its command renders over the layers beneath whenever the document is drawn.
class FilterRasterNode : public Node, public FilterParamsInterface {
public:
    FilterRasterNode(std::string name, Kernel::Counted<RasterDevicePreviewableFilterLayerCommand> filter);
    Kernel::Counted<RasterDevicePreviewableFilterLayerCommand> GetFilter() const override { return m_Filter; }
    void SetFilter(Kernel::Counted<RasterDevicePreviewableFilterLayerCommand> filter) {
        m_Filter = std::move(filter);
    }
    std::string GetKindName() const override { return "live filter"; }

private:
    Kernel::Counted<RasterDevicePreviewableFilterLayerCommand> m_Filter;
};

// The pixels of one rectangle of a raster layer that a PixelChange swaps in and out. While the entry is done
// they are the pixels from before the change; while it is undone, those from after it.
struct PixelPatch {
    Kernel::Counted<RasterNode> layer;
    Kernel::RectT<int> rect;                       // in layer pixels
    Kernel::Counted<Raster::DynamicBuffer> pixels; // rect's size, the layer's format
};

// One undoable step: the command as applied and what it changed, so that it can be undone, redone and saved.
struct HistoryEntry {
    enum class Kind {
        PixelChange,       // the command changed the pixels of the selected raster layers
        LiveLayerAdded,    // the command became the filter of a new live filter layer at index
        LiveFilterChanged, // the command replaced previousFilter as the filter of layer
    };
    Kind kind = Kind::PixelChange;
    Kernel::Counted<Command> command;
    Kernel::Counted<Node> layer;
    std::size_t index = 0;
    Kernel::Counted<RasterDevicePreviewableFilterLayerCommand> previousFilter;
    std::vector<PixelPatch> patches; // PixelChange: one per changed layer
};

// The layers, selection and history of one document. Not thread-safe: the user-interface thread owns it.
class Document : public virtual Kernel::Countable {
public:
    using NodeList = std::vector<Kernel::Counted<Node>>;

    // Layers from bottom to top.
    const NodeList& GetLayers() const noexcept { return m_Layers; }
    void InsertLayer(std::size_t index, Kernel::Counted<Node> node);
    void RemoveLayer(const Kernel::Counted<Node>& node);
    // The index of node in the layer stack, or -1.
    int IndexOf(const Node& node) const;
    const Kernel::Counted<Node>& GetLayer(std::size_t index) const { return m_Layers.at(index); }

    const NodeList& GetSelection() const noexcept { return m_Selection; }
    void SetSelection(NodeList selection) { m_Selection = std::move(selection); }
    // The only selected live filter layer, or null when none or several are selected.
    Kernel::Counted<FilterRasterNode> GetSingleSelectedFilterNode() const;

    // History: entries before the cursor are done, those after it were undone and can be redone.
    const std::vector<HistoryEntry>& GetHistory() const noexcept { return m_History; }
    std::size_t GetHistoryCursor() const noexcept { return m_Cursor; }
    // Drops the undone entries, applies entry and appends it. A PixelChange's patches must hold the new
    // pixels: applying swaps them with the layer's.
    void PushHistory(HistoryEntry entry);
    // Replaces the whole history, entries before cursor counted as done, dropped the number of older entries
    // that were dropped before it (used when loading; nothing is applied).
    void RestoreHistory(std::vector<HistoryEntry> entries, std::size_t cursor, std::size_t dropped = 0);
    bool Undo();
    bool Redo();

    // History keeps the pixels that undo needs within a memory budget: once the pixels of its entries take
    // more bytes than the budget, the oldest done entries are dropped (the newest entry always stays).
    static constexpr std::size_t kDefaultHistoryBudget = std::size_t(256) << 20;
    // The budget of documents made from now on.
    static void SetDefaultHistoryBudget(std::size_t bytes) noexcept;
    static std::size_t GetDefaultHistoryBudget() noexcept;
    // Sets this document's budget and drops entries at once if history is over it.
    void SetHistoryBudget(std::size_t bytes);
    std::size_t GetHistoryBudget() const noexcept { return m_HistoryBudget; }
    // The bytes of pixels the history entries hold.
    std::size_t GetHistoryBytes() const noexcept;
    // How many of the oldest entries were dropped to stay within the budget, over the document's life.
    std::size_t GetDroppedHistoryCount() const noexcept { return m_DroppedHistory; }

    // The transient command shown over the document, not kept in history.
    const Kernel::Counted<Command>& GetPreview() const noexcept { return m_Preview; }
    void SetPreview(Kernel::Counted<Command> preview) { m_Preview = std::move(preview); }

    // The profile and EXIF, XMP and IPTC of the image the document was made from, written out again with it.
    const Raster::ImageMetadata& GetMetadata() const noexcept { return m_Metadata; }
    void SetMetadata(Raster::ImageMetadata metadata) { m_Metadata = std::move(metadata); }
    // What the document's RGB, grey and CMYK numbers mean: for each, the profile of the lowest raster layer
    // that has one of that kind (Raster::ColourProfiles says what an empty one means).
    Raster::ColourProfiles GetProfiles() const;

    // The pixel selection that limits pixel changes; null when there is none.
    const Kernel::Counted<SelectionRasterNode>& GetPixelSelection() const noexcept {
        return m_PixelSelection;
    }
    void SetPixelSelection(Kernel::Counted<SelectionRasterNode> selection) {
        m_PixelSelection = std::move(selection);
    }

private:
    void TrimHistory();

    NodeList m_Layers;
    NodeList m_Selection;
    std::vector<HistoryEntry> m_History;
    std::size_t m_Cursor = 0;
    std::size_t m_HistoryBudget = GetDefaultHistoryBudget();
    std::size_t m_DroppedHistory = 0;
    Kernel::Counted<Command> m_Preview;
    Kernel::Counted<SelectionRasterNode> m_PixelSelection;
    Raster::ImageMetadata m_Metadata;
};

// Swaps the pixels of patch with those of its layer's rectangle; false (and nothing changed) when they do not
// fit each other.
bool SwapPatchPixels(PixelPatch& patch);
