#pragma once
// What travels with an image's pixels from file to document to file: its ICC profile and its EXIF, XMP and
// IPTC metadata, each kept as the bytes its own standard defines so that nothing is lost on the way.

#include <cstddef>
#include <string>
#include <vector>

namespace Raster {

struct ImageMetadata {
    // An ICC profile; empty means the built-in working space (sRGB) for colour and grey pixels, none for CMYK
    // and Lab.
    std::vector<std::byte> iccProfile;
    // EXIF as a TIFF structure (byte-order mark first, no "Exif" header), as libexiv2 encodes it.
    std::vector<std::byte> exif;
    std::string xmp;             // an XMP packet
    std::vector<std::byte> iptc; // IPTC-IIM records

    bool IsEmpty() const noexcept {
        return iccProfile.empty() && exif.empty() && xmp.empty() && iptc.empty();
    }
    bool operator==(const ImageMetadata&) const = default;
};

} // namespace Raster
