#pragma once
// The copy's four kinds of render: plain (nearest, identity) or scaled (bilinear through an identity-then-
// scale chain), each without or with a selection mask. Their processor halves are instantiated per
// destination format in instances/.

#include "pipeline/Pipeline.h"

namespace RasterTools::CopyStages {

using Plain = PipelineStages<Raster::Copy, Raster::IdentityMask, Raster::IdentitySampler,
                             Raster::IdentityTransform, Raster::Zero>;
using PlainMasked = PipelineStages<Raster::Copy, Raster::BitmapMask, Raster::IdentitySampler,
                                   Raster::IdentityTransform, Raster::Zero>;
using ScaleChain = Raster::ChainedTransform<Raster::IdentityTransform, Raster::ScaleTransform>;
// Edge pixels continue outwards, so that the bilinear border does not fade into transparency.
using Scaled =
    PipelineStages<Raster::Copy, Raster::IdentityMask, Raster::BilinearSampler, ScaleChain, Raster::Safe>;
using ScaledMasked =
    PipelineStages<Raster::Copy, Raster::BitmapMask, Raster::BilinearSampler, ScaleChain, Raster::Safe>;

} // namespace RasterTools::CopyStages

// One destination format's instantiations of all four.
#define RT_INSTANTIATE_COPY(Format)                                                                          \
    RT_INSTANTIATE_PROCESSOR(RasterTools::CopyStages::Plain, Format)                                         \
    RT_INSTANTIATE_PROCESSOR(RasterTools::CopyStages::PlainMasked, Format)                                   \
    RT_INSTANTIATE_PROCESSOR(RasterTools::CopyStages::Scaled, Format)                                        \
    RT_INSTANTIATE_PROCESSOR(RasterTools::CopyStages::ScaledMasked, Format)
