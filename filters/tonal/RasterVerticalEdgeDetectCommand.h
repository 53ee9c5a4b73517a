#pragma once
// The vertical edge detect command: every pixel's colour becomes the magnitude of the horizontal gradient
// around it (vertical edges light up, flat areas go to the minimum); alpha stays. Applied to pixels only.

#include "filters/tonal/EdgeDetectStages.h"
#include "filters/tonal/VerticalEdgeDetect.h"
#include "frame/SinglePassCommand.h"

namespace RasterTools {

class RasterVerticalEdgeDetectCommand final
    : public SinglePassCommand<VerticalEdgeDetectFilter, RasterCommand> {
public:
    template <Raster::PixelFormat F>
    using PlainStages = EdgeDetectStages::Plain<F>;
    template <Raster::PixelFormat F>
    using MaskedStages = EdgeDetectStages::Masked<F>;

    RasterVerticalEdgeDetectCommand() = default;
    // The catalogue's form; a command without parameters has no live form, so liveEffect is ignored.
    RasterVerticalEdgeDetectCommand(bool, const VerticalEdgeDetectParameters& params)
        : m_Params(params) {}

    const VerticalEdgeDetectParameters& GetParameters() const noexcept { return m_Params; }

    Kernel::LocalisedString GetDescription() const override {
        return Kernel::LocalisedString(std::string(VerticalEdgeDetectFilter::kDescription),
                                       "Command description");
    }
    Kernel::Counted<DocumentCommand> Clone() const override {
        return Kernel::Counted<DocumentCommand>(new RasterVerticalEdgeDetectCommand(false, m_Params));
    }
    bool CanRepeat() const override { return true; }

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return Entry::properties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return Entry::properties; }

    // The stages take no parameters.
    template <class StageParams>
    void FillStageParams(StageParams&, const Kernel::RectT<double>&,
                         const Raster::AffineTransform::Params&) const noexcept {}

private:
    using Entry = FilterClassEntry<VerticalEdgeDetectFilter, RasterCommand>;
    VerticalEdgeDetectParameters m_Params;
};

} // namespace RasterTools
