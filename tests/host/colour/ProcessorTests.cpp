// The colour manager's Lab conversions on the processor: values from the defining formulas, agreement with
// lcms2's own sRGB profile, round trips, alpha, buffers of any length and alignment, hostile values, and many
// threads at once.

#include "ColourTestSupport.h"

#include "host/kernel/Simd.h"

#include <gtest/gtest.h>
#include <lcms2.h>

#include <algorithm>
#include <cstring>
#include <limits>
#include <thread>

using namespace ColourTest;
using Raster::ICCManager;

namespace {

::testing::AssertionResult StoredNear(const LabPixel& lab, const std::array<double, 3>& expected) {
    for (int c = 0; c < 3; ++c)
        if (std::abs(double(lab[c]) - expected[c]) > 1.0)
            return ::testing::AssertionFailure() << "channel " << c << " stored " << lab[c] << ", expected "
                                                 << expected[c] << " within one step";
    return ::testing::AssertionSuccess();
}

} // namespace

TEST(ColourProcessor, KnownColoursMatchTheLabFormulas) {
    const LabReference reference;
    // White and black sit on the neutral axis at the ends of L.
    EXPECT_TRUE(StoredNear(ToLab({1, 1, 1, 1}), {65535.0, 32768.0, 32768.0}));
    EXPECT_TRUE(StoredNear(ToLab({0, 0, 0, 1}), {0.0, 32768.0, 32768.0}));
    // sRGB mid grey: linear (0.555/1.055)^2.4 = 0.21404, L* = 116 cbrt(0.21404) - 16 = 53.389.
    const LabPixel grey = ToLab({0.5f, 0.5f, 0.5f, 1});
    EXPECT_NEAR(grey[0] / 655.35, 53.389, 0.002);
    EXPECT_EQ(grey[1], 32768);
    EXPECT_EQ(grey[2], 32768);

    // Saturated primaries: the reference works them out from the chromaticities and the Bradford matrix.
    // For red, XYZ(D50) = (0.43607, 0.22250, 0.01393): L* = 54.29, a* = 80.81, b* = 69.89.
    const auto red = reference.Lab(1, 0, 0);
    EXPECT_NEAR(red[0], 54.29, 0.01);
    EXPECT_NEAR(red[1], 80.81, 0.01);
    EXPECT_NEAR(red[2], 69.89, 0.01);
    EXPECT_TRUE(StoredNear(ToLab({1, 0, 0, 1}), reference.Stored(1, 0, 0)));
    EXPECT_TRUE(StoredNear(ToLab({0, 1, 0, 1}), reference.Stored(0, 1, 0)));
    EXPECT_TRUE(StoredNear(ToLab({0, 0, 1, 1}), reference.Stored(0, 0, 1)));

    // Back from Lab: the ends of the neutral axis are white and black.
    const RGBPixel white = ToRGB({65535, 32768, 32768, 65535});
    const RGBPixel black = ToRGB({0, 32768, 32768, 65535});
    for (int c = 0; c < 3; ++c) {
        EXPECT_NEAR(white[c], 1.0f, 2e-5f) << c;
        EXPECT_NEAR(black[c], 0.0f, 2e-5f) << c;
    }
}

TEST(ColourProcessor, HandWorkedPointsStoreAsTheFormulasRound) {
    // Rounded to nearest, stored values lie within half a step of the exact ones; float arithmetic may add a
    // few hundredths of a step.
    const auto expectStored = [](const RGBPixel& rgb, double l, double a, double b) {
        const LabPixel lab = ToLab(rgb);
        const double exact[3] = {l * 655.35, (a + 128.0) * 256.0, (b + 128.0) * 256.0};
        for (int c = 0; c < 3; ++c)
            EXPECT_LE(std::abs(double(lab[c]) - exact[c]), 0.55)
                << rgb[0] << " " << rgb[1] << " " << rgb[2] << " channel " << c << ": stored " << lab[c]
                << ", exact " << exact[c];
    };
    // White and black are the ends of the neutral axis, exactly.
    EXPECT_EQ(ToLab({1, 1, 1, 1}), (LabPixel{65535, 32768, 32768, 65535}));
    EXPECT_EQ(ToLab({0, 0, 0, 1}), (LabPixel{0, 32768, 32768, 65535}));
    // Mid grey: linear ((0.5 + 0.055) / 1.055)^2.4 = 0.2140411, L* = 116 * 0.2140411^(1/3) - 16 = 53.388965,
    // stored 34988.458 -> 34988; grey has no chroma.
    expectStored({0.5f, 0.5f, 0.5f, 1}, 53.388965, 0.0, 0.0);
    EXPECT_EQ(ToLab({0.5f, 0.5f, 0.5f, 1})[0], 34988);
    // The primaries: linear (1, 0, 0) is the first column of the adapted matrix, XYZ(D50) = (0.4360413,
    // 0.2224845, 0.0139202); over the white (0.9642, 1, 0.8249) and through f, L* = 54.289632,
    // a* = 80.814356, b* = 69.889742. Green, XYZ (0.3851129, 0.7169051, 0.0970672): L* = 87.819406,
    // a* = -79.274942, b* = 80.992723. Blue, XYZ (0.1430458, 0.0606104, 0.7139126): L* = 29.565939,
    // a* = 68.286208, b* = -112.032919.
    expectStored({1, 0, 0, 1}, 54.289632, 80.814356, 69.889742);
    expectStored({0, 1, 0, 1}, 87.819406, -79.274942, 80.992723);
    expectStored({0, 0, 1, 1}, 29.565939, 68.286208, -112.032919);
    // The secondaries, from the reference's double arithmetic.
    const LabReference reference;
    for (const RGBPixel& primary : {RGBPixel{1, 1, 0, 1}, RGBPixel{0, 1, 1, 1}, RGBPixel{1, 0, 1, 1}}) {
        const auto lab = reference.Lab(primary[0], primary[1], primary[2]);
        expectStored(primary, lab[0], lab[1], lab[2]);
    }

    // Back from Lab: black is exactly zero, with no residue for a CMYK split to divide by 1 - k, and white is
    // 1 to within a float step.
    const RGBPixel black = ToRGB({0, 32768, 32768, 65535});
    const RGBPixel white = ToRGB({65535, 32768, 32768, 65535});
    for (int c = 0; c < 3; ++c) {
        EXPECT_EQ(black[c], 0.0f) << c;
        EXPECT_NEAR(white[c], 1.0f, 2.4e-7f) << c;
    }
}

TEST(ColourProcessor, ClosedFormMatchesLcms2sOwnSRGBProfile) {
    // lcms2's built-in sRGB profile (its own primaries, white and curve) to its D50 Lab, in float, over a
    // grid of in-gamut colours: the stored values lie within 0.55 of a step of lcms2's unrounded ones (half a
    // step of rounding, the rest float arithmetic on either side).
    cmsHPROFILE srgb = cmsCreate_sRGBProfile();
    cmsHPROFILE lab = cmsCreateLab4Profile(nullptr);
    ASSERT_TRUE(srgb && lab);
    cmsHTRANSFORM transform = cmsCreateTransform(srgb, TYPE_RGB_FLT, lab, TYPE_Lab_FLT,
                                                 INTENT_RELATIVE_COLORIMETRIC, cmsFLAGS_NOOPTIMIZE);
    cmsCloseProfile(srgb);
    cmsCloseProfile(lab);
    ASSERT_NE(transform, nullptr);
    double worst = 0.0;
    constexpr int Steps = 40;
    for (int r = 0; r <= Steps; ++r)
        for (int g = 0; g <= Steps; ++g)
            for (int b = 0; b <= Steps; ++b) {
                const float rgb[3] = {float(r) / Steps, float(g) / Steps, float(b) / Steps};
                float reference[3];
                cmsDoTransform(transform, rgb, reference, 1);
                const double unrounded[3] = {reference[0] * 655.35, (reference[1] + 128.0) * 256.0,
                                             (reference[2] + 128.0) * 256.0};
                const LabPixel stored = ToLab({rgb[0], rgb[1], rgb[2], 1.0f});
                for (int c = 0; c < 3; ++c)
                    worst = std::max(worst, std::abs(double(stored[c]) - unrounded[c]));
            }
    cmsDeleteTransform(transform);
    EXPECT_LE(worst, 0.55);
    std::cout << "[ info     ] largest distance from lcms2: " << worst << " of a stored step\n";
}

TEST(ColourProcessor, AgreesWithTheReferenceOverWorkingColours) {
    // In range and out of range alike, wherever the Lab value is storable without clamping.
    const LabReference reference;
    int compared = 0;
    for (const RGBPixel& rgb : RGBGrid()) {
        const auto expected = reference.Stored(rgb[0], rgb[1], rgb[2]);
        bool storable = true;
        for (double v : expected)
            storable = storable && v >= 0.0 && v <= 65535.0;
        if (!storable) continue;
        ++compared;
        ASSERT_TRUE(StoredNear(ToLab(rgb), expected)) << rgb[0] << ", " << rgb[1] << ", " << rgb[2];
    }
    EXPECT_GT(compared, 15000);
}

TEST(ColourProcessor, StoredLabRoundTripsWithinOneStep) {
    int exact = 0, total = 0;
    for (const LabPixel& lab : LabGrid()) {
        const LabPixel back = ToLab(ToRGB(lab));
        ASSERT_LE(MaxStepDifference(lab, back), 1)
            << lab[0] << " " << lab[1] << " " << lab[2] << " came back as " << back[0] << " " << back[1]
            << " " << back[2];
        EXPECT_EQ(back[3], lab[3]) << "alpha is exact";
        exact += back == lab;
        ++total;
    }
    EXPECT_GT(exact, total * 99 / 100) << "nearly every stored value comes back exactly";
}

TEST(ColourProcessor, NeutralAxisStaysNeutral) {
    for (int l = 0; l <= 65535; l += 97) {
        const LabPixel lab{static_cast<std::uint16_t>(l), 32768, 32768, 65535};
        const RGBPixel rgb = ToRGB(lab);
        EXPECT_NEAR(rgb[0], rgb[1], 1e-5f) << l;
        EXPECT_NEAR(rgb[2], rgb[1], 1e-5f) << l;
        EXPECT_EQ(ToLab(rgb), lab) << l;
    }
}

TEST(ColourProcessor, WorkingColoursSurviveARoundTripAsFarAsLabAllows) {
    // Wherever the Lab value is storable, values below 0 and above 1 included, the colour that comes back is
    // the one the stored value denotes: the round trip loses LabA16's quantisation (half a step) and no more.
    // Inside 0..1 that stays well below an 8-bit step.
    const LabReference reference;
    float worstInside = 0.0f;
    for (const RGBPixel& rgb : RGBGrid()) {
        const auto unrounded = reference.Stored(rgb[0], rgb[1], rgb[2]);
        if (*std::min_element(unrounded.begin(), unrounded.end()) < 0.5 ||
            *std::max_element(unrounded.begin(), unrounded.end()) > 65534.5)
            continue;
        const LabPixel stored = ToLab(rgb);
        const RGBPixel back = ToRGB(stored);
        const auto denoted = reference.Stored(back[0], back[1], back[2]);
        for (int c = 0; c < 3; ++c)
            ASSERT_NEAR(denoted[c], stored[c], 0.6)
                << rgb[0] << ", " << rgb[1] << ", " << rgb[2] << " channel " << c;
        if (std::min({rgb[0], rgb[1], rgb[2]}) >= 0.0f && std::max({rgb[0], rgb[1], rgb[2]}) <= 1.0f)
            for (int c = 0; c < 3; ++c)
                worstInside = std::max(worstInside, std::abs(back[c] - rgb[c]));
    }
    EXPECT_LT(worstInside, 0.25f / 255.0f) << "a quarter of an 8-bit step";

    const RGBPixel outside = ToRGB(ToLab({-0.2f, 0.5f, 0.5f, 1}));
    EXPECT_NEAR(outside[0], -0.2f, 1e-3f);
    const RGBPixel bright = ToRGB(ToLab({1.3f, 0.5f, 0.2f, 1}));
    EXPECT_NEAR(bright[0], 1.3f, 1e-3f);

    // Brighter than white is beyond L = 100: it stores as white and comes back as white.
    EXPECT_EQ(ToLab({2, 2, 2, 1}), (LabPixel{65535, 32768, 32768, 65535}));
    // Below black likewise clamps to L = 0.
    EXPECT_EQ(ToLab({-0.5f, -0.5f, -0.5f, 1})[0], 0);
    // a and b clamp at the ends of their range rather than wrapping.
    const LabPixel vivid = ToLab({-1.0f, 4.0f, -1.0f, 1});
    EXPECT_EQ(vivid[1], 0);
    EXPECT_EQ(vivid[2], 65535);
}

TEST(ColourProcessor, AlphaIsScaledRoundedAndClamped) {
    // Every stored alpha comes back exactly through the float.
    for (int a = 0; a <= 65535; ++a) {
        const RGBPixel rgb = ToRGB({30000, 32768, 32768, static_cast<std::uint16_t>(a)});
        ASSERT_EQ(rgb[3], static_cast<float>(a) / 65535.0f);
        ASSERT_EQ(ToLab(rgb)[3], a);
    }
    // Scale, add 0.5, truncate: 0.5 * 65535 + 0.5 = 32768.
    EXPECT_EQ(ToLab({0.5f, 0.5f, 0.5f, 0.5f})[3], 32768);
    EXPECT_EQ(ToLab({0.5f, 0.5f, 0.5f, 0.0f})[3], 0);
    EXPECT_EQ(ToLab({0.5f, 0.5f, 0.5f, 1.0f})[3], 65535);
    EXPECT_EQ(ToLab({0.5f, 0.5f, 0.5f, 0.49f / 65535.0f})[3], 0);
    EXPECT_EQ(ToLab({0.5f, 0.5f, 0.5f, 0.51f / 65535.0f})[3], 1);
    EXPECT_EQ(ToLab({0.5f, 0.5f, 0.5f, -0.25f})[3], 0);
    EXPECT_EQ(ToLab({0.5f, 0.5f, 0.5f, 1.75f})[3], 65535);

    // Alpha never changes the colour, in either direction.
    const LabPixel opaque = ToLab({0.8f, 0.3f, 0.1f, 1.0f});
    const LabPixel clear = ToLab({0.8f, 0.3f, 0.1f, 0.0f});
    EXPECT_EQ(MaxStepDifference(opaque, clear, 3), 0);
    const RGBPixel a = ToRGB({40000, 20000, 50000, 0});
    const RGBPixel b = ToRGB({40000, 20000, 50000, 65535});
    EXPECT_EQ(std::memcmp(a.data(), b.data(), 3 * sizeof(float)), 0);
}

TEST(ColourProcessor, HostileValuesStoreInsideTheRange) {
    const float nan = std::numeric_limits<float>::quiet_NaN();
    const float inf = std::numeric_limits<float>::infinity();
    const LabPixel nanAlpha = ToLab({0.5f, 0.5f, 0.5f, nan});
    EXPECT_EQ(nanAlpha[3], 0) << "a NaN alpha stores as 0";
    EXPECT_EQ(MaxStepDifference(nanAlpha, ToLab({0.5f, 0.5f, 0.5f, 1}), 3), 0)
        << "and leaves the colour alone";
    // A NaN colour counts as 0 and infinities as the 2^20 limit; a neighbour in the same call is unaffected.
    std::array<RGBPixel, 3> pixels{{{nan, 0.5f, 0.5f, 1}, {inf, -inf, 1e30f, 1}, {0.25f, 0.5f, 0.75f, 1}}};
    std::array<LabPixel, 3> stored{};
    ICCManager::GetInstance().DoRGBAFToLABA16Transform(reinterpret_cast<unsigned char*>(pixels.data()),
                                                       reinterpret_cast<unsigned char*>(stored.data()), 3);
    EXPECT_EQ(stored[0], ToLab({0.0f, 0.5f, 0.5f, 1}));
    EXPECT_EQ(stored[1], ToLab({1048576.0f, -1048576.0f, 1048576.0f, 1}));
    EXPECT_EQ(stored[2], ToLab(pixels[2]));
}

TEST(ColourProcessor, CallsOfAnyLengthAndAlignmentMatchSinglePixels) {
    const auto grid = LabGrid(7919, 16411);
    std::vector<RGBPixel> expected(grid.size());
    for (std::size_t i = 0; i < grid.size(); ++i)
        expected[i] = ToRGB(grid[i]);

    for (int count : {0, 1, 63, 64, 65, 129, static_cast<int>(grid.size())}) {
        // One byte off any natural alignment, and guard bytes after the last pixel.
        std::vector<unsigned char> in(1 + grid.size() * 8), out(1 + grid.size() * 16 + 16, 0xA5);
        std::memcpy(in.data() + 1, grid.data(), grid.size() * 8);
        ICCManager::GetInstance().DoLABA16ToRGBAFTransform(in.data() + 1, out.data() + 1, count);
        EXPECT_EQ(out[0], 0xA5);
        for (int i = 0; i < count; ++i)
            ASSERT_EQ(std::memcmp(out.data() + 1 + i * 16, expected[i].data(), 16), 0) << count << " " << i;
        for (std::size_t b = 1 + std::size_t(count) * 16; b < out.size(); ++b)
            ASSERT_EQ(out[b], 0xA5) << "count " << count << " wrote past its end";

        std::vector<unsigned char> back(1 + grid.size() * 8 + 8, 0x5A);
        ICCManager::GetInstance().DoRGBAFToLABA16Transform(out.data() + 1, back.data() + 1, count);
        for (int i = 0; i < count; ++i) {
            LabPixel one;
            std::memcpy(one.data(), back.data() + 1 + i * 8, 8);
            ASSERT_EQ(one, ToLab(expected[i])) << count << " " << i;
        }
        for (std::size_t b = 1 + std::size_t(count) * 8; b < back.size(); ++b)
            ASSERT_EQ(back[b], 0x5A) << "count " << count << " wrote past its end";
    }
}

// RASTERTOOLS_NO_SIMD reaches the colour manager too, and its portable build gives the AVX2 build's bytes
// both ways.
TEST(ColourProcessor, PlainAndSimdBuildsGiveTheSameBytes) {
    Kernel::SetSimdEnabled(true);
    if (!Kernel::HasAvx2()) GTEST_SKIP() << "this processor has no AVX2: only the portable build runs";
    auto grid = LabGrid(7919, 16411);
    const int count = static_cast<int>(grid.size());
    std::vector<RGBPixel> rgb[2];
    std::vector<LabPixel> lab[2];
    for (int simd = 0; simd < 2; ++simd) {
        Kernel::SetSimdEnabled(simd == 1);
        ASSERT_EQ(Kernel::HasAvx2(), simd == 1);
        rgb[simd].resize(grid.size());
        lab[simd].resize(grid.size());
        auto& icc = ICCManager::GetInstance();
        icc.DoLABA16ToRGBAFTransform(reinterpret_cast<unsigned char*>(grid.data()),
                                     reinterpret_cast<unsigned char*>(rgb[simd].data()), count);
        icc.DoRGBAFToLABA16Transform(reinterpret_cast<unsigned char*>(rgb[simd].data()),
                                     reinterpret_cast<unsigned char*>(lab[simd].data()), count);
    }
    Kernel::SetSimdEnabled(true);
    EXPECT_EQ(std::memcmp(rgb[0].data(), rgb[1].data(), grid.size() * sizeof(RGBPixel)), 0);
    EXPECT_EQ(lab[0], lab[1]);
}

TEST(ColourProcessor, ManyThreadsGiveTheResultsOfOne) {
    const auto lab = LabGrid(4801, 8191);
    std::vector<RGBPixel> rgb(lab.size());
    std::vector<LabPixel> back(lab.size());
    for (std::size_t i = 0; i < lab.size(); ++i) {
        rgb[i] = ToRGB(lab[i]);
        back[i] = ToLab(rgb[i]);
    }

    // Every thread converts every pixel, one at a time as rendering threads do, starting at different
    // places so that different conversions overlap.
    constexpr int Threads = 8;
    std::vector<int> mismatches(Threads, 0);
    std::vector<std::thread> threads;
    for (int t = 0; t < Threads; ++t)
        threads.emplace_back([&, t] {
            for (std::size_t k = 0; k < lab.size(); ++k) {
                const std::size_t i = (k + t * lab.size() / Threads) % lab.size();
                const RGBPixel r = ToRGB(lab[i]);
                mismatches[t] += std::memcmp(r.data(), rgb[i].data(), sizeof r) != 0;
                mismatches[t] += ToLab(rgb[i]) != back[i];
            }
        });
    for (auto& thread : threads)
        thread.join();
    for (int t = 0; t < Threads; ++t)
        EXPECT_EQ(mismatches[t], 0) << "thread " << t;
}
