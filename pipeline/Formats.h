#pragma once
// The formats the library renders: the layer formats in a fixed order, each format's Convert bodies as
// kernel text, the conversion fragment for a pair of formats, and channel write masks by name.

#include "host/raster/PixelFormat.h"
#include "host/raster/device/Hardware.h"

#include <array>
#include <optional>
#include <string>
#include <string_view>

namespace RasterTools {

// Source and destination formats of every filter.
inline constexpr std::array<Raster::PixelFormat, 7> LayerFormats{
    Raster::PixelFormat::RGBA8,  Raster::PixelFormat::RGBA16, Raster::PixelFormat::RGBAUF,
    Raster::PixelFormat::IA8,    Raster::PixelFormat::IA16,   Raster::PixelFormat::CMYKA8,
    Raster::PixelFormat::LabA16,
};

// The bodies of a format's two Convert overloads, exactly as kernels get them: stored to working
// (`rgbauf_type Convert(source_type source)`) and working to stored (`dest_type Convert(rgbauf_type
// source)`). Empty for a format without conversions (the single-channel float map, the scratch format).
struct ConvertPair {
    std::string_view toWorking;
    std::string_view fromWorking;
};
ConvertPair GetConvertPair(Raster::PixelFormat format);
// The colour-only pair: colour unscaled with alpha 1 on the way in, colour only on the way out.
ConvertPair GetColourOnlyConvertPair();

// Descriptor field 4: the identity between equal formats, else the joint conversion through the working
// pixel. Null when a format has no conversions or the language is unknown.
const char* GetConversionFragment(Raster::PixelFormat source, Raster::PixelFormat dest,
                                  Raster::HardwareKernelLanguage language);
// Descriptor field 4 for a kernel that also reads a secondary sampler image of format sampler: the above,
// then the sampler's traits, ConvertSamplerToWorking and ReadSampler. Null where a format has no conversions.
const char* GetSamplerConversionFragment(Raster::PixelFormat source, Raster::PixelFormat dest,
                                         Raster::PixelFormat sampler,
                                         Raster::HardwareKernelLanguage language);
// The same for a kernel without a source that renders from the sampler image: ConvertWorkingToDest, the
// sampler's traits, ConvertSamplerToWorking, ReadSampler and ConvertSamplerToDest.
const char* GetSamplerReferenceConversionFragment(Raster::PixelFormat dest, Raster::PixelFormat sampler,
                                                  Raster::HardwareKernelLanguage language);

// The channel write mask for text naming channels of format: a number (the mask itself), or the format's
// channel names: one letter each ("rgb", "cmyka", "ia"), or comma-separated names where a name is longer
// ("L,a,b,alpha" for LabA16). "alpha" names alpha in every format. Nothing for an unknown name or a mask
// with bits the format does not have.
std::optional<int> ParseChannelMask(Raster::PixelFormat format, std::string_view text);
// The names ParseChannelMask accepts for format, for messages: "r, g, b, a".
std::string DescribeChannelNames(Raster::PixelFormat format);

} // namespace RasterTools
