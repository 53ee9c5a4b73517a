#include "app/BrushVerbs.h"

#include "app/FilterArguments.h"
#include "app/Options.h"
#include "brushes/PixelDab.h"
#include "brushes/RasterPixelTool.h"
#include "host/document/DocumentFile.h"
#include "host/document/PixelEffect.h"
#include "host/kernel/AtomicFile.h"

#include <charconv>
#include <cmath>
#include <iostream>

namespace App {

const char* const kBrushToolNames = "pixel";
const char* const kBrushVerbs = "stroke, latch, mode, snapshot, colour, brush-size, context";

namespace {

std::optional<double> ParseNumber(std::string_view text) {
    double value = 0.0;
    const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
    if (result.ec != std::errc() || result.ptr != text.data() + text.size() || !std::isfinite(value))
        return std::nullopt;
    return value;
}

std::optional<Kernel::PointT<double>> ParseStrokePoint(const std::string& text) {
    const auto comma = text.find(',');
    if (comma == std::string::npos) return std::nullopt;
    const auto x = ParseNumber(std::string_view(text).substr(0, comma));
    const auto y = ParseNumber(std::string_view(text).substr(comma + 1));
    if (!x || !y) return std::nullopt;
    return Kernel::PointT<double>{*x, *y};
}

// "R,G,B" with whole components 0..255, as a colour picker gives them.
std::optional<Renderer::ConsolidatedColour> ParseColour(const std::string& text) {
    float channels[3] = {};
    std::string_view rest = text;
    for (int i = 0; i < 3; ++i) {
        const std::size_t comma = i < 2 ? rest.find(',') : rest.size();
        if (comma == std::string_view::npos) return std::nullopt;
        int value = -1;
        const auto part = rest.substr(0, comma);
        const auto result = std::from_chars(part.data(), part.data() + part.size(), value);
        if (part.empty() || result.ec != std::errc() || result.ptr != part.data() + part.size() ||
            value < 0 || value > 255)
            return std::nullopt;
        channels[i] = float(value) / 255.0f;
        rest.remove_prefix(i < 2 ? comma + 1 : comma);
    }
    return Renderer::ConsolidatedColour{channels[0], channels[1], channels[2], 1.0f};
}

std::string DescribeColour(const Renderer::ConsolidatedColour& colour) {
    const auto byte = [](float v) { return std::to_string(std::lround(std::clamp(v, 0.0f, 1.0f) * 255.0f)); };
    return byte(colour.r) + "," + byte(colour.g) + "," + byte(colour.b);
}

} // namespace

Kernel::Counted<Tool> FindBrushTool(DocumentController& controller, const std::string& name) {
    return name == "pixel" ? controller.FindTool(ToolID::Pixel) : nullptr;
}

std::optional<std::string> RunBrushVerb(DocumentController& controller, const Kernel::Counted<Tool>& tool,
                                        const std::vector<std::string>& words, std::ostream& out) {
    static const std::vector<std::string> verbs = {"stroke", "latch",      "mode",   "snapshot",
                                                   "colour", "brush-size", "context"};
    const std::string& verb = words.front();
    if (std::find(verbs.begin(), verbs.end(), verb) == verbs.end()) return std::nullopt;
    if (verb == "snapshot") {
        if (words.size() != 1) return "usage: snapshot";
        controller.NominateSnapshot();
        return "";
    }
    if (verb == "context") {
        if (words.size() != 2 || (words[1] != "primary" && words[1] != "secondary"))
            return "usage: context primary|secondary";
        controller.SelectPrimaryColourContext(words[1] == "primary");
        return "";
    }
    auto* pixel = dynamic_cast<RasterTools::RasterPixelTool*>(tool.Get());
    if (!pixel) return verb + " needs the pixel tool (use: tool pixel)";
    if (verb == "stroke") {
        std::vector<Kernel::PointT<double>> points;
        bool secondary = false;
        for (std::size_t i = 1; i < words.size(); ++i) {
            if (words[i] == "--secondary") {
                secondary = true;
                continue;
            }
            const auto point = ParseStrokePoint(words[i]);
            if (!point) return QuoteExcerpt(words[i]) + " is not a point (expected X,Y)";
            points.push_back(*point);
        }
        if (points.empty()) return "usage: stroke X0,Y0 [X1,Y1]... [--secondary]";
        Kernel::KeyState keys;
        keys.secondary = secondary;
        pixel->SetKeyState(keys);
        pixel->Stroke(points);
        pixel->SetKeyState({});
    } else if (verb == "latch") {
        if (words.size() != 2 || (words[1] != "on" && words[1] != "off")) return "usage: latch on|off";
        pixel->SetAlternateLatch(words[1] == "on");
        out << "  latch " << words[1] << '\n';
    } else if (verb == "mode") {
        static const std::pair<const char*, RasterTools::RasterPixelTool::AlternateMode> modes[] = {
            {"erase", RasterTools::RasterPixelTool::Erase},
            {"background", RasterTools::RasterPixelTool::BackgroundColour},
            {"snapshot", RasterTools::RasterPixelTool::UndoFromSnapshot}};
        const auto found = std::find_if(std::begin(modes), std::end(modes), [&](const auto& mode) {
            return words.size() == 2 && words[1] == mode.first;
        });
        if (found == std::end(modes)) return "usage: mode erase|background|snapshot";
        pixel->SetAlternateMode(found->second);
    } else if (verb == "colour") {
        const auto colour = words.size() == 2 ? ParseColour(words[1]) : std::nullopt;
        if (!colour) return "usage: colour R,G,B (whole numbers 0 to 255)";
        pixel->SetColour(*colour);
    } else if (verb == "brush-size") {
        if (words.size() != 2 || (words[1] != "+" && words[1] != "-")) return "usage: brush-size +|-";
        pixel->ChangeBrushSizeByFactor(words[1] == "+" ? 2.0 : 0.5);
        out << "  brush size " << pixel->GetCurrentBrush()->GetSize() << '\n';
    }
    return "";
}

namespace {

struct PaintArguments {
    std::string document;
    std::vector<Kernel::PointT<double>> stroke;
    Renderer::ConsolidatedColour colour{0.0f, 0.0f, 0.0f, 1.0f};
    double size = 1.0;
    bool erase = false;
    bool fromSnapshot = false;
    std::optional<std::size_t> snapshot;
    std::string device; // empty: the processor
};

constexpr const char* kPaintUsage =
    "usage: rastertools doc paint DOC --stroke X0,Y0 [X1,Y1]... [--colour R,G,B] "
    "[--size N] [--erase | --from-snapshot [--snapshot N]] [--device D]";

PaintArguments ParsePaintArguments(const std::vector<std::string>& args) {
    PaintArguments result;
    bool strokeGiven = false, colourGiven = false, sizeGiven = false;
    for (std::size_t i = 0; i < args.size(); ++i) {
        const std::string& arg = args[i];
        const auto value = [&]() -> const std::string& {
            if (i + 1 >= args.size()) throw UsageError(arg + " needs a value");
            return args[++i];
        };
        const auto once = [&](bool& given) {
            if (given) throw UsageError(arg + " is given more than once");
            given = true;
        };
        if (arg == "--stroke") {
            once(strokeGiven);
            while (i + 1 < args.size() && !args[i + 1].starts_with("--")) {
                const auto point = ParseStrokePoint(args[++i]);
                if (!point)
                    throw UsageError("--stroke: " + QuoteExcerpt(args[i]) + " is not a point (expected X,Y)");
                result.stroke.push_back(*point);
            }
            if (result.stroke.empty()) throw UsageError("--stroke needs at least one point X,Y");
        } else if (arg == "--colour") {
            once(colourGiven);
            const auto colour = ParseColour(value());
            if (!colour)
                throw UsageError("--colour " + args[i] + ": expected R,G,B with whole numbers 0 to 255");
            result.colour = *colour;
        } else if (arg == "--size") {
            once(sizeGiven);
            const auto size = ParseNumber(value());
            if (!size || *size < 1.0 || *size > 4096.0 || *size != std::floor(*size))
                throw UsageError("--size " + args[i] + ": expected a whole number of pixels, 1 to 4096");
            result.size = *size;
        } else if (arg == "--device") {
            if (!result.device.empty()) throw UsageError("--device is given more than once");
            result.device = value();
            if (result.device.empty() || !Raster::ParseHardwareSelector(result.device))
                throw UsageError("--device " + result.device +
                                 ": expected cpu, auto, opencl[:N] or cuda[:N]");
        } else if (arg == "--erase") {
            if (result.erase) throw UsageError("--erase is given more than once");
            result.erase = true;
        } else if (arg == "--from-snapshot") {
            if (result.fromSnapshot) throw UsageError("--from-snapshot is given more than once");
            result.fromSnapshot = true;
        } else if (arg == "--snapshot") {
            if (result.snapshot) throw UsageError("--snapshot is given more than once");
            const auto entry = ParseNumber(value());
            if (!entry || *entry < 0 || *entry != std::floor(*entry) || *entry > 1e9)
                throw UsageError("--snapshot " + args[i] + ": expected a history position (0 or more)");
            result.snapshot = std::size_t(*entry);
        } else if (arg.starts_with("-")) {
            throw UsageError("doc paint has no option " + arg +
                             " (it takes --stroke, --colour, --size, --erase, "
                             "--from-snapshot, --snapshot)");
        } else if (result.document.empty()) {
            result.document = arg;
        } else {
            throw UsageError(kPaintUsage);
        }
    }
    if (result.document.empty() || !strokeGiven) throw UsageError(kPaintUsage);
    if (result.erase && result.fromSnapshot)
        throw UsageError("--erase and --from-snapshot exclude each other");
    if (result.snapshot && !result.fromSnapshot) throw UsageError("--snapshot belongs to --from-snapshot");
    if (colourGiven && (result.erase || result.fromSnapshot))
        throw UsageError("--colour is for painting, not with --erase or --from-snapshot");
    return result;
}

// The document as it was after history position `position` (0: before the oldest entry kept), nominated as
// the snapshot: history is walked back to it and forward again, and the snapshot keeps what the walk forward
// changes.
void NominateHistorySnapshot(DocumentController& controller, std::size_t position, const std::string& path) {
    Document& document = *controller.GetDocument();
    const std::size_t cursor = document.GetHistoryCursor();
    if (position > cursor)
        throw UsageError("--snapshot " + std::to_string(position) + ": " + path + " has " +
                         std::to_string(cursor) + " done history entries");
    while (document.GetHistoryCursor() > position)
        document.Undo();
    controller.NominateSnapshot();
    while (document.GetHistoryCursor() < cursor)
        document.Redo();
}

} // namespace

int RunDocPaint(const std::vector<std::string>& args) {
    const PaintArguments arguments = ParsePaintArguments(args);
    const std::string& path = arguments.document;
    Kernel::FileLock lock;
    if (auto busy = lock.Acquire(path, std::chrono::seconds(10), false)) throw Error(*busy);
    Kernel::Counted<Document> document;
    if (auto error = DocumentFile::Load(path, document)) throw Error(*error);
    if (GetPixelTargets(*document).empty())
        throw Error(path + ": the document has no raster layer to paint on");

    // Dabs are composed on the device named, the processor otherwise; a device that is not there is an error.
    if (!arguments.device.empty() && arguments.device != "cpu") {
        auto device = Raster::Hardware::GetDevice(arguments.device);
        if (!device && arguments.device != "auto")
            throw Error("--device " + arguments.device + ": no such device here");
        RasterTools::SetDabDevice(device);
    }
    auto controller = Kernel::MakeCounted<DocumentController>(document);
    controller->CreateTools();
    auto tool = Kernel::CountedCast<RasterTools::RasterPixelTool>(controller->FindTool(ToolID::Pixel));
    if (!tool) throw Error("the pixel tool is not available in this build");
    controller->SetActiveTool(tool);
    tool->Start({});
    if (arguments.size != 1.0) {
        auto brush = tool->GetCurrentBrush()->Copy();
        brush->SetSize(arguments.size);
        tool->ReplaceBrush(brush);
    }
    tool->SetColour(arguments.colour);
    if (arguments.erase || arguments.fromSnapshot) {
        tool->SetAlternateMode(arguments.erase ? RasterTools::RasterPixelTool::Erase
                                               : RasterTools::RasterPixelTool::UndoFromSnapshot);
        tool->SetAlternateLatch(true);
    }
    if (arguments.fromSnapshot) NominateHistorySnapshot(*controller, arguments.snapshot.value_or(0), path);

    const std::size_t before = document->GetHistory().size();
    const std::size_t cursorBefore = document->GetHistoryCursor();
    tool->Stroke(arguments.stroke);
    if (document->GetHistoryCursor() == cursorBefore && document->GetHistory().size() <= before)
        throw Error(path + ": the stroke painted nothing");
    const auto& entry = document->GetHistory()[document->GetHistoryCursor() - 1];
    if (auto error = DocumentFile::Save(*document, path)) throw Error(*error);
    const auto* brush = dynamic_cast<const RasterBrushCommand*>(entry.command.Get());
    std::cout << path << ": " << entry.command->GetDescription().Localise();
    if (brush) std::cout << " (" << brush->GetNozzles().size() << " dabs)";
    for (const auto& patch : entry.patches)
        std::cout << ", changed " << patch.rect.Width() << "x" << patch.rect.Height() << " at "
                  << patch.rect.left << "," << patch.rect.top << " of \"" << patch.layer->GetName() << "\"";
    if (entry.patches.empty()) std::cout << ", no pixels changed";
    if (!arguments.erase && !arguments.fromSnapshot)
        std::cout << " with colour " << DescribeColour(arguments.colour);
    std::cout << '\n';
    return 0;
}

} // namespace App
