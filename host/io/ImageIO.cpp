#include "host/io/ImageIO.h"

#include "host/io/Codecs.h"
#include "host/kernel/AtomicFile.h"

#include <algorithm>
#include <cstring>
#include <exception>
#include <new>

namespace IO {

using Raster::PixelFormat;

namespace Detail {

std::string Describe(std::string_view name, std::string_view reason) {
    std::string text;
    text.reserve(name.size() + reason.size() + 2);
    text.append(name).append(": ").append(reason);
    return text;
}

std::string CheckImageSize(std::string_view name, std::uint64_t width, std::uint64_t height,
                           PixelFormat format) {
    if (width == 0 || height == 0)
        return Describe(name,
                        "image " + std::to_string(width) + " x " + std::to_string(height) + " is empty");
    const auto limit = [](std::uint64_t v) { return std::int64_t(std::min<std::uint64_t>(v, 1u << 30)); };
    if (Raster::DynamicBuffer::IsSizeAllowed(limit(width), limit(height), format)) return {};
    return Describe(name, "image " + std::to_string(width) + " x " + std::to_string(height) + " (" +
                              std::string(Raster::GetPixelFormatName(format)) + ") exceeds the limit of " +
                              std::to_string(Raster::DynamicBuffer::MaxSide) + " pixels a side and " +
                              std::to_string(Raster::DynamicBuffer::MaxStorageBytes >> 30) +
                              " GiB of pixel data");
}

bool AppendBytes(std::vector<std::byte>& out, const void* data, std::size_t size) noexcept {
    try {
        const auto* bytes = static_cast<const std::byte*>(data);
        out.insert(out.end(), bytes, bytes + size);
        return true;
    } catch (...) {
        return false;
    }
}

bool IsOpaque(const Raster::DynamicBuffer& image) noexcept {
    const PixelFormat format = image.GetFormat();
    const int components = Raster::GetBytesPerPixel(format) / Raster::GetBytesPerComponent(format);
    const int alpha = components - 1; // every layer format keeps alpha last
    for (int y = 0; y < image.GetHeight(); ++y) {
        const std::byte* row = image.RowBytes(y);
        for (int x = 0; x < image.GetWidth(); ++x) {
            const std::byte* p = row + std::size_t(x) * std::size_t(image.GetBytesPerPixel());
            switch (Raster::GetBytesPerComponent(format)) {
            case 1:
                if (std::uint8_t(p[alpha]) != 0xFF) return false;
                break;
            case 2: {
                std::uint16_t v;
                std::memcpy(&v, p + alpha * 2, 2);
                if (v != 0xFFFF) return false;
                break;
            }
            default: {
                float v;
                std::memcpy(&v, p + alpha * 4, 4);
                if (v != 1.0f) return false;
                break;
            }
            }
        }
    }
    return true;
}

std::string_view GetProfileColourSpace(std::span<const std::byte> profile) noexcept {
    if (profile.size() < 132) return {}; // an ICC header is 128 bytes, a tag count follows
    return std::string_view(reinterpret_cast<const char*>(profile.data()) + 16, 4);
}

bool ProfileFits(std::span<const std::byte> profile, PixelFormat format) noexcept {
    const std::string_view space = GetProfileColourSpace(profile);
    switch (format) {
    case PixelFormat::RGBA8:
    case PixelFormat::RGBA16:
    case PixelFormat::RGBAUF:
        return space == "RGB ";
    case PixelFormat::IA8:
    case PixelFormat::IA16:
        return space == "GRAY";
    case PixelFormat::CMYKA8:
        return space == "CMYK";
    default:
        return false;
    }
}

Kernel::Counted<Raster::DynamicBuffer> Upright(Kernel::Counted<Raster::DynamicBuffer> stored,
                                               int orientation) {
    if (orientation <= 1 || orientation > 8 || !stored) return stored;
    const int width = stored->GetWidth();
    const int height = stored->GetHeight();
    const bool swap = orientation >= 5;
    const int outWidth = swap ? height : width;
    const int outHeight = swap ? width : height;
    auto upright = Raster::DynamicBuffer::Create(outWidth, outHeight, stored->GetFormat());
    if (!upright) return upright;
    const std::size_t pixel = std::size_t(stored->GetBytesPerPixel());
    // For each upright position, the stored row and column: whether they run backwards, and whether the
    // upright x walks the stored rows (5..8) or the stored columns (1..4).
    const bool mirrorX = orientation == 2 || orientation == 3 || orientation == 6 || orientation == 7;
    const bool mirrorY = orientation == 3 || orientation == 4 || orientation == 7 || orientation == 8;
    for (int y = 0; y < outHeight; ++y) {
        std::byte* to = upright->RowBytes(y);
        const int v = mirrorY ? outHeight - 1 - y : y;
        for (int x = 0; x < outWidth; ++x) {
            const int u = mirrorX ? outWidth - 1 - x : x;
            const int row = swap ? u : v;
            const int column = swap ? v : u;
            std::memcpy(to + std::size_t(x) * pixel, stored->RowBytes(row) + std::size_t(column) * pixel,
                        pixel);
        }
    }
    return upright;
}

} // namespace Detail

namespace {

// Files above this are refused outright: no image within the pixel limit needs more, even uncompressed.
constexpr std::size_t MaxFileBytes = std::size_t(4) << 30;

constexpr std::string_view NotAnImage = "not a PNG, JPEG, TIFF, WebP, AVIF, HEIC or OpenEXR file";

std::string Lower(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(),
                   [](char c) { return c >= 'A' && c <= 'Z' ? char(c - 'A' + 'a') : c; });
    return text;
}

std::string FailureText(std::string_view name, const std::exception& e) {
    if (dynamic_cast<const std::bad_alloc*>(&e)) return Detail::Describe(name, "out of memory");
    return Detail::Describe(name, std::string("internal error: ") + e.what());
}

} // namespace

std::string_view GetFileTypeName(FileType type) noexcept {
    switch (type) {
    case FileType::PNG:
        return "PNG";
    case FileType::JPEG:
        return "JPEG";
    case FileType::TIFF:
        return "TIFF";
    case FileType::WebP:
        return "WebP";
    case FileType::AVIF:
        return "AVIF";
    case FileType::HEIC:
        return "HEIC";
    case FileType::EXR:
        break;
    }
    return "OpenEXR";
}

std::optional<FileType> DetectFileType(std::span<const std::byte> head) noexcept {
    auto at = [&](std::size_t offset, std::initializer_list<unsigned char> magic) {
        if (head.size() < offset + magic.size()) return false;
        std::size_t i = offset;
        for (unsigned char m : magic)
            if (head[i++] != std::byte(m)) return false;
        return true;
    };
    auto starts = [&](std::initializer_list<unsigned char> magic) { return at(0, magic); };
    if (starts({0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A})) return FileType::PNG;
    if (starts({0xFF, 0xD8, 0xFF})) return FileType::JPEG;
    // Classic TIFF (42) and BigTIFF (43), in either byte order.
    if (starts({'I', 'I', 42, 0}) || starts({'M', 'M', 0, 42}) || starts({'I', 'I', 43, 0}) ||
        starts({'M', 'M', 0, 43}))
        return FileType::TIFF;
    if (starts({'R', 'I', 'F', 'F'}) && at(8, {'W', 'E', 'B', 'P'})) return FileType::WebP;
    if (starts({0x76, 0x2F, 0x31, 0x01})) return FileType::EXR;
    // HEIF: an ftyp box whose major or compatible brands name AV1 (AVIF) or HEVC (HEIC) still images.
    if (at(4, {'f', 't', 'y', 'p'}) && head.size() >= 16) {
        std::uint32_t boxSize = 0;
        for (int i = 0; i < 4; ++i)
            boxSize = (boxSize << 8) | std::uint32_t(head[std::size_t(i)]);
        const std::size_t end = std::min<std::size_t>(head.size(), boxSize);
        bool hevc = false;
        for (std::size_t offset = 8; offset + 4 <= end; offset += offset == 8 ? 8 : 4) {
            const std::string_view brand(reinterpret_cast<const char*>(head.data()) + offset, 4);
            if (brand == "avif" || brand == "avis") return FileType::AVIF;
            if (brand == "heic" || brand == "heix" || brand == "heim" || brand == "heis" || brand == "hevc" ||
                brand == "hevx" || brand == "mif1" || brand == "msf1")
                hevc = true;
        }
        if (hevc) return FileType::HEIC;
    }
    return std::nullopt;
}

std::optional<FileType> GetFileTypeForName(std::string_view name) {
    const std::string word = Lower(std::string(name));
    if (word == "png") return FileType::PNG;
    if (word == "jpg" || word == "jpeg") return FileType::JPEG;
    if (word == "tif" || word == "tiff") return FileType::TIFF;
    if (word == "webp") return FileType::WebP;
    if (word == "avif") return FileType::AVIF;
    if (word == "heic" || word == "heif") return FileType::HEIC;
    if (word == "exr") return FileType::EXR;
    return std::nullopt;
}

std::optional<FileType> GetFileTypeForExtension(const std::filesystem::path& path) {
    const std::string extension = path.extension().string();
    if (extension.size() < 2 || extension[0] != '.') return std::nullopt;
    return GetFileTypeForName(std::string_view(extension).substr(1));
}

std::string DescribeFileExtensions() {
    return ".png, .jpg, .jpeg, .tif, .tiff, .webp, .avif, .heic, .heif or .exr";
}

std::vector<std::string_view> GetCompressionNames(FileType type) {
    switch (type) {
    case FileType::PNG:
        return {"none", "fast", "default", "best"};
    case FileType::TIFF:
        return {"none", "deflate", "lzw", "packbits", "zstd"};
    default:
        return {};
    }
}

ReadResult DecodeImage(std::span<const std::byte> data, std::string_view name,
                       std::optional<PixelFormat> requested, const ReadOptions& options) {
    ReadResult result;
    try {
        if (data.empty()) {
            result.error = Detail::Describe(name, "empty file, " + std::string(NotAnImage));
            return result;
        }
        const std::optional<FileType> type = DetectFileType(data);
        if (!type) {
            result.error = Detail::Describe(name, NotAnImage);
            return result;
        }
        switch (*type) {
        case FileType::PNG:
            result = Detail::DecodePng(data, name, requested);
            break;
        case FileType::JPEG:
            result = Detail::DecodeJpeg(data, name, requested);
            break;
        case FileType::TIFF:
            result = Detail::DecodeTiff(data, name);
            break;
        case FileType::WebP:
            result = Detail::DecodeWebp(data, name);
            break;
        case FileType::AVIF:
        case FileType::HEIC:
            result = Detail::DecodeHeif(data, name);
            break;
        case FileType::EXR:
            result = Detail::DecodeExr(data, name);
            break;
        }
        result.type = *type;
        if (!result.image) return result;
        if (*type != FileType::AVIF && *type != FileType::HEIC && *type != FileType::EXR)
            Detail::ReadMetadata(data, *type, result.metadata);
        // TIFF and HEIF pixels come out upright already, so their tag would turn them a second time.
        const bool upright = *type == FileType::TIFF || *type == FileType::AVIF || *type == FileType::HEIC;
        const int orientation = Detail::GetExifOrientation(result.metadata.exif);
        if (orientation != 1 && (upright || options.autoOrient)) {
            if (!upright) {
                result.image = Detail::Upright(std::move(result.image), orientation);
                if (!result.image) {
                    result.error = Detail::Describe(name, "out of memory");
                    return result;
                }
            }
            result.metadata.exif = Detail::ResetExifOrientation(result.metadata.exif);
        }
    } catch (const std::exception& e) {
        result.image.Reset();
        result.error = FailureText(name, e);
    } catch (...) {
        result.image.Reset();
        result.error = Detail::Describe(name, "internal error");
    }
    return result;
}

ReadResult ReadImage(const std::filesystem::path& path, std::optional<PixelFormat> requested,
                     const ReadOptions& options) {
    ReadResult result;
    std::string name;
    try {
        name = path.string();
        // Judged before opening: a folder has no bytes to read, and a device or pipe may never end.
        std::error_code ignored;
        const std::filesystem::file_status status = std::filesystem::status(path, ignored);
        if (std::filesystem::is_directory(status)) {
            result.error = Detail::Describe(name, "is a folder, not a file");
            return result;
        }
        if (std::filesystem::exists(status) && !std::filesystem::is_regular_file(status)) {
            result.error = Detail::Describe(name, "is not a regular file");
            return result;
        }
        std::string contents;
        if (auto error = Kernel::ReadWholeFile(path, contents, MaxFileBytes)) {
            result.error = std::move(*error);
            return result;
        }
        return DecodeImage(std::as_bytes(std::span(contents.data(), contents.size())), name, requested,
                           options);
    } catch (const std::exception& e) {
        result.error = FailureText(name, e);
    } catch (...) {
        result.error = Detail::Describe(name, "internal error");
    }
    return result;
}

bool CanWrite(FileType type, PixelFormat format) noexcept {
    switch (type) {
    case FileType::PNG:
        return format == PixelFormat::RGBA8 || format == PixelFormat::RGBA16 || format == PixelFormat::IA8 ||
               format == PixelFormat::IA16;
    case FileType::JPEG:
        return format == PixelFormat::RGBA8 || format == PixelFormat::IA8 || format == PixelFormat::CMYKA8;
    case FileType::TIFF:
        return Raster::IsValidPixelFormat(format) && Raster::IsLayerFormat(format);
    case FileType::WebP:
        return format == PixelFormat::RGBA8;
    case FileType::AVIF:
    case FileType::HEIC:
        return format == PixelFormat::RGBA8 || format == PixelFormat::IA8;
    case FileType::EXR:
        return format == PixelFormat::RGBAUF;
    }
    return false;
}

PixelFormat GetWritableFormat(FileType type, PixelFormat format) noexcept {
    if (CanWrite(type, format)) return format;
    const bool grey = format == PixelFormat::IA8 || format == PixelFormat::IA16 ||
                      format == PixelFormat::MaskA8 || format == PixelFormat::MaskA16 ||
                      format == PixelFormat::MaskAF || format == PixelFormat::IntensityUF;
    const bool deep = Raster::IsValidPixelFormat(format) && Raster::GetBytesPerComponent(format) > 1;
    switch (type) {
    case FileType::PNG:
        if (grey) return deep ? PixelFormat::IA16 : PixelFormat::IA8;
        return deep ? PixelFormat::RGBA16 : PixelFormat::RGBA8;
    case FileType::JPEG:
    case FileType::AVIF:
    case FileType::HEIC:
        return grey ? PixelFormat::IA8 : PixelFormat::RGBA8;
    case FileType::WebP:
        return PixelFormat::RGBA8;
    case FileType::EXR:
        return PixelFormat::RGBAUF;
    case FileType::TIFF:
        break;
    }
    // Only the non-layer formats are left for TIFF.
    switch (format) {
    case PixelFormat::MaskA8:
        return PixelFormat::IA8;
    case PixelFormat::MaskA16:
        return PixelFormat::IA16;
    default:
        return PixelFormat::RGBAUF;
    }
}

EncodeResult EncodeImage(const Raster::DynamicBuffer& image, FileType type, std::string_view name,
                         const WriteOptions& options) {
    EncodeResult result;
    try {
        const PixelFormat format = image.GetFormat();
        if (!CanWrite(type, format)) {
            result.error = Detail::Describe(
                name, std::string(GetFileTypeName(type)) + " cannot hold " +
                          std::string(Raster::IsValidPixelFormat(format) ? Raster::GetPixelFormatName(format)
                                                                         : "unknown") +
                          " pixels; convert them to " +
                          std::string(Raster::GetPixelFormatName(GetWritableFormat(type, format))) +
                          " first");
            return result;
        }
        const bool lossy = type == FileType::JPEG || type == FileType::WebP || type == FileType::AVIF ||
                           type == FileType::HEIC;
        if (lossy && (options.quality < 1 || options.quality > 100)) {
            result.error = Detail::Describe(name, std::string(GetFileTypeName(type)) + " quality " +
                                                      std::to_string(options.quality) + " is outside 1..100");
            return result;
        }
        const std::vector<std::string_view> choices = GetCompressionNames(type);
        if (!options.compression.empty() &&
            std::find(choices.begin(), choices.end(), Lower(options.compression)) == choices.end()) {
            std::string valid;
            for (std::string_view choice : choices)
                valid.append(valid.empty() ? "" : ", ").append(choice);
            result.error = Detail::Describe(
                name, choices.empty() ? std::string(GetFileTypeName(type)) +
                                            " has no compression choices (compression \"" +
                                            options.compression + "\" given)"
                                      : std::string(GetFileTypeName(type)) + " compression \"" +
                                            options.compression + "\" is unknown; choose one of " + valid);
            return result;
        }
        const std::string compression = Lower(options.compression);
        Detail::EncodeRequest request;
        request.quality = options.quality;
        request.compression = compression;
        if (Detail::ProfileFits(options.metadata.iccProfile, format))
            request.icc = options.metadata.iccProfile;
        request.alpha = !Detail::IsOpaque(image);
        // IPTC has no block in WebP and HEIF: its author, copyright and captions travel in the XMP instead.
        Raster::ImageMetadata mirrored;
        const Raster::ImageMetadata* metadata = &options.metadata;
        if (!metadata->iptc.empty() && !Detail::HoldsIptc(type) && type != FileType::EXR) {
            mirrored = options.metadata;
            mirrored.xmp = Detail::MirrorIptcIntoXmp(options.metadata);
            mirrored.iptc.clear();
            metadata = &mirrored;
        }
        request.metadata = metadata;
        switch (type) {
        case FileType::PNG:
            result = Detail::EncodePng(image, name, request);
            break;
        case FileType::JPEG:
            result = Detail::EncodeJpeg(image, name, request);
            break;
        case FileType::TIFF:
            result = Detail::EncodeTiff(image, name, request);
            break;
        case FileType::WebP:
            result = Detail::EncodeWebp(image, name, request);
            break;
        case FileType::AVIF:
        case FileType::HEIC:
            return Detail::EncodeHeif(image, name, type, request);
        case FileType::EXR:
            return Detail::EncodeExr(image, name, request);
        }
        if (!result) return result;
        if (!metadata->exif.empty() || !metadata->xmp.empty() || !metadata->iptc.empty()) {
            if (auto error = Detail::WriteMetadata(result.bytes, type, *metadata)) {
                result.bytes.clear();
                result.error = Detail::Describe(name, *error);
            }
        }
    } catch (const std::exception& e) {
        result.bytes.clear();
        result.error = FailureText(name, e);
    } catch (...) {
        result.bytes.clear();
        result.error = Detail::Describe(name, "internal error");
    }
    return result;
}

WriteResult WriteImage(const std::filesystem::path& path, const Raster::DynamicBuffer& image,
                       const WriteOptions& options) {
    WriteResult result;
    std::string name;
    try {
        name = path.string();
        const std::optional<FileType> type = GetFileTypeForExtension(path);
        if (!type) {
            const std::string extension = path.extension().string();
            result.error = Detail::Describe(
                name, (extension.empty() ? std::string("no file extension")
                                         : "unknown image file extension \"" + extension + "\"") +
                          "; use " + DescribeFileExtensions());
            return result;
        }
        EncodeResult encoded = EncodeImage(image, *type, name, options);
        if (!encoded) {
            result.error = std::move(encoded.error);
            return result;
        }
        if (auto error = Kernel::WriteFileAtomically(path, std::span<const std::byte>(encoded.bytes)))
            result.error = std::move(*error);
    } catch (const std::exception& e) {
        result.error = FailureText(name, e);
    } catch (...) {
        result.error = Detail::Describe(name, "internal error");
    }
    return result;
}

} // namespace IO
