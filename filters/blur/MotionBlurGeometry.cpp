#include "filters/blur/MotionBlurRender.h"

#include <algorithm>
#include <array>
#include <cmath>

namespace RasterTools::MotionBlurRender {

std::vector<RowRange> NeededRows(const Kernel::RectT<int>& rect, const Plan& plan) {
    const int width = plan.box.Width(), height = plan.box.Height();
    std::vector<RowRange> rows(std::size_t(std::max(width, 0)));
    if (rect.IsEmpty() || width <= 0 || height <= 0) return rows;
    const double c = plan.cosine, s = plan.sine, px = plan.pivotX, py = plan.pivotY;
    // Where the resample out samples the pixel centre of (x, y), in box coordinates.
    auto sampled = [&](int x, int y) {
        const double mx = double(x) + 0.5 - px, my = double(y) + 0.5 - py;
        return std::array<double, 2>{s * my + px - 0.5 + c * mx - plan.box.left,
                                     c * my + py - 0.5 - s * mx - plan.box.top};
    };
    const std::array<std::array<double, 2>, 4> corners{
        sampled(rect.left, rect.top), sampled(rect.right - 1, rect.top),
        sampled(rect.right - 1, rect.bottom - 1), sampled(rect.left, rect.bottom - 1)};
    constexpr double Slack = 1e-6;
    for (int j = 0; j < width; ++j) {
        // Column j is read by samples with j - 1 < x < j + 1; the sampler clamps x to the box, so the end
        // columns also take everything beyond.
        const double lo = j == 0 ? -HUGE_VAL : double(j) - 1.0 - Slack;
        const double hi = j == width - 1 ? HUGE_VAL : double(j) + 1.0 + Slack;
        double top = HUGE_VAL, bottom = -HUGE_VAL;
        for (int k = 0; k < 4; ++k) {
            const auto& a = corners[std::size_t(k)];
            const auto& b = corners[std::size_t((k + 1) % 4)];
            if (a[0] >= lo && a[0] <= hi) {
                top = std::min(top, a[1]);
                bottom = std::max(bottom, a[1]);
            }
            for (const double edge : {lo, hi}) {
                if ((a[0] < edge) == (b[0] < edge) || !std::isfinite(edge)) continue;
                const double y = a[1] + (b[1] - a[1]) * (edge - a[0]) / (b[0] - a[0]);
                top = std::min(top, y);
                bottom = std::max(bottom, y);
            }
        }
        if (top > bottom) continue;
        const int first = int(std::clamp(std::floor(top) - 1.0, 0.0, double(height - 1)));
        const int last = int(std::clamp(std::floor(bottom) + 3.0, double(first + 1), double(height)));
        rows[std::size_t(j)] = {first, last};
    }
    return rows;
}

} // namespace RasterTools::MotionBlurRender
