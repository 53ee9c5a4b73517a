#pragma once
// The renderer's span-populator contract: how a command fills a layer's pixels for a rectangle.

#include "host/kernel/Countable.h"
#include "host/kernel/Geometry.h"
#include "host/raster/AffineTransform.h"
#include "host/raster/DynamicBuffer.h"

namespace Renderer {

// What a fill reads: the layer's pixels and their bounds in document units.
class SpanPopulatorBitmapFillMutationTarget {
public:
    SpanPopulatorBitmapFillMutationTarget(Kernel::Counted<Raster::DynamicBuffer> source,
                                          Kernel::RectT<double> bounds)
        : m_Source(std::move(source))
        , m_Bounds(bounds) {}

    const Kernel::Counted<Raster::DynamicBuffer>& GetSource() const noexcept { return m_Source; }
    Kernel::RectT<double> GetBounds() const noexcept { return m_Bounds; }

private:
    Kernel::Counted<Raster::DynamicBuffer> m_Source;
    Kernel::RectT<double> m_Bounds;
};

// A command that renders pixels through span populators. Both forms fill rect of the destination buffer
// (in its format) from the source; transform maps source pixels to the view (identity when the layer is
// rendered at its own resolution). Const: tiles call them on several threads at once.
class SpanPopulatorBitmapFillMutationHost {
public:
    virtual ~SpanPopulatorBitmapFillMutationHost() = default;

    // Fill-target form: the source and bounds come from target.
    virtual void PrepareSpanPopulator(const SpanPopulatorBitmapFillMutationTarget* target,
                                      Kernel::RectT<int> rect, Kernel::Counted<Raster::DynamicBuffer> buffer,
                                      Raster::AffineTransform::Params transform, bool, bool* abort,
                                      int) const = 0;
    // Buffer form.
    virtual void PrepareSpanPopulator(Kernel::Counted<Raster::DynamicBuffer> source, int,
                                      Kernel::RectT<double> bounds, Raster::AffineTransform::Params transform,
                                      Kernel::RectT<int> rect,
                                      Kernel::Counted<Raster::DynamicBuffer> destination,
                                      bool* abort) const = 0;
};

} // namespace Renderer
