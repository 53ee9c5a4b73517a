#pragma once
// The host's colour manager: conversions between working float RGB and LabA16 pixels on the processor, and
// conversions of whole images between pixel formats through the ICC profiles that say what their numbers
// mean.

#include "host/kernel/Countable.h"
#include "host/raster/PixelFormat.h"

#include <cstddef>
#include <span>
#include <string>
#include <vector>

namespace Raster {

class DynamicBuffer;

// The ICC profiles that give a document's or an image's RGB, grey and CMYK numbers their meaning. An empty
// one is the built-in default: the working space (sRGB) for RGB and grey, the pixel pipeline's undercolour
// formula against sRGB for CMYK. Lab needs none.
struct ColourProfiles {
    std::vector<std::byte> rgb;
    std::vector<std::byte> grey;
    std::vector<std::byte> cmyk;

    bool IsEmpty() const noexcept { return rgb.empty() && grey.empty() && cmyk.empty(); }
    bool operator==(const ColourProfiles&) const = default;
    // The profile that describes pixels of format (empty for Lab and for formats without colour).
    const std::vector<std::byte>& For(PixelFormat format) const noexcept;
    // profile put in the slot its own header names (RGB, GRAY or CMYK); false, and nothing changed, when it
    // is none of those or too short to be a profile.
    bool Add(std::span<const std::byte> profile);
};

// The two colour spaces: the defining constants, from which the literals of LabMath.h are derived (and
// checked, in LabFragments.cpp).
//
// Working RGB (rgbauf, and what 8- and 16-bit RGB layers hold): sRGB-encoded values, sRGB primaries, D65
// white. The transfer curve is the sRGB one, continued beyond 0..1 rather than clipped: below the break
// point the linear segment goes on into negative values, above 1 the power segment goes on. Out-of-gamut
// and over-bright colours therefore reach Lab and come back unchanged, as far as LabA16 can store them.
//
// Lab: CIE L*a*b* relative to D50, the illuminant of ICC profile connection, so that LabA16 pixels mean the
// same as Lab TIFF files and ICC Lab data from other applications. D65 is adapted to D50 with the Bradford
// transform, as ICC matrix/shaper profiles do; the conversion is relative colorimetric.
namespace WorkingColourSpace {
// CIE xy chromaticities.
inline constexpr double RedX = 0.64, RedY = 0.33;
inline constexpr double GreenX = 0.30, GreenY = 0.60;
inline constexpr double BlueX = 0.15, BlueY = 0.06;
inline constexpr double WhiteX = 0.3127, WhiteY = 0.3290;

// Encoded v to linear light: ((v + Offset) / (1 + Offset))^Gamma from Break up, v / LinearSlope below.
inline constexpr double Gamma = 2.4;
inline constexpr double Offset = 0.055;
inline constexpr double LinearSlope = 12.92;
inline constexpr double Break = 0.04045;

// The Lab reference white (the ICC D50, XYZ with Y = 1).
inline constexpr double LabWhiteX = 0.9642, LabWhiteY = 1.0, LabWhiteZ = 0.8249;

// Bradford cone response matrix (rows: rho, gamma, beta from X, Y, Z).
inline constexpr double Bradford[3][3] = {
    {0.8951, 0.2664, -0.1614},
    {-0.7502, 1.7135, 0.0367},
    {0.0389, -0.0685, 1.0296},
};
} // namespace WorkingColourSpace

// Lab conversions for the processor path. Pixels are packed: rgbauf as four 32-bit floats (red, green,
// blue, alpha), LabA16 as four unsigned 16-bit values (L, a, b, alpha) encoded as LabA16Encoding says
// (PixelFormat.h). The built-in pair (working RGB <-> Lab) is the closed form of LabMath.h, the very source
// the kernels' Lab text is made of, with the LabA16 Convert bodies' scaling and rounding: a call gives what a
// kernel gives, bit for bit. ICC profiles other than these two belong to lcms2. Both calls may run on any
// number of threads at once; they allocate nothing. in and out must not overlap; neither needs any alignment.
class ICCManager {
public:
    static ICCManager& GetInstance();

    // Working RGB to LabA16: as rgbauf_to_labaf (LabMath.h) describes, Lab values beyond what LabA16 stores
    // clamp to its range and a NaN colour component counts as 0; alpha is clamped to 0..1 (NaN to 0); each
    // component is then scaled by 65535 and 0.5 is added before truncation.
    void DoRGBAFToLABA16Transform(unsigned char* in, unsigned char* out, int count);
    // LabA16 to working RGB, unbounded: colours outside sRGB come back with components below 0 or above 1.
    // Alpha is the stored value divided by 65535.
    void DoLABA16ToRGBAFTransform(unsigned char* in, unsigned char* out, int count);

    // Whether converting pixels of from, described by fromProfiles, into to, described by toProfiles, needs
    // ConvertImage: a profile takes part and the numbers must change meaning (another colour model, or
    // another profile for the same one). Otherwise the pixel pipeline's conversions give the right result.
    static bool NeedsProfileConversion(PixelFormat from, const ColourProfiles& fromProfiles, PixelFormat to,
                                       const ColourProfiles& toProfiles);
    // The image converted into a layer format through lcms2, relative colorimetric, in float: RGB and grey
    // through their profiles, CMYK through its profile (or the undercolour formula), LabA16 as D50 Lab.
    // Alpha is carried over, rescaled. Integer results are clamped and rounded to nearest; rgbauf is not
    // clamped. Null, with error set, when a profile is damaged or lcms2 cannot join the two.
    static Kernel::Counted<DynamicBuffer> ConvertImage(const DynamicBuffer& image,
                                                       const ColourProfiles& fromProfiles, PixelFormat to,
                                                       const ColourProfiles& toProfiles, std::string& error);

    ICCManager(const ICCManager&) = delete;
    ICCManager& operator=(const ICCManager&) = delete;

private:
    ICCManager() = default;
    ~ICCManager() = default; // the instance lives until the process ends; rendering threads may outlast main
};

} // namespace Raster
