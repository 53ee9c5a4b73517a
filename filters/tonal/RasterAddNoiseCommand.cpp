#include "filters/tonal/RasterAddNoiseCommand.h"

#include "frame/Registration.h"

#include <cmath>

namespace RasterTools {

const Kernel::ClassProperties RasterAddNoiseCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RANC"), &RasterAddNoiseCommand::CreateObject, 1,
    RasterAddNoiseCommand::__GetDefaultSerialisation(),
    &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

namespace {
const FilterRegistration<AddNoiseFilter> kRegistration;

// Uniform noise is scaled down so that its spread is comparable to the gaussian's at equal intensity.
constexpr double UniformSpread = 0.341;

} // namespace

RasterAddNoiseCommand::RasterAddNoiseCommand(bool liveEffect, double intensity, bool mono, bool gaussian)
    : SinglePassCommand(liveEffect, AddNoiseParameters{intensity, mono, gaussian}) {}

RasterAddNoiseCommand::RasterAddNoiseCommand(bool liveEffect, const AddNoiseParameters& params)
    : SinglePassCommand(liveEffect, params) {}

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

} // namespace RasterTools
