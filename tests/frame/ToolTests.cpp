// Tool lifecycle as an editor drives it: settings, gestures, previews, commits, live filter layers.

#include "filters/tonal/DiffuseTool.h"
#include "filters/tonal/NoiseTool.h"
#include "filters/tonal/RasterAddNoiseCommand.h"
#include "filters/tonal/RasterDiffuseCommand.h"
#include "filters/tonal/RasterUnsharpMaskCommand.h"
#include "filters/tonal/UnsharpMaskTool.h"
#include "host/document/VeyraController.h"
#include "tests/frame/FrameTestSupport.h"

using namespace RasterTools;
using RasterToolsTest::EditorFixture;

namespace {

ToolPointSpread At(double x, double y) {
    return ToolPointSpread{{x, y}};
}

void DragBy(Tool& tool, double dx, double dy) {
    tool.OnBeginDrag(At(100, 100));
    tool.OnDrag(At(100 + dx, 100 + dy));
    tool.OnEndDrag(At(100 + dx, 100 + dy));
}

} // namespace

class ToolLifecycle : public EditorFixture {};

TEST_F(ToolLifecycle, AnEmptyStoreGivesTheDefaults) {
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    EXPECT_EQ(noise->GetIntensity(), 0.0);
    EXPECT_FALSE(noise->GetMono());
    EXPECT_TRUE(noise->GetGaussian());
    EXPECT_EQ(m_Controller->GetHintline(), "|DRAG| to set intensity. |CLICK| to reset.");
    EXPECT_EQ(m_Controller->GetCursor(), 85);

    auto unsharp = CountedCast<UnsharpMaskTool>(StartTool(ToolID::UnsharpMask));
    EXPECT_EQ(unsharp->GetRadius(), 0.0);
    EXPECT_EQ(unsharp->GetFactor(), 0.5);
    EXPECT_EQ(unsharp->GetThreshold(), 0.0);
    EXPECT_EQ(m_Controller->GetHintline(), "|DRAG| to set radius. |CLICK| to reset.");

    StartTool(ToolID::Diffuse);
    EXPECT_EQ(m_Controller->GetHintline(), "|DRAG| to set diffusion. |CLICK| to reset.");
    // Starting tools reads the store but never writes it.
    EXPECT_FALSE(std::filesystem::exists(m_SettingsFile));
}

TEST_F(ToolLifecycle, DragDistanceSetsIntensityWithoutClamp) {
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    DragBy(*noise, 256, 0);
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.5);
    DragBy(*noise, 0, 1024);
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 2.0);
    DragBy(*noise, 300, 400); // a 3-4-5 triangle: 500 units
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 500.0 / 512.0);
}

TEST_F(ToolLifecycle, OnlyDiffuseAndUnsharpMaskSetTheValueAtTheEndOfADrag) {
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    noise->OnBeginDrag(At(0, 0));
    noise->OnDrag(At(512, 0));
    noise->OnEndDrag(At(1024, 0));
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 1.0);

    auto diffuse = CountedCast<DiffuseTool>(StartTool(ToolID::Diffuse));
    diffuse->OnBeginDrag(At(0, 0));
    diffuse->OnDrag(At(512, 0));
    diffuse->OnEndDrag(At(1024, 0));
    EXPECT_DOUBLE_EQ(diffuse->GetIntensity(), 2.0);

    auto unsharp = CountedCast<UnsharpMaskTool>(StartTool(ToolID::UnsharpMask));
    unsharp->OnBeginDrag(At(10, 10));
    unsharp->OnEndDrag(At(13, 14));
    EXPECT_DOUBLE_EQ(unsharp->GetRadius(), 5.0);
}

TEST_F(ToolLifecycle, ClickClearsTheDraggedValueAndResetRestoresAll) {
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    noise->SetMono(true);
    noise->SetGaussian(false);
    DragBy(*noise, 256, 0);
    TakeEvents();
    EXPECT_TRUE(noise->OnClicked(At(1, 1), Raster::AffineTransform::Params{}));
    EXPECT_EQ(noise->GetIntensity(), 0.0);
    EXPECT_TRUE(noise->GetMono());
    EXPECT_FALSE(noise->GetGaussian());
    EXPECT_TRUE(SawEvent("notify ToolParametersChanged tool=55"));
    EXPECT_TRUE(SawEvent("enqueue preview Add Noise"));

    DragBy(*noise, 256, 0);
    noise->Reset();
    EXPECT_EQ(noise->GetIntensity(), 0.0);
    EXPECT_FALSE(noise->GetMono());
    EXPECT_TRUE(noise->GetGaussian());

    auto unsharp = CountedCast<UnsharpMaskTool>(StartTool(ToolID::UnsharpMask));
    unsharp->SetRadius(7);
    unsharp->SetFactor(2);
    unsharp->SetThreshold(0.3);
    unsharp->Reset();
    EXPECT_EQ(unsharp->GetRadius(), 0.0);
    EXPECT_EQ(unsharp->GetFactor(), 0.5);
    EXPECT_EQ(unsharp->GetThreshold(), 0.0);
}

TEST_F(ToolLifecycle, LeavingCommitsOnlyAnEffectThatDoesSomething) {
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    for (double nothing : {0.0, 1e-6, -1e-6}) {
        noise->SetIntensity(nothing);
        EXPECT_FALSE(noise->AutoCommitIfRequired(true)) << nothing;
    }
    EXPECT_TRUE(m_Document->GetHistory().empty());
    EXPECT_FALSE(std::filesystem::exists(m_SettingsFile));

    noise->SetIntensity(2e-6);
    EXPECT_TRUE(noise->AutoCommitIfRequired(true));
    ASSERT_EQ(m_Document->GetHistory().size(), 1u);
    auto committed = CountedCast<RasterAddNoiseCommand>(m_Document->GetHistory()[0].command);
    ASSERT_TRUE(committed);
    EXPECT_EQ(committed->GetIntensity(), 2e-6);
    EXPECT_FALSE(committed->IsLiveEffect());
    EXPECT_EQ(VeyraController::GetInstance().GetDoubleForKey("tools.addnoise.intensity", -1), 2e-6);

    // The first parameter decides for the other tools too: a threshold alone is not an effect.
    auto unsharp = CountedCast<UnsharpMaskTool>(StartTool(ToolID::UnsharpMask));
    unsharp->SetThreshold(0.5);
    EXPECT_FALSE(unsharp->AutoCommitIfRequired(true));
    unsharp->SetRadius(1.0);
    EXPECT_TRUE(unsharp->AutoCommitIfRequired(true));
}

TEST_F(ToolLifecycle, CommitPersistsAndTheNextStartShowsIt) {
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    DragBy(*noise, 384, 0);
    noise->SetMono(true);
    noise->Commit();
    const std::string afterCommit = ReadSettingsFile();
    EXPECT_NE(afterCommit.find("\"tools.addnoise.intensity\": 0.75"), std::string::npos) << afterCommit;
    EXPECT_NE(afterCommit.find("\"tools.addnoise.mono\": true"), std::string::npos) << afterCommit;
    EXPECT_NE(afterCommit.find("\"tools.addnoise.gaussian\": true"), std::string::npos) << afterCommit;

    // Changes, previews, reset and cancel afterwards leave the file as it is.
    DragBy(*noise, 10, 0);
    noise->Reset();
    noise->Preview(true);
    noise->OnCancel();
    EXPECT_EQ(ReadSettingsFile(), afterCommit);

    noise->Start(nullptr);
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.75);
    EXPECT_TRUE(noise->GetMono());
    // The settings are read from the file, not from memory: a fresh load gives the same.
    VeyraController::GetInstance().SetFile(m_SettingsFile);
    noise->Start(nullptr);
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.75);
}

TEST_F(ToolLifecycle, PreviewsDifferDeliberatelyBetweenNoiseAndItsSiblings) {
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    noise->SetIntensity(0.5);
    TakeEvents();
    noise->Preview(true);
    EXPECT_TRUE(SawEvent("enqueue preview Add Noise inte=0.5"));
    EXPECT_TRUE(m_Document->GetHistory().empty());
    auto shown = CountedCast<RasterAddNoiseCommand>(m_Document->GetPreview());
    ASSERT_TRUE(shown);
    EXPECT_EQ(shown->GetIntensity(), 0.5);

    auto diffuse = CountedCast<DiffuseTool>(StartTool(ToolID::Diffuse));
    diffuse->SetIntensity(0.25);
    TakeEvents();
    diffuse->Preview(false);
    EXPECT_TRUE(SawEvent("enqueue transient Diffuse inte=0.25"));
    EXPECT_TRUE(m_Document->GetHistory().empty());

    // While a live filter layer is edited, noise previews go to history; diffuse's only when not final.
    auto diffuseLayer = AddLiveLayer(Kernel::Counted<Command>(new RasterDiffuseCommand(true, 0.1)));
    m_Controller->BeginLiveEffectEdit(diffuseLayer);
    TakeEvents();
    const std::size_t before = m_Document->GetHistory().size();
    diffuse->Preview(true);
    EXPECT_TRUE(SawEvent("enqueue transient Diffuse"));
    EXPECT_EQ(m_Document->GetHistory().size(), before);
    diffuse->Preview(false);
    EXPECT_EQ(m_Document->GetHistory().size(), before + 1);
}

TEST_F(ToolLifecycle, StartAdoptsTheSelectedLiveFilterButCommitWritesTheToolsValues) {
    VeyraController::GetInstance().SetDoubleForKey("tools.addnoise.intensity", 0.125);
    auto layer = AddLiveLayer(Kernel::Counted<Command>(new RasterAddNoiseCommand(true, 0.8, true, false)));
    m_Controller->BeginLiveEffectEdit(layer);
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.8);
    EXPECT_TRUE(noise->GetMono());
    EXPECT_FALSE(noise->GetGaussian());

    noise->SetIntensity(0.9);
    noise->Commit();
    EXPECT_DOUBLE_EQ(VeyraController::GetInstance().GetDoubleForKey("tools.addnoise.intensity", 0), 0.9);
    auto filter = CountedCast<RasterAddNoiseCommand>(layer->GetFilter());
    ASSERT_TRUE(filter);
    EXPECT_DOUBLE_EQ(filter->GetIntensity(), 0.9);
    EXPECT_TRUE(filter->IsLiveEffect());

    // Without a live edit the persisted values stand, even with the layer selected.
    m_Controller->EndLiveEffectEdit();
    noise->Start(nullptr);
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.9);
    VeyraController::GetInstance().SetDoubleForKey("tools.addnoise.intensity", 0.3);
    noise->Start(nullptr);
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.3);
}

TEST_F(ToolLifecycle, AForeignLiveFilterIsNotAdopted) {
    auto layer = AddLiveLayer(Kernel::Counted<Command>(new RasterDiffuseCommand(true, 0.4)));
    m_Controller->BeginLiveEffectEdit(layer);
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    EXPECT_EQ(noise->GetIntensity(), 0.0);
}

TEST_F(ToolLifecycle, EditingFollowsTheSelectionAndCancelsOnAnotherKind) {
    auto first = AddLiveLayer(Kernel::Counted<Command>(new RasterAddNoiseCommand(true, 0.2, false, true)));
    auto second = AddLiveLayer(Kernel::Counted<Command>(new RasterAddNoiseCommand(true, 0.6, true, true)));
    auto foreign = AddLiveLayer(Kernel::Counted<Command>(new RasterDiffuseCommand(true, 0.4)));
    m_Controller->BeginLiveEffectEdit(first);
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.2);

    TakeEvents();
    m_Controller->SetSelection({Kernel::Counted<Node>(second)});
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.6);
    EXPECT_TRUE(noise->GetMono());
    EXPECT_TRUE(SawEvent("notify TwoUpStop"));
    EXPECT_TRUE(SawEvent("notify ToolParametersChanged tool=55"));
    EXPECT_TRUE(m_Controller->IsEditingLiveEffect());

    // Undoing a change of the edited layer's filter brings the tool back to the older values.
    noise->SetIntensity(0.7);
    noise->Preview(false);
    EXPECT_DOUBLE_EQ(CountedCast<RasterAddNoiseCommand>(second->GetFilter())->GetIntensity(), 0.7);
    ASSERT_TRUE(m_Controller->Undo());
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.6);

    m_Controller->SetSelection({Kernel::Counted<Node>(foreign)});
    EXPECT_FALSE(m_Controller->IsEditingLiveEffect());
    EXPECT_DOUBLE_EQ(CountedCast<RasterDiffuseCommand>(foreign->GetFilter())->GetIntensity(), 0.4);
}

TEST_F(ToolLifecycle, AHistoryChangeOutsideALiveEditIsLeftToTheBase) {
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    noise->SetIntensity(0.5);
    noise->Commit();
    TakeEvents();
    ASSERT_TRUE(m_Controller->Undo());
    EXPECT_FALSE(SawEvent("notify TwoUpStop"));
    EXPECT_DOUBLE_EQ(noise->GetIntensity(), 0.5);
}

TEST_F(ToolLifecycle, SuccessiveLiveEditsMergeIntoOneHistoryEntry) {
    auto layer = AddLiveLayer(Kernel::Counted<Command>(new RasterAddNoiseCommand(true, 0.1, false, true)));
    const std::size_t afterAdding = m_Document->GetHistory().size();
    m_Controller->BeginLiveEffectEdit(layer);
    auto noise = CountedCast<NoiseTool>(StartTool(ToolID::AddNoise));
    noise->OnBeginDrag(At(0, 0));
    for (int step = 1; step <= 4; ++step)
        noise->OnDrag(At(128.0 * step, 0));
    noise->OnEndDrag(At(512, 0));
    // The whole drag is one entry: the first step adds it, the others merge into it. (The adding
    // entry was enqueued with the background selected, so it cannot take the edit over.)
    ASSERT_EQ(m_Document->GetHistory().size(), afterAdding + 1);
    EXPECT_EQ(m_Document->GetHistory().back().kind, HistoryEntry::Kind::LiveFilterChanged);
    EXPECT_DOUBLE_EQ(CountedCast<RasterAddNoiseCommand>(layer->GetFilter())->GetIntensity(), 1.0);
    ASSERT_TRUE(m_Controller->Undo());
    EXPECT_DOUBLE_EQ(CountedCast<RasterAddNoiseCommand>(layer->GetFilter())->GetIntensity(), 0.1);
    ASSERT_TRUE(m_Controller->Redo());

    // A pixel edit in between ends the run: the next live edit is a new entry.
    m_Controller->EnqueueCommand(Kernel::Counted<Command>(new RasterDiffuseCommand(false, 0.2)), false);
    m_Controller->SetSelection({Kernel::Counted<Node>(layer)});
    noise->OnDrag(At(256, 0));
    EXPECT_EQ(m_Document->GetHistory().size(), afterAdding + 3);
    m_Controller->Undo();
    EXPECT_DOUBLE_EQ(CountedCast<RasterAddNoiseCommand>(layer->GetFilter())->GetIntensity(), 1.0);
}

TEST_F(ToolLifecycle, ThePanelListsTheBasePropertiesFirst) {
    auto noise = StartTool(ToolID::AddNoise);
    const auto properties = noise->EnumerateReflecteds();
    ASSERT_EQ(properties.size(), 4u);
    EXPECT_EQ(Kernel::FourCCToString(properties[0]->GetIdentifier()), "edlv");
    const char* ids[] = {"inte", "mono", "gaus"};
    const char* labels[] = {"Intensity", "Monochrome", "Gaussian"};
    for (std::size_t i = 0; i < 3; ++i) {
        EXPECT_EQ(Kernel::FourCCToString(properties[i + 1]->GetIdentifier()), ids[i]);
        EXPECT_EQ(properties[i + 1]->GetLabel().GetEnglish(), labels[i]);
        EXPECT_EQ(properties[i + 1]->GetLabel().GetContext(), "Reflected property");
    }
    auto* intensity = dynamic_cast<Kernel::ReflectedUnitRange*>(properties[1].Get());
    ASSERT_NE(intensity, nullptr);
    EXPECT_EQ(intensity->GetMinimum(), 0.0);
    EXPECT_EQ(intensity->GetMaximum(), 100.0);
    EXPECT_EQ(properties[2]->FindAttribute<Kernel::ImageAttribute>()->GetName(), "monochromatic");
    EXPECT_EQ(properties[3]->FindAttribute<Kernel::ImageAttribute>()->GetName(), "gaussian");

    // The bindings reach the tool's fields.
    ASSERT_TRUE(properties[1]->SetValueText("0.625"));
    ASSERT_TRUE(properties[2]->SetValueText("true"));
    EXPECT_DOUBLE_EQ(CountedCast<NoiseTool>(noise)->GetIntensity(), 0.625);
    EXPECT_TRUE(CountedCast<NoiseTool>(noise)->GetMono());
    EXPECT_FALSE(properties[0]->SetValueText("true")); // the host's indicator is read-only
}

TEST_F(ToolLifecycle, SnapshotsPutLayersAndSelectionBack) {
    const auto snapshot = m_Controller->TakeSnapshot();
    auto layer = AddLiveLayer(Kernel::Counted<Command>(new RasterDiffuseCommand(true, 0.2)));
    m_Controller->SetSelection({Kernel::Counted<Node>(layer)});
    ASSERT_EQ(m_Document->GetLayers().size(), 2u);
    TakeEvents();
    m_Controller->RestoreSnapshot(*snapshot);
    ASSERT_EQ(m_Document->GetLayers().size(), 1u);
    EXPECT_EQ(m_Document->GetLayer(0), m_Background);
    ASSERT_EQ(m_Document->GetSelection().size(), 1u);
    EXPECT_EQ(m_Document->GetSelection()[0], m_Background);
    EXPECT_TRUE(SawEvent("notify NewSelection"));
    EXPECT_EQ(m_Controller->GetDocumentDefaults().width, 1024);
}
