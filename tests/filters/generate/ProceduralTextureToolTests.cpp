// The procedural texture tool: its editing operations report whether they changed anything, its own history
// is labelled and undoes and redoes, presets apply, input presets follow the values, and the origin follows
// clicks and drags.

#include "FrameTestSupport.h"
#include "filters/generate/ProceduralTextureTool.h"

#include <gtest/gtest.h>

namespace {

using namespace RasterTools;
using Kernel::Counted;
using Config = ProceduralTextureConfig;

class ProceduralTextureToolTest : public RasterToolsTest::EditorFixture {
protected:
    ProceduralTextureTool& Tool() {
        if (!m_Tool) m_Tool = StartTool(ToolID::ProceduralTexture);
        return dynamic_cast<ProceduralTextureTool&>(*m_Tool);
    }
    std::vector<std::string> Labels() {
        std::vector<std::string> labels;
        for (int i = 0; i < Tool().GetNumberOfHistoryStates(); ++i)
            labels.push_back(Tool().GetHistoryDescription(i));
        return labels;
    }
};

TEST_F(ProceduralTextureToolTest, EditsAreLabelledAndUndoRestoresThem) {
    auto& tool = Tool();
    EXPECT_EQ(Labels(), (std::vector<std::string>{"Start"}));
    EXPECT_FALSE(tool.CanUndo());
    const Config::Handle start = tool.GetState().config;

    EXPECT_TRUE(tool.BeginBlank());
    EXPECT_FALSE(tool.BeginBlank()) << "already blank";
    EXPECT_TRUE(tool.AddEquation());
    EXPECT_TRUE(tool.ReplaceEquation(0, ProceduralTextureEquation("x / w", 7), false));
    EXPECT_FALSE(tool.ReplaceEquation(0, ProceduralTextureEquation("x / w", 7), false))
        << "the same equation";
    EXPECT_FALSE(tool.ReplaceEquation(3, ProceduralTextureEquation("y", 1), false)) << "no such equation";
    EXPECT_TRUE(tool.ReplaceEquation(0, ProceduralTextureEquation("x / w", 1), true));
    EXPECT_TRUE(tool.SetAnglesInRadians(true));
    EXPECT_FALSE(tool.SetAnglesInRadians(true));
    EXPECT_TRUE(tool.SetAnglesInRadians(false));
    EXPECT_FALSE(tool.DeleteEquation(5));
    EXPECT_TRUE(tool.CaptureConstantSet(ProceduralTextureTool::RenameInput));
    EXPECT_FALSE(tool.CaptureConstantSet(16)) << "an unknown message pushes nothing";
    EXPECT_EQ(Labels(),
              (std::vector<std::string>{"Start", "Reset to empty", "Add equation", "Change equation",
                                        "Change equation channel mask", "Use radians for angles",
                                        "Use degrees for angles", "Rename input"}));
    EXPECT_EQ(tool.GetUndoDescription(), "Rename input");

    const Config::Handle edited = tool.GetState().config;
    while (tool.CanUndo())
        EXPECT_TRUE(tool.Undo());
    EXPECT_EQ(tool.GetState().config, start);
    EXPECT_FALSE(tool.Undo());
    EXPECT_EQ(tool.GetRedoDescription(), "Reset to empty");
    EXPECT_TRUE(tool.SetHistoryIndex(tool.GetNumberOfHistoryStates() - 1));
    EXPECT_EQ(tool.GetState().config, edited);
    // A new edit after an undo drops the redo branch.
    EXPECT_TRUE(tool.Undo());
    EXPECT_TRUE(tool.AddEquation());
    EXPECT_FALSE(tool.CanRedo());
    EXPECT_EQ(Labels().back(), "Add equation");
}

TEST_F(ProceduralTextureToolTest, PresetsAndInputPresets) {
    auto& tool = Tool();
    const auto& presets = ProceduralTextureTool::GetPresets();
    ASSERT_GE(presets.size(), 6u);
    EXPECT_EQ(presets[0].first, "Default");
    EXPECT_STREQ(ProceduralTextureTool::GetPresetsFilter(), "Procedural texture presets");
    EXPECT_FALSE(tool.ApplyPreset(presets[0].second)) << "the tool starts on the default";
    EXPECT_TRUE(tool.ApplyPreset(presets[2].second));
    EXPECT_EQ(tool.GetPresetDisplayString(), presets[2].first);
    EXPECT_EQ(Labels().back(), "Apply preset");

    // Every starter preset compiles.
    for (const auto& [name, property] : presets)
        EXPECT_TRUE(ProceduralTextureCommand::ValidateConfig(property.GetConfig(), property.GetValues()))
            << name;

    // Input presets: saved from the current values, found again when the values return to them.
    ASSERT_TRUE(tool.CanAddInputsPreset());
    EXPECT_FALSE(tool.CanDeleteInputsPreset());
    EXPECT_TRUE(tool.AddInputsPreset("Wide"));
    EXPECT_EQ(tool.GetCurrentInputsPresetIndex(), 0);
    EXPECT_EQ(tool.GetInputsPresetDisplayString(), "Wide");
    const auto wide = tool.GetState().values->Get(0);
    EXPECT_TRUE(tool.SetConstantValue(0, 2.0, true));
    EXPECT_EQ(tool.GetCurrentInputsPresetIndex(), -1);
    EXPECT_EQ(tool.GetInputsPresetDisplayString(), "Custom");
    EXPECT_EQ(Labels().back(), "Change input value");
    EXPECT_TRUE(tool.SelectInputsPreset(0));
    EXPECT_EQ(tool.GetState().values->Get(0), wide);
    EXPECT_EQ(Labels().back(), "Apply inputs preset");
    EXPECT_FALSE(tool.SelectInputsPreset(0)) << "already selected";
    EXPECT_FALSE(tool.SelectInputsPreset(4));
    EXPECT_TRUE(tool.RenameInputsPreset("Broad"));
    EXPECT_FALSE(tool.RenameInputsPreset("Broad"));
    EXPECT_TRUE(tool.DeleteInputsPreset());
    EXPECT_FALSE(tool.DeleteInputsPreset());

    // The whole config travels as a preset property and applies back.
    const auto property = tool.CreatePresetProperty();
    EXPECT_TRUE(ProceduralTextureTool::PropertyIsCompatible(*property));
    EXPECT_TRUE(tool.BeginBlank());
    EXPECT_TRUE(tool.ApplyPresetProperty(*property));
    EXPECT_EQ(tool.GetState().config, property->GetConfig());
}

TEST_F(ProceduralTextureToolTest, ClicksAndDragsSetTheOrigin) {
    auto& tool = Tool();
    EXPECT_TRUE(tool.OnClicked({{12.0, 7.0}}, Raster::AffineTransform::Params{}));
    EXPECT_EQ(tool.GetState().origin, (Kernel::PointT<double>{12.0, 7.0}));
    EXPECT_EQ(Labels().back(), "Set origin");
    const int before = tool.GetNumberOfHistoryStates();
    tool.OnBeginDrag({{1.0, 1.0}});
    tool.OnDrag({{5.0, 6.0}});
    tool.OnDrag({{8.0, 9.0}});
    tool.OnEndDrag({{8.0, 9.0}});
    EXPECT_EQ(tool.GetState().origin, (Kernel::PointT<double>{8.0, 9.0}));
    EXPECT_EQ(tool.GetNumberOfHistoryStates(), before + 1) << "one drag is one history item";
    EXPECT_TRUE(tool.Undo());
    EXPECT_EQ(tool.GetState().origin, (Kernel::PointT<double>{12.0, 7.0}));
    EXPECT_TRUE(tool.OnDoubleClicked({{0.0, 0.0}}));
    EXPECT_FALSE(tool.SetOrigin({std::nan(""), 0.0}, true));
}

} // namespace
