#pragma once
// A pipeline kernel's fourteen-fragment descriptor and its parameter array with the seven-float header.

#include "host/raster/KernelFragments.h"
#include "host/raster/PixelTraits.h"
#include "host/raster/device/ExecuteKernel.h"
#include "host/raster/device/HardwareKernel.h"
#include "pipeline/Formats.h"
#include "pipeline/StageText.h"

#include <array>
#include <optional>
#include <span>
#include <vector>

namespace RasterTools {

// The header's blocks, in header order. The three after Process belong to the sampler, the mask and the
// Filter stage (its channel write mask).
enum class ParamBlock : std::size_t { Source, Dest, Transform, Process, Sampler, Mask, Filter };
inline constexpr std::size_t ParamBlockCount = 7;
inline constexpr std::size_t ParamHeaderSize = ParamBlockCount;
inline constexpr std::size_t MaxKernelParams = Raster::MaxHardwareKernelParams;

// The parameter array: a header of seven start indices, then the blocks one after another; an empty block
// starts where the next one does. A kernel whose array passes MaxKernelParams floats runs on the processor.
std::vector<float> BuildParameterArray(const std::array<std::vector<float>, ParamBlockCount>& blocks);

// The floats of a stage's parameter record, as its block holds them.
template <class P>
std::vector<float> ParamFloats(const P& params) {
    std::vector<float> floats(std::size_t(Raster::ParamFloatCount<P>()));
    Raster::WriteParamFloats(params, floats.data());
    return floats;
}

// What a kernel is built from besides its stage types.
struct KernelShape {
    Raster::PixelFormat source;
    Raster::PixelFormat dest;
    std::optional<Raster::PixelFormat> mask; // none: the kernel reads no mask image
    bool channelMasked = false;              // the Filter stage applies filter_params[0]
};

// The descriptor of the kernel for Stages (PipelineStages) and shape in a language; nothing when a fragment
// has no text (an unknown language, a format without conversions). The texts live for the process.
template <class Stages>
std::optional<Raster::HardwareKernelDescriptor> DescribeKernel(Raster::HardwareKernelLanguage language,
                                                               const KernelShape& shape) {
    using Raster::HardwareKernelFragment;
    constexpr bool readsMask = !Raster::IsIdentityMask<typename Stages::Mask>;
    Raster::HardwareKernelDescriptor d;
    d[HardwareKernelFragment::SourceTraits] =
        Raster::GetTraitsFragment(shape.source, Raster::KernelTraitsRole::Source, language);
    d[HardwareKernelFragment::DestTraits] =
        Raster::GetTraitsFragment(shape.dest, Raster::KernelTraitsRole::Dest, language);
    d[HardwareKernelFragment::MaskTraits] =
        shape.mask ? Raster::GetTraitsFragment(*shape.mask, Raster::KernelTraitsRole::Mask, language)
                   : Raster::GetNoMaskTraitsFragment(language);
    d[HardwareKernelFragment::Conversion] = GetConversionFragment(shape.source, shape.dest, language);
    d[HardwareKernelFragment::PerPixelLoop] = Raster::KernelPerPixel<Raster::Horizontal>::GetHardwareFragment(
        language, readsMask, Raster::ProcessReadsDestination<typename Stages::Process>, true, readsMask,
        readsMask);
    d[HardwareKernelFragment::SourceAccess] =
        Raster::GetImageAccessFragment(Raster::KernelImageRole::Source, language);
    d[HardwareKernelFragment::DestAccess] =
        Raster::GetImageAccessFragment(Raster::KernelImageRole::Dest, language);
    d[HardwareKernelFragment::ReadMask] = StageText<typename Stages::Mask>::Get(language);
    d[HardwareKernelFragment::Process] = StageText<typename Stages::Process>::Get(language);
    d[HardwareKernelFragment::Transform] = GetTransformStageText<typename Stages::Transform>(language);
    d[HardwareKernelFragment::Sample] = GetSampleStageText<typename Stages::Sampler>(language, shape.source);
    d[HardwareKernelFragment::Blend] = Raster::NormalBlend::GetHardwareFragment(language);
    d[HardwareKernelFragment::Extend] = Stages::Extend::GetHardwareFragment(language);
    d[HardwareKernelFragment::Filter] = GetFilterText(shape.dest, shape.channelMasked, language);
    d.entryPoint = Raster::KernelPerPixel<Raster::Horizontal>::EntryPoint;
    if (!d.IsComplete()) return std::nullopt;
    return d;
}

} // namespace RasterTools
