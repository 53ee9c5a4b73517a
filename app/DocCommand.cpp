// rastertools doc: layered documents from the command line. Every subcommand that changes a document locks
// it, loads it, changes it in memory and writes it back atomically before letting go, so an error leaves the
// file as it was and concurrent commands on one document each see the others' changes.

#include "app/BrushVerbs.h"
#include "app/CommandLine.h"
#include "app/FilterArguments.h"
#include "app/ImageFiles.h"
#include "app/Options.h"
#include "app/Progress.h"
#include "filters/Catalogue.h"
#include "host/document/DocumentFile.h"
#include "host/document/DocumentRender.h"
#include "host/document/PixelEffect.h"
#include "host/document/TileRenderer.h"
#include "host/io/ImageIO.h"
#include "host/kernel/AtomicFile.h"
#include "host/raster/device/Hardware.h"
#include "pipeline/RenderJob.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <optional>
#include <set>

namespace App {

namespace {

constexpr std::string_view kDocUsage =
    "usage: rastertools doc new IMAGE -o DOC [--format F] [--force]\n"
    "       rastertools doc filter DOC FILTER [--PARAM VALUE]... [--live] [--device D] [--tile N] "
    "[--threads N]\n"
    "       rastertools doc render DOC OUTPUT [--format F] [--device D] [--tile N] [--threads N]\n"
    "       rastertools doc show DOC\n"
    "       rastertools doc undo DOC | doc redo DOC\n"
    "       rastertools doc paint DOC --stroke X0,Y0 [X1,Y1]... [--colour R,G,B] [--size N]\n"
    "                             [--erase | --from-snapshot [--snapshot N]] [--device D]\n"
    "       (rastertools doc SUBCOMMAND --help says more)";

// A doc subcommand's arguments, parsed; filter is set for doc filter.
struct DocArguments {
    DocFlags flags;
    const RasterTools::FilterInfo* filter = nullptr;
    std::vector<std::pair<std::string, std::string>> parameters; // the filter's, as typed
    RenderSettings render;
    bool help = false;
};

// Where doc filter's FILTER stands: the second word that is not an option or an option's value.
std::optional<std::size_t> FindFilterWord(const std::vector<std::string>& words) {
    int bare = 0;
    for (std::size_t i = 0; i < words.size(); ++i) {
        const std::string& word = words[i];
        if (word == "-" || !word.starts_with("-")) {
            if (++bare == 2) return i;
            continue;
        }
        if (word.find('=') == std::string::npos && word != "--live" && word != "--help" && word != "-h") ++i;
    }
    return std::nullopt;
}

DocArguments ParseDoc(const std::string& subcommand, std::vector<std::string> words) {
    DocArguments arguments;
    auto app = MakeDocApp(subcommand, arguments.flags);
    app->allow_extras();
    std::vector<TextOption> values;
    std::string filterWord;
    const bool help = std::any_of(words.begin(), words.end(),
                                  [](const std::string& word) { return word == "--help" || word == "-h"; });
    if (subcommand == "filter") {
        if (const auto at = FindFilterWord(words)) {
            arguments.filter = &RequireFilter(words[*at]);
            if (help) {
                std::cout << FilterHelp(*arguments.filter);
                arguments.help = true;
                return arguments;
            }
            AddFilterParameters(*app, *arguments.filter, values);
            filterWord = words[*at];
            words.erase(words.begin() + std::ptrdiff_t(*at));
        }
    }
    if (ParseArguments(*app, words)) {
        arguments.help = true;
        return arguments;
    }
    if (arguments.filter) {
        // The filter's name was taken out before parsing; it goes back to its place after the document's.
        auto& positional = arguments.flags.positional;
        positional.insert(positional.begin() + std::ptrdiff_t(std::min<std::size_t>(1, positional.size())),
                          filterWord);
    }
    for (const auto& extra : app->remaining())
        if (extra.starts_with("-") && extra != "-") {
            const std::string name =
                EscapeBytes(std::string_view(extra).substr(0, std::min<std::size_t>(40, extra.find('='))));
            if (arguments.filter) {
                const std::string known = ParameterFlags(*arguments.filter);
                throw UsageError(std::string(arguments.filter->name) + " has no parameter " + name +
                                 " (it takes " + (known.empty() ? std::string("none") : known) + ")");
            }
            std::string known;
            for (const auto* option : app->get_options())
                if (!option->get_group().empty() && option->get_name() != "-h,--help" &&
                    !option->get_lnames().empty())
                    known += (known.empty() ? "--" : ", --") + option->get_lnames().front();
            throw UsageError("doc " + subcommand + " has no option " + name + " (it takes " +
                             (known.empty() ? std::string("none") : known) + ")");
        }
    if (arguments.flags.live && subcommand != "filter") throw UsageError("--live belongs to doc filter");
    if (arguments.flags.force && subcommand != "new") throw UsageError("--force belongs to doc new");
    arguments.render = CheckRenderFlags(arguments.flags.render);
    Once(arguments.flags.output, "-o");
    Once(arguments.flags.format, "--format");
    if (arguments.filter) arguments.parameters = FilterParameterTexts(*arguments.filter, values);
    return arguments;
}

void RequirePositional(const DocArguments& arguments, std::size_t count, const std::string& usage) {
    if (arguments.flags.positional.size() != count) throw UsageError("usage: rastertools doc " + usage);
}

Raster::PixelFormat ParseLayerFormat(const std::string& text) {
    const auto format = Raster::ParsePixelFormat(text);
    if (!format || !Raster::IsLayerFormat(*format))
        throw UsageError("--format " + text + ": not a layer format (" + LayerFormatNames() + ")");
    return *format;
}

Kernel::Counted<Document> LoadDocument(const std::string& path) {
    Kernel::Counted<Document> document;
    if (auto error = DocumentFile::Load(path, document)) throw Error(*error);
    return document;
}

void SaveDocument(const Document& document, const std::string& path) {
    if (auto error = DocumentFile::Save(document, path)) throw Error(*error);
}

// How long a command waits for another one working on the same document: RASTERTOOLS_LOCK_TIMEOUT seconds,
// else 10.
std::chrono::milliseconds LockTimeout() {
    const char* text = std::getenv("RASTERTOOLS_LOCK_TIMEOUT");
    if (!text || !*text) return std::chrono::seconds(10);
    char* end = nullptr;
    const double seconds = std::strtod(text, &end);
    if (*end != '\0' || !std::isfinite(seconds) || seconds < 0 || seconds > 86400)
        throw UsageError(std::string("RASTERTOOLS_LOCK_TIMEOUT: \"") + text +
                         "\" is not a number of seconds (0 .. 86400)");
    return std::chrono::milliseconds(std::llround(seconds * 1000));
}

// "copy format=-1 scale=1,1", or the command's description for commands the library does not know.
std::string DescribeFilterCommand(const Command& command) {
    const RasterTools::FilterInfo* info = RasterTools::FindFilterOf(command);
    if (!info) return command.GetDescription().Localise();
    const std::string values = DescribeParameterValues(*info, info->readCommand(command));
    return std::string(info->name) + (values.empty() ? "" : " " + values);
}

std::string DescribeSize(const Raster::DynamicBuffer& image) {
    return std::to_string(image.GetWidth()) + "x" + std::to_string(image.GetHeight()) + " " +
           std::string(Raster::GetPixelFormatName(image.GetFormat()));
}

// The device for live filters and pixel commands, which pick theirs from the process's selection: --device
// overrides it. A device that is not there is refused before any work.
RenderDevice UseDevice(const std::string& option) {
    const DeviceSelection selection = ResolveDeviceSelector(option);
    const RenderDevice device = FindRenderDevice(selection);
    if (!device.IsValid()) throw UsageError(device.error);
    if (!option.empty()) ::setenv(Raster::Hardware::SelectorVariable, selection.selector.c_str(), 1);
    return device;
}

int RunNew(const DocArguments& arguments) {
    RequirePositional(arguments, 1, "new IMAGE -o DOC [--format F] [--force]");
    const auto& flags = arguments.flags;
    if (!flags.output.Given()) throw UsageError("doc new needs the document to write: -o DOC");
    const FileSettings files = CheckFileFlags(flags.files);
    const std::string& input = flags.positional[0];
    const std::string& output = flags.output.Value();
    const Kernel::FileLock lock = LockDocument(output);
    // Replacing a document is what new is for; replacing anything else (the picture itself, say) is asked
    // for.
    std::error_code error;
    if (std::filesystem::exists(output, error) && !flags.force && !DocumentFile::IsDocument(output))
        throw Error(output +
                    ": exists and is not a RasterTools document; not replaced (--force replaces it)");

    IO::ReadResult read = ReadInput(input, std::nullopt, files);
    if (!read) throw Error(read.error);
    Kernel::Counted<Raster::DynamicBuffer> pixels = read.image;
    if (flags.format.Given()) {
        const Raster::PixelFormat format = ParseLayerFormat(flags.format.Value());
        Raster::ColourProfiles profiles;
        profiles.Add(read.metadata.iccProfile);
        if (std::string why;
            Raster::ICCManager::NeedsProfileConversion(pixels->GetFormat(), profiles, format, profiles)) {
            // A tagged picture changes colour model through its own profile.
            pixels = Raster::ICCManager::ConvertImage(*pixels, profiles, format, profiles, why);
            if (!pixels) throw Error(input + ": " + why);
        } else if (format != pixels->GetFormat()) {
            // Converting is the pixel pipeline's work: a copy into the chosen format.
            const auto& copy = RequireFilter("copy");
            const auto command =
                copy.makeCommand(false, ParseFilterParameters(copy, {{"format", flags.format.Value()}}));
            const auto* pipeline = dynamic_cast<const RasterTools::PipelineCommand*>(command.Get());
            auto converted = Raster::DynamicBuffer::Create(pixels->GetWidth(), pixels->GetHeight(), format);
            if (!pipeline || !converted)
                throw Error(input + ": cannot convert the image to " + flags.format.Value());
            const auto result = RasterTools::RenderImage(*pipeline, pixels, converted, nullptr, {});
            if (!result.complete) throw Error(input + ": " + result.error);
            pixels = std::move(converted);
        }
    }
    auto document = Kernel::MakeCounted<Document>();
    const std::string name = input == "-" ? std::string() : std::filesystem::path(input).stem().string();
    auto layer = Kernel::MakeCounted<RasterNode>(name.empty() ? "Background" : name, pixels);
    Raster::ColourProfiles profiles;
    if (profiles.Add(read.metadata.iccProfile)) layer->SetColourProfile(profiles.For(pixels->GetFormat()));
    document->InsertLayer(0, layer);
    document->SetMetadata(read.metadata);
    SaveDocument(*document, output);
    if (!IsQuiet())
        std::cout << output << ": new document, raster layer \"" << document->GetLayer(0)->GetName() << "\" "
                  << DescribeSize(*pixels) << '\n';
    return 0;
}

int RunFilter(const DocArguments& arguments) {
    if (arguments.flags.positional.size() != 2 || !arguments.filter)
        throw UsageError("usage: rastertools doc filter DOC FILTER [--PARAM VALUE]... [--live] [--device D] "
                         "[--tile N] [--threads N]");
    // A live filter renders when the document does; its tiles and threads are doc render's to choose.
    if (arguments.flags.live && (arguments.render.tileSize || arguments.flags.render.threads.Given()))
        throw UsageError(std::string(arguments.render.tileSize ? "--tile" : "--threads") +
                         " sets how pixels are changed now; a live filter layer is rendered by doc render, "
                         "which takes it");
    const std::string& path = arguments.flags.positional[0];
    const RasterTools::FilterInfo& filter = *arguments.filter;
    const auto command = MakeFilterCommand(filter, arguments.flags.live, arguments.parameters);
    if (!command) throw Error(std::string(filter.name) + ": the command could not be made");
    UseDevice(arguments.render.device);
    const Kernel::FileLock lock = LockDocument(path);
    auto document = LoadDocument(path);

    if (arguments.flags.live) {
        auto live = Kernel::CountedCast<RasterDevicePreviewableFilterLayerCommand>(command);
        if (!live) throw Error(std::string(filter.name) + " cannot be the filter of a live filter layer");
        live->SetSelection(document->GetSelection());
        Kernel::Counted<Node> node(new FilterRasterNode(command->GetDescription().Localise(), live));
        document->PushHistory({.kind = HistoryEntry::Kind::LiveLayerAdded,
                               .command = command,
                               .layer = node,
                               .index = document->GetLayers().size()});
        SaveDocument(*document, path);
        if (!IsQuiet())
            std::cout << path << ": live filter layer \"" << node->GetName()
                      << "\" added on top: " << DescribeFilterCommand(*command) << '\n';
        return 0;
    }

    if (!dynamic_cast<const Renderer::SpanPopulatorBitmapFillMutationHost*>(command.Get()))
        throw Error(std::string(filter.name) + " cannot change pixels yet");
    const auto targets = GetPixelTargets(*document);
    if (targets.empty()) throw Error(path + ": the document has no raster layer to filter");
    ProgressBar progress(std::string(filter.name));
    PixelEffectOptions options;
    // The bar covers the filter (nine tenths) and saving the document.
    options.progress = [&progress](double fraction) { progress.Update(0.9 * fraction); };
    options.tileSize = arguments.render.tileSize;
    options.threads = arguments.render.threads;
    const std::size_t droppedBefore = document->GetDroppedHistoryCount();
    const auto error = ApplyPixelCommand(*document, command, options);
    if (error) throw Error(path + ": " + *error);
    SaveDocument(*document, path);
    progress.Update(1.0);
    progress.Finish();
    const auto& entry = document->GetHistory().back();
    if (entry.patches.empty() && !IsQuiet())
        std::cerr << "rastertools: note: " << path << ": " << filter.name
                  << " with these parameters changes no pixel\n";
    if (IsQuiet()) return 0;
    std::cout << path << ": " << DescribeFilterCommand(*command);
    if (entry.patches.empty()) std::cout << ", no pixels changed";
    for (const auto& patch : entry.patches)
        std::cout << "; layer \"" << patch.layer->GetName() << "\" " << patch.rect.Width() << "x"
                  << patch.rect.Height() << " at " << patch.rect.left << "," << patch.rect.top;
    if (const std::size_t dropped = document->GetDroppedHistoryCount() - droppedBefore)
        std::cout << "; history reached its memory budget: " << dropped << " oldest "
                  << (dropped == 1 ? "entry" : "entries") << " dropped";
    std::cout << '\n';
    return 0;
}

int RunRender(const DocArguments& arguments) {
    RequirePositional(arguments, 2, "render DOC OUTPUT [--format F] [--device D] [--tile N] [--threads N]");
    const auto& flags = arguments.flags;
    const std::string& path = flags.positional[0];
    const std::string& output = flags.positional[1];
    const FileSettings files = CheckFileFlags(flags.files);
    const IO::FileType outputType = OutputType(output, files);
    const auto* type = &outputType;
    FlattenOptions flatten;
    if (flags.format.Given()) flatten.format = ParseLayerFormat(flags.format.Value());
    if (arguments.render.tileSize) flatten.tileSize = arguments.render.tileSize;
    flatten.threads = arguments.render.threads;
    const RenderDevice device = UseDevice(arguments.render.device);

    const auto document = LoadDocument(path);
    if (!flatten.format) {
        // The bottom layer's format where the file can hold it, else the closest one it can.
        for (const auto& node : document->GetLayers())
            if (const auto* raster = dynamic_cast<const RasterNode*>(node.Get());
                raster && raster->GetPixels()) {
                flatten.format = IO::GetWritableFormat(*type, raster->GetPixels()->GetFormat());
                break;
            }
    } else if (!IO::CanWrite(*type, *flatten.format)) {
        throw Error(output + ": " + std::string(IO::GetFileTypeName(*type)) + " cannot hold " +
                    std::string(Raster::GetPixelFormatName(*flatten.format)) +
                    " pixels (choose another --format or " +
                    std::string(Raster::GetPixelFormatName(IO::GetWritableFormat(*type, *flatten.format))) +
                    ")");
    }
    // The bar covers rendering (nine tenths) and writing.
    ProgressBar progress("render");
    flatten.progress = [&progress](double fraction) { progress.Update(0.9 * fraction); };
    const FlattenResult result = FlattenDocument(*document, flatten);
    if (!result.image) {
        progress.Finish();
        throw Error(path + ": " + result.error);
    }
    WriteOutput(output, outputType, *result.image, files,
                GetFlattenedMetadata(*document, result.image->GetFormat()));
    progress.Update(1.0);
    progress.Finish();
    for (const auto& warning : result.warnings)
        if (!IsQuiet()) std::cerr << "rastertools: warning: " << path << ": " << warning << '\n';
    if (!IsQuiet())
        (output == "-" ? std::cerr : std::cout)
            << output << ": " << DescribeSize(*result.image) << " from " << document->GetLayers().size()
            << " layers, live filters on "
            << (device.device ? device.device->GetIdentifier() : std::string("the processor")) << '\n';
    return 0;
}

int RunShow(const DocArguments& arguments) {
    RequirePositional(arguments, 1, "show DOC");
    const std::string& path = arguments.flags.positional[0];
    const auto document = LoadDocument(path);
    const auto& layers = document->GetLayers();
    const auto& selection = document->GetSelection();
    std::cout << path << ": " << layers.size() << " layers, bottom to top\n";
    for (std::size_t i = 0; i < layers.size(); ++i) {
        const auto& node = layers[i];
        const bool selected = std::find(selection.begin(), selection.end(), node) != selection.end();
        std::cout << "  " << i << (selected ? " * " : "   ") << node->GetKindName() << " \""
                  << node->GetName() << "\"";
        if (const auto* raster = dynamic_cast<const RasterNode*>(node.Get())) {
            if (raster->GetPixels()) std::cout << " " << DescribeSize(*raster->GetPixels());
            std::cout << " at " << raster->GetOffset().x << "," << raster->GetOffset().y;
        } else if (const auto* live = dynamic_cast<const FilterRasterNode*>(node.Get())) {
            std::cout << ": " << DescribeFilterCommand(*live->GetFilter());
        }
        std::cout << '\n';
    }
    if (const auto& pixels = document->GetPixelSelection()) {
        const auto box = pixels->GetSelectedSpreadBox();
        std::cout << "pixel selection: " << DescribeSize(*pixels->GetMask());
        if (pixels->IsSelectNone())
            std::cout << ", nothing selected\n";
        else
            std::cout << ", selected within " << box.left << "," << box.top << " .. " << box.right << ","
                      << box.bottom << '\n';
    }
    const auto& history = document->GetHistory();
    std::cout << "history: " << history.size() << " entries, "
              << history.size() - document->GetHistoryCursor() << " undone";
    if (const std::size_t dropped = document->GetDroppedHistoryCount())
        std::cout << "; " << dropped << " older " << (dropped == 1 ? "entry was" : "entries were")
                  << " dropped to keep history within its memory budget";
    std::cout << '\n';
    for (std::size_t i = 0; i < history.size(); ++i) {
        const auto& entry = history[i];
        std::cout << "  " << i + 1 << ". " << (i < document->GetHistoryCursor() ? "" : "(undone) ")
                  << entry.command->GetDescription().Localise() << ": "
                  << DescribeFilterCommand(*entry.command);
        switch (entry.kind) {
        case HistoryEntry::Kind::PixelChange:
            if (entry.patches.empty()) std::cout << "; no pixels changed";
            for (const auto& patch : entry.patches)
                std::cout << "; pixels of \"" << patch.layer->GetName() << "\" " << patch.rect.Width() << "x"
                          << patch.rect.Height() << " at " << patch.rect.left << "," << patch.rect.top;
            break;
        case HistoryEntry::Kind::LiveLayerAdded:
            std::cout << "; live filter layer \"" << entry.layer->GetName() << "\" added";
            break;
        case HistoryEntry::Kind::LiveFilterChanged:
            std::cout << "; filter of \"" << entry.layer->GetName() << "\" changed";
            break;
        }
        std::cout << '\n';
    }
    return 0;
}

int RunUndoRedo(const DocArguments& arguments, bool undo) {
    const std::string verb = undo ? "undo" : "redo";
    RequirePositional(arguments, 1, verb + " DOC");
    const std::string& path = arguments.flags.positional[0];
    const Kernel::FileLock lock = LockDocument(path);
    auto document = LoadDocument(path);
    if (!(undo ? document->Undo() : document->Redo())) throw Error(path + ": nothing to " + verb);
    SaveDocument(*document, path);
    const auto& entry =
        document->GetHistory()[undo ? document->GetHistoryCursor() : document->GetHistoryCursor() - 1];
    if (!IsQuiet())
        std::cout << path << ": " << verb << " " << entry.command->GetDescription().Localise() << '\n';
    return 0;
}

} // namespace

Kernel::FileLock LockDocument(const std::string& path) {
    Kernel::FileLock lock;
    if (auto busy = lock.Acquire(path, LockTimeout(), false)) throw Error(*busy);
    return lock;
}

int RunDoc(const std::vector<std::string>& args) {
    if (args.empty()) throw UsageError(std::string(kDocUsage));
    const std::string& subcommand = args.front();
    if (subcommand == "--help" || subcommand == "-h") {
        std::cout << CommandHelp("doc");
        return 0;
    }
    // paint reads its own arguments (a stroke is a run of points; --erase stands alone).
    if (subcommand == "paint") return RunDocPaint({args.begin() + 1, args.end()});
    if (std::find(std::begin(kDocSubcommands), std::end(kDocSubcommands), subcommand) ==
        std::end(kDocSubcommands))
        throw UsageError("unknown doc subcommand " + QuoteExcerpt(subcommand) +
                         " (new, filter, render, show, undo, redo, paint)");
    const DocArguments arguments = ParseDoc(subcommand, {args.begin() + 1, args.end()});
    if (arguments.help) return 0;
    if (subcommand == "new") return RunNew(arguments);
    if (subcommand == "filter") return RunFilter(arguments);
    if (subcommand == "render") return RunRender(arguments);
    if (subcommand == "show") return RunShow(arguments);
    return RunUndoRedo(arguments, subcommand == "undo");
}

} // namespace App
