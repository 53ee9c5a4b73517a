// rastertools play: drives the library's tools through the host as an editor would, one verb a line,
// and prints what the host sees (hints, notifications, enqueued commands, merges, history, settings).

#include "app/BrushVerbs.h"
#include "app/FilterArguments.h"
#include "app/Options.h"
#include "filters/Catalogue.h"
#include "host/document/DocumentController.h"
#include "host/document/DocumentFile.h"
#include "host/document/DocumentRender.h"
#include "host/document/VeyraController.h"
#include "host/io/ImageIO.h"
#include "host/kernel/AtomicFile.h"

#include <charconv>
#include <cmath>
#include <filesystem>
#include <iostream>
#include <sstream>

namespace App {

namespace {

// A problem with one line of a script; the runner adds the script name and line number.
class ScriptError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

constexpr std::string_view kVerbs = "tool, start, drag, click, set, reset, commit, cancel, leave, select, "
                                    "select-live, add-live, undo, redo, show, save, load, render";
constexpr std::string_view kShows = "params, hint, reflected, settings, history, layers";

Kernel::PointT<double> ParsePoint(const std::string& text) {
    auto value = RasterTools::ParseParameterValue(RasterTools::ParameterType::Point, text);
    if (!value) throw ScriptError(QuoteExcerpt(text) + " is not a point (expected X,Y)");
    return std::get<Kernel::PointT<double>>(*value);
}

int ParseIndex(const std::string& text, int limit, const char* what) {
    int value = -1;
    const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
    if (result.ec != std::errc() || result.ptr != text.data() + text.size() || value < 0 || value >= limit)
        throw ScriptError(QuoteExcerpt(text) + " is not a " + what + " (0 to " + std::to_string(limit - 1) +
                          ")");
    return value;
}

class PlaySession {
public:
    PlaySession(std::ostream& out, const PlayOptions& options)
        : m_Out(out)
        , m_FilesAllowed(options.filesAllowed)
        , m_Folder(options.folder) {
        auto document = Kernel::MakeCounted<Document>();
        document->InsertLayer(
            0, Kernel::Counted<Node>(new RasterNode("Background", options.width, options.height)));
        document->SetSelection({document->GetLayer(0)});
        m_Controller = Kernel::MakeCounted<DocumentController>(document);
        m_Controller->SetObserver([this](const std::string& event) { m_Out << "  " << event << '\n'; });
        m_Controller->CreateTools();
    }

    void Execute(const std::vector<std::string>& words) {
        const std::string& verb = words[0];
        if (!m_FilesAllowed && (verb == "save" || verb == "load" || verb == "render"))
            throw ScriptError(verb + " is not available here: this script may not touch files");
        const auto arguments = [&](std::size_t minimum, std::size_t maximum, const char* usage) {
            if (words.size() - 1 < minimum || words.size() - 1 > maximum)
                throw ScriptError("usage: " + std::string(usage));
        };
        if (verb == "tool") {
            arguments(1, 1, "tool NAME");
            SelectTool(words[1]);
        } else if (verb == "start") {
            arguments(0, 0, "start");
            RequireTool()->Start(m_PreviousTool);
        } else if (verb == "drag") {
            arguments(2, 3, "drag X0,Y0 X1,Y1 [STEPS]");
            Drag(ParsePoint(words[1]), ParsePoint(words[2]),
                 words.size() > 3 ? ParseIndex(words[3], 10001, "step count") : 1);
        } else if (verb == "click") {
            arguments(1, 1, "click X,Y");
            const bool handled =
                RequireTool()->OnClicked({ParsePoint(words[1])}, Raster::AffineTransform::Params{});
            m_Out << "  click " << (handled ? "handled" : "ignored") << '\n';
        } else if (verb == "set") {
            arguments(2, 2, "set ID VALUE");
            SetReflected(words[1], words[2]);
        } else if (verb == "reset") {
            arguments(0, 0, "reset");
            RequireTool()->Reset();
        } else if (verb == "commit") {
            arguments(0, 0, "commit");
            RequireTool()->Commit();
        } else if (verb == "cancel") {
            arguments(0, 0, "cancel");
            RequireTool()->OnCancel();
        } else if (verb == "leave") {
            arguments(0, 0, "leave");
            const bool committed = RequireTool()->AutoCommitIfRequired(true);
            m_Out << "  leave: " << (committed ? "committed" : "nothing to commit") << '\n';
        } else if (verb == "select") {
            arguments(1, 1, "select N");
            m_Controller->SetSelection({Layer(words[1])});
        } else if (verb == "select-live") {
            arguments(1, 1, "select-live N");
            auto node = Kernel::CountedCast<FilterRasterNode>(Layer(words[1]));
            if (!node) throw ScriptError("layer " + words[1] + " is not a live filter layer");
            m_Controller->BeginLiveEffectEdit(node);
        } else if (verb == "add-live") {
            if (words.size() < 2) throw ScriptError("usage: add-live NAME [PARAM=VALUE]...");
            AddLive(words);
        } else if (verb == "undo" || verb == "redo") {
            arguments(0, 0, verb == "undo" ? "undo" : "redo");
            if (!(verb == "undo" ? m_Controller->Undo() : m_Controller->Redo()))
                m_Out << "  nothing to " << verb << '\n';
        } else if (verb == "show") {
            arguments(1, 1, "show WHAT");
            Show(words[1]);
        } else if (verb == "save") {
            arguments(1, 1, "save FILE");
            // Not in the middle of another command's change to the same document.
            const std::string path = InFolder(words[1], true);
            const Kernel::FileLock lock = LockDocument(path);
            if (auto error = DocumentFile::Save(*m_Controller->GetDocument(), path))
                throw ScriptError(*error);
            m_Out << "  saved " << words[1] << '\n';
        } else if (verb == "load") {
            arguments(1, 1, "load FILE");
            Kernel::Counted<Document> document;
            if (auto error = DocumentFile::Load(InFolder(words[1], false), document))
                throw ScriptError(*error);
            m_Controller->SetDocument(document);
            m_Out << "  loaded " << words[1] << '\n';
        } else if (verb == "render") {
            arguments(1, 1, "render OUTPUT");
            Render(InFolder(words[1], true));
        } else if (auto brush = RunBrushVerb(*m_Controller, m_Tool, words, m_Out)) {
            if (!brush->empty()) throw ScriptError(*brush);
        } else {
            throw ScriptError("unknown verb " + QuoteExcerpt(verb) + " (verbs: " + std::string(kVerbs) +
                              ", " + kBrushVerbs + ")");
        }
    }

private:
    const Kernel::Counted<Tool>& RequireTool() const {
        if (!m_Tool) throw ScriptError("no tool chosen (use: tool NAME)");
        return m_Tool;
    }

    std::string ToolNames() const {
        std::string names;
        for (const auto& info : RasterTools::GetFilterCatalogue())
            if (!info.toolClass.empty()) names += (names.empty() ? "" : ", ") + std::string(info.name);
        return names;
    }

    void SelectTool(const std::string& name) {
        const RasterTools::FilterInfo* info = RasterTools::FindFilter(name);
        auto tool = info ? m_Controller->FindTool(info->toolID) : nullptr;
        if (!tool && (tool = FindBrushTool(*m_Controller, name))) {
            m_Filter = nullptr;
            m_PreviousTool = m_Controller->SetActiveTool(tool);
            m_Tool = tool;
            m_Out << "  tool " << name << " (id " << int(tool->GetToolID()) << ")\n";
            return;
        }
        if (!tool)
            throw ScriptError("unknown tool " + QuoteExcerpt(name) + " (tools: " + ToolNames() + ", " +
                              kBrushToolNames + ")");
        m_Filter = info;
        m_PreviousTool = m_Controller->SetActiveTool(tool);
        m_Tool = tool;
        m_Out << "  tool " << info->toolClass << " (id " << int(info->toolID) << ")\n";
    }

    void Drag(Kernel::PointT<double> from, Kernel::PointT<double> to, int steps) {
        const auto& tool = RequireTool();
        tool->OnBeginDrag({from});
        steps = std::max(steps, 1);
        for (int i = 1; i <= steps; ++i) {
            const double t = double(i) / steps;
            tool->OnDrag({{from.x + (to.x - from.x) * t, from.y + (to.y - from.y) * t}});
        }
        tool->OnEndDrag({to});
    }

    Kernel::Counted<Kernel::Reflected> FindReflected(const std::string& id) {
        const auto code = Kernel::ParseFourCC(id);
        if (code)
            for (auto& property : RequireTool()->EnumerateReflecteds())
                if (property->GetIdentifier() == *code) return property;
        std::string known;
        for (auto& property : RequireTool()->EnumerateReflecteds())
            known += (known.empty() ? "" : ", ") + Kernel::FourCCToString(property->GetIdentifier());
        throw ScriptError("the tool has no property " + QuoteExcerpt(id) + " (properties: " + known + ")");
    }

    // The catalogue's entry for a property of the current tool, where it has one.
    const RasterTools::ParameterSpec* FindSpec(Kernel::FourCC identifier) const {
        if (m_Filter)
            for (const auto& spec : m_Filter->parameters)
                if (spec.reflected == identifier) return &spec;
        return nullptr;
    }

    // A property's value as people read it: in the units the command line takes.
    std::string ShownValue(const Kernel::Reflected& property) const {
        const std::string text = property.GetValueText();
        const RasterTools::ParameterSpec* spec = FindSpec(property.GetIdentifier());
        if (!spec) return text;
        const auto value = RasterTools::ParseParameterValue(spec->type, text);
        return value ? FormatShownValue(*spec, *value) : text;
    }

    void SetReflected(const std::string& id, const std::string& value) {
        auto property = FindReflected(id);
        // A catalogued parameter is typed in its shown units and checked as apply checks it.
        if (const RasterTools::ParameterSpec* spec = FindSpec(property->GetIdentifier())) {
            RasterTools::ParameterValue stored;
            try {
                stored = ParseShownValue(*spec, value, id);
            } catch (const UsageError& error) {
                throw ScriptError(error.what());
            }
            if (!property->SetValueText(RasterTools::FormatParameterValue(stored)))
                throw ScriptError(QuoteExcerpt(value) + " is not a valid " + property->GetTypeName() +
                                  " for " + id);
        } else if (!property->SetValueText(value)) {
            throw ScriptError(QuoteExcerpt(value) + " is not a valid " + property->GetTypeName() + " for " +
                              id);
        }
        m_Out << "  " << id << "=" << ShownValue(*property) << '\n';
        // A panel edit is followed by a fresh preview, as after any change.
        m_Tool->Preview(false);
    }

    Kernel::Counted<Node> Layer(const std::string& text) const {
        const auto& layers = m_Controller->GetDocument()->GetLayers();
        if (layers.empty()) throw ScriptError("the document has no layers");
        return layers[std::size_t(ParseIndex(text, int(layers.size()), "layer index"))];
    }

    void AddLive(const std::vector<std::string>& words) {
        const RasterTools::FilterInfo* info = RasterTools::FindFilter(words[1]);
        if (!info) throw ScriptError("unknown filter " + QuoteExcerpt(words[1]));
        std::vector<RasterTools::ParameterValue> values;
        for (const auto& spec : info->parameters)
            values.push_back(spec.defaultValue);
        for (std::size_t i = 2; i < words.size(); ++i) {
            const auto equals = words[i].find('=');
            const std::string name = words[i].substr(0, equals);
            const RasterTools::ParameterSpec* spec = FindShownParameter(*info, name);
            if (equals == std::string::npos || !spec)
                throw ScriptError(QuoteExcerpt(words[i]) + " is not PARAM=VALUE for a parameter of " +
                                  words[1]);
            try {
                values[std::size_t(spec - info->parameters.data())] =
                    ParseShownValue(*spec, words[i].substr(equals + 1), name);
            } catch (const UsageError& error) {
                throw ScriptError(error.what());
            }
        }
        auto command = info->makeCommand(true, values);
        if (!dynamic_cast<const RasterDevicePreviewableFilterLayerCommand*>(command.Get()))
            throw ScriptError(words[1] + " cannot be the filter of a live filter layer");
        m_Controller->EnqueueCommand(std::move(command), false);
    }

    std::string DescribeParameters(const Command& command) const {
        const RasterTools::FilterInfo* info = RasterTools::FindFilterOf(command);
        if (!info) return DescribeCommand(command);
        std::string text(info->description);
        const auto values = info->readCommand(command);
        for (std::size_t i = 0; i < values.size(); ++i)
            text += " " + GetShownParameter(info->parameters[i]).flag + "=" +
                    FormatShownValue(info->parameters[i], values[i]);
        return text;
    }

    void Render(const std::string& output) {
        const auto type = IO::GetFileTypeForExtension(output);
        if (!type)
            throw ScriptError(EscapeBytes(output) + ": unknown file type (use " +
                              IO::DescribeFileExtensions() + ")");
        const auto& document = *m_Controller->GetDocument();
        FlattenOptions options;
        for (const auto& node : document.GetLayers())
            if (const auto* raster = dynamic_cast<const RasterNode*>(node.Get());
                raster && raster->GetPixels()) {
                options.format = IO::GetWritableFormat(*type, raster->GetPixels()->GetFormat());
                break;
            }
        const FlattenResult result = FlattenDocument(document, options);
        for (const auto& warning : result.warnings)
            m_Out << "  warning: " << warning << '\n';
        if (!result.image) throw ScriptError("cannot render: " + result.error);
        // The picture keeps the profile and metadata of the image the document was made from.
        IO::WriteOptions write;
        write.metadata = GetFlattenedMetadata(document, result.image->GetFormat());
        if (const IO::WriteResult written = IO::WriteImage(output, *result.image, write); !written)
            throw ScriptError(written.error);
        m_Out << "  rendered " << output << " (" << result.image->GetWidth() << "x"
              << result.image->GetHeight() << " " << Raster::GetPixelFormatName(result.image->GetFormat())
              << ")\n";
    }

    void Show(const std::string& what) {
        if (what == "params") {
            RequireTool();
            if (!m_Filter)
                throw ScriptError("the tool has no filter parameters (show reflected lists its properties)");
            const auto reflecteds = m_Tool->EnumerateReflecteds();
            for (const auto& spec : m_Filter->parameters)
                for (const auto& property : reflecteds)
                    if (property->GetIdentifier() == spec.reflected)
                        m_Out << GetShownParameter(spec).flag << '=' << ShownValue(*property) << '\n';
        } else if (what == "hint") {
            m_Out << m_Controller->GetHintline() << '\n';
        } else if (what == "reflected") {
            for (const auto& property : RequireTool()->EnumerateReflecteds()) {
                m_Out << Kernel::FourCCToString(property->GetIdentifier()) << " \""
                      << property->GetLabel().Localise() << "\" " << property->GetTypeName() << " = "
                      << property->GetValueText();
                if (auto range = property->DescribeRange(); !range.empty()) m_Out << ' ' << range;
                for (const auto& attribute : property->GetAttributes())
                    m_Out << " [" << attribute->Describe() << ']';
                m_Out << '\n';
            }
        } else if (what == "settings") {
            for (const auto& [key, value] : VeyraController::GetInstance().GetEntries("tools."))
                m_Out << key << '=' << value << '\n';
        } else if (what == "history") {
            const auto& document = *m_Controller->GetDocument();
            const auto& history = document.GetHistory();
            if (history.empty()) m_Out << "(empty)\n";
            for (std::size_t i = 0; i < history.size(); ++i)
                m_Out << (i < document.GetHistoryCursor() ? "" : "(undone) ") << i + 1 << ". "
                      << DescribeParameters(*history[i].command) << '\n';
        } else if (what == "layers") {
            const auto& document = *m_Controller->GetDocument();
            const auto& selection = document.GetSelection();
            for (std::size_t i = 0; i < document.GetLayers().size(); ++i) {
                const auto& node = document.GetLayers()[i];
                const bool selected = std::find(selection.begin(), selection.end(), node) != selection.end();
                m_Out << i << (selected ? " * " : "   ") << node->GetKindName() << " \"" << node->GetName()
                      << '"';
                if (const auto* live = dynamic_cast<const FilterRasterNode*>(node.Get()))
                    m_Out << ": " << DescribeParameters(*live->GetFilter());
                m_Out << '\n';
            }
        } else {
            throw ScriptError("cannot show " + QuoteExcerpt(what) + " (show " + std::string(kShows) + ")");
        }
    }

    // A file named in a script is found beside the script, wherever it is run from; one to be written gets
    // its folder made.
    std::string InFolder(const std::string& name, bool forWriting) const {
        std::filesystem::path path(name);
        if (path.is_relative() && !m_Folder.empty()) path = m_Folder / path;
        std::error_code error;
        if (forWriting && path.has_parent_path())
            std::filesystem::create_directories(path.parent_path(), error);
        return path.string();
    }

    std::ostream& m_Out;
    bool m_FilesAllowed;
    std::filesystem::path m_Folder;
    Kernel::Counted<DocumentController> m_Controller;
    Kernel::Counted<Tool> m_Tool;
    Kernel::Counted<Tool> m_PreviousTool;
    const RasterTools::FilterInfo* m_Filter = nullptr;
};

std::vector<std::string> SplitWords(const std::string& line) {
    std::vector<std::string> words;
    std::istringstream in(line.substr(0, line.find('#')));
    for (std::string word; in >> word;)
        words.push_back(word);
    return words;
}

} // namespace

void PlayScript(std::istream& in, std::ostream& out, const std::string& name, const PlayOptions& options) {
    PlaySession session(out, options);
    std::string line;
    for (int number = 1; std::getline(in, line); ++number) {
        const auto words = SplitWords(line);
        if (words.empty()) continue;
        // The echo is a transcript, not the script: control bytes are shown escaped.
        const std::string shown = line.substr(0, line.find('#'));
        out << "> " << EscapeBytes(shown) << '\n';
        try {
            session.Execute(words);
        } catch (const ScriptError& error) {
            out.flush();
            throw Error(name + ":" + std::to_string(number) + ": " + error.what());
        }
    }
    if (in.bad()) throw Error(name + ": cannot read the script");
}

// Scripts are typed by people or written by tools; anything larger is not a script.
constexpr std::size_t kMaxScriptBytes = std::size_t{64} << 20;

int RunPlay(const std::vector<std::string>& args) {
    if (args.size() != 1) throw UsageError("usage: rastertools play SCRIPT (\"-\" reads standard input)");
    const std::string& name = args[0];
    if (name == "-") {
        PlayScript(std::cin, std::cout, name);
        return 0;
    }
    // Read whole, so that a folder, a device or a pipe is named as such rather than read as an empty script.
    std::string text;
    if (auto error = Kernel::ReadWholeFile(name, text, kMaxScriptBytes)) throw Error(*error);
    std::istringstream file(text);
    PlayOptions options;
    options.folder = std::filesystem::path(name).parent_path();
    PlayScript(file, std::cout, name, options);
    return 0;
}

} // namespace App
