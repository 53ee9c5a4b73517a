#pragma once
// The brush engine's composition of one dab into a layer or mask: the dab's colour, zero alpha, a source's
// pixels or full mask intensity, written under the dab's coverage; pixels whose weight is full are replaced.

#include "host/kernel/Geometry.h"
#include "host/raster/DynamicBuffer.h"

#include <cstddef>
#include <cstdint>
#include <optional>

namespace Raster {

// How coverage turns into change: Opaque ignores the strength, Blended scales by it, Stamp replaces a pixel
// outright where the weight reaches half and leaves it elsewhere.
enum class DabPath : int { Opaque = 0, Blended = 1, Stamp = 2 };

enum class DabWrite : int {
    Colour,     // every channel moves towards colour
    ClearAlpha, // alpha moves towards 0, colour stays
    Copy,       // every channel moves towards source's pixel (one path: Blended by the strength)
    FullMask,   // a mask target moves towards full intensity
};

struct DabRequest {
    DabWrite write = DabWrite::Colour;
    DabPath path = DabPath::Opaque;
    double strength = 1.0;                 // 0..1; NaN counts as 0
    double dynamic = 1.0;                  // the brush dynamic's factor, 0..1
    const std::byte* colour = nullptr;     // Colour: one pixel of the target's format
    const DynamicBuffer* source = nullptr; // Copy: the target's format, the size of rect
    // A mask texture in the mask format compatible with the target, repeated over the document at scale.
    const DynamicBuffer* texture = nullptr;
    double textureScale = 1.0;
    Kernel::PointT<int> targetOrigin; // document position of the target's pixel (0, 0)
};

// The weight arithmetic, in the three precisions the paths use. 8-bit products round, 16-bit products
// truncate, and float targets take the 16-bit weight divided by 65535.
struct DabFixedPoint {
    static constexpr std::uint32_t Multiply8(std::uint32_t a, std::uint32_t b) noexcept {
        const std::uint32_t t = a * b;
        return (t + 128 + (t >> 8)) >> 8;
    }
    static constexpr std::uint32_t Multiply16(std::uint32_t a, std::uint32_t b) noexcept {
        return std::uint32_t(std::uint64_t(a) * b / 65535u);
    }
};

// What a request comes to once checked: the rect cut to the target (empty: nothing to do), where the
// coverage is read from for its top-left, the precision of the weights (8 or 16 bits), the weight the
// strength and dynamic give, and whether the dab stamps.
struct DabPlan {
    Kernel::RectT<int> rect;
    Kernel::PointT<int> coverageAt;
    int precisionBits = 8;
    std::uint32_t factor = 0;
    bool stamp = false;
};
// Nothing when the request cannot be met (see CompositeDab).
std::optional<DabPlan> PlanDab(const DynamicBuffer& target, Kernel::RectT<int> rect,
                               const DynamicBuffer& coverage, const DabRequest& request);
// The texel index along one axis of a texture of size texels for a document coordinate.
int DabTexel(int documentCoordinate, double scale, int size) noexcept;

// Composes over rect (target pixels; clipped to the target) with the coverage pixel (0, 0) at rect's
// top-left. Coverage in MaskA8, MaskA16 or MaskAF; any other coverage format, or a request missing what its
// write needs, changes nothing and gives false.
bool CompositeDab(DynamicBuffer& target, Kernel::RectT<int> rect, const DynamicBuffer& coverage,
                  const DabRequest& request);

} // namespace Raster
