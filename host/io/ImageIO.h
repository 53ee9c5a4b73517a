#pragma once
// Reading and writing PNG, JPEG, TIFF, WebP, AVIF, HEIC and OpenEXR files into and from Raster::DynamicBuffer
// images, with the ICC profile and the EXIF, XMP and IPTC metadata that travel with them.
//
// Reading gives the file's natural format; converting to another format is the pixel pipeline's work:
//   PNG   grey (+alpha) 1..8 bit -> IA8, 16 bit -> IA16; RGB(A) and palette 8 bit -> RGBA8, 16 bit -> RGBA16.
//   JPEG  grey -> IA8, colour -> RGBA8, CMYK / YCCK -> CMYKA8 (Adobe files store inverted ink; that is
//         undone).
//   TIFF  grey 8 -> IA8, 16 -> IA16, float -> RGBAUF (grey replicated); RGB 8 -> RGBA8, 16 -> RGBA16,
//         float -> RGBAUF; CMYK 8 -> CMYKA8 (16-bit CMYK is rounded to 8 bits); CIELab / ICCLab 8, 16 bit or
//         float -> LabA16. Other layouts libtiff can render (palette, YCbCr, bilevel, ...) -> RGBA8.
//   WebP  -> RGBA8.  AVIF, HEIC  grey -> IA8, colour 8 bit -> RGBA8, deeper -> RGBA16.
//   OpenEXR  -> RGBAUF (half and float channels; a lone Y channel is replicated to grey).
// A missing alpha channel reads as opaque. Associated (premultiplied) alpha is divided out, so every result
// holds straight alpha. A TIFF's orientation is applied (the image comes out upright, rows and columns
// swapped for 5..8), and so is HEIF's own rotation; the EXIF Orientation of the other types is kept in the
// metadata and applied only when ReadOptions::autoOrient asks (the tag then says 1). Only the first TIFF
// directory and the primary HEIF image are read. Damaged data is refused, never decoded into made-up pixels:
// a TIFF whose strip or tile tables do not cover the image, or whose data libtiff warns about while decoding,
// is refused like a truncated one; so is a palette TIFF without its colour map.
//
// LabA16 against TIFF Lab (see Raster::LabA16Encoding): L* 0..100 is 0..65535 (8-bit L is scaled by 257);
// a* and b* are (value + 128) * 256, neutral at 32768. 16-bit CIELab's signed a/b (units of 1/256) map to it
// with an offset of 32768, 8-bit signed a/b as (value + 128) * 256, and ICCLab's unsigned 8-bit a/b as
// value * 256 (16-bit ICCLab is the same scale). Writing uses 16-bit CIELab, so LabA16 round-trips exactly.
//
// Every image is bounded by Raster::DynamicBuffer's limits (65536 pixels a side, 2 GiB of pixels); larger
// claims are refused before anything is allocated, as are files above 4 GiB. No exception leaves these
// functions; every failure is a message that starts with the file's name. They keep no shared state, so
// several threads may read and write images at once.

#include "host/raster/DynamicBuffer.h"
#include "host/raster/ImageMetadata.h"

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace IO {

enum class FileType : std::uint8_t { PNG, JPEG, TIFF, WebP, AVIF, HEIC, EXR };

// "PNG", "JPEG", "TIFF", "WebP", "AVIF", "HEIC", "OpenEXR"
std::string_view GetFileTypeName(FileType type) noexcept;

// The type a file's first bytes announce (16 bytes suffice), or nothing.
std::optional<FileType> DetectFileType(std::span<const std::byte> head) noexcept;
// The type that an output name asks for by its extension (.png .jpg .jpeg .tif .tiff .webp .avif .heic .heif
// .exr, any letter case).
std::optional<FileType> GetFileTypeForExtension(const std::filesystem::path& path);
// The type named by a word, as an extension without its dot: "png", "jpg", "jpeg", "tif", "tiff", "webp",
// "avif", "heic", "heif", "exr" (any letter case).
std::optional<FileType> GetFileTypeForName(std::string_view name);
// The accepted extensions for messages: ".png, .jpg, .jpeg, ... or .exr".
std::string DescribeFileExtensions();

struct ReadResult {
    Kernel::Counted<Raster::DynamicBuffer> image; // null on failure
    FileType type = FileType::PNG;                // what the data was, when it was recognised
    std::string error;                            // empty on success
    Raster::ImageMetadata metadata;               // the embedded profile and metadata, as found
    explicit operator bool() const noexcept { return bool(image); }
};

struct ReadOptions {
    // Turns the pixels upright as the EXIF Orientation says and sets the tag to 1 (top-left).
    bool autoOrient = false;
};

// requested is a hint, never a promise: a decoder uses it only where its codec library widens for free and
// without loss (PNG grey to RGBA, PNG 8 to 16 bit, JPEG grey to RGBA8). Check the result's format.
ReadResult ReadImage(const std::filesystem::path& path, std::optional<Raster::PixelFormat> requested = {},
                     const ReadOptions& options = {});
// The same from bytes in memory; name is only used in messages.
ReadResult DecodeImage(std::span<const std::byte> data, std::string_view name,
                       std::optional<Raster::PixelFormat> requested = {}, const ReadOptions& options = {});

struct WriteOptions {
    int quality = 92; // 1..100, for JPEG, WebP, AVIF and HEIC; WebP at 100 is lossless
    // PNG: "none", "fast", "default", "best" (zlib effort); TIFF: "none", "deflate", "lzw", "packbits",
    // "zstd". Empty: "default" and "deflate". Other types have no choices and refuse a name.
    std::string compression;
    // Embedded where the type can hold it: the profile when it describes pixels of the written kind (RGB,
    // grey or CMYK); EXIF, XMP and IPTC in PNG, JPEG, TIFF, WebP, AVIF and HEIC. The last three have no IPTC
    // block: its datasets are written as the XMP properties that stand for them (dc:creator, dc:rights, ...),
    // where the XMP does not already have them.
    Raster::ImageMetadata metadata;
};

// The compression names type accepts (empty for types without choices).
std::vector<std::string_view> GetCompressionNames(FileType type);

struct WriteResult {
    std::string error; // empty on success
    explicit operator bool() const noexcept { return error.empty(); }
};

struct EncodeResult {
    std::vector<std::byte> bytes;
    std::string error; // empty on success
    explicit operator bool() const noexcept { return error.empty(); }
};

// What each file type holds: PNG RGBA8, RGBA16, IA8, IA16; JPEG RGBA8, IA8 and CMYKA8 (alpha dropped); TIFF
// every layer format; WebP RGBA8; AVIF and HEIC RGBA8 and IA8; OpenEXR RGBAUF. Anything else is refused; the
// caller converts first (see GetWritableFormat). Where every pixel is opaque, no alpha channel is written.
bool CanWrite(FileType type, Raster::PixelFormat format) noexcept;
// The format to convert to before writing format into type: format itself when CanWrite, else the closest.
Raster::PixelFormat GetWritableFormat(FileType type, Raster::PixelFormat format) noexcept;

// Writes by extension into a temporary file beside path, renamed into place only when everything succeeded;
// otherwise the old file is left as it was and the temporary is removed.
WriteResult WriteImage(const std::filesystem::path& path, const Raster::DynamicBuffer& image,
                       const WriteOptions& options = {});
EncodeResult EncodeImage(const Raster::DynamicBuffer& image, FileType type, std::string_view name,
                         const WriteOptions& options = {});

} // namespace IO
