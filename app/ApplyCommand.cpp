// rastertools apply FILTER [--PARAM VALUE]... INPUT OUTPUT: one filter on one image, through the pixel
// pipeline on the chosen device or the processor.

#include "app/ChainRender.h"
#include "app/CommandLine.h"
#include "app/FilterArguments.h"
#include "app/ImageFiles.h"
#include "app/Options.h"
#include "app/Progress.h"
#include "filters/Catalogue.h"
#include "host/document/TileRenderer.h"
#include "host/io/ImageIO.h"
#include "host/raster/ICCManager.h"
#include "pipeline/Formats.h"
#include "pipeline/RenderJob.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstring>
#include <filesystem>
#include <iomanip>
#include <iostream>
#include <map>
#include <optional>
#include <set>
#include <sstream>
#include <thread>

namespace App {

namespace {

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

// The selection: an 8-bit grey image whose intensity is the weight (white selects).
Kernel::Counted<Raster::DynamicBuffer> ReadMask(const std::string& path, int width, int height) {
    IO::ReadResult read = ReadInput(path, Raster::PixelFormat::IA8, {});
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
                                                     Raster::PixelFormat format, const std::string& path,
                                                     const std::vector<std::byte>& profile) {
    if (image->GetFormat() == format) return image;
    // A tagged picture changes colour model through its own profile.
    Raster::ColourProfiles profiles;
    profiles.Add(profile);
    if (std::string why;
        Raster::ICCManager::NeedsProfileConversion(image->GetFormat(), profiles, format, profiles)) {
        if (auto managed = Raster::ICCManager::ConvertImage(*image, profiles, format, profiles, why))
            return managed;
        throw Error(path + ": " + why);
    }
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

// Everything apply was told, checked.
struct ApplyPlan {
    CheckedApply checked;
    std::string device, mask, channels;
    FileSettings files;
    std::vector<std::string> inputs;
    std::string output; // a file, "-", a folder ending in '/' or a pattern with {stem}, {name} or {ext}
    bool named = false; // -o given
    bool help = false;  // help was asked for and printed
};

const std::set<std::string, std::less<>> kValueOptions = {
    "--device", "--tile",   "--threads",       "--mask",    "--channels",   "--format",
    "-o",       "--output", "--output-format", "--quality", "--compression"};

// Where the filter's name stands in one link of the chain: the first word that is not an option or an
// option's value (an unknown --name takes a value, as parameters do).
std::optional<std::size_t> FindFilterWord(const std::vector<std::string>& words) {
    for (std::size_t i = 0; i < words.size(); ++i) {
        const std::string& word = words[i];
        if (word == "-" || !word.starts_with("-")) return i;
        if (word.find('=') != std::string::npos || word == "--auto-orient" || word == "--help" ||
            word == "-h")
            continue;
        ++i; // its value
    }
    return std::nullopt;
}

void Append(TextOption& into, const TextOption& from) {
    into.values.insert(into.values.end(), from.values.begin(), from.values.end());
}

ApplyPlan Plan(const std::vector<std::string>& args, bool printHelp) {
    std::vector<std::vector<std::string>> links(1);
    for (const auto& arg : args)
        if (arg == ":")
            links.emplace_back();
        else
            links.back().push_back(arg);

    ApplyPlan plan;
    ApplyFlags all;
    std::optional<Raster::PixelFormat> loadFormat;
    for (std::size_t link = 0; link < links.size(); ++link) {
        const auto& words = links[link];
        const bool help = std::any_of(words.begin(), words.end(), [](const std::string& word) {
            return word == "--help" || word == "-h";
        });
        const auto at = FindFilterWord(words);
        if (!at) {
            if (help && printHelp) {
                std::cout << CommandHelp("apply");
                plan.help = true;
                return plan;
            }
            if (link == 0) throw UsageError("apply needs a filter name (for example: apply copy IN OUT)");
            throw UsageError("a \":\" must be followed by a filter name (for example: twirl : unsharpmask)");
        }
        const RasterTools::FilterInfo& filter = RequireFilter(words[*at]);
        if (help) {
            if (!printHelp) throw UsageError("--help asks for help, not for work");
            std::cout << FilterHelp(filter);
            plan.help = true;
            return plan;
        }
        const bool hasFormat =
            std::any_of(filter.parameters.begin(), filter.parameters.end(),
                        [](const RasterTools::ParameterSpec& spec) { return spec.name == "format"; });
        ApplyFlags flags;
        auto app = MakeApplyApp(flags, !hasFormat);
        app->allow_extras();
        std::vector<TextOption> values;
        AddFilterParameters(*app, filter, values);
        std::vector<std::string> rest(words);
        rest.erase(rest.begin() + std::ptrdiff_t(*at));
        ParseArguments(*app, rest);
        for (const auto& extra : app->remaining())
            if (extra.starts_with("-") && extra != "-") {
                const std::string known = ParameterFlags(filter);
                throw UsageError(std::string(filter.name) + " has no parameter " +
                                 EscapeBytes(std::string_view(extra).substr(
                                     0, std::min<std::size_t>(40, extra.find('=')))) +
                                 " (it takes " + (known.empty() ? std::string("none") : known) + ")");
            }
        auto command = MakeFilterCommand(filter, false, FilterParameterTexts(filter, values));
        if (!dynamic_cast<const RasterTools::PipelineCommand*>(command.Get()))
            throw Error(std::string(filter.name) + " cannot be applied from the command line yet");
        plan.checked.chain.push_back(command);
        plan.checked.names.emplace_back(filter.name);

        if (flags.format.Given()) {
            Once(flags.format, "--format");
            if (loadFormat || link > 0)
                throw UsageError("--format converts the input, so it belongs to the first filter of a chain");
            loadFormat = Raster::ParsePixelFormat(flags.format.Value());
            if (!loadFormat || !Raster::IsLayerFormat(*loadFormat))
                throw UsageError("--format: " + QuoteExcerpt(flags.format.Value()) +
                                 " is not a layer format (" + LayerFormatNames() + ")");
        }
        Append(all.render.device, flags.render.device);
        Append(all.render.tile, flags.render.tile);
        Append(all.render.threads, flags.render.threads);
        Append(all.mask, flags.mask);
        Append(all.channels, flags.channels);
        Append(all.output, flags.output);
        Append(all.files.quality, flags.files.quality);
        Append(all.files.compression, flags.files.compression);
        Append(all.files.outputFormat, flags.files.outputFormat);
        all.files.autoOrient = all.files.autoOrient || flags.files.autoOrient;
        plan.inputs.insert(plan.inputs.end(), flags.positional.begin(), flags.positional.end());
    }
    Once(all.mask, "--mask");
    Once(all.channels, "--channels");
    Once(all.output, "--output");
    plan.checked.command = plan.checked.chain.front();
    plan.checked.loadFormat = loadFormat ? int(*loadFormat) : -1;
    const RenderSettings render = CheckRenderFlags(all.render);
    plan.checked.tileSize = render.tileSize;
    plan.checked.threads = render.threads;
    plan.device = render.device;
    if (all.mask.Given()) plan.mask = all.mask.Value();
    if (all.channels.Given()) plan.channels = all.channels.Value();
    plan.files = CheckFileFlags(all.files);

    if (all.output.Given()) {
        plan.named = true;
        plan.output = all.output.Value();
        if (plan.inputs.empty()) throw UsageError("apply needs an input file, after the filter name");
    } else {
        if (plan.inputs.size() != 2)
            throw UsageError(
                plan.inputs.size() > 2
                    ? "apply takes one input and one output, or several inputs with -o FOLDER/ or "
                      "-o '{stem}-new.png'"
                    : "apply needs an input and an output file, after the filter name");
        plan.output = plan.inputs.back();
        plan.inputs.pop_back();
    }
    return plan;
}

bool IsPattern(const std::string& output) {
    return output.find("{stem}") != std::string::npos || output.find("{name}") != std::string::npos ||
           output.find("{ext}") != std::string::npos;
}

bool IsFolder(const std::string& output) {
    std::error_code error;
    return output.ends_with('/') || std::filesystem::is_directory(output, error);
}

// The output file of input: the folder's file of the same name, or the pattern filled in.
std::string OutputFor(const std::string& input, const std::string& output) {
    const std::filesystem::path path(input);
    if (IsFolder(output)) return (std::filesystem::path(output) / path.filename()).string();
    if (!IsPattern(output)) return output;
    std::string ext = path.extension().string();
    if (!ext.empty()) ext.erase(0, 1);
    std::string result;
    for (std::size_t i = 0; i < output.size();) {
        bool replaced = false;
        for (const auto& [key, value] : {std::pair<std::string, std::string>{"{stem}", path.stem().string()},
                                         {"{name}", path.filename().string()},
                                         {"{ext}", ext}})
            if (output.compare(i, key.size(), key) == 0) {
                result += value;
                i += key.size();
                replaced = true;
                break;
            }
        if (!replaced) result += output[i++];
    }
    // A pattern without a folder puts each result beside its input.
    if (output.find('/') == std::string::npos && path.has_parent_path())
        return (path.parent_path() / result).string();
    return result;
}

struct FileReport {
    std::string line; // what was done
    bool unchanged = false;
};

FileReport ProcessFile(const ApplyPlan& plan, const RenderDevice& device, const std::string& input,
                       const std::string& output) {
    const auto& checked = plan.checked;
    const std::optional<Raster::PixelFormat> loadFormat =
        checked.loadFormat >= 0 ? std::optional(Raster::PixelFormat(checked.loadFormat)) : std::nullopt;
    const IO::FileType outputType = OutputType(output, plan.files);
    std::string label;
    for (const auto& name : checked.names)
        label += (label.empty() ? "" : " : ") + name;

    ProgressBar progress(label);
    IO::ReadResult read = ReadInput(input, loadFormat, plan.files);
    if (!read) throw Error(read.error);
    const std::string inputName = input == "-" ? "standard input" : input;
    const auto source =
        loadFormat ? ConvertOnLoad(read.image, *loadFormat, inputName, read.metadata.iccProfile) : read.image;
    progress.Update(0.05);

    // Every link's output shape first, so that an output the file cannot hold is refused before the work.
    std::vector<RasterTools::OutputShape> shapes;
    int width = source->GetWidth(), height = source->GetHeight();
    Raster::PixelFormat format = source->GetFormat();
    for (const auto& command : checked.chain) {
        const auto* pipeline = dynamic_cast<const RasterTools::PipelineCommand*>(command.Get());
        shapes.push_back(pipeline->GetOutputShape(width, height, format));
        width = shapes.back().width;
        height = shapes.back().height;
        format = shapes.back().format;
    }
    const std::string outputName = output == "-" ? "standard output" : output;
    if (!IO::CanWrite(outputType, format))
        throw Error(outputName + ": " + std::string(IO::GetFileTypeName(outputType)) + " cannot hold " +
                    std::string(Raster::GetPixelFormatName(format)) + " pixels (choose another --format or " +
                    std::string(Raster::GetPixelFormatName(IO::GetWritableFormat(outputType, format))) + ")");

    std::vector<ChainLink> links;
    for (std::size_t i = 0; i < checked.chain.size(); ++i) {
        const auto& command = checked.chain[i];
        const auto& shape = shapes[i];
        ChainLink link;
        link.command = command.Get();
        link.pipeline = dynamic_cast<const RasterTools::PipelineCommand*>(command.Get());
        link.shape = shape;
        if (!plan.channels.empty()) {
            const auto mask = RasterTools::ParseChannelMask(shape.format, plan.channels);
            if (!mask)
                throw UsageError("--channels " + QuoteExcerpt(plan.channels) + ": not a channel mask of " +
                                 std::string(Raster::GetPixelFormatName(shape.format)) +
                                 " (a number, or channels named " +
                                 RasterTools::DescribeChannelNames(shape.format) + ")");
            link.channelMask = *mask;
        }
        if (!plan.mask.empty()) link.mask = ReadMask(plan.mask, shape.width, shape.height);
        link.tileSize = checked.tileSize
                            ? checked.tileSize
                            : DefaultTileSize(*command, shape.width, shape.height, checked.threads);
        links.push_back(std::move(link));
    }
    ChainOptions chain;
    chain.threads = checked.threads;
    chain.device = device.device;
    chain.progress = [&progress](double fraction) { progress.Update(0.1 + 0.8 * fraction); };
    const auto started = std::chrono::steady_clock::now();
    const ChainResult rendered = RenderChain(source, links, chain);
    if (!rendered.image)
        throw Error(rendered.filterFailed ? checked.names[rendered.failedLink] + ": " + rendered.error
                                          : outputName + ": " + rendered.error);
    const Kernel::Counted<Raster::DynamicBuffer> current = rendered.image;
    const long deviceTiles = rendered.deviceTiles, processorTiles = rendered.processorTiles;
    const std::chrono::duration<double, std::milli> renderTime = std::chrono::steady_clock::now() - started;

    FileReport report;
    if (current->GetWidth() == source->GetWidth() && current->GetHeight() == source->GetHeight() &&
        current->GetFormat() == source->GetFormat()) {
        report.unchanged = true;
        for (int y = 0; y < current->GetHeight() && report.unchanged; ++y)
            report.unchanged =
                std::memcmp(current->RowBytes(y), source->RowBytes(y), source->GetRowBytes()) == 0;
    }
    WriteOutput(output, outputType, *current, plan.files, read.metadata);
    progress.Update(1.0);
    progress.Finish();

    std::ostringstream line;
    line << label << ": " << (input == "-" ? std::string("standard input") : input) << " "
         << source->GetWidth() << "x" << source->GetHeight() << " "
         << Raster::GetPixelFormatName(source->GetFormat()) << " -> " << outputName << " "
         << current->GetWidth() << "x" << current->GetHeight() << " "
         << Raster::GetPixelFormatName(current->GetFormat()) << "; " << deviceTiles << " tiles on "
         << (device.device ? device.device->GetIdentifier() : std::string("the device")) << ", "
         << processorTiles << " on the processor; rendered in " << std::fixed << std::setprecision(1)
         << renderTime.count() << " ms";
    report.line = line.str();
    return report;
}

} // namespace

CheckedApply CheckApplyArguments(const std::vector<std::string>& args) {
    return Plan(args, false).checked;
}

int RunApply(const std::vector<std::string>& args) {
    const ApplyPlan plan = Plan(args, true);
    if (plan.help) return 0;
    const RenderDevice device = FindRenderDevice(ResolveDeviceSelector(plan.device));
    if (!device.IsValid()) throw UsageError(device.error);

    // Every output decided before any work, so that a typing error costs nothing and no two inputs overwrite
    // one output.
    const bool batch = plan.inputs.size() > 1;
    if (batch && !IsFolder(plan.output) && !IsPattern(plan.output))
        throw UsageError("several inputs need -o FOLDER/ or a pattern such as -o '{stem}-new.png', not " +
                         QuoteExcerpt(plan.output));
    std::vector<std::string> outputs;
    std::map<std::string, std::string> writers;
    for (const auto& input : plan.inputs) {
        if (batch && input == "-") throw UsageError("\"-\" (standard input) can only be the one input");
        if (plan.named && (IsFolder(plan.output) || IsPattern(plan.output)) && input == "-")
            throw UsageError("standard input has no name for -o " + QuoteExcerpt(plan.output) + " to use");
        outputs.push_back(plan.named ? OutputFor(input, plan.output) : plan.output);
        OutputType(outputs.back(), plan.files);
        const auto [at, inserted] = writers.emplace(outputs.back(), input);
        if (!inserted)
            throw UsageError(QuoteExcerpt(at->second) + " and " + QuoteExcerpt(input) +
                             " would both be written to " + QuoteExcerpt(outputs.back()));
    }
    if (batch && IsFolder(plan.output)) {
        std::error_code error;
        std::filesystem::create_directories(plan.output, error);
        if (error) throw Error(plan.output + ": cannot make the folder (" + error.message() + ")");
    }

    int failed = 0;
    for (std::size_t i = 0; i < plan.inputs.size(); ++i) {
        try {
            const FileReport report = ProcessFile(plan, device, plan.inputs[i], outputs[i]);
            // Standard output may carry the picture: the report goes to standard error then.
            if (!IsQuiet()) (outputs[i] == "-" ? std::cerr : std::cout) << report.line << '\n';
            if (report.unchanged && !IsQuiet())
                std::cerr << "rastertools: note: " << plan.inputs[i]
                          << ": these parameters change no pixel; the output is a copy of the input\n";
        } catch (const UsageError&) {
            throw;
        } catch (const std::exception& error) {
            // One bad file in a batch does not stop the others.
            if (!batch) throw;
            ++failed;
            std::cerr << "rastertools: " << error.what() << '\n';
        }
    }
    if (failed) {
        std::cerr << "rastertools: " << failed << " of " << plan.inputs.size() << " files failed\n";
        return kExitFailure;
    }
    return 0;
}

} // namespace App
