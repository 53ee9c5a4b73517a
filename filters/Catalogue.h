#pragma once
// The library's filters by name, for front ends: parameters, codes and a way to build each command.

#include "frame/Parameters.h"
#include "host/document/Command.h"
#include "host/document/ToolID.h"
#include "pipeline/DeviceSteps.h"

#include <functional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace RasterTools {

struct FilterInfo {
    std::string_view name;         // settings name and command-line name, e.g. "addnoise"
    std::string_view toolClass;    // "NoiseTool"; empty for commands without a tool
    std::string_view commandClass; // "RasterAddNoiseCommand"
    std::string_view description;  // the command's description
    ToolID toolID;
    Kernel::FourCC classCode;
    std::vector<ParameterSpec> parameters;
    // A command with the given values, in parameter order.
    std::function<Kernel::Counted<RasterCommand>(bool liveEffect, const std::vector<ParameterValue>& values)>
        makeCommand;
    // Whether command is one of this filter's.
    std::function<bool(const Command& command)> isCommand;
    // The values of a command of this filter, in parameter order (the caller checks isCommand first).
    std::function<std::vector<ParameterValue>(const Command& command)> readCommand;
    // Values worth rendering besides the parameter table's corners and defaults (a filter's kSamples), in
    // parameter order; used by the conformance tests.
    std::vector<std::vector<ParameterValue>> samples;
    // Flags that carry text (equations, files) rather than a table value, and may be given more than once; a
    // filter with any makes its commands through makeCommandWithText, from the table's values and these
    // (flag without dashes, text) in order. Null when something does not fit; error says what.
    std::vector<std::string_view> textFlags;
    // What each text flag takes, a line each for the help (parallel to textFlags; empty: a generic line).
    std::vector<std::string_view> textFlagHelp;
    std::function<Kernel::Counted<RasterCommand>(
        bool liveEffect, const std::vector<ParameterValue>& values,
        const std::vector<std::pair<std::string, std::string>>& texts, std::string& error)>
        makeCommandWithText;
    // The device kernels of the filter for a language and layer format, as texts, for checks that compile
    // them; empty for a filter that declares none.
    std::function<std::vector<DeviceKernelText>(Raster::HardwareKernelLanguage language,
                                                Raster::PixelFormat format)>
        kernelTexts;
};

// Every filter of the library, sorted by name. Built on first use, not at load.
const std::vector<FilterInfo>& GetFilterCatalogue();
const FilterInfo* FindFilter(std::string_view name);
const FilterInfo* FindFilter(ToolID tool);
// The catalogue entry of a command object, or null when the library does not know it.
const FilterInfo* FindFilterOf(const Command& command);

// Called at load by each filter's registration object (frame/Registration.h): describe builds its entry.
void RegisterFilter(FilterInfo (*describe)());

} // namespace RasterTools
