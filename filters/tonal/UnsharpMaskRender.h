#pragma once
// The unsharp mask's processor render of one rectangle (instantiated in instances/, one file per format).

#include "pipeline/Pipeline.h"

#include <vector>

namespace RasterTools::UnsharpMaskRender {

struct Plan {
    std::vector<float> taps; // the Gaussian's weights for offsets -margin..margin, summing to 1
    float factor = 0.0f;
    float threshold = 0.0f; // 0..1 of the channel range
    int Margin() const noexcept { return int(taps.size() / 2); }
};

// Processor, or Aborted.
template <Raster::PixelFormat F>
RenderPath Run(const RenderTarget& target, const Kernel::RectT<int>& rect, const Plan& plan);

#define RT_DECLARE_UNSHARP_MASK(FORMAT)                                                                      \
    extern template RenderPath Run<Raster::PixelFormat::FORMAT>(const RenderTarget&,                         \
                                                                const Kernel::RectT<int>&, const Plan&);
RT_DECLARE_UNSHARP_MASK(RGBA8)
RT_DECLARE_UNSHARP_MASK(RGBA16)
RT_DECLARE_UNSHARP_MASK(RGBAUF)
RT_DECLARE_UNSHARP_MASK(IA8)
RT_DECLARE_UNSHARP_MASK(IA16)
RT_DECLARE_UNSHARP_MASK(CMYKA8)
RT_DECLARE_UNSHARP_MASK(LabA16)
#undef RT_DECLARE_UNSHARP_MASK

} // namespace RasterTools::UnsharpMaskRender
