#pragma once
// The motion blur command: smears the layer along one direction by a running box blur between two rotations.

#include "filters/blur/MotionBlur.h"
#include "filters/blur/MotionBlurRender.h"
#include "frame/FilterCommand.h"
#include "pipeline/PipelineCommand.h"

namespace RasterTools {

class RasterMotionBlurCommand final : public FilterCommand<MotionBlurFilter>, public PipelineCommand {
public:
    // For loading: Load then sets the fields.
    RasterMotionBlurCommand() = default;
    RasterMotionBlurCommand(bool liveEffect, double radius, double radians);
    RasterMotionBlurCommand(bool liveEffect, const MotionBlurParameters& params);

    double GetRadius() const noexcept { return m_Params.radius; }
    double GetRadians() const noexcept { return m_Params.radians; }

    bool CanAffectAlpha() const override { return true; }
    // Grows rect by the rows the blur reads along the motion, through both rotations (at view scale 1).
    void PrepareInputRectangle(Kernel::RectT<double>& rect) const override;
    // The smear reaches radius (and the resampling one pixel) beyond the layer's pixels.
    bool PrepareOutputRectangle(Kernel::RectT<double>& rect) const override;

    // The view's scale: sqrt(((a00 + a01)² + (a10 + a11)²) / 2).
    static double GetViewScale(const Raster::AffineTransform::Params& view) noexcept;
    // The rectangle of an intermediate image that holds rect turned by theta about its centre, with
    // trunc(radius / scale) rows added above and below (the host's unbounded rectangle stays as it is).
    static Kernel::RectT<int> CompensateIntermediate(const Kernel::RectT<int>& rect,
                                                     const Raster::AffineTransform::Params& view,
                                                     double radius, double theta);
    // Geometry and window of a render of rect of an image of the given size under view.
    MotionBlurRender::Plan MakePlan(const Kernel::RectT<int>& rect, int width, int height,
                                    const Raster::AffineTransform::Params& view) const noexcept;

    // Renders every layer format (source and destination of one format) with the device's steps when the
    // target has a device whose kernels are compiled, else on the processor; both give the same pixels.
    RenderPath Render(const RenderTarget& target) const override;
    bool PrepareDevice(const RenderTarget& target) const override;
    // The whole raster (cut to the selection) on the processor.
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override;

    // Effective radii beyond this many pixels are cut to it: the sums of 8- and 16-bit pixels stay exact.
    static constexpr int MaxWholeRadius = 30000;
};

} // namespace RasterTools
