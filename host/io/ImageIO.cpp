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

} // namespace Detail

namespace {

// Files above this are refused outright: no image within the pixel limit needs more, even uncompressed.
constexpr std::size_t MaxFileBytes = std::size_t(4) << 30;

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
        break;
    }
    return "TIFF";
}

std::optional<FileType> DetectFileType(std::span<const std::byte> head) noexcept {
    auto starts = [&](std::initializer_list<unsigned char> magic) {
        if (head.size() < magic.size()) return false;
        std::size_t i = 0;
        for (unsigned char m : magic)
            if (head[i++] != std::byte(m)) return false;
        return true;
    };
    if (starts({0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A})) return FileType::PNG;
    if (starts({0xFF, 0xD8, 0xFF})) return FileType::JPEG;
    // Classic TIFF (42) and BigTIFF (43), in either byte order.
    if (starts({'I', 'I', 42, 0}) || starts({'M', 'M', 0, 42}) || starts({'I', 'I', 43, 0}) ||
        starts({'M', 'M', 0, 43}))
        return FileType::TIFF;
    return std::nullopt;
}

std::optional<FileType> GetFileTypeForExtension(const std::filesystem::path& path) {
    const std::string extension = Lower(path.extension().string());
    if (extension == ".png") return FileType::PNG;
    if (extension == ".jpg" || extension == ".jpeg") return FileType::JPEG;
    if (extension == ".tif" || extension == ".tiff") return FileType::TIFF;
    return std::nullopt;
}

ReadResult DecodeImage(std::span<const std::byte> data, std::string_view name,
                       std::optional<PixelFormat> requested) {
    ReadResult result;
    try {
        if (data.empty()) {
            result.error = Detail::Describe(name, "empty file, not a PNG, JPEG or TIFF file");
            return result;
        }
        const std::optional<FileType> type = DetectFileType(data);
        if (!type) {
            result.error = Detail::Describe(name, "not a PNG, JPEG or TIFF file");
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
        }
        result.type = *type;
    } catch (const std::exception& e) {
        result.image.Reset();
        result.error = FailureText(name, e);
    } catch (...) {
        result.image.Reset();
        result.error = Detail::Describe(name, "internal error");
    }
    return result;
}

ReadResult ReadImage(const std::filesystem::path& path, std::optional<PixelFormat> requested) {
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
        return DecodeImage(std::as_bytes(std::span(contents.data(), contents.size())), name, requested);
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
        return format == PixelFormat::RGBA8 || format == PixelFormat::IA8;
    case FileType::TIFF:
        return Raster::IsValidPixelFormat(format) && Raster::IsLayerFormat(format);
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
        return grey ? PixelFormat::IA8 : PixelFormat::RGBA8;
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
        switch (type) {
        case FileType::PNG:
            return Detail::EncodePng(image, name);
        case FileType::JPEG:
            if (options.jpegQuality < 1 || options.jpegQuality > 100) {
                result.error = Detail::Describe(name, "JPEG quality " + std::to_string(options.jpegQuality) +
                                                          " is outside 1..100");
                return result;
            }
            return Detail::EncodeJpeg(image, name, options.jpegQuality);
        case FileType::TIFF:
            return Detail::EncodeTiff(image, name);
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
                          "; use .png, .jpg, .jpeg, .tif or .tiff");
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
