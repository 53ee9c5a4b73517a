// The pixel tool as the host drives it: size stepping, the alternate behaviours, the colour contexts, the
// hint lines, the quick action and the messages.

#include "PixelToolSupport.h"

#include "brushes/RasterPixelBrushCommand.h"
#include "brushes/RasterPixelEraseCommand.h"
#include "brushes/RasterPixelUndoCommand.h"

#include <gtest/gtest.h>

namespace {

using RasterTools::RasterPixelTool;

const std::vector<std::uint8_t> kGrey = {128, 128, 128, 255};

TEST(PixelTool, StartsWithASquareOnePixelBrushInPixelMode) {
    PixelToolDocument doc;
    EXPECT_EQ(doc.tool->GetToolID(), ToolID::Pixel);
    EXPECT_EQ(int(ToolID::Pixel), 41);
    ASSERT_TRUE(doc.tool->GetCurrentBrush());
    EXPECT_EQ(doc.tool->GetCurrentBrush()->GetSize(), 1.0);
    EXPECT_TRUE(dynamic_cast<const Raster::SquareRasterBrush*>(doc.tool->GetCurrentBrush().Get()));
    EXPECT_EQ(doc.tool->GetDefaultBrush(), doc.tool->GetCurrentBrush());
    EXPECT_EQ(doc.tool->GetBrushEngine().GetPixelMode(), 1);
    EXPECT_TRUE(doc.tool->AllowInstantColourPicking());
    EXPECT_TRUE(doc.tool->SupportsSymmetry());
    EXPECT_TRUE(doc.tool->AllowColourPicker());
    for (const int state : {2, 3}) {
        doc.tool->SetBrushToolState(state);
        EXPECT_FALSE(doc.tool->AllowColourPicker()) << state;
    }
}

TEST(PixelTool, BrushSizeStepsOnePixelPerCallWithinItsLimits) {
    PixelToolDocument doc;
    const auto size = [&] { return doc.tool->GetCurrentBrush()->GetSize(); };
    doc.tool->ChangeBrushSizeByFactor(1.0);
    EXPECT_EQ(size(), 1.0); // 1 stays 1
    doc.tool->ChangeBrushSizeByFactor(1.0001);
    doc.tool->ChangeBrushSizeByFactor(50.0);
    EXPECT_EQ(size(), 3.0);                 // one pixel per call, whatever the factor
    doc.tool->ChangeBrushSizeByFactor(1.0); // exactly 1.0 shrinks
    EXPECT_EQ(size(), 2.0);
    doc.tool->ChangeBrushSizeByFactor(0.1);
    EXPECT_EQ(size(), 1.0);
    auto big = doc.tool->GetCurrentBrush()->Copy();
    big->SetSize(4096.0);
    doc.tool->ReplaceBrush(big);
    doc.tool->ChangeBrushSizeByFactor(2.0);
    EXPECT_EQ(size(), 4096.0);
    // The display is refreshed unless the panel is locked; the default brush is never touched.
    const int refreshes = doc.tool->GetBrushDisplayRefreshCount();
    doc.tool->SetBrushPanelLocked(true);
    doc.tool->ChangeBrushSizeByFactor(0.5);
    EXPECT_EQ(size(), 4095.0);
    EXPECT_EQ(doc.tool->GetBrushDisplayRefreshCount(), refreshes);
    EXPECT_EQ(doc.tool->GetDefaultBrush()->GetSize(), 1.0);
}

TEST(PixelTool, TheLatchInBackgroundModeWithTheSecondaryContextPaintsTheForegroundColour) {
    PixelToolDocument doc;
    DocumentDefaults defaults;
    defaults.foreground = {1.0f, 0.0f, 0.0f, 1.0f};
    defaults.background = {0.0f, 0.0f, 1.0f, 1.0f};
    doc.controller->SetDocumentDefaults(defaults);
    doc.controller->SelectPrimaryColourContext(false);
    // Without the alternate behaviour the secondary context's colour (background) paints.
    doc.tool->Stroke({{1, 1}});
    EXPECT_EQ(doc.PixelAt(1, 1), (std::vector<std::uint8_t>{0, 0, 255, 255}));
    doc.tool->SetAlternateMode(RasterPixelTool::BackgroundColour);
    doc.tool->SetAlternateLatch(true);
    doc.tool->Stroke({{2, 1}});
    EXPECT_EQ(doc.PixelAt(2, 1), (std::vector<std::uint8_t>{255, 0, 0, 255}));
    // With the primary context, the latch paints the background colour; the modifier does the same.
    doc.controller->SelectPrimaryColourContext(true);
    doc.tool->Stroke({{3, 1}});
    EXPECT_EQ(doc.PixelAt(3, 1), (std::vector<std::uint8_t>{0, 0, 255, 255}));
    doc.tool->SetAlternateLatch(false);
    doc.tool->SetKeyState({.secondary = true});
    doc.tool->Stroke({{4, 1}});
    EXPECT_EQ(doc.PixelAt(4, 1), (std::vector<std::uint8_t>{0, 0, 255, 255}));
    doc.tool->SetKeyState({});
    doc.tool->Stroke({{5, 1}});
    EXPECT_EQ(doc.PixelAt(5, 1), (std::vector<std::uint8_t>{255, 0, 0, 255}));
}

TEST(PixelTool, GenerateCommandChoosesByTheAlternateModeAndUnknownModesMakeNothing) {
    PixelToolDocument doc;
    const std::vector<Raster::BrushNozzle> nozzles(1);
    const auto make = [&] { return doc.tool->GenerateCommand(nozzles, true, true); };
    EXPECT_TRUE(Kernel::CountedCast<RasterTools::RasterPixelBrushCommand>(make()));
    doc.tool->SetAlternateLatch(true);
    EXPECT_TRUE(Kernel::CountedCast<RasterTools::RasterPixelEraseCommand>(make()));
    doc.tool->SetAlternateMode(RasterPixelTool::UndoFromSnapshot);
    EXPECT_TRUE(Kernel::CountedCast<RasterTools::RasterPixelUndoCommand>(make()));
    doc.tool->SetAlternateMode(RasterPixelTool::AlternateMode(7));
    EXPECT_FALSE(make());
    // An unknown mode leaves the hint line as it was.
    EXPECT_NE(doc.controller->GetHintline().find("undo to snapshot"), std::string::npos);
}

TEST(PixelTool, HintLinesFollowTheAlternateMode) {
    PixelToolDocument doc;
    const std::string start = "|DRAG| to start drawing. |CLICK|+|PRIMARY| to continue last stroke. "
                              "|DRAG|+|PRIMARY| to constrain stroke. |DRAG|+|SECONDARY| to ";
    const std::string end = " |DRAG|+|TERTIARY| to use colour picker.";
    EXPECT_EQ(doc.controller->GetHintline(), start + "erase." + end);
    doc.tool->SetAlternateMode(RasterPixelTool::BackgroundColour);
    EXPECT_EQ(doc.controller->GetHintline(), start + "use background colour." + end);
    doc.tool->SetAlternateMode(RasterPixelTool::UndoFromSnapshot);
    EXPECT_EQ(doc.controller->GetHintline(), start + "undo to snapshot." + end);
}

TEST(PixelTool, ReflectedPropertiesAndTheToggleAction) {
    PixelToolDocument doc;
    Kernel::ReflectedList properties = doc.tool->EnumerateReflecteds();
    const auto find = [&](const char* context) -> Kernel::Reflected* {
        for (const auto& property : properties)
            if (property->GetLabel().GetContext() == context) return property.Get();
        return nullptr;
    };
    auto* mode = find("Raster pixel tool reflection");
    auto* latch = find("Raster pixel too reflection");
    ASSERT_TRUE(mode && latch);
    EXPECT_EQ(mode->GetLabel().GetEnglish(), "Alternate");
    EXPECT_EQ(latch->GetLabel().GetEnglish(), "Alternate");
    ASSERT_TRUE(mode->SetValueText("Undo from snapshot"));
    EXPECT_EQ(doc.tool->GetAlternateMode(), RasterPixelTool::UndoFromSnapshot);
    ASSERT_TRUE(latch->SetValueText("true"));
    EXPECT_TRUE(doc.tool->GetAlternateLatch());
    const auto modes = RasterPixelTool::GetAlternateModes();
    ASSERT_EQ(modes.size(), 3u);
    EXPECT_EQ(modes[1].first, 1);
    EXPECT_EQ(modes[1].second.GetEnglish(), "Background colour");

    // The colour property reads and writes the selected context's colour.
    Kernel::Reflected* colour = nullptr;
    for (const auto& property : properties)
        if (property->GetLabel().GetEnglish() == "Colour") colour = property.Get();
    ASSERT_TRUE(colour);
    ASSERT_TRUE(colour->SetValueText("0,1,0,1"));
    EXPECT_EQ(doc.controller->GetDocumentDefaults().foreground, (Renderer::ConsolidatedColour{0, 1, 0, 1}));
    doc.controller->SelectPrimaryColourContext(false);
    ASSERT_TRUE(colour->SetValueText("0,0,1,1"));
    EXPECT_EQ(doc.controller->GetDocumentDefaults().background, (Renderer::ConsolidatedColour{0, 0, 1, 1}));
    EXPECT_EQ(doc.controller->GetDocumentDefaults().foreground, (Renderer::ConsolidatedColour{0, 1, 0, 1}));

    Kernel::Reflected* toggle = nullptr;
    const auto actions = doc.tool->EnumerateQuickActions();
    for (const auto& action : actions)
        if (action->GetLabel().GetEnglish() == "Toggle alternate") toggle = action.Get();
    ASSERT_TRUE(toggle);
    EXPECT_EQ(toggle->GetLabel().GetContext(), "Pencil action");
    toggle->SetValueText("");
    EXPECT_FALSE(doc.tool->GetAlternateLatch());
    EXPECT_TRUE(doc.Saw("notify InvalidateReflecteds"));
}

TEST(PixelTool, UndoModeWithoutASnapshotShowsTheMessageAndRestoresNothing) {
    PixelToolDocument doc;
    doc.tool->Stroke({{0, 0}, {10, 0}});
    const auto painted = Bytes(doc.Pixels());
    doc.tool->SetAlternateMode(RasterPixelTool::UndoFromSnapshot);
    doc.tool->SetKeyState({.secondary = true});
    doc.tool->Stroke({{0, 0}, {10, 0}});
    EXPECT_TRUE(
        doc.Saw("notify ModelessMessage title=\"No Snapshot\" message=\"You must nominate a snapshot / "
                "history entry before using this mode.\""));
    EXPECT_EQ(Bytes(doc.Pixels()), painted);
    // Nothing is said for the mode without the modifier, nor in the tool's picking states.
    doc.events.clear();
    doc.tool->SetKeyState({});
    doc.tool->SetAlternateLatch(true);
    doc.tool->Stroke({{3, 3}});
    doc.tool->SetKeyState({.secondary = true});
    doc.tool->SetBrushToolState(RasterPixelTool::PickingColour);
    doc.tool->OnMouseDown({{3, 3}}, {});
    for (const auto& event : doc.events)
        EXPECT_EQ(event.find("No Snapshot"), std::string::npos) << event;
}

TEST(PixelTool, UndoFromASnapshotRestoresExactlyTheSnapshotsPixelsUnderTheDab) {
    PixelToolDocument doc;
    doc.controller->SetDocumentDefaults({.foreground = {1, 0, 0, 1}});
    doc.tool->Stroke({{0, 5}, {30, 5}});
    const auto atSnapshot = Bytes(doc.Pixels());
    doc.controller->NominateSnapshot();
    doc.controller->SetDocumentDefaults({.foreground = {0, 1, 0, 1}});
    auto wide = doc.tool->GetCurrentBrush()->Copy();
    wide->SetSize(5);
    doc.tool->ReplaceBrush(wide);
    doc.tool->Stroke({{0, 5}, {30, 5}}); // green over red and grey, rows 3..7
    const auto green = Bytes(doc.Pixels());
    // Restore a 1-pixel-wide column from the snapshot.
    doc.tool->ReplaceBrush(wide->Copy());
    auto thin = wide->Copy();
    thin->SetSize(1);
    doc.tool->ReplaceBrush(thin);
    doc.tool->SetAlternateMode(RasterPixelTool::UndoFromSnapshot);
    doc.tool->SetKeyState({.secondary = true});
    doc.tool->Stroke({{12, 0}, {12, 20}});
    EXPECT_EQ(doc.document->GetHistory().back().command->GetDescription().GetEnglish(), "Pixel Undo Brush");
    const std::size_t row = doc.Pixels().GetRowBytes();
    const auto now = Bytes(doc.Pixels());
    for (int y = 0; y < doc.Pixels().GetHeight(); ++y)
        for (int x = 0; x < doc.Pixels().GetWidth(); ++x)
            for (int c = 0; c < 4; ++c) {
                const std::size_t at = std::size_t(y) * row + std::size_t(x) * 4 + std::size_t(c);
                const bool underDab = x == 12 && y <= 20;
                EXPECT_EQ(now[at], underDab ? atSnapshot[at] : green[at]) << x << "," << y;
            }
    EXPECT_EQ(doc.PixelAt(12, 5), (std::vector<std::uint8_t>{255, 0, 0, 255}));
    EXPECT_EQ(doc.PixelAt(12, 4), kGrey);
}

TEST(PixelTool, AFastDiagonalStrokeLeavesAConnectedLineWithoutAntiAliasing) {
    PixelToolDocument doc(80, 80);
    doc.controller->SetDocumentDefaults({.foreground = {1, 1, 0, 1}});
    doc.tool->Stroke({{2.5, 3.5}, {70.9, 41.2}});
    const std::vector<std::uint8_t> yellow = {255, 255, 0, 255};
    int painted = 0;
    std::vector<std::pair<int, int>> line;
    for (int y = 0; y < 80; ++y)
        for (int x = 0; x < 80; ++x) {
            const auto pixel = doc.PixelAt(x, y);
            ASSERT_TRUE(pixel == yellow || pixel == kGrey) << "blended pixel at " << x << "," << y;
            if (pixel == yellow) ++painted;
        }
    // One pixel per column from 2 to 70, each touching the one before.
    EXPECT_EQ(painted, 69);
    int previousY = -1;
    for (int x = 2; x <= 70; ++x) {
        int found = -1;
        for (int y = 0; y < 80; ++y)
            if (doc.PixelAt(x, y) == yellow) found = y;
        ASSERT_GE(found, 0) << "gap at column " << x;
        if (previousY >= 0) {
            EXPECT_LE(std::abs(found - previousY), 1) << x;
        }
        previousY = found;
    }
}

TEST(PixelTool, TheAssistantAddsARasterLayerWhenThereIsNothingToPaintOn) {
    PixelToolDocument doc;
    doc.document->RemoveLayer(doc.layer);
    doc.controller->SetDocumentDefaults({.width = 20, .height = 10, .foreground = {0, 0, 0, 1}});
    doc.tool->Stroke({{1, 1}});
    ASSERT_EQ(doc.document->GetLayers().size(), 1u);
    const auto added = Kernel::CountedCast<RasterNode>(doc.document->GetLayers()[0]);
    ASSERT_TRUE(added);
    EXPECT_EQ(added->GetWidth(), 20);
    const auto* pixel = added->GetPixels()->Row<std::uint8_t>(1) + 4;
    EXPECT_EQ(pixel[3], 255);
    EXPECT_EQ(doc.document->GetHistory().size(), 1u);
}

} // namespace
