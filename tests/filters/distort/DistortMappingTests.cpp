// The twirl and sphere mappings worked out by hand from their defining formulas, the polynomial sine, cosine
// and arcsine against the C library, and the circle carried through layer and view transforms.

#include "DistortTestSupport.h"

#include "filters/distort/DistortMath.h"

#include <cmath>
#include <numbers>

namespace {

using namespace RasterTools;
using Raster::KernelMath::float2;

constexpr double Pi = 3.14159; // the mappings' own value

float2 Twirl(float x, float y, float cx, float cy, float angle, float radius) {
    const float p[4] = {cx, cy, angle, radius};
    return DistortMath::TwirlMap({x, y}, p);
}

float2 Sphere(float x, float y, float cx, float cy, float k, float radius) {
    const float p[4] = {cx, cy, k, radius};
    return DistortMath::SphereMap({x, y}, p);
}

// The angle by which a location at (x, y) is turned about (cx, cy), in degrees of the mappings' pi.
double TurnDegrees(float x, float y, float cx, float cy, float angle, float radius) {
    const float2 to = Twirl(x, y, cx, cy, angle, radius);
    const double before = std::atan2(double(y) - cy, double(x) - cx);
    const double after = std::atan2(double(to.y) - cy, double(to.x) - cx);
    double turn = after - before;
    while (turn > std::numbers::pi)
        turn -= 2.0 * std::numbers::pi;
    while (turn < -std::numbers::pi)
        turn += 2.0 * std::numbers::pi;
    return turn * 180.0 / Pi;
}

TEST(DistortMath, SineCosineAndArcsineFollowTheLibraryClosely) {
    double worstTrig = 0.0, worstAsin = 0.0;
    for (int i = -200000; i <= 200000; ++i) {
        const float x = float(i) * float(4.0 * std::numbers::pi / 200000.0); // four turns either way
        const float2 sc = DistortMath::DistortSinCos(x);
        worstTrig = std::max(
            {worstTrig, std::fabs(sc.x - std::sin(double(x))), std::fabs(sc.y - std::cos(double(x)))});
    }
    for (int i = 0; i <= 100000; ++i) {
        const float x = float(i) / 100000.0f;
        worstAsin = std::max(worstAsin, std::fabs(DistortMath::DistortAsin(x) - std::asin(double(x))));
    }
    EXPECT_LT(worstTrig, 4e-7);
    EXPECT_LT(worstAsin, 4e-7);
    EXPECT_EQ(DistortMath::DistortSinCos(0.0f).x, 0.0f);
    EXPECT_EQ(DistortMath::DistortSinCos(0.0f).y, 1.0f);
    EXPECT_EQ(DistortMath::DistortAsin(0.0f), 0.0f);
}

TEST(DistortMath, TwirlLocationsWorkedOutByHand) {
    // Centre (10, 10), radius 8, angle 90: (14, 10) is 4 from the centre, so d = 8 - 4 = 4, ratio = 16 / 64,
    // theta = 0.25 × -90 × pi / 180 = -22.5 degrees: the source is (10 + 4 cos theta, 10 + 4 sin theta).
    const double theta = 0.25 * -90.0 * Pi / 180.0;
    const float2 half = Twirl(14.0f, 10.0f, 10.0f, 10.0f, 90.0f, 8.0f);
    EXPECT_NEAR(half.x, 10.0 + 4.0 * std::cos(theta), 1e-5);
    EXPECT_NEAR(half.y, 10.0 + 4.0 * std::sin(theta), 1e-5);
    // (10, 12) with angle -60: d = 6, ratio = 36 / 64, theta = 0.5625 × 60 degrees; (dx, dy) = (0, 2).
    const double theta2 = 0.5625 * 60.0 * Pi / 180.0;
    const float2 other = Twirl(10.0f, 12.0f, 10.0f, 10.0f, -60.0f, 8.0f);
    EXPECT_NEAR(other.x, 10.0 - std::sin(theta2) * 2.0, 1e-5);
    EXPECT_NEAR(other.y, 10.0 + std::cos(theta2) * 2.0, 1e-5);
}

TEST(DistortMath, TwirlTurnsByTheFullAngleAtTheCentreAndAQuarterAtHalfTheRadius) {
    for (const float angle : {90.0f, -45.0f, 170.0f}) {
        // Near the centre the ratio is ((R - d) / R)^2 ≈ 1 (here 0.99998); the minus sign turns the source
        // backwards. A centre at the origin keeps the tiny offset exact in floats.
        EXPECT_NEAR(TurnDegrees(0.01f, 0.0f, 0.0f, 0.0f, angle, 1000.0f), -angle, 0.01) << angle;
        EXPECT_NEAR(TurnDegrees(100.0f, 40.0f, 50.0f, 40.0f, angle, 100.0f), -angle / 4.0, 1e-3) << angle;
        EXPECT_NEAR(TurnDegrees(50.0f, 90.0f, 50.0f, 40.0f, angle, 100.0f), -angle / 4.0, 1e-3) << angle;
    }
}

TEST(DistortMath, TwirlLeavesTheRimOutsideAngleZeroAndRadiusZeroAlone) {
    const float2 rim = Twirl(18.0f, 10.0f, 10.0f, 10.0f, 300.0f, 8.0f);
    EXPECT_EQ(rim.x, 18.0f);
    EXPECT_EQ(rim.y, 10.0f);
    const float2 outside = Twirl(-3.5f, 40.25f, 10.0f, 10.0f, 300.0f, 8.0f);
    EXPECT_EQ(outside.x, -3.5f);
    EXPECT_EQ(outside.y, 40.25f);
    const float2 still = Twirl(11.5f, 9.5f, 10.0f, 10.0f, 0.0f, 8.0f);
    EXPECT_EQ(still.x, 11.5f);
    EXPECT_EQ(still.y, 9.5f);
    const float2 none = Twirl(10.0f, 10.0f, 10.0f, 10.0f, 90.0f, 0.0f);
    EXPECT_EQ(none.x, 10.0f);
    EXPECT_EQ(none.y, 10.0f);
}

TEST(DistortMath, SphereLocationsWorkedOutByHand) {
    // Centre (0, 0), radius 10, (5, 0): d = 0.5. Bulge k = 0.5: delta = 0.5 (asin(0.5) 2 / pi - 0.5), the
    // source is 5 (1 + delta / 0.5) from the centre. Pinch k = -0.5: delta = -0.5 (0.5 - sin(0.5 pi / 2)).
    const double bulge = 0.5 * (std::asin(0.5) * 2.0 / Pi - 0.5);
    EXPECT_NEAR(Sphere(5.0f, 0.0f, 0.0f, 0.0f, 0.5f, 10.0f).x, 5.0 * (1.0 + bulge / 0.5), 1e-5);
    const double pinch = -0.5 * (0.5 - std::sin(0.5 * Pi / 2.0));
    EXPECT_NEAR(Sphere(5.0f, 0.0f, 0.0f, 0.0f, -0.5f, 10.0f).x, 5.0 * (1.0 + pinch / 0.5), 1e-5);
    // (3, 4) from (1, 2) with radius 5: d = sqrt(8) / 5; both coordinates scale alike.
    const double d = std::sqrt(8.0) / 5.0;
    const double scale = 1.0 + 0.8 * (std::asin(d) * 2.0 / Pi - d) / d;
    const float2 diagonal = Sphere(3.0f, 4.0f, 1.0f, 2.0f, 0.8f, 5.0f);
    EXPECT_NEAR(diagonal.x, 1.0 + 2.0 * scale, 1e-5);
    EXPECT_NEAR(diagonal.y, 2.0 + 2.0 * scale, 1e-5);
}

TEST(DistortMath, SphereKeepsItsRimAndTheIdleCasesInPlace) {
    // At intensity 100 the rim (d -> 1) stays: asin(1) × 2 / 3.14159 - 1 is about 8.4e-7.
    const float2 nearRim = Sphere(9.99999f, 0.0f, 0.0f, 0.0f, 1.0f, 10.0f);
    EXPECT_NEAR(nearRim.x, 10.0, 0.05);
    for (const float k : {1.0f, -1.0f, 0.3f}) {
        const float2 rim = Sphere(0.0f, 10.0f, 0.0f, 0.0f, k, 10.0f);
        EXPECT_EQ(rim.x, 0.0f);
        EXPECT_EQ(rim.y, 10.0f);
        const float2 outside = Sphere(12.0f, -7.0f, 0.0f, 0.0f, k, 10.0f);
        EXPECT_EQ(outside.x, 12.0f);
        EXPECT_EQ(outside.y, -7.0f);
        // The exact centre maps onto itself (the formula's 0 / 0 has that limit).
        const float2 centre = Sphere(3.5f, 2.5f, 3.5f, 2.5f, k, 10.0f);
        EXPECT_EQ(centre.x, 3.5f);
        EXPECT_EQ(centre.y, 2.5f);
    }
    const float2 idle = Sphere(3.0f, 1.0f, 0.0f, 0.0f, 0.0f, 10.0f);
    EXPECT_EQ(idle.x, 3.0f);
    EXPECT_EQ(idle.y, 1.0f);
    const float2 flat = Sphere(0.0f, 0.0f, 0.0f, 0.0f, 0.5f, 0.0f);
    EXPECT_EQ(flat.x, 0.0f);
    EXPECT_EQ(flat.y, 0.0f);
}

Raster::AffineTransform::Params Affine(double a, double b, double c, double d, double e, double f) {
    Raster::AffineTransform::Params p;
    p.m = {a, b, c, d, e, f};
    return p;
}

TEST(DistortPlacement, TheCircleMovesAndScalesWithTheLayer) {
    auto twirl = DistortTest::MakeTwirl(90.0, 20.0, {30.0, 40.0});
    const auto layer = Affine(2.0, 0.0, 5.0, 0.0, 2.0, -3.0); // zoom 2, then moved by (5, -3)
    twirl->ApplyTransform(layer);
    EXPECT_EQ(twirl->GetCentre(), (Kernel::PointT<double>{65.0, 77.0}));
    EXPECT_DOUBLE_EQ(twirl->GetRadius(), 40.0);
    EXPECT_TRUE(twirl->ApplyInverseTransform(layer));
    EXPECT_DOUBLE_EQ(twirl->GetCentre().x, 30.0);
    EXPECT_DOUBLE_EQ(twirl->GetCentre().y, 40.0);
    EXPECT_DOUBLE_EQ(twirl->GetRadius(), 20.0);
    EXPECT_DOUBLE_EQ(twirl->GetAngle(), 90.0);
    // A singular transform has no inverse: nothing changes.
    EXPECT_FALSE(twirl->ApplyInverseTransform(Affine(0.0, 0.0, 1.0, 0.0, 0.0, 1.0)));
    EXPECT_DOUBLE_EQ(twirl->GetRadius(), 20.0);

    auto sphere = DistortTest::MakeSphere(50.0, 10.0, UnsetCentre);
    sphere->ApplyTransform(Affine(0.0, -3.0, 0.0, 3.0, 0.0, 0.0)); // a turn by 90 degrees, zoom 3
    EXPECT_TRUE(Distort::IsUnset(sphere->GetCentre())) << "an unset centre stays unset";
    EXPECT_DOUBLE_EQ(sphere->GetRadius(), 30.0);

    // A layer scaled up without end cannot carry the circle past the limits that keep its arithmetic finite.
    const auto huge = Affine(1e12, 0.0, 0.0, 0.0, 1e12, 0.0);
    twirl->ApplyTransform(huge);
    EXPECT_LE(twirl->GetRadius(), 1e6);
    EXPECT_LE(std::abs(twirl->GetCentre().x), 1e6);
    EXPECT_TRUE(twirl->ApplyInverseTransform(Affine(1e-12, 0.0, 0.0, 0.0, 1e-12, 0.0)));
    EXPECT_LE(twirl->GetRadius(), 1e6);
}

TEST(DistortPlacement, TheStageBlockIsTheInverseViewThenTheCircleInSourcePixels) {
    const auto twirl = DistortTest::MakeTwirl(-45.0, 16.0, {48.0, 30.0});
    // The layer at (40, 25) at zoom 2: source pixels to output pixels.
    const auto view = Affine(2.0, 0.0, 40.0, 0.0, 2.0, 25.0);
    const auto params = twirl->GetTransformParams({40.0, 25.0, 100.0, 65.0}, view);
    const auto& m = params.left.m;
    EXPECT_DOUBLE_EQ(m[0], 0.5);
    EXPECT_DOUBLE_EQ(m[2], -20.0);
    EXPECT_DOUBLE_EQ(m[4], 0.5);
    EXPECT_DOUBLE_EQ(m[5], -12.5);
    EXPECT_EQ(params.right.block[0], 4.0f);
    EXPECT_EQ(params.right.block[1], 2.5f);
    EXPECT_EQ(params.right.block[2], -45.0f);
    EXPECT_EQ(params.right.block[3], 8.0f);
    // The kernel's block: the left part's count, six affine floats, then the four.
    float floats[11];
    params.Write(floats);
    EXPECT_EQ(floats[0], 6.0f);
    EXPECT_EQ(floats[7], 4.0f);
    EXPECT_EQ(floats[10], 8.0f);

    // Unset, the centre is the middle of the bounds; the sphere's third float is intensity / 100.
    const auto sphere = DistortTest::MakeSphere(-30.0, 12.0, UnsetCentre);
    const auto middle = sphere->GetTransformParams({0.0, 0.0, 37.0, 29.0}, {});
    EXPECT_EQ(middle.right.block[0], 18.5f);
    EXPECT_EQ(middle.right.block[1], 14.5f);
    EXPECT_EQ(middle.right.block[2], -0.3f);
    EXPECT_EQ(middle.right.block[3], 12.0f);
}

TEST(DistortPlacement, TheReadAreaCoversTheCircleWhereTheyMeet) {
    const auto twirl = DistortTest::MakeTwirl(90.0, 10.0, {50.0, 50.0});
    Kernel::RectT<double> inside{45.0, 45.0, 47.0, 47.0};
    twirl->PrepareInputRectangle(inside);
    EXPECT_EQ(inside, (Kernel::RectT<double>{39.0, 39.0, 61.0, 61.0}));
    Kernel::RectT<double> apart{0.0, 0.0, 10.0, 10.0};
    twirl->PrepareInputRectangle(apart);
    EXPECT_EQ(apart, (Kernel::RectT<double>{-1.0, -1.0, 11.0, 11.0}));
    auto unbounded = Kernel::RectT<double>::Unbounded();
    twirl->PrepareInputRectangle(unbounded);
    EXPECT_TRUE(unbounded.IsUnbounded());
    Kernel::RectT<double> unknown{0.0, 0.0, 10.0, 10.0};
    DistortTest::MakeSphere(50.0, 10.0, UnsetCentre)->PrepareInputRectangle(unknown);
    EXPECT_TRUE(unknown.IsUnbounded());
}

} // namespace
