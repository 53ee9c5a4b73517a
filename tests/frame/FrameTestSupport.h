#pragma once
// A document, a controller with the library's tools and a private settings file, for tool and command tests.

#include "host/document/DocumentController.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <string>
#include <vector>

namespace RasterToolsTest {

class EditorFixture : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;

    // Makes the tool with this identifier current and starts it, as picking it in the toolbar does.
    Kernel::Counted<Tool> StartTool(ToolID id);
    // Adds a live filter layer holding command above the background and returns it.
    Kernel::Counted<FilterRasterNode> AddLiveLayer(Kernel::Counted<Command> command);
    // Events the host reported since the last call.
    std::vector<std::string> TakeEvents();
    // Whether any event reported since the last TakeEvents starts with prefix.
    bool SawEvent(const std::string& prefix) const;
    std::string ReadSettingsFile() const;

    std::filesystem::path m_SettingsFile;
    Kernel::Counted<Document> m_Document;
    Kernel::Counted<DocumentController> m_Controller;
    Kernel::Counted<Node> m_Background;
    Kernel::Counted<Tool> m_Tool;
    std::vector<std::string> m_Events;
};

} // namespace RasterToolsTest
