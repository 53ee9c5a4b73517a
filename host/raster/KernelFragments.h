#pragma once
// The host's kernel text fragments beyond the traits: the per-pixel loop that holds the entry point, and the
// conversion fragments that wrap the library's Convert bodies. (Access, extend and blend fragments are
// reached through Bitmap, the extend types and NormalBlend.)

#include "host/raster/Stages.h"

#include <string>
#include <string_view>

namespace Raster {

template <class Direction>
struct KernelPerPixel;

// The kernel entry: for every pixel of the rectangle it samples the source (Sample), converts it to the
// destination format (ConvertSourceToDest), reads the mask weight (ReadMask), calls Process, blends (Blend)
// and stores through Filter. Its arguments, in order: source pixels, width, height; destination pixels,
// width, height; mask pixels, width, height; secondary mask pixels, width, height; sampler pixels, width,
// height; the parameter array and its length; process pixels; the rectangle's origin and size (int2 each).
template <>
struct KernelPerPixel<Horizontal> {
    static constexpr const char* EntryPoint = "RasterPerPixelHorizontal";

    // readsMask: call ReadMask (else every weight is 1). processReadsDestination: Process gets the current
    // destination pixel as dest (else the converted source again). samplesSource: call Sample (else the
    // destination pixel is the source, with no conversion). blends: Blend the result over the destination by
    // the weight (else it replaces it). skipsEmptyMask: a pixel of weight 0 or less is left as it is without
    // sampling. Null for an unknown language.
    static const char* GetHardwareFragment(HardwareKernelLanguage language, bool readsMask,
                                           bool processReadsDestination, bool samplesSource, bool blends,
                                           bool skipsEmptyMask);
};

// ConvertSourceToDest where source and destination have the same format.
const char* GetIdentityConversionFragment(HardwareKernelLanguage language);
// ConvertSourceToDest through the working format: toWorking is the body of the source format's
// `rgbauf_type Convert(source_type source)`, fromWorking that of the destination's
// `dest_type Convert(rgbauf_type source)`. Each body is embedded as it is, with a blank line before and
// after. Empty for an unknown language.
std::string GetJointConversionFragment(HardwareKernelLanguage language, std::string_view toWorking,
                                       std::string_view fromWorking);
// Only ConvertWorkingToDest, for kernels without a source image.
std::string GetNoSourceConversionFragment(HardwareKernelLanguage language, std::string_view fromWorking);
// For kernels that also read a secondary sampler image (sampler_pixels, sampler_bounds) of its own format:
// conversion (the identity or joint fragment above) followed by samplerTraits (the sampler format's traits in
// the sampler role), `rgbauf_type ConvertSamplerToWorking(sampler_type source)` whose body is the sampler
// format's samplerToWorking, and `rgbauf_type ReadSampler(int2 location, uint2 sampler_bounds,
// constant_address_space void* sampler_pixels)`, the sampler pixel at location (clamped to the image's edges)
// in working colour. Empty for an unknown language.
std::string GetSamplerConversionFragment(HardwareKernelLanguage language, std::string_view conversion,
                                         std::string_view samplerTraits, std::string_view samplerToWorking);
// For kernels without a source that render from the sampler image as their reference: ConvertWorkingToDest
// (fromWorking), the sampler's traits, ConvertSamplerToWorking and ReadSampler as above, and
// `dest_type ConvertSamplerToDest(sampler_type source)` through the working pixel.
std::string GetSamplerReferenceConversionFragment(HardwareKernelLanguage language,
                                                  std::string_view fromWorking,
                                                  std::string_view samplerTraits,
                                                  std::string_view samplerToWorking);

enum class BlendMode { Normal };
// The Blend fragment of a blend mode.
const char* GetBlendFragment(BlendMode mode, HardwareKernelLanguage language);

} // namespace Raster
