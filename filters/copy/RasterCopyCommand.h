#pragma once
// The copy command: copies a layer into a destination of the same or another layer format, optionally
// scaled (bilinear), through the pixel pipeline on the device or the processor.

#include "filters/copy/Copy.h"
#include "frame/FilterCommand.h"
#include "pipeline/PipelineCommand.h"

namespace RasterTools {

class RasterCopyCommand final : public FilterCommand<CopyFilter>, public PipelineCommand {
public:
    // For loading: Load then sets the fields.
    RasterCopyCommand() = default;
    RasterCopyCommand(bool liveEffect, int format, Kernel::PointT<double> scale);
    RasterCopyCommand(bool liveEffect, const CopyParameters& params);

    // The destination format, or nothing to keep the source's.
    std::optional<Raster::PixelFormat> GetFormat() const noexcept;
    Kernel::PointT<double> GetScale() const noexcept { return m_Params.scale; }
    bool IsScaled() const noexcept { return m_Params.scale.x != 1.0 || m_Params.scale.y != 1.0; }

    // The pixels keep their alpha unless the format conversion changes it.
    bool CanAffectAlpha() const override { return false; }
    bool CanRequireInflation() const override { return false; }
    // A scaled copy reads the source where the inverse scale puts each output pixel, one pixel around.
    void PrepareInputRectangle(Kernel::RectT<double>& rect) const override;
    bool PrepareOutputRectangle(Kernel::RectT<double>& rect) const override;

    // The input scaled (at least one pixel a side) in the chosen format; scales outside the parameter's
    // range, or a format that is not a layer format, are clamped to it.
    OutputShape GetOutputShape(int width, int height, Raster::PixelFormat format) const override;
    RenderPath Render(const RenderTarget& target) const override;
    // Applied to a layer's pixels in place, on the processor.
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override {
        return raster ? RenderDirectly(*raster) : Kernel::RectT<int>{};
    }
    bool PrepareDevice(const RenderTarget& target) const override;

private:
    // The scale that rendering uses: within the parameter's range.
    Kernel::PointT<double> GetEffectiveScale() const noexcept;
};

} // namespace RasterTools
