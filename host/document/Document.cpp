#include "host/document/Document.h"

#include <algorithm>
#include <atomic>

namespace {
std::uint64_t NextNodeId() {
    static std::atomic<std::uint64_t> next{1};
    return next.fetch_add(1, std::memory_order_relaxed);
}
} // namespace

Node::Node(std::string name)
    : m_Id(NextNodeId())
    , m_Name(std::move(name)) {}

RasterNode::RasterNode(std::string name, int width, int height)
    : Node(std::move(name))
    , m_Pixels(Raster::DynamicBuffer::Create(width, height, Raster::PixelFormat::RGBA8)) {}

RasterNode::RasterNode(std::string name, Kernel::Counted<Raster::DynamicBuffer> pixels,
                       Kernel::PointT<int> offset)
    : Node(std::move(name))
    , m_Pixels(std::move(pixels))
    , m_Offset(offset) {}

Raster::AffineTransform::Params RasterNode::GetTransform() const noexcept {
    Raster::AffineTransform::Params params;
    params.m[2] = double(m_Offset.x);
    params.m[5] = double(m_Offset.y);
    return params;
}

Kernel::RectT<int> RasterNode::GetDocumentBounds() const noexcept {
    return {m_Offset.x, m_Offset.y, m_Offset.x + GetWidth(), m_Offset.y + GetHeight()};
}

bool SwapPatchPixels(PixelPatch& patch) {
    if (!patch.layer || !patch.pixels) return false;
    const auto& pixels = patch.layer->GetPixels();
    const Kernel::RectT<int> rect = patch.rect;
    if (!pixels || rect.IsEmpty() || pixels->GetFormat() != patch.pixels->GetFormat() ||
        rect.Intersect(pixels->GetBounds()) != rect || patch.pixels->GetWidth() != rect.Width() ||
        patch.pixels->GetHeight() != rect.Height())
        return false;
    patch.layer->WillWritePixels(rect, patch.pixels.Get());
    const std::size_t bpp = std::size_t(pixels->GetBytesPerPixel());
    const std::size_t bytes = std::size_t(rect.Width()) * bpp;
    for (int y = 0; y < rect.Height(); ++y)
        std::swap_ranges(pixels->RowBytes(rect.top + y) + std::size_t(rect.left) * bpp,
                         pixels->RowBytes(rect.top + y) + std::size_t(rect.left) * bpp + bytes,
                         patch.pixels->RowBytes(y));
    return true;
}

FilterRasterNode::FilterRasterNode(std::string name,
                                   Kernel::Counted<RasterDevicePreviewableFilterLayerCommand> filter)
    : Node(std::move(name))
    , m_Filter(std::move(filter)) {}

void Document::InsertLayer(std::size_t index, Kernel::Counted<Node> node) {
    index = std::min(index, m_Layers.size());
    m_Layers.insert(m_Layers.begin() + std::ptrdiff_t(index), std::move(node));
}

void Document::RemoveLayer(const Kernel::Counted<Node>& node) {
    std::erase(m_Layers, node);
    std::erase(m_Selection, node);
}

int Document::IndexOf(const Node& node) const {
    for (std::size_t i = 0; i < m_Layers.size(); ++i)
        if (m_Layers[i].Get() == &node) return int(i);
    return -1;
}

Kernel::Counted<FilterRasterNode> Document::GetSingleSelectedFilterNode() const {
    Kernel::Counted<FilterRasterNode> found;
    for (const auto& node : m_Selection) {
        if (auto filter = Kernel::CountedCast<FilterRasterNode>(node)) {
            if (found) return {};
            found = std::move(filter);
        }
    }
    return found;
}

namespace {
void Apply(Document& document, HistoryEntry& entry, bool forward) {
    switch (entry.kind) {
    case HistoryEntry::Kind::PixelChange:
        // The patches hold the other state's pixels, so undo and redo are the same swap.
        for (auto& patch : entry.patches)
            SwapPatchPixels(patch);
        break;
    case HistoryEntry::Kind::LiveLayerAdded:
        if (forward)
            document.InsertLayer(entry.index, entry.layer);
        else
            document.RemoveLayer(entry.layer);
        break;
    case HistoryEntry::Kind::LiveFilterChanged:
        if (auto node = Kernel::CountedCast<FilterRasterNode>(entry.layer))
            node->SetFilter(
                forward ? Kernel::CountedCast<RasterDevicePreviewableFilterLayerCommand>(entry.command)
                        : entry.previousFilter);
        break;
    }
}
} // namespace

void Document::PushHistory(HistoryEntry entry) {
    m_History.resize(m_Cursor);
    Apply(*this, entry, true);
    m_History.push_back(std::move(entry));
    m_Cursor = m_History.size();
    TrimHistory();
}

void Document::RestoreHistory(std::vector<HistoryEntry> entries, std::size_t cursor, std::size_t dropped) {
    m_History = std::move(entries);
    m_Cursor = std::min(cursor, m_History.size());
    m_DroppedHistory = dropped;
    TrimHistory();
}

namespace {
std::atomic<std::size_t> g_DefaultHistoryBudget{Document::kDefaultHistoryBudget};

std::size_t EntryBytes(const HistoryEntry& entry) {
    std::size_t bytes = 0;
    for (const auto& patch : entry.patches)
        if (patch.pixels) bytes += patch.pixels->GetStorageBytes();
    return bytes;
}
} // namespace

void Document::SetDefaultHistoryBudget(std::size_t bytes) noexcept {
    g_DefaultHistoryBudget = bytes;
}

std::size_t Document::GetDefaultHistoryBudget() noexcept {
    return g_DefaultHistoryBudget;
}

void Document::SetHistoryBudget(std::size_t bytes) {
    m_HistoryBudget = bytes;
    TrimHistory();
}

std::size_t Document::GetHistoryBytes() const noexcept {
    std::size_t bytes = 0;
    for (const auto& entry : m_History)
        bytes += EntryBytes(entry);
    return bytes;
}

void Document::TrimHistory() {
    std::size_t bytes = GetHistoryBytes();
    std::size_t drop = 0;
    // Only done entries go, oldest first: what is left still undoes back to the state after the last one
    // dropped, and redoes as before.
    while (bytes > m_HistoryBudget && drop < m_Cursor && m_History.size() - drop > 1)
        bytes -= EntryBytes(m_History[drop++]);
    if (drop == 0) return;
    m_History.erase(m_History.begin(), m_History.begin() + std::ptrdiff_t(drop));
    m_Cursor -= drop;
    m_DroppedHistory += drop;
}

bool Document::Undo() {
    if (m_Cursor == 0) return false;
    --m_Cursor;
    Apply(*this, m_History[m_Cursor], false);
    return true;
}

bool Document::Redo() {
    if (m_Cursor == m_History.size()) return false;
    Apply(*this, m_History[m_Cursor], true);
    ++m_Cursor;
    return true;
}

Raster::ColourProfiles Document::GetProfiles() const {
    Raster::ColourProfiles profiles;
    for (const auto& node : m_Layers) {
        const auto* raster = dynamic_cast<const RasterNode*>(node.Get());
        if (!raster || raster->GetColourProfile().empty()) continue;
        Raster::ColourProfiles one;
        if (!one.Add(raster->GetColourProfile())) continue;
        if (!one.rgb.empty() && profiles.rgb.empty()) profiles.rgb = std::move(one.rgb);
        if (!one.grey.empty() && profiles.grey.empty()) profiles.grey = std::move(one.grey);
        if (!one.cmyk.empty() && profiles.cmyk.empty()) profiles.cmyk = std::move(one.cmyk);
    }
    return profiles;
}
