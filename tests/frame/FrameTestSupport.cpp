#include "tests/frame/FrameTestSupport.h"

#include "host/document/VeyraController.h"

#include <algorithm>
#include <fstream>
#include <sstream>
#include <unistd.h>

namespace RasterToolsTest {

void EditorFixture::SetUp() {
    const auto* test = ::testing::UnitTest::GetInstance()->current_test_info();
    m_SettingsFile =
        std::filesystem::temp_directory_path() / ("rastertools-" + std::to_string(::getpid()) + "-" +
                                                  test->test_suite_name() + "-" + test->name() + ".json");
    std::filesystem::remove(m_SettingsFile);
    VeyraController::GetInstance().SetFile(m_SettingsFile);

    m_Document = Kernel::MakeCounted<Document>();
    m_Background = Kernel::Counted<Node>(new RasterNode("Background", 64, 48));
    m_Document->InsertLayer(0, m_Background);
    m_Document->SetSelection({m_Background});
    m_Controller = Kernel::MakeCounted<DocumentController>(m_Document);
    m_Controller->SetObserver([this](const std::string& event) { m_Events.push_back(event); });
    m_Controller->CreateTools();
}

void EditorFixture::TearDown() {
    m_Tool.Reset();
    m_Controller->SetActiveTool(nullptr);
    std::filesystem::remove(m_SettingsFile);
}

Kernel::Counted<Tool> EditorFixture::StartTool(ToolID id) {
    auto tool = m_Controller->FindTool(id);
    EXPECT_TRUE(tool) << "no tool with id " << int(id);
    auto previous = m_Controller->SetActiveTool(tool);
    tool->Start(previous);
    m_Tool = tool;
    return tool;
}

Kernel::Counted<FilterRasterNode> EditorFixture::AddLiveLayer(Kernel::Counted<Command> command) {
    const Document::NodeList before = m_Document->GetLayers();
    m_Controller->EnqueueCommand(std::move(command), false);
    for (const auto& node : m_Document->GetLayers())
        if (std::find(before.begin(), before.end(), node) == before.end())
            return Kernel::CountedCast<FilterRasterNode>(node);
    ADD_FAILURE() << "no live filter layer was added";
    return {};
}

std::vector<std::string> EditorFixture::TakeEvents() {
    return std::exchange(m_Events, {});
}

bool EditorFixture::SawEvent(const std::string& prefix) const {
    for (const auto& event : m_Events)
        if (event.starts_with(prefix)) return true;
    return false;
}

std::string EditorFixture::ReadSettingsFile() const {
    std::ifstream in(m_SettingsFile);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

} // namespace RasterToolsTest
