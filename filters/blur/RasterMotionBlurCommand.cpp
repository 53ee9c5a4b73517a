#include "filters/blur/RasterMotionBlurCommand.h"

#include "filters/blur/BlurPixels.h"
#include "filters/blur/MotionBlurDevice.h"
#include "frame/Registration.h"
#include "pipeline/StepsRender.h"

#include <algorithm>
#include <cmath>
#include <cstring>

namespace RasterTools {

namespace {
const FilterRegistration<MotionBlurFilter, &MotionBlurDevice::GetKernelTexts> kRegistration;

// A quarter turn of the motion: the direction lies along the columns of the intermediate image.
constexpr double QuarterTurn = 1.5707963267948966;
// The host's unbounded pixel rectangle.
constexpr int UnboundedEdge = -2147483647;
constexpr double EdgeTolerance = 1e-6;

struct Turn {
    double cosine, sine;
};

// cos and sin of theta, with values within 1e-12 of 0 made exact so that quarter turns move whole pixels.
Turn TurnOf(double theta) noexcept {
    if (!std::isfinite(theta)) return {1.0, 0.0};
    double c = std::cos(theta), s = std::sin(theta);
    if (std::fabs(c) < 1e-12) {
        c = 0.0;
        s = s < 0.0 ? -1.0 : 1.0;
    } else if (std::fabs(s) < 1e-12) {
        s = 0.0;
        c = c < 0.0 ? -1.0 : 1.0;
    }
    return {c, s};
}

struct Box {
    double left, top, right, bottom;
};

// The box enclosing the four corners of box after p -> R (p - pivot) + pivot (transposed: the inverse).
Box Rotate(const Box& box, Turn t, double px, double py, bool inverse) noexcept {
    const double s = inverse ? -t.sine : t.sine;
    Box out{HUGE_VAL, HUGE_VAL, -HUGE_VAL, -HUGE_VAL};
    for (const double x : {box.left, box.right})
        for (const double y : {box.top, box.bottom}) {
            const double dx = x - px, dy = y - py;
            const double rx = t.cosine * dx + s * dy + px, ry = -s * dx + t.cosine * dy + py;
            out = {std::min(out.left, rx), std::min(out.top, ry), std::max(out.right, rx),
                   std::max(out.bottom, ry)};
        }
    return out;
}

Kernel::RectT<int> Enclosing(const Box& box) noexcept {
    auto clampInt = [](double v) { return int(std::clamp(v, -1e9, 1e9)); };
    return {clampInt(std::floor(box.left + EdgeTolerance)), clampInt(std::floor(box.top + EdgeTolerance)),
            clampInt(std::ceil(box.right - EdgeTolerance)), clampInt(std::ceil(box.bottom - EdgeTolerance))};
}

bool IsUnboundedPixels(const Kernel::RectT<int>& rect) noexcept {
    return rect.left == UnboundedEdge && rect.top == UnboundedEdge && rect.right == UnboundedEdge &&
           rect.bottom == UnboundedEdge;
}

// Copies rect of source into destination through the write mask (a radius of 0 changes nothing).
template <Raster::PixelFormat F>
void CopyRect(const RenderTarget& target, const Kernel::RectT<int>& rect) {
    using L = Blur::Layout<F>;
    using T = typename L::T;
    const bool all = target.channelMask < 0 ||
                     (target.channelMask & Raster::AllChannelsMask(F)) == Raster::AllChannelsMask(F);
    for (int y = rect.top; y < rect.bottom; ++y) {
        const T* from = target.source.pixels->Row<T>(y) + std::size_t(rect.left) * L::N;
        T* to = target.destination.pixels->Row<T>(y) + std::size_t(rect.left) * L::N;
        if (from == to) continue;
        if (all) {
            std::memmove(to, from, std::size_t(rect.Width()) * L::N * sizeof(T));
            continue;
        }
        for (int i = 0; i < rect.Width() * L::N; ++i)
            if (target.channelMask & Blur::ChannelBit<F>(i % L::N)) to[i] = from[i];
    }
}

} // namespace

RasterMotionBlurCommand::RasterMotionBlurCommand(bool liveEffect, double radius, double radians)
    : FilterCommand(liveEffect, MotionBlurParameters{radius, radians}) {}

RasterMotionBlurCommand::RasterMotionBlurCommand(bool liveEffect, const MotionBlurParameters& params)
    : FilterCommand(liveEffect, params) {}

double RasterMotionBlurCommand::GetViewScale(const Raster::AffineTransform::Params& view) noexcept {
    const auto& m = view.m;
    const double x = m[0] + m[1], y = m[3] + m[4];
    return std::sqrt((x * x + y * y) * 0.5);
}

Kernel::RectT<int>
RasterMotionBlurCommand::CompensateIntermediate(const Kernel::RectT<int>& rect,
                                                const Raster::AffineTransform::Params& view, double radius,
                                                double theta) {
    if (IsUnboundedPixels(rect)) return rect;
    const double cx = rect.left + (rect.right - rect.left) / 2, cy = rect.top + (rect.bottom - rect.top) / 2;
    const Turn turn{std::cos(theta), std::sin(theta)};
    Kernel::RectT<int> out = Enclosing(Rotate(
        {double(rect.left), double(rect.top), double(rect.right), double(rect.bottom)}, turn, cx, cy, false));
    const double scale = GetViewScale(view);
    const double pad = scale > 0.0 ? std::trunc(radius / scale) : 0.0;
    const int rows = std::isfinite(pad) ? int(std::clamp(pad, 0.0, 1e9)) : 0;
    out.top -= rows;
    out.bottom += rows;
    return out;
}

MotionBlurRender::Plan
RasterMotionBlurCommand::MakePlan(const Kernel::RectT<int>& rect, int width, int height,
                                  const Raster::AffineTransform::Params& view) const noexcept {
    MotionBlurRender::Plan plan;
    double r = m_Params.radius * GetViewScale(view);
    if (!std::isfinite(r) || r < 0.0) r = 0.0;
    r = std::min(r, double(MaxWholeRadius));
    const double whole = std::trunc(r);
    plan.whole = int(whole);
    // Small fractional radii weigh the row beyond the whole ones; larger radii are cut to whole rows.
    plan.fraction = (r <= 16.0 && r != whole) ? float(r - whole) : 0.0f;
    const Turn turn = TurnOf(m_Params.radians + QuarterTurn);
    plan.cosine = turn.cosine;
    plan.sine = turn.sine;
    // One pivot for the whole image, so that every tile samples the same intermediate grid.
    plan.pivotX = double(width / 2);
    plan.pivotY = double(height / 2);
    plan.box = MotionBlurRender::RotatedBounds(rect, plan.cosine, plan.sine, plan.pivotX, plan.pivotY)
                   .Inflated(1); // the resample out reads one pixel around each position
    return plan;
}

void RasterMotionBlurCommand::PrepareInputRectangle(Kernel::RectT<double>& rect) const {
    if (rect.IsUnbounded() || rect.IsEmpty()) return;
    const double radius =
        std::isfinite(m_Params.radius) ? std::clamp(m_Params.radius, 0.0, double(MaxWholeRadius)) : 0.0;
    const Turn turn = TurnOf(m_Params.radians + QuarterTurn);
    const double px = std::floor((rect.left + rect.right) / 2), py = std::floor((rect.top + rect.bottom) / 2);
    // Forward: the rotated output, one pixel for the resample out and the blur's rows above and below.
    Box box = Rotate({rect.left, rect.top, rect.right, rect.bottom}, turn, px, py, false);
    const double rows = std::trunc(radius) + 1.0;
    box = {std::floor(box.left) - 1.0, std::floor(box.top) - 1.0 - rows, std::ceil(box.right) + 1.0,
           std::ceil(box.bottom) + 1.0 + rows};
    // Back: what those rows sample, one pixel for the resample in and one for the pivot's rounding.
    box = Rotate(box, turn, px, py, true);
    rect = {std::floor(box.left) - 2.0, std::floor(box.top) - 2.0, std::ceil(box.right) + 2.0,
            std::ceil(box.bottom) + 2.0};
}

bool RasterMotionBlurCommand::PrepareOutputRectangle(Kernel::RectT<double>& rect) const {
    const double radius =
        std::isfinite(m_Params.radius) ? std::clamp(m_Params.radius, 0.0, double(MaxWholeRadius)) : 0.0;
    rect = rect.Inflated(std::ceil(radius) + 1.0);
    return true;
}

RenderPath RasterMotionBlurCommand::Render(const RenderTarget& target) const {
    auto planFor = [&](const Kernel::RectT<int>& rect) {
        const Raster::DynamicBuffer& destination = *target.destination.pixels;
        return MakePlan(rect, destination.GetWidth(), destination.GetHeight(), target.transform);
    };
    auto onDevice = [&](const Kernel::RectT<int>& rect) {
        return MotionBlurDevice::Run(target, rect, planFor(rect));
    };
    auto onProcessor = [&](const Kernel::RectT<int>& rect) {
        const MotionBlurRender::Plan plan = planFor(rect);
        RenderPath path = RenderPath::Failed;
        LayerFormatList::Dispatch(target.destination.pixels->GetFormat(), [&](auto tag) {
            constexpr Raster::PixelFormat F = decltype(tag)::value;
            if (plan.whole == 0 && plan.fraction == 0.0f) { // a box of one row: the source itself
                CopyRect<F>(target, rect);
                path = RenderPath::Processor;
            } else {
                path = MotionBlurRender::Run<F>(target, rect, plan);
            }
            return true;
        });
        return path;
    };
    return RenderInSteps(target, onDevice, onProcessor);
}

bool RasterMotionBlurCommand::PrepareDevice(const RenderTarget& target) const {
    return MotionBlurDevice::KernelsReady(target, true);
}

Kernel::RectT<int>
RasterMotionBlurCommand::DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const {
    if (!raster) return {};
    return RenderDirectly(*raster);
}

Kernel::RectT<int> MotionBlurRender::RotatedBounds(const Kernel::RectT<int>& rect, double cosine, double sine,
                                                   double pivotX, double pivotY) noexcept {
    return Enclosing(Rotate({double(rect.left), double(rect.top), double(rect.right), double(rect.bottom)},
                            {cosine, sine}, pivotX, pivotY, false));
}

} // namespace RasterTools
