// Pixel selections and the area a direct change may touch.
#include "host/document/RasterInterface.h"

#include <algorithm>
#include <cmath>

namespace {

Kernel::RectT<double> SpreadOf(const Raster::DynamicBuffer* mask) {
    if (!mask) return {};
    int left = mask->GetWidth(), right = 0, top = mask->GetHeight(), bottom = 0;
    for (int y = 0; y < mask->GetHeight(); ++y) {
        const auto* row = mask->Row<std::uint8_t>(y);
        int first = -1, last = -1;
        for (int x = 0; x < mask->GetWidth(); ++x)
            if (row[x]) {
                if (first < 0) first = x;
                last = x;
            }
        if (first < 0) continue;
        left = std::min(left, first);
        right = std::max(right, last + 1);
        top = std::min(top, y);
        bottom = y + 1;
    }
    if (right <= left) return {};
    return {double(left), double(top), double(right), double(bottom)};
}

} // namespace

SelectionRasterNode::SelectionRasterNode(Kernel::Counted<Raster::DynamicBuffer> mask)
    : m_Mask(std::move(mask))
    , m_Spread(SpreadOf(m_Mask.Get())) {}

Kernel::RectT<int> GetEffectArea(const MutableRasterInterface& raster) {
    const Kernel::RectT<int> box = raster.GetRasterBoundingBox();
    const SelectionRasterNode* selection = raster.GetSelection();
    if (!selection || selection->IsSelectNone()) return box;

    // Document pixels back to layer pixels through the inverse of the layer's transform.
    if (Raster::AffineTransform::IsSingular(raster.GetTransform())) return {};
    const auto inverse = Raster::AffineTransform::Invert(raster.GetTransform()).m;
    const double i0 = inverse[0], i1 = inverse[1], i2 = inverse[2];
    const double i3 = inverse[3], i4 = inverse[4], i5 = inverse[5];
    const Kernel::RectT<double> spread = selection->GetSelectedSpreadBox();
    double left = 1e300, top = 1e300, right = -1e300, bottom = -1e300;
    for (const double x : {spread.left, spread.right})
        for (const double y : {spread.top, spread.bottom}) {
            const double u = i0 * x + i1 * y + i2, v = i3 * x + i4 * y + i5;
            left = std::min(left, u);
            right = std::max(right, u);
            top = std::min(top, v);
            bottom = std::max(bottom, v);
        }
    constexpr double tolerance = 1e-6;
    const Kernel::RectT<int> area{int(std::floor(left + tolerance)), int(std::floor(top + tolerance)),
                                  int(std::ceil(right - tolerance)), int(std::ceil(bottom - tolerance))};
    const Kernel::RectT<int> clipped = area.Intersect(box);
    return clipped.IsEmpty() ? Kernel::RectT<int>{} : clipped;
}
