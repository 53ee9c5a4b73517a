#include "filters/tonal/RasterUnsharpMaskCommand.h"

#include "filters/tonal/UnsharpMaskDevice.h"
#include "frame/Registration.h"
#include "pipeline/StepsRender.h"

#include <algorithm>
#include <cmath>
#include <vector>

namespace RasterTools {

namespace {
const FilterRegistration<UnsharpMaskFilter, &UnsharpMaskDevice::GetKernelTexts> kRegistration;
}

RasterUnsharpMaskCommand::RasterUnsharpMaskCommand(bool liveEffect, double radius, double factor,
                                                   double threshold)
    : FilterCommand(liveEffect, UnsharpMaskParameters{radius, factor, threshold}) {}

RasterUnsharpMaskCommand::RasterUnsharpMaskCommand(bool liveEffect, const UnsharpMaskParameters& params)
    : FilterCommand(liveEffect, params) {}

int RasterUnsharpMaskCommand::GetMargin() const noexcept {
    // Radii are bounded far below the range of int; a hostile stream's value is clamped, not trusted.
    const double margin = std::ceil(std::clamp(m_Params.radius, 0.0, 1e6) / 3.0);
    return std::isfinite(margin) ? int(margin) : 0;
}

void RasterUnsharpMaskCommand::PrepareInputRectangle(Kernel::RectT<double>& rect) const {
    rect = rect.Inflated(GetMargin());
}

bool RasterUnsharpMaskCommand::PrepareOutputRectangle(Kernel::RectT<double>& rect) const {
    rect = rect.Inflated(GetMargin());
    return true;
}

UnsharpMaskRender::Plan RasterUnsharpMaskCommand::MakePlan() const {
    UnsharpMaskRender::Plan plan;
    const int margin = GetMargin();
    const double sigma = std::clamp(m_Params.radius, 0.0, 1e6) / 6.0;
    plan.taps.assign(std::size_t(2 * margin + 1), 0.0f);
    double total = 0.0;
    std::vector<double> weights(plan.taps.size());
    for (int k = -margin; k <= margin; ++k)
        if (margin == 0)
            total += weights[0] = 1.0;
        else
            total += weights[std::size_t(k + margin)] =
                std::exp(-double(k) * double(k) / (2.0 * sigma * sigma));
    for (std::size_t k = 0; k < weights.size(); ++k)
        plan.taps[k] = float(weights[k] / total);
    plan.factor = std::isfinite(m_Params.factor) ? float(m_Params.factor) : 0.0f;
    plan.threshold = std::isfinite(m_Params.threshold) ? float(m_Params.threshold) : 0.0f;
    return plan;
}

RenderPath RasterUnsharpMaskCommand::Render(const RenderTarget& target) const {
    const UnsharpMaskRender::Plan plan = MakePlan();
    auto onDevice = [&](const Kernel::RectT<int>& rect) {
        return UnsharpMaskDevice::Run(target, rect, plan);
    };
    auto onProcessor = [&](const Kernel::RectT<int>& rect) {
        RenderPath path = RenderPath::Failed;
        LayerFormatList::Dispatch(target.destination.pixels->GetFormat(), [&](auto tag) {
            path = UnsharpMaskRender::Run<decltype(tag)::value>(target, rect, plan);
            return true;
        });
        return path;
    };
    return RenderInSteps(target, onDevice, onProcessor);
}

bool RasterUnsharpMaskCommand::PrepareDevice(const RenderTarget& target) const {
    return UnsharpMaskDevice::KernelsReady(target, true);
}

Kernel::RectT<int>
RasterUnsharpMaskCommand::DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const {
    if (!raster) return {};
    return RenderDirectly(*raster);
}

} // namespace RasterTools
