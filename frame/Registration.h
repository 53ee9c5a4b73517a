#pragma once
// Load-time registration of the library's command classes and tools with the host, and of each filter with
// the library's catalogue: one object per filter, in the unit that gives its stage text (or its command's
// source file, for commands with one).

#include "filters/Catalogue.h"
#include "frame/KernelTexts.h"
#include "host/document/Command.h"
#include "host/document/DocumentController.h"

#include <type_traits>
#include <typeinfo>

namespace RasterTools {

namespace Detail {

// The catalogue entry of Filter, built from its table when the catalogue is first used. KernelTexts gives
// the device kernels of a command that renders in several steps (single-pass commands need none).
template <class Filter, auto KernelTexts>
FilterInfo Describe() {
    using Params = typename Filter::Params;
    using CommandClass = typename Filter::Command;
    FilterInfo info{.name = Filter::kName,
                    .toolClass = Filter::kToolClass,
                    .commandClass = Filter::kCommandClass,
                    .description = Filter::kDescription,
                    .toolID = Filter::kToolID,
                    .classCode = CommandClass::GetTypeClassProperties().GetClassCode(),
                    .parameters = {},
                    .makeCommand = {},
                    .isCommand = {},
                    .readCommand = {}};
    for (const auto& parameter : Filter::kParameters)
        info.parameters.push_back(parameter.spec);
    if constexpr (requires { Filter::kSamples; })
        for (const Params& sample : Filter::kSamples) {
            std::vector<ParameterValue> values;
            for (const auto& parameter : Filter::kParameters)
                values.push_back(GetParameter(sample, parameter));
            info.samples.push_back(std::move(values));
        }
    info.makeCommand = [](bool liveEffect, const std::vector<ParameterValue>& values) {
        Params params = DefaultParameters(Filter::kParameters);
        for (std::size_t i = 0; i < values.size() && i < Filter::kParameters.size(); ++i)
            SetParameter(params, Filter::kParameters[i], values[i]);
        return Kernel::Counted<RasterCommand>(new CommandClass(liveEffect, params));
    };
    info.isCommand = [](const Command& command) {
        return dynamic_cast<const CommandClass*>(&command) != nullptr;
    };
    info.readCommand = [](const Command& command) {
        std::vector<ParameterValue> values;
        if (const auto* own = dynamic_cast<const CommandClass*>(&command))
            for (const auto& parameter : Filter::kParameters)
                values.push_back(GetParameter(own->GetParameters(), parameter));
        return values;
    };
    if constexpr (requires { Filter::kTextFlags; }) {
        info.textFlags.assign(Filter::kTextFlags.begin(), Filter::kTextFlags.end());
        static_assert(Filter::kTextFlagHelp.size() == Filter::kTextFlags.size());
        info.textFlagHelp.assign(Filter::kTextFlagHelp.begin(), Filter::kTextFlagHelp.end());
        info.makeCommandWithText = &CommandClass::MakeCommandWithText;
    }
    if constexpr (requires { typename CommandClass::template PlainStages<Raster::PixelFormat::RGBA8>; })
        info.kernelTexts = &GetSinglePassKernelTexts<CommandClass>;
    else if constexpr (!std::is_null_pointer_v<decltype(KernelTexts)>)
        info.kernelTexts = KernelTexts;
    return info;
}

} // namespace Detail

// Enters Filter's command class in the host's coverage list under the class name its table declares, and the
// filter in the catalogue. KernelTexts: see Detail::Describe.
template <class Filter, auto KernelTexts = nullptr>
struct FilterRegistration {
    FilterRegistration() {
        CommandCoverage::Instance().Register(typeid(typename Filter::Command),
                                             std::string(Filter::kCommandClass));
        RegisterFilter(&Detail::Describe<Filter, KernelTexts>);
    }
};

// Gives the document controller a factory that creates the tool for each new document.
template <class ToolClass>
struct ToolRegistration {
    ToolRegistration() {
        DocumentController::RegisterTool(
            [](Kernel::NonCounted<DocumentController> controller) { ToolClass::CreateTool(controller); });
    }
};

} // namespace RasterTools
