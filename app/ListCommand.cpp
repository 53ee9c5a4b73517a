// rastertools list: what the library registered with the host, read back from the host's registries.

#include "app/FilterArguments.h"
#include "app/Options.h"
#include "filters/Catalogue.h"
#include "host/document/DocumentController.h"
#include "host/kernel/ClassProperties.h"

#include <algorithm>
#include <cstdio>
#include <iomanip>
#include <iostream>
#include <sstream>

namespace App {

namespace {

std::string Hex(Kernel::FourCC code) {
    char text[16];
    std::snprintf(text, sizeof text, "0x%08X", unsigned(code));
    return text;
}

std::string TagName(const RasterTools::ParameterSpec& spec) {
    switch (spec.type) {
    case RasterTools::ParameterType::Double:
        return "10";
    case RasterTools::ParameterType::Bool:
        return "bool";
    case RasterTools::ParameterType::Int:
        return "7";
    case RasterTools::ParameterType::Point:
        return "36";
    }
    return "?";
}

void PrintCommand(std::ostream& out, const RasterTools::FilterInfo& info) {
    const Kernel::ClassProperties* properties = Kernel::ClassProperties::Find(info.classCode);
    const auto object = properties ? properties->CreateObject() : nullptr;
    const auto command = Kernel::CountedCast<RasterCommand>(object);
    if (!command) {
        out << "  command " << info.commandClass << ": NOT REGISTERED\n";
        return;
    }
    out << "  command " << info.commandClass << "  class code \"" << Kernel::FourCCToString(info.classCode)
        << "\" " << Hex(info.classCode) << "  tool id " << int(command->GetAssociatedToolID()) << "  \""
        << command->GetDescription().Localise() << "\"\n";
    out << "    live panel:";
    for (const auto& property : command->EnumerateReflecteds())
        out << ' ' << Kernel::FourCCToString(property->GetIdentifier()) << " \""
            << property->GetLabel().Localise() << '"';
    out << '\n';
}

} // namespace

int RunList(const std::vector<std::string>& args) {
    if (!args.empty()) throw UsageError("list takes no arguments");
    auto controller = Kernel::MakeCounted<DocumentController>(Kernel::MakeCounted<Document>());
    controller->CreateTools();

    std::ostream& out = std::cout;
    out << controller->GetTools().size() << " tools, " << CommandCoverage::Instance().GetEntries().size()
        << " commands registered\n";
    auto tools = controller->GetTools();
    std::sort(tools.begin(), tools.end(),
              [](const auto& a, const auto& b) { return a->GetToolID() < b->GetToolID(); });
    for (const auto& tool : tools) {
        const RasterTools::FilterInfo* info = RasterTools::FindFilter(tool->GetToolID());
        if (!info) {
            out << "\ntool with id " << int(tool->GetToolID()) << " (not in the catalogue)\n";
            continue;
        }
        out << '\n'
            << info->toolClass << "  tool id " << int(tool->GetToolID()) << "  name " << info->name << '\n';
        PrintCommand(out, *info);
        out << "    " << std::left << std::setw(12) << "parameter" << std::setw(6) << "id" << std::setw(14)
            << "label" << std::setw(12) << "type" << std::setw(20) << "range" << std::setw(32)
            << "settings key" << std::setw(9) << "default"
            << "serialised\n";
        const auto reflecteds = tool->EnumerateReflecteds();
        for (const auto& spec : info->parameters) {
            std::string type = "?", range;
            for (const auto& property : reflecteds)
                if (property->GetIdentifier() == spec.reflected) {
                    type = property->GetTypeName();
                    if (!property->DescribeRange().empty()) {
                        // In the units the command line takes (degrees, percent), as the help shows them.
                        const ShownParameter shown = GetShownParameter(spec);
                        range = FormatShownNumber(shown.displayMinimum) + ".." +
                                FormatShownNumber(shown.displayMaximum) + UnitSuffix(shown.unit);
                    }
                }
            const std::string key = spec.persisted ? RasterTools::SettingsKey(info->name, spec) : "-";
            out << "    " << std::setw(12) << GetShownParameter(spec).flag << std::setw(6)
                << Kernel::FourCCToString(spec.reflected) << std::setw(14)
                << ("\"" + std::string(spec.toolLabel) + "\"") << std::setw(12) << type << std::setw(20)
                << (range.empty() ? "-" : range) << std::setw(32) << key << std::setw(9)
                << FormatShownValue(spec, spec.defaultValue) << '"' << Kernel::FourCCToString(spec.code)
                << "\":" << TagName(spec) << '\n';
        }
    }
    // Commands without a tool of their own.
    for (const auto& entry : CommandCoverage::Instance().GetEntries()) {
        bool hasTool = false;
        for (const auto& info : RasterTools::GetFilterCatalogue())
            if (info.commandClass == entry.name && !info.toolClass.empty()) hasTool = true;
        if (!hasTool) out << "\ncommand " << entry.name << " (no tool)\n";
    }
    return 0;
}

} // namespace App
