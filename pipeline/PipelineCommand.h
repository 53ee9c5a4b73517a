#pragma once
// The rendering face of a command that renders through the pixel pipeline. Commands derive from it beside
// their host command base; front ends and the conformance tests reach it with dynamic_cast.

#include "host/document/RasterInterface.h"
#include "host/raster/AffineTransform.h"
#include "host/renderer/SpanPopulator.h"
#include "pipeline/Pipeline.h"

namespace RasterTools {

// The image that rendering an input produces.
struct OutputShape {
    int width = 0;
    int height = 0;
    Raster::PixelFormat format = Raster::PixelFormat::RGBA8;
    friend bool operator==(const OutputShape&, const OutputShape&) = default;
};

class PipelineCommand : public Renderer::SpanPopulatorBitmapFillMutationHost {
public:
    virtual ~PipelineCommand() = default;

    // The destination a render of an input of this size and format writes: the same by default.
    virtual OutputShape GetOutputShape(int width, int height, Raster::PixelFormat format) const {
        return {width, height, format};
    }
    // Renders target.rect of the destination (see Render in Pipeline.h). Const and free of shared state:
    // tiles of one job render on several threads at once.
    virtual RenderPath Render(const RenderTarget& target) const = 0;
    // Blocks until the kernel for target has compiled; true when the device can take it.
    virtual bool PrepareDevice(const RenderTarget& target) const = 0;
    // False for a command without a device kernel: it renders every target on the processor, and agreement
    // tests compare only its processor renders.
    virtual bool HasDeviceKernel() const { return true; }

    // The host's two forms: render rect of the destination from the source, on the device that
    // Raster::Hardware::GetDevice() picks (RASTERTOOLS_DEVICE) or else on the processor.
    void PrepareSpanPopulator(const Renderer::SpanPopulatorBitmapFillMutationTarget* target,
                              Kernel::RectT<int> rect, Kernel::Counted<Raster::DynamicBuffer> buffer,
                              Raster::AffineTransform::Params transform, bool, bool* abort,
                              int) const override;
    void PrepareSpanPopulator(Kernel::Counted<Raster::DynamicBuffer> source, int,
                              Kernel::RectT<double> bounds, Raster::AffineTransform::Params transform,
                              Kernel::RectT<int> rect, Kernel::Counted<Raster::DynamicBuffer> destination,
                              bool* abort) const override;

protected:
    PipelineCommand() = default;
    PipelineCommand(const PipelineCommand&) = default;
    PipelineCommand& operator=(const PipelineCommand&) = default;

    // DoEffect's body for pipeline commands: renders the raster's effect area (see GetEffectArea) in place on
    // the processor, in tiles, with the raster's abort flag and progress; returns the area, or the empty
    // rectangle when nothing was changed.
    Kernel::RectT<int> RenderDirectly(const MutableRasterInterface& raster) const;
};

} // namespace RasterTools
