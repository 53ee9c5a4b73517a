// The processor's fast paths against the plain code they stand in for, bit for bit: the four-lane RGBA8
// bilinear sampler against the one-location sampler (translucent, transparent and opaque neighbours, pixel
// centres, negative whole numbers, locations far outside and locations the integer arithmetic cannot take),
// and the span mappings built for AVX2 against the inline mapping.

#include "filters/distort/DistortStages.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <random>
#include <vector>

namespace {

using namespace RasterTools;
using Raster::KernelMath::make_float2;
using Raster::KernelMath::uchar4;
using Image = Raster::BitmapOf<Raster::PixelFormat::RGBA8>;

Kernel::Counted<Raster::DynamicBuffer> Pixels(int width, int height, std::uint32_t seed) {
    auto buffer = Raster::DynamicBuffer::Create(width, height, Raster::PixelFormat::RGBA8);
    std::mt19937 random(seed);
    for (int y = 0; y < height; ++y) {
        auto* row = buffer->Row<uchar4>(y);
        for (int x = 0; x < width; ++x) {
            // Alphas mostly opaque or transparent, as photographs and cut-outs are; the rest anything.
            const std::uint32_t kind = random() % 4;
            const auto alpha = std::uint8_t(kind == 0 ? 255 : kind == 1 ? 0 : random() % 256);
            row[x] = {std::uint8_t(random()), std::uint8_t(random()), std::uint8_t(random()), alpha};
        }
    }
    return buffer;
}

std::vector<float> Locations(std::uint32_t seed, int count) {
    std::mt19937 random(seed);
    std::uniform_real_distribution<float> inside(-3.0f, 40.0f);
    const float special[] = {0.0f,
                             -0.0f,
                             -1.0f,
                             -2.0f,
                             -0.5f,
                             31.0f,
                             31.5f,
                             35.999998f,
                             1e-7f,
                             -1e-7f,
                             1e9f,
                             -1e9f,
                             3e9f,
                             -3e9f,
                             std::numeric_limits<float>::infinity(),
                             std::numeric_limits<float>::quiet_NaN(),
                             1073741824.0f,
                             -1073741824.0f};
    std::vector<float> values;
    for (int i = 0; i < count; ++i) {
        const std::uint32_t kind = random() % 8;
        if (kind == 0)
            values.push_back(special[random() % std::size(special)]);
        else if (kind == 1)
            values.push_back(float(int(random() % 45) - 4)); // pixel centres, less half a pixel
        else
            values.push_back(inside(random));
    }
    return values;
}

TEST(BilinearRGBA8, FourLanesGiveEveryByteOfTheScalarSampler) {
    for (const auto& [width, height] : {std::pair{37, 29}, std::pair{1, 1}, std::pair{2, 5}}) {
        const auto buffer = Pixels(width, height, std::uint32_t(width * 131 + height));
        const Image image(buffer.Get());
        const int count = 40000;
        const std::vector<float> xs = Locations(7, count), ys = Locations(11, count);
        int sampled = 0;
        for (int i = 0; i + 4 <= count; i += 4) {
            uchar4 lanes[4];
            if (!BilinearRGBA8::SampleSafe4(image, &xs[std::size_t(i)], &ys[std::size_t(i)], lanes)) continue;
            ++sampled;
            for (int k = 0; k < 4; ++k) {
                const float x = xs[std::size_t(i + k)], y = ys[std::size_t(i + k)];
                const uchar4 expected = SpanBilinearSampler::At<Raster::Safe>(image, make_float2(x, y));
                ASSERT_EQ(lanes[k], expected)
                    << width << " x " << height << " at (" << x << ", " << y << "): got " << int(lanes[k].x)
                    << " " << int(lanes[k].y) << " " << int(lanes[k].z) << " " << int(lanes[k].w)
                    << ", expected " << int(expected.x) << " " << int(expected.y) << " " << int(expected.z)
                    << " " << int(expected.w);
            }
        }
        // The hostile values refuse a fifth or so of the groups; the rest must really have been compared.
        EXPECT_GT(sampled, count / 8);
    }
}

TEST(BilinearRGBA8, LocationsBeyondIntegerRangeAreLeftToTheScalarSampler) {
    const auto buffer = Pixels(4, 4, 3);
    const Image image(buffer.Get());
    uchar4 out[4] = {};
    const float ys[4] = {1.0f, 1.0f, 1.0f, 1.0f};
    for (const float far :
         {std::numeric_limits<float>::quiet_NaN(), 3e9f, -std::numeric_limits<float>::infinity()}) {
        const float xs[4] = {0.5f, far, 1.5f, 2.0f};
        EXPECT_FALSE(BilinearRGBA8::SampleSafe4(image, xs, ys, out)) << far;
    }
    const float xs[4] = {0.5f, 1.25f, 1.5f, 2.0f};
    EXPECT_TRUE(BilinearRGBA8::SampleSafe4(image, xs, ys, out));
}

template <class Map>
void ExpectClonedMappingEqualsInline(const char* name, float third) {
    using ChainT = DistortStages::Chain<Map>;
    std::mt19937 random(17);
    std::uniform_real_distribution<float> unit(-1.0f, 1.0f);
    for (int round = 0; round < 500; ++round) {
        typename ChainT::Params params;
        // Views that zoom, turn and shift; centres, angles or intensities and radii of every sign and size.
        const double turn = double(unit(random)) * 3.2, zoom = std::exp(double(unit(random)) * 2.0);
        params.left.m = {zoom * std::cos(turn), -zoom * std::sin(turn), double(unit(random)) * 300.0,
                         zoom * std::sin(turn), zoom * std::cos(turn),  double(unit(random)) * 300.0};
        params.right.block[0] = unit(random) * 200.0f;
        params.right.block[1] = unit(random) * 200.0f;
        params.right.block[2] = unit(random) * third;
        params.right.block[3] = round % 50 == 0 ? 0.0f : std::fabs(unit(random)) * 400.0f;
        const auto prepared = ChainT::Prepare(params);
        const int x0 = int(random() % 512) - 256, y = int(random() % 512) - 256;
        alignas(64) float xs[Raster::SpanLength], ys[Raster::SpanLength];
        alignas(64) float inlineXs[Raster::SpanLength], inlineYs[Raster::SpanLength];
        DistortStages::MapSpan(prepared, x0, y, xs, ys);
        DistortStages::MapSpanInline<ChainT>(prepared, x0, y, inlineXs, inlineYs);
        ASSERT_EQ(std::memcmp(xs, inlineXs, sizeof xs), 0) << name << ", round " << round;
        ASSERT_EQ(std::memcmp(ys, inlineYs, sizeof ys), 0) << name << ", round " << round;
    }
}

TEST(DistortSpans, BuiltMappingsEqualTheInlineMapping) {
    ExpectClonedMappingEqualsInline<TwirlTransform>("twirl", 720.0f);
    ExpectClonedMappingEqualsInline<SphereTransform>("sphere", 1.0f);
}

} // namespace
