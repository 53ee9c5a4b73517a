#include "host/brush/RasterBrushCommand.h"

#include "host/document/Document.h"

#include "host/kernel/Abort.h"

#include <algorithm>
#include <cmath>

// Abstract bases: in the class hierarchy, never created from a stream.
const Kernel::ClassProperties
    RasterBrushCommand::ms_ClassProperties(0, nullptr, 1, nullptr, &RasterCommand::GetTypeClassProperties());
const Kernel::ClassProperties
    RasterPaintBrushCommand::ms_ClassProperties(0, nullptr, 1, nullptr,
                                                &RasterBrushCommand::GetTypeClassProperties());

namespace {

constexpr Kernel::FourCC kNozzles = Kernel::MakeFourCC("Nozl");
constexpr Kernel::FourCC kGenerated = Kernel::MakeFourCC("Genr");
constexpr Kernel::FourCC kFlag0 = Kernel::MakeFourCC("Flg0");
constexpr Kernel::FourCC kFlag1 = Kernel::MakeFourCC("Flg1");
constexpr Kernel::FourCC kStrokeRect = Kernel::MakeFourCC("SRct");
constexpr Kernel::FourCC kExtra = Kernel::MakeFourCC("SExt");
constexpr Kernel::FourCC kBrush = Kernel::MakeFourCC("Brsh");
constexpr std::size_t kNozzleFields = 12;

int ToInt(double value) {
    // Anything that is not a small whole number becomes -1, which no composition accepts.
    if (!(value >= -2147483648.0 && value <= 2147483647.0) || value != std::floor(value)) return -1;
    return int(value);
}

} // namespace

Kernel::RectT<int> RoundNozzleRect(const Kernel::RectT<double>& rect, int width, int height) {
    const double coordinates[4] = {rect.left, rect.top, rect.right, rect.bottom};
    int rounded[4];
    for (int i = 0; i < 4; ++i) {
        if (std::isnan(coordinates[i])) return {};
        const double held = std::clamp(coordinates[i], -RasterBrushCommand::kCoordinateLimit,
                                       RasterBrushCommand::kCoordinateLimit);
        rounded[i] = int(std::round(held));
    }
    const Kernel::RectT<int> result =
        Kernel::RectT<int>{rounded[0], rounded[1], rounded[2], rounded[3]}.Intersect({0, 0, width, height});
    return result.IsEmpty() ? Kernel::RectT<int>{} : result;
}

RasterBrushCommand::RasterBrushCommand(std::vector<Raster::BrushNozzle> nozzles, const StrokeInfo& info,
                                       Kernel::Counted<Raster::RasterBrush> brush)
    : m_Nozzles(std::move(nozzles))
    , m_Info(info)
    , m_Brush(std::move(brush)) {
    if (m_Nozzles.size() > kMaxNozzles) m_Nozzles.resize(kMaxNozzles);
    for (auto& nozzle : m_Nozzles) {
        // The command keeps dabs, not targets.
        nozzle.bitmap = {};
        nozzle.mask = {};
        nozzle.coverage = {};
        nozzle.source = {};
    }
}

void RasterBrushCommand::CopyStrokeInto(RasterBrushCommand& other) const {
    other.m_Nozzles = m_Nozzles;
    other.m_Info = m_Info;
    other.m_Brush = m_Brush ? m_Brush->Copy() : nullptr;
    other.SetSelection({});
}

Kernel::Counted<DocumentCommand> RasterBrushCommand::Clone() const {
    return Copy();
}

namespace {

// The coverage limited by the document's pixel selection (MaskA8, document pixels).
void LimitBySelection(Raster::DynamicBuffer& coverage, Kernel::PointT<int> at,
                      const SelectionRasterNode& selection) {
    const auto& mask = selection.GetMask();
    const double full = Raster::MaskFullValue(coverage.GetFormat());
    for (int y = 0; y < coverage.GetHeight(); ++y)
        for (int x = 0; x < coverage.GetWidth(); ++x) {
            const long long dx = (long long)at.x + x, dy = (long long)at.y + y;
            double selected = 0.0;
            if (mask && dx >= 0 && dy >= 0 && dx < mask->GetWidth() && dy < mask->GetHeight())
                selected = mask->Row<std::uint8_t>(int(dy))[dx] / 255.0;
            switch (coverage.GetFormat()) {
            case Raster::PixelFormat::MaskA8: {
                auto& v = coverage.Row<std::uint8_t>(y)[x];
                v = std::uint8_t(std::lround(v * selected));
                break;
            }
            case Raster::PixelFormat::MaskA16: {
                auto& v = coverage.Row<std::uint16_t>(y)[x];
                v = std::uint16_t(std::lround(v * selected));
                break;
            }
            default:
                coverage.Row<float>(y)[x] = float(coverage.Row<float>(y)[x] * selected);
                break;
            }
            (void)full;
        }
}

} // namespace

Kernel::RectT<int> RasterBrushCommand::DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const {
    const auto pixels = raster->GetPixels();
    if (!pixels || !m_Brush) return {};
    const auto transform = raster->GetTransform();
    // Layers sit at whole-pixel offsets in the document.
    const double offsetX = transform.m[2], offsetY = transform.m[5];
    const SelectionRasterNode* selection = raster->GetSelection();
    Kernel::RectT<int> changed;
    for (const auto& stored : m_Nozzles) {
        if (Kernel::IsAborted(raster->GetAbort())) break;
        Raster::BrushNozzle nozzle = stored;
        nozzle.rect = {stored.rect.left - offsetX, stored.rect.top - offsetY, stored.rect.right - offsetX,
                       stored.rect.bottom - offsetY};
        const Kernel::RectT<int> rect = RoundNozzleRect(nozzle.rect, pixels->GetWidth(), pixels->GetHeight());
        if (rect.IsEmpty()) continue;
        nozzle.rect = {double(rect.left), double(rect.top), double(rect.right), double(rect.bottom)};
        nozzle.bitmap = pixels;
        nozzle.targetOrigin = {int(offsetX), int(offsetY)};
        nozzle.coverage = m_Brush->MakeCoverage(rect);
        if (!nozzle.coverage) continue;
        if (selection && !selection->IsSelectNone())
            LimitBySelection(*nozzle.coverage, {rect.left + int(offsetX), rect.top + int(offsetY)},
                             *selection);
        PrepareNozzle(nozzle, *raster);
        PerformNozzle(nozzle);
        changed = changed.IsEmpty()
                      ? rect
                      : Kernel::RectT<int>{std::min(changed.left, rect.left), std::min(changed.top, rect.top),
                                           std::max(changed.right, rect.right),
                                           std::max(changed.bottom, rect.bottom)};
    }
    return changed;
}

void RasterBrushCommand::Save(Kernel::OutSerialiser& out) const {
    std::vector<double> values;
    values.reserve(m_Nozzles.size() * kNozzleFields);
    for (const auto& n : m_Nozzles) {
        const double fields[kNozzleFields] = {
            n.rect.left,    n.rect.top,      n.rect.right, n.rect.bottom,      n.opacity,         n.strength,
            double(n.mode), double(n.param), n.hueOffset,  n.saturationOffset, n.lightnessOffset, n.pressure};
        values.insert(values.end(), fields, fields + kNozzleFields);
    }
    out.SaveArray(kNozzles, values);
    out.SaveType(kGenerated, m_Info.generated);
    out.SaveType(kFlag0, std::int32_t(m_Info.flags[0]));
    out.SaveType(kFlag1, std::int32_t(m_Info.flags[1]));
    const double rect[4] = {m_Info.rect.left, m_Info.rect.top, m_Info.rect.right, m_Info.rect.bottom};
    out.SaveArray(kStrokeRect, rect);
    out.SaveType(kExtra, m_Info.extra);
    if (m_Brush) out.SaveObject(kBrush, *m_Brush);
    RasterCommand::Save(out);
}

bool RasterBrushCommand::Load(const Kernel::InSerialiser& in, Kernel::FileStore& store,
                              unsigned short version) {
    std::vector<double> values;
    if (!in.LoadArray(kNozzles, values) || values.size() % kNozzleFields != 0 ||
        values.size() / kNozzleFields > kMaxNozzles)
        return false;
    m_Nozzles.clear();
    m_Nozzles.reserve(values.size() / kNozzleFields);
    for (std::size_t i = 0; i < values.size(); i += kNozzleFields) {
        const double* f = values.data() + i;
        Raster::BrushNozzle n;
        n.rect = {f[0], f[1], f[2], f[3]};
        n.opacity = float(f[4]);
        n.strength = float(f[5]);
        n.mode = ToInt(f[6]);
        n.param = ToInt(f[7]);
        n.hueOffset = float(f[8]);
        n.saturationOffset = float(f[9]);
        n.lightnessOffset = float(f[10]);
        n.pressure = float(f[11]);
        m_Nozzles.push_back(n);
    }
    in.LoadType(kGenerated, m_Info.generated);
    std::int32_t flag = 0;
    if (in.LoadType(kFlag0, flag)) m_Info.flags[0] = std::uint8_t(flag);
    if (in.LoadType(kFlag1, flag)) m_Info.flags[1] = std::uint8_t(flag);
    std::vector<double> rect;
    if (in.LoadArray(kStrokeRect, rect) && rect.size() == 4)
        m_Info.rect = {rect[0], rect[1], rect[2], rect[3]};
    in.LoadType(kExtra, m_Info.extra);
    m_Brush = Kernel::CountedCast<Raster::RasterBrush>(in.LoadObject(kBrush, store));
    if (!m_Brush) return false;
    return RasterCommand::Load(in, store, version);
}

Kernel::ReflectedList RasterPaintBrushCommand::EnumerateReflecteds() {
    return {Kernel::MakeCounted<Kernel::ReflectedBinding<int>>(
        Kernel::MakeFourCC("Dabs"), Kernel::LocalisedString("Dabs", "Reflected property"),
        [this] { return int(GetNozzles().size()); }, nullptr)};
}
