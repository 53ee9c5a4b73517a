#pragma once
// The lighting command: lights the layer's colour with a spot, point or directional light over the relief of
// its own luminance (Phong's diffuse and specular terms plus ambient light); alpha stays.

#include "filters/distort/DistortPlacement.h"
#include "filters/lighting/Lighting.h"
#include "filters/lighting/LightingStages.h"
#include "frame/SinglePassCommand.h"

#include <algorithm>
#include <cmath>

namespace RasterTools {

class RasterLightingCommand final : public SinglePassCommand<LightingFilter> {
public:
    template <Raster::PixelFormat F>
    using PlainStages = LightingStages::Plain<F>;
    template <Raster::PixelFormat F>
    using MaskedStages = LightingStages::Masked<F>;

    RasterLightingCommand(bool liveEffect, const LightingParameters& params)
        : SinglePassCommand(liveEffect, params) {}

    // Lit pixels are smooth at any scale and the relief's slopes are measured in document units: a preview
    // at another pixel density shows the same picture.
    bool GetLooksTerribleWhenPreviewingBecauseOfRetina() const override { return false; }
    bool CanAffectAlpha() const override { return false; }

    // Document coordinates; not numbers when unset (see UnsetLightCentre).
    Kernel::PointT<double> GetCentre() const noexcept { return m_Params.centre; }
    double GetDistance() const noexcept { return m_Params.distance; }

    // The layer was transformed by transform: the light's centre moves with it and its distance scales by
    // the transform's length scale (an unset centre or distance stays unset).
    void ApplyTransform(const Raster::AffineTransform::Params& transform) {
        Distort::TransformCircle(m_Params.centre, m_Params.distance, transform, false);
        BoundParameters(m_Params, LightingFilter::kParameters);
    }
    // The converse, e.g. from document coordinates into a layer's own pixels; false, changing nothing, for a
    // singular transform.
    bool ApplyInverseTransform(const Raster::AffineTransform::Params& transform) {
        const bool applied = Distort::TransformCircle(m_Params.centre, m_Params.distance, transform, true);
        BoundParameters(m_Params, LightingFilter::kParameters);
        return applied;
    }

    // The whole raster (cut to the selection) on the processor, with the light carried into the layer's
    // pixels.
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override {
        if (!raster) return {};
        const Kernel::Counted<RasterLightingCommand> local(new RasterLightingCommand(false, m_Params));
        if (!local->ApplyInverseTransform(raster->GetTransform())) return {};
        return local->RenderDirectly(*raster);
    }

    // The height map's slopes read the pixels next to each one.
    static double Margin(const LightingParameters&) { return 1.0; }

    // How many document units of relief a full step of the height map (luminance 0 to 1) is, per unit of
    // depth: the bump opacity over the view's scale (a preview at half size reads neighbours two document
    // units apart).
    static double DepthScale(const LightingParameters& params, const Raster::AffineTransform::Params& view) {
        const double scale = std::sqrt(std::fabs(view.m[0] * view.m[4] - view.m[1] * view.m[3]));
        return scale > 0.0 && std::isfinite(scale) ? params.bumpOpacity / scale : 0.0;
    }

    // The sampler block for a raster of the given bounds (document units) seen through view (raster pixels
    // to document units): see LightingMath's indices.
    LightingSampler::Params GetSamplerParams(const Kernel::RectT<double>& bounds,
                                             const Raster::AffineTransform::Params& view) const {
        using namespace LightingMath;
        const LightingParameters& params = m_Params;
        LightingSampler::Params sampler;
        float* p = sampler.block;
        p[LightingAmbientAmount] = float(params.ambient);
        p[LightingSpecularAmount] = float(params.specular);
        p[LightingDiffuseAmount] = float(params.diffuse);
        const auto inverse = Raster::AffineTransform::Invert(view).m;
        for (int i = 0; i < 6; ++i) {
            p[LightingSurfaceAffine + i] = float(view.m[std::size_t(i)]);
            p[LightingBumpAffine + i] = float(inverse[std::size_t(i)]);
        }
        const double q = DepthScale(params, view);
        p[LightingNormalZ] = float(2.0 / std::max(std::fabs(params.depth) * q, 0.000001));
        p[LightingHeightSense] = params.depth < 0.0 ? 1.0f : 0.0f;
        p[LightingLightCount] = 1.0f;
        WriteLight(p + LightingFirstLight, bounds);
        return sampler;
    }

    template <class StageParams>
    void FillStageParams(StageParams& params, const Kernel::RectT<double>& bounds,
                         const Raster::AffineTransform::Params& view) const {
        params.sampler = GetSamplerParams(bounds, view);
    }

    // For loading: Load then sets the fields.
    RasterLightingCommand() = default;

private:
    // The light's fifteen floats: type; colour; position; direction; the spot's cone thresholds; the
    // specular exponent; the flat surface's specular term under a directional light.
    void WriteLight(float* light, const Kernel::RectT<double>& bounds) const {
        using namespace LightingMath;
        const LightingParameters& params = m_Params;
        constexpr double Radians = 3.14159265358979323846 / 180.0;
        Kernel::PointT<double> centre = params.centre;
        if (std::isnan(centre.x) || std::isnan(centre.y))
            centre = {(bounds.left + bounds.right) / 2.0, (bounds.top + bounds.bottom) / 2.0};
        double distance = params.distance;
        if (!(distance > 0.0)) distance = 0.15 * std::hypot(bounds.Width(), bounds.Height());
        if (!std::isfinite(centre.x) || !std::isfinite(centre.y)) centre = {0.0, 0.0};
        if (!std::isfinite(distance)) distance = 0.0;
        const double spin = params.spin * Radians, tilt = params.tilt * Radians;
        const double s = -std::sin(spin), c = std::cos(spin), k = 1.0 / std::sqrt(c * c + s * s);
        const double exponent = std::round(std::clamp(params.shininess, 1.0, 128.0));
        const double direction[3] = {std::cos(tilt) * c * k, std::cos(tilt) * s * k, -std::sin(tilt)};
        double position[3] = {0.0, 0.0, 0.0};
        double inner = 0.0, outer = 0.0, flat = 0.0;
        switch (LightType(params.lightType)) {
        case LightType::Point:
            position[0] = centre.x;
            position[1] = centre.y;
            position[2] = distance;
            break;
        case LightType::Spot: {
            outer = std::cos(params.outerCone * Radians);
            inner = std::cos(params.outerCone * Radians * params.innerCone);
            const double z = std::sin(tilt) * distance;
            // The horizontal reach z / tan(tilt), written so that it holds at a tilt of 0 too.
            const double reach = std::cos(tilt) * distance;
            position[0] = c * k * reach + centre.x;
            position[1] = s * k * reach + centre.y;
            position[2] = z;
            break;
        }
        default:
            flat = std::pow(std::sin(tilt), exponent);
            break;
        }
        light[LightingLightType] = float(params.lightType);
        for (int i = 0; i < 4; ++i)
            light[LightingLightColour + i] = 1.0f;
        for (int i = 0; i < 3; ++i) {
            light[LightingLightPosition + i] = float(position[i]);
            light[LightingLightDirection + i] = float(direction[i]);
        }
        light[LightingInnerThreshold] = float(inner);
        light[LightingOuterThreshold] = float(outer);
        light[LightingLightExponent] = float(exponent);
        light[LightingFlatSpecular] = float(flat);
    }
};

} // namespace RasterTools
