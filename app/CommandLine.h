#pragma once
// The command line's grammar on CLI11: every command's options with their help, shared by the parsers, the
// help texts, the bash completion script and the manual page.

#include "filters/Catalogue.h"

#include <CLI/CLI.hpp>
#include <memory>
#include <string>
#include <vector>

namespace App {

// An option with one value kept as typed (values are checked by our own parsers, so that messages speak the
// user's words); given twice is an error that Once reports.
struct TextOption {
    std::vector<std::string> values;
    bool Given() const noexcept { return !values.empty(); }
    const std::string& Value() const { return values.front(); }
};
CLI::Option* AddText(CLI::App& app, const std::string& names, TextOption& into, const std::string& help);
// A UsageError when an option was given more than once.
void Once(const TextOption& option, const std::string& name);

// Parses args (in order) with app; CLI11's errors become UsageErrors. True when help was asked for and
// printed.
bool ParseArguments(CLI::App& app, const std::vector<std::string>& args);

// The options every rendering command shares: the device, tiles and threads.
struct RenderFlags {
    TextOption device, tile, threads;
};
void AddRenderFlags(CLI::App& app, RenderFlags& flags);
// The rendering options as given, checked: each at most once, the tile side and threads within their bounds.
struct RenderSettings {
    std::string device; // empty: not given
    int tileSize = 0;   // 0: chosen for the filter and image
    int threads = 0;    // 0: every core
};
RenderSettings CheckRenderFlags(const RenderFlags& flags);

// Output and input flags wired to the image reader and writer.
struct FileFlags {
    TextOption quality, compression, outputFormat;
    bool autoOrient = false;
};
void AddWriteFlags(CLI::App& app, FileFlags& flags);
void AddReadFlags(CLI::App& app, FileFlags& flags);

// apply: FILTER [--PARAM VALUE]... [: FILTER ...]... INPUT... [OUTPUT] with these options.
struct ApplyFlags {
    RenderFlags render;
    FileFlags files;
    TextOption mask, channels, output, format;
    std::vector<std::string> positional;
};
std::unique_ptr<CLI::App> MakeApplyApp(ApplyFlags& flags, bool withFormat = true);

// doc SUBCOMMAND: the options of each.
struct DocFlags {
    RenderFlags render;
    FileFlags files;
    TextOption output, format;
    bool live = false, force = false;
    std::vector<std::string> positional;
};
std::unique_ptr<CLI::App> MakeDocApp(const std::string& subcommand, DocFlags& flags);
constexpr std::string_view kDocSubcommands[] = {"new", "filter", "render", "show", "undo", "redo"};

// One option per parameter of filter, named by its shown flag, with its range, default, unit and an example,
// then one per text flag of the filter.
void AddFilterParameters(CLI::App& app, const RasterTools::FilterInfo& filter,
                         std::vector<TextOption>& values);
// The (flag, text) pairs that values, filled by AddFilterParameters, hold, in the order of the options.
std::vector<std::pair<std::string, std::string>> FilterParameterTexts(const RasterTools::FilterInfo& filter,
                                                                      const std::vector<TextOption>& values);
// What rastertools apply FILTER --help prints.
std::string FilterHelp(const RasterTools::FilterInfo& filter);
// Every filter with its description, one a line, for help texts.
std::string FilterList();

// The whole command tree for the top-level help, the completion script and the manual page.
std::string TopLevelHelp();
std::string BashCompletion();
std::string ManualPage();
// The help of COMMAND (and SUBCOMMAND): "apply", "doc filter"; empty when there is no such command.
std::string CommandHelp(const std::string& command);

std::string_view Version();

} // namespace App
