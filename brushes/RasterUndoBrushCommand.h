#pragma once
// The base of brush commands that restore pixels from the nominated history snapshot.

#include "host/brush/RasterBrushCommand.h"
#include "host/document/DocumentController.h"

namespace RasterTools {

class RasterUndoBrushCommand : public RasterBrushCommand {
public:
    RasterUndoBrushCommand() = default;
    RasterUndoBrushCommand(std::vector<Raster::BrushNozzle> nozzles, const StrokeInfo& info,
                           Kernel::Counted<Raster::RasterBrush> brush,
                           Kernel::Counted<DocumentSnapshot> snapshot)
        : RasterBrushCommand(std::move(nozzles), info, std::move(brush))
        , m_Snapshot(std::move(snapshot)) {}

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }
    // The snapshot restored from; null when none was nominated (and after loading: history keeps the
    // pixels the stroke changed, not the snapshot).
    const Kernel::Counted<DocumentSnapshot>& GetSnapshot() const noexcept { return m_Snapshot; }

protected:
    // Hands the nozzle the snapshot's pixels under it, when the snapshot has the layer in the same format.
    void PrepareNozzle(Raster::BrushNozzle& nozzle, const MutableRasterInterface& raster) const override;
    void SetSnapshot(Kernel::Counted<DocumentSnapshot> snapshot) { m_Snapshot = std::move(snapshot); }

private:
    Kernel::Counted<DocumentSnapshot> m_Snapshot;
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
