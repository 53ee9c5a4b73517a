#include "filters/distort/DistortPlacement.h"

#include <algorithm>
#include <cmath>

namespace RasterTools::Distort {

namespace {
// Maps whose determinant is this small in magnitude are singular.
constexpr double SingularDeterminant = 1e-128;

double Determinant(const Raster::AffineTransform::Params& t) {
    return t.m[0] * t.m[4] - t.m[1] * t.m[3];
}
} // namespace

std::optional<Raster::AffineTransform::Params> Invert(const Raster::AffineTransform::Params& transform) {
    const auto& m = transform.m;
    const double determinant = Determinant(transform);
    if (!(std::fabs(determinant) > SingularDeterminant) || !std::isfinite(determinant)) return std::nullopt;
    Raster::AffineTransform::Params inverse;
    inverse.m = {m[4] / determinant,  -m[1] / determinant, (m[1] * m[5] - m[2] * m[4]) / determinant,
                 -m[3] / determinant, m[0] / determinant,  (m[2] * m[3] - m[0] * m[5]) / determinant};
    return inverse;
}

double LengthScale(const Raster::AffineTransform::Params& transform) {
    return std::sqrt(std::fabs(Determinant(transform)));
}

Kernel::PointT<double> Apply(const Raster::AffineTransform::Params& t, Kernel::PointT<double> p) {
    return {p.x * t.m[0] + p.y * t.m[1] + t.m[2], p.x * t.m[3] + p.y * t.m[4] + t.m[5]};
}

bool IsUnset(Kernel::PointT<double> centre) {
    return std::isnan(centre.x) || std::isnan(centre.y);
}

bool TransformCircle(Kernel::PointT<double>& centre, double& radius,
                     const Raster::AffineTransform::Params& transform, bool inverse) {
    std::optional<Raster::AffineTransform::Params> map = transform;
    if (inverse) map = Invert(transform);
    if (!map) return false;
    if (!IsUnset(centre)) centre = Apply(*map, centre);
    radius *= LengthScale(*map);
    return true;
}

Placement Place(Kernel::PointT<double> centre, double radius, const Kernel::RectT<double>& bounds,
                const Raster::AffineTransform::Params& view) {
    if (IsUnset(centre)) centre = {(bounds.left + bounds.right) / 2.0, (bounds.top + bounds.bottom) / 2.0};
    Placement placement;
    placement.toSource = Invert(view).value_or(Raster::AffineTransform::Params{});
    const Kernel::PointT<double> at = Apply(placement.toSource, centre);
    placement.centreX = float(at.x);
    placement.centreY = float(at.y);
    placement.radius = float(radius * LengthScale(placement.toSource));
    return placement;
}

void GrowToReadArea(Kernel::RectT<double>& rect, Kernel::PointT<double> centre, double radius) {
    if (rect.IsUnbounded()) return;
    if (IsUnset(centre)) {
        rect = Kernel::RectT<double>::Unbounded();
        return;
    }
    const double r = std::fabs(radius);
    const Kernel::RectT<double> circle{centre.x - r, centre.y - r, centre.x + r, centre.y + r};
    if (!rect.Intersect(circle).IsEmpty())
        rect = {std::min(rect.left, circle.left), std::min(rect.top, circle.top),
                std::max(rect.right, circle.right), std::max(rect.bottom, circle.bottom)};
    rect = rect.Inflated(1.0);
}

} // namespace RasterTools::Distort
