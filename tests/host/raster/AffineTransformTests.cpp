// Inverting the view and layer transforms: a regular map composed with its inverse is the identity; a
// singular one collapses onto its negated translation instead of producing infinities.

#include "host/raster/AffineTransform.h"

#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <limits>

namespace {

using Raster::AffineTransform;

AffineTransform::Params Map(double a, double b, double c, double d, double e, double f) {
    AffineTransform::Params p;
    p.m = {a, b, c, d, e, f};
    return p;
}

std::pair<double, double> Apply(const AffineTransform::Params& p, double x, double y) {
    return {p.m[0] * x + p.m[1] * y + p.m[2], p.m[3] * x + p.m[4] * y + p.m[5]};
}

TEST(AffineTransformInvert, RegularMapsRoundTrip) {
    for (const auto& map :
         {Map(2, 0, 3, 0, 0.5, -7), Map(0.866, -0.5, 12.5, 0.5, 0.866, -7.25), Map(0, 1, 4, -1, 0, 9)}) {
        EXPECT_FALSE(AffineTransform::IsSingular(map));
        const auto inverse = AffineTransform::Invert(map);
        for (const auto& [x, y] : {std::pair{0.0, 0.0}, {10.5, -3.0}, {-100.0, 250.0}}) {
            const auto [u, v] = Apply(map, x, y);
            const auto [bx, by] = Apply(inverse, u, v);
            EXPECT_NEAR(bx, x, 1e-9 * (1 + std::abs(x)));
            EXPECT_NEAR(by, y, 1e-9 * (1 + std::abs(y)));
        }
    }
}

TEST(AffineTransformInvert, TinyButRegularMapsStillInvert) {
    // A determinant of 1e-120 is above the limit: a true inverse, however large.
    const auto inverse = AffineTransform::Invert(Map(1e-60, 0, 1, 0, 1e-60, 2));
    EXPECT_DOUBLE_EQ(inverse.m[0], 1e60);
    EXPECT_DOUBLE_EQ(inverse.m[2], -1e60);
    EXPECT_DOUBLE_EQ(inverse.m[5], -2e60);
}

TEST(AffineTransformInvert, SingularMapsCollapseOntoTheNegatedTranslation) {
    const double nan = std::numeric_limits<double>::quiet_NaN();
    const double inf = std::numeric_limits<double>::infinity();
    // 1e-64 squared is 1e-128: exactly at the limit counts as singular, as do NaN and infinite determinants.
    for (const auto& map : {Map(0, 0, 3, 0, 0, -1), Map(1e-64, 0, 3, 0, 1e-64, -1), Map(1, 2, 3, 2, 4, -1),
                            Map(nan, 0, 3, 0, 1, -1), Map(inf, 0, 3, 0, 1, -1)}) {
        EXPECT_TRUE(AffineTransform::IsSingular(map));
        EXPECT_EQ(AffineTransform::Invert(map).m, (std::array<double, 6>{0, 0, -3, 0, 0, 1}));
    }
}

} // namespace
