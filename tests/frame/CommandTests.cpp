// Filter commands: serialised bytes, round trips through the class registry, hostile streams, merging,
// rectangles and the fixed answers each command gives the host.

#include "filters/Catalogue.h"
#include "filters/tonal/RasterAddNoiseCommand.h"
#include "filters/tonal/RasterDiffuseCommand.h"
#include "filters/tonal/RasterUnsharpMaskCommand.h"
#include "host/document/Document.h"

#include <algorithm>
#include <cstring>
#include <gtest/gtest.h>

using namespace RasterTools;

namespace {

// The record of one tagged value as the serialiser lays it out: code, tag, size (little-endian), payload.
void AppendRecord(std::vector<std::byte>& bytes, const char (&code)[5], std::uint16_t tag,
                  const void* payload, std::uint32_t size) {
    const Kernel::FourCC value =
        (Kernel::FourCC(std::uint8_t(code[0])) << 24) | (Kernel::FourCC(std::uint8_t(code[1])) << 16) |
        (Kernel::FourCC(std::uint8_t(code[2])) << 8) | Kernel::FourCC(std::uint8_t(code[3]));
    for (int i = 0; i < 4; ++i)
        bytes.push_back(std::byte((value >> (8 * i)) & 0xFF));
    bytes.push_back(std::byte(tag & 0xFF));
    bytes.push_back(std::byte(tag >> 8));
    for (int i = 0; i < 4; ++i)
        bytes.push_back(std::byte((size >> (8 * i)) & 0xFF));
    const auto* p = static_cast<const std::byte*>(payload);
    bytes.insert(bytes.end(), p, p + size);
}

template <class T>
Kernel::Counted<T> LoadInto(const std::vector<std::byte>& records, Kernel::Counted<T> command,
                            bool* loaded = nullptr) {
    Kernel::InSerialiser in(records);
    Kernel::FileStore store;
    const bool result = command->Load(in, store, 1);
    if (loaded) *loaded = result;
    return command;
}

Kernel::Counted<RasterAddNoiseCommand> FreshNoise() {
    return Kernel::CountedCast<RasterAddNoiseCommand>(
        RasterAddNoiseCommand::GetTypeClassProperties().CreateObject());
}

} // namespace

TEST(CommandSerialisation, NoiseWritesItsPropertiesThenTheBaseData) {
    auto command = Kernel::MakeCounted<RasterAddNoiseCommand>(true, 0.75, true, false);
    Kernel::OutSerialiser out;
    command->Save(out);

    // Worked out from the record layout: "Inte" as a tag-10 double, "Mono" and "Gaus" as typed
    // booleans, then the live-effect flag that the base class writes.
    std::vector<std::byte> expected;
    const double intensity = 0.75;
    const std::uint8_t yes = 1, no = 0;
    AppendRecord(expected, "Inte", 10, &intensity, 8);
    AppendRecord(expected, "Mono", 2, &yes, 1);
    AppendRecord(expected, "Gaus", 2, &no, 1);
    AppendRecord(expected, "Live", 2, &yes, 1);
    EXPECT_EQ(out.GetBytes(), expected);
    // "Inte" leads with its code's low byte: 0x496E7465 stored little-endian.
    ASSERT_GE(out.GetBytes().size(), 4u);
    EXPECT_EQ(std::to_integer<int>(out.GetBytes()[0]), 0x65);
    EXPECT_EQ(std::to_integer<int>(out.GetBytes()[3]), 0x49);
}

TEST(CommandSerialisation, EveryFilterRoundTripsThroughTheClassRegistry) {
    for (const auto& info : GetFilterCatalogue()) {
        SCOPED_TRACE(std::string(info.name));
        // Values away from the defaults, so that a field that is not saved shows up.
        std::vector<ParameterValue> values;
        for (const auto& spec : info.parameters) {
            switch (spec.type) {
            case ParameterType::Double:
                values.emplace_back(spec.maximum * 0.37 + 0.125);
                break;
            case ParameterType::Bool:
                values.emplace_back(!std::get<bool>(spec.defaultValue));
                break;
            case ParameterType::Int: {
                // Three above the default where the range allows, else the end farther from it.
                const int value = std::get<int>(spec.defaultValue), high = int(HighestValue(spec));
                const int low = int(LowestValue(spec));
                values.emplace_back(value + 3 <= high ? value + 3 : high - value >= value - low ? high : low);
                break;
            }
            case ParameterType::Point: {
                const double low = LowestValue(spec), span = HighestValue(spec) - low;
                values.emplace_back(Kernel::PointT<double>{low + 0.375 * span, low + 0.625 * span});
                break;
            }
            }
        }
        for (bool live : {false, true}) {
            const auto original = info.makeCommand(live, values);
            const auto bytes = Kernel::SerialiseObject(*original);
            Kernel::FileStore store;
            const auto restored = Kernel::CountedCast<RasterCommand>(Kernel::DeserialiseObject(bytes, store));
            ASSERT_TRUE(restored);
            EXPECT_EQ(restored->GetObjectClassProperties().GetClassCode(), info.classCode);
            EXPECT_EQ(info.readCommand(*restored), values);
            // One-shot commands without a live form (vertical edge detect) ignore the flag and repeat.
            const auto* filter =
                dynamic_cast<const RasterDevicePreviewableFilterLayerCommand*>(restored.Get());
            if (filter) {
                EXPECT_EQ(filter->IsLiveEffect(), live);
            }
            EXPECT_EQ(restored->CanRepeat(), !filter || !live);

            const auto clone = Kernel::CountedCast<RasterCommand>(restored->Clone());
            ASSERT_TRUE(clone);
            EXPECT_NE(clone.Get(), restored.Get());
            EXPECT_EQ(info.readCommand(*clone), values);
            EXPECT_EQ(Kernel::SerialiseObject(*clone), bytes);
        }
    }
}

TEST(CommandSerialisation, AbsentPropertiesKeepTheirFields) {
    std::vector<std::byte> records;
    const std::uint8_t yes = 1;
    AppendRecord(records, "Mono", 2, &yes, 1);
    bool loaded = false;
    auto command = LoadInto(records, FreshNoise(), &loaded);
    EXPECT_TRUE(loaded);
    EXPECT_EQ(command->GetIntensity(), 0.0);
    EXPECT_TRUE(command->GetMono());
    EXPECT_TRUE(command->GetGaussian());
    EXPECT_FALSE(command->IsLiveEffect());
}

TEST(CommandSerialisation, WrongTagsAndSizesAreNotLoaded) {
    std::vector<std::byte> records;
    const std::int32_t wholeNumber = 7;
    const double half = 0.5;
    const std::uint8_t two = 2;
    AppendRecord(records, "Inte", 7, &wholeNumber, 4); // an integer where a double belongs
    AppendRecord(records, "Mono", 10, &half, 8);       // a double where a boolean belongs
    AppendRecord(records, "Gaus", 2, &two, 1);         // a boolean byte that is neither 0 nor 1
    auto command = LoadInto(records, FreshNoise());
    EXPECT_EQ(command->GetIntensity(), 0.0);
    EXPECT_FALSE(command->GetMono());
    EXPECT_TRUE(command->GetGaussian());
}

TEST(CommandSerialisation, TruncatedAndOversizedStreamsAreRefused) {
    const auto bytes =
        Kernel::SerialiseObject(*Kernel::MakeCounted<RasterUnsharpMaskCommand>(true, 4.0, 1.5, 0.25));
    Kernel::FileStore store;
    for (std::size_t length = 0; length < bytes.size(); ++length)
        EXPECT_FALSE(Kernel::DeserialiseObject(std::span(bytes).first(length), store)) << "length " << length;

    // A record that claims more bytes than there are.
    std::vector<std::byte> oversized = bytes;
    const std::size_t firstSize = 4 + 2 + 4 + 4 + 2; // object header (code, version, size), then code and tag
    for (std::size_t i = 0; i < 4; ++i)
        oversized[firstSize + i] = std::byte(0xFF);
    EXPECT_FALSE(Kernel::DeserialiseObject(oversized, store));

    // An unknown class code.
    std::vector<std::byte> foreign = bytes;
    foreign[0] = std::byte('?');
    EXPECT_FALSE(Kernel::DeserialiseObject(foreign, store));
}

TEST(CommandMerge, TakesTheNewerParametersOnlyForTheSameLiveLayer) {
    auto layer = Kernel::Counted<Node>(
        new FilterRasterNode("noise", Kernel::Counted<RasterDevicePreviewableFilterLayerCommand>(
                                          new RasterAddNoiseCommand(true, 0.1, false, true))));
    auto other = Kernel::Counted<Node>(new RasterNode("pixels", 8, 8));
    auto cache = Kernel::Counted<Kernel::Countable>(new RasterNode("cache stand-in", 1, 1));

    auto first = Kernel::MakeCounted<RasterAddNoiseCommand>(true, 0.2, false, true);
    auto second = Kernel::MakeCounted<RasterAddNoiseCommand>(true, 0.6, true, false);
    first->SetSelection({layer});
    second->SetSelection({layer});
    second->SetRenderCache(cache);
    ASSERT_TRUE(first->Merge(second));
    EXPECT_EQ(first->GetIntensity(), 0.6);
    EXPECT_TRUE(first->GetMono());
    EXPECT_FALSE(first->GetGaussian());
    EXPECT_EQ(first->GetRenderCache(), cache);

    // Another selection.
    auto elsewhere = Kernel::MakeCounted<RasterAddNoiseCommand>(true, 0.9, false, true);
    elsewhere->SetSelection({layer, other});
    EXPECT_FALSE(first->Merge(elsewhere));
    EXPECT_EQ(first->GetIntensity(), 0.6);

    // A command that edits pixels never merges, nor does another filter's command.
    auto pixels = Kernel::MakeCounted<RasterAddNoiseCommand>(false, 0.3, false, true);
    pixels->SetSelection({layer});
    auto second2 = Kernel::MakeCounted<RasterAddNoiseCommand>(true, 0.4, false, true);
    second2->SetSelection({layer});
    EXPECT_FALSE(pixels->Merge(second2));
    auto diffuse = Kernel::MakeCounted<RasterDiffuseCommand>(true, 0.4);
    diffuse->SetSelection({layer});
    EXPECT_FALSE(first->Merge(diffuse));

    // A selection without a live filter layer in it.
    auto onPixels = Kernel::MakeCounted<RasterAddNoiseCommand>(true, 0.2, false, true);
    auto onPixelsToo = Kernel::MakeCounted<RasterAddNoiseCommand>(true, 0.3, false, true);
    onPixels->SetSelection({other});
    onPixelsToo->SetSelection({other});
    EXPECT_FALSE(onPixels->Merge(onPixelsToo));
}

TEST(CommandRectangles, GrowByWhatEachFilterReads) {
    const Kernel::RectT<double> rect{10.0, 20.0, 110.0, 70.0};
    const auto unbounded = Kernel::RectT<double>::Unbounded();
    EXPECT_EQ(unbounded.left, -1.7976931348623157e308);

    auto noise = Kernel::MakeCounted<RasterAddNoiseCommand>(false, 3.0, false, true);
    for (auto given : {rect, unbounded}) {
        auto in = given, out = given;
        noise->PrepareInputRectangle(in);
        EXPECT_TRUE(noise->PrepareOutputRectangle(out));
        EXPECT_EQ(in, given);
        EXPECT_EQ(out, given);
    }

    // 0.3 × 512 = 153.6: the input grows by whole pixels, the output exactly.
    auto diffuse = Kernel::MakeCounted<RasterDiffuseCommand>(false, 0.3);
    auto in = rect, out = rect;
    diffuse->PrepareInputRectangle(in);
    EXPECT_TRUE(diffuse->PrepareOutputRectangle(out));
    EXPECT_EQ(in, (Kernel::RectT<double>{-144.0, -134.0, 264.0, 224.0}));
    EXPECT_DOUBLE_EQ(out.left, 10.0 - 153.6);
    EXPECT_DOUBLE_EQ(out.bottom, 70.0 + 153.6);
    auto sentinel = unbounded;
    diffuse->PrepareInputRectangle(sentinel);
    EXPECT_TRUE(sentinel.IsUnbounded());

    // ceil(10 / 3) = 4 pixels on every side.
    auto unsharp = Kernel::MakeCounted<RasterUnsharpMaskCommand>(false, 10.0, 0.5, 0.0);
    in = rect;
    unsharp->PrepareInputRectangle(in);
    EXPECT_EQ(in, (Kernel::RectT<double>{6.0, 16.0, 114.0, 74.0}));
    sentinel = unbounded;
    unsharp->PrepareInputRectangle(sentinel);
    EXPECT_TRUE(sentinel.IsUnbounded());
    sentinel = unbounded;
    EXPECT_TRUE(unsharp->PrepareOutputRectangle(sentinel));
    EXPECT_TRUE(sentinel.IsUnbounded());
}

// The fixed answers of the host contract, per command class; every filter of the catalogue must have a row,
// so that registering a filter enrols it here.
TEST(CommandAnswers, EveryRegisteredCommandGivesTheHostContractsAnswers) {
    struct Expected {
        const char* commandClass;
        char classCode[5];
        bool canAffectAlpha, canRequireInflation, looksTerrible, prefersToProtectAlpha;
        int progressType; // 0: the host's own answer
    };
    constexpr Expected table[] = {
        {"RasterAddNoiseCommand", "RANC", false, false, true, false, 2},
        {"RasterDiffuseCommand", "RDf2", true, true, true, false, 2},
        {"RasterUnsharpMaskCommand", "RUSC", false, true, false, false, 2},
        {"RasterMotionBlurCommand", "RMoB", true, true, false, false, 2},
        {"RasterSphereCommand", "RSpC", true, true, false, false, 2},
        {"RasterTwirlCommand", "RTwC", true, true, false, false, 2},
        {"RasterVoronoiCommand", "RVoC", false, true, false, false, 2},
        {"RasterCopyCommand", "RCpy", false, false, false, false, 2},
        {"RasterVerticalEdgeDetectCommand", "RVEd", true, true, false, true, 0},
        {"ProceduralTextureCommand", "PrTx", true, false, false, false, 2},
        {"RasterLightingCommand", "RLig", false, true, false, false, 2},
    };
    const auto CodeOf = [](const char* code) {
        return (Kernel::FourCC(std::uint8_t(code[0])) << 24) | (Kernel::FourCC(std::uint8_t(code[1])) << 16) |
               (Kernel::FourCC(std::uint8_t(code[2])) << 8) | Kernel::FourCC(std::uint8_t(code[3]));
    };
    for (const auto& info : GetFilterCatalogue()) {
        SCOPED_TRACE(std::string(info.commandClass));
        const auto* row = std::find_if(std::begin(table), std::end(table), [&](const Expected& e) {
            return info.commandClass == e.commandClass;
        });
        ASSERT_NE(row, std::end(table)) << "no contract answers for this command";
        for (const bool live : {false, true}) {
            const auto command = info.makeCommand(live, {});
            ASSERT_TRUE(command);
            EXPECT_EQ(command->GetDescription(),
                      Kernel::LocalisedString(std::string(info.description), "Command description"));
            EXPECT_EQ(command->GetAssociatedToolID(), info.toolID);
            EXPECT_EQ(command->GetObjectClassProperties().GetClassCode(), info.classCode);
            EXPECT_EQ(info.classCode, CodeOf(row->classCode));
            EXPECT_EQ(command->CanAffectAlpha(), row->canAffectAlpha);
            EXPECT_EQ(command->CanRequireInflation(), row->canRequireInflation);
            EXPECT_EQ(command->GetLooksTerribleWhenPreviewingBecauseOfRetina(), row->looksTerrible);
            EXPECT_EQ(command->PrefersToProtectAlpha(), row->prefersToProtectAlpha);
            if (row->progressType != 0) {
                EXPECT_EQ(int(command->GetProgressType()), row->progressType);
            }
            EXPECT_EQ(FindFilterOf(*command), &info);
        }
        // The command class is known to the host under the name its table declares.
        EXPECT_TRUE(CommandCoverage::Instance().Contains(std::string(info.commandClass)));
    }
    EXPECT_EQ(RasterAddNoiseCommand::GetTypeClassProperties().GetClassCode(), 0x52414E43u); // "RANC"
    // No default values are declared for any property.
    EXPECT_EQ(RasterAddNoiseCommand::GetTypeClassProperties().GetDefaults()[0].code, 0u);
}

TEST(CommandReflection, TheLiveLayerPanelShowsTheCommandsLabels) {
    auto command = Kernel::MakeCounted<RasterAddNoiseCommand>(true, 0.5, true, false);
    const auto properties = command->EnumerateReflecteds();
    ASSERT_EQ(properties.size(), 3u);
    const char* ids[] = {"inte", "mono", "gaus"};
    const char* labels[] = {"Intensity", "Mono", "Gaussian"};
    for (std::size_t i = 0; i < 3; ++i) {
        EXPECT_EQ(Kernel::FourCCToString(properties[i]->GetIdentifier()), ids[i]);
        EXPECT_EQ(properties[i]->GetLabel(), Kernel::LocalisedString(labels[i], "Reflected property"));
        EXPECT_EQ(properties[i]->FindAttribute<Kernel::ImageAttribute>(), nullptr);
    }
    EXPECT_EQ(properties[0]->GetValueText(), "0.5");
    EXPECT_EQ(properties[1]->GetValueText(), "true");
}
