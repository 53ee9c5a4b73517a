#include "filters/tonal/RasterDiffuseCommand.h"

#include "frame/Registration.h"

#include <cmath>

namespace RasterTools {

const Kernel::ClassProperties RasterDiffuseCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RDf2"), &RasterDiffuseCommand::CreateObject, 1,
    RasterDiffuseCommand::__GetDefaultSerialisation(),
    &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

namespace {
const CommandRegistration<RasterDiffuseCommand> kRegistration("RasterDiffuseCommand");

// Calls f with the stages for the target's format, with or without a mask; Failed for another format.
template <class Function>
RenderPath WithStages(const RenderTarget& target, Function&& f) {
    if (!target.source) return RenderPath::Failed;
    RenderPath path = RenderPath::Failed;
    LayerFormatList::Dispatch(target.source.pixels->GetFormat(), [&](auto format) {
        constexpr Raster::PixelFormat F = decltype(format)::value;
        path = target.mask ? f(DiffuseStages::Masked<F>{}) : f(DiffuseStages::Plain<F>{});
        return true;
    });
    return path;
}

} // namespace

RasterDiffuseCommand::RasterDiffuseCommand(bool liveEffect, double intensity)
    : FilterCommand(liveEffect, DiffuseParameters{intensity}) {}

RasterDiffuseCommand::RasterDiffuseCommand(bool liveEffect, const DiffuseParameters& params)
    : FilterCommand(liveEffect, params) {}

void RasterDiffuseCommand::PrepareInputRectangle(Kernel::RectT<double>& rect) const {
    rect = rect.Inflated(std::ceil(m_Params.intensity * 512.0));
}

bool RasterDiffuseCommand::PrepareOutputRectangle(Kernel::RectT<double>& rect) const {
    rect = rect.Inflated(m_Params.intensity * 512.0);
    return true;
}

DiffuseSampler::Params
RasterDiffuseCommand::GetSamplerParams(const Kernel::RectT<double>& bounds,
                                       const Raster::AffineTransform::Params& view) const noexcept {
    const auto inverse = Raster::AffineTransform::Invert(view).m;
    DiffuseSampler::Params params;
    for (int i = 0; i < 6; ++i)
        params.block[DiffuseSampler::AffineIndex + i] = float(inverse[std::size_t(i)]);
    // The scatter distance follows the view's scale: the length of the view's image of (1, 1), over √2.
    const auto& m = view.m;
    const double scale = std::sqrt(((m[0] + m[1]) * (m[0] + m[1]) + (m[3] + m[4]) * (m[3] + m[4])) * 0.5);
    params.block[DiffuseSampler::SigmaIndex] = float(m_Params.intensity * scale);
    params.block[DiffuseSampler::WidthIndex] = NoiseGenerator::TruncatedWidth(bounds.left, bounds.right);
    return params;
}

RenderPath RasterDiffuseCommand::Render(const RenderTarget& target) const {
    const DiffuseSampler::Params sampler = GetSamplerParams(target.bounds, target.transform);
    return WithStages(target, [&](auto stages) {
        using Stages = decltype(stages);
        typename Stages::Params params;
        params.sampler = sampler;
        return RasterTools::Render<Stages>(target, params);
    });
}

bool RasterDiffuseCommand::PrepareDevice(const RenderTarget& target) const {
    return WithStages(target, [&](auto stages) {
               return WaitForKernel<decltype(stages)>(target) ? RenderPath::Device : RenderPath::Failed;
           }) == RenderPath::Device;
}

Kernel::RectT<int> RasterDiffuseCommand::DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const {
    if (!raster) return {};
    return RenderDirectly(*raster);
}

} // namespace RasterTools
