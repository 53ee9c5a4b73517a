#pragma once
// The processor half of Render for one destination format: the seam where run-time formats become one
// ProcessTile instantiation each. Included only by the files that instantiate it, one destination format
// per file (RT_INSTANTIATE_PROCESSOR), so that the instantiations build in parallel.

#include "host/raster/ProcessTile.h"
#include "pipeline/Conversions.h"
#include "pipeline/Pipeline.h"

namespace RasterTools {

namespace Detail {

template <Raster::PixelFormat F>
using ChannelsOf = Raster::FormatChannels<F>;

template <class Stages, Raster::PixelFormat Dest, Raster::PixelFormat Source, class MaskChannels>
bool ProcessFormats(const RenderTarget& target, const Kernel::RectT<int>& rect,
                    const typename Stages::Params& params) {
    using D = ChannelsOf<Dest>;
    using S = ChannelsOf<Source>;
    using M = MaskChannels;
    using Process = typename Stages::Process;
    using Mask = typename Stages::Mask;
    using Sampler = typename Stages::Sampler;
    const Raster::BitmapOf<Source> source(target.source.pixels.Get());
    Raster::BitmapOf<Dest> dest(target.destination.pixels.Get());
    const typename Raster::MaskBase<Mask>::Params mask{params.mask, target.mask.pixels.Get(), nullptr};
    const typename Raster::SamplerBase<Sampler>::Params sampler{params.sampler, target.sampler.pixels.Get()};
    const Raster::TileOptions options{target.channelMask, target.abort};
    return Raster::ProcessBase<Process>::template ProcessTile<
        Raster::PixelProcessor<Raster::Horizontal>, typename D::C1, typename D::C2, typename D::C3,
        typename D::C4, typename D::C5, typename S::C1, typename S::C2, typename S::C3, typename S::C4,
        typename S::C5, typename M::C1, typename M::C2, typename M::C3, typename M::C4, typename M::C5,
        Raster::BitmapOf<Dest>, Raster::BitmapOf<Source>, Process, Mask, Sampler, typename Stages::Transform,
        typename Stages::Extend, typename Stages::Blend>(&source, &dest, params.process, rect, &mask,
                                                         &params.transform, &sampler, options);
}

// The channel list of a kernel without a mask image.
struct NoMaskChannels {
    using C1 = Raster::X1;
    using C2 = Raster::X2;
    using C3 = Raster::X3;
    using C4 = Raster::X4;
    using C5 = Raster::X5;
};

} // namespace Detail

template <class Stages, Raster::PixelFormat Dest>
bool RunProcessorFor(const RenderTarget& target, const Kernel::RectT<int>& rect,
                     const typename Stages::Params& params) {
    return Stages::SourceFormats::Dispatch(target.source.pixels->GetFormat(), [&](auto source) {
        constexpr Raster::PixelFormat Source = decltype(source)::value;
        if constexpr (MaskReadsImage<typename Stages::Mask>) {
            return Stages::MaskFormats::Dispatch(target.mask.pixels->GetFormat(), [&](auto mask) {
                using M = Detail::ChannelsOf<decltype(mask)::value>;
                return Detail::ProcessFormats<Stages, Dest, Source, M>(target, rect, params);
            });
        } else {
            return Detail::ProcessFormats<Stages, Dest, Source, Detail::NoMaskChannels>(target, rect, params);
        }
    });
}

} // namespace RasterTools

// Instantiates the processor half of Stages for the destination format Format (a PixelFormat enumerator).
#define RT_INSTANTIATE_PROCESSOR(Stages, Format)                                                             \
    template bool RasterTools::RunProcessorFor<Stages, Raster::PixelFormat::Format>(                         \
        const RasterTools::RenderTarget&, const Kernel::RectT<int>&, const Stages::Params&);
