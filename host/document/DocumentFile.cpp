#include "host/document/DocumentFile.h"

#include "host/kernel/AtomicFile.h"
#include "host/kernel/Serialiser.h"

#include <zstd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <fstream>
#include <limits>

namespace DocumentFile {

namespace {

constexpr std::array<char, 8> kMagic = {'R', 'T', 'D', 'O', 'C', '\r', '\n', '\x1a'};
// 2: raster layers with their pixels and placement, pixel patches in history, the pixel selection.
// 3: the number of history entries dropped to keep history within its memory budget.
// 4: each raster layer's ICC profile, and the profile, EXIF, XMP and IPTC of the image the document was made
//    from. Versions 2 and 3 are still read (their layers have no profile: the working space).
constexpr std::uint32_t kVersion = 4;
constexpr std::uint32_t kOldestReadableVersion = 2;
constexpr int kCompressionLevel = 3;
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
    // Format, size, then the rows without padding as one zstd frame that records its content size.
    bool Image(const Raster::DynamicBuffer& image) {
        Value(std::uint8_t(image.GetFormat()));
        Value(std::int32_t(image.GetWidth()));
        Value(std::int32_t(image.GetHeight()));
        const std::size_t sizeAt = m_Bytes.size();
        Value(std::uint64_t(0));
        const std::size_t start = m_Bytes.size();
        ZSTD_CCtx* context = ZSTD_createCCtx();
        if (!context) return false;
        bool ok =
            !ZSTD_isError(ZSTD_CCtx_setParameter(context, ZSTD_c_compressionLevel, kCompressionLevel)) &&
            !ZSTD_isError(ZSTD_CCtx_setPledgedSrcSize(context, std::uint64_t(image.GetRowBytes()) *
                                                                   std::uint64_t(image.GetHeight())));
        for (int y = 0; ok && y < image.GetHeight(); ++y) {
            ZSTD_inBuffer in{image.RowBytes(y), image.GetRowBytes(), 0};
            const ZSTD_EndDirective mode = y + 1 == image.GetHeight() ? ZSTD_e_end : ZSTD_e_continue;
            for (;;) {
                const std::size_t at = m_Bytes.size();
                m_Bytes.resize(at + ZSTD_CStreamOutSize());
                ZSTD_outBuffer out{m_Bytes.data() + at, ZSTD_CStreamOutSize(), 0};
                const std::size_t left = ZSTD_compressStream2(context, &out, &in, mode);
                m_Bytes.resize(at + out.pos);
                if (ZSTD_isError(left)) {
                    ok = false;
                    break;
                }
                if (mode == ZSTD_e_end ? left == 0 : in.pos == in.size) break;
            }
        }
        ZSTD_freeCCtx(context);
        const std::uint64_t compressed = m_Bytes.size() - start;
        std::memcpy(m_Bytes.data() + sizeAt, &compressed, sizeof compressed);
        return ok;
    }
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
    // An image written by Writer::Image. Every claim is checked against the remaining bytes, the buffer
    // limits and the frame's own content size before anything is allocated or decompressed. Sets why.
    bool Image(Kernel::Counted<Raster::DynamicBuffer>& image, bool mask, std::string& why) {
        std::uint8_t code = 0;
        std::int32_t width = 0, height = 0;
        std::uint64_t compressed = 0;
        if (!Value(code) || !Value(width) || !Value(height) || !Value(compressed))
            return Why(why, "truncated");
        const auto format = Raster::PixelFormat(code);
        if (!Raster::IsValidPixelFormat(format) ||
            (mask ? format != Raster::PixelFormat::MaskA8 : !Raster::IsLayerFormat(format)))
            return Why(why, "unknown pixel format " + std::to_string(code));
        if (!Raster::DynamicBuffer::IsSizeAllowed(width, height, format))
            return Why(why, "a " + std::to_string(width) + "x" + std::to_string(height) + " " +
                                std::string(Raster::GetPixelFormatName(format)) +
                                " image is beyond the limits");
        if (!Need(compressed)) return Why(why, "pixels truncated");
        const auto frame = m_Bytes.subspan(m_At, std::size_t(compressed));
        m_At += std::size_t(compressed);
        const std::uint64_t expected =
            std::uint64_t(width) * std::uint64_t(height) * std::uint64_t(Raster::GetBytesPerPixel(format));
        if (ZSTD_getFrameContentSize(frame.data(), frame.size()) != expected ||
            ZSTD_findFrameCompressedSize(frame.data(), frame.size()) != frame.size())
            return Why(why, "pixel data does not match the image's size");
        auto buffer = Raster::DynamicBuffer::Create(width, height, format);
        if (!buffer) return Why(why, "not enough memory for the pixels");
        ZSTD_DCtx* context = ZSTD_createDCtx();
        if (!context) return Why(why, "not enough memory to decompress");
        ZSTD_inBuffer in{frame.data(), frame.size(), 0};
        bool ok = true;
        std::size_t last = 1;
        for (int y = 0; ok && y < height; ++y) {
            ZSTD_outBuffer out{buffer->RowBytes(y), buffer->GetRowBytes(), 0};
            while (ok && out.pos < out.size) {
                const std::size_t before = in.pos, produced = out.pos;
                last = ZSTD_decompressStream(context, &out, &in);
                ok = !ZSTD_isError(last) && (in.pos != before || out.pos != produced);
            }
        }
        // The frame must end exactly where the pixels do.
        if (ok && last != 0) {
            std::byte spare;
            ZSTD_outBuffer out{&spare, 1, 0};
            last = ZSTD_decompressStream(context, &out, &in);
            ok = !ZSTD_isError(last) && last == 0 && out.pos == 0;
        }
        ok = ok && in.pos == in.size;
        ZSTD_freeDCtx(context);
        if (!ok) return Why(why, "the pixels do not decompress");
        image = std::move(buffer);
        return true;
    }

    // Whether count items of at least minItemBytes each can still follow.
    bool CanHold(std::uint64_t count, std::size_t minItemBytes) const {
        return m_Ok && count <= (m_Bytes.size() - m_At) / minItemBytes;
    }
    bool AtEnd() const { return m_Ok && m_At == m_Bytes.size(); }
    bool Ok() const { return m_Ok; }

private:
    bool Why(std::string& why, std::string reason) {
        why = std::move(reason);
        m_Ok = false;
        return false;
    }
    bool Need(std::uint64_t size) {
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
    const auto keep = [&](const Kernel::Counted<Node>& node) {
        if (node && std::find(nodes.begin(), nodes.end(), node) == nodes.end()) nodes.push_back(node);
    };
    for (const auto& entry : document.GetHistory()) {
        keep(entry.layer);
        for (const auto& patch : entry.patches)
            keep(patch.layer);
    }
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
            if (!raster->GetPixels()) return fail("raster layer \"" + node->GetName() + "\" has no pixels");
            out.Value(std::int32_t(raster->GetOffset().x));
            out.Value(std::int32_t(raster->GetOffset().y));
            if (!out.Image(*raster->GetPixels()))
                return fail("the pixels of layer \"" + node->GetName() + "\" could not be compressed");
            out.Block(raster->GetColourProfile());
        } else if (const auto* live = dynamic_cast<const FilterRasterNode*>(node.Get())) {
            out.Value(LayerKind::LiveFilter);
            if (!live->GetFilter())
                return fail("live filter layer \"" + node->GetName() + "\" has no filter");
            out.Block(Kernel::SerialiseObject(*live->GetFilter()));
        } else {
            return fail("layer \"" + node->GetName() + "\" is of a kind that cannot be saved");
        }
    }

    const Raster::ImageMetadata& metadata = document.GetMetadata();
    out.Block(metadata.iccProfile);
    out.Block(metadata.exif);
    out.Text(metadata.xmp);
    out.Block(metadata.iptc);

    out.Value(std::uint32_t(document.GetSelection().size()));
    for (const auto& node : document.GetSelection())
        out.Value(IndexOrNone(document, node));
    const auto& pixelSelection = document.GetPixelSelection();
    out.Value(std::uint8_t(pixelSelection && pixelSelection->GetMask() ? 1 : 0));
    if (pixelSelection && pixelSelection->GetMask() && !out.Image(*pixelSelection->GetMask()))
        return fail("the pixel selection could not be compressed");

    out.Value(std::uint32_t(document.GetHistory().size()));
    out.Value(std::uint32_t(document.GetHistoryCursor()));
    out.Value(std::uint64_t(document.GetDroppedHistoryCount()));
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
        out.Value(std::uint32_t(entry.patches.size()));
        for (const auto& patch : entry.patches) {
            if (!patch.pixels) return fail("a history entry lacks the pixels it changed");
            out.Value(nodeIndex(patch.layer));
            out.Value(std::int32_t(patch.rect.left));
            out.Value(std::int32_t(patch.rect.top));
            if (!out.Image(*patch.pixels))
                return fail("the pixels of a history entry could not be compressed");
        }
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
    const std::string readable = " (this program reads versions " + std::to_string(kOldestReadableVersion) +
                                 " to " + std::to_string(kVersion) + ")";
    if (version < kOldestReadableVersion)
        return "document version " + std::to_string(version) +
               " is from an older rastertools and cannot be read" + readable;
    if (version > kVersion)
        return "document version " + std::to_string(version) +
               " is from a newer rastertools and cannot be read" + readable;
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
            std::int32_t x = 0, y = 0;
            Kernel::Counted<Raster::DynamicBuffer> pixels;
            std::string why;
            if (!in.Value(x) || !in.Value(y)) return damaged("placement of layer " + std::to_string(i));
            if (!in.Image(pixels, false, why))
                return damaged("pixels of layer " + std::to_string(i) + ": " + why);
            std::span<const std::byte> profile;
            if (version >= 4 && !in.Block(profile))
                return damaged("colour profile of layer " + std::to_string(i));
            auto* raster = new RasterNode(name, std::move(pixels), {x, y});
            nodes.emplace_back(raster);
            raster->SetColourProfile({profile.begin(), profile.end()});
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
    if (version >= 4) {
        std::span<const std::byte> profile, exif, iptc;
        Raster::ImageMetadata metadata;
        if (!in.Block(profile) || !in.Block(exif) || !in.Text(metadata.xmp) || !in.Block(iptc))
            return damaged("metadata");
        metadata.iccProfile.assign(profile.begin(), profile.end());
        metadata.exif.assign(exif.begin(), exif.end());
        metadata.iptc.assign(iptc.begin(), iptc.end());
        document->SetMetadata(std::move(metadata));
    }

    std::uint32_t selectionCount = 0;
    if (!in.Value(selectionCount) || !in.CanHold(selectionCount, 4)) return damaged("selection");
    Document::NodeList selection;
    for (std::uint32_t i = 0; i < selectionCount; ++i) {
        std::uint32_t index = 0;
        if (!in.Value(index) || index >= stackCount) return damaged("selection");
        selection.push_back(nodes[index]);
    }
    document->SetSelection(std::move(selection));
    std::uint8_t hasPixelSelection = 0;
    if (!in.Value(hasPixelSelection) || hasPixelSelection > 1) return damaged("pixel selection");
    if (hasPixelSelection) {
        Kernel::Counted<Raster::DynamicBuffer> mask;
        std::string why;
        if (!in.Image(mask, true, why)) return damaged("pixel selection: " + why);
        document->SetPixelSelection(Kernel::MakeCounted<SelectionRasterNode>(std::move(mask)));
    }

    std::uint32_t historyCount = 0, cursor = 0;
    std::uint64_t dropped = 0;
    if (!in.Value(historyCount) || !in.Value(cursor) || cursor > historyCount ||
        (version >= 3 && !in.Value(dropped)) || !in.CanHold(historyCount, 21))
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
        std::uint32_t patchCount = 0;
        if (!in.Value(patchCount) || !in.CanHold(patchCount, 29) ||
            (patchCount != 0 && entry.kind != HistoryEntry::Kind::PixelChange))
            return damaged("pixels of history entry " + std::to_string(i + 1));
        for (std::uint32_t p = 0; p < patchCount; ++p) {
            const std::string what = "pixels of history entry " + std::to_string(i + 1);
            std::uint32_t patchLayer = 0;
            std::int32_t left = 0, top = 0;
            PixelPatch patch;
            std::string why;
            if (!in.Value(patchLayer) || !in.Value(left) || !in.Value(top) || patchLayer >= nodeCount ||
                !(patch.layer = Kernel::CountedCast<RasterNode>(nodes[patchLayer])))
                return damaged(what);
            if (!in.Image(patch.pixels, false, why)) return damaged(what + ": " + why);
            const auto& layerPixels = *patch.layer->GetPixels();
            // 64-bit sums: the claimed corner may be anywhere in the int range.
            if (left < 0 || top < 0 ||
                std::int64_t(left) + patch.pixels->GetWidth() > layerPixels.GetWidth() ||
                std::int64_t(top) + patch.pixels->GetHeight() > layerPixels.GetHeight() ||
                patch.pixels->GetFormat() != layerPixels.GetFormat())
                return damaged(what + " do not fit their layer");
            patch.rect = {left, top, left + patch.pixels->GetWidth(), top + patch.pixels->GetHeight()};
            entry.patches.push_back(std::move(patch));
        }
        history.push_back(std::move(entry));
    }
    if (!in.AtEnd()) return damaged("unexpected data at the end");
    document->RestoreHistory(std::move(history), cursor, std::size_t(dropped));
    result = std::move(document);
    return std::nullopt;
}

bool IsDocument(const std::filesystem::path& path) {
    std::error_code error;
    if (!std::filesystem::is_regular_file(path, error)) return false;
    std::ifstream in(path, std::ios::binary);
    std::array<char, kMagic.size()> start{};
    return in.read(start.data(), std::streamsize(start.size())) && start == kMagic;
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
