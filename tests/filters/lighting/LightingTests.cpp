// Lighting values worked out by hand from the model's formulas (ambient alone, a flat surface under a
// directional light, a tilted normal, a spot's cone and its edges, the relief at the layer's border), a spot
// and a point light agreeing where the cone does not cut, and parameters no panel would give.

#include "PipelineTestSupport.h"

#include "filters/lighting/RasterLightingCommand.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <numbers>

namespace {

using namespace RasterTools;
using namespace RasterTools::LightingMath;
using PipelineTest::Compare;
using PipelineTest::ReadComponents;
using Raster::PixelFormat;

Kernel::Counted<RasterLightingCommand> Make(const LightingParameters& params) {
    return Kernel::MakeCounted<RasterLightingCommand>(false, params);
}

const Kernel::RectT<double> Bounds{0.0, 0.0, 40.0, 30.0};
const Raster::AffineTransform::Params Identity{};

// A block with no lights, white colours and the amounts given.
LightingSampler::Params Block(float ambient, float diffuse, float specular) {
    LightingSampler::Params params;
    params.block[LightingAmbientAmount] = ambient;
    params.block[LightingDiffuseAmount] = diffuse;
    params.block[LightingSpecularAmount] = specular;
    return params;
}

// Appends a white light of the given type with its position, direction, cone thresholds and exponent.
void AddLight(LightingSampler::Params& params, float type, const float (&position)[3],
              const float (&direction)[3], float inner, float outer, float exponent) {
    float* p = params.block;
    float* light = p + LightingFirstLight + LightingLightFloats * int(p[LightingLightCount]);
    light[LightingLightType] = type;
    for (int i = 0; i < 4; ++i)
        light[LightingLightColour + i] = 1.0f;
    for (int i = 0; i < 3; ++i) {
        light[LightingLightPosition + i] = position[i];
        light[LightingLightDirection + i] = direction[i];
    }
    light[LightingInnerThreshold] = inner;
    light[LightingOuterThreshold] = outer;
    light[LightingLightExponent] = exponent;
    p[LightingLightCount] += 1.0f;
}

struct Terms {
    float4 diffuse, specular;
};
Terms Shade(const LightingSampler::Params& params, float2 v, float4 n) {
    Terms terms;
    LightingShade(v, n, params.block, &terms.diffuse, &terms.specular);
    return terms;
}

template <PixelFormat F>
Raster::StoredPixel<F> SampleAt(const Raster::DynamicBuffer& buffer, int x, int y,
                                const LightingSampler::Params& params) {
    const Raster::BitmapOf<F> image(const_cast<Raster::DynamicBuffer*>(&buffer));
    return LightingSampler::Sample<Raster::IdentityTransform, Raster::Zero>(
        image, make_int2(x, y), Raster::IdentityTransform::Prepare({}), params);
}

TEST(LightingValues, WithoutLightsThePixelIsScaledByTheAmbientColourAndAlphaStays) {
    auto params = Block(0.8f, 1.0f, 1.0f);
    const float ambient[4] = {0.5f, 0.25f, 1.0f, 1.0f};
    for (int i = 0; i < 4; ++i)
        params.block[LightingAmbientColour + i] = ambient[i];
    // Colour below 0 and above 1 in the unbounded format: the product is not clamped.
    const float4 pixel = make_float4(0.6f, -0.5f, 2.0f, 0.7f);
    const auto floats = PipelineTest::MakeFilled(PixelFormat::RGBAUF, 3, 2, &pixel);
    const float4 lit = SampleAt<PixelFormat::RGBAUF>(*floats, 1, 1, params);
    EXPECT_NEAR(lit.x, 0.6 * 0.4, 1e-6);
    EXPECT_NEAR(lit.y, -0.5 * 0.2, 1e-6);
    EXPECT_NEAR(lit.z, 2.0 * 0.8, 1e-6);
    EXPECT_EQ(lit.w, 0.7f);
    // (200, 100, 50) × (0.4, 0.2, 0.8) = (80, 20, 40), alpha 128 as it was.
    const uchar4 bytes = make_uchar4(200, 100, 50, 128);
    const auto eight = PipelineTest::MakeFilled(PixelFormat::RGBA8, 3, 2, &bytes);
    const uchar4 out = SampleAt<PixelFormat::RGBA8>(*eight, 0, 0, params);
    EXPECT_EQ(out.x, 80);
    EXPECT_EQ(out.y, 20);
    EXPECT_EQ(out.z, 40);
    EXPECT_EQ(out.w, 128);
}

TEST(LightingValues, AmbientAloneThroughTheCommandHalvesEveryColourChannelOnEveryPath) {
    LightingParameters params;
    params.ambient = 0.5;
    params.diffuse = 0.0;
    params.specular = 0.0;
    params.depth = 3.0;
    const auto command = Make(params);
    const uchar4 bytes = make_uchar4(200, 101, 0, 77);
    const auto source = PipelineTest::MakeFilled(PixelFormat::RGBA8, 9, 7, &bytes);
    const auto device = PipelineTest::OpenCLDevice();
    for (const bool onDevice : {false, true}) {
        if (onDevice && !device) continue;
        const auto out = PipelineTest::Render(*command, source, 4, onDevice ? device : nullptr);
        ASSERT_TRUE(out);
        for (int y = 0; y < 7; ++y)
            for (int x = 0; x < 9; ++x) {
                // 101 / 2 = 50.5 rounds away from zero.
                const std::vector<double> expected{100.0, 51.0, 0.0, 77.0};
                EXPECT_EQ(ReadComponents(*out, x, y), expected) << "at " << x << ", " << y;
            }
    }
}

TEST(LightingValues, AFlatSurfaceUnderADirectionalLightTakesMinusTheDirectionsZWhateverTheNormalsLength) {
    // Tilt 30 degrees: -direction.z = sin 30 = 0.5, the flat specular term 0.5^5.
    for (const double depth : {0.0, 0.25, 2.0, -7.0, 10000.0}) {
        SCOPED_TRACE(depth);
        LightingParameters params;
        params.lightType = int(LightType::Directional);
        params.tilt = 30.0;
        params.depth = depth;
        const auto block = Make(params)->GetSamplerParams(Bounds, Identity);
        ASSERT_NE(block.block[LightingNormalZ], 0.0f);
        // Equal heights: the normal has no x or y, only its z (any length before normalising).
        const float4 n = LightingNormal(0.7f, 0.7f, 0.7f, 0.7f, block.block);
        EXPECT_EQ(n.x, 0.0f);
        EXPECT_EQ(n.y, 0.0f);
        const Terms terms = Shade(block, make_float2(3.0f, 4.0f), n);
        EXPECT_NEAR(terms.diffuse.x, 0.5 * 1.0 + 0.2, 1e-6); // diffuse amount 1, white ambient 0.2
        EXPECT_NEAR(terms.specular.x, 0.03125 * 0.5, 1e-7);  // specular amount 0.5
    }
}

TEST(LightingValues, ATiltedNormalUnderADirectionalLightFollowsPhong) {
    // Depth 2 with the layer's own scale: normal z 2 / 2 = 1. Heights 0 left, 1 right: n = (1, 0, 1) /
    // sqrt 2.
    LightingParameters params;
    params.lightType = int(LightType::Directional);
    params.tilt = 30.0;
    params.spin = 180.0; // direction (-cos 30, 0, -sin 30)
    params.depth = 2.0;
    params.ambient = 0.0;
    params.specular = 1.0;
    const auto block = Make(params)->GetSamplerParams(Bounds, Identity);
    EXPECT_FLOAT_EQ(block.block[LightingNormalZ], 1.0f);
    const float4 n = LightingNormal(0.5f, 0.5f, 0.0f, 1.0f, block.block);
    EXPECT_NEAR(n.x, std::numbers::sqrt2 / 2.0, 1e-7);
    EXPECT_NEAR(n.z, std::numbers::sqrt2 / 2.0, 1e-7);
    const Terms terms = Shade(block, make_float2(0.0f, 0.0f), n);
    // dot = (cos 30 + sin 30) / sqrt 2; rz = 2 n.z dot - sin 30 = cos 30; specular cos^5 30.
    const double c30 = std::sqrt(3.0) / 2.0;
    EXPECT_NEAR(terms.diffuse.y, (c30 + 0.5) / std::numbers::sqrt2, 1e-6);
    EXPECT_NEAR(terms.specular.y, std::pow(c30, 5.0), 1e-6);
    // Turned the other way the light meets the surface's back: nothing.
    params.spin = 0.0;
    const auto away = Make(params)->GetSamplerParams(Bounds, Identity);
    const Terms dark = Shade(away, make_float2(0.0f, 0.0f), n);
    EXPECT_EQ(dark.diffuse.x, 0.0f);
    EXPECT_EQ(dark.specular.x, 0.0f);
}

TEST(LightingValues, ASpotIsFullInsideItsInnerConeRampsToItsOuterConeAndIsDarkBeyond) {
    // Straight down from (0, 0, 1); inner threshold 1 (cos 0), outer 0.5 (cos 60).
    auto block = Block(0.0f, 1.0f, 1.0f);
    AddLight(block, 0.0f, {0.0f, 0.0f, 1.0f}, {0.0f, 0.0f, -1.0f}, 1.0f, 0.5f, 1.0f);
    const float4 flat = make_float4(0.0f, 0.0f, 1.0f, 0.0f);
    // Under the light dot2 is exactly the inner threshold: the ramp, whose value there is 1.
    const Terms centre = Shade(block, make_float2(0.0f, 0.0f), flat);
    EXPECT_EQ(centre.diffuse.x, 1.0f);
    EXPECT_EQ(centre.specular.x, 1.0f);
    // One pixel aside, 45 degrees off the axis: dot = dot2 = 1 / sqrt 2, attenuation (dot2 - 0.5) / 0.5,
    // diffuse 1 - sqrt 2 / 2; rz = 2 dot - 1 / sqrt 2 = 1 / sqrt 2 gives the same specular.
    const Terms ramp = Shade(block, make_float2(1.0f, 0.0f), flat);
    EXPECT_NEAR(ramp.diffuse.x, 1.0 - std::numbers::sqrt2 / 2.0, 1e-6);
    EXPECT_NEAR(ramp.specular.x, 1.0 - std::numbers::sqrt2 / 2.0, 1e-6);
    // Three pixels aside dot2 = 1 / sqrt 10, below the outer threshold.
    const Terms beyond = Shade(block, make_float2(0.0f, 3.0f), flat);
    EXPECT_EQ(beyond.diffuse.x, 0.0f);
    EXPECT_EQ(beyond.specular.x, 0.0f);
    // A point light in the same place has no cone.
    auto point = Block(0.0f, 1.0f, 1.0f);
    AddLight(point, 1.0f, {0.0f, 0.0f, 1.0f}, {0.0f, 0.0f, -1.0f}, 1.0f, 0.5f, 1.0f);
    EXPECT_NEAR(Shade(point, make_float2(0.0f, 3.0f), flat).diffuse.x, 1.0 / std::sqrt(10.0), 1e-6);
    // Unknown types give nothing; the ambient light still does.
    auto unknown = Block(0.25f, 1.0f, 1.0f);
    AddLight(unknown, 3.0f, {0.0f, 0.0f, 1.0f}, {0.0f, 0.0f, -1.0f}, 1.0f, 0.5f, 1.0f);
    EXPECT_EQ(Shade(unknown, make_float2(0.0f, 0.0f), flat).diffuse.x, 0.25f);
    EXPECT_EQ(Shade(unknown, make_float2(0.0f, 0.0f), flat).specular.x, 0.0f);
}

TEST(LightingValues, ASpotStraightDownWithAConeThatDoesNotCutLightsAsAPointLight) {
    for (const PixelFormat format : {PixelFormat::RGBAUF, PixelFormat::RGBA8}) {
        const auto source = PipelineTest::MakeImage(format, 37, 29, 5u);
        LightingParameters spot;
        spot.tilt = 90.0; // straight down: the spot sits at the centre, distance high
        spot.outerCone = 90.0;
        spot.innerCone = 1.0;
        spot.centre = {20.0, 15.0};
        spot.distance = 40.0;
        spot.depth = 4.0;
        LightingParameters point = spot;
        point.lightType = int(LightType::Point);
        const auto lit = PipelineTest::Render(*Make(spot), source, 0);
        const auto reference = PipelineTest::Render(*Make(point), source, 0);
        ASSERT_TRUE(lit && reference);
        if (const auto difference = Compare(*lit, *reference))
            ADD_FAILURE() << Raster::GetPixelFormatName(format) << ": " << difference->Describe();
        // A narrow cone does cut.
        spot.outerCone = 10.0;
        const auto narrow = PipelineTest::Render(*Make(spot), source, 0);
        EXPECT_TRUE(Compare(*narrow, *reference).has_value());
    }
}

TEST(LightingValues, TheReliefSlopesToZeroAtTheLayersBorder) {
    // A uniform grey layer (luminance 0.5) under a directional light from spin 0, tilt 45; depth 2 gives
    // normal z 1. Inside the layer the surface is flat; at the border the missing neighbour reads 0.
    const float4 grey = make_float4(0.5f, 0.5f, 0.5f, 1.0f);
    const auto source = PipelineTest::MakeFilled(PixelFormat::RGBAUF, 9, 7, &grey);
    LightingParameters params;
    params.lightType = int(LightType::Directional);
    params.spin = 0.0;
    params.tilt = 45.0;
    params.depth = 2.0;
    params.ambient = 0.0;
    params.specular = 0.0;
    const auto out = PipelineTest::Render(*Make(params), source, 3);
    ASSERT_TRUE(out);
    const double s = std::numbers::sqrt2 / 2.0, L = 0.5, length = std::sqrt(1.0 + L * L);
    const auto red = [&](int x, int y) { return ReadComponents(*out, x, y)[0]; };
    EXPECT_NEAR(red(4, 3), 0.5 * s, 1e-6);                    // flat: sin 45
    EXPECT_NEAR(red(0, 3), 0.5 * (s - L * s) / length, 1e-6); // rising towards +x: n = (L, 0, 1)
    EXPECT_NEAR(red(8, 3), 0.5 * (s + L * s) / length, 1e-6); // falling: n = (-L, 0, 1)
    EXPECT_NEAR(red(4, 0), 0.5 * s / length, 1e-6);           // n = (0, L, 1): across the light
    EXPECT_EQ(ReadComponents(*out, 0, 3)[3], 1.0);            // alpha stays
}

TEST(LightingPlacement, TheLightMovesAndScalesWithTheLayersTransformAndBack) {
    LightingParameters params;
    params.centre = {10.0, 5.0};
    params.distance = 20.0;
    const auto command = Make(params);
    Raster::AffineTransform::Params layer;
    layer.m = {2.0, 0.0, 3.0, 0.0, 2.0, 4.0};
    command->ApplyTransform(layer);
    EXPECT_EQ(command->GetCentre(), (Kernel::PointT<double>{23.0, 14.0}));
    EXPECT_EQ(command->GetDistance(), 40.0);
    EXPECT_TRUE(command->ApplyInverseTransform(layer));
    EXPECT_EQ(command->GetCentre(), (Kernel::PointT<double>{10.0, 5.0}));
    EXPECT_EQ(command->GetDistance(), 20.0);
    // Unset stays unset; a singular map changes nothing.
    const auto unset = Make(LightingParameters{});
    unset->ApplyTransform(layer);
    EXPECT_TRUE(std::isnan(unset->GetCentre().x));
    EXPECT_EQ(unset->GetDistance(), 0.0);
    Raster::AffineTransform::Params singular;
    singular.m = {0.0, 0.0, 1.0, 0.0, 0.0, 1.0};
    EXPECT_FALSE(command->ApplyInverseTransform(singular));
    EXPECT_EQ(command->GetCentre(), (Kernel::PointT<double>{10.0, 5.0}));
}

TEST(LightingHostile, ParametersNoPanelWouldGiveAreBoundedAndRenderFinitePixels) {
    const double nan = std::numeric_limits<double>::quiet_NaN(),
                 inf = std::numeric_limits<double>::infinity();
    for (const double value : {nan, inf, -inf, 1e300, -1e300, 0.0}) {
        SCOPED_TRACE(value);
        LightingParameters params{value, value, value,           value, value, value, 7,
                                  value, value, {value, -value}, value, value, value};
        const auto command = Make(params);
        for (const auto& parameter : LightingFilter::kParameters) {
            const ParameterValue bounded = GetParameter(command->GetParameters(), parameter);
            // A centre that is not a number is the unset centre, placed by the render.
            if (const auto* point = std::get_if<Kernel::PointT<double>>(&bounded);
                point && std::isnan(point->x) && std::isnan(point->y))
                continue;
            EXPECT_TRUE(IsAcceptedValue(parameter.spec, bounded)) << parameter.spec.name;
        }
        // Unbounded, empty and singular placements give a block of numbers.
        Raster::AffineTransform::Params singular;
        singular.m = {0.0, 0.0, 5.0, 0.0, 0.0, 3.0};
        for (const auto& bounds : {Kernel::RectT<double>::Unbounded(), Kernel::RectT<double>{}, Bounds})
            for (const auto& view : {Identity, singular}) {
                const auto block = command->GetSamplerParams(bounds, view);
                for (const float f : block.block)
                    ASSERT_TRUE(std::isfinite(f));
            }
        const auto source = PipelineTest::MakeImage(PixelFormat::RGBAUF, 13, 11, 3u);
        const auto out = PipelineTest::Render(*command, source, 5);
        ASSERT_TRUE(out);
        for (int y = 0; y < 11; ++y)
            for (int x = 0; x < 13; ++x)
                for (const double c : ReadComponents(*out, x, y))
                    ASSERT_TRUE(std::isfinite(c)) << x << ", " << y;
    }
}

} // namespace
