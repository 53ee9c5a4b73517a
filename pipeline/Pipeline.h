#pragma once
// Rendering one rectangle through the pipeline: on the device when it takes the kernel, otherwise on the
// processor, with the same stage parameters feeding both.

#include "host/kernel/Abort.h"
#include "host/raster/AffineTransform.h"
#include "host/raster/Bitmap.h"
#include "host/raster/HardwareCache.h"
#include "host/raster/PipelineKernel.h"
#include "pipeline/KernelAssembly.h"

#include <array>

namespace RasterTools {

// ---- Formats a set of stages is instantiated for

template <Raster::PixelFormat... F>
struct FormatList {
    static constexpr std::array<Raster::PixelFormat, sizeof...(F)> Values{F...};
    static constexpr bool Contains(Raster::PixelFormat format) noexcept { return ((format == F) || ...); }
    // Calls f(Raster::FormatTag<X>{}) for the entry X equal to format; false when there is none.
    template <class Function>
    static bool Dispatch(Raster::PixelFormat format, Function&& f) {
        bool result = false;
        (void)((format == F ? (result = f(Raster::FormatTag<F>{}), true) : false) || ...);
        return result;
    }
};

using LayerFormatList =
    FormatList<Raster::PixelFormat::RGBA8, Raster::PixelFormat::RGBA16, Raster::PixelFormat::RGBAUF,
               Raster::PixelFormat::IA8, Raster::PixelFormat::IA16, Raster::PixelFormat::CMYKA8,
               Raster::PixelFormat::LabA16>;
using MaskFormatList =
    FormatList<Raster::PixelFormat::MaskA8, Raster::PixelFormat::MaskA16, Raster::PixelFormat::MaskAF>;

// Whether a mask stage reads a mask image (a bitmap mask does; an opacity alone does not).
template <class Mask>
inline constexpr bool MaskReadsImage = false;
template <>
inline constexpr bool MaskReadsImage<Raster::BitmapMask> = true;
template <class Left, class Right>
inline constexpr bool MaskReadsImage<Raster::ChainedMask<Left, Right>> =
    MaskReadsImage<Left> || MaskReadsImage<Right>;

// The stages of one kind of render and the formats its processor path is instantiated for.
template <class ProcessT, class MaskT, class SamplerT, class TransformT, class ExtendT,
          class SourceFormatsT = LayerFormatList, class DestFormatsT = LayerFormatList,
          class MaskFormatsT = FormatList<Raster::PixelFormat::MaskA8>>
struct PipelineStages {
    using Process = ProcessT;
    using Mask = MaskT;
    using Sampler = SamplerT;
    using Transform = TransformT;
    using Extend = ExtendT;
    using Blend = Raster::NormalBlend;
    using SourceFormats = SourceFormatsT;
    using DestFormats = DestFormatsT;
    using MaskFormats = MaskFormatsT;

    // One record per stage; each holds the floats of its block of the parameter array.
    struct Params {
        Process process{};
        typename Mask::Params mask{};
        typename Transform::Params transform{};
        typename Sampler::Params sampler{};
    };
};

// ---- One render

// An image of a render: its pixels and, optionally, the device mirror that the renders of one job share
// (without one, a device attempt mirrors the image for that rectangle only).
struct PipelineImage {
    Kernel::Counted<Raster::DynamicBuffer> pixels;
    Kernel::Counted<Raster::HardwareCache> cache;
    explicit operator bool() const noexcept { return bool(pixels); }
};

struct RenderTarget {
    PipelineImage source;
    PipelineImage destination;
    PipelineImage mask; // for a mask stage that reads an image
    // A second image the sampler stage reads (a height map, a texture), in its own format and size; none:
    // the kernel's sampler image is the device's identity buffer, of width 0.
    PipelineImage sampler;
    Kernel::RectT<int> rect; // in destination pixels; clipped to the destination
    // The raster's bounds in document units and the transform from source pixels to the view (identity:
    // the layer at its own resolution). Filters whose pixels depend on position or view scale read them.
    Kernel::RectT<double> bounds;
    Raster::AffineTransform::Params transform;
    // Tried first when set; null renders on the processor.
    Kernel::Counted<Raster::HardwareDevice> device;
    int channelMask = -1;        // negative: every channel (see Raster::WriteChannels)
    const bool* abort = nullptr; // host-owned, only read
    bool* completed = nullptr;   // set once the device attempt is over, whichever way it went
};

enum class RenderPath {
    Nothing,   // the rectangle was empty
    Device,    // rendered by the kernel
    Processor, // rendered on the processor (no device, or the device attempt failed)
    Aborted,   // the abort flag ended it; pixels not yet rendered are untouched
    Failed,    // refused: a missing image or a format the stages are not instantiated for
};

const char* DescribeRenderPath(RenderPath path) noexcept;

// The shape of the kernel for a target: formats and whether Filter applies a channel mask.
template <class Stages>
KernelShape GetKernelShape(const RenderTarget& target) {
    KernelShape shape{target.source.pixels->GetFormat(), target.destination.pixels->GetFormat(), std::nullopt,
                      false};
    if constexpr (MaskReadsImage<typename Stages::Mask>)
        if (target.mask) shape.mask = target.mask.pixels->GetFormat();
    const int all = Raster::AllChannelsMask(shape.dest);
    shape.channelMasked = target.channelMask >= 0 && (target.channelMask & all) != all;
    return shape;
}

// Whether the processor path of Stages covers the target's formats (and it has the images it needs).
template <class Stages>
bool CanRender(const RenderTarget& target) {
    if (!target.source || !target.destination) return false;
    if (!Stages::SourceFormats::Contains(target.source.pixels->GetFormat())) return false;
    if (!Stages::DestFormats::Contains(target.destination.pixels->GetFormat())) return false;
    if constexpr (MaskReadsImage<typename Stages::Mask>)
        if (!target.mask || !Stages::MaskFormats::Contains(target.mask.pixels->GetFormat())) return false;
    return true;
}

// Image sizes in mask blocks come from the mask image itself.
template <class Mask>
struct MaskImageSize {
    static void Fill(typename Mask::Params&, const Raster::DynamicBuffer&) noexcept {}
};
template <>
struct MaskImageSize<Raster::BitmapMask> {
    static void Fill(Raster::BitmapMask::Params& params, const Raster::DynamicBuffer& mask) noexcept {
        params.width = float(mask.GetWidth());
        params.height = float(mask.GetHeight());
    }
};
template <class Left, class Right>
struct MaskImageSize<Raster::ChainedMask<Left, Right>> {
    static void Fill(typename Raster::ChainedMask<Left, Right>::Params& params,
                     const Raster::DynamicBuffer& mask) noexcept {
        MaskImageSize<Left>::Fill(params.left, mask);
        MaskImageSize<Right>::Fill(params.right, mask);
    }
};

// The kernel's parameter array for target and params.
template <class Stages>
std::vector<float> BuildKernelParams(const RenderTarget& target, const KernelShape& shape,
                                     const typename Stages::Params& params) {
    std::array<std::vector<float>, ParamBlockCount> blocks;
    auto imageBlock = [](const Raster::DynamicBuffer& image) {
        std::vector<float> block(Raster::ImageHardwareParamCount);
        block.resize(std::size_t(Raster::GetImageHardwareParams(image, block.data())));
        return block;
    };
    blocks[std::size_t(ParamBlock::Source)] = imageBlock(*target.source.pixels);
    blocks[std::size_t(ParamBlock::Dest)] = imageBlock(*target.destination.pixels);
    blocks[std::size_t(ParamBlock::Transform)] = ParamFloats(params.transform);
    blocks[std::size_t(ParamBlock::Process)] = ParamFloats(params.process.GetParams());
    blocks[std::size_t(ParamBlock::Sampler)] = ParamFloats(params.sampler);
    typename Stages::Mask::Params mask = params.mask;
    if (target.mask) MaskImageSize<typename Stages::Mask>::Fill(mask, *target.mask.pixels);
    blocks[std::size_t(ParamBlock::Mask)] = ParamFloats(mask);
    if (shape.channelMasked)
        blocks[std::size_t(ParamBlock::Filter)] = {
            float(target.channelMask & Raster::AllChannelsMask(shape.dest))};
    return BuildParameterArray(blocks);
}

// The device half of a render, after the kernel is known to be compiled and the parameters fit: cache syncs
// under the device-buffer semaphore, retention, execution, and the destination's host copy marked stale.
bool ExecuteOnDevice(const RenderTarget& target, const Kernel::RectT<int>& rect,
                     const Raster::HardwareKernelDescriptor& descriptor, std::span<const float> params);

// Tries the device for rect; false (nothing written) on any refusal or failure.
template <class Stages>
bool TryDevice(const RenderTarget& target, const Kernel::RectT<int>& rect,
               const typename Stages::Params& params) {
    const Raster::HardwareDevice* device = target.device.Get();
    if (!device || !Raster::ShouldExecuteKernel(rect)) return false;
    const KernelShape shape = GetKernelShape<Stages>(target);
    const auto descriptor = DescribeKernel<Stages>(Raster::GetKernelLanguage(device), shape);
    if (!descriptor) return false;
    if (Raster::IsKernelBroken(*descriptor, device)) return false;
    // The first request starts the compilation in the background; this rectangle goes to the processor.
    if (Raster::IsKernelPendingCompilation(*descriptor, device, false, target.abort)) return false;
    const std::vector<float> array = BuildKernelParams<Stages>(target, shape, params);
    if (array.size() > MaxKernelParams) return false;
    return ExecuteOnDevice(target, rect, *descriptor, array);
}

// Blocks until the target's kernel has compiled (or failed to), so that the next Render uses it; true when
// it is ready. For callers that want the device from the first rectangle on (tests, benchmarks).
template <class Stages>
bool WaitForKernel(const RenderTarget& target) {
    const Raster::HardwareDevice* device = target.device.Get();
    if (!device || !CanRender<Stages>(target)) return false;
    const auto descriptor =
        DescribeKernel<Stages>(Raster::GetKernelLanguage(device), GetKernelShape<Stages>(target));
    if (!descriptor) return false;
    Raster::IsKernelPendingCompilation(*descriptor, device, true, target.abort);
    return !Raster::IsKernelBroken(*descriptor, device);
}

// The processor half for one destination format; instantiated per format in separate translation units
// (see ProcessorInstances.h).
template <class Stages, Raster::PixelFormat Dest>
bool RunProcessorFor(const RenderTarget& target, const Kernel::RectT<int>& rect,
                     const typename Stages::Params& params);

template <class Stages>
bool RunProcessor(const RenderTarget& target, const Kernel::RectT<int>& rect,
                  const typename Stages::Params& params) {
    return Stages::DestFormats::Dispatch(target.destination.pixels->GetFormat(), [&](auto dest) {
        return RunProcessorFor<Stages, decltype(dest)::value>(target, rect, params);
    });
}

namespace Detail {
void SetCompleted(bool* completed) noexcept;
// Before the processor renders after a failed device attempt: the host copies brought up to date. Processor
// when that worked, else Aborted or Failed.
RenderPath PrepareHostCopies(const RenderTarget& target, const Kernel::RectT<int>& rect);
void MarkProcessorResult(const RenderTarget& target, const Kernel::RectT<int>& rect);

// The processor half of a render of rect once the device is out of it: completion reported, host copies
// brought up to date, render() (Processor or Aborted), the destination's device copy marked stale.
template <class Processor>
RenderPath RenderOnProcessor(const RenderTarget& target, const Kernel::RectT<int>& rect, Processor&& render) {
    SetCompleted(target.completed);
    if (const RenderPath ready = PrepareHostCopies(target, rect); ready != RenderPath::Processor)
        return ready;
    const RenderPath path = render();
    if (path == RenderPath::Processor) MarkProcessorResult(target, rect);
    return path;
}
} // namespace Detail

// Renders target.rect with the stages and parameters: clip; try the device; on failure count it, report
// completion, bring the host copies up to date, render on the processor and mark the destination's device
// copy stale. The abort flag is read before each step.
template <class Stages>
RenderPath Render(const RenderTarget& target, const typename Stages::Params& params) {
    if (!CanRender<Stages>(target)) return RenderPath::Failed;
    const Kernel::RectT<int> rect = target.rect.Intersect(target.destination.pixels->GetBounds());
    if (rect.IsEmpty()) return RenderPath::Nothing;
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    if (TryDevice<Stages>(target, rect, params)) {
        Detail::SetCompleted(target.completed);
        return RenderPath::Device;
    }
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    Raster::Hardware::IncrementFailedKernels(target.device.Get());
    return Detail::RenderOnProcessor(target, rect, [&] {
        return RunProcessor<Stages>(target, rect, params) ? RenderPath::Processor : RenderPath::Aborted;
    });
}

} // namespace RasterTools
