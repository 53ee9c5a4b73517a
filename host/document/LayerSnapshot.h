#pragma once
// The pixels of one raster layer as they were at a moment, kept by copying tiles only when they are about to
// change: a snapshot shares every unchanged pixel with the layer.

#include "host/document/Document.h"

#include <cstddef>
#include <unordered_map>

class LayerSnapshot final : public virtual Kernel::Countable, private PixelWriteObserver {
public:
    // Tiles are square; a change anywhere in a tile keeps the whole tile.
    static constexpr int kTileSide = 128;

    explicit LayerSnapshot(Kernel::Counted<RasterNode> layer);
    ~LayerSnapshot() override;
    LayerSnapshot(const LayerSnapshot&) = delete;
    LayerSnapshot& operator=(const LayerSnapshot&) = delete;

    const Kernel::Counted<RasterNode>& GetLayer() const noexcept { return m_Layer; }
    // The layer's size and format at the moment of the snapshot (no pixels when it had none).
    const Kernel::Counted<Raster::DynamicBuffer>& GetBase() const noexcept { return m_Base; }
    // The snapshot's pixels of rect (layer pixels, within the base's bounds); null outside them or when
    // memory cannot be had.
    Kernel::Counted<Raster::DynamicBuffer> Read(Kernel::RectT<int> rect) const;
    // Bytes held for the tiles kept so far.
    std::size_t GetKeptBytes() const noexcept { return m_KeptBytes; }
    std::size_t GetKeptTileCount() const noexcept { return m_Tiles.size(); }

private:
    // Keeps the tiles under rect whose pixels incoming would change (all of them without incoming).
    void WillWritePixels(const RasterNode& layer, Kernel::RectT<int> rect,
                         const Raster::DynamicBuffer* incoming) override;
    Kernel::RectT<int> TileRect(int column, int row) const noexcept;

    Kernel::Counted<RasterNode> m_Layer;
    // The buffer the layer had; as long as the layer still has it, tiles are copied out before they change.
    Kernel::Counted<Raster::DynamicBuffer> m_Base;
    std::unordered_map<std::uint64_t, Kernel::Counted<Raster::DynamicBuffer>> m_Tiles;
    std::size_t m_KeptBytes = 0;
};
