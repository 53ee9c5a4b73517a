// The device half of a render and the steps around the processor half.
#include "pipeline/Pipeline.h"

namespace RasterTools {

namespace {

using Raster::HardwareCache;

// Keeps the retained buffers of one execution until its device work is done.
class PipelineProlongation final : public Raster::Prolongation {
public:
    Raster::HardwareRetention source;
    Raster::HardwareRetention destination;
    Raster::HardwareRetention mask;
};

Kernel::Counted<HardwareCache> MirrorOf(const PipelineImage& image) {
    return image.cache ? image.cache : HardwareCache::Create(image.pixels);
}

Raster::KernelImage Bound(const Raster::HardwareRetention& retention, const Raster::DynamicBuffer& image) {
    return {retention.buffer, image.GetWidth(), image.GetHeight()};
}

} // namespace

const char* DescribeRenderPath(RenderPath path) noexcept {
    switch (path) {
    case RenderPath::Nothing:
        return "nothing";
    case RenderPath::Device:
        return "device";
    case RenderPath::Processor:
        return "processor";
    case RenderPath::Aborted:
        return "aborted";
    case RenderPath::Failed:
        return "failed";
    }
    return "?";
}

bool ExecuteOnDevice(const RenderTarget& target, const Kernel::RectT<int>& rect,
                     const Raster::HardwareKernelDescriptor& descriptor, std::span<const float> params) {
    const Raster::HardwareDevice* device = target.device.Get();
    // Held from before the syncs until the kernel is queued, so that renders never interleave retention.
    Raster::HardwareBufferSemaphoreGuard guard = Raster::GetRetainHardwareBufferSemaphoreGuard(device);
    if (Kernel::IsAborted(target.abort)) return false;

    // A job's shared mirrors, or mirrors for this rectangle alone.
    const Kernel::Counted<HardwareCache> destination = MirrorOf(target.destination);
    const bool distinct = target.source.pixels != target.destination.pixels;
    const Kernel::Counted<HardwareCache> source =
        distinct ? MirrorOf(target.source) : (target.source.cache ? target.source.cache : destination);
    const Kernel::Counted<HardwareCache> mask = target.mask ? MirrorOf(target.mask) : nullptr;
    if (!destination || !source) return false;

    if (!destination->SyncHardwareCache(device, rect)) return false;
    if (!source->SyncHardwareCache(device, target.source.pixels->GetBounds())) return false;
    if (mask && !mask->SyncHardwareCache(device, target.mask.pixels->GetBounds())) return false;

    auto prolongation = Kernel::MakeCounted<PipelineProlongation>();
    prolongation->destination = Raster::RetainHardwareBuffer(device, destination, rect);
    prolongation->source = Raster::RetainHardwareBuffer(device, source, target.source.pixels->GetBounds());
    if (mask)
        prolongation->mask = Raster::RetainHardwareBuffer(device, mask, target.mask.pixels->GetBounds());
    if (!prolongation->destination || !prolongation->source || (mask && !prolongation->mask)) return false;
    const Kernel::Counted<Raster::HardwareBuffer> identity = Raster::Hardware::GetIdentityBuffer(device);
    if (!identity) return false;

    Raster::PipelineKernelExecution execution;
    execution.language = Raster::GetKernelLanguage(device);
    execution.device = device;
    execution.descriptor = &descriptor;
    execution.source = Bound(prolongation->source, *target.source.pixels);
    execution.destination = Bound(prolongation->destination, *target.destination.pixels);
    execution.mask = mask ? Bound(prolongation->mask, *target.mask.pixels) : Raster::KernelImage{identity};
    execution.secondaryMask = {identity};
    execution.sampler = {identity};
    execution.processPixels = identity;
    execution.params = params;
    execution.rect = rect;
    execution.abort = target.abort;
    execution.name = "pipeline";
    execution.prolongation = std::move(prolongation);
    const bool done = Raster::ExecuteKernel(std::move(execution));
    guard.Release();
    if (!done) return false;

    destination->InvalidateHostCache(rect);
    // Nobody else will read back a mirror made for this rectangle alone.
    if (!target.destination.cache && !destination->SyncHostCache(rect)) return false;
    return true;
}

namespace Detail {

void SetCompleted(bool* completed) noexcept {
    if (completed) *completed = true;
}

RenderPath PrepareHostCopies(const RenderTarget& target, const Kernel::RectT<int>& rect) {
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    if (target.source.cache && !target.source.cache->SyncHostCache(target.source.pixels->GetBounds()))
        return RenderPath::Failed;
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    if (target.destination.cache && !target.destination.cache->SyncHostCache(rect)) return RenderPath::Failed;
    if (target.mask.cache && !target.mask.cache->SyncHostCache(target.mask.pixels->GetBounds()))
        return RenderPath::Failed;
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    return RenderPath::Processor;
}

void MarkProcessorResult(const RenderTarget& target, const Kernel::RectT<int>& rect) {
    if (target.destination.cache) target.destination.cache->InvalidateHardwareCache(rect);
}

} // namespace Detail

} // namespace RasterTools
