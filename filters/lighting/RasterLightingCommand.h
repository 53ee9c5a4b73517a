#pragma once
// The lighting command: lights the layer's colour with coloured spot, point and directional lights over the
// relief of its own luminance (Phong's diffuse and specular terms plus ambient light); alpha stays.

#include "filters/distort/DistortPlacement.h"
#include "filters/lighting/Lighting.h"
#include "filters/lighting/LightingParams.h"
#include "filters/lighting/LightingStages.h"
#include "frame/SinglePassCommand.h"

#include "host/raster/HardwareCache.h"

#include <algorithm>
#include <array>
#include <cmath>

namespace RasterTools {

class RasterLightingCommand final : public SinglePassCommand<LightingFilter> {
public:
    template <Raster::PixelFormat F>
    using PlainStages = LightingStages::Plain<F>;
    template <Raster::PixelFormat F>
    using MaskedStages = LightingStages::Masked<F>;

    // One white light from the table's values.
    RasterLightingCommand(bool liveEffect, const LightingParameters& params)
        : SinglePassCommand(liveEffect, params)
        , m_Lighting(FromTable(m_Params)) {}
    // Every light, the colours and the bump map.
    RasterLightingCommand(bool liveEffect, const LightingParams& params)
        : SinglePassCommand(liveEffect, ToTable(params)) {
        SetParams(params);
    }

    // The catalogue's form for the command line: the table's values and the text flags (see kTextFlags).
    static Kernel::Counted<RasterCommand>
    MakeCommandWithText(bool liveEffect, const std::vector<ParameterValue>& values,
                        const std::vector<std::pair<std::string, std::string>>& texts, std::string& error);

    // The whole state: the table's values (which panels may have changed) over the first light.
    LightingParams GetParams() const {
        LightingParams params = m_Lighting;
        Absorb(params, m_Params);
        return params;
    }

    // Lit pixels are smooth at any scale and the relief's slopes are measured in document units: a preview
    // at another pixel density shows the same picture.
    bool GetLooksTerribleWhenPreviewingBecauseOfRetina() const override { return false; }
    bool CanAffectAlpha() const override { return false; }

    // The first light's, in document coordinates; not numbers when unset (see UnsetLightCentre).
    Kernel::PointT<double> GetCentre() const noexcept { return m_Params.centre; }
    double GetDistance() const noexcept { return m_Params.distance; }

    // The layer was transformed by transform: every light's centre moves with it and its distance scales by
    // the transform's length scale (an unset centre or distance stays unset).
    void ApplyTransform(const Raster::AffineTransform::Params& transform) {
        LightingParams params = GetParams();
        params.ApplyTransform(transform);
        SetParams(params);
    }
    // The converse, e.g. from document coordinates into a layer's own pixels; false, changing nothing, for a
    // singular transform.
    bool ApplyInverseTransform(const Raster::AffineTransform::Params& transform) {
        LightingParams params = GetParams();
        if (!params.ApplyInverseTransform(transform)) return false;
        SetParams(params);
        return true;
    }

    Kernel::Counted<DocumentCommand> Clone() const override {
        return Kernel::Counted<DocumentCommand>(new RasterLightingCommand(IsLiveEffect(), GetParams()));
    }

    bool Merge(Kernel::Counted<const Command> other) override {
        if (!SinglePassCommand::Merge(other)) return false;
        SetParams(dynamic_cast<const RasterLightingCommand&>(*other).GetParams());
        return true;
    }

    // The whole LightingParams with its lights, then the base's data.
    void Save(Kernel::OutSerialiser& out) const override {
        GetParams().Save(out, true);
        RasterDevicePreviewableFilterLayerCommand::Save(out);
    }

    // Version 1 saved the table alone (one white light).
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override {
        if (version < 2) {
            if (!SinglePassCommand::Load(in, store, version)) return false;
            SetParams(FromTable(m_Params));
            return true;
        }
        LightingParams params;
        if (!params.Load(in, LightingParams::GetClassUID(), LightingParams::GetSchemaVersion(), store))
            return false;
        SetParams(params);
        return RasterDevicePreviewableFilterLayerCommand::Load(in, store, version);
    }

    // The table's view of params: the surface and the first light (the table's defaults without one), in
    // degrees, bounded; an unset distance is 0.
    static LightingParameters ToTable(const LightingParams& params) {
        LightingParameters table = DefaultParameters(LightingFilter::kParameters);
        table.ambient = params.ambient;
        table.diffuse = params.diffuse;
        table.specular = params.specular;
        table.shininess = params.exponent;
        table.depth = params.depth;
        table.bumpOpacity = params.bumpMapOpacity;
        if (params.lights.empty()) {
            BoundParameters(table, LightingFilter::kParameters);
            return table;
        }
        const LightSource& light = params.lights.front();
        table.lightType = int(light.type);
        table.spin = ToDegrees(light.spin);
        table.tilt = ToDegrees(light.tilt);
        table.centre = light.centre;
        table.distance = light.distance > 0.0 ? light.distance : 0.0;
        table.outerCone = ToDegrees(light.outerCone);
        table.innerCone = light.innerCone;
        // Bounded as the table keeps it, so that a value the table cannot show reads as unchanged.
        BoundParameters(table, LightingFilter::kParameters);
        return table;
    }

    // One white light from the table's values, the rest at their defaults.
    static LightingParams FromTable(const LightingParameters& table) {
        LightingParams params;
        Absorb(params, table, true);
        return params;
    }

    // The whole raster (cut to the selection) on the processor, with the light carried into the layer's
    // pixels.
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override {
        if (!raster) return {};
        const Kernel::Counted<RasterLightingCommand> local(new RasterLightingCommand(false, GetParams()));
        if (!local->ApplyInverseTransform(raster->GetTransform())) return {};
        return local->RenderDirectly(*raster);
    }

    // The height map's slopes read the pixels next to each one.
    static double Margin(const LightingParameters&) { return 1.0; }

    // How many document units of relief a full step of the height map (luminance 0 to 1) is, per unit of
    // depth: the bump opacity over the view's scale (a preview at half size reads neighbours two document
    // units apart).
    static double DepthScale(double bumpOpacity, const Raster::AffineTransform::Params& view) {
        const double scale = std::sqrt(std::fabs(view.m[0] * view.m[4] - view.m[1] * view.m[3]));
        return scale > 0.0 && std::isfinite(scale) ? bumpOpacity / scale : 0.0;
    }

    // The sampler block for a raster of the given bounds (document units) seen through view (raster pixels
    // to document units): see LightingMath's indices.
    LightingSampler::Params GetSamplerParams(const Kernel::RectT<double>& bounds,
                                             const Raster::AffineTransform::Params& view) const {
        using namespace LightingMath;
        const LightingParams params = GetParams();
        LightingSampler::Params sampler;
        float* p = sampler.block;
        WriteColour(p + LightingAmbientColour, params.ambientColour);
        p[LightingAmbientAmount] = float(params.ambient);
        WriteColour(p + LightingSpecularColour, params.specularColour);
        p[LightingSpecularAmount] = float(params.specular);
        p[LightingDiffuseAmount] = float(params.diffuse);
        const auto inverse = Raster::AffineTransform::Invert(view).m;
        const auto bump = BumpAffine(params, bounds);
        for (int i = 0; i < 6; ++i) {
            p[LightingSurfaceAffine + i] = float(view.m[std::size_t(i)]);
            p[LightingBumpAffine + i] =
                float(params.bumpMap ? bump[std::size_t(i)] : inverse[std::size_t(i)]);
        }
        // A bump map's steps are its own pixels whatever the view: only the opacity scales its relief.
        const double q = params.bumpMap ? params.bumpMapOpacity : DepthScale(params.bumpMapOpacity, view);
        p[LightingNormalZ] = float(2.0 / std::max(std::fabs(params.depth) * q, 0.000001));
        p[LightingHeightSense] = params.depth < 0.0 ? 1.0f : 0.0f;
        const std::size_t count = std::min(params.lights.size(), LightingParams::MaxRenderedLights);
        p[LightingLightCount] = float(count);
        const double exponent = std::round(std::clamp(params.exponent, 1.0, 128.0));
        for (std::size_t i = 0; i < count; ++i)
            WriteLight(p + LightingFirstLight + LightingLightFloats * int(i), params.lights[i], exponent,
                       bounds);
        return sampler;
    }

    // From document units to bump-map pixels: the raster's top left on the map's, each axis stretched across
    // the raster when it fits (and the bounds are finite), otherwise one map pixel per document unit.
    static std::array<double, 6> BumpAffine(const LightingParams& params,
                                            const Kernel::RectT<double>& bounds) {
        std::array<double, 6> m{1.0, 0.0, 0.0, 0.0, 1.0, 0.0};
        const bool finite = std::isfinite(bounds.left) && std::isfinite(bounds.top) &&
                            std::isfinite(bounds.Width()) && std::isfinite(bounds.Height());
        if (!params.bumpMap || !finite) return m;
        const double sx = params.scaleXToFit && bounds.Width() > 0.0
                              ? double(params.bumpMap->GetWidth()) / bounds.Width()
                              : 1.0;
        const double sy = params.scaleYToFit && bounds.Height() > 0.0
                              ? double(params.bumpMap->GetHeight()) / bounds.Height()
                              : 1.0;
        m = {sx, 0.0, -bounds.left * sx, 0.0, sy, -bounds.top * sy};
        return m;
    }

    // The base's render with the bump map, if any, as the sampler image.
    RenderPath Render(const RenderTarget& target) const override {
        if (!m_BumpImage) return SinglePassCommand::Render(target);
        RenderTarget withBump = target;
        withBump.sampler = m_BumpImage;
        return SinglePassCommand::Render(withBump);
    }

    template <class StageParams>
    void FillStageParams(StageParams& params, const Kernel::RectT<double>& bounds,
                         const Raster::AffineTransform::Params& view) const {
        params.sampler = GetSamplerParams(bounds, view);
    }

    // For loading: Load then sets the fields.
    RasterLightingCommand()
        : m_Lighting(FromTable(m_Params)) {}

private:
    // Bounded params as the whole state, and the table as its view.
    void SetParams(const LightingParams& params) {
        m_Lighting = params;
        m_Lighting.Bound();
        // The pipeline only reads a sampler image; its device mirror is made once and shared by every render.
        if (m_Lighting.bumpMap.Get() != m_BumpImage.pixels.Get()) {
            m_BumpImage = {};
            if (m_Lighting.bumpMap) {
                m_BumpImage.pixels = Kernel::Counted<Raster::DynamicBuffer>(
                    const_cast<Raster::DynamicBuffer*>(m_Lighting.bumpMap.Get()));
                m_BumpImage.cache = Raster::HardwareCache::Create(m_BumpImage.pixels);
            }
        }
        m_Params = ToTable(m_Lighting);
        BoundParameters(m_Params, LightingFilter::kParameters);
    }

    // Degrees to a billionth, so that an angle the table gave in whole degrees reads back as given.
    static double ToDegrees(double radians) noexcept {
        const double degrees = radians * (180.0 / 3.14159265358979323846);
        return std::fabs(degrees) < 1e6 ? std::round(degrees * 1e9) / 1e9 : degrees;
    }

    static bool Same(double a, double b) noexcept { return a == b || (std::isnan(a) && std::isnan(b)); }

    // Writes into params the table's values that differ from params' own view (all of them when every), so
    // that a value the table merely shows in degrees is not rounded on the way back. The light values go to
    // the first light; without a light they have nowhere to go.
    static void Absorb(LightingParams& params, const LightingParameters& table, bool every = false) {
        constexpr double Radians = 3.14159265358979323846 / 180.0;
        const LightingParameters view = ToTable(params);
        const auto take = [&](double LightingParameters::*field, double& target, double scale = 1.0) {
            if (every || !Same(table.*field, view.*field)) target = table.*field * scale;
        };
        take(&LightingParameters::ambient, params.ambient);
        take(&LightingParameters::diffuse, params.diffuse);
        take(&LightingParameters::specular, params.specular);
        take(&LightingParameters::shininess, params.exponent);
        take(&LightingParameters::depth, params.depth);
        take(&LightingParameters::bumpOpacity, params.bumpMapOpacity);
        if (params.lights.empty()) return;
        LightSource& light = params.lights.front();
        if (every || table.lightType != view.lightType) light.type = LightSource::Type(table.lightType);
        take(&LightingParameters::spin, light.spin, Radians);
        take(&LightingParameters::tilt, light.tilt, Radians);
        if (every || !Same(table.centre.x, view.centre.x) || !Same(table.centre.y, view.centre.y))
            light.centre = table.centre;
        take(&LightingParameters::distance, light.distance);
        take(&LightingParameters::outerCone, light.outerCone, Radians);
        take(&LightingParameters::innerCone, light.innerCone);
    }

    static void WriteColour(float* out, const Renderer::ConsolidatedColour& colour) {
        out[0] = colour.r;
        out[1] = colour.g;
        out[2] = colour.b;
        out[3] = colour.a;
    }

    // A light's fifteen floats: type; colour; position; direction; the spot's cone thresholds; the specular
    // exponent; the flat surface's specular term under a directional light. An unset centre is the middle of
    // the bounds, an unset distance 0.15 × their diagonal.
    static void WriteLight(float* out, const LightSource& light, double exponent,
                           const Kernel::RectT<double>& bounds) {
        using namespace LightingMath;
        Kernel::PointT<double> centre = light.centre;
        if (std::isnan(centre.x) || std::isnan(centre.y))
            centre = {(bounds.left + bounds.right) / 2.0, (bounds.top + bounds.bottom) / 2.0};
        double distance = light.distance;
        if (!(distance > 0.0)) distance = 0.15 * std::hypot(bounds.Width(), bounds.Height());
        if (!std::isfinite(centre.x) || !std::isfinite(centre.y)) centre = {0.0, 0.0};
        if (!std::isfinite(distance)) distance = 0.0;
        const double spin = light.spin, tilt = light.tilt;
        const double s = -std::sin(spin), c = std::cos(spin), k = 1.0 / std::sqrt(c * c + s * s);
        const double direction[3] = {std::cos(tilt) * c * k, std::cos(tilt) * s * k, -std::sin(tilt)};
        double position[3] = {0.0, 0.0, 0.0};
        double inner = 0.0, outer = 0.0, flat = 0.0;
        const auto type = std::int32_t(light.type);
        if (type == std::int32_t(LightSource::Type::Point)) {
            position[0] = centre.x;
            position[1] = centre.y;
            position[2] = distance;
        } else if (type == std::int32_t(LightSource::Type::Spot)) {
            outer = std::cos(light.outerCone);
            inner = std::cos(light.outerCone * light.innerCone);
            const double z = std::sin(tilt) * distance;
            // The horizontal reach z / tan(tilt), written so that it holds at a tilt of 0 too.
            const double reach = std::cos(tilt) * distance;
            position[0] = c * k * reach + centre.x;
            position[1] = s * k * reach + centre.y;
            position[2] = z;
        } else {
            flat = std::pow(std::sin(tilt), exponent);
        }
        // Kinds past the directional light are directional; negative kinds are unknown and skipped.
        out[LightingLightType] = type < 0 ? -1.0f : float(std::min(type, std::int32_t(2)));
        WriteColour(out + LightingLightColour, light.colour);
        for (int i = 0; i < 3; ++i) {
            out[LightingLightPosition + i] = float(position[i]);
            out[LightingLightDirection + i] = float(direction[i]);
        }
        out[LightingInnerThreshold] = float(inner);
        out[LightingOuterThreshold] = float(outer);
        out[LightingLightExponent] = float(exponent);
        out[LightingFlatSpecular] = float(flat);
    }

    LightingParams m_Lighting;
    PipelineImage m_BumpImage; // the bump map as a pipeline image
};

} // namespace RasterTools
