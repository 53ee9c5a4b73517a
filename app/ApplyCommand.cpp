// rastertools apply FILTER [--PARAM VALUE]... INPUT OUTPUT: one filter on one image, through the pixel
// pipeline on the chosen device or the processor.

#include "app/FilterArguments.h"
#include "app/Options.h"
#include "app/Progress.h"
#include "filters/Catalogue.h"
#include "host/document/TileRenderer.h"
#include "host/io/ImageIO.h"
#include "pipeline/Formats.h"
#include "pipeline/RenderJob.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstring>
#include <iomanip>
#include <iostream>
#include <optional>
#include <set>
#include <thread>

namespace App {

namespace {

struct ApplyOptions {
    std::string filter;
    std::vector<std::pair<std::string, std::string>> parameters; // --name value, in order
    std::string device;                                          // --device, empty: the environment or auto
    std::optional<int> tileSize; // --tile; by default chosen for the filter (see DefaultTileSize)
    int threads = 0;
    std::string mask;
    std::string channels;
    std::vector<std::string> files;
};

// How many times its own area a tile of this side reads (a blur's margin, a rotation's corners).
double ReadFactor(const RasterCommand& command, int tile) {
    Kernel::RectT<double> rect{0.0, 0.0, double(tile), double(tile)};
    command.PrepareInputRectangle(rect);
    if (rect.IsUnbounded()) return HUGE_VAL;
    return rect.Width() * rect.Height() / (double(tile) * double(tile));
}

// 256 pixels, doubled while that cuts what each tile reads by more than a fifth (a long motion blur would
// otherwise spend most of its time on the margins its tiles share), as long as every thread keeps two tiles.
int DefaultTileSize(const RasterCommand& command, int width, int height, int threads) {
    if (threads <= 0) threads = int(std::max(1u, std::thread::hardware_concurrency()));
    int tile = 256;
    while (tile < 4096) {
        const int next = tile * 2;
        const long tiles = long((width + next - 1) / next) * long((height + next - 1) / next);
        if (tiles < 2L * threads || !(ReadFactor(command, tile) > 1.25 * ReadFactor(command, next))) break;
        tile = next;
    }
    return tile;
}

ApplyOptions ParseArguments(const std::vector<std::string>& args) {
    ApplyOptions options;
    std::set<std::string> seen;
    for (std::size_t i = 0; i < args.size(); ++i) {
        const std::string& arg = args[i];
        if (!arg.starts_with("--")) {
            if (options.filter.empty())
                options.filter = arg;
            else
                options.files.push_back(arg);
            continue;
        }
        if (i + 1 >= args.size()) throw UsageError(QuoteExcerpt(arg) + " needs a value");
        // Which of two values was meant cannot be guessed.
        if (!seen.insert(arg).second && !IsTextFlag(options.filter, arg.substr(2)))
            throw UsageError(QuoteExcerpt(arg) + " is given more than once");
        const std::string& value = args[++i];
        if (arg == "--device")
            options.device = value;
        else if (arg == "--tile")
            options.tileSize = ParseTileSize(value);
        else if (arg == "--threads")
            options.threads = ParseThreadCount(value);
        else if (arg == "--mask")
            options.mask = value;
        else if (arg == "--channels")
            options.channels = value;
        else
            options.parameters.emplace_back(arg.substr(2), value);
    }
    if (options.filter.empty())
        throw UsageError("apply needs a filter name (for example: apply copy IN OUT)");
    if (options.files.size() != 2)
        throw UsageError("apply needs an input and an output file, after the filter name");
    return options;
}

// The selection: an 8-bit grey image whose intensity is the weight (white selects).
Kernel::Counted<Raster::DynamicBuffer> ReadMask(const std::string& path, int width, int height) {
    IO::ReadResult read = IO::ReadImage(path, Raster::PixelFormat::IA8);
    if (!read) throw Error(read.error);
    const auto& image = *read.image;
    if (image.GetFormat() != Raster::PixelFormat::IA8)
        throw Error(path + ": a mask must be an 8-bit grey image, not " +
                    std::string(Raster::GetPixelFormatName(image.GetFormat())));
    if (image.GetWidth() != width || image.GetHeight() != height)
        throw Error(path + ": the mask is " + std::to_string(image.GetWidth()) + "x" +
                    std::to_string(image.GetHeight()) + ", the output " + std::to_string(width) + "x" +
                    std::to_string(height) + "; they must be the same size");
    auto mask = Raster::DynamicBuffer::Create(width, height, Raster::PixelFormat::MaskA8);
    if (!mask) throw Error(path + ": not enough memory for the mask");
    for (int y = 0; y < height; ++y) {
        const std::uint8_t* grey = image.Row<std::uint8_t>(y);
        std::uint8_t* weights = mask->Row<std::uint8_t>(y);
        for (int x = 0; x < width; ++x)
            weights[x] = grey[2 * x];
    }
    return mask;
}

// The image in format, converted on the processor by the copy filter (the decoder only widens for free).
Kernel::Counted<Raster::DynamicBuffer> ConvertOnLoad(Kernel::Counted<Raster::DynamicBuffer> image,
                                                     Raster::PixelFormat format, const std::string& path) {
    if (image->GetFormat() == format) return image;
    const RasterTools::FilterInfo* copy = RasterTools::FindFilter("copy");
    const auto command =
        copy ? copy->makeCommand(false, {static_cast<int>(format), Kernel::PointT<double>{1.0, 1.0}})
             : nullptr;
    const auto* pipeline = dynamic_cast<const RasterTools::PipelineCommand*>(command.Get());
    auto converted = Raster::DynamicBuffer::Create(image->GetWidth(), image->GetHeight(), format);
    if (!pipeline || !converted)
        throw Error(path + ": the image could not be converted to " +
                    std::string(Raster::GetPixelFormatName(format)));
    const auto result = RasterTools::RenderImage(*pipeline, image, converted, nullptr, {});
    if (!result.complete) throw Error(path + ": " + result.error);
    return converted;
}

} // namespace

CheckedApply CheckApplyArguments(const std::vector<std::string>& args) {
    const ApplyOptions options = ParseArguments(args);
    const RasterTools::FilterInfo* filter = &RequireFilter(options.filter);
    // A filter without a format parameter of its own takes --format as the format to convert the input to
    // when it is read.
    std::optional<Raster::PixelFormat> loadFormat;
    const bool hasFormatParameter =
        std::any_of(filter->parameters.begin(), filter->parameters.end(),
                    [](const RasterTools::ParameterSpec& spec) { return spec.name == "format"; });
    std::vector<std::pair<std::string, std::string>> parameters;
    for (const auto& [name, text] : options.parameters) {
        if (name != "format" || hasFormatParameter) {
            parameters.emplace_back(name, text);
            continue;
        }
        loadFormat = Raster::ParsePixelFormat(text);
        if (!loadFormat || !Raster::IsLayerFormat(*loadFormat))
            throw UsageError("--format: " + QuoteExcerpt(text) + " is not a layer format (" +
                             LayerFormatNames() + ")");
    }
    CheckedApply checked;
    checked.command = MakeFilterCommand(*filter, false, parameters);
    if (!dynamic_cast<const RasterTools::PipelineCommand*>(checked.command.Get()))
        throw Error(options.filter + " cannot be applied from the command line yet");
    checked.loadFormat = loadFormat ? int(*loadFormat) : -1;
    checked.tileSize = options.tileSize.value_or(0);
    checked.threads = options.threads;
    return checked;
}

int RunApply(const std::vector<std::string>& args) {
    const CheckedApply checked = CheckApplyArguments(args);
    const ApplyOptions options = ParseArguments(args);
    const auto& command = checked.command;
    const auto* pipeline = dynamic_cast<const RasterTools::PipelineCommand*>(command.Get());
    const std::optional<Raster::PixelFormat> loadFormat =
        checked.loadFormat >= 0 ? std::optional(Raster::PixelFormat(checked.loadFormat)) : std::nullopt;

    const std::string& input = options.files[0];
    const std::string& output = options.files[1];
    const auto outputType = IO::GetFileTypeForExtension(output);
    if (!outputType) throw UsageError(output + ": unknown file type (use .png, .jpg, .jpeg, .tif or .tiff)");

    IO::ReadResult read = IO::ReadImage(input, loadFormat);
    if (!read) throw Error(read.error);
    const auto source = loadFormat ? ConvertOnLoad(read.image, *loadFormat, input) : read.image;
    const auto shape = pipeline->GetOutputShape(source->GetWidth(), source->GetHeight(), source->GetFormat());
    if (!IO::CanWrite(*outputType, shape.format))
        throw Error(
            output + ": " + std::string(IO::GetFileTypeName(*outputType)) + " cannot hold " +
            std::string(Raster::GetPixelFormatName(shape.format)) + " pixels (choose another --format or " +
            std::string(Raster::GetPixelFormatName(IO::GetWritableFormat(*outputType, shape.format))) + ")");

    int channelMask = -1;
    if (!options.channels.empty()) {
        const auto mask = RasterTools::ParseChannelMask(shape.format, options.channels);
        if (!mask)
            throw UsageError("--channels " + options.channels + ": not a channel mask of " +
                             std::string(Raster::GetPixelFormatName(shape.format)) +
                             " (a number, or channels named " +
                             RasterTools::DescribeChannelNames(shape.format) + ")");
        channelMask = *mask;
    }

    // Channels the write mask keeps come from the input where the output has its size and format.
    Kernel::Counted<Raster::DynamicBuffer> destination;
    if (shape.width == source->GetWidth() && shape.height == source->GetHeight() &&
        shape.format == source->GetFormat() && channelMask >= 0) {
        destination = Raster::DynamicBuffer::Create(shape.width, shape.height, shape.format);
        if (destination)
            for (int y = 0; y < shape.height; ++y)
                std::memcpy(destination->RowBytes(y), source->RowBytes(y), source->GetRowBytes());
    } else {
        destination = Raster::DynamicBuffer::Create(shape.width, shape.height, shape.format);
    }
    if (!destination)
        throw Error(output + ": a " + std::to_string(shape.width) + "x" + std::to_string(shape.height) + " " +
                    std::string(Raster::GetPixelFormatName(shape.format)) + " image is too large");

    Kernel::Counted<Raster::DynamicBuffer> mask;
    if (!options.mask.empty()) mask = ReadMask(options.mask, shape.width, shape.height);

    const RenderDevice device = FindRenderDevice(ResolveDeviceSelector(options.device));
    if (!device.IsValid()) throw UsageError(device.error);

    RasterTools::RenderJobOptions job;
    job.tileSize = options.tileSize ? *options.tileSize
                                    : DefaultTileSize(*command, shape.width, shape.height, options.threads);
    job.threads = options.threads;
    job.device = device.device;
    job.channelMask = channelMask;
    ProgressBar progress(options.filter);
    job.progress = progress.Callback();
    const auto started = std::chrono::steady_clock::now();
    const auto result = RasterTools::RenderImage(*pipeline, source, destination, mask, job);
    const std::chrono::duration<double, std::milli> renderTime = std::chrono::steady_clock::now() - started;
    progress.Finish();
    if (!result.complete) throw Error(options.filter + ": " + result.error);

    const IO::WriteResult written = IO::WriteImage(output, *destination);
    if (!written) throw Error(written.error);

    std::cout << options.filter << ": " << source->GetWidth() << "x" << source->GetHeight() << " "
              << Raster::GetPixelFormatName(source->GetFormat()) << " -> " << shape.width << "x"
              << shape.height << " " << Raster::GetPixelFormatName(shape.format) << "; " << result.deviceTiles
              << " tiles on " << (device.device ? device.device->GetIdentifier() : std::string("the device"))
              << ", " << result.processorTiles << " on the processor; rendered in " << std::fixed
              << std::setprecision(1) << renderTime.count() << " ms\n";
    return 0;
}

} // namespace App
