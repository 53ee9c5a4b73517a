// The procedural texture model: consolidation identity, editing, input values and serialisation round trips,
// and refusal of broken or hostile stored forms.
#include "host/document/ProceduralTexture.h"
#include "host/raster/PixelFormat.h"

#include <gtest/gtest.h>

#include <cmath>
#include <numbers>

using Kernel::Counted;

namespace {

using Config = ProceduralTextureConfig;

Counted<const ExpressionConstantSet> SampleSet() {
    return Counted<const ExpressionConstantSet>(new ExpressionConstantSet(
        {ExpressionConstant::Create(ExpressionConstant::Real, "scale", "Stripe width", 1.0, 100.0),
         ExpressionConstant::Create(ExpressionConstant::Integer, "count", "Rings", 1, 20),
         ExpressionConstant::Create(ExpressionConstant::Vector, "light", "Light direction", 0, 0)}));
}

Config::Handle SampleConfig() {
    return Config::CreateEmpty(Config::RGB)
        ->AddEquation(ProceduralTextureEquation("sin(x / scale) * 0.5 + 0.5", 7))
        ->AddEquation(ProceduralTextureEquation("1", 8))
        ->ReplaceConstantSet(SampleSet());
}

template <class T>
Counted<T> RoundTrip(const Kernel::Serialisable& object) {
    Kernel::FileStore store;
    Counted<Kernel::Serialisable> loaded = Kernel::DeserialiseObject(Kernel::SerialiseObject(object), store);
    return Counted<T>(dynamic_cast<T*>(loaded.Get()));
}

} // namespace

TEST(ProceduralTextureModel, EqualConfigsAreOneObjectAndEditsMakeNewOnes) {
    const Config::Handle a = SampleConfig();
    const Config::Handle b = SampleConfig();
    EXPECT_EQ(a, b) << "two equal configs built separately must be the same object";
    EXPECT_EQ(a.Get(), b.Get());

    const Config::Handle degrees = a->ChangeAnglesInRadians(true);
    EXPECT_NE(degrees, a);
    EXPECT_EQ(degrees->ChangeAnglesInRadians(false), a) << "undoing an edit finds the original object";

    const Config::Handle edited = a->ReplaceEquation(0, ProceduralTextureEquation("x", 7));
    EXPECT_NE(edited, a);
    EXPECT_EQ(edited->GetEquations()[0]->GetText(), "x");
    EXPECT_EQ(a->GetEquations()[0]->GetText(), "sin(x / scale) * 0.5 + 0.5") << "the original never changes";
    EXPECT_EQ(edited->ReplaceEquation(0, *a->GetEquations()[0]), a);

    // The mask alone distinguishes equations.
    EXPECT_NE(a->ReplaceEquation(1, ProceduralTextureEquation("1", 1)), a);
    // Out-of-range edits leave the value as it is (and so the same object).
    EXPECT_EQ(a->DeleteEquation(9), a);
    EXPECT_EQ(a->ReplaceEquation(9, ProceduralTextureEquation("y", 1)), a);

    const Config::Handle added = a->AddEquation();
    ASSERT_EQ(added->GetEquationCount(), 3u);
    EXPECT_EQ(added->GetEquations()[2]->GetChannelMask(), 15u) << "a new RGB equation writes R, G, B and A";
    EXPECT_TRUE(added->GetEquations()[2]->GetText().empty());
    EXPECT_EQ(added->DeleteEquation(2), a);
    EXPECT_EQ(Config::CreateEmpty(Config::CMYK)->AddEquation()->GetEquations()[0]->GetChannelMask(), 31u);
}

TEST(ProceduralTextureModel, UnusedConfigsLeaveTheRegistry) {
    const std::size_t before = Config::Handle::GetRegistrySize();
    {
        const Config::Handle temporary =
            Config::CreateEmpty(Config::Lab)->AddEquation(ProceduralTextureEquation("unique-text-4711", 1));
        EXPECT_GT(Config::Handle::GetRegistrySize(), before);
    }
    EXPECT_EQ(Config::Handle::GetRegistrySize(), before);
}

TEST(ProceduralTextureModel, ColourFormatsAndChannels) {
    using Raster::PixelFormat;
    const std::pair<PixelFormat, Config::ColourFormat> pairs[] = {
        {PixelFormat::RGBA8, Config::RGB},      {PixelFormat::RGBA16, Config::RGB},
        {PixelFormat::RGBAUF, Config::RGB},     {PixelFormat::CMYKA8, Config::CMYK},
        {PixelFormat::LabA16, Config::Lab},     {PixelFormat::IA8, Config::Intensity},
        {PixelFormat::IA16, Config::Intensity}, {PixelFormat::MaskA8, Config::Alpha},
        {PixelFormat::MaskA16, Config::Alpha},  {PixelFormat::MaskAF, Config::Alpha}};
    for (const auto& [raster, colour] : pairs)
        EXPECT_EQ(Config::ColourFormatFromRasterFormat(raster), colour) << int(raster);
    EXPECT_EQ(Config::ChannelCount(Config::RGB), 4);
    EXPECT_EQ(Config::ChannelCount(Config::CMYK), 5);
    EXPECT_EQ(Config::ChannelCount(Config::Lab), 4);
    EXPECT_EQ(Config::ChannelCount(Config::Intensity), 2);
    EXPECT_EQ(Config::ChannelCount(Config::Alpha), 1);
    EXPECT_EQ(Config::ChannelNames(Config::Lab)[1], "LA");
    EXPECT_STREQ(Config::ColourFormatString(Config::CMYK), "CMYK");
}

TEST(ProceduralTextureModel, InputValuesDefaultsAndVectors) {
    const auto values = ExpressionConstantValues::Create(*SampleSet());
    ASSERT_EQ(values->GetCount(), 3u);
    EXPECT_EQ(values->Get(0), ExpressionConstantValue(1.0)) << "a real starts at its range minimum";
    EXPECT_EQ(values->Get(1), ExpressionConstantValue(1)) << "an integer stays an integer";
    EXPECT_EQ(values->Get(2), ExpressionConstantValue(ExpressionConstantValueVec{}));

    const auto clone = values->Clone();
    clone->Set(0, 2.5);
    EXPECT_EQ(values->Get(0), ExpressionConstantValue(1.0)) << "a clone is independent";
    EXPECT_FALSE(*clone == *values);

    // (cos e cos a, -(sin a cos e), sin e)
    const auto flat = ExpressionConstantValues::ToUnitVector({0.0, 0.0});
    EXPECT_DOUBLE_EQ(flat[0], 1.0);
    EXPECT_DOUBLE_EQ(flat[1], 0.0);
    EXPECT_DOUBLE_EQ(flat[2], 0.0);
    const auto up = ExpressionConstantValues::ToUnitVector({0.0, std::numbers::pi / 2});
    EXPECT_NEAR(up[0], 0.0, 1e-15);
    EXPECT_NEAR(up[1], 0.0, 1e-15);
    EXPECT_DOUBLE_EQ(up[2], 1.0);
    const auto side = ExpressionConstantValues::ToUnitVector({std::numbers::pi / 2, 0.0});
    EXPECT_NEAR(side[0], 0.0, 1e-15);
    EXPECT_DOUBLE_EQ(side[1], -1.0);
}

TEST(ProceduralTextureModel, SerialisationRoundTrips) {
    const Config::Handle config = SampleConfig()->ChangeAnglesInRadians(true);
    const auto loaded = RoundTrip<Config>(*config);
    ASSERT_TRUE(loaded);
    EXPECT_TRUE(*loaded == *config);
    EXPECT_EQ(Config::Consolidate(*loaded), config) << "a loaded config consolidates to the saved one";

    auto values = ExpressionConstantValues::Create(config->GetConstantSet());
    values->Set(0, 12.25);
    values->Set(1, -3);
    values->Set(2, ExpressionConstantValueVec{0.5, -0.25});
    const auto loadedValues = RoundTrip<ExpressionConstantValues>(*values);
    ASSERT_TRUE(loadedValues);
    EXPECT_TRUE(*loadedValues == *values);
    EXPECT_TRUE(std::holds_alternative<int>(loadedValues->Get(1))) << "the value kinds survive";

    const auto loadedSet = RoundTrip<ExpressionConstantSet>(config->GetConstantSet());
    ASSERT_TRUE(loadedSet);
    EXPECT_TRUE(*loadedSet == config->GetConstantSet());
    EXPECT_EQ(loadedSet->Get(1).GetKind(), ExpressionConstant::Integer);
    EXPECT_EQ(loadedSet->Get(2).GetDescription(), "Light direction");

    ProceduralTextureConfigProperty property(config, values);
    EXPECT_TRUE(property.HasConstants());
    EXPECT_TRUE(property.AddPreset("Wide", values));
    auto narrow = values->Clone();
    narrow->Set(0, 2.0);
    EXPECT_TRUE(property.AddPreset("Narrow", narrow));
    const auto loadedProperty = RoundTrip<ProceduralTextureConfigProperty>(property);
    ASSERT_TRUE(loadedProperty);
    EXPECT_EQ(loadedProperty->GetConfig(), config);
    ASSERT_EQ(loadedProperty->GetPresets().size(), 2u);
    EXPECT_EQ(loadedProperty->GetPresets()[1].name, "Narrow");
    EXPECT_EQ(loadedProperty->FindPresetMatch(*narrow), 1);
    ASSERT_TRUE(loadedProperty->GetValues());
    EXPECT_TRUE(*loadedProperty->GetValues() == *values);
}

TEST(ProceduralTextureModel, InputPresetEditsReportWhetherTheyChangedAnything) {
    auto values = ExpressionConstantValues::Create(*SampleSet());
    ProceduralTextureConfigProperty property(SampleConfig(), values);
    EXPECT_EQ(property.FindPresetMatch(*values), -1);
    EXPECT_TRUE(property.AddPreset("One", values));
    EXPECT_EQ(property.FindPresetMatch(*values), 0);
    EXPECT_FALSE(property.RenamePreset(0, "One"));
    EXPECT_TRUE(property.RenamePreset(0, "First"));
    EXPECT_FALSE(property.RenamePreset(3, "Nope"));
    EXPECT_FALSE(property.ReplacePreset(0, values->Clone())) << "equal values change nothing";
    auto other = values->Clone();
    other->Set(1, 7);
    EXPECT_TRUE(property.ReplacePreset(0, other));
    EXPECT_EQ(property.FindPresetMatch(*values), -1);
    EXPECT_FALSE(property.DeletePreset(1));
    EXPECT_TRUE(property.DeletePreset(0));
    EXPECT_TRUE(property.GetPresets().empty());
    EXPECT_FALSE(ProceduralTextureConfigProperty(Config::CreateEmpty(Config::RGB), nullptr).HasConstants());
}

TEST(ProceduralTextureModel, BrokenStoredFormsAreRefused) {
    // An unknown colour format.
    {
        Kernel::OutSerialiser out;
        out.SaveType(Kernel::MakeFourCC("ClrF"), std::int32_t(9));
        out.SaveType(Kernel::MakeFourCC("Cnt "), std::int32_t(0));
        Config config;
        Kernel::FileStore store;
        const Kernel::InSerialiser in(out.GetBytes());
        EXPECT_FALSE(config.Load(in, store, 1));
    }
    // A hostile equation count: refused before anything is read.
    {
        Kernel::OutSerialiser out;
        out.SaveType(Kernel::MakeFourCC("ClrF"), std::int32_t(0));
        out.SaveType(Kernel::MakeFourCC("Cnt "), std::int32_t(1 << 30));
        Config config;
        Kernel::FileStore store;
        const Kernel::InSerialiser in(out.GetBytes());
        EXPECT_FALSE(config.Load(in, store, 1));
    }
    // A count that promises more equations than are stored.
    {
        Kernel::OutSerialiser out;
        out.SaveType(Kernel::MakeFourCC("ClrF"), std::int32_t(0));
        out.SaveType(Kernel::MakeFourCC("Cnt "), std::int32_t(2));
        Config config;
        Kernel::FileStore store;
        const Kernel::InSerialiser in(out.GetBytes());
        EXPECT_FALSE(config.Load(in, store, 1));
    }
    // A value of an unknown kind.
    {
        Kernel::OutSerialiser out;
        out.SaveType(Kernel::MakeFourCC("Cnt "), std::int32_t(1));
        out.SaveType((Kernel::FourCC('k') << 24), std::int32_t(7));
        ExpressionConstantValues values;
        Kernel::FileStore store;
        const Kernel::InSerialiser in(out.GetBytes());
        EXPECT_FALSE(values.Load(in, store, 1));
    }
    EXPECT_FALSE(ExpressionConstant::Create(42, "n", "", 0, 1));
}

TEST(ProceduralTextureModel, JsonFormRoundTripsAndRefusesWhatItCannotRead) {
    auto values = ExpressionConstantValues::Create(*SampleSet());
    values->Set(0, 12.5);
    values->Set(1, 4);
    values->Set(2, ExpressionConstantValueVec{0.5, 0.25});
    const Config::Handle config = SampleConfig()->ChangeAnglesInRadians(true);
    std::string error;
    const auto read = ReadProceduralTextureJson(WriteProceduralTextureJson(*config, values.Get()), error);
    ASSERT_TRUE(read) << error;
    EXPECT_EQ(read->config, config);
    EXPECT_TRUE(*read->values == *values);

    const std::pair<const char*, const char*> refused[] = {
        {"[]", "not a JSON object"},
        {"{\"equations\": 3}", "equations: expected an array"},
        {"{\"colourFormat\": \"HSV\", \"equations\": []}", "colourFormat"},
        {"{\"equations\": [{\"channels\": \"rgz\", \"text\": \"1\"}]}", "unknown channel \"z\""},
        {"{\"equations\": [], \"inputs\": [{\"name\": \"v\", \"kind\": \"vector\", \"value\": 3}]}",
         "inputs[0].value"},
        {"{\"equations\": [], \"inputs\": [{\"name\": \"k\", \"kind\": \"complex\"}]}", "inputs[0].kind"},
        {"{\"equations\": [{\"text\": \"1\"}", "not a JSON object"},
    };
    for (const auto& [text, message] : refused) {
        error.clear();
        EXPECT_FALSE(ReadProceduralTextureJson(text, error)) << text;
        EXPECT_NE(error.find(message), std::string::npos) << text << ": " << error;
    }
    // Channels default to all of the colour format's; Lab names run with commas.
    const auto lab = ReadProceduralTextureJson("{\"colourFormat\": \"lab\", \"equations\": [{\"text\": "
                                               "\"1\"}, {\"channels\": \"l,LB\", \"text\": \"0\"}]}",
                                               error);
    ASSERT_TRUE(lab) << error;
    EXPECT_EQ(lab->config->GetEquations()[0]->GetChannelMask(), 15u);
    EXPECT_EQ(lab->config->GetEquations()[1]->GetChannelMask(), 5u);
}
