#pragma once
// Where the command line's file flags (--quality, --compression, --auto-orient, --output-format) meet the
// image reader and writer, and "-" as standard input or output.

#include "app/CommandLine.h"
#include "host/io/ImageIO.h"

#include <optional>
#include <string>

namespace App {

// The checked file flags.
struct FileSettings {
    std::optional<int> quality;               // 1..100
    std::string compression;                  // a compression name, lower case; empty: the writer's default
    bool autoOrient = false;                  // turn the pixels upright and reset the orientation tag
    std::optional<IO::FileType> outputFormat; // --output-format
};
// A UsageError names a flag given twice or a value that is not accepted.
FileSettings CheckFileFlags(const FileFlags& flags);

// The image at path ("-": standard input), with the reading flags applied; an Error names what is wrong.
IO::ReadResult ReadInput(const std::string& path, std::optional<Raster::PixelFormat> requested,
                         const FileSettings& settings);
// The type the output gets: --output-format, else the name's extension; a UsageError when neither says.
IO::FileType OutputType(const std::string& path, const FileSettings& settings);
// Writes image atomically to path ("-": standard output) as type, with the writing flags applied and the
// profile and metadata that came with it.
void WriteOutput(const std::string& path, IO::FileType type, const Raster::DynamicBuffer& image,
                 const FileSettings& settings, const Raster::ImageMetadata& metadata = {});

} // namespace App
