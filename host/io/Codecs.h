#pragma once
// Internal to HostIO: the per-format decoders and encoders behind ImageIO.h, and what they share.

#include "host/io/ImageIO.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace IO::Detail {

// "<name>: <reason>", the shape of every message.
std::string Describe(std::string_view name, std::string_view reason);

// Empty when DynamicBuffer accepts a width × height image of format, else the message refusing it. Called
// with the file's claimed size before anything is allocated.
std::string CheckImageSize(std::string_view name, std::uint64_t width, std::uint64_t height,
                           Raster::PixelFormat format);

// Appends to a byte vector without throwing; false when memory runs out. Encoders call it from C callbacks.
bool AppendBytes(std::vector<std::byte>& out, const void* data, std::size_t size) noexcept;

// Whether every pixel's alpha is at its maximum (1 for float), so that the alpha channel can be left out.
bool IsOpaque(const Raster::DynamicBuffer& image) noexcept;

// The profile's colour space signature (bytes 16..19: "RGB ", "GRAY", "CMYK", "Lab "), or empty.
std::string_view GetProfileColourSpace(std::span<const std::byte> profile) noexcept;
// Whether profile describes pixels of format's kind (RGB, grey or CMYK); Lab pixels take none.
bool ProfileFits(std::span<const std::byte> profile, Raster::PixelFormat format) noexcept;

// stored turned and mirrored as EXIF/TIFF orientation 1..8 says the stored rows lie; 5..8 swap the sides.
// Null when memory runs out; stored itself for 1 and values outside 1..8.
Kernel::Counted<Raster::DynamicBuffer> Upright(Kernel::Counted<Raster::DynamicBuffer> stored,
                                               int orientation);

// What an encoder is asked for beside the pixels.
struct EncodeRequest {
    int quality = 92;
    std::string_view compression;                    // already checked against GetCompressionNames
    std::span<const std::byte> icc;                  // empty, or a profile that fits the pixels
    bool alpha = true;                               // false: every pixel is opaque, leave the channel out
    const Raster::ImageMetadata* metadata = nullptr; // for the codecs that embed it themselves (HEIF)
};

// Each decoder is handed data already recognised as its type; result.type is set by the caller. Each puts
// the embedded ICC profile in result.metadata; HEIF also its EXIF and XMP.
ReadResult DecodePng(std::span<const std::byte> data, std::string_view name,
                     std::optional<Raster::PixelFormat> requested);
ReadResult DecodeJpeg(std::span<const std::byte> data, std::string_view name,
                      std::optional<Raster::PixelFormat> requested);
ReadResult DecodeTiff(std::span<const std::byte> data, std::string_view name);
ReadResult DecodeWebp(std::span<const std::byte> data, std::string_view name);
ReadResult DecodeHeif(std::span<const std::byte> data, std::string_view name);
ReadResult DecodeExr(std::span<const std::byte> data, std::string_view name);

// Each encoder is handed an image in a format that CanWrite accepts for its type.
EncodeResult EncodePng(const Raster::DynamicBuffer& image, std::string_view name,
                       const EncodeRequest& request);
EncodeResult EncodeJpeg(const Raster::DynamicBuffer& image, std::string_view name,
                        const EncodeRequest& request);
EncodeResult EncodeTiff(const Raster::DynamicBuffer& image, std::string_view name,
                        const EncodeRequest& request);
EncodeResult EncodeWebp(const Raster::DynamicBuffer& image, std::string_view name,
                        const EncodeRequest& request);
EncodeResult EncodeHeif(const Raster::DynamicBuffer& image, std::string_view name, FileType type,
                        const EncodeRequest& request);
EncodeResult EncodeExr(const Raster::DynamicBuffer& image, std::string_view name,
                       const EncodeRequest& request);

// EXIF, XMP and IPTC through libexiv2, for the types it reads and writes (PNG, JPEG, TIFF, WebP).
// ReadMetadata fills those three fields of metadata (the profile is the decoder's); damaged metadata is
// skipped, never an error. WriteMetadata puts them into encoded bytes of type, keeping what the encoder wrote
// (the profile included); it returns an error message or nothing.
void ReadMetadata(std::span<const std::byte> data, FileType type, Raster::ImageMetadata& metadata);
std::optional<std::string> WriteMetadata(std::vector<std::byte>& bytes, FileType type,
                                         const Raster::ImageMetadata& metadata);
// Whether type has a block of its own for IPTC (PNG, JPEG and TIFF do; WebP, HEIF and OpenEXR do not).
bool HoldsIptc(FileType type);
// The XMP packet of metadata with its IPTC datasets added as the XMP properties that stand for them (author,
// copyright, captions, places), for types that cannot hold IPTC; a property the packet already has keeps its
// own value. The packet as it was when there is no IPTC or either block cannot be read.
std::string MirrorIptcIntoXmp(const Raster::ImageMetadata& metadata);
// The EXIF Orientation in exif (1..8), or 1 when there is none or it is out of range.
int GetExifOrientation(std::span<const std::byte> exif);
// exif with its Orientation set to 1 (and nothing else changed in meaning); exif itself when it has none.
std::vector<std::byte> ResetExifOrientation(std::span<const std::byte> exif);

} // namespace IO::Detail
