#pragma once
// Running a pipeline kernel on a device: the questions asked before (worth it, broken, still compiling) and
// one execution over a rectangle with the pipeline's fixed list of images, parameters and rectangle.

#include "host/raster/HardwareCache.h"
#include "host/raster/device/ExecuteKernel.h"

#include <span>

namespace Raster {

// Whether a rectangle goes to a device at all: not empty, and a grid the device layer can launch.
bool ShouldExecuteKernel(const Kernel::RectT<int>& rect) noexcept;

// The kernel cache's answers, in the argument order of the pipeline's calls.
bool IsKernelBroken(const HardwareKernelDescriptor& descriptor, const HardwareDevice* device);
bool IsKernelPendingCompilation(const HardwareKernelDescriptor& descriptor, const HardwareDevice* device,
                                bool wait, const bool* abort);

enum class HardwareExecutionMode : int {
    Wait = 0, // queue the kernel and return when it has finished
};

// One image of a kernel: its device buffer (the identity buffer for an input the kernel ignores) and size.
struct KernelImage {
    Kernel::Counted<HardwareBuffer> buffer;
    int width = 0;
    int height = 0;
};

struct PipelineKernelExecution {
    HardwareKernelLanguage language = HardwareKernelLanguage::None;
    HardwareExecutionMode mode = HardwareExecutionMode::Wait;
    const HardwareDevice* device = nullptr;
    HardwareQueue queue; // the device's write queue
    // Released once the device work is complete.
    Kernel::Counted<Prolongation> prolongation;
    const HardwareKernelDescriptor* descriptor = nullptr;
    KernelImage source, destination, mask, secondaryMask, sampler;
    std::span<const float> params;
    Kernel::Counted<HardwareBuffer> processPixels;
    Kernel::RectT<int> rect{}; // in destination pixels; the grid is its size
    const bool* abort = nullptr;
    const char* name = ""; // for diagnostics
};

// Runs the descriptor's per-pixel loop over execution.rect with the arguments in the loop's order. False
// (nothing written) for a language other than the device's, a queue that is not the device's, a missing
// buffer, more than MaxHardwareKernelParams parameters, an abort, or any device failure (see
// GetLastHardwareError).
bool ExecuteKernel(PipelineKernelExecution execution);

} // namespace Raster
