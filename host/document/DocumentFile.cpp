#include "host/document/DocumentFile.h"

#include "host/kernel/AtomicFile.h"
#include "host/kernel/Serialiser.h"

#include <array>
#include <cstring>
#include <limits>

namespace DocumentFile {

namespace {

constexpr std::array<char, 8> kMagic = {'R', 'T', 'D', 'O', 'C', '\r', '\n', '\x1a'};
constexpr std::uint32_t kVersion = 1;
constexpr std::uint32_t kNoLayer = std::numeric_limits<std::uint32_t>::max();

enum class LayerKind : std::uint8_t { Raster = 0, LiveFilter = 1 };

std::uint64_t Checksum(std::span<const std::byte> bytes) {
    std::uint64_t hash = 0xcbf29ce484222325ull; // 64-bit FNV-1a
    for (std::byte b : bytes)
        hash = (hash ^ std::uint64_t(b)) * 0x100000001b3ull;
    return hash;
}

class Writer {
public:
    void Bytes(const void* data, std::size_t size) {
        const auto* p = static_cast<const std::byte*>(data);
        m_Bytes.insert(m_Bytes.end(), p, p + size);
    }
    template <class T>
    void Value(T value) {
        std::array<std::byte, sizeof(T)> raw;
        std::memcpy(raw.data(), &value, sizeof(T)); // little-endian host; the format is little-endian
        Bytes(raw.data(), raw.size());
    }
    void Block(std::span<const std::byte> block) {
        Value(std::uint32_t(block.size()));
        Bytes(block.data(), block.size());
    }
    void Text(const std::string& text) { Block(std::as_bytes(std::span(text.data(), text.size()))); }
    std::vector<std::byte>& Result() { return m_Bytes; }

private:
    std::vector<std::byte> m_Bytes;
};

// Reads with bounds checks; the first failure sticks and every later read fails too.
class Reader {
public:
    explicit Reader(std::span<const std::byte> bytes)
        : m_Bytes(bytes) {}
    template <class T>
    bool Value(T& value) {
        if (!Need(sizeof(T))) return false;
        std::memcpy(&value, m_Bytes.data() + m_At, sizeof(T));
        m_At += sizeof(T);
        return true;
    }
    bool Block(std::span<const std::byte>& block) {
        std::uint32_t size = 0;
        if (!Value(size) || !Need(size)) return false;
        block = m_Bytes.subspan(m_At, size);
        m_At += size;
        return true;
    }
    bool Text(std::string& text) {
        std::span<const std::byte> block;
        if (!Block(block)) return false;
        text.assign(reinterpret_cast<const char*>(block.data()), block.size());
        return true;
    }
    // Whether count items of at least minItemBytes each can still follow.
    bool CanHold(std::uint64_t count, std::size_t minItemBytes) const {
        return m_Ok && count <= (m_Bytes.size() - m_At) / minItemBytes;
    }
    bool AtEnd() const { return m_Ok && m_At == m_Bytes.size(); }
    bool Ok() const { return m_Ok; }

private:
    bool Need(std::size_t size) {
        if (m_Ok && size <= m_Bytes.size() - m_At) return true;
        m_Ok = false;
        return false;
    }
    std::span<const std::byte> m_Bytes;
    std::size_t m_At = 0;
    bool m_Ok = true;
};

std::uint32_t IndexOrNone(const Document& document, const Kernel::Counted<Node>& node) {
    const int index = node ? document.IndexOf(*node) : -1;
    return index < 0 ? kNoLayer : std::uint32_t(index);
}

} // namespace

std::vector<std::byte> Encode(const Document& document, std::string* error) {
    auto fail = [&](std::string message) {
        if (error) *error = std::move(message);
        return std::vector<std::byte>();
    };
    Writer out;
    out.Bytes(kMagic.data(), kMagic.size());
    out.Value(kVersion);

    // Layers that were undone are not in the stack but history still refers to them: keep them too,
    // after the stack, marked as detached.
    std::vector<Kernel::Counted<Node>> nodes(document.GetLayers().begin(), document.GetLayers().end());
    for (const auto& entry : document.GetHistory())
        if (entry.layer && std::find(nodes.begin(), nodes.end(), entry.layer) == nodes.end())
            nodes.push_back(entry.layer);
    auto nodeIndex = [&](const Kernel::Counted<Node>& node) {
        const auto it = std::find(nodes.begin(), nodes.end(), node);
        return it == nodes.end() ? kNoLayer : std::uint32_t(it - nodes.begin());
    };

    out.Value(std::uint32_t(nodes.size()));
    out.Value(std::uint32_t(document.GetLayers().size()));
    for (const auto& node : nodes) {
        out.Text(node->GetName());
        if (const auto* raster = dynamic_cast<const RasterNode*>(node.Get())) {
            out.Value(LayerKind::Raster);
            out.Value(std::int32_t(raster->GetWidth()));
            out.Value(std::int32_t(raster->GetHeight()));
        } else if (const auto* live = dynamic_cast<const FilterRasterNode*>(node.Get())) {
            out.Value(LayerKind::LiveFilter);
            if (!live->GetFilter())
                return fail("live filter layer \"" + node->GetName() + "\" has no filter");
            out.Block(Kernel::SerialiseObject(*live->GetFilter()));
        } else {
            return fail("layer \"" + node->GetName() + "\" is of a kind that cannot be saved");
        }
    }

    out.Value(std::uint32_t(document.GetSelection().size()));
    for (const auto& node : document.GetSelection())
        out.Value(IndexOrNone(document, node));

    out.Value(std::uint32_t(document.GetHistory().size()));
    out.Value(std::uint32_t(document.GetHistoryCursor()));
    for (const auto& entry : document.GetHistory()) {
        const auto* serialisable = dynamic_cast<const Kernel::Serialisable*>(entry.command.Get());
        if (!serialisable) return fail("a history entry holds a command that cannot be saved");
        out.Value(std::uint8_t(entry.kind));
        out.Value(nodeIndex(entry.layer));
        out.Value(std::uint32_t(entry.index));
        out.Block(Kernel::SerialiseObject(*serialisable));
        if (entry.previousFilter)
            out.Block(Kernel::SerialiseObject(*entry.previousFilter));
        else
            out.Value(std::uint32_t(0));
    }
    const std::uint64_t checksum = Checksum(out.Result());
    out.Value(checksum);
    return std::move(out.Result());
}

std::optional<std::string> Decode(std::span<const std::byte> bytes, Kernel::Counted<Document>& result) {
    if (bytes.size() < kMagic.size() || std::memcmp(bytes.data(), kMagic.data(), kMagic.size()) != 0)
        return "not a RasterTools document";
    if (bytes.size() < kMagic.size() + sizeof(std::uint32_t) + sizeof(std::uint64_t))
        return "the document is truncated";
    const auto body = bytes.first(bytes.size() - sizeof(std::uint64_t));
    std::uint64_t stored = 0;
    std::memcpy(&stored, bytes.data() + body.size(), sizeof stored);
    Reader in(body.subspan(kMagic.size()));
    std::uint32_t version = 0;
    in.Value(version);
    if (version != kVersion)
        return "document version " + std::to_string(version) +
               " is not supported (this program reads version " + std::to_string(kVersion) + ")";
    if (Checksum(body) != stored) return "the document is damaged (checksum mismatch)";

    const auto damaged = [](const std::string& what) { return "the document is damaged (" + what + ")"; };
    Kernel::FileStore store;
    auto loadCommand = [&](std::span<const std::byte> block) {
        return Kernel::DeserialiseObject(block, store);
    };

    std::uint32_t nodeCount = 0, stackCount = 0;
    if (!in.Value(nodeCount) || !in.Value(stackCount) || stackCount > nodeCount || !in.CanHold(nodeCount, 5))
        return damaged("layer count");
    auto document = Kernel::MakeCounted<Document>();
    std::vector<Kernel::Counted<Node>> nodes;
    nodes.reserve(nodeCount);
    for (std::uint32_t i = 0; i < nodeCount; ++i) {
        std::string name;
        LayerKind kind{};
        if (!in.Text(name) || !in.Value(kind)) return damaged("layer " + std::to_string(i));
        if (kind == LayerKind::Raster) {
            std::int32_t width = 0, height = 0;
            if (!in.Value(width) || !in.Value(height) || width < 0 || height < 0)
                return damaged("size of layer " + std::to_string(i));
            nodes.emplace_back(new RasterNode(name, width, height));
        } else if (kind == LayerKind::LiveFilter) {
            std::span<const std::byte> block;
            if (!in.Block(block)) return damaged("filter of layer " + std::to_string(i));
            auto filter = Kernel::CountedCast<RasterDevicePreviewableFilterLayerCommand>(loadCommand(block));
            if (!filter) return "the filter of layer \"" + name + "\" is damaged or of an unknown kind";
            nodes.emplace_back(new FilterRasterNode(name, filter));
        } else {
            return damaged("kind of layer " + std::to_string(i));
        }
    }
    for (std::uint32_t i = 0; i < stackCount; ++i)
        document->InsertLayer(i, nodes[i]);

    std::uint32_t selectionCount = 0;
    if (!in.Value(selectionCount) || !in.CanHold(selectionCount, 4)) return damaged("selection");
    Document::NodeList selection;
    for (std::uint32_t i = 0; i < selectionCount; ++i) {
        std::uint32_t index = 0;
        if (!in.Value(index) || index >= stackCount) return damaged("selection");
        selection.push_back(nodes[index]);
    }
    document->SetSelection(std::move(selection));

    std::uint32_t historyCount = 0, cursor = 0;
    if (!in.Value(historyCount) || !in.Value(cursor) || cursor > historyCount ||
        !in.CanHold(historyCount, 13))
        return damaged("history");
    std::vector<HistoryEntry> history;
    for (std::uint32_t i = 0; i < historyCount; ++i) {
        std::uint8_t kind = 0;
        std::uint32_t layer = 0, index = 0;
        std::span<const std::byte> commandBlock, previousBlock;
        if (!in.Value(kind) || !in.Value(layer) || !in.Value(index) || !in.Block(commandBlock) ||
            !in.Block(previousBlock) || kind > std::uint8_t(HistoryEntry::Kind::LiveFilterChanged) ||
            (layer != kNoLayer && layer >= nodeCount))
            return damaged("history entry " + std::to_string(i + 1));
        HistoryEntry entry{.kind = HistoryEntry::Kind(kind),
                           .command = {},
                           .layer = {},
                           .index = index,
                           .previousFilter = {}};
        entry.command = Kernel::CountedCast<Command>(loadCommand(commandBlock));
        if (!entry.command)
            return "history entry " + std::to_string(i + 1) + " holds a damaged or unknown command";
        if (layer != kNoLayer) entry.layer = nodes[layer];
        if (!previousBlock.empty()) {
            entry.previousFilter =
                Kernel::CountedCast<RasterDevicePreviewableFilterLayerCommand>(loadCommand(previousBlock));
            if (!entry.previousFilter)
                return damaged("previous filter of history entry " + std::to_string(i + 1));
        }
        const bool needsLayer = entry.kind != HistoryEntry::Kind::PixelChange;
        const bool liveCommand =
            Kernel::CountedCast<RasterDevicePreviewableFilterLayerCommand>(entry.command) != nullptr;
        if (needsLayer &&
            (!entry.layer || !liveCommand || !dynamic_cast<FilterRasterNode*>(entry.layer.Get())))
            return damaged("history entry " + std::to_string(i + 1) + " refers to no live filter layer");
        if (entry.kind == HistoryEntry::Kind::LiveFilterChanged && !entry.previousFilter)
            return damaged("history entry " + std::to_string(i + 1) + " lacks the filter it replaced");
        history.push_back(std::move(entry));
    }
    if (!in.AtEnd()) return damaged("unexpected data at the end");
    document->RestoreHistory(std::move(history), cursor);
    result = std::move(document);
    return std::nullopt;
}

std::optional<std::string> Save(const Document& document, const std::filesystem::path& path) {
    std::string error;
    const std::vector<std::byte> bytes = Encode(document, &error);
    if (bytes.empty()) return path.string() + ": cannot save: " + error;
    return Kernel::WriteFileAtomically(path, bytes);
}

std::optional<std::string> Load(const std::filesystem::path& path, Kernel::Counted<Document>& document) {
    std::string contents;
    if (auto error = Kernel::ReadWholeFile(path, contents, kMaxFileBytes)) return error;
    if (auto error = Decode(std::as_bytes(std::span(contents.data(), contents.size())), document))
        return path.string() + ": " + *error;
    return std::nullopt;
}

} // namespace DocumentFile
