#pragma once
// The start of a render for commands that have no kernel and always render on the processor.

#include "pipeline/Pipeline.h"

namespace RasterTools {

// Checks target (a layer format on both sides, equal sizes, an 8-bit mask covering the destination), clips
// its rectangle to the destination into rect, reports completion and brings the host copies up to date.
// Processor when the render should go on over rect; otherwise the path the render ends with.
inline RenderPath BeginProcessorOnlyRender(const RenderTarget& target, Kernel::RectT<int>& rect) {
    if (!target.source || !target.destination) return RenderPath::Failed;
    const Raster::DynamicBuffer& source = *target.source.pixels;
    const Raster::DynamicBuffer& destination = *target.destination.pixels;
    const Raster::PixelFormat format = source.GetFormat();
    if (destination.GetFormat() != format || !LayerFormatList::Contains(format)) return RenderPath::Failed;
    if (source.GetWidth() != destination.GetWidth() || source.GetHeight() != destination.GetHeight())
        return RenderPath::Failed;
    if (target.mask && (target.mask.pixels->GetFormat() != Raster::PixelFormat::MaskA8 ||
                        target.mask.pixels->GetWidth() < destination.GetWidth() ||
                        target.mask.pixels->GetHeight() < destination.GetHeight()))
        return RenderPath::Failed;
    rect = target.rect.Intersect(destination.GetBounds());
    if (rect.IsEmpty()) return RenderPath::Nothing;
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    // No kernel: the device's copies are brought to the host and the processor renders.
    Detail::SetCompleted(target.completed);
    return Detail::PrepareHostCopies(target, rect);
}

} // namespace RasterTools
