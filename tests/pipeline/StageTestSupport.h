#pragma once
// Stage sets and stages that only the tests use, with their processor halves instantiated here.

#include "PipelineTestSupport.h"

#include "pipeline/ProcessorInstances.h"

namespace PipelineTest {

using AllFormats =
    RasterTools::FormatList<PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF, PixelFormat::IA8,
                            PixelFormat::IA16, PixelFormat::CMYKA8, PixelFormat::LabA16, PixelFormat::MaskA8,
                            PixelFormat::MaskA16, PixelFormat::MaskAF>;

// A nearest copy between any two formats that have conversions, masks included.
using AnyCopy = RasterTools::PipelineStages<Raster::Copy, Raster::IdentityMask, Raster::IdentitySampler,
                                            Raster::IdentityTransform, Raster::Zero, AllFormats, AllFormats>;

// Renders stages over all of destination on the processor, or on device after its kernel has compiled.
template <class Stages>
RasterTools::RenderPath
RenderAll(Kernel::Counted<Raster::DynamicBuffer> source, Kernel::Counted<Raster::DynamicBuffer> destination,
          const typename Stages::Params& params, Kernel::Counted<Raster::HardwareDevice> device,
          int channelMask = -1, Kernel::Counted<Raster::DynamicBuffer> mask = nullptr) {
    RasterTools::RenderTarget target;
    target.source.pixels = source;
    target.destination.pixels = destination;
    target.mask.pixels = mask;
    target.rect = destination->GetBounds();
    target.device = device;
    target.channelMask = channelMask;
    if (device) {
        EXPECT_TRUE(RasterTools::WaitForKernel<Stages>(target)) << Raster::GetLastHardwareError();
    }
    return RasterTools::Render<Stages>(target, params);
}

} // namespace PipelineTest
