#pragma once
// What a command sees of a raster layer when it changes its pixels directly (DoEffect), and the pixel
// selection that limits the change.

#include "host/kernel/Countable.h"
#include "host/kernel/Geometry.h"
#include "host/raster/AffineTransform.h"
#include "host/raster/DynamicBuffer.h"

#include <cstdint>
#include <functional>

// A pixel selection: a MaskA8 image in document pixels (255 selected, 0 not).
class SelectionRasterNode : public virtual Kernel::Countable {
public:
    explicit SelectionRasterNode(Kernel::Counted<Raster::DynamicBuffer> mask);

    const Kernel::Counted<Raster::DynamicBuffer>& GetMask() const noexcept { return m_Mask; }
    // True when nothing is selected, which the filters treat as "the whole layer".
    bool IsSelectNone() const noexcept { return m_Spread.IsEmpty(); }
    // The smallest rectangle holding every selected pixel, in document pixels.
    Kernel::RectT<double> GetSelectedSpreadBox() const noexcept { return m_Spread; }

private:
    Kernel::Counted<Raster::DynamicBuffer> m_Mask;
    Kernel::RectT<double> m_Spread;
};

// One raster layer opened for change.
class MutableRasterInterface {
public:
    virtual ~MutableRasterInterface() = default;
    // The layer's pixels, changed in place.
    virtual Kernel::Counted<Raster::DynamicBuffer> GetPixels() const = 0;
    // The layer's pixel rectangle, (0, 0, width, height).
    virtual Kernel::RectT<int> GetRasterBoundingBox() const = 0;
    // Maps the layer's pixels to document pixels.
    virtual Raster::AffineTransform::Params GetTransform() const = 0;
    // The document's pixel selection, or null when it has none.
    virtual const SelectionRasterNode* GetSelection() const = 0;
    // The identity of the layer opened (Node::GetId), 0 when it is not a document's layer.
    virtual std::uint64_t GetLayerId() const { return 0; }
    // Host-owned abort flag (may be null), only read.
    virtual const bool* GetAbort() const { return nullptr; }
    // How a command that renders in tiles splits the work: the tile side (0: its own choice) and the worker
    // threads (0: every core). The pixels must not depend on either.
    virtual int GetTileSize() const { return 0; }
    virtual int GetThreads() const { return 0; }
    // Receives the fraction of the work done, from any thread, one call at a time.
    virtual void Progress(double fraction) const { (void)fraction; }
};

// The area of a layer that a change may touch: its bounding box, cut down to the selection's spread box
// (mapped into layer pixels, with a tolerance of 1e-6) when a selection exists and is not empty.
Kernel::RectT<int> GetEffectArea(const MutableRasterInterface& raster);
