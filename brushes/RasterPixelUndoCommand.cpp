#include "brushes/RasterPixelUndoCommand.h"

#include "brushes/PixelDab.h"

#include <typeinfo>

namespace RasterTools {

const Kernel::ClassProperties
    RasterPixelUndoCommand::ms_ClassProperties(Kernel::MakeFourCC("RPxU"),
                                               &RasterPixelUndoCommand::CreateObject, 1, nullptr,
                                               &RasterUndoBrushCommand::GetTypeClassProperties());

namespace {
struct Coverage {
    Coverage() {
        CommandCoverage::Instance().Register(typeid(RasterPixelUndoCommand), "RasterPixelUndoCommand");
    }
} const kCoverage;
} // namespace

Kernel::Counted<Kernel::Serialisable> RasterPixelUndoCommand::CreateObject() {
    return Kernel::MakeCounted<RasterPixelUndoCommand>();
}

Kernel::LocalisedString RasterPixelUndoCommand::GetDescription() const {
    return {"Pixel Undo Brush", "Raster pixel undo brush command name"};
}

Kernel::Counted<RasterBrushCommand> RasterPixelUndoCommand::Copy() const {
    if (IsFinished()) return {};
    auto copy = Kernel::MakeCounted<RasterPixelUndoCommand>();
    CopyStrokeInto(*copy);
    copy->SetSnapshot(GetSnapshot());
    return copy;
}

void RasterPixelUndoCommand::PerformNozzle(Raster::BrushNozzle& nozzle) const {
    const Raster::RasterBrush* brush = GetBrush().Get();
    auto dab = PrepareDab(nozzle, brush);
    if (!dab || !nozzle.source) return;
    const auto texture = GetDabTexture(*brush, dab->target->GetFormat());
    Raster::DabRequest request;
    request.write = Raster::DabWrite::Copy;
    request.strength = double(nozzle.strength) * double(nozzle.opacity);
    request.dynamic = GetDynamicFactor(*brush, nozzle);
    request.source = nozzle.source.Get();
    request.texture = texture.Get();
    request.textureScale = brush->GetMaskTextureScale();
    request.targetOrigin = nozzle.targetOrigin;
    ComposeDab(*dab->target, dab->rect, *dab->coverage, request);
}

} // namespace RasterTools
