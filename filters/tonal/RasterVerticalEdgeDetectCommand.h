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
    RasterVerticalEdgeDetectCommand(bool liveEffect, const VerticalEdgeDetectParameters& params);

    const VerticalEdgeDetectParameters& GetParameters() const noexcept { return m_Params; }

    Kernel::LocalisedString GetDescription() const override;
    Kernel::Counted<DocumentCommand> Clone() const override;
    bool CanRepeat() const override { return true; }

    // The stages take no parameters.
    template <class StageParams>
    void FillStageParams(StageParams&, const Kernel::RectT<double>&,
                         const Raster::AffineTransform::Params&) const noexcept {}

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }
    static Kernel::Counted<Kernel::Serialisable> CreateObject();
    // No property declares a default value: one empty item.
    static const Kernel::ClassPropertiesBase::DefaultItem* __GetDefaultSerialisation();

private:
    VerticalEdgeDetectParameters m_Params;
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
