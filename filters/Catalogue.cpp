#include "filters/Catalogue.h"

#include "filters/blur/MotionBlurTool.h"
#include "filters/blur/RasterMotionBlurCommand.h"
#include "filters/copy/RasterCopyCommand.h"
#include "filters/distort/RasterSphereCommand.h"
#include "filters/distort/RasterTwirlCommand.h"
#include "filters/distort/SphereTool.h"
#include "filters/distort/TwirlTool.h"
#include "filters/tonal/DiffuseTool.h"
#include "filters/tonal/NoiseTool.h"
#include "filters/tonal/RasterAddNoiseCommand.h"
#include "filters/tonal/RasterDiffuseCommand.h"
#include "filters/tonal/RasterUnsharpMaskCommand.h"
#include "filters/tonal/RasterVerticalEdgeDetectCommand.h"
#include "filters/tonal/UnsharpMaskTool.h"

#include <algorithm>

namespace RasterTools {

namespace {

template <class Filter>
FilterInfo Describe(std::string_view toolClass, std::string_view commandClass) {
    using Params = typename Filter::Params;
    using CommandClass = typename Filter::Command;
    FilterInfo info{.name = Filter::kName,
                    .toolClass = toolClass,
                    .commandClass = commandClass,
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
    return info;
}

} // namespace

const std::vector<FilterInfo>& GetFilterCatalogue() {
    static const std::vector<FilterInfo> catalogue = {
        Describe<AddNoiseFilter>("NoiseTool", "RasterAddNoiseCommand"),
        Describe<DiffuseFilter>("DiffuseTool", "RasterDiffuseCommand"),
        Describe<UnsharpMaskFilter>("UnsharpMaskTool", "RasterUnsharpMaskCommand"),
        Describe<CopyFilter>("", "RasterCopyCommand"),
        Describe<MotionBlurFilter>("MotionBlurTool", "RasterMotionBlurCommand"),
        Describe<TwirlFilter>("TwirlTool", "RasterTwirlCommand"),
        Describe<SphereFilter>("SphereTool", "RasterSphereCommand"),
        Describe<VerticalEdgeDetectFilter>("", "RasterVerticalEdgeDetectCommand"),
    };
    return catalogue;
}

const FilterInfo* FindFilter(std::string_view name) {
    const auto& catalogue = GetFilterCatalogue();
    auto it =
        std::find_if(catalogue.begin(), catalogue.end(), [&](const FilterInfo& f) { return f.name == name; });
    return it == catalogue.end() ? nullptr : &*it;
}

const FilterInfo* FindFilter(ToolID tool) {
    const auto& catalogue = GetFilterCatalogue();
    auto it = std::find_if(catalogue.begin(), catalogue.end(),
                           [&](const FilterInfo& f) { return f.toolID == tool; });
    return it == catalogue.end() ? nullptr : &*it;
}

const FilterInfo* FindFilterOf(const Command& command) {
    for (const auto& info : GetFilterCatalogue())
        if (info.isCommand(command)) return &info;
    return nullptr;
}

} // namespace RasterTools
