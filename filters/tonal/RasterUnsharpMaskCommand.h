#pragma once
// The unsharp-mask command: adds back factor × (source − blur) where the difference passes the threshold.

#include "filters/tonal/UnsharpMask.h"
#include "filters/tonal/UnsharpMaskRender.h"
#include "frame/FilterCommand.h"
#include "pipeline/PipelineCommand.h"

namespace RasterTools {

class RasterUnsharpMaskCommand final : public FilterCommand<UnsharpMaskFilter>, public PipelineCommand {
public:
    // For loading: Load then sets the fields.
    RasterUnsharpMaskCommand() = default;
    RasterUnsharpMaskCommand(bool liveEffect, double radius, double factor, double threshold);
    RasterUnsharpMaskCommand(bool liveEffect, const UnsharpMaskParameters& params);

    double GetRadius() const noexcept { return m_Params.radius; }
    double GetFactor() const noexcept { return m_Params.factor; }
    double GetThreshold() const noexcept { return m_Params.threshold; }

    bool CanAffectAlpha() const override { return false; }
    // The blur reads ceil(radius / 3) whole pixels beyond every side of the output.
    void PrepareInputRectangle(Kernel::RectT<double>& rect) const override;
    bool PrepareOutputRectangle(Kernel::RectT<double>& rect) const override;
    int GetMargin() const noexcept;
    // The Gaussian (standard deviation radius / 6, cut off at the margin), factor and threshold.
    UnsharpMaskRender::Plan MakePlan() const;

    // Renders every layer format (source and destination of one format) with the device's steps when the
    // target has a device whose kernels are compiled, else on the processor; both give the same pixels.
    RenderPath Render(const RenderTarget& target) const override;
    bool PrepareDevice(const RenderTarget& target) const override;
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override;
};

} // namespace RasterTools
