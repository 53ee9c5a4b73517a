#pragma once
// What the twirl and sphere commands share: a circle (centre and radius) that moves with the layer's
// transform, rendering through the distortion's Transform stage chained after the view's affine, and the
// area a render reads. Filter::Command gives the stage's third float (StrengthOf).

#include "filters/distort/DistortPlacement.h"
#include "filters/distort/DistortStages.h"
#include "frame/SinglePassCommand.h"

namespace RasterTools {

template <class Filter, class Map>
class DistortCommand : public SinglePassCommand<Filter> {
public:
    using Params = typename Filter::Params;
    using TransformParams = typename DistortStages::Chain<Map>::Params;
    template <Raster::PixelFormat F>
    using PlainStages = DistortStages::Plain<Map, F>;
    template <Raster::PixelFormat F>
    using MaskedStages = DistortStages::Masked<Map, F>;

    DistortCommand(bool liveEffect, const Params& params)
        : SinglePassCommand<Filter>(liveEffect, params) {}

    double GetRadius() const noexcept { return m_Params.radius; }
    // Document coordinates; not numbers when unset (see UnsetCentre).
    Kernel::PointT<double> GetCentre() const noexcept { return m_Params.centre; }

    // The layer was transformed by transform: the centre moves with it and the radius scales by its length
    // scale.
    void ApplyTransform(const Raster::AffineTransform::Params& transform) {
        Distort::TransformCircle(m_Params.centre, m_Params.radius, transform, false);
        // A scale may carry the circle past the limits that keep its arithmetic finite.
        BoundParameters(m_Params, Filter::kParameters);
    }
    // The converse, e.g. from document coordinates into a layer's own pixels; false, changing nothing, for a
    // singular transform.
    bool ApplyInverseTransform(const Raster::AffineTransform::Params& transform) {
        const bool applied = Distort::TransformCircle(m_Params.centre, m_Params.radius, transform, true);
        BoundParameters(m_Params, Filter::kParameters);
        return applied;
    }

    // Bilinear reads at the image's edge mix in transparent neighbours' weights.
    bool CanAffectAlpha() const override { return true; }
    void PrepareInputRectangle(Kernel::RectT<double>& rect) const override {
        Distort::GrowToReadArea(rect, m_Params.centre, m_Params.radius);
    }
    // Only pixels of the output area are written: the base's answer.

    // The Transform stage's block for a raster of the given bounds (output units) seen through view (source
    // pixels to output pixels): the inverse view, then [centre x, centre y, strength, radius] in source
    // pixels.
    TransformParams GetTransformParams(const Kernel::RectT<double>& bounds,
                                       const Raster::AffineTransform::Params& view) const {
        const Distort::Placement place = Distort::Place(m_Params.centre, m_Params.radius, bounds, view);
        TransformParams params;
        params.left = place.toSource;
        params.right.block[0] = place.centreX;
        params.right.block[1] = place.centreY;
        params.right.block[2] = Filter::Command::StrengthOf(m_Params);
        params.right.block[3] = place.radius;
        return params;
    }

    template <class StageParams>
    void FillStageParams(StageParams& params, const Kernel::RectT<double>& bounds,
                         const Raster::AffineTransform::Params& view) const {
        params.transform = GetTransformParams(bounds, view);
    }

    // The whole raster (cut to the selection) on the processor, with the circle carried into the layer's
    // pixels.
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override {
        if (!raster) return {};
        Params placed = m_Params;
        Distort::TransformCircle(placed.centre, placed.radius, raster->GetTransform(), true);
        const Kernel::Counted<typename Filter::Command> local(new typename Filter::Command(false, placed));
        return local->RenderDirectly(*raster);
    }

protected:
    DistortCommand() = default;
    using FilterCommand<Filter>::m_Params;
};

} // namespace RasterTools
