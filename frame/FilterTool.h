#pragma once
// Shared behaviour of filter tools: settings, live filter adoption, drag and click, preview, commit, reset.

#include "frame/Parameters.h"
#include "host/document/DocumentController.h"
#include "host/document/Notifications.h"
#include "host/document/Tool.h"

#include <cmath>

namespace RasterTools {

// Filter describes the filter: Params, kParameters, kName (settings name), kToolID, kHint,
// kDragScale (parameter units per document unit of drag) and the Command and Tool classes.
// The dragged parameter is the first of the table.
template <class Filter>
class FilterTool : public FilterLayerEffectTool {
public:
    using Params = typename Filter::Params;
    using CommandClass = typename Filter::Command;

    static void CreateTool(Kernel::NonCounted<DocumentController> controller) {
        Kernel::Counted<Tool> tool(new typename Filter::Tool(controller));
        controller->AddTool(tool);
    }

    explicit FilterTool(Kernel::NonCounted<DocumentController> controller)
        : FilterLayerEffectTool(controller)
        , m_Params(DefaultParameters(Filter::kParameters)) {}

    const Params& GetParameters() const noexcept { return m_Params; }

    void Start(Kernel::Counted<Tool> previousTool) override {
        ReadSettings(m_Params, Filter::kName, Filter::kParameters);
        if (GetEditingLiveEffect()) {
            if (const auto live = FindSelectedLiveFilter()) {
                m_Params = live->GetParameters();
                PostParametersChanged();
            }
        }
        EffectTool::Start(std::move(previousTool));
    }

    // A filter whose first parameter is within 1e-6 of zero does nothing and is never committed.
    bool AutoCommitIfRequired(bool userInitiated) override {
        if (std::abs(DraggedValue() - 0.0) <= 1e-6) return false;
        return FilterLayerEffectTool::AutoCommitIfRequired(userInitiated);
    }

    void OnNotify(Kernel::Counted<Kernel::Notification> notification) override {
        const bool editingLive = GetEditingLiveEffect();
        const bool concernsTool =
            dynamic_cast<const NewSelectionNotification*>(notification.Get()) ||
            (editingLive && dynamic_cast<const DocumentHistoryChangedNotification*>(notification.Get()));
        if (concernsTool && editingLive) {
            Notify(Kernel::Counted<Kernel::Notification>(
                new TwoUpStopNotification(GetUnsafeDocumentController())));
            if (const auto live = FindSelectedLiveFilter()) {
                m_Params = live->GetParameters();
                PostParametersChanged();
            } else {
                OnCancel();
            }
            return;
        }
        EffectTool::OnNotify(std::move(notification));
    }

    ToolID GetToolID() const override { return Filter::kToolID; }

    void UpdateHintline() override {
        ChangeHintline(Kernel::LocalisedString(std::string(Filter::kHint), "Hintline"), 0);
    }

    // 85: the host's cursor for simple filter tools.
    void UpdateCursor() override { ChangeCursor(85, 1.0f, CursorHotSpot{}, 0); }

    bool OnClicked(const ToolPointSpread&, const Raster::AffineTransform::Params&) override {
        DraggedValue() = 0.0;
        PostParametersChanged();
        Preview(false);
        return true;
    }

    void OnBeginDrag(const ToolPointSpread& point) override {
        Tool::OnBeginDrag(point);
        m_DragOrigin = point.GetSpreadPoint();
    }

    void OnDrag(const ToolPointSpread& point) override {
        Tool::OnDrag(point);
        DragTo(point);
    }

    void Commit() override {
        EffectTool::Commit();
        BoundParameters(m_Params, Filter::kParameters);
        WriteSettings(m_Params, Filter::kName, Filter::kParameters);
        EnqueueCommand(MakeCommand(), false);
    }

    // Enqueues a fresh command: shown as a transient preview when final or when working on pixels,
    // added to history (and merged there) while a live filter layer is edited.
    void Preview(bool final) override { EnqueueCommand(MakeCommand(), final || !GetEditingLiveEffect()); }

    void Reset() override {
        m_Params = DefaultParameters(Filter::kParameters);
        PostParametersChanged();
        Preview(false);
    }

    Kernel::ReflectedList EnumerateReflecteds() override {
        Kernel::ReflectedList list = FilterLayerEffectTool::EnumerateReflecteds();
        for (auto& property : ReflectParameters(Kernel::Counted<Kernel::Countable>(this), &m_Params,
                                                Filter::kParameters, Panel::Tool))
            list.push_back(std::move(property));
        return list;
    }

protected:
    // Sets the dragged parameter from the distance between the drag origin and point.
    void DragTo(const ToolPointSpread& point) {
        const Kernel::PointT<double> at = point.GetSpreadPoint();
        DraggedValue() = std::hypot(at.x - m_DragOrigin.x, at.y - m_DragOrigin.y) * Filter::kDragScale;
        PostParametersChanged();
        Preview(false);
    }

    Kernel::Counted<Command> MakeCommand() const {
        return Kernel::Counted<Command>(new CommandClass(GetEditingLiveEffect(), m_Params));
    }

    // Every change of the fields (drags, clicks, a live filter's values) ends here: the fields are brought
    // within bounds before anyone sees them.
    void PostParametersChanged() {
        BoundParameters(m_Params, Filter::kParameters);
        Notify(Kernel::Counted<Kernel::Notification>(
            new ToolParametersChangedNotification(GetUnsafeDocumentController(), GetToolID())));
    }

    // The filter of the single selected live filter layer, when it is one of this tool's commands.
    Kernel::Counted<CommandClass> FindSelectedLiveFilter() const {
        const auto controller = GetSafeDocumentController();
        if (!controller) return {};
        const auto node = controller->GetDocument()->GetSingleSelectedFilterNode();
        return node ? Kernel::CountedCast<CommandClass>(node->GetFilter()) : nullptr;
    }

    double& DraggedValue() { return m_Params.*std::get<double Params::*>(Filter::kParameters[0].field); }
    double DraggedValue() const { return m_Params.*std::get<double Params::*>(Filter::kParameters[0].field); }

    Params m_Params;
    Kernel::PointT<double> m_DragOrigin{};
};

} // namespace RasterTools
