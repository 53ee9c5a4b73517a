// The processor's span path (the generator run across 32 pixels at once) against the per-pixel definition:
// every seed, every draw and every pixel bit for bit, including places that saturate.

#include "NoiseTestSupport.h"

#include "host/raster/Bitmap.h"

#include <cmath>
#include <limits>

namespace {

using namespace RasterTools::NoiseGenerator;
using Raster::PixelFormat;
using RasterTools::NoiseSampler;

TEST(NoiseSpan, DivisionFreeDrawsAreExactForEveryValue) {
    for (uint r = 0; r <= RandomMax; ++r)
        ASSERT_EQ(RandomToUnit(r), (float)r / (float)RandomMax) << r;
}

TEST(NoiseSpan, JumpsReachTheSameStatesAsSteps) {
    const Jump* jumps = GetJumps();
    for (const uint start : {0u, 1u, 1902946834u, 0xFFFFFFFFu}) {
        uint state = start;
        for (int k = 1; k <= MaxJump; ++k) {
            (void)RandomGet(&state);
            ASSERT_EQ(jumps[k].multiplier * start + jumps[k].increment, state)
                << "start " << start << ", k " << k;
        }
    }
}

TEST(NoiseSpan, SeedsMatchNoiseSeedAndDiffuseSeedUnderAnyAffine) {
    const float inf = std::numeric_limits<float>::infinity(), nan = std::numeric_limits<float>::quiet_NaN();
    const float affines[][6] = {
        {1, 0, 0, 0, 1, 0},          {0.5f, 0, 0, 0, 0.5f, 0}, {0.866f, 0.5f, -12.5f, -0.5f, 0.866f, 7.25f},
        {1, 0, 1e20f, 0, 1, -1e20f}, {3e5f, 0, 0, 0, 3e5f, 0}, {1, 0, 4194303.5f, 0, 1, -4194304.5f},
        {1, 0, nan, 0, 1, 0},        {inf, 0, 0, 0, 1, 0},     {-1, 0, 0, 0, -1, 0},
        {0, 0, 3, 0, 0, 1},
    };
    for (const auto& affine : affines)
        for (const int x0 : {0, -45, 4096, 2147483600})
            for (const int y : {0, -3, 77}) {
                float params[SamplerFloatCount] = {affine[0], affine[1], affine[2], affine[3], affine[4],
                                                   affine[5], 0.3f,      1000.0f,   0.0f,      1.0f};
                std::uint32_t seeds[SpanPixels], diffuse[SpanPixels];
                SpanSeeds(x0, y, params, seeds);
                SpanDiffuseSeeds(x0, y, params, diffuse);
                for (int i = 0; i < SpanPixels; ++i) {
                    ASSERT_EQ(seeds[i], NoiseSeed(make_int2(x0 + i, y), params))
                        << "affine " << affine[0] << ", " << affine[2] << ", " << affine[5] << "; pixel ("
                        << x0 + i << ", " << y << ")";
                    ASSERT_EQ(diffuse[i], DiffuseSeed(make_int2(x0 + i, y), params))
                        << "affine " << affine[0] << ", " << affine[2] << ", " << affine[5] << "; pixel ("
                        << x0 + i << ", " << y << ")";
                }
            }
}

TEST(NoiseSpan, NoiseMatchesSuccessiveDraws) {
    std::uint32_t seeds[SpanPixels];
    for (int i = 0; i < SpanPixels; ++i)
        seeds[i] = Hash(uint(i * 7919));
    for (const bool gaussian : {false, true})
        for (const int channels : {1, 2, 3, 4}) {
            float noise[4][SpanPixels];
            SpanNoise(seeds, channels, gaussian, 0.7f, noise);
            for (int i = 0; i < SpanPixels; ++i) {
                uint state = seeds[i];
                for (int c = 0; c < channels; ++c)
                    ASSERT_EQ(noise[c][i], GetNoise(gaussian, 0.7f, &state))
                        << (gaussian ? "gaussian" : "uniform") << ", " << channels << " channels, channel "
                        << c << ", lane " << i;
            }
        }
}

// The span sampler and the per-pixel sampler over spans inside, across and outside the image.
template <PixelFormat F>
void CompareSamplers() {
    const auto image = PipelineTest::MakeImage(F, 50, 4, 11u);
    const Raster::BitmapOf<F> bitmap(image.Get());
    using Transform = Raster::IdentityTransform;
    const auto t = Transform::Prepare({});
    // Sigmas that move a little, saturate both ends (1e30) and go through NaN (infinity times zero).
    const float inf = std::numeric_limits<float>::infinity();
    for (const float sigma : {0.6f, 1e30f, inf})
        for (const float mono : {0.0f, 1.0f})
            for (const float gaussian : {0.0f, 1.0f}) {
                NoiseSampler::Params params;
                const float block[SamplerFloatCount] = {0.5f, 0.25f, 3.0f,  -0.125f, 2.0f,
                                                        1.0f, sigma, 50.0f, mono,    gaussian};
                std::copy_n(block, SamplerFloatCount, params.block);
                for (const int x0 : {0, 7, 32, 40, -20})
                    for (const int y : {0, 3, -1}) {
                        const int n = x0 == 7 ? 25 : 32;
                        typename Raster::BitmapOf<F>::Stored span[SpanPixels];
                        NoiseSampler::SampleSpan<Transform, Raster::Zero>(bitmap, t, params, x0, y, n, span);
                        for (int i = 0; i < n; ++i) {
                            const auto one = NoiseSampler::Sample<Transform, Raster::Zero>(
                                bitmap, Raster::KernelMath::make_int2(x0 + i, y), t, params);
                            ASSERT_EQ(std::memcmp(&one, &span[i], sizeof one), 0)
                                << Raster::GetPixelFormatName(F) << " sigma " << sigma << " mono " << mono
                                << " gaussian " << gaussian << " at (" << x0 + i << ", " << y << ")";
                        }
                    }
            }
}

TEST(NoiseSpan, SpanSamplerMatchesThePixelSamplerInEveryFormat) {
    CompareSamplers<PixelFormat::RGBA8>();
    CompareSamplers<PixelFormat::RGBA16>();
    CompareSamplers<PixelFormat::RGBAUF>();
    CompareSamplers<PixelFormat::IA8>();
    CompareSamplers<PixelFormat::IA16>();
    CompareSamplers<PixelFormat::CMYKA8>();
    CompareSamplers<PixelFormat::LabA16>();
}

} // namespace
