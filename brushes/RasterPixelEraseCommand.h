#pragma once
// The pixel tool's erasing command: every dab takes the alpha of whole pixels away.

#include "brushes/RasterEraseBrushCommand.h"

namespace RasterTools {

class RasterPixelEraseCommand final : public RasterEraseBrushCommand {
public:
    using RasterEraseBrushCommand::RasterEraseBrushCommand;

    static Kernel::Counted<Kernel::Serialisable> CreateObject();
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

    void PerformNozzle(Raster::BrushNozzle& nozzle) const override;
    Kernel::Counted<RasterBrushCommand> Copy() const override;
    // The same label as the painting command's.
    Kernel::LocalisedString GetDescription() const override;
    ToolID GetAssociatedToolID() const override { return ToolID::Pixel; }

private:
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
