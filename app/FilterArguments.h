#pragma once
// Filter names and `--PARAM VALUE` arguments on the command line, shared by apply and doc filter.

#include "filters/Catalogue.h"

#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace App {

// The catalogue entry for name; a UsageError listing the filters when there is none.
const RasterTools::FilterInfo& RequireFilter(const std::string& name);

// How people type and read a parameter: its flag, unit and range in the units they think in (degrees,
// percent), and the factor from the stored number (shown = stored x scale).
struct ShownParameter {
    std::string flag; // without the dashes
    double scale = 1.0;
    Kernel::UnitKind unit = Kernel::UnitKind::None;
    double displayMinimum = 0.0; // the panel's range
    double displayMaximum = 0.0;
    double lowest = 0.0; // the values accepted
    double highest = 0.0;
};
ShownParameter GetShownParameter(const RasterTools::ParameterSpec& spec);
// " %", " degrees", " pixels" or nothing.
std::string UnitSuffix(Kernel::UnitKind unit);
// A shown number without the noise of the conversion (90, not 89.99999999999999).
std::string FormatShownNumber(double value);
// A stored value as people read it.
std::string FormatShownValue(const RasterTools::ParameterSpec& spec,
                             const RasterTools::ParameterValue& stored);
// The stored value of text typed in shown units. A UsageError starting with label when the text is not a
// value of the parameter's type ("\"ninety\" is not a number") or lies outside the accepted values.
RasterTools::ParameterValue ParseShownValue(const RasterTools::ParameterSpec& spec, const std::string& text,
                                            const std::string& label);
// "must lie within 0 .. 100 %" in shown units.
std::string DescribeShownRange(const RasterTools::ParameterSpec& spec);
// The parameter whose flag (or reflected identifier, for scripts) is name; null when there is none.
const RasterTools::ParameterSpec* FindShownParameter(const RasterTools::FilterInfo& filter,
                                                     std::string_view name);
// "--radius, --angle": the flags a filter takes.
std::string ParameterFlags(const RasterTools::FilterInfo& filter);

// The filter's defaults with the given (name, text) pairs parsed over them, in parameter order. An unknown
// name, a value that does not parse or one out of range is a UsageError saying what is accepted.
std::vector<RasterTools::ParameterValue>
ParseFilterParameters(const RasterTools::FilterInfo& filter,
                      const std::vector<std::pair<std::string, std::string>>& parameters);

// The filter's command from (name, text) pairs: the table's parameters as ParseFilterParameters reads them,
// and the text flags of filters that have them (which may repeat). An Error saying why when the command
// cannot be made from the texts (an equation that does not compile, a file that cannot be read).
Kernel::Counted<RasterCommand>
MakeFilterCommand(const RasterTools::FilterInfo& filter, bool liveEffect,
                  const std::vector<std::pair<std::string, std::string>>& parameters);
// Whether flag (without dashes) is a text flag of the filter named filterName.
bool IsTextFlag(const std::string& filterName, std::string_view flag);

// "--format rgba16 --scale 1,1": a command's parameters as they would be typed.
std::string DescribeParameterValues(const RasterTools::FilterInfo& filter,
                                    const std::vector<RasterTools::ParameterValue>& values);

// A whole number from minimum to maximum for option, or a UsageError.
int ParseCount(const std::string& option, const std::string& text, int minimum, int maximum = 1 << 30);

// The smallest tile side and the most worker threads accepted: smaller tiles or more threads only multiply
// the work each tile repeats (its margins, its set-up) without rendering anything more.
constexpr int kMinimumTileSize = 16;
constexpr int kMaximumTileSize = 1 << 16;
constexpr int kMaximumThreads = 256;
// --tile N and --threads N, within the bounds above (threads 0: every core).
int ParseTileSize(const std::string& text);
int ParseThreadCount(const std::string& text);

// text with every byte that is not printable ASCII written as \xNN.
std::string EscapeBytes(std::string_view text);
// text in double quotes for a message: at most limit characters of it (then "..."), with bytes that are
// not printable ASCII escaped, so that a message never carries raw binary or a whole file.
std::string QuoteExcerpt(std::string_view text, std::size_t limit = 40);

// What `apply` decides from its arguments alone, before it reads a file: the commands of the chain, the
// format to convert the input to (-1: none), the tile side (0: chosen for the image) and the threads (0:
// every core).
struct CheckedApply {
    Kernel::Counted<RasterCommand> command; // the chain's first
    std::vector<Kernel::Counted<RasterCommand>> chain;
    std::vector<std::string> names; // the filters' names, in chain order
    int loadFormat = -1;
    int tileSize = 0;
    int threads = 0;
};
// Every check `apply` makes of its arguments; a UsageError (or Error) names what is wrong.
CheckedApply CheckApplyArguments(const std::vector<std::string>& args);

// The layer formats' names, comma separated.
std::string LayerFormatNames();

} // namespace App
