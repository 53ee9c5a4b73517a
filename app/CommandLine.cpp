// The command grammar on CLI11, and the help, completion and manual texts generated from it and from the
// filter catalogue.
#include "app/CommandLine.h"

#include "app/FilterArguments.h"
#include "app/Options.h"

#include <algorithm>
#include <iostream>
#include <set>
#include <sstream>

#ifndef RASTERTOOLS_VERSION
#define RASTERTOOLS_VERSION "unknown"
#endif

namespace App {

namespace {

constexpr std::string_view kTopUsage = R"(usage: rastertools [--settings FILE] [--quiet] COMMAND [ARGS...]
       rastertools COMMAND --help        what a command does and takes
       rastertools apply FILTER --help   what a filter does, with every parameter's range and default

commands:
  list            every tool and command: class codes, tool identifiers, descriptions, parameters
  play SCRIPT     drive a tool as an editor would and print what the host sees
  apply FILTER [--PARAM VALUE]... [: FILTER [--PARAM VALUE]...]... INPUT... (OUTPUT | -o DEST)
                  filters on images: one after another in one call (separated by " : "), on many files
                  with -o FOLDER/ or -o '{stem}-sharp.jpg'; "-" reads standard input or writes standard
                  output
  doc new IMAGE -o DOC
                  a new document (.rtd) holding the image as its one raster layer
  doc filter DOC FILTER [--PARAM VALUE]... [--live]
                  changes the selected raster layers with a filter, or adds a live filter layer
  doc render DOC OUTPUT
                  flattens the document into an image file
  doc show DOC    layers, live filters, pixel selection and history
  doc undo DOC, doc redo DOC
                  undoes (redoes) one step and saves the document
  completion      prints the bash completion script
  manual          prints the manual page (troff)

options:
  --settings FILE the settings file (default: $RASTERTOOLS_SETTINGS, else
                  $XDG_CONFIG_HOME/rastertools/settings.json)
  -q, --quiet     print nothing but errors
  --version       the program's version
  -h, --help      this text

environment:
  RASTERTOOLS_DEVICE          the device when --device is not given (auto, cpu, opencl, opencl:N, cuda)
  RASTERTOOLS_LOCK_TIMEOUT    seconds a doc command waits for another one changing the same document
                              (default 10)
  RASTERTOOLS_HISTORY_BUDGET  bytes of pixels a document's history keeps for undo before dropping its
                              oldest entries (default 256M; K, M and G suffixes allowed)

pixel formats: rgba8 and rgba16 (red, green, blue, alpha; 8 or 16 bits), rgbauf (floats, unbounded),
  ia8 and ia16 (grey and alpha), cmyka8 (inks and alpha), laba16 (CIE L*a*b* and alpha, 16 bits)
)";

// CLI11 marks options that may be repeated with "..."; ours may not (a repeat is an error), so the mark goes.
std::string Tidy(std::string help) {
    for (std::size_t at; (at = help.find(" ...")) != std::string::npos;)
        help.erase(at, 4);
    return help;
}

// CLI11 says "--tile: 1 required TEXT missing"; people read "--tile needs a value".
std::string Translate(const CLI::ParseError& error) {
    const std::string what = error.what();
    const std::string name = error.get_name();
    if (name == "ArgumentMismatch" || what.find("required") != std::string::npos) {
        const auto colon = what.find(':');
        if (colon != std::string::npos && what.starts_with("-"))
            return QuoteExcerpt(what.substr(0, colon)) + " needs a value";
    }
    if (name == "ExtrasError") {
        const auto colon = what.find(':');
        return "unexpected argument" +
               EscapeBytes(
                   std::string_view(colon == std::string::npos ? what : what.substr(colon)).substr(0, 200));
    }
    return EscapeBytes(std::string_view(what).substr(0, 200));
}

std::string Example(const RasterTools::FilterInfo& filter, std::size_t index) {
    const auto& spec = filter.parameters[index];
    if (spec.name == "format") return "rgba16";
    if (!filter.samples.empty() && index < filter.samples.front().size()) {
        const auto& sample = filter.samples.front()[index];
        if (sample != spec.defaultValue) return FormatShownValue(spec, sample);
    }
    const ShownParameter shown = GetShownParameter(spec);
    switch (spec.type) {
    case RasterTools::ParameterType::Bool:
        return std::get<bool>(spec.defaultValue) ? "false" : "true";
    case RasterTools::ParameterType::Point:
        return "100,80";
    default:
        return FormatShownNumber(std::round((shown.displayMinimum + shown.displayMaximum) / 2));
    }
}

std::string ParameterHelp(const RasterTools::FilterInfo& filter, std::size_t index) {
    const auto& spec = filter.parameters[index];
    const ShownParameter shown = GetShownParameter(spec);
    std::string text = std::string(spec.toolLabel);
    if (spec.name == "format") {
        text += ": a layer format (" + LayerFormatNames() + "); default: the input's";
    } else if (spec.type == RasterTools::ParameterType::Bool) {
        text += ": true or false; default " + FormatShownValue(spec, spec.defaultValue);
    } else {
        text += ": " + FormatShownNumber(shown.displayMinimum) + " to " +
                FormatShownNumber(shown.displayMaximum) + UnitSuffix(shown.unit);
        if (shown.lowest != shown.displayMinimum || shown.highest != shown.displayMaximum)
            text += " (" + FormatShownNumber(shown.lowest) + " .. " + FormatShownNumber(shown.highest) +
                    " accepted)";
        if (spec.type == RasterTools::ParameterType::Point) text += " on each axis, as X,Y";
        const std::string value = FormatShownValue(spec, spec.defaultValue);
        text += "; default " +
                (value.find("nan") != std::string::npos ? std::string("the image's middle") : value);
    }
    return text + "; e.g. --" + shown.flag + " " + Example(filter, index);
}

} // namespace

CLI::Option* AddText(CLI::App& app, const std::string& names, TextOption& into, const std::string& help) {
    return app.add_option(names, into.values, help)
        ->allow_extra_args(false)
        ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll)
        ->type_name("VALUE");
}

void Once(const TextOption& option, const std::string& name) {
    // Which of two values was meant cannot be guessed.
    if (option.values.size() > 1) throw UsageError(name + " is given more than once");
}

bool ParseArguments(CLI::App& app, const std::vector<std::string>& args) {
    std::vector<std::string> reversed(args.rbegin(), args.rend());
    try {
        app.parse(reversed);
    } catch (const CLI::CallForHelp&) {
        std::cout << Tidy(app.help());
        return true;
    } catch (const CLI::ParseError& error) {
        throw UsageError(Translate(error));
    }
    return false;
}

void AddRenderFlags(CLI::App& app, RenderFlags& flags) {
    AddText(app, "--device", flags.device,
            "auto (a GPU where there is one, else the processor), cpu, opencl[:N] or cuda[:N]; an OpenCL "
            "device that runs on the processor only when named")
        ->type_name("DEVICE");
    AddText(app, "--tile", flags.tile,
            "tile side in pixels, " + std::to_string(kMinimumTileSize) + " to " +
                std::to_string(kMaximumTileSize) + " (default: chosen for the filter and image)")
        ->type_name("N");
    AddText(app, "--threads", flags.threads,
            "worker threads, 0 to " + std::to_string(kMaximumThreads) + " (default 0: every core)")
        ->type_name("N");
}

RenderSettings CheckRenderFlags(const RenderFlags& flags) {
    Once(flags.device, "--device");
    Once(flags.tile, "--tile");
    Once(flags.threads, "--threads");
    RenderSettings settings;
    if (flags.device.Given()) settings.device = flags.device.Value();
    if (flags.tile.Given()) settings.tileSize = ParseTileSize(flags.tile.Value());
    if (flags.threads.Given()) settings.threads = ParseThreadCount(flags.threads.Value());
    return settings;
}

void AddWriteFlags(CLI::App& app, FileFlags& flags) {
    AddText(app, "--quality", flags.quality, "JPEG, WebP and AVIF quality, 1 to 100 (default 92)")
        ->type_name("N");
    AddText(app, "--compression", flags.compression,
            "PNG and TIFF compression: none, fast, default or best; TIFF also lzw, deflate or packbits")
        ->type_name("NAME");
    AddText(app, "--output-format", flags.outputFormat,
            "the output's file type where no file name says it (writing to -): png, jpeg, tiff, webp, avif, "
            "heic, exr")
        ->type_name("TYPE");
}

void AddReadFlags(CLI::App& app, FileFlags& flags) {
    app.add_flag("--auto-orient", flags.autoOrient,
                 "turns the pixels upright as the camera's orientation tag says, and resets the tag");
}

std::unique_ptr<CLI::App> MakeApplyApp(ApplyFlags& flags, bool withFormat) {
    auto app = std::make_unique<CLI::App>(
        "Applies filters to images. Several filters separated by \" : \" run one after another; several "
        "inputs with -o FOLDER/ or -o PATTERN ({stem}, {name}, {ext}) are each written to their own file. "
        "\"-\" as input reads standard input, as output writes standard output.",
        "rastertools apply");
    app->set_help_flag("-h,--help", "what apply (or, after a filter's name, the filter) takes");
    app->add_option("FILTER INPUT OUTPUT", flags.positional, "the filter, then the files")->type_name("");
    AddRenderFlags(*app, flags.render);
    AddText(*app, "--mask", flags.mask, "an 8-bit grey image the size of the output: white selects")
        ->type_name("GREY.png");
    AddText(*app, "--channels", flags.channels, "the channels written, named (rgb, a, ...) or as a number")
        ->type_name("CHANNELS");
    if (withFormat)
        AddText(*app, "--format", flags.format,
                "the layer format the input is converted to first (" + LayerFormatNames() + ")")
            ->type_name("FORMAT");
    AddText(*app, "-o,--output", flags.output,
            "where the results go: a folder (ending in /) or a name pattern with {stem}, {name}, {ext}")
        ->type_name("DEST");
    AddWriteFlags(*app, flags.files);
    AddReadFlags(*app, flags.files);
    app->footer("filters:\n" + FilterList() +
                "\nexample:\n  rastertools apply unsharpmask --radius 2 "
                "--factor 1.5 portrait.jpg portrait-sharp.jpg\n"
                "  rastertools apply twirl --angle 90 : unsharpmask --radius 2 "
                "in.png out.png\n"
                "  rastertools apply addnoise --intensity 3 *.jpg -o "
                "'{stem}-grain.jpg'\n");
    return app;
}

std::unique_ptr<CLI::App> MakeDocApp(const std::string& subcommand, DocFlags& flags) {
    auto app = std::make_unique<CLI::App>("", "rastertools doc " + subcommand);
    app->set_help_flag("-h,--help", "what this command takes");
    if (subcommand == "new") {
        app->description("A new document (.rtd) holding the image as its one raster layer. An existing file "
                         "that is not a document is only replaced with --force.");
        app->add_option("IMAGE", flags.positional, "the picture")->type_name("");
        AddText(*app, "-o,--output", flags.output, "the document to write")->type_name("DOC");
        AddText(*app, "--format", flags.format, "the layer's format (" + LayerFormatNames() + ")")
            ->type_name("FORMAT");
        app->add_flag("--force", flags.force, "replaces a file that is not a document");
        AddReadFlags(*app, flags.files);
    } else if (subcommand == "filter") {
        app->description(
            "Changes the selected raster layers (else the top one) with a filter, or with --live "
            "adds a live filter layer on top that holds it. The filter's parameters are those "
            "of rastertools apply FILTER --help.");
        app->add_option("DOC FILTER", flags.positional, "the document and the filter")->type_name("");
        app->add_flag("--live", flags.live, "adds a live filter layer instead of changing pixels");
        AddRenderFlags(*app, flags.render);
    } else if (subcommand == "render") {
        app->description("Flattens the document into an image file.");
        app->add_option("DOC OUTPUT", flags.positional, "the document and the image to write")->type_name("");
        AddText(*app, "--format", flags.format, "the image's layer format (" + LayerFormatNames() + ")")
            ->type_name("FORMAT");
        AddRenderFlags(*app, flags.render);
        AddWriteFlags(*app, flags.files);
    } else {
        app->description(subcommand == "show"   ? "Layers, live filters, pixel selection and history."
                         : subcommand == "undo" ? "Undoes one step and saves the document."
                                                : "Redoes one step and saves the document.");
        app->add_option("DOC", flags.positional, "the document")->type_name("");
    }
    // --live and --force standing where they do not belong get messages of their own.
    if (subcommand != "filter") app->add_flag("--live", flags.live)->group("");
    if (subcommand != "new") app->add_flag("--force", flags.force)->group("");
    return app;
}

void AddFilterParameters(CLI::App& app, const RasterTools::FilterInfo& filter,
                         std::vector<TextOption>& values) {
    values.resize(filter.parameters.size() + filter.textFlags.size());
    // Text flags (equations, inputs, files): the filter's command checks them.
    for (std::size_t i = 0; i < filter.textFlags.size(); ++i)
        AddText(app, "--" + std::string(filter.textFlags[i]), values[filter.parameters.size() + i],
                i < filter.textFlagHelp.size() ? std::string(filter.textFlagHelp[i]) : "text for the filter")
            ->type_name("TEXT")
            ->group("Parameters of " + std::string(filter.name));
    for (std::size_t i = 0; i < filter.parameters.size(); ++i) {
        const auto& spec = filter.parameters[i];
        AddText(app, "--" + GetShownParameter(spec).flag, values[i], ParameterHelp(filter, i))
            ->type_name(spec.type == RasterTools::ParameterType::Point  ? "X,Y"
                        : spec.type == RasterTools::ParameterType::Bool ? "BOOL"
                        : spec.name == "format"                         ? "FORMAT"
                                                                        : "NUMBER")
            ->group("Parameters of " + std::string(filter.name));
    }
}

std::vector<std::pair<std::string, std::string>> FilterParameterTexts(const RasterTools::FilterInfo& filter,
                                                                      const std::vector<TextOption>& values) {
    std::vector<std::pair<std::string, std::string>> texts;
    for (std::size_t i = 0; i < values.size(); ++i) {
        const std::string flag = i < filter.parameters.size()
                                     ? GetShownParameter(filter.parameters[i]).flag
                                     : std::string(filter.textFlags[i - filter.parameters.size()]);
        for (const auto& value : values[i].values)
            texts.emplace_back(flag, value);
    }
    return texts;
}

std::string FilterHelp(const RasterTools::FilterInfo& filter) {
    ApplyFlags flags;
    const bool hasFormat = std::any_of(filter.parameters.begin(), filter.parameters.end(),
                                       [](const auto& spec) { return spec.name == "format"; });
    auto app = MakeApplyApp(flags, !hasFormat);
    app->name("rastertools apply " + std::string(filter.name));
    app->description(std::string(filter.description) + " (" + std::string(filter.commandClass) + ")." +
                     (filter.parameters.empty() ? " It takes no parameters." : ""));
    std::vector<TextOption> values;
    AddFilterParameters(*app, filter, values);
    std::string example = "rastertools apply " + std::string(filter.name);
    for (std::size_t i = 0; i < filter.parameters.size(); ++i)
        if (filter.parameters[i].type != RasterTools::ParameterType::Point &&
            filter.parameters[i].name != "format")
            example += " --" + GetShownParameter(filter.parameters[i]).flag + " " + Example(filter, i);
    app->footer("example:\n  " + example + " photo.jpg result.jpg\n");
    return Tidy(app->help());
}

std::string FilterList() {
    std::string text;
    for (const auto& filter : RasterTools::GetFilterCatalogue()) {
        std::string line = "  " + std::string(filter.name);
        line.resize(std::max<std::size_t>(line.size() + 1, 16), ' ');
        text += line + std::string(filter.description) + "\n";
    }
    return text;
}

std::string TopLevelHelp() {
    return std::string(kTopUsage) + "\nfilters (rastertools apply FILTER --help):\n" + FilterList();
}

std::string CommandHelp(const std::string& command) {
    if (command == "apply") {
        ApplyFlags flags;
        return Tidy(MakeApplyApp(flags)->help());
    }
    if (command.starts_with("doc ")) {
        const std::string sub = command.substr(4);
        if (std::find(std::begin(kDocSubcommands), std::end(kDocSubcommands), sub) ==
            std::end(kDocSubcommands))
            return {};
        DocFlags flags;
        return Tidy(MakeDocApp(sub, flags)->help());
    }
    if (command == "doc") {
        std::string text = "usage: rastertools doc SUBCOMMAND ... (rastertools doc SUBCOMMAND --help)\n\n";
        for (const auto sub : kDocSubcommands) {
            DocFlags flags;
            text += "doc " + std::string(sub) + ": " +
                    MakeDocApp(std::string(sub), flags)->get_description() + "\n";
        }
        return text;
    }
    if (command == "list")
        return "usage: rastertools list\n\nEvery tool and command the library registered: class codes, tool "
               "identifiers, descriptions, parameters with their ranges in the units the command line "
               "takes.\n";
    if (command == "play")
        return "usage: rastertools play SCRIPT\n\nDrives a tool as an editor would and prints what the host "
               "sees. SCRIPT is a file (\"-\" reads standard input); its verbs are tool, start, drag, click, "
               "set, "
               "reset, commit, cancel, leave, select, select-live, add-live, save, load, render and show. "
               "File "
               "names in a script are taken from the script's folder.\n";
    return {};
}

std::string BashCompletion() {
    std::string filters;
    for (const auto& filter : RasterTools::GetFilterCatalogue())
        filters += (filters.empty() ? "" : " ") + std::string(filter.name);
    std::string formats = LayerFormatNames();
    std::replace(formats.begin(), formats.end(), ',', ' ');
    std::ostringstream out;
    out << "# bash completion for rastertools, generated from its command tree and filter catalogue\n"
        << "_rastertools() {\n"
        << "  local cur=${COMP_WORDS[COMP_CWORD]} prev=${COMP_WORDS[COMP_CWORD-1]}\n"
        << "  local commands='list play apply doc completion manual' filters='" << filters << "'\n"
        << "  local common='--device --tile --threads --mask --channels --format -o --output --quality "
           "--compression --output-format --auto-orient --help'\n"
        << "  case $prev in\n"
        << "    --device) COMPREPLY=($(compgen -W 'auto cpu opencl cuda' -- \"$cur\")); return;;\n"
        << "    --format) COMPREPLY=($(compgen -W '" << formats << "' -- \"$cur\")); return;;\n"
        << "    --output-format) COMPREPLY=($(compgen -W 'png jpeg tiff webp avif heic exr' -- \"$cur\")); "
           "return;;\n"
        << "  esac\n"
        << "  if [ \"$COMP_CWORD\" -eq 1 ]; then COMPREPLY=($(compgen -W \"$commands --help --version "
           "--settings --quiet\" -- \"$cur\")); return; fi\n"
        << "  local i filter='' command=${COMP_WORDS[1]}\n"
        << "  if [ \"$command\" = doc ] && [ \"$COMP_CWORD\" -eq 2 ]; then\n"
        << "    COMPREPLY=($(compgen -W '";
    for (const auto sub : kDocSubcommands)
        out << sub << ' ';
    out << "' -- \"$cur\")); return; fi\n"
        << "  for ((i = 2; i < COMP_CWORD; i++)); do\n"
        << "    case ${COMP_WORDS[i]} in :) filter='';; -*) ;; *) [ -z \"$filter\" ] && [[ \" $filters \" == "
           "*\" ${COMP_WORDS[i]} \"* ]] && filter=${COMP_WORDS[i]};; esac\n"
        << "  done\n"
        << "  local flags=$common\n"
        << "  case $filter in\n";
    for (const auto& filter : RasterTools::GetFilterCatalogue()) {
        out << "    " << filter.name << ") flags=\"$flags";
        for (const auto& spec : filter.parameters)
            out << " --" << GetShownParameter(spec).flag;
        out << "\";;\n";
    }
    out << "  esac\n"
        << "  if [[ $cur == -* ]]; then COMPREPLY=($(compgen -W \"$flags\" -- \"$cur\"));\n"
        << "  elif [ -z \"$filter\" ] && { [ \"$command\" = apply ] || [ \"${COMP_WORDS[2]}\" = filter ]; }; "
           "then\n"
        << "    COMPREPLY=($(compgen -W \"$filters\" -- \"$cur\") $(compgen -f -- \"$cur\"));\n"
        << "  else COMPREPLY=($(compgen -f -- \"$cur\")); fi\n"
        << "}\n"
        << "complete -o filenames -F _rastertools rastertools\n";
    return out.str();
}

namespace {

// Help text as a troff block shown as it stands.
std::string Troff(const std::string& text) {
    std::string out = ".nf\n";
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) {
        std::string escaped;
        for (const char c : line)
            escaped += c == '\\' ? std::string("\\e") : c == '-' ? std::string("\\-") : std::string(1, c);
        if (!escaped.empty() && (escaped[0] == '.' || escaped[0] == '\'')) escaped = "\\&" + escaped;
        out += escaped + "\n";
    }
    return out + ".fi\n";
}

} // namespace

std::string ManualPage() {
    std::string page =
        ".TH RASTERTOOLS 1 \"\" \"rastertools " + std::string(Version()) +
        "\" \"User Commands\"\n.SH NAME\nrastertools \\- raster filters, layered documents and "
        "tool scripts from the command line\n.SH SYNOPSIS\n";
    page += Troff(TopLevelHelp());
    page += ".SH COMMANDS\n";
    for (const std::string command :
         {"list", "play", "apply", "doc new", "doc filter", "doc render", "doc show", "doc undo", "doc redo"})
        page += ".SS " + command + "\n" + Troff(CommandHelp(command));
    page += ".SH FILTERS\n";
    for (const auto& filter : RasterTools::GetFilterCatalogue())
        page += ".SS " + std::string(filter.name) + "\n" + Troff(FilterHelp(filter));
    page += ".SH EXIT STATUS\n0 success, 1 a failure while working (in a batch: any file failed), 2 a bad "
            "command line.\n";
    return page;
}

std::string_view Version() {
    return RASTERTOOLS_VERSION;
}

} // namespace App
