#include "brushes/RasterPixelBrushCommand.h"

#include "brushes/PixelDab.h"

#include <typeinfo>

namespace RasterTools {

const Kernel::ClassProperties
    RasterPixelBrushCommand::ms_ClassProperties(Kernel::MakeFourCC("RPxB"),
                                                &RasterPixelBrushCommand::CreateObject, 1, nullptr,
                                                &RasterPaintBrushCommand::GetTypeClassProperties());

namespace {
struct Coverage {
    Coverage() {
        CommandCoverage::Instance().Register(typeid(RasterPixelBrushCommand), "RasterPixelBrushCommand");
    }
} const kCoverage;

constexpr Kernel::FourCC kColour = Kernel::MakeFourCC("Colr");
} // namespace

RasterPixelBrushCommand::RasterPixelBrushCommand(const Renderer::ConsolidatedColour& colour,
                                                 std::vector<Raster::BrushNozzle> nozzles,
                                                 const StrokeInfo& info,
                                                 Kernel::Counted<Raster::RasterBrush> brush,
                                                 int documentFormat)
    : RasterPaintBrushCommand(std::move(nozzles), info, std::move(brush))
    , m_Colour(colour)
    , m_DocumentFormat(documentFormat) {}

Kernel::Counted<Kernel::Serialisable> RasterPixelBrushCommand::CreateObject() {
    return Kernel::MakeCounted<RasterPixelBrushCommand>();
}

Kernel::LocalisedString RasterPixelBrushCommand::GetDescription() const {
    return {"Pixel Brush", "Raster pixel brush command name"};
}

Kernel::Counted<RasterBrushCommand> RasterPixelBrushCommand::Copy() const {
    if (IsFinished()) return {};
    auto copy = Kernel::MakeCounted<RasterPixelBrushCommand>();
    CopyStrokeInto(*copy);
    copy->m_Colour = m_Colour;
    copy->m_DocumentFormat = m_DocumentFormat;
    return copy;
}

Kernel::ReflectedList RasterPixelBrushCommand::EnumerateReflecteds() {
    auto list = RasterPaintBrushCommand::EnumerateReflecteds();
    list.push_back(Kernel::MakeCounted<Kernel::ReflectedBinding<Renderer::ConsolidatedColour>>(
        kColour, Kernel::LocalisedString("Colour", "Reflectable property"), [this] { return m_Colour; },
        [this](Renderer::ConsolidatedColour colour) { m_Colour = colour; }));
    return list;
}

void RasterPixelBrushCommand::PerformNozzle(Raster::BrushNozzle& nozzle) const {
    const Raster::RasterBrush* brush = GetBrush().Get();
    auto dab = PrepareDab(nozzle, brush);
    if (!dab) return;
    const double dynamic = GetDynamicFactor(*brush, nozzle);
    const Raster::PixelFormat format = dab->target->GetFormat();
    if (!brush->IsCoverageOnly() && !Raster::IsMaskFormat(format)) {
        double r = m_Colour.r, g = m_Colour.g, b = m_Colour.b;
        if (nozzle.hueOffset != 0.0f || nozzle.saturationOffset != 0.0f || nozzle.lightnessOffset != 0.0f) {
            const auto hsl = OffsetHueSaturationLightness(
                ToHueSaturationLightness(std::clamp(r, 0.0, 1.0), std::clamp(g, 0.0, 1.0),
                                         std::clamp(b, 0.0, 1.0)),
                nozzle.hueOffset, nozzle.saturationOffset, nozzle.lightnessOffset);
            FromHueSaturationLightness(hsl, r, g, b);
        }
        const auto pixel =
            GetRasterDynamicPixel({float(r), float(g), float(b), m_Colour.a}, Raster::ColourProfiles{},
                                  m_DocumentFormat, format, MakeColourCoverage(m_Colour.a, nozzle.opacity));
        const auto path = ChooseDabPath(nozzle.mode, nozzle.strength);
        if (!pixel || !path) return;
        const auto texture = GetDabTexture(*brush, format);
        Raster::DabRequest request;
        request.write = Raster::DabWrite::Colour;
        request.path = *path;
        request.strength = nozzle.strength;
        request.dynamic = dynamic;
        request.colour = pixel->data();
        request.texture = texture.Get();
        request.textureScale = brush->GetMaskTextureScale();
        request.targetOrigin = nozzle.targetOrigin;
        ComposeDab(*dab->target, dab->rect, *dab->coverage, request);
        return;
    }
    // A mask target, or a brush that only marks coverage: full intensity into the mask.
    Raster::DynamicBuffer* mask = Raster::IsMaskFormat(format) ? dab->target : nozzle.mask.Get();
    if (!mask || !Raster::IsMaskFormat(mask->GetFormat())) return;
    const double strength = double(nozzle.strength) * double(nozzle.opacity);
    const auto path = ChooseDabPath(nozzle.mode, strength);
    if (!path) return;
    const Kernel::RectT<int> rect = RoundNozzleRect(nozzle.rect, mask->GetWidth(), mask->GetHeight());
    if (rect.IsEmpty()) return;
    auto coverage = rect == dab->rect ? dab->coverage : brush->MakeCoverage(rect);
    if (!coverage) return;
    const auto texture = GetDabTexture(*brush, mask->GetFormat());
    Raster::DabRequest request;
    request.write = Raster::DabWrite::FullMask;
    request.path = *path;
    request.strength = strength;
    request.dynamic = dynamic;
    request.texture = texture.Get();
    request.textureScale = brush->GetMaskTextureScale();
    request.targetOrigin = nozzle.targetOrigin;
    ComposeDab(*mask, rect, *coverage, request);
}

void RasterPixelBrushCommand::Save(Kernel::OutSerialiser& out) const {
    const double colour[4] = {m_Colour.r, m_Colour.g, m_Colour.b, m_Colour.a};
    out.SaveArray(kColour, colour);
    RasterPaintBrushCommand::Save(out);
}

bool RasterPixelBrushCommand::Load(const Kernel::InSerialiser& in, Kernel::FileStore& store,
                                   unsigned short version) {
    std::vector<double> colour;
    if (!in.LoadArray(kColour, colour) || colour.size() != 4) return false;
    for (const double c : colour)
        if (!std::isfinite(c)) return false;
    m_Colour = {float(colour[0]), float(colour[1]), float(colour[2]), float(colour[3])};
    return RasterPaintBrushCommand::Load(in, store, version);
}

} // namespace RasterTools
