#include "host/document/Tool.h"

#include "host/document/DocumentController.h"

using namespace Kernel::Literals;

Tool::Tool(Kernel::NonCounted<DocumentController> controller)
    : m_Controller(controller) {}

void Tool::Start(Kernel::Counted<Tool>) {}

bool Tool::AutoCommitIfRequired(bool) {
    return false;
}

void Tool::OnNotify(Kernel::Counted<Kernel::Notification>) {}

bool Tool::OnClicked(const ToolPointSpread&, const Raster::AffineTransform::Params&) {
    return false;
}

void Tool::OnBeginDrag(const ToolPointSpread&) {
    m_Dragging = true;
}

void Tool::OnDrag(const ToolPointSpread&) {}

void Tool::OnEndDrag(const ToolPointSpread&) {
    m_Dragging = false;
}

void Tool::EnqueueCommand(Kernel::Counted<Command> command, bool transient) {
    if (m_Controller) m_Controller->EnqueueCommand(std::move(command), transient);
}

void Tool::Notify(Kernel::Counted<Kernel::Notification> notification) {
    if (m_Controller && notification) m_Controller->Post(std::move(notification));
}

Kernel::Counted<DocumentController> Tool::GetSafeDocumentController() const {
    return Kernel::Counted<DocumentController>(m_Controller.Get());
}

void Tool::ChangeCursor(int cursor, float, const CursorHotSpot&, int) {
    if (m_Controller) m_Controller->SetCursor(cursor);
}

void Tool::ChangeHintline(const Kernel::LocalisedString& hint, int) {
    if (m_Controller) m_Controller->SetHintline(hint.Localise());
}

void EffectTool::Start(Kernel::Counted<Tool>) {
    UpdateHintline();
    UpdateCursor();
}

void EffectTool::Commit() {
    // The final command replaces whatever preview is showing.
    if (auto controller = GetUnsafeDocumentController()) controller->CancelPreview();
}

void EffectTool::OnNotify(Kernel::Counted<Kernel::Notification>) {}

void EffectTool::OnCancel() {
    if (auto controller = GetUnsafeDocumentController()) {
        controller->CancelPreview();
        controller->EndLiveEffectEdit();
    }
}

bool EffectTool::GetEditingLiveEffect() const {
    auto controller = GetUnsafeDocumentController();
    return controller && controller->IsEditingLiveEffect();
}

bool FilterLayerEffectTool::AutoCommitIfRequired(bool) {
    Commit();
    return true;
}

Kernel::ReflectedList FilterLayerEffectTool::EnumerateReflecteds() {
    // Every filter tool shows first, read-only, whether it works on a live filter layer or on pixels.
    auto controller = GetUnsafeDocumentController();
    Kernel::ReflectedList list;
    list.push_back(Kernel::Counted<Kernel::Reflected>(new Kernel::ReflectedBinding<bool>(
        "edlv"_4cc, Kernel::LocalisedString("Editing Live Filter", "Reflected property"),
        [controller] { return controller && controller->IsEditingLiveEffect(); }, nullptr,
        {Kernel::Counted<Kernel::ReflectedAttribute>(new Kernel::Reflected::VolatileAttribute)})));
    return list;
}
