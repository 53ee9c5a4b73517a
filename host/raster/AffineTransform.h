#pragma once
// The 2 × 3 affine map that takes output pixel locations to source locations, and its transform stage.

#include "host/raster/KernelMath.h"

#include <array>
#include <cmath>

namespace Raster {

class AffineTransform {
public:
    // x' = m[0]·x + m[1]·y + m[2];  y' = m[3]·x + m[4]·y + m[5]. Default: the identity.
    struct Params {
        std::array<double, 6> m{1.0, 0.0, 0.0, 0.0, 1.0, 0.0};
        friend bool operator==(const Params&, const Params&) = default;

        // Its block of a kernel's parameter array: the six entries as floats, in order.
        static constexpr int FloatCount = 6;
        void Write(float* out) const noexcept {
            for (std::size_t i = 0; i < m.size(); ++i)
                out[i] = static_cast<float>(m[i]);
        }
    };

    // Maps whose determinant is at most this in magnitude (or not finite) have no inverse.
    static constexpr double SingularDeterminant = 1e-128;

    static bool IsSingular(const Params& params) noexcept {
        const auto& m = params.m;
        const double determinant = m[0] * m[4] - m[1] * m[3];
        return !(std::fabs(determinant) > SingularDeterminant) || !std::isfinite(determinant);
    }

    // The inverse map. A singular one collapses instead: the zero linear part with the negated translation,
    // so that every location lands on one point rather than on infinities.
    static Params Invert(const Params& params) noexcept {
        const auto& m = params.m;
        Params inverse;
        if (IsSingular(params)) {
            inverse.m = {0.0, 0.0, -m[2], 0.0, 0.0, -m[5]};
            return inverse;
        }
        const double d = m[0] * m[4] - m[1] * m[3];
        inverse.m = {m[4] / d,  -m[1] / d, (m[1] * m[5] - m[2] * m[4]) / d,
                     -m[3] / d, m[0] / d,  (m[2] * m[3] - m[0] * m[5]) / d};
        return inverse;
    }

    // The floats a kernel reads, so that the processor computes with exactly the same values.
    struct Prepared {
        float p[6];
    };
    static Prepared Prepare(const Params& params) noexcept {
        Prepared prepared;
        params.Write(prepared.p);
        return prepared;
    }

    static KernelMath::float2 Transform(KernelMath::float2 location, const Prepared& t) noexcept {
        return KernelMath::float2_literal(location.x * t.p[0] + location.y * t.p[1] + t.p[2],
                                          location.x * t.p[3] + location.y * t.p[4] + t.p[5]);
    }
};

} // namespace Raster
