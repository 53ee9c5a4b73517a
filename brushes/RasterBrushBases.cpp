#include "brushes/RasterEraseBrushCommand.h"
#include "brushes/RasterUndoBrushCommand.h"

#include <cmath>

namespace RasterTools {

// Abstract bases: in the class hierarchy, never created from a stream.
const Kernel::ClassProperties
    RasterEraseBrushCommand::ms_ClassProperties(0, nullptr, 1, nullptr,
                                                &RasterBrushCommand::GetTypeClassProperties());
const Kernel::ClassProperties
    RasterUndoBrushCommand::ms_ClassProperties(0, nullptr, 1, nullptr,
                                               &RasterBrushCommand::GetTypeClassProperties());

void RasterUndoBrushCommand::PrepareNozzle(Raster::BrushNozzle& nozzle,
                                           const MutableRasterInterface& raster) const {
    nozzle.source = {};
    if (!m_Snapshot || !nozzle.bitmap) return;
    const LayerSnapshot* layer = m_Snapshot->FindLayer(raster.GetLayerId());
    if (!layer || !layer->GetBase() || layer->GetBase()->GetFormat() != nozzle.bitmap->GetFormat()) return;
    // DoEffect has already rounded the rect to whole target pixels.
    const Kernel::RectT<int> rect{int(nozzle.rect.left), int(nozzle.rect.top), int(nozzle.rect.right),
                                  int(nozzle.rect.bottom)};
    nozzle.source = layer->Read(rect.Intersect(layer->GetBase()->GetBounds()));
}

} // namespace RasterTools
