#pragma once
// Where a distortion's circle lies for a render or a layer: its centre and radius carried through affine
// transforms, an unset centre placed at the middle of the raster's bounds, and the area it reads.

#include "host/kernel/Geometry.h"
#include "host/raster/AffineTransform.h"

#include <optional>

namespace RasterTools::Distort {

// The inverse of an affine map; nothing when it is singular (or not finite).
std::optional<Raster::AffineTransform::Params> Invert(const Raster::AffineTransform::Params& transform);
// How the map scales lengths: the square root of the magnitude of its determinant.
double LengthScale(const Raster::AffineTransform::Params& transform);
Kernel::PointT<double> Apply(const Raster::AffineTransform::Params& transform, Kernel::PointT<double> point);

bool IsUnset(Kernel::PointT<double> centre);

// The circle moved by transform (ApplyTransform) or by its inverse (ApplyInverseTransform): the centre
// mapped, the radius scaled by the map's length scale. An unset centre stays unset. False, changing nothing,
// for an inverse of a singular map.
bool TransformCircle(Kernel::PointT<double>& centre, double& radius,
                     const Raster::AffineTransform::Params& transform, bool inverse);

// The circle of a render in source pixels, and the affine from output pixels to source pixels. bounds is the
// raster's bounds in output (document) units, where an unset centre goes to their middle; view maps source
// pixels to output pixels (a singular view is taken as the identity).
struct Placement {
    Raster::AffineTransform::Params toSource;
    float centreX = 0.0f;
    float centreY = 0.0f;
    float radius = 0.0f;
};
Placement Place(Kernel::PointT<double> centre, double radius, const Kernel::RectT<double>& bounds,
                const Raster::AffineTransform::Params& view);

// rect grown to what a distortion of the circle reads for it: the circle's bounding box where they meet,
// and one pixel around for the bilinear neighbours. The unbounded sentinel stays; an unset centre makes the
// area unbounded.
void GrowToReadArea(Kernel::RectT<double>& rect, Kernel::PointT<double> centre, double radius);

} // namespace RasterTools::Distort
