// The one place where command-line flags become the image reader's and writer's options.
#include "app/ImageFiles.h"

#include "app/FilterArguments.h"
#include "app/Options.h"
#include "host/kernel/AtomicFile.h"

#include <cstdio>
#include <iostream>
#include <unistd.h>

#include <algorithm>

namespace App {

namespace {

// The compression names that any writer knows, in the order the types list them.
std::vector<std::string_view> KnownCompressions() {
    std::vector<std::string_view> names;
    for (const auto type : {IO::FileType::PNG, IO::FileType::JPEG, IO::FileType::TIFF, IO::FileType::WebP,
                            IO::FileType::AVIF, IO::FileType::HEIC, IO::FileType::EXR})
        for (const auto name : IO::GetCompressionNames(type))
            if (std::find(names.begin(), names.end(), name) == names.end()) names.push_back(name);
    return names;
}

// The most a standard input may hold: the readers refuse larger files anyway.
constexpr std::size_t kMaxInputBytes = std::size_t(4) << 30;

// ---- Connection to the I/O layer's options -------------------------------------------------------------
// Everything the reader and writer are told from the command line is set here and nowhere else.
IO::WriteOptions MakeWriteOptions(const FileSettings& settings, const Raster::ImageMetadata& metadata) {
    IO::WriteOptions options;
    if (settings.quality) options.quality = *settings.quality;
    options.compression = settings.compression; // the writer refuses a name its type does not know
    options.metadata = metadata;
    return options;
}

IO::ReadResult Read(const std::string& path, std::span<const std::byte> bytes, bool fromMemory,
                    std::optional<Raster::PixelFormat> requested, const FileSettings& settings) {
    const IO::ReadOptions options{.autoOrient = settings.autoOrient};
    return fromMemory ? IO::DecodeImage(bytes, path, requested, options)
                      : IO::ReadImage(path, requested, options);
}
// ---------------------------------------------------------------------------------------------------------

} // namespace

FileSettings CheckFileFlags(const FileFlags& flags) {
    Once(flags.quality, "--quality");
    Once(flags.compression, "--compression");
    Once(flags.outputFormat, "--output-format");
    FileSettings settings;
    if (flags.quality.Given()) settings.quality = ParseCount("--quality", flags.quality.Value(), 1, 100);
    if (flags.compression.Given()) {
        const std::string& name = flags.compression.Value();
        std::string known;
        for (const auto compression : KnownCompressions()) {
            if (name == compression) settings.compression = name;
            known += (known.empty() ? "" : ", ") + std::string(compression);
        }
        if (settings.compression.empty())
            throw UsageError("--compression: " + QuoteExcerpt(name) + " is not a compression (" + known +
                             ")");
    }
    if (flags.outputFormat.Given()) {
        const std::string& name = flags.outputFormat.Value();
        settings.outputFormat = IO::GetFileTypeForName(name);
        if (!settings.outputFormat)
            throw UsageError("--output-format: " + QuoteExcerpt(name) + " is not a file type (" +
                             IO::DescribeFileExtensions() + ", without the dot)");
    }
    settings.autoOrient = flags.autoOrient;
    return settings;
}

IO::ReadResult ReadInput(const std::string& path, std::optional<Raster::PixelFormat> requested,
                         const FileSettings& settings) {
    if (path != "-") return Read(path, {}, false, requested, settings);
    std::vector<std::byte> bytes;
    std::byte buffer[1 << 16];
    for (ssize_t n; (n = ::read(STDIN_FILENO, buffer, sizeof buffer)) != 0;) {
        if (n < 0) {
            if (errno == EINTR) continue;
            throw Error("standard input: cannot be read");
        }
        if (bytes.size() + std::size_t(n) > kMaxInputBytes) throw Error("standard input: larger than 4 GiB");
        bytes.insert(bytes.end(), buffer, buffer + n);
    }
    if (bytes.empty()) throw Error("standard input: empty (pipe an image into rastertools)");
    return Read("standard input", bytes, true, requested, settings);
}

IO::FileType OutputType(const std::string& path, const FileSettings& settings) {
    if (settings.outputFormat) return *settings.outputFormat;
    if (path == "-") throw UsageError("writing to standard output needs --output-format (png, jpeg, tiff)");
    if (const auto type = IO::GetFileTypeForExtension(path)) return *type;
    throw UsageError(EscapeBytes(path) +
                     ": unknown file type (use .png, .jpg, .jpeg, .tif or .tiff, or --output-format)");
}

void WriteOutput(const std::string& path, IO::FileType type, const Raster::DynamicBuffer& image,
                 const FileSettings& settings, const Raster::ImageMetadata& metadata) {
    const IO::WriteOptions options = MakeWriteOptions(settings, metadata);
    if (path != "-" && IO::GetFileTypeForExtension(path) == type) {
        if (const IO::WriteResult written = IO::WriteImage(path, image, options); !written)
            throw Error(written.error);
        return;
    }
    const IO::EncodeResult encoded =
        IO::EncodeImage(image, type, path == "-" ? "standard output" : path, options);
    if (!encoded) throw Error(encoded.error);
    if (path != "-") {
        if (auto error = Kernel::WriteFileAtomically(path, encoded.bytes)) throw Error(*error);
        return;
    }
    std::cout.flush();
    for (std::size_t done = 0; done < encoded.bytes.size();) {
        const ssize_t n = ::write(STDOUT_FILENO, encoded.bytes.data() + done, encoded.bytes.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) throw Error("standard output: cannot be written");
        done += std::size_t(n);
    }
}

} // namespace App
