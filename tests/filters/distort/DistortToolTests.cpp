// The twirl and sphere tools as an editor drives them, and their commands as history and documents keep
// them: panels, settings, drags, serialisation, registration and the command line's catalogue entries.

#include "DistortTestSupport.h"

#include "filters/Catalogue.h"
#include "filters/distort/SphereTool.h"
#include "filters/distort/TwirlTool.h"
#include "host/document/VeyraController.h"
#include "tests/frame/FrameTestSupport.h"

using namespace RasterTools;
using RasterToolsTest::EditorFixture;

namespace {

ToolPointSpread At(double x, double y) {
    return ToolPointSpread{{x, y}};
}

std::vector<std::string> Describe(const Kernel::ReflectedList& list) {
    std::vector<std::string> described;
    for (const auto& property : list) {
        std::string text = Kernel::FourCCToString(property->GetIdentifier()) + " " +
                           property->GetLabel().GetEnglish() + " (" + property->GetLabel().GetContext() +
                           ") " + property->DescribeRange();
        if (const auto* unit = property->FindAttribute<Kernel::ValueTypeAttribute>())
            text += " " + unit->Describe();
        described.push_back(text);
    }
    return described;
}

} // namespace

class DistortTools : public EditorFixture {};

TEST_F(DistortTools, StartPlacesTheCentreAtTheLayersMiddleWithTheDefaults) {
    auto twirl = CountedCast<TwirlTool>(StartTool(ToolID::Twirl));
    ASSERT_TRUE(twirl);
    EXPECT_EQ(twirl->GetCentre(), (Kernel::PointT<double>{32.0, 24.0})); // the 64 × 48 background
    EXPECT_EQ(twirl->GetTwirl(), 0.0);
    EXPECT_EQ(twirl->GetRadius(), 128.0);
    EXPECT_EQ(m_Controller->GetHintline(), "|DRAG| to set twirl centre.");

    // A layer placed elsewhere, selected: its own middle.
    auto moved = Kernel::Counted<RasterNode>(new RasterNode("Moved", 20, 10));
    moved->SetOffset({100, 50});
    m_Document->InsertLayer(1, moved);
    m_Document->SetSelection({moved});
    auto sphere = CountedCast<SphereTool>(StartTool(ToolID::Sphere));
    ASSERT_TRUE(sphere);
    EXPECT_EQ(sphere->GetCentre(), (Kernel::PointT<double>{110.0, 55.0}));
    EXPECT_EQ(sphere->GetRadius(), 128.0);
    EXPECT_EQ(sphere->GetIntensity(), 50.0);
    EXPECT_EQ(m_Controller->GetHintline(), "|DRAG| to set sphere centre.");
}

TEST_F(DistortTools, PanelsListTheirPropertiesWithRangesAndUnits) {
    auto twirl = StartTool(ToolID::Twirl);
    // The base tool's properties come first; the tool's own are the last ones.
    auto twirlList = Describe(twirl->EnumerateReflecteds());
    ASSERT_GE(twirlList.size(), 3u);
    const auto base = twirlList.size() - 3;
    twirlList.erase(twirlList.begin(), twirlList.begin() + std::ptrdiff_t(base));
    EXPECT_EQ(twirlList, (std::vector<std::string>{
                             "angl Angle (Reflected property) range=-720..720 unit=degrees",
                             "inte Radius (Reflected property) range=0..1024 unit=pixels",
                             "cntr Centre (Twirl tool reflection) ",
                         }));
    auto sphereList = Describe(StartTool(ToolID::Sphere)->EnumerateReflecteds());
    ASSERT_EQ(sphereList.size(), base + 2);
    sphereList.erase(sphereList.begin(), sphereList.begin() + std::ptrdiff_t(base));
    EXPECT_EQ(sphereList, (std::vector<std::string>{
                              "radi Radius (Reflected property) range=0..1024 unit=pixels",
                              "inte Intensity (Reflected property) range=-100..100 unit=percent",
                          }));
    // The live layer's panel: the command's labels.
    auto command = DistortTest::MakeTwirl(10.0, 20.0, {1.0, 2.0});
    const auto commandList = Describe(command->EnumerateReflecteds());
    ASSERT_EQ(commandList.size(), 3u);
    EXPECT_EQ(commandList[0].substr(0, 10), "angl Twirl");
}

TEST_F(DistortTools, DragsMoveTheCentreAndTheEndOfADragIsFinal) {
    auto twirl = CountedCast<TwirlTool>(StartTool(ToolID::Twirl));
    twirl->SetTwirl(45.0);
    TakeEvents();
    twirl->OnBeginDrag(At(5.0, 6.0));
    twirl->OnDrag(At(12.0, 13.5));
    EXPECT_EQ(twirl->GetCentre(), (Kernel::PointT<double>{12.0, 13.5}));
    twirl->OnEndDrag(At(20.0, 7.0));
    EXPECT_EQ(twirl->GetCentre(), (Kernel::PointT<double>{20.0, 7.0}));
    EXPECT_TRUE(SawEvent("enqueue transient Twirl"));
    EXPECT_EQ(twirl->GetTwirl(), 45.0) << "a drag moves only the centre";
    EXPECT_FALSE(twirl->OnClicked(At(1.0, 1.0), {}));
    EXPECT_EQ(twirl->GetCentre(), (Kernel::PointT<double>{20.0, 7.0}));
    twirl->Reset();
    EXPECT_EQ(twirl->GetTwirl(), 0.0);
    EXPECT_EQ(twirl->GetCentre(), (Kernel::PointT<double>{32.0, 24.0}));
}

TEST_F(DistortTools, TheTwirlWritesItsTwoKeysOnCommitAndTheSphereNone) {
    auto twirl = CountedCast<TwirlTool>(StartTool(ToolID::Twirl));
    EXPECT_FALSE(twirl->AutoCommitIfRequired(true)) << "angle 0 is no twirl";
    twirl->SetTwirl(-120.0);
    twirl->SetRadius(64.0);
    twirl->Preview(false);
    EXPECT_FALSE(std::filesystem::exists(m_SettingsFile)) << "previews write nothing";
    twirl->Commit();
    const std::string settings = ReadSettingsFile();
    EXPECT_NE(settings.find("\"tools.twirl.twirl\": -120"), std::string::npos) << settings;
    EXPECT_NE(settings.find("\"tools.twirl.radius\": 64"), std::string::npos) << settings;
    EXPECT_EQ(settings.find("centre"), std::string::npos) << settings;
    twirl->Start(nullptr);
    EXPECT_EQ(twirl->GetTwirl(), -120.0);
    EXPECT_EQ(twirl->GetRadius(), 64.0);

    auto sphere = CountedCast<SphereTool>(StartTool(ToolID::Sphere));
    sphere->SetRadius(300.0);
    sphere->SetIntensity(-20.0);
    sphere->Commit();
    EXPECT_EQ(ReadSettingsFile(), settings) << "the sphere keeps no settings";
    sphere->Start(nullptr);
    EXPECT_EQ(sphere->GetRadius(), 128.0);
    EXPECT_EQ(sphere->GetIntensity(), 50.0);
    sphere->SetIntensity(0.0);
    EXPECT_FALSE(sphere->AutoCommitIfRequired(true)) << "intensity 0 is no sphere";
}

TEST_F(DistortTools, StartAdoptsTheSelectedLiveSphereCentreAndAll) {
    auto live =
        AddLiveLayer(Kernel::Counted<Command>(new RasterSphereCommand(true, -40.0, 33.0, {7.0, 9.0})));
    ASSERT_TRUE(live);
    m_Controller->BeginLiveEffectEdit(live);
    auto sphere = CountedCast<SphereTool>(StartTool(ToolID::Sphere));
    EXPECT_EQ(sphere->GetIntensity(), -40.0);
    EXPECT_EQ(sphere->GetRadius(), 33.0);
    EXPECT_EQ(sphere->GetCentre(), (Kernel::PointT<double>{7.0, 9.0}));
}

namespace {

// The record of one tagged value: code (little-endian), tag, size, payload.
void AppendRecord(std::vector<std::byte>& bytes, Kernel::FourCC code, std::uint16_t tag, const void* payload,
                  std::uint32_t size) {
    for (int i = 0; i < 4; ++i)
        bytes.push_back(std::byte((code >> (8 * i)) & 0xFF));
    bytes.push_back(std::byte(tag & 0xFF));
    bytes.push_back(std::byte(tag >> 8));
    for (int i = 0; i < 4; ++i)
        bytes.push_back(std::byte((size >> (8 * i)) & 0xFF));
    const auto* p = static_cast<const std::byte*>(payload);
    bytes.insert(bytes.end(), p, p + size);
}

} // namespace

TEST(DistortCommands, SaveWritesTheCodesInOrderThenTheBaseAndLoadRestoresThem) {
    const auto twirl =
        Kernel::Counted<RasterTwirlCommand>(new RasterTwirlCommand(true, -33.5, 77.0, {12.25, -4.0}));
    Kernel::OutSerialiser out;
    twirl->Save(out);
    std::vector<std::byte> expected;
    const double angle = -33.5, radius = 77.0, centre[2] = {12.25, -4.0};
    const std::uint8_t live = 1;
    AppendRecord(expected, Kernel::MakeFourCC("Angl"), 10, &angle, 8);
    AppendRecord(expected, Kernel::MakeFourCC("Radi"), 10, &radius, 8);
    AppendRecord(expected, Kernel::MakeFourCC("Orin"), 36, centre, 16);
    AppendRecord(expected, Kernel::MakeFourCC("Live"), 2, &live, 1);
    EXPECT_EQ(out.GetBytes(), expected);

    const auto loaded = RasterTwirlCommand::GetTypeClassProperties().CreateObject();
    Kernel::FileStore store;
    ASSERT_TRUE(loaded->Load(Kernel::InSerialiser(out.GetBytes()), store, 1));
    const auto* back = dynamic_cast<const RasterTwirlCommand*>(loaded.Get());
    ASSERT_TRUE(back);
    EXPECT_EQ(back->GetAngle(), -33.5);
    EXPECT_EQ(back->GetRadius(), 77.0);
    EXPECT_EQ(back->GetCentre(), (Kernel::PointT<double>{12.25, -4.0}));
    EXPECT_TRUE(back->IsLiveEffect());

    const auto sphere = DistortTest::MakeSphere(-12.0, 5.0, {1.0, 2.0});
    Kernel::OutSerialiser sphereOut;
    sphere->Save(sphereOut);
    std::vector<std::byte> sphereExpected;
    const double intensity = -12.0, sphereRadius = 5.0, sphereCentre[2] = {1.0, 2.0};
    const std::uint8_t notLive = 0;
    AppendRecord(sphereExpected, Kernel::MakeFourCC("Inte"), 10, &intensity, 8);
    AppendRecord(sphereExpected, Kernel::MakeFourCC("Radi"), 10, &sphereRadius, 8);
    AppendRecord(sphereExpected, Kernel::MakeFourCC("Orig"), 36, sphereCentre, 16);
    AppendRecord(sphereExpected, Kernel::MakeFourCC("Live"), 2, &notLive, 1);
    EXPECT_EQ(sphereOut.GetBytes(), sphereExpected);
}

// The command line's default centre (the catalogue's) renders like the image's middle typed in.
TEST(DistortCommands, TheDefaultCentreIsTheImagesMiddle) {
    const auto source = PipelineTest::MakeImage(Raster::PixelFormat::RGBA8, 50, 30, 3u);
    for (const char* name : {"twirl", "sphere"}) {
        const FilterInfo* info = FindFilter(name);
        ASSERT_TRUE(info) << name;
        std::vector<ParameterValue> values;
        for (const auto& spec : info->parameters)
            values.push_back(spec.defaultValue);
        values[0] = 80.0;
        values[1] = 20.0;
        const auto byDefault = info->makeCommand(false, values);
        values[2] = Kernel::PointT<double>{25.0, 15.0};
        const auto typed = info->makeCommand(false, values);
        const auto a = DistortTest::Render(dynamic_cast<const PipelineCommand&>(*byDefault), source, 0);
        const auto b = DistortTest::Render(dynamic_cast<const PipelineCommand&>(*typed), source, 0);
        ASSERT_TRUE(a && b);
        EXPECT_FALSE(PipelineTest::Compare(*a, *b)) << name;
        EXPECT_TRUE(PipelineTest::Compare(*a, *source)) << name << " changed nothing";
    }
}
