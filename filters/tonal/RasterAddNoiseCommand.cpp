#include "filters/tonal/RasterAddNoiseCommand.h"

#include "frame/Registration.h"

#include <cmath>

namespace RasterTools {

const Kernel::ClassProperties RasterAddNoiseCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RANC"), &RasterAddNoiseCommand::CreateObject, 1,
    RasterAddNoiseCommand::__GetDefaultSerialisation(),
    &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

namespace {
const CommandRegistration<RasterAddNoiseCommand> kRegistration("RasterAddNoiseCommand");

// Uniform noise is scaled down so that its spread is comparable to the gaussian's at equal intensity.
constexpr double UniformSpread = 0.341;

// Calls f with the stages for the target's format, with or without a mask; Failed for another format.
template <class Function>
RenderPath WithStages(const RenderTarget& target, Function&& f) {
    if (!target.source) return RenderPath::Failed;
    RenderPath path = RenderPath::Failed;
    LayerFormatList::Dispatch(target.source.pixels->GetFormat(), [&](auto format) {
        constexpr Raster::PixelFormat F = decltype(format)::value;
        path = target.mask ? f(NoiseStages::Masked<F>{}) : f(NoiseStages::Plain<F>{});
        return true;
    });
    return path;
}

} // namespace

RasterAddNoiseCommand::RasterAddNoiseCommand(bool liveEffect, double intensity, bool mono, bool gaussian)
    : FilterCommand(liveEffect, AddNoiseParameters{intensity, mono, gaussian}) {}

RasterAddNoiseCommand::RasterAddNoiseCommand(bool liveEffect, const AddNoiseParameters& params)
    : FilterCommand(liveEffect, params) {}

NoiseSampler::Params
RasterAddNoiseCommand::GetSamplerParams(const Kernel::RectT<double>& bounds,
                                        const Raster::AffineTransform::Params& view) const noexcept {
    using namespace NoiseGenerator;
    const auto inverse = Raster::AffineTransform::Invert(view).m;
    NoiseSampler::Params params;
    for (int i = 0; i < 6; ++i)
        params.block[AffineIndex + i] = float(inverse[std::size_t(i)]);
    params.block[SigmaIndex] = float((m_Params.gaussian ? 1.0 : UniformSpread) * m_Params.intensity);
    params.block[WidthIndex] = TruncatedWidth(bounds.left, bounds.right);
    params.block[MonoIndex] = m_Params.mono ? 1.0f : 0.0f;
    params.block[GaussianIndex] = m_Params.gaussian ? 1.0f : 0.0f;
    return params;
}

RenderPath RasterAddNoiseCommand::Render(const RenderTarget& target) const {
    const NoiseSampler::Params sampler = GetSamplerParams(target.bounds, target.transform);
    return WithStages(target, [&](auto stages) {
        using Stages = decltype(stages);
        typename Stages::Params params;
        params.sampler = sampler;
        return RasterTools::Render<Stages>(target, params);
    });
}

bool RasterAddNoiseCommand::PrepareDevice(const RenderTarget& target) const {
    return WithStages(target, [&](auto stages) {
               return WaitForKernel<decltype(stages)>(target) ? RenderPath::Device : RenderPath::Failed;
           }) == RenderPath::Device;
}

Kernel::RectT<int> RasterAddNoiseCommand::DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const {
    if (!raster) return {};
    return RenderDirectly(*raster);
}

} // namespace RasterTools
