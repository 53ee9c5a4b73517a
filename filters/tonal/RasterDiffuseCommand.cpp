#include "filters/tonal/RasterDiffuseCommand.h"

#include "frame/Registration.h"

#include <cmath>

namespace RasterTools {

const Kernel::ClassProperties RasterDiffuseCommand::ms_ClassProperties(
    Kernel::MakeFourCC("RDf2"), &RasterDiffuseCommand::CreateObject, 1,
    RasterDiffuseCommand::__GetDefaultSerialisation(),
    &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

namespace {
const FilterRegistration<DiffuseFilter> kRegistration;

} // namespace

RasterDiffuseCommand::RasterDiffuseCommand(bool liveEffect, double intensity)
    : SinglePassCommand(liveEffect, DiffuseParameters{intensity}) {}

RasterDiffuseCommand::RasterDiffuseCommand(bool liveEffect, const DiffuseParameters& params)
    : SinglePassCommand(liveEffect, params) {}

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

} // namespace RasterTools
