#include "host/brush/RasterBrushTool.h"

#include "host/document/DocumentController.h"
#include "host/document/PixelEffect.h"

#include <cmath>

RasterBrushTool::RasterBrushTool(Kernel::NonCounted<DocumentController> controller)
    : Tool(controller) {}

void RasterBrushTool::ReplaceBrush(Kernel::Counted<Raster::RasterBrush> brush) {
    if (!brush) return;
    m_Brush = brush;
    m_Engine.SetRasterBrush(std::move(brush));
}

RasterBrushCommand::StrokeInfo RasterBrushTool::MakeStrokeInfo(bool generated) const {
    RasterBrushCommand::StrokeInfo info;
    info.generated = generated;
    info.flags[0] = m_Flags[0];
    info.flags[1] = m_Flags[1];
    info.rect = m_Engine.GetStrokeBounds();
    info.extra = m_Brush ? m_Brush->GetSize() : 0.0;
    return info;
}

void RasterBrushTool::RunAssistantSteps() {
    const auto steps = std::exchange(m_Assistant, {});
    const auto controller = GetSafeDocumentController();
    if (!controller) return;
    const auto& document = controller->GetDocument();
    for (const AssistantStep step : steps) {
        if (step != AssistantStep::AddRasterLayer) continue; // the reference host has no vector layers
        if (!GetPixelTargets(*document).empty()) continue;
        const auto& defaults = controller->GetDocumentDefaults();
        Kernel::Counted<Node> layer(new RasterNode(
            "Layer " + std::to_string(document->GetLayers().size() + 1), defaults.width, defaults.height));
        document->InsertLayer(document->GetLayers().size(), layer);
        controller->SetSelection({layer});
    }
}

void RasterBrushTool::OnMouseDown(const ToolPointSpread& point, const Raster::AffineTransform::Params& view) {
    (void)point, (void)view;
    RunAssistantSteps();
}

void RasterBrushTool::OnBeginDrag(const ToolPointSpread& point) {
    OnMouseDown(point, Raster::AffineTransform::Params{});
    Tool::OnBeginDrag(point);
    if (m_State == PickingColour || m_State == Adjusting) return;
    m_Engine.SetRasterBrush(m_Brush);
    m_Engine.SetDabSettings(m_Opacity, m_Strength, m_DabMode);
    m_Engine.BeginStroke(point.GetSpreadPoint(), m_Pressure);
    m_State = Painting;
}

void RasterBrushTool::OnDrag(const ToolPointSpread& point) {
    Tool::OnDrag(point);
    if (m_State == Painting) m_Engine.StrokeTo(point.GetSpreadPoint(), m_Pressure);
}

void RasterBrushTool::OnEndDrag(const ToolPointSpread& point) {
    if (m_State == Painting) {
        m_Engine.StrokeTo(point.GetSpreadPoint(), m_Pressure);
        FinishSegment(true);
        m_Engine.EndStroke();
        m_State = Idle;
    }
    Tool::OnEndDrag(point);
}

void RasterBrushTool::Stroke(const std::vector<Kernel::PointT<double>>& points) {
    if (points.empty()) return;
    OnBeginDrag({points.front()});
    for (std::size_t i = 1; i + 1 < points.size(); ++i)
        OnDrag({points[i]});
    OnEndDrag({points.back()});
}

void RasterBrushTool::FinishSegment(bool final) {
    auto nozzles = m_Engine.TakeNozzles();
    if (nozzles.empty()) return;
    if (auto command = GenerateCommand(nozzles, true, final)) EnqueueCommand(std::move(command), false);
}

Kernel::ReflectedList RasterBrushTool::EnumerateReflecteds() {
    using Kernel::LocalisedString;
    Kernel::ReflectedList list;
    list.push_back(Kernel::MakeCounted<Kernel::ReflectedUnitRangeBinding>(
        Kernel::MakeFourCC("BrSz"), LocalisedString("Width", "Reflected property"),
        Raster::RasterBrush::kMinimumSize, Raster::RasterBrush::kMaximumSize,
        [this] { return m_Brush ? m_Brush->GetSize() : 0.0; },
        [this](double size) {
            if (!m_Brush) return;
            auto copy = m_Brush->Copy();
            copy->SetSize(size);
            ReplaceBrush(copy);
        },
        Kernel::AttributeList{Kernel::MakeCounted<Kernel::ValueTypeAttribute>(Kernel::UnitKind::Pixels)}));
    list.push_back(Kernel::MakeCounted<Kernel::ReflectedUnitRangeBinding>(
        Kernel::MakeFourCC("Opac"), LocalisedString("Opacity", "Reflected property"), 0.0, 1.0,
        [this] { return double(m_Opacity); },
        [this](double value) { m_Opacity = std::isnan(value) ? 1.0f : float(std::clamp(value, 0.0, 1.0)); },
        Kernel::AttributeList{Kernel::MakeCounted<Kernel::RepresentsOpacityAttribute>()}));
    list.push_back(Kernel::MakeCounted<Kernel::ReflectedUnitRangeBinding>(
        Kernel::MakeFourCC("Flow"), LocalisedString("Flow", "Reflected property"), 0.0, 1.0,
        [this] { return double(m_Strength); },
        [this](double value) {
            m_Strength = std::isnan(value) ? 1.0f : float(std::clamp(value, 0.0, 1.0));
        }));
    list.push_back(Kernel::MakeCounted<Kernel::ReflectedEnum>(
        Kernel::MakeFourCC("DbMd"), LocalisedString("Dab mode", "Reflected property"),
        std::vector<LocalisedString>{LocalisedString("Paint", "Brush dab mode"),
                                     LocalisedString("Stamp", "Brush dab mode")},
        [this] { return m_DabMode; }, [this](int mode) { m_DabMode = mode == 1 ? 1 : 0; }));
    return list;
}

Kernel::ReflectedList RasterBrushTool::EnumerateQuickActions() {
    return {Kernel::MakeCounted<Kernel::ReflectedAction>(
        Kernel::MakeFourCC("RsBr"), Kernel::LocalisedString("Reset brush", "Brush action"), [this] {
            if (m_DefaultBrush) ReplaceBrush(m_DefaultBrush->Copy());
        })};
}
