// rastertools doc: layered documents from the command line. Every subcommand that changes a document locks
// it, loads it, changes it in memory and writes it back atomically before letting go, so an error leaves the
// file as it was and concurrent commands on one document each see the others' changes.

#include "app/FilterArguments.h"
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

#include <chrono>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <set>

namespace App {

namespace {

constexpr std::string_view kDocUsage =
    "usage: rastertools doc new IMAGE -o DOC [--format F] [--force]\n"
    "       rastertools doc filter DOC FILTER [--PARAM VALUE]... [--live]\n"
    "       rastertools doc render DOC OUTPUT [--format F] [--device D] [--tile N] [--threads N]\n"
    "       rastertools doc show DOC\n"
    "       rastertools doc undo DOC | doc redo DOC";

struct DocArguments {
    std::vector<std::string> positional;
    std::vector<std::pair<std::string, std::string>> options; // --name value, in order
    bool live = false;
    bool force = false;
};

// Splits arguments into positional ones and `--name value` pairs; only `--live` and `--force` stand alone.
DocArguments SplitArguments(const std::vector<std::string>& args) {
    DocArguments result;
    for (std::size_t i = 0; i < args.size(); ++i) {
        const std::string& arg = args[i];
        if (arg == "--live") {
            result.live = true;
        } else if (arg == "--force") {
            result.force = true;
        } else if (arg.starts_with("--") || arg == "-o") {
            if (i + 1 >= args.size()) throw UsageError(arg + " needs a value");
            result.options.emplace_back(arg == "-o" ? "o" : arg.substr(2), args[++i]);
        } else {
            result.positional.push_back(arg);
        }
    }
    return result;
}

// The value of each option in allowed; any other option is a usage error.
std::map<std::string, std::string> TakeOptions(const DocArguments& arguments, const std::string& subcommand,
                                               const std::set<std::string>& allowed) {
    std::map<std::string, std::string> values;
    for (const auto& [name, value] : arguments.options) {
        if (!allowed.contains(name)) {
            std::string known;
            for (const auto& option : allowed)
                known += (known.empty() ? "" : ", ") + std::string(option == "o" ? "-o" : "--" + option);
            throw UsageError("doc " + subcommand + " has no option " + (name == "o" ? "-o" : "--" + name) +
                             " (it takes " + (known.empty() ? std::string("none") : known) + ")");
        }
        if (!values.emplace(name, value).second)
            throw UsageError((name == "o" ? "-o" : "--" + name) + " is given more than once");
    }
    if (arguments.live) throw UsageError("--live belongs to doc filter");
    if (arguments.force && subcommand != "new") throw UsageError("--force belongs to doc new");
    return values;
}

void RequirePositional(const DocArguments& arguments, std::size_t count, const std::string& usage) {
    if (arguments.positional.size() != count) throw UsageError("usage: rastertools doc " + usage);
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

int RunNew(const DocArguments& arguments) {
    const auto options = TakeOptions(arguments, "new", {"o", "format"});
    RequirePositional(arguments, 1, "new IMAGE -o DOC [--format F] [--force]");
    if (!options.contains("o")) throw UsageError("doc new needs the document to write: -o DOC");
    const std::string& input = arguments.positional[0];
    const std::string& output = options.at("o");
    const Kernel::FileLock lock = LockDocument(output);
    // Replacing a document is what new is for; replacing anything else (the picture itself, say) is asked
    // for.
    std::error_code error;
    if (std::filesystem::exists(output, error) && !arguments.force && !DocumentFile::IsDocument(output))
        throw Error(output +
                    ": exists and is not a RasterTools document; not replaced (--force replaces it)");

    IO::ReadResult read = IO::ReadImage(input);
    if (!read) throw Error(read.error);
    Kernel::Counted<Raster::DynamicBuffer> pixels = read.image;
    if (options.contains("format")) {
        const Raster::PixelFormat format = ParseLayerFormat(options.at("format"));
        if (format != pixels->GetFormat()) {
            // Converting is the pixel pipeline's work: a copy into the chosen format.
            const auto& copy = RequireFilter("copy");
            const auto command =
                copy.makeCommand(false, ParseFilterParameters(copy, {{"format", options.at("format")}}));
            const auto* pipeline = dynamic_cast<const RasterTools::PipelineCommand*>(command.Get());
            auto converted = Raster::DynamicBuffer::Create(pixels->GetWidth(), pixels->GetHeight(), format);
            if (!pipeline || !converted)
                throw Error(input + ": cannot convert the image to " + options.at("format"));
            const auto result = RasterTools::RenderImage(*pipeline, pixels, converted, nullptr, {});
            if (!result.complete) throw Error(input + ": " + result.error);
            pixels = std::move(converted);
        }
    }
    auto document = Kernel::MakeCounted<Document>();
    const std::string name = std::filesystem::path(input).stem().string();
    document->InsertLayer(0,
                          Kernel::Counted<Node>(new RasterNode(name.empty() ? "Background" : name, pixels)));
    SaveDocument(*document, output);
    std::cout << output << ": new document, raster layer \"" << document->GetLayer(0)->GetName() << "\" "
              << DescribeSize(*pixels) << '\n';
    return 0;
}

int RunFilter(const DocArguments& arguments) {
    if (arguments.positional.size() != 2)
        throw UsageError("usage: rastertools doc filter DOC FILTER [--PARAM VALUE]... [--live]");
    const std::string& path = arguments.positional[0];
    const RasterTools::FilterInfo& filter = RequireFilter(arguments.positional[1]);
    const auto command = MakeFilterCommand(filter, arguments.live, arguments.options);
    if (!command) throw Error(std::string(filter.name) + ": the command could not be made");
    if (arguments.force) throw UsageError("--force belongs to doc new");
    const Kernel::FileLock lock = LockDocument(path);
    auto document = LoadDocument(path);

    if (arguments.live) {
        auto live = Kernel::CountedCast<RasterDevicePreviewableFilterLayerCommand>(command);
        if (!live) throw Error(std::string(filter.name) + " cannot be the filter of a live filter layer");
        live->SetSelection(document->GetSelection());
        Kernel::Counted<Node> node(new FilterRasterNode(command->GetDescription().Localise(), live));
        document->PushHistory({.kind = HistoryEntry::Kind::LiveLayerAdded,
                               .command = command,
                               .layer = node,
                               .index = document->GetLayers().size()});
        SaveDocument(*document, path);
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
    options.progress = progress.Callback();
    const std::size_t droppedBefore = document->GetDroppedHistoryCount();
    const auto error = ApplyPixelCommand(*document, command, options);
    progress.Finish();
    if (error) throw Error(path + ": " + *error);
    SaveDocument(*document, path);
    const auto& entry = document->GetHistory().back();
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
    const auto options = TakeOptions(arguments, "render", {"format", "device", "tile", "threads"});
    RequirePositional(arguments, 2, "render DOC OUTPUT [--format F] [--device D] [--tile N] [--threads N]");
    const std::string& path = arguments.positional[0];
    const std::string& output = arguments.positional[1];
    const auto type = IO::GetFileTypeForExtension(output);
    if (!type) throw UsageError(output + ": unknown file type (use .png, .jpg, .jpeg, .tif or .tiff)");
    FlattenOptions flatten;
    if (options.contains("format")) flatten.format = ParseLayerFormat(options.at("format"));
    if (options.contains("tile")) flatten.tileSize = ParseTileSize(options.at("tile"));
    if (options.contains("threads")) flatten.threads = ParseThreadCount(options.at("threads"));

    const DeviceSelection selection =
        ResolveDeviceSelector(options.contains("device") ? options.at("device") : std::string());
    const RenderDevice device = FindRenderDevice(selection);
    if (!device.IsValid()) throw UsageError(device.error);
    // Live filters pick their device from the process's selection, which --device overrides.
    if (options.contains("device"))
        ::setenv(Raster::Hardware::SelectorVariable, selection.selector.c_str(), 1);

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
    ProgressBar progress("render");
    flatten.progress = progress.Callback();
    const FlattenResult result = FlattenDocument(*document, flatten);
    progress.Finish();
    for (const auto& warning : result.warnings)
        std::cerr << "rastertools: warning: " << path << ": " << warning << '\n';
    if (!result.image) throw Error(path + ": " + result.error);
    const IO::WriteResult written = IO::WriteImage(output, *result.image);
    if (!written) throw Error(written.error);
    std::cout << output << ": " << DescribeSize(*result.image) << " from " << document->GetLayers().size()
              << " layers, live filters on "
              << (device.device ? device.device->GetIdentifier() : std::string("the processor")) << '\n';
    return 0;
}

int RunShow(const DocArguments& arguments) {
    TakeOptions(arguments, "show", {});
    RequirePositional(arguments, 1, "show DOC");
    const std::string& path = arguments.positional[0];
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
    TakeOptions(arguments, verb, {});
    RequirePositional(arguments, 1, verb + " DOC");
    const std::string& path = arguments.positional[0];
    const Kernel::FileLock lock = LockDocument(path);
    auto document = LoadDocument(path);
    if (!(undo ? document->Undo() : document->Redo())) throw Error(path + ": nothing to " + verb);
    SaveDocument(*document, path);
    const auto& entry =
        document->GetHistory()[undo ? document->GetHistoryCursor() : document->GetHistoryCursor() - 1];
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
    const DocArguments arguments = SplitArguments({args.begin() + 1, args.end()});
    if (subcommand == "new") return RunNew(arguments);
    if (subcommand == "filter") return RunFilter(arguments);
    if (subcommand == "render") return RunRender(arguments);
    if (subcommand == "show") return RunShow(arguments);
    if (subcommand == "undo") return RunUndoRedo(arguments, true);
    if (subcommand == "redo") return RunUndoRedo(arguments, false);
    throw UsageError("unknown doc subcommand \"" + subcommand + "\" (new, filter, render, show, undo, redo)");
}

} // namespace App
