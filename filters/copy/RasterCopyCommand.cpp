#include "filters/copy/RasterCopyCommand.h"

#include "filters/copy/CopyStages.h"
#include "frame/Registration.h"

#include <algorithm>
#include <cmath>

namespace RasterTools {

namespace {

// The four kinds of copy kernel into a layer format from the same format, for checks that compile them.
std::vector<DeviceKernelText> GetCopyKernelTexts(Raster::HardwareKernelLanguage language,
                                                 Raster::PixelFormat format) {
    std::vector<DeviceKernelText> texts;
    const auto add = [&](auto stages, std::optional<Raster::PixelFormat> mask) {
        const auto descriptor =
            DescribeKernel<decltype(stages)>(language, {format, format, mask, mask.has_value()});
        if (descriptor)
            texts.push_back({Raster::AssembleKernelSource(*descriptor, language), descriptor->entryPoint});
        else
            texts.push_back({});
    };
    add(CopyStages::Plain{}, std::nullopt);
    add(CopyStages::PlainMasked{}, Raster::PixelFormat::MaskA8);
    add(CopyStages::Scaled{}, std::nullopt);
    add(CopyStages::ScaledMasked{}, Raster::PixelFormat::MaskA8);
    return texts;
}

const FilterRegistration<CopyFilter, &GetCopyKernelTexts> kRegistration;

double ClampScale(double scale) {
    // NaN and anything out of range end up inside it.
    return std::isnan(scale) ? 1.0 : std::clamp(scale, CopyFilter::kMinimumScale, CopyFilter::kMaximumScale);
}

int ScaledSide(int side, double scale) {
    return std::max(1, int(std::lround(double(side) * scale)));
}

template <class Stages>
typename Stages::Params StageParams(Kernel::PointT<double> scale) {
    typename Stages::Params params;
    if constexpr (std::is_same_v<typename Stages::Transform, CopyStages::ScaleChain>) {
        // The transform takes output locations to source locations: the inverse scale.
        params.transform.right.x = float(1.0 / scale.x);
        params.transform.right.y = float(1.0 / scale.y);
    }
    return params;
}

// Calls f with the stages for a render of this scale, with or without a mask.
template <class Function>
decltype(auto) WithStages(bool scaled, bool masked, Function&& f) {
    if (scaled) return masked ? f(CopyStages::ScaledMasked{}) : f(CopyStages::Scaled{});
    return masked ? f(CopyStages::PlainMasked{}) : f(CopyStages::Plain{});
}

} // namespace

RasterCopyCommand::RasterCopyCommand(bool liveEffect, int format, Kernel::PointT<double> scale)
    : FilterCommand(liveEffect, CopyParameters{format, scale}) {}

RasterCopyCommand::RasterCopyCommand(bool liveEffect, const CopyParameters& params)
    : FilterCommand(liveEffect, params) {}

std::optional<Raster::PixelFormat> RasterCopyCommand::GetFormat() const noexcept {
    const auto format = static_cast<Raster::PixelFormat>(m_Params.format);
    if (m_Params.format < 0 || !Raster::IsValidPixelFormat(format) || !Raster::IsLayerFormat(format))
        return std::nullopt;
    return format;
}

Kernel::PointT<double> RasterCopyCommand::GetEffectiveScale() const noexcept {
    return {ClampScale(m_Params.scale.x), ClampScale(m_Params.scale.y)};
}

void RasterCopyCommand::PrepareInputRectangle(Kernel::RectT<double>& rect) const {
    if (rect.IsUnbounded() || !IsScaled()) return;
    const auto scale = GetEffectiveScale();
    rect = {std::floor(rect.left / scale.x) - 1.0, std::floor(rect.top / scale.y) - 1.0,
            std::ceil(rect.right / scale.x) + 1.0, std::ceil(rect.bottom / scale.y) + 1.0};
}

bool RasterCopyCommand::PrepareOutputRectangle(Kernel::RectT<double>& rect) const {
    if (rect.IsUnbounded() || !IsScaled()) return true;
    const auto scale = GetEffectiveScale();
    rect = {rect.left * scale.x, rect.top * scale.y, rect.right * scale.x, rect.bottom * scale.y};
    return true;
}

OutputShape RasterCopyCommand::GetOutputShape(int width, int height, Raster::PixelFormat format) const {
    const auto scale = GetEffectiveScale();
    return {ScaledSide(width, scale.x), ScaledSide(height, scale.y), GetFormat().value_or(format)};
}

RenderPath RasterCopyCommand::Render(const RenderTarget& target) const {
    const auto scale = GetEffectiveScale();
    return WithStages(IsScaled(), bool(target.mask), [&](auto stages) {
        using Stages = decltype(stages);
        return RasterTools::Render<Stages>(target, StageParams<Stages>(scale));
    });
}

bool RasterCopyCommand::PrepareDevice(const RenderTarget& target) const {
    return WithStages(IsScaled(), bool(target.mask),
                      [&](auto stages) { return WaitForKernel<decltype(stages)>(target); });
}

} // namespace RasterTools
