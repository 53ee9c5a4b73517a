#pragma once
// The blurs' per-format pixel arithmetic (BlurPixels.h) as kernel text, for their device steps.

#include "host/raster/PixelFormat.h"
#include "host/raster/device/Hardware.h"

#include <string>

namespace RasterTools::Blur {

// The steps prelude, then for the format: T (a stored component), ACC (a premultiplied sum), RT_N, RT_A,
// RT_MAX, RT_PSCALE, and rt_premultiply, rt_store, rt_channel_bit and rt_sample_bilinear with the
// processor's arithmetic, operation for operation.
std::string PixelsKernelText(Raster::HardwareKernelLanguage language, Raster::PixelFormat format);

} // namespace RasterTools::Blur
