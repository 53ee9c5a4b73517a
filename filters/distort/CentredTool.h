#pragma once
// What the twirl and sphere tools share: the circle's centre starts at the middle of the layer, and a drag
// moves it to the pointer.

#include "frame/FilterTool.h"
#include "host/document/PixelEffect.h"

namespace RasterTools {

template <class Filter>
class CentredTool : public FilterTool<Filter> {
public:
    using Params = typename Filter::Params;

    explicit CentredTool(Kernel::NonCounted<DocumentController> controller)
        : FilterTool<Filter>(controller) {}

    Kernel::PointT<double> GetCentre() const noexcept { return m_Params.centre; }
    void SetCentre(Kernel::PointT<double> centre) noexcept { m_Params.centre = centre; }

    // The table's defaults, the persisted parameters over them, the centre at the middle of the layer; then a
    // selected live filter's parameters, all of them, when one of this kind is being edited.
    void Start(Kernel::Counted<Tool> previousTool) override {
        m_Params = DefaultParameters(Filter::kParameters);
        ReadSettings(m_Params, Filter::kName, Filter::kParameters);
        PlaceAtLayerMiddle();
        if (this->GetEditingLiveEffect()) {
            if (const auto live = this->FindSelectedLiveFilter()) {
                m_Params = live->GetParameters();
                this->PostParametersChanged();
            }
        }
        EffectTool::Start(std::move(previousTool));
    }

    // The defaults, with the centre back at the middle of the layer.
    void Reset() override {
        m_Params = DefaultParameters(Filter::kParameters);
        PlaceAtLayerMiddle();
        this->PostParametersChanged();
        this->Preview(false);
    }

    // A click changes nothing: only drags place the centre.
    bool OnClicked(const ToolPointSpread&, const Raster::AffineTransform::Params&) override { return false; }

    void OnDrag(const ToolPointSpread& point) override {
        Tool::OnDrag(point);
        MoveCentre(point, false);
    }

    // The last position, and the preview is final (while a live layer is edited it goes to history instead,
    // as every step of the drag did).
    void OnEndDrag(const ToolPointSpread& point) override {
        Tool::OnEndDrag(point);
        MoveCentre(point, !this->GetEditingLiveEffect());
    }

protected:
    using FilterTool<Filter>::m_Params;

private:
    void MoveCentre(const ToolPointSpread& point, bool final) {
        m_Params.centre = point.GetSpreadPoint();
        this->PostParametersChanged();
        this->Preview(final);
    }

    // The middle of the layer a pixel change would work on (the first selected raster layer, else the top
    // one); the document's origin when there is none.
    void PlaceAtLayerMiddle() {
        m_Params.centre = {0.0, 0.0};
        const auto controller = this->GetSafeDocumentController();
        if (!controller || !controller->GetDocument()) return;
        const auto targets = GetPixelTargets(*controller->GetDocument());
        if (targets.empty()) return;
        const Kernel::RectT<int> bounds = targets.front()->GetDocumentBounds();
        m_Params.centre = {(double(bounds.left) + double(bounds.right)) / 2.0,
                           (double(bounds.top) + double(bounds.bottom)) / 2.0};
    }
};

} // namespace RasterTools
