#pragma once
// The vertical edge detect command: every pixel's colour becomes the magnitude of the horizontal gradient
// around it (vertical edges light up, flat areas go to the minimum); alpha stays. Applied to pixels only.

#include "filters/tonal/VerticalEdgeDetect.h"
#include "host/document/Command.h"
#include "pipeline/PipelineCommand.h"

namespace RasterTools {

class RasterVerticalEdgeDetectCommand final : public RasterCommand, public PipelineCommand {
public:
    RasterVerticalEdgeDetectCommand() = default;
    // The catalogue's form; a command without parameters has no live form, so liveEffect is ignored.
    RasterVerticalEdgeDetectCommand(bool liveEffect, const VerticalEdgeDetectParameters& params);

    const VerticalEdgeDetectParameters& GetParameters() const noexcept { return m_Params; }

    Kernel::LocalisedString GetDescription() const override;
    Kernel::Counted<DocumentCommand> Clone() const override;
    bool CanRepeat() const override { return true; }

    // Renders on the device or the processor, for every layer format (source and destination alike).
    RenderPath Render(const RenderTarget& target) const override;
    bool PrepareDevice(const RenderTarget& target) const override;
    // The whole raster (cut to the selection) on the processor.
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override;

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
