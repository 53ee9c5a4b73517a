// The lighting tool as an editor drives it: where the light starts, setters that bound their values and
// refresh the preview, drags that move the light, and the settings a commit writes.

#include "filters/lighting/LightingTool.h"
#include "filters/lighting/RasterLightingCommand.h"
#include "tests/frame/FrameTestSupport.h"

#include <gtest/gtest.h>

using namespace RasterTools;
using RasterToolsTest::EditorFixture;

namespace {

ToolPointSpread At(double x, double y) {
    return ToolPointSpread{{x, y}};
}

} // namespace

class LightingTools : public EditorFixture {};

TEST_F(LightingTools, TheLightStartsAtTheLayersMiddleAndSettersBoundAndPreview) {
    auto tool = CountedCast<LightingTool>(StartTool(ToolID::Lighting));
    ASSERT_TRUE(tool);
    EXPECT_EQ(tool->GetCentre(), (Kernel::PointT<double>{32.0, 24.0})); // the 64 × 48 background
    EXPECT_EQ(m_Controller->GetHintline(), "|DRAG| handles to position lights.");
    EXPECT_EQ(tool->GetAmbient(), 0.2);
    EXPECT_EQ(tool->GetShininess(), 5.0);
    TakeEvents();
    tool->SetShininess(1000.0);
    EXPECT_EQ(tool->GetShininess(), 128.0);
    EXPECT_TRUE(SawEvent("enqueue transient Lighting"));
    TakeEvents();
    tool->SetDepth(-3.5);
    EXPECT_EQ(tool->GetDepth(), -3.5);
    EXPECT_TRUE(SawEvent("enqueue transient Lighting"));
    tool->SetBumpMapOpacity(-1.0);
    EXPECT_EQ(tool->GetBumpMapOpacity(), 0.0);
}

TEST_F(LightingTools, ADragMovesOnlyTheLightAndACommitKeepsEverythingButWhereItWas) {
    auto tool = CountedCast<LightingTool>(StartTool(ToolID::Lighting));
    tool->SetAmbient(0.4);
    TakeEvents();
    tool->OnBeginDrag(At(5.0, 6.0));
    tool->OnDrag(At(12.0, 13.5));
    EXPECT_EQ(tool->GetCentre(), (Kernel::PointT<double>{12.0, 13.5}));
    tool->OnEndDrag(At(20.0, 7.0));
    EXPECT_EQ(tool->GetCentre(), (Kernel::PointT<double>{20.0, 7.0}));
    EXPECT_TRUE(SawEvent("enqueue transient Lighting"));
    EXPECT_EQ(tool->GetAmbient(), 0.4) << "a drag moves only the light";
    tool->Commit();
    const std::string settings = ReadSettingsFile();
    EXPECT_NE(settings.find("\"tools.lighting.ambient\": 0.4"), std::string::npos) << settings;
    EXPECT_EQ(settings.find("centre"), std::string::npos) << settings;
    tool->Start(nullptr);
    EXPECT_EQ(tool->GetAmbient(), 0.4);
    EXPECT_EQ(tool->GetCentre(), (Kernel::PointT<double>{32.0, 24.0}));
}
