#pragma once
// The motion blur on the device: the resample in, the running-sum blur and the resample out as three kernels
// through two scratch buffers, with the processor's pixels.

#include "filters/blur/MotionBlurRender.h"
#include "pipeline/DeviceSteps.h"

#include <vector>

namespace RasterTools::MotionBlurDevice {

// Whether the target's device has the kernels for its format compiled; the first call starts them compiling
// (with wait, blocks until they are done). False without a device.
bool KernelsReady(const RenderTarget& target, bool wait);

// The kernels for a language and layer format, for checks that compile them without running them.
std::vector<DeviceKernelText> GetKernelTexts(Raster::HardwareKernelLanguage language,
                                             Raster::PixelFormat format);

// Renders rect (clipped, not empty) of the target's destination on its device; false, with the destination
// left for the processor to render, on any refusal or failure.
bool Run(const RenderTarget& target, const Kernel::RectT<int>& rect, const MotionBlurRender::Plan& plan);

} // namespace RasterTools::MotionBlurDevice
