#pragma once
// The 2 × 3 affine map that takes output pixel locations to source locations.

#include <array>

namespace Raster {

class AffineTransform {
public:
    // x' = m[0]·x + m[1]·y + m[2];  y' = m[3]·x + m[4]·y + m[5]
    struct Params {
        std::array<double, 6> m{1.0, 0.0, 0.0, 0.0, 1.0, 0.0};
        friend bool operator==(const Params&, const Params&) = default;
    };
};

} // namespace Raster
