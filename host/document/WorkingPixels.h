#pragma once
// Layer pixels to and from the working colour (straight r, g, b, a floats, sRGB-encoded), for compositing.

#include "host/raster/PixelFormat.h"

#include <cstddef>

namespace WorkingPixels {

// n pixels of a layer format to 4 × n floats. Integer components are divided by their maximum; CMYK goes
// through its undercolour formula, Lab through the colour manager.
void ToWorking(Raster::PixelFormat format, const std::byte* in, float* out, int n) noexcept;
// 4 × n floats to n pixels of a layer format: clamped to the format's range and rounded to nearest.
void FromWorking(Raster::PixelFormat format, const float* in, std::byte* out, int n) noexcept;

} // namespace WorkingPixels
