#pragma once
// Load-time registration of the library's command classes and tools with the host.

#include "host/document/Command.h"
#include "host/document/DocumentController.h"

#include <typeinfo>

namespace RasterTools {

// Enters a command class in the host's coverage list under its class name.
template <class CommandClass>
struct CommandRegistration {
    explicit CommandRegistration(const char* className) {
        CommandCoverage::Instance().Register(typeid(CommandClass), className);
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
