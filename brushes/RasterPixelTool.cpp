#include "brushes/RasterPixelTool.h"

#include "brushes/RasterPixelBrushCommand.h"
#include "brushes/RasterPixelEraseCommand.h"
#include "brushes/RasterPixelUndoCommand.h"
#include "frame/Registration.h"
#include "host/document/Notifications.h"
#include "host/document/VeyraController.h"

#include <algorithm>

namespace RasterTools {

namespace {
const ToolRegistration<RasterPixelTool> kRegistration;

constexpr Kernel::FourCC kColourId = Kernel::MakeFourCC("Colr");
constexpr Kernel::FourCC kAlternateModeId = Kernel::MakeFourCC("AltM");
constexpr Kernel::FourCC kAlternateLatchId = Kernel::MakeFourCC("AltL");
constexpr Kernel::FourCC kToggleId = Kernel::MakeFourCC("TgAl");
} // namespace

void RasterPixelTool::CreateTool(Kernel::NonCounted<DocumentController> controller) {
    controller->AddTool(Kernel::MakeCounted<RasterPixelTool>(controller));
}

RasterPixelTool::RasterPixelTool(Kernel::NonCounted<DocumentController> controller)
    : RasterBrushTool(controller) {
    auto brush = Kernel::Counted<Raster::RasterBrush>(new Raster::SquareRasterBrush());
    brush->SetSize(1.0);
    brush->GetDynamic(0).SetValue(1.0);
    SetCurrentBrush(brush);
    SetDefaultBrush(brush);
    GetBrushEngine().SetRasterBrush(brush);
    GetBrushEngine().SetPixelMode(1);
}

void RasterPixelTool::Start(Kernel::Counted<Tool> previousTool) {
    RasterBrushTool::Start(std::move(previousTool));
    UpdateHintline();
}

bool RasterPixelTool::AllowColourPicker() const noexcept {
    const int state = GetBrushToolState();
    return state != PickingColour && state != Adjusting;
}

void RasterPixelTool::SetAlternateMode(AlternateMode mode) {
    m_AlternateMode = mode;
    UpdateHintline();
}

std::vector<std::pair<int, Kernel::LocalisedString>> RasterPixelTool::GetAlternateModes() {
    return {{Erase, {"Erase", "Raster pixel tool reflection"}},
            {BackgroundColour, {"Background colour", "Raster pixel tool reflection"}},
            {UndoFromSnapshot, {"Undo from snapshot", "Raster pixel tool reflection"}}};
}

Renderer::ConsolidatedColour RasterPixelTool::GetColour() const {
    const auto controller = GetSafeDocumentController();
    const auto& defaults = controller->GetDocumentDefaults();
    return controller->IsPrimaryColourContextSelected() ? defaults.GetForegroundColour()
                                                        : defaults.GetBackgroundColour();
}

void RasterPixelTool::SetColour(const Renderer::ConsolidatedColour& colour) {
    const auto controller = GetSafeDocumentController();
    controller->SetFillForContext(controller->IsPrimaryColourContextSelected() ? 2 : 1, colour);
}

void RasterPixelTool::ChangeBrushSizeByFactor(double factor) {
    const auto& brush = GetCurrentBrush();
    if (!brush) return;
    // Whole pixels, one at a time, whatever the factor.
    const double size =
        std::clamp(factor > 1.0 ? brush->GetSize() + 1.0 : brush->GetSize() - 1.0, 1.0, 4096.0);
    auto copy = brush->Copy();
    copy->SetSize(size);
    ReplaceBrush(copy);
    if (!IsBrushPanelLocked()) RefreshBrushDisplay();
}

Kernel::ReflectedList RasterPixelTool::EnumerateReflecteds() {
    auto list = RasterBrushTool::EnumerateReflecteds();
    list.push_back(Kernel::MakeCounted<Kernel::ReflectedBinding<Renderer::ConsolidatedColour>>(
        kColourId, Kernel::LocalisedString("Colour", "Reflected property"), [this] { return GetColour(); },
        [this](Renderer::ConsolidatedColour colour) { SetColour(colour); }));
    std::vector<Kernel::LocalisedString> labels;
    for (const auto& [value, label] : GetAlternateModes())
        labels.push_back(label);
    list.push_back(Kernel::MakeCounted<Kernel::ReflectedEnum>(
        kAlternateModeId, Kernel::LocalisedString("Alternate", "Raster pixel tool reflection"),
        std::move(labels), [this] { return int(m_AlternateMode); },
        [this](int mode) { SetAlternateMode(AlternateMode(mode)); }));
    list.push_back(Kernel::MakeCounted<Kernel::ReflectedBinding<bool>>(
        kAlternateLatchId, Kernel::LocalisedString("Alternate", "Raster pixel too reflection"),
        [this] { return m_AlternateLatch; }, [this](bool latch) { m_AlternateLatch = latch; }));
    return list;
}

Kernel::ReflectedList RasterPixelTool::EnumerateQuickActions() {
    auto list = RasterBrushTool::EnumerateQuickActions();
    list.push_back(Kernel::MakeCounted<Kernel::ReflectedAction>(
        kToggleId, Kernel::LocalisedString("Toggle alternate", "Pencil action"), [this] {
            m_AlternateLatch = !m_AlternateLatch;
            Notify(Kernel::MakeCounted<Kernel::InvalidateReflectedsNotification>());
        }));
    return list;
}

void RasterPixelTool::UpdateHintline() {
    static constexpr const char* kStart = "|DRAG| to start drawing. |CLICK|+|PRIMARY| to continue last "
                                          "stroke. |DRAG|+|PRIMARY| to constrain stroke. ";
    static constexpr const char* kEnd = " |DRAG|+|TERTIARY| to use colour picker.";
    const char* middle = nullptr;
    switch (m_AlternateMode) {
    case Erase:
        middle = "|DRAG|+|SECONDARY| to erase.";
        break;
    case BackgroundColour:
        middle = "|DRAG|+|SECONDARY| to use background colour.";
        break;
    case UndoFromSnapshot:
        middle = "|DRAG|+|SECONDARY| to undo to snapshot.";
        break;
    default:
        return;
    }
    ChangeHintline({std::string(kStart) + middle + kEnd, "Hintline"}, 0);
}

void RasterPixelTool::OnMouseDown(const ToolPointSpread& point, const Raster::AffineTransform::Params& view) {
    const int state = GetBrushToolState();
    if (state != PickingColour && state != Adjusting) {
        const AssistantOptions assistant(VeyraController::GetInstance());
        if (assistant.GetGlobalEnable()) {
            if (assistant.GetPaintOnNoSelectionAction() == 0) EnqueueAssistantAddRasterLayer();
            const int vector = assistant.GetPaintOnVectorSelectionAction();
            if (vector == 0) EnqueueAssistantAddRasterSubLayer();
            if (vector == 1) EnqueueAssistantRasterise();
        }
        if (GetKeyState().IsModifierDownSecondary() && m_AlternateMode == UndoFromSnapshot &&
            !GetSafeDocumentController()->GetCurrentSnapshot())
            Notify(Kernel::MakeCounted<ModelessMessageNotification>(
                Kernel::LocalisedString("No Snapshot", "Raster pixel tool"),
                Kernel::LocalisedString(
                    "You must nominate a snapshot / history entry before using this mode.",
                    "Raster pixel tool")));
    }
    RasterBrushTool::OnMouseDown(point, view);
}

bool RasterPixelTool::IsAlternateActive() const noexcept {
    return m_AlternateLatch || GetKeyState().IsModifierDownSecondary();
}

Kernel::Counted<Command> RasterPixelTool::GenerateCommand(const std::vector<Raster::BrushNozzle>& nozzles,
                                                          bool generated, bool final) {
    (void) final;
    const auto controller = GetSafeDocumentController();
    auto info = MakeStrokeInfo(generated);
    auto brush = GetCurrentBrush() ? GetCurrentBrush()->Copy() : nullptr;
    const auto paint = [&](const Renderer::ConsolidatedColour& colour) {
        auto paintInfo = info;
        paintInfo.flags[1] = 0; // the painting command takes one flag byte
        return Kernel::Counted<Command>(
            new RasterPixelBrushCommand(colour, nozzles, paintInfo, brush, controller->GetFormat()));
    };
    if (!IsAlternateActive()) return paint(GetColour());
    switch (m_AlternateMode) {
    case Erase:
        return Kernel::Counted<Command>(new RasterPixelEraseCommand(nozzles, info, brush));
    case BackgroundColour: {
        const auto& defaults = controller->GetDocumentDefaults();
        return paint(controller->IsPrimaryColourContextSelected() ? defaults.GetBackgroundColour()
                                                                  : defaults.GetForegroundColour());
    }
    case UndoFromSnapshot:
        return Kernel::Counted<Command>(
            new RasterPixelUndoCommand(nozzles, info, brush, controller->GetCurrentSnapshot()));
    default:
        return {};
    }
}

} // namespace RasterTools
