// Pipeline kernel execution on top of the device layer's generic ExecuteKernel.
#include "host/raster/PipelineKernel.h"

#include <limits>

namespace Raster {

bool ShouldExecuteKernel(const Kernel::RectT<int>& rect) noexcept {
    if (rect.IsEmpty()) return false;
    const long long area = (long long)rect.Width() * (long long)rect.Height();
    return area <= std::numeric_limits<int>::max();
}

bool IsKernelBroken(const HardwareKernelDescriptor& descriptor, const HardwareDevice* device) {
    return IsKernelBroken(device, descriptor);
}

bool IsKernelPendingCompilation(const HardwareKernelDescriptor& descriptor, const HardwareDevice* device,
                                bool wait, const bool* abort) {
    return IsKernelPendingCompilation(device, descriptor, wait, abort);
}

bool ExecuteKernel(PipelineKernelExecution execution) {
    if (!execution.device || !execution.descriptor || !execution.queue.IsOn(execution.device)) return false;
    if (execution.language != GetKernelLanguage(execution.device)) return false;
    if (execution.mode != HardwareExecutionMode::Wait) return false;
    HardwareKernelArguments arguments;
    for (const KernelImage* image : {&execution.source, &execution.destination, &execution.mask,
                                     &execution.secondaryMask, &execution.sampler})
        arguments.AddBuffer(image->buffer).AddInt(image->width).AddInt(image->height);
    arguments.AddParams(execution.params)
        .AddBuffer(execution.processPixels)
        .AddInt2(execution.rect.left, execution.rect.top)
        .AddInt2(execution.rect.Width(), execution.rect.Height());
    const bool done = ExecuteKernel(execution.device, *execution.descriptor, execution.rect.Width(),
                                    execution.rect.Height(), arguments, execution.abort);
    // The device layer waits for completion, so what the kernel used may go now.
    execution.prolongation.Reset();
    return done;
}

} // namespace Raster
