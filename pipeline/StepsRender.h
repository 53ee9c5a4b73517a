#pragma once
// The render of commands that run their own steps rather than one pipeline kernel: the device's steps when
// the target has a device and they succeed, otherwise the processor's.

#include "pipeline/Pipeline.h"

namespace RasterTools {

// Checks target (a layer format on both sides, equal sizes, an 8-bit mask covering the destination) and clips
// its rectangle to the destination. onDevice(rect) renders on target.device and says whether it did;
// onProcessor(rect) renders with the host copies up to date and returns Processor or Aborted. Completion is
// reported once the device attempt is over, and a failed attempt is counted against the device.
template <class OnDevice, class OnProcessor>
RenderPath RenderInSteps(const RenderTarget& target, OnDevice&& onDevice, OnProcessor&& onProcessor) {
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
    const Kernel::RectT<int> rect = target.rect.Intersect(destination.GetBounds());
    if (rect.IsEmpty()) return RenderPath::Nothing;
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    if (target.device) {
        if (onDevice(rect)) {
            Detail::SetCompleted(target.completed);
            return RenderPath::Device;
        }
        if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
        Raster::Hardware::IncrementFailedKernels(target.device.Get());
    }
    return Detail::RenderOnProcessor(target, rect, [&] { return onProcessor(rect); });
}

} // namespace RasterTools
