#include "host/document/LayerSnapshot.h"

#include <algorithm>
#include <cstring>

namespace {

std::uint64_t TileKey(int column, int row) {
    return (std::uint64_t(std::uint32_t(row)) << 32) | std::uint32_t(column);
}

void CopyRect(const Raster::DynamicBuffer& from, Kernel::PointT<int> fromAt, Raster::DynamicBuffer& to,
              Kernel::PointT<int> toAt, int width, int height) {
    const std::size_t bpp = std::size_t(from.GetBytesPerPixel());
    for (int y = 0; y < height; ++y)
        std::memcpy(to.RowBytes(toAt.y + y) + std::size_t(toAt.x) * bpp,
                    from.RowBytes(fromAt.y + y) + std::size_t(fromAt.x) * bpp, std::size_t(width) * bpp);
}

// Whether incoming (placed with its pixel (0, 0) at origin) differs from base anywhere in part.
bool Differs(const Raster::DynamicBuffer& base, const Raster::DynamicBuffer& incoming,
             Kernel::RectT<int> part, Kernel::PointT<int> origin) {
    const std::size_t bpp = std::size_t(base.GetBytesPerPixel());
    for (int y = part.top; y < part.bottom; ++y)
        if (std::memcmp(base.RowBytes(y) + std::size_t(part.left) * bpp,
                        incoming.RowBytes(y - origin.y) + std::size_t(part.left - origin.x) * bpp,
                        std::size_t(part.Width()) * bpp) != 0)
            return true;
    return false;
}

} // namespace

LayerSnapshot::LayerSnapshot(Kernel::Counted<RasterNode> layer)
    : m_Layer(std::move(layer))
    , m_Base(m_Layer ? m_Layer->GetPixels() : nullptr) {
    if (m_Layer) m_Layer->AddWriteObserver(this);
}

LayerSnapshot::~LayerSnapshot() {
    if (m_Layer) m_Layer->RemoveWriteObserver(this);
}

Kernel::RectT<int> LayerSnapshot::TileRect(int column, int row) const noexcept {
    const Kernel::RectT<int> tile{column * kTileSide, row * kTileSide, (column + 1) * kTileSide,
                                  (row + 1) * kTileSide};
    return tile.Intersect(m_Base->GetBounds());
}

void LayerSnapshot::WillWritePixels(const RasterNode& layer, Kernel::RectT<int> rect,
                                    const Raster::DynamicBuffer* incoming) {
    // A layer that was given another buffer writes into that one; the base stays as it was.
    if (!m_Base || layer.GetPixels() != m_Base) return;
    const Kernel::RectT<int> written = rect;
    if (incoming && (incoming->GetFormat() != m_Base->GetFormat() || incoming->GetWidth() != rect.Width() ||
                     incoming->GetHeight() != rect.Height()))
        incoming = nullptr;
    rect = rect.Intersect(m_Base->GetBounds());
    if (rect.IsEmpty()) return;
    for (int row = rect.top / kTileSide; row <= (rect.bottom - 1) / kTileSide; ++row)
        for (int column = rect.left / kTileSide; column <= (rect.right - 1) / kTileSide; ++column) {
            const std::uint64_t key = TileKey(column, row);
            if (m_Tiles.contains(key)) continue;
            const Kernel::RectT<int> tile = TileRect(column, row);
            // A stroke's change is its bounding box, mostly unchanged pixels: only tiles that differ are
            // kept.
            if (incoming && !Differs(*m_Base, *incoming, tile.Intersect(rect), {written.left, written.top}))
                continue;
            auto kept = Raster::DynamicBuffer::Create(tile.Width(), tile.Height(), m_Base->GetFormat());
            // Without memory the tile is lost to the snapshot; reads of it then give the changed pixels.
            if (!kept) continue;
            CopyRect(*m_Base, {tile.left, tile.top}, *kept, {0, 0}, tile.Width(), tile.Height());
            m_KeptBytes += kept->GetStorageBytes();
            m_Tiles.emplace(key, std::move(kept));
        }
}

Kernel::Counted<Raster::DynamicBuffer> LayerSnapshot::Read(Kernel::RectT<int> rect) const {
    if (!m_Base || rect.IsEmpty() || rect.Intersect(m_Base->GetBounds()) != rect) return {};
    auto result = Raster::DynamicBuffer::Create(rect.Width(), rect.Height(), m_Base->GetFormat());
    if (!result) return result;
    CopyRect(*m_Base, {rect.left, rect.top}, *result, {0, 0}, rect.Width(), rect.Height());
    for (int row = rect.top / kTileSide; row <= (rect.bottom - 1) / kTileSide; ++row)
        for (int column = rect.left / kTileSide; column <= (rect.right - 1) / kTileSide; ++column) {
            const auto found = m_Tiles.find(TileKey(column, row));
            if (found == m_Tiles.end()) continue;
            const Kernel::RectT<int> tile = TileRect(column, row);
            const Kernel::RectT<int> part = tile.Intersect(rect);
            CopyRect(*found->second, {part.left - tile.left, part.top - tile.top}, *result,
                     {part.left - rect.left, part.top - rect.top}, part.Width(), part.Height());
        }
    return result;
}
