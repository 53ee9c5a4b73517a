#pragma once
// ICC profiles for tests, made by lcms2: the profile bytes that images and documents embed.

#include <lcms2.h>

#include <cstddef>
#include <vector>

namespace HostTests {

// The profile's bytes; closes it.
inline std::vector<std::byte> SaveProfile(cmsHPROFILE profile) {
    cmsUInt32Number size = 0;
    cmsSaveProfileToMem(profile, nullptr, &size);
    std::vector<std::byte> bytes(size);
    cmsSaveProfileToMem(profile, bytes.data(), &size);
    cmsCloseProfile(profile);
    return bytes;
}

// ProPhoto RGB (ROMM): its primaries, D50 white and 1.8 gamma; a gamut much wider than sRGB's.
inline std::vector<std::byte> ProPhotoProfile() {
    const cmsCIExyY white{0.3457, 0.3585, 1.0};
    const cmsCIExyYTRIPLE primaries{{0.7347, 0.2653, 1.0}, {0.1596, 0.8404, 1.0}, {0.0366, 0.0001, 1.0}};
    cmsToneCurve* curve = cmsBuildGamma(nullptr, 1.8);
    cmsToneCurve* curves[3] = {curve, curve, curve};
    cmsHPROFILE profile = cmsCreateRGBProfile(&white, &primaries, curves);
    cmsFreeToneCurve(curve);
    return SaveProfile(profile);
}

// A grey profile with D50 white and the given gamma.
inline std::vector<std::byte> GreyProfile(double gamma) {
    cmsToneCurve* curve = cmsBuildGamma(nullptr, gamma);
    cmsHPROFILE profile = cmsCreateGrayProfile(cmsD50_xyY(), curve);
    cmsFreeToneCurve(curve);
    return SaveProfile(profile);
}

} // namespace HostTests
