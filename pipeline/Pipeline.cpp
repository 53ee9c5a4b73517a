// The device half of a render and the steps around the processor half.
#include "pipeline/Pipeline.h"

#include "pipeline/DeviceSteps.h"

namespace RasterTools {

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
    DeviceSteps steps(target, rect);
    if (!steps) return false;
    const Raster::HardwareDevice* device = target.device.Get();
    const Kernel::Counted<Raster::HardwareBuffer> identity = Raster::Hardware::GetIdentityBuffer(device);
    if (!identity) return false;
    auto bound = [](const Kernel::Counted<Raster::HardwareBuffer>& buffer,
                    const Raster::DynamicBuffer& image) {
        return Raster::KernelImage{buffer, image.GetWidth(), image.GetHeight()};
    };

    Raster::PipelineKernelExecution execution;
    execution.language = Raster::GetKernelLanguage(device);
    execution.device = device;
    execution.queue = steps.Queue();
    execution.descriptor = &descriptor;
    execution.source = bound(steps.Source(), *target.source.pixels);
    execution.destination = bound(steps.Destination(), *target.destination.pixels);
    execution.mask = target.mask ? bound(steps.Mask(), *target.mask.pixels) : Raster::KernelImage{identity};
    execution.secondaryMask = {identity};
    execution.sampler =
        target.sampler ? bound(steps.Sampler(), *target.sampler.pixels) : Raster::KernelImage{identity};
    execution.processPixels = identity;
    execution.params = params;
    execution.rect = rect;
    execution.abort = target.abort;
    execution.name = "pipeline";
    execution.prolongation = steps.Prolong();
    return Raster::ExecuteKernel(std::move(execution)) && steps.Finish();
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
