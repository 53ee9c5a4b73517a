// Whole-image conversions through ICC profiles: a wide-gamut image's Lab is the one lcms2 gives for its own
// profile, not the one sRGB would give; round trips; the built-in defaults agree with the closed forms;
// alpha; damaged and mismatched profiles.

#include "host/raster/DynamicBuffer.h"
#include "host/raster/ICCManager.h"

#include <gtest/gtest.h>

#include "tests/host/TestProfiles.h"

#include <lcms2.h>

#include <cmath>
#include <cstring>

using Raster::ColourProfiles;
using Raster::ICCManager;
using Raster::PixelFormat;

namespace {

// A grid of 16-bit RGB colours with varying alpha.
Kernel::Counted<Raster::DynamicBuffer> Grid16() {
    auto image = Raster::DynamicBuffer::Create(9, 9 * 9, PixelFormat::RGBA16);
    for (int y = 0; y < 81; ++y)
        for (int x = 0; x < 9; ++x) {
            const std::uint16_t pixel[4] = {std::uint16_t(x * 8191), std::uint16_t((y % 9) * 8191),
                                            std::uint16_t((y / 9) * 8191), std::uint16_t(65535 - x * 1000)};
            std::memcpy(image->RowBytes(y) + x * 8, pixel, 8);
        }
    return image;
}

std::uint16_t At(const Raster::DynamicBuffer& image, int x, int y, int c) {
    std::uint16_t v;
    std::memcpy(&v, image.RowBytes(y) + x * 8 + c * 2, 2);
    return v;
}

} // namespace

TEST(ProfileConversion, WideGamutRgbToLabIsWhatLcms2GivesForItsProfile) {
    ColourProfiles profiles;
    ASSERT_TRUE(profiles.Add(HostTests::ProPhotoProfile()));
    ASSERT_FALSE(profiles.rgb.empty());
    const auto image = Grid16();
    EXPECT_TRUE(ICCManager::NeedsProfileConversion(PixelFormat::RGBA16, profiles, PixelFormat::LabA16, {}));
    std::string error;
    const auto lab = ICCManager::ConvertImage(*image, profiles, PixelFormat::LabA16, {}, error);
    ASSERT_TRUE(lab) << error;

    // lcms2 in double, straight from the 16-bit numbers to D50 Lab, then LabA16's encoding by hand:
    // L * 65535 / 100, a and b * 256 + 32768.
    cmsHPROFILE rgb = cmsOpenProfileFromMem(profiles.rgb.data(), cmsUInt32Number(profiles.rgb.size()));
    cmsHPROFILE labProfile = cmsCreateLab4Profile(nullptr);
    cmsHTRANSFORM reference = cmsCreateTransform(rgb, TYPE_RGB_16, labProfile, TYPE_Lab_DBL,
                                                 INTENT_RELATIVE_COLORIMETRIC, cmsFLAGS_NOOPTIMIZE);
    cmsCloseProfile(rgb);
    cmsCloseProfile(labProfile);
    ASSERT_NE(reference, nullptr);
    double worst = 0;
    for (int y = 0; y < image->GetHeight(); ++y)
        for (int x = 0; x < image->GetWidth(); ++x) {
            const std::uint16_t in[3] = {At(*image, x, y, 0), At(*image, x, y, 1), At(*image, x, y, 2)};
            cmsCIELab expected;
            cmsDoTransform(reference, in, &expected, 1);
            const double stored[3] = {expected.L * 655.35, expected.a * 256 + 32768,
                                      expected.b * 256 + 32768};
            for (int c = 0; c < 3; ++c)
                if (stored[c] >= 0 && stored[c] <= 65535)
                    worst = std::max(worst, std::abs(stored[c] - At(*lab, x, y, c)));
            EXPECT_EQ(At(*lab, x, y, 3), At(*image, x, y, 3)); // alpha carried over
        }
    cmsDeleteTransform(reference);
    // Float against double, each rounded once: within one stored step (a* and b* steps are 1/256).
    EXPECT_LE(worst, 1.0);

    // The profile matters: ProPhoto's full red lies far outside sRGB, a* well beyond sRGB red's (about 80).
    auto red = Raster::DynamicBuffer::Create(1, 1, PixelFormat::RGBA16);
    const std::uint16_t pure[4] = {65535, 0, 0, 65535};
    std::memcpy(red->RowBytes(0), pure, 8);
    const auto wide = ICCManager::ConvertImage(*red, profiles, PixelFormat::LabA16, {}, error);
    const auto narrow = ICCManager::ConvertImage(*red, {}, PixelFormat::LabA16, {}, error);
    ASSERT_TRUE(wide && narrow) << error;
    const double wideA = (At(*wide, 0, 0, 1) - 32768) / 256.0,
                 narrowA = (At(*narrow, 0, 0, 1) - 32768) / 256.0;
    EXPECT_GT(wideA, narrowA + 20);
    EXPECT_NEAR(narrowA, 80.1, 1.0);
}

TEST(ProfileConversion, RoundTripsThroughLabAndBetweenProfilesComeBack) {
    ColourProfiles prophoto;
    prophoto.Add(HostTests::ProPhotoProfile());
    const auto image = Grid16();
    std::string error;
    const auto lab = ICCManager::ConvertImage(*image, prophoto, PixelFormat::LabA16, {}, error);
    ASSERT_TRUE(lab) << error;
    const auto back = ICCManager::ConvertImage(*lab, {}, PixelFormat::RGBA16, prophoto, error);
    ASSERT_TRUE(back) << error;
    // Through float RGB and back: ProPhoto to sRGB (unbounded) to ProPhoto.
    const auto working = ICCManager::ConvertImage(*image, prophoto, PixelFormat::RGBAUF, {}, error);
    ASSERT_TRUE(working) << error;
    const auto again = ICCManager::ConvertImage(*working, {}, PixelFormat::RGBA16, prophoto, error);
    ASSERT_TRUE(again) << error;
    int worstLab = 0, worstFloat = 0;
    for (int y = 0; y < image->GetHeight(); ++y)
        for (int x = 0; x < image->GetWidth(); ++x)
            for (int c = 0; c < 4; ++c) {
                // ProPhoto reaches colours whose a* or b* LabA16 cannot store (they clamp), and its 1.8 gamma
                // near black magnifies LabA16's steps.
                const bool stored = At(*lab, x, y, 1) % 65535 != 0 && At(*lab, x, y, 2) % 65535 != 0;
                const int lost = std::abs(int(At(*image, x, y, c)) - int(At(*back, x, y, c)));
                if (stored && (At(*image, x, y, c) > 4096 || c == 3)) {
                    worstLab = std::max(worstLab, lost);
                }
                // A 1.8 gamma's slope is infinite at 0: there float's last bit becomes a few 16-bit steps.
                if (At(*image, x, y, c) > 0)
                    worstFloat =
                        std::max(worstFloat, std::abs(int(At(*image, x, y, c)) - int(At(*again, x, y, c))));
                else
                    EXPECT_LE(At(*again, x, y, c), 8);
            }
    EXPECT_LE(worstLab, 64); // under 0.1 % of the range
    EXPECT_LE(worstFloat, 2);
}

TEST(ProfileConversion, BuiltInDefaultsAgreeWithTheClosedForms) {
    // No profile on either side: nothing to manage.
    EXPECT_FALSE(ICCManager::NeedsProfileConversion(PixelFormat::RGBA8, {}, PixelFormat::LabA16, {}));
    ColourProfiles prophoto;
    prophoto.Add(HostTests::ProPhotoProfile());
    // The same profile on both sides of a depth change needs none either.
    EXPECT_FALSE(
        ICCManager::NeedsProfileConversion(PixelFormat::RGBA8, prophoto, PixelFormat::RGBA16, prophoto));
    EXPECT_TRUE(ICCManager::NeedsProfileConversion(PixelFormat::RGBA8, prophoto, PixelFormat::RGBA16, {}));

    // sRGB through lcms2 against the closed form the kernels share: within a stored step.
    auto floats = Raster::DynamicBuffer::Create(8, 8, PixelFormat::RGBAUF);
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 8; ++x) {
            const float pixel[4] = {float(x) / 7.0f, float(y) / 7.0f, float(x + y) / 14.0f, 1.0f};
            std::memcpy(floats->RowBytes(y) + x * 16, pixel, 16);
        }
    std::string error;
    const auto managed = ICCManager::ConvertImage(*floats, {}, PixelFormat::LabA16, {}, error);
    ASSERT_TRUE(managed) << error;
    for (int y = 0; y < 8; ++y) {
        std::uint16_t closed[8 * 4];
        ICCManager::GetInstance().DoRGBAFToLABA16Transform(
            reinterpret_cast<unsigned char*>(floats->RowBytes(y)), reinterpret_cast<unsigned char*>(closed),
            8);
        for (int x = 0; x < 8; ++x)
            for (int c = 0; c < 4; ++c)
                EXPECT_LE(std::abs(int(closed[x * 4 + c]) - int(At(*managed, x, y, c))), 2) << x << "," << y;
    }

    // CMYK without a profile uses the pipeline's undercolour formula: full cyan is (0, 1, 1), half black
    // under half magenta is (0.5, 0.25, 0.5).
    auto cmyk = Raster::DynamicBuffer::Create(2, 1, PixelFormat::CMYKA8);
    const std::uint8_t inks[10] = {255, 0, 0, 0, 255, 0, 127, 0, 127, 255};
    std::memcpy(cmyk->RowBytes(0), inks, 10);
    const auto rgb = ICCManager::ConvertImage(*cmyk, {}, PixelFormat::RGBAUF, {}, error);
    ASSERT_TRUE(rgb) << error;
    const float* p = rgb->Row<float>(0);
    const float expected[8] = {
        0, 1, 1, 1, 128 / 255.0f, 1 - (127 / 255.0f * 128 / 255.0f + 127 / 255.0f), 128 / 255.0f, 1};
    for (int i = 0; i < 8; ++i)
        EXPECT_NEAR(p[i], expected[i], 1e-5) << i;
    // and back to the same inks
    const auto inksBack = ICCManager::ConvertImage(*rgb, {}, PixelFormat::CMYKA8, {}, error);
    ASSERT_TRUE(inksBack) << error;
    EXPECT_EQ(std::memcmp(inksBack->RowBytes(0), inks, 10), 0);
}

TEST(ProfileConversion, GreyProfilesAndRefusals) {
    ColourProfiles profiles;
    EXPECT_TRUE(profiles.Add(HostTests::GreyProfile(2.2)));
    EXPECT_TRUE(profiles.rgb.empty());
    EXPECT_FALSE(profiles.grey.empty());
    // A 2.2-gamma grey of 50 % is L* = 100 * f(0.5^2.2) with the CIE function.
    auto grey = Raster::DynamicBuffer::Create(1, 1, PixelFormat::IA16);
    const std::uint16_t half[2] = {32768, 65535};
    std::memcpy(grey->RowBytes(0), half, 4);
    std::string error;
    const auto lab = ICCManager::ConvertImage(*grey, profiles, PixelFormat::LabA16, {}, error);
    ASSERT_TRUE(lab) << error;
    const double Y = std::pow(32768 / 65535.0, 2.2);
    const double L = 116 * std::cbrt(Y) - 16;
    std::uint16_t stored[4];
    std::memcpy(stored, lab->RowBytes(0), 8);
    EXPECT_NEAR(stored[0] / 655.35, L, 0.05);
    EXPECT_NEAR(stored[1], 32768, 16); // neutral
    EXPECT_NEAR(stored[2], 32768, 16);

    // Damaged profile bytes, a profile of another model in a slot, and a non-profile are refused.
    ColourProfiles damaged;
    damaged.rgb = std::vector<std::byte>(200, std::byte{7});
    auto rgba = Raster::DynamicBuffer::Create(1, 1, PixelFormat::RGBA8);
    EXPECT_FALSE(ICCManager::ConvertImage(*rgba, damaged, PixelFormat::LabA16, {}, error));
    EXPECT_EQ(error, "the colour profile is damaged");
    ColourProfiles mismatched;
    mismatched.rgb = HostTests::GreyProfile(2.2);
    EXPECT_FALSE(ICCManager::ConvertImage(*rgba, mismatched, PixelFormat::LabA16, {}, error));
    EXPECT_EQ(error, "the colour profile is for other pixels than these");
    EXPECT_FALSE(profiles.Add(std::vector<std::byte>(40)));
}
