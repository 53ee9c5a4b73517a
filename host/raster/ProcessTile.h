#pragma once
// The processor's per-tile template: one instantiation per destination, source and mask format and stage
// types walks a rectangle row by row in spans of 32 pixels: Sample, convert, ReadMask, Process, Blend, store
// through the channel write mask.

#include "host/kernel/Abort.h"
#include "host/raster/Stages.h"

#include <algorithm>
#include <cstring>
#include <type_traits>

namespace Raster {

// Traversal order of a tile: rows top to bottom, each left to right.
template <class Direction>
struct PixelProcessor {
    static_assert(std::is_same_v<Direction, Horizontal>, "rows are the only traversal so far");
};

// What a tile needs beyond its stages.
struct TileOptions {
    int channelMask = -1;        // channel write mask (see WriteChannels); negative writes every channel
    const bool* abort = nullptr; // read before each row
};

template <class Process>
struct ProcessBase {
    // Renders rect (clipped to the destination) from source into dest. Returns false when the abort flag
    // stopped it, leaving the rows not yet started untouched, or when an image is missing or of the wrong
    // format. maskParams, transformParams and samplerParams may be null where the stage has no parameters.
    template <class Processor, class D1, class D2, class D3, class D4, class D5, class S1, class S2, class S3,
              class S4, class S5, class M1, class M2, class M3, class M4, class M5, class DestModel,
              class SourceModel, class ProcessStage, class Mask, class Sampler, class Transform, class Extend,
              class Blend>
    static bool ProcessTile(const SourceModel* source, DestModel* dest, const ProcessStage& process,
                            Kernel::RectT<int> rect, const typename MaskBase<Mask>::Params* maskParams,
                            const typename Transform::Params* transformParams,
                            const typename SamplerBase<Sampler>::Params* samplerParams,
                            const TileOptions& options = {});
};

namespace Detail {

template <class Model>
inline constexpr bool IsConstantSource = requires {
    Model::value;
}
|| requires(Model m) {
    m.value;
};

// Sampling of one span for every source model. A sampler that has SampleSpan takes the whole span at once
// (its own loop, e.g. vectorised across pixels), with the sampler image (null when the render has none) when
// its SampleSpan takes one; one whose Sample takes its Params gets them per pixel.
template <class SourceModel, class Sampler, class Transform, class Extend, class Stored>
inline void SampleSpan(const SourceModel& source, const PreparedTransform<Transform>& t,
                       const typename Sampler::Params& samplerParams, const DynamicBuffer* samplerPixels,
                       int x0, int y, int n, Stored* out) noexcept {
    using namespace KernelMath;
    if constexpr (IsConstantSource<SourceModel>) {
        (void)samplerPixels;
        std::fill_n(out, n, source.value);
    } else if constexpr (requires {
                             Sampler::template SampleSpan<Transform, Extend>(source, t, samplerParams,
                                                                             samplerPixels, x0, y, n, out);
                         }) {
        Sampler::template SampleSpan<Transform, Extend>(source, t, samplerParams, samplerPixels, x0, y, n,
                                                        out);
    } else if constexpr (requires {
                             Sampler::template SampleSpan<Transform, Extend>(source, t, samplerParams, x0, y,
                                                                             n, out);
                         }) {
        Sampler::template SampleSpan<Transform, Extend>(source, t, samplerParams, x0, y, n, out);
    } else if constexpr (IsIdentityTransform<Transform> && requires { requires Sampler::IsNearest; }) {
        // The identity maps a pixel centre (x + 0.5, y + 0.5) back onto (x, y) exactly for any coordinate an
        // image can have, so the float round trip is skipped; a span inside the source is one row slice.
        if (y >= 0 && y < source.GetHeight() && x0 >= 0 && x0 + n <= source.GetWidth()) {
            std::memcpy(out, source.Row(y) + x0, std::size_t(n) * sizeof(Stored));
        } else {
            for (int i = 0; i < n; ++i)
                out[i] = Extend::Read(source, make_int2(x0 + i, y));
        }
    } else if constexpr (requires {
                             Sampler::template Sample<Transform, Extend>(source, make_int2(x0, y), t,
                                                                         samplerParams);
                         }) {
        for (int i = 0; i < n; ++i)
            out[i] =
                Sampler::template Sample<Transform, Extend>(source, make_int2(x0 + i, y), t, samplerParams);
    } else {
        (void)samplerParams;
        (void)samplerPixels;
        for (int i = 0; i < n; ++i)
            out[i] = Sampler::template Sample<Transform, Extend>(source, make_int2(x0 + i, y), t);
    }
}

// The typed mask bitmap of a tile; a mask stage that reads no image (a constant opacity) gets NoMaskImage.
struct NoMaskImage {};
template <bool HasImage, class M1, class M2, class M3, class M4, class M5>
struct MaskImageOf {
    using Type = NoMaskImage;
};
template <class M1, class M2, class M3, class M4, class M5>
struct MaskImageOf<true, M1, M2, M3, M4, M5> {
    using Type = Bitmap<M1, M2, M3, M4, M5>;
};

} // namespace Detail

template <class ProcessType>
template <class Processor, class D1, class D2, class D3, class D4, class D5, class S1, class S2, class S3,
          class S4, class S5, class M1, class M2, class M3, class M4, class M5, class DestModel,
          class SourceModel, class ProcessStage, class Mask, class Sampler, class Transform, class Extend,
          class Blend>
bool ProcessBase<ProcessType>::ProcessTile(const SourceModel* source, DestModel* dest,
                                           const ProcessStage& process, Kernel::RectT<int> rect,
                                           const typename MaskBase<Mask>::Params* maskParams,
                                           const typename Transform::Params* transformParams,
                                           const typename SamplerBase<Sampler>::Params* samplerParams,
                                           const TileOptions& options) {
    static_assert(std::is_same_v<ProcessType, ProcessStage>, "ProcessBase<P> processes with P");
    static_assert(std::is_same_v<Processor, PixelProcessor<Horizontal>>);
    static_assert(std::is_same_v<Blend, NormalBlend>, "the normal blend is the only blend so far");
    constexpr PixelFormat DestFormat = FormatOf_v<D1, D2, D3, D4, D5>;
    constexpr PixelFormat SourceFormat = FormatOf_v<S1, S2, S3, S4, S5>;
    static_assert(DestModel::Format == DestFormat && SourceModel::Format == SourceFormat);
    constexpr bool HasMask = !IsIdentityMask<Mask>;
    constexpr bool HasMaskImage = !M1::IsPlaceholder;
    using DestStored = StoredPixel<DestFormat>;
    using Conversion = PixelConversion<SourceFormat, DestFormat>;
    constexpr bool SameFormat = SourceFormat == DestFormat;

    if (!dest || !*dest || !source) return false;
    if constexpr (!Detail::IsConstantSource<SourceModel>)
        if (!*source) return false;
    rect = rect.Intersect(dest->GetBounds());
    if (rect.IsEmpty()) return true;

    const typename Transform::Params transformDefaults{};
    const auto transform = Transform::Prepare(transformParams ? *transformParams : transformDefaults);
    // The sampler's block (the same floats as in a kernel's parameter array); defaults where none is given.
    const typename Sampler::Params samplerDefaults{};
    const typename Sampler::Params& samplerBlock = samplerParams ? samplerParams->block : samplerDefaults;
    const DynamicBuffer* samplerImage = samplerParams ? samplerParams->pixels : nullptr;

    using MaskImage = typename Detail::MaskImageOf<HasMaskImage, M1, M2, M3, M4, M5>::Type;
    [[maybe_unused]] MaskImage maskImage;
    if constexpr (HasMask) {
        if (!maskParams) return false;
        if constexpr (HasMaskImage) {
            maskImage = MaskImage(const_cast<DynamicBuffer*>(maskParams->pixels));
            if (!maskImage) return false;
        }
    }

    const int allChannels = AllChannelsMask(DestFormat);
    const int channelMask = options.channelMask < 0 ? allChannels : options.channelMask & allChannels;
    const bool writesAll = channelMask == allChannels;
    const bool needsDestination = HasMask || ProcessReadsDestination<ProcessStage> || !writesAll;

    InterleavedPixelSpan<SourceFormat> sampled;
    InterleavedPixelSpan<DestFormat> converted;
    InterleavedPixelSpan<DestFormat> current;
    InterleavedPixelSpan<DestFormat> result;
    MaskSpan weights;

    // A plain copy has nothing to compute: a row inside the source is one block, converted span by span
    // straight from the source row into the destination row when the formats differ.
    constexpr bool PlainRowCopy =
        !HasMask && std::is_same_v<ProcessStage, Copy> && IsIdentityTransform<Transform> && requires {
        requires Sampler::IsNearest;
    }
    &&!Detail::IsConstantSource<SourceModel>;
    const auto convertSpan = [](const StoredPixel<SourceFormat>* in, DestStored* out, int n) {
        if constexpr (requires { Conversion::ConvertSpan(in, out, n); }) {
            Conversion::ConvertSpan(in, out, n);
        } else {
            for (int i = 0; i < n; ++i)
                out[i] = Conversion::Convert(in[i]);
        }
    };

    for (int y = rect.top; y < rect.bottom; ++y) {
        if (Kernel::IsAborted(options.abort)) return false;
        DestStored* row = dest->Row(y);
        if constexpr (PlainRowCopy) {
            if (writesAll && y < source->GetHeight() && rect.right <= source->GetWidth()) {
                if constexpr (SameFormat) {
                    std::memcpy(row + rect.left, source->Row(y) + rect.left,
                                std::size_t(rect.Width()) * sizeof(DestStored));
                } else {
                    // A tile's rows are short runs, each on pages of its own, which the processor's
                    // prefetching does not foresee: each span asks for the same span of the next row while it
                    // converts.
                    const bool prefetch = y + 1 < rect.bottom && y + 1 < source->GetHeight();
                    for (int x0 = rect.left; x0 < rect.right;) {
                        const int n = std::min(rect.right - x0, SpanLength);
                        if (prefetch) {
                            const auto* next = reinterpret_cast<const char*>(source->Row(y + 1) + x0);
                            const std::size_t bytes = std::size_t(n) * sizeof(StoredPixel<SourceFormat>);
                            for (std::size_t at = 0; at < bytes; at += 64) // a cache line at a time
                                __builtin_prefetch(next + at);
                        }
                        convertSpan(source->Row(y) + x0, row + x0, n);
                        x0 += n;
                    }
                }
                continue;
            }
        }
        // Spans end on multiples of 32, so that all but the first and last of a row are whole aligned blocks.
        for (int x0 = rect.left; x0 < rect.right;) {
            const int n = std::min(rect.right, (x0 / SpanLength + 1) * SpanLength) - x0;
            sampled.count = converted.count = current.count = result.count = weights.count = n;

            if constexpr (SameFormat) {
                Detail::SampleSpan<SourceModel, Sampler, Transform, Extend>(
                    *source, transform, samplerBlock, samplerImage, x0, y, n, converted.pixels);
            } else {
                Detail::SampleSpan<SourceModel, Sampler, Transform, Extend>(
                    *source, transform, samplerBlock, samplerImage, x0, y, n, sampled.pixels);
                convertSpan(sampled.pixels, converted.pixels, n);
            }
            if (needsDestination) std::memcpy(current.pixels, row + x0, std::size_t(n) * sizeof(DestStored));
            if constexpr (HasMask) Mask::ReadSpan(maskImage, maskParams->block, x0, y, weights);

            // A plain copy has nothing to compute: the converted span is the result.
            const DestStored* finished = converted.pixels;
            if constexpr (!std::is_same_v<ProcessStage, Copy> || HasMask) {
                const DestStored* destPixels = needsDestination ? current.pixels : converted.pixels;
                for (int i = 0; i < n; ++i) {
                    const float weight = HasMask ? weights.planes[0][i] : 1.0f;
                    result.pixels[i] =
                        process.template Process<DestFormat>(converted.pixels[i], destPixels[i], weight);
                }
                if constexpr (HasMask) SpanApplyMask(result, current, weights);
                finished = result.pixels;
            }

            DestStored* out = row + x0;
            if (writesAll) {
                if (n == SpanLength && x0 % SpanLength == 0) {
                    std::memcpy(out, finished, sizeof result.pixels); // an aligned block of 32 at once
                } else {
                    for (int i = 0; i < n; ++i)
                        out[i] = finished[i];
                }
            } else {
                for (int i = 0; i < n; ++i)
                    WriteChannels<DestFormat>(out[i], finished[i], channelMask);
            }
            x0 += n;
        }
    }
    return true;
}

} // namespace Raster
