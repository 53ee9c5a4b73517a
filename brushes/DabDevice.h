#pragma once
// Dab composition on a compute device: the same pixels as the processor's CompositeDab, for strokes rendered
// where a device is at hand.

#include "host/brush/DabComposite.h"
#include "host/raster/device/Hardware.h"
#include "pipeline/DeviceSteps.h"

#include <vector>

namespace RasterTools {

// Composes the dab on device. With wait, a kernel still compiling is waited for; without, that answers
// false. False whenever the device cannot do it (no device, a broken kernel, a failed transfer, a request
// CompositeDab would refuse): nothing has changed then, and the caller composes on the processor.
bool CompositeDabOnDevice(const Raster::HardwareDevice* device, Raster::DynamicBuffer& target,
                          Kernel::RectT<int> rect, const Raster::DynamicBuffer& coverage,
                          const Raster::DabRequest& request, bool wait = true, const bool* abort = nullptr);

// The dab kernel's text for a kernel language, for checks that compile it.
DeviceKernelText GetDabKernelText(Raster::HardwareKernelLanguage language);

} // namespace RasterTools
