#pragma once
// The pixel tool's restoring command: every dab copies whole pixels back from the nominated snapshot.

#include "brushes/RasterUndoBrushCommand.h"

namespace RasterTools {

class RasterPixelUndoCommand final : public RasterUndoBrushCommand {
public:
    using RasterUndoBrushCommand::RasterUndoBrushCommand;

    static Kernel::Counted<Kernel::Serialisable> CreateObject();
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

    void PerformNozzle(Raster::BrushNozzle& nozzle) const override;
    Kernel::Counted<RasterBrushCommand> Copy() const override;
    Kernel::LocalisedString GetDescription() const override;
    ToolID GetAssociatedToolID() const override { return ToolID::Pixel; }

private:
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
