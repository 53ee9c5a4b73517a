// Loading the library registers every command class and tool with the host, and does nothing else.

#include "host/document/Command.h"
#include "host/document/DocumentController.h"
#include "host/document/VeyraController.h"
#include "host/kernel/ClassProperties.h"

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <set>

namespace {

struct Snapshot {
    long liveObjects;
    std::size_t tools;
    std::size_t commands;
    std::size_t classes;
    unsigned long settingsAccesses;
};

Snapshot Take() {
    return {Kernel::Countable::GetLiveObjectCount(), DocumentController::GetRegisteredToolCount(),
            CommandCoverage::Instance().GetEntries().size(), Kernel::ClassProperties::GetRegistered().size(),
            VeyraController::GetInstance().GetAccessCount()};
}

} // namespace

TEST(LibraryLoad, RegistersCommandsAndToolsAndNothingElse) {
    for (const char* code : {"RANC", "RDf2", "RUSC"})
        ASSERT_EQ(Kernel::ClassProperties::Find(*Kernel::ParseFourCC(code)), nullptr) << "already loaded?";
    const Snapshot before = Take();

    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();
    // Kept loaded for the process: the host holds factories that point into it.
    void* library = dlopen(RASTERTOOLS_LIBRARY, RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
    const std::string printed =
        testing::internal::GetCapturedStdout() + testing::internal::GetCapturedStderr();
    ASSERT_NE(library, nullptr) << dlerror();
    const Snapshot after = Take();

    // Registration only: no object was created, the settings store was not touched, nothing was printed.
    EXPECT_EQ(after.liveObjects, before.liveObjects);
    EXPECT_EQ(after.settingsAccesses, before.settingsAccesses);
    EXPECT_EQ(printed, "");
    // Every command class enters both registries; the tools are at least the three filter tools.
    EXPECT_GE(after.tools, before.tools + 3);
    EXPECT_GE(after.commands, before.commands + 3);
    EXPECT_EQ(after.classes - before.classes, after.commands - before.commands);

    // Each class is found by its code, derives from the live filter layer base, and can be created.
    const auto entries = CommandCoverage::Instance().GetEntries();
    std::set<std::string> names;
    for (const auto& entry : entries)
        names.insert(entry.name);
    const struct {
        const char* code;
        const char* name;
        int tool;
    } expected[] = {{"RANC", "RasterAddNoiseCommand", 55},
                    {"RDf2", "RasterDiffuseCommand", 56},
                    {"RUSC", "RasterUnsharpMaskCommand", 81}};
    for (const auto& row : expected) {
        SCOPED_TRACE(row.name);
        EXPECT_TRUE(names.count(row.name));
        const auto* properties = Kernel::ClassProperties::Find(*Kernel::ParseFourCC(row.code));
        ASSERT_NE(properties, nullptr);
        EXPECT_EQ(properties->GetVersion(), 1);
        EXPECT_TRUE(
            properties->IsKindOf(RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties()));
        auto command = Kernel::CountedCast<RasterCommand>(properties->CreateObject());
        ASSERT_TRUE(command);
        EXPECT_EQ(int(command->GetAssociatedToolID()), row.tool);
        const auto entry = std::find_if(entries.begin(), entries.end(),
                                        [&](const CommandCoverage::Entry& e) { return e.name == row.name; });
        ASSERT_NE(entry, entries.end());
        EXPECT_TRUE(typeid(*command) == *entry->type);
    }

    // The registered factories create one tool each, with the commands' identifiers.
    auto controller = Kernel::MakeCounted<DocumentController>(Kernel::MakeCounted<Document>());
    controller->CreateTools();
    std::set<int> ids;
    for (const auto& tool : controller->GetTools())
        ids.insert(int(tool->GetToolID()));
    EXPECT_EQ(ids.size(), controller->GetTools().size()) << "two tools share an identifier";
    EXPECT_EQ(controller->GetTools().size(), after.tools - before.tools);
    for (int id : {55, 56, 81})
        EXPECT_TRUE(ids.count(id)) << id;
}
