#include "brushes/RasterPixelEraseCommand.h"

#include "brushes/PixelDab.h"

#include <typeinfo>

namespace RasterTools {

const Kernel::ClassProperties
    RasterPixelEraseCommand::ms_ClassProperties(Kernel::MakeFourCC("RPxE"),
                                                &RasterPixelEraseCommand::CreateObject, 1, nullptr,
                                                &RasterEraseBrushCommand::GetTypeClassProperties());

namespace {
struct Coverage {
    Coverage() {
        CommandCoverage::Instance().Register(typeid(RasterPixelEraseCommand), "RasterPixelEraseCommand");
    }
} const kCoverage;
} // namespace

Kernel::Counted<Kernel::Serialisable> RasterPixelEraseCommand::CreateObject() {
    return Kernel::MakeCounted<RasterPixelEraseCommand>();
}

Kernel::LocalisedString RasterPixelEraseCommand::GetDescription() const {
    return {"Pixel Brush", "Raster pixel brush command name"};
}

Kernel::Counted<RasterBrushCommand> RasterPixelEraseCommand::Copy() const {
    if (IsFinished()) return {};
    auto copy = Kernel::MakeCounted<RasterPixelEraseCommand>();
    CopyStrokeInto(*copy);
    return copy;
}

void RasterPixelEraseCommand::PerformNozzle(Raster::BrushNozzle& nozzle) const {
    const Raster::RasterBrush* brush = GetBrush().Get();
    auto dab = PrepareDab(nozzle, brush);
    if (!dab) return;
    const double strength = double(nozzle.strength) * double(nozzle.opacity);
    const auto path = ChooseDabPath(nozzle.mode, strength);
    if (!path) return;
    const auto texture = GetDabTexture(*brush, dab->target->GetFormat());
    Raster::DabRequest request;
    // A mask's only channel is its alpha: erasing moves it to zero as well.
    request.write = Raster::DabWrite::ClearAlpha;
    request.path = *path;
    request.strength = strength;
    request.dynamic = GetDynamicFactor(*brush, nozzle);
    request.texture = texture.Get();
    request.textureScale = brush->GetMaskTextureScale();
    request.targetOrigin = nozzle.targetOrigin;
    ComposeDab(*dab->target, dab->rect, *dab->coverage, request);
}

} // namespace RasterTools
