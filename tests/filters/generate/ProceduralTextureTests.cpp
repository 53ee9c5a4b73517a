// The procedural texture command: values worked out by hand from the binding and write-back rules, the
// first-wins channel rule, validation and hostile equations, processor/device agreement in every accepted
// format and tiling, the processor fallback for what the device cannot express, and the saved form.

#include "filters/generate/ProceduralTextureCommand.h"
#include "pipeline/RenderJob.h"
#include "tests/pipeline/LanguageZeroCheck.h"
#include "tests/pipeline/PipelineTestSupport.h"

#include <gtest/gtest.h>

#include <cstring>
#include <numbers>

namespace {

using namespace RasterTools;
using Kernel::Counted;
using PipelineTest::ReadComponents;
using Raster::PixelFormat;
using Config = ProceduralTextureConfig;

struct Eq {
    const char* text;
    std::uint32_t mask;
};

Config::Handle MakeConfig(Config::ColourFormat format, std::initializer_list<Eq> equations,
                          std::vector<Counted<const ExpressionConstant>> inputs = {}, bool radians = true) {
    Config::Handle config = Config::CreateEmpty(format)->ChangeAnglesInRadians(radians);
    if (!inputs.empty())
        config = config->ReplaceConstantSet(
            Counted<const ExpressionConstantSet>(new ExpressionConstantSet(std::move(inputs))));
    for (const Eq& eq : equations)
        config = config->AddEquation(ProceduralTextureEquation(eq.text, eq.mask));
    return config;
}

Counted<ProceduralTextureCommand> MakeCommand(const Config::Handle& config,
                                              Counted<const ExpressionConstantValues> values = nullptr,
                                              Kernel::PointT<double> origin = {}, double opacity = 1.0,
                                              int blendMode = 0) {
    return Kernel::MakeCounted<ProceduralTextureCommand>(false, origin, opacity, blendMode, config, values);
}

// An RGBA8 image of every pixel (r, g, b, a).
Counted<Raster::DynamicBuffer> Filled(std::uint8_t r, std::uint8_t g, std::uint8_t b, std::uint8_t a,
                                      int width = 8, int height = 4) {
    const std::uint8_t pixel[4] = {r, g, b, a};
    return PipelineTest::MakeFilled(PixelFormat::RGBA8, width, height, pixel);
}

std::vector<double> RenderPixel(const ProceduralTextureCommand& command,
                                const Counted<Raster::DynamicBuffer>& source, int x, int y) {
    const auto result = PipelineTest::Render(command, source, 0);
    if (!result) return {};
    return ReadComponents(*result, x, y);
}

std::vector<double> Px(double r, double g, double b, double a) {
    return {r, g, b, a};
}

} // namespace

// Each value below follows from: x = px + 0.5 (identity view), the result times 255 truncated and clamped,
// channels the mask leaves out unchanged.
TEST(ProceduralTextureValues, PositionsConstantsAndMasks) {
    const auto source = Filled(10, 20, 30, 200);
    // x / 255 at pixel 5: (5.5 / 255) * 255 = 5.5, truncated 5, in R, G and B; alpha as read.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"x / 255", 7}})), source, 5, 2),
              Px(5, 5, 5, 200));
    // y drives alpha alone.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"y / 255", 8}})), source, 5, 3),
              Px(10, 20, 30, 3));
    // Truncation and clamping on an 8-bit channel.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"1.7", 1}, {"-0.2", 2}, {"0.999", 4}})),
                          source, 0, 0),
              Px(255, 0, 254, 200));
    // Half of 255 truncates to 127.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"0.5", 15}})), source, 3, 1),
              Px(127, 127, 127, 127));
    // The origin: rx = x - ox. At pixel 6 with ox = 2: 4.5 -> 4; at pixel 1: -0.5 -> 0.
    const auto origin =
        MakeCommand(MakeConfig(Config::RGB, {{"rx / 255", 1}, {"ry / 255", 2}}), nullptr, {2.0, -1.0});
    EXPECT_EQ(RenderPixel(*origin, source, 6, 2), Px(4, 3, 30, 200));
    EXPECT_EQ(RenderPixel(*origin, source, 1, 2), Px(0, 3, 30, 200));
    // w and h are the raster's size (8 x 4).
    EXPECT_EQ(
        RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"w / 255", 1}, {"h / 255", 2}})), source, 0, 0),
        Px(8, 4, 30, 200));
}

TEST(ProceduralTextureValues, FirstEquationWinsAndSourcesAreReadBeforeAnyEquation) {
    const auto source = Filled(255, 0, 255, 255);
    // Both select R: only the first writes it; the second still writes G.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"0", 1}, {"1", 3}})), source, 0, 0),
              Px(0, 255, 255, 255));
    // The second equation reads R as it was read (1), not as the first wrote it (0).
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"0", 1}, {"R", 2}})), source, 0, 0),
              Px(0, 255, 255, 255));
    // An equation whose channels are all claimed is skipped, even when it would not compile.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"G", 4}, {"nonsense(", 4}})), source, 0, 0),
              Px(255, 0, 0, 255));
    // An empty text is ignored: the next equation gets its channels.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"", 1}, {"B", 1}})), source, 0, 0),
              Px(255, 0, 255, 255));
}

TEST(ProceduralTextureValues, VectorResultsFillSelectedChannelsInOrder) {
    const auto source = Filled(9, 9, 9, 9);
    // Two components into R, G, B: c0, c1, then 0. 0.2f * 255 and 0.6f * 255 truncate to 51 and 153.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"vec2(0.2, 0.6)", 7}})), source, 0, 0),
              Px(51, 153, 0, 9));
    // The k-th selected channel takes component k: G and A get c0 and c1.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"vec3(1, 0.5, 0)", 10}})), source, 0, 0),
              Px(9, 255, 9, 127));
}

TEST(ProceduralTextureValues, InputsAnglesAndUnits) {
    const auto source = Filled(0, 0, 0, 255);
    using C = ExpressionConstant;
    const auto inputs = std::vector<Counted<const ExpressionConstant>>{
        C::Create(C::Real, "k", "", 0, 1), C::Create(C::Integer, "n", "", 0, 10),
        C::Create(C::Vector, "light", "", 0, 0)};
    // Without values: a real is 1, an integer 0, a vector (1, 0, 0).
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"k", 1}, {"n", 2}, {"light.x", 4}}, inputs)),
                          source, 0, 0),
              Px(255, 0, 255, 255));
    auto values = Kernel::MakeCounted<ExpressionConstantValues>(
        std::vector<ExpressionConstantValue>{0.25, 3, ExpressionConstantValueVec{0.0, std::numbers::pi / 2}});
    // k = 0.25 -> 63; n / 10 = 0.3 -> 76; the vector from e = pi/2 is (0, 0, 1).
    EXPECT_EQ(
        RenderPixel(
            *MakeCommand(MakeConfig(Config::RGB, {{"k", 1}, {"n / 10", 2}, {"light.z", 4}}, inputs), values),
            source, 0, 0),
        Px(63, 76, 255, 255));
    EXPECT_EQ(
        RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"light", 7}}, inputs), values), source, 0, 0),
        Px(0, 0, 255, 255));
    // Degrees unless the config says radians: sin(90) is 1 in degrees and 0.89400 (x 255 = 227.97) in
    // radians.
    EXPECT_EQ(
        RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"sin(90)", 1}}, {}, false)), source, 0, 0)[0],
        255);
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"sin(90)", 1}}, {}, true)), source, 0, 0)[0],
              227);
}

TEST(ProceduralTextureValues, OpacityMixesWithTheLayer) {
    const auto source = Filled(100, 0, 0, 255);
    // Half of the way from 100 to 255: 177.5, truncated.
    EXPECT_EQ(
        RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"1", 1}}), nullptr, {}, 0.5), source, 0, 0)[0],
        177);
    EXPECT_EQ(
        RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"1", 1}}), nullptr, {}, 0.0), source, 0, 0)[0],
        100);
}

// Every blend mode on one pixel pair, worked out from the modes' defining formulas (B(b, s) channel by
// channel for the separable ones; luminosity 0.3 R + 0.59 G + 0.11 B with the set-luminosity, set-saturation
// and clip steps for the others) with the layer b = (201, 57, 113) / 255 and the texture s = (0.31, 0.67,
// 0.53), the result times 255 truncated. Alpha is replaced by the texture, never blended.
TEST(ProceduralTextureBlendModes, EveryModeOnAHandWorkedPixel) {
    const auto source = Filled(201, 57, 113, 200);
    const auto config = MakeConfig(Config::RGB, {{"vec3(0.31, 0.67, 0.53)", 7}, {"0.5", 8}});
    const std::vector<std::vector<double>> expected = {
        {79, 170, 135, 127},  // Normal: the texture
        {62, 38, 59, 127},    // Multiply: b s
        {217, 189, 188, 127}, // Screen: b + s - b s
        {180, 76, 119, 127},  // Overlay: hard light with b and s swapped
        {79, 57, 113, 127},   // Darken: the smaller
        {201, 170, 135, 127}, // Lighten: the larger
        {255, 172, 240, 127}, // Colour dodge: b / (1 - s), at most 1
        {80, 0, 0, 127},      // Colour burn: 1 - (1 - b) / s, at least 0
        {124, 124, 121, 127}, // Hard light: 2 b s below s = 0.5, screen with 2 s - 1 above
        {184, 78, 116, 127},  // Soft light: b - (1 - 2s) b (1 - b), or toward sqrt(b) above s = 0.5
        {121, 113, 22, 127},  // Difference: |b - s|
        {155, 151, 128, 127}, // Exclusion: b + s - 2 b s
        {11, 155, 99, 127},   // Hue: the texture's hue at the layer's saturation and luminosity
        {166, 74, 110, 127},  // Saturation: the texture's saturation
        {46, 137, 102, 127},  // Colour: the texture's hue and saturation at the layer's luminosity
        {234, 90, 146, 127},  // Luminosity: the layer's hue and saturation at the texture's luminosity
    };
    ASSERT_EQ(int(expected.size()), ProceduralTextureCommand::BlendModeCount);
    for (int mode = 0; mode < ProceduralTextureCommand::BlendModeCount; ++mode)
        EXPECT_EQ(RenderPixel(*MakeCommand(config, nullptr, {}, 1.0, mode), source, 1, 1),
                  expected[std::size_t(mode)])
            << Kernel::ReflectedBlendMode::GetBlendModeNames()[std::size_t(mode)].GetEnglish();

    // The opacity mixes the blended value with the layer: multiply's 62.31 at one half from 201 is 131.66.
    EXPECT_EQ(RenderPixel(*MakeCommand(config, nullptr, {}, 0.5, 1), source, 0, 0)[0], 131);
    // A texture that writes only red leaves green and blue to the separable modes ...
    const auto red = MakeConfig(Config::RGB, {{"0.31", 1}});
    EXPECT_EQ(RenderPixel(*MakeCommand(red, nullptr, {}, 1.0, 1), source, 0, 0), Px(62, 57, 113, 200));
    // ... while luminosity moves every colour channel: the texture pixel (0.31, 57/255, 113/255) has the
    // luminosity 0.27363 and the layer 0.41710, so the layer's colour shifts by -0.14347 (no clipping
    // needed): (0.64477, 0.08006, 0.29967) -> (164, 20, 76).
    EXPECT_EQ(RenderPixel(*MakeCommand(red, nullptr, {}, 1.0, 15), source, 0, 0), Px(164, 20, 76, 200));
}

TEST(ProceduralTextureBlendModes, OtherColourFormats) {
    // CMYK blends the inks' complements, so multiply adds ink: 1 - (1 - 101/255)(1 - 0.33) = 0.59537 -> 151,
    // and screen multiplies the inks: 101/255 * 0.33 = 0.13071 -> 33.
    const std::uint8_t cmykPixel[5] = {101, 0, 0, 0, 255};
    const auto cmyk = PipelineTest::MakeFilled(PixelFormat::CMYKA8, 4, 4, cmykPixel);
    const auto cmykConfig = MakeConfig(Config::CMYK, {{"0.33", 1}});
    EXPECT_EQ(RenderPixel(*MakeCommand(cmykConfig, nullptr, {}, 1.0, 1), cmyk, 0, 0),
              (std::vector<double>{151, 0, 0, 0, 255}));
    EXPECT_EQ(RenderPixel(*MakeCommand(cmykConfig, nullptr, {}, 1.0, 2), cmyk, 0, 0),
              (std::vector<double>{33, 0, 0, 0, 255}));

    // Lab: multiply acts on lightness and keeps the layer's a and b; colour takes a and b from the texture
    // (0.1 and 0.9 of 65535, truncated) and luminosity takes lightness alone.
    const std::uint16_t labPixel[4] = {40000, 20000, 50000, 65535};
    const auto lab = PipelineTest::MakeFilled(PixelFormat::LabA16, 4, 4, labPixel);
    const auto labConfig = MakeConfig(Config::Lab, {{"vec3(0.5, 0.1, 0.9)", 7}});
    EXPECT_EQ(RenderPixel(*MakeCommand(labConfig, nullptr, {}, 1.0, 1), lab, 0, 0),
              Px(20000, 20000, 50000, 65535));
    EXPECT_EQ(RenderPixel(*MakeCommand(labConfig, nullptr, {}, 1.0, 14), lab, 0, 0),
              Px(40000, 6553, 58981, 65535));
    EXPECT_EQ(RenderPixel(*MakeCommand(labConfig, nullptr, {}, 1.0, 15), lab, 0, 0),
              Px(32767, 20000, 50000, 65535));

    // A grey has no hue or saturation: hue, saturation and colour keep the layer; luminosity takes the
    // texture.
    const std::uint8_t greyPixel[2] = {200, 255};
    const auto grey = PipelineTest::MakeFilled(PixelFormat::IA8, 4, 4, greyPixel);
    const auto greyConfig = MakeConfig(Config::Intensity, {{"0.5", 1}});
    EXPECT_EQ(RenderPixel(*MakeCommand(greyConfig, nullptr, {}, 1.0, 1), grey, 0, 0),
              (std::vector<double>{100, 255}));
    for (const int mode : {12, 13, 14})
        EXPECT_EQ(RenderPixel(*MakeCommand(greyConfig, nullptr, {}, 1.0, mode), grey, 0, 0),
                  (std::vector<double>{200, 255}));
    EXPECT_EQ(RenderPixel(*MakeCommand(greyConfig, nullptr, {}, 1.0, 15), grey, 0, 0),
              (std::vector<double>{127, 255}));

    // Out-of-range texture values are clamped before blending on integer channels (a stored layer could not
    // hold them): multiply by 1.7 is multiply by 1, the layer's 201 exactly; by -0.2 is 0.
    const auto source = Filled(201, 57, 113, 255);
    EXPECT_EQ(
        RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"1.7", 1}, {"-0.2", 2}}), nullptr, {}, 1.0, 1),
                    source, 0, 0),
        Px(201, 0, 113, 255));
}

TEST(ProceduralTextureValidation, EmptyBrokenAndMismatchedConfigs) {
    std::string error;
    EXPECT_FALSE(ProceduralTextureCommand::ValidateConfig(Config::CreateEmpty(Config::RGB), nullptr, &error));
    EXPECT_FALSE(ProceduralTextureCommand::ValidateConfig(nullptr, nullptr));
    EXPECT_TRUE(
        ProceduralTextureCommand::ValidateConfig(MakeConfig(Config::RGB, {{"", 1}, {"x", 1}}), nullptr));
    EXPECT_TRUE(ProceduralTextureCommand::ValidateConfig(MakeConfig(Config::Alpha, {{"x / w", 1}}), nullptr));
    EXPECT_TRUE(ProceduralTextureCommand::ValidateConfig(MakeConfig(Config::Lab, {{"LA", 2}}), nullptr));

    // The message names the equation, the column and the reason.
    EXPECT_FALSE(ProceduralTextureCommand::ValidateConfig(MakeConfig(Config::RGB, {{"x", 1}, {"x + foo", 2}}),
                                                          nullptr, &error));
    EXPECT_NE(error.find("equation 2"), std::string::npos) << error;
    EXPECT_NE(error.find("foo"), std::string::npos) << error;
    EXPECT_NE(error.find("column 5"), std::string::npos) << error;

    // Physical lengths depend on a resolution the texture does not have: refused.
    EXPECT_FALSE(
        ProceduralTextureCommand::ValidateConfig(MakeConfig(Config::RGB, {{"x / 10mm", 1}}), nullptr));
    // Unit names are case-sensitive.
    EXPECT_TRUE(
        ProceduralTextureCommand::ValidateConfig(MakeConfig(Config::RGB, {{"x / 10px", 1}}), nullptr));
    EXPECT_FALSE(
        ProceduralTextureCommand::ValidateConfig(MakeConfig(Config::RGB, {{"x / 10PX", 1}}), nullptr));
    // Channel names of another colour format are unknown.
    EXPECT_FALSE(
        ProceduralTextureCommand::ValidateConfig(MakeConfig(Config::Intensity, {{"R", 1}}), nullptr));
    // An input may not take a variable's name.
    EXPECT_FALSE(ProceduralTextureCommand::ValidateConfig(
        MakeConfig(Config::RGB, {{"x", 1}},
                   {ExpressionConstant::Create(ExpressionConstant::Real, "x", "", 0, 1)}),
        nullptr, &error));

    // A config in one colour format is refused for a layer of another, and renders nothing there.
    ProceduralTextureState state;
    const auto cmyk = MakeConfig(Config::CMYK, {{"1", 31}});
    EXPECT_FALSE(ProceduralTextureCommand::Init(PixelFormat::RGBA8, {8, 4}, 72, {}, cmyk, nullptr, state));
    EXPECT_NE(state.error.find("CMYK"), std::string::npos) << state.error;
    EXPECT_TRUE(ProceduralTextureCommand::Init(PixelFormat::CMYKA8, {8, 4}, 72, {}, cmyk, nullptr, state));
    const auto source = Filled(1, 2, 3, 4);
    EXPECT_EQ(RenderPixel(*MakeCommand(cmyk), source, 2, 2), Px(1, 2, 3, 4));
}

TEST(ProceduralTextureValidation, HostileEquationsAreRefusedOrEvaluatedWithoutHarm) {
    const std::string deep = std::string(5000, '(') + "x" + std::string(5000, ')');
    const std::string longText(200000, '1');
    std::string error;
    for (const std::string& text : {deep, longText, std::string("x +"), std::string("sin(1, 2)"),
                                    std::string(")"), std::string("\xff\xfe"), std::string("x = ; y")}) {
        EXPECT_FALSE(ProceduralTextureCommand::ValidateConfig(MakeConfig(Config::RGB, {{text.c_str(), 1}}),
                                                              nullptr, &error))
            << text.substr(0, 20);
        EXPECT_FALSE(error.empty());
    }
    // IEEE results are stored by the clamp: infinity saturates, NaN stores 0.
    const auto source = Filled(7, 7, 7, 7);
    EXPECT_EQ(
        RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"1 / 0", 1}, {"0 / 0", 2}, {"sqrt(-1)", 4}})),
                    source, 0, 0),
        Px(255, 0, 0, 7));
    // A broken config renders the layer unchanged.
    EXPECT_EQ(RenderPixel(*MakeCommand(MakeConfig(Config::RGB, {{"x +", 1}})), source, 0, 0), Px(7, 7, 7, 7));
}

namespace {

// Configs for every colour format that use positions, inputs, channels, vectors and noise.
struct FormatCase {
    PixelFormat format;
    Config::Handle config;
};

std::vector<FormatCase> AgreementCases() {
    using C = ExpressionConstant;
    const std::vector<Counted<const ExpressionConstant>> inputs = {C::Create(C::Real, "scale", "", 1, 100),
                                                                   C::Create(C::Vector, "dir", "", 0, 0)};
    const auto rgb = MakeConfig(Config::RGB,
                                {{"sin(rx / scale) * 0.5 + 0.5", 1},
                                 {"vec2(fract(hypot(rx, ry) / 7), G * dir.x)", 6},
                                 {"clamp(noise(x / 9, y / 9) + A, 0, 1)", 8}},
                                inputs);
    const auto cmyk = MakeConfig(Config::CMYK, {{"fract(x / 13)", 5}, {"vec3(M, y / h, 1 - K)", 26}}, inputs);
    const auto lab = MakeConfig(Config::Lab, {{"L * 0.5 + x / w * 0.5", 1}, {"vec2(LB, LA)", 6}});
    const auto intensity = MakeConfig(Config::Intensity, {{"abs(cos(x / scale + y / 5))", 1}}, inputs);
    std::vector<FormatCase> cases;
    for (PixelFormat f : {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF})
        cases.push_back({f, rgb});
    cases.push_back({PixelFormat::CMYKA8, cmyk});
    cases.push_back({PixelFormat::LabA16, lab});
    cases.push_back({PixelFormat::IA8, intensity});
    cases.push_back({PixelFormat::IA16, intensity});
    return cases;
}

Counted<const ExpressionConstantValues> AgreementValues() {
    return Kernel::MakeCounted<ExpressionConstantValues>(
        std::vector<ExpressionConstantValue>{9.5, ExpressionConstantValueVec{0.4, 0.3}});
}

} // namespace

// The processor renders whole are the reference; the processor in tiles and the device whole and in tiles
// must give the same bytes (the device pastes the very functions the bytecode runs).
TEST(ProceduralTextureAgreement, ProcessorAndDeviceAgreeInEveryAcceptedFormatAndTiling) {
    const auto device = PipelineTest::OpenCLDevice();
    for (const FormatCase& c : AgreementCases()) {
        SCOPED_TRACE(Raster::GetPixelFormatName(c.format));
        const auto source = PipelineTest::MakeImage(c.format, 83, 45, 11u);
        const auto command = MakeCommand(c.config, AgreementValues(), {20.25, 9.5});
        ProceduralTextureState state;
        ASSERT_TRUE(
            ProceduralTextureCommand::Init(c.format, {83, 45}, 72, {}, c.config, AgreementValues(), state))
            << state.error;
        const auto reference = PipelineTest::Render(*command, source, 0);
        ASSERT_TRUE(reference);
        // The equations changed something.
        EXPECT_TRUE(PipelineTest::Compare(*reference, *source).has_value());
        for (const bool onDevice : {false, true}) {
            if (onDevice && !device) continue;
            for (const int tile : {0, 32, 37}) {
                if (!onDevice && tile == 0) continue;
                const auto result = PipelineTest::Render(*command, source, tile, onDevice ? device : nullptr);
                ASSERT_TRUE(result);
                if (const auto difference = PipelineTest::Compare(*result, *reference, 0.0))
                    ADD_FAILURE() << (onDevice ? "device" : "processor") << ", tiles " << tile << ": "
                                  << difference->Describe();
            }
        }
    }
    if (!device) GTEST_SKIP() << "no OpenCL device: only processor tilings were compared";
}

// Every blend mode, at an opacity below 1, gives the same bytes on the device as on the processor.
TEST(ProceduralTextureAgreement, EveryBlendModeAgreesInEveryAcceptedFormatAndTiling) {
    const auto device = PipelineTest::OpenCLDevice();
    for (const FormatCase& c : AgreementCases()) {
        SCOPED_TRACE(Raster::GetPixelFormatName(c.format));
        const auto source = PipelineTest::MakeImage(c.format, 83, 45, 5u);
        for (int mode = 1; mode < ProceduralTextureCommand::BlendModeCount; ++mode) {
            SCOPED_TRACE(mode);
            const auto command = MakeCommand(c.config, AgreementValues(), {20.25, 9.5}, 0.75, mode);
            const auto reference = PipelineTest::Render(*command, source, 0);
            ASSERT_TRUE(reference);
            for (const bool onDevice : {false, true}) {
                if (onDevice && !device) continue;
                for (const int tile : {0, 37}) {
                    if (!onDevice && tile == 0) continue;
                    const auto result =
                        PipelineTest::Render(*command, source, tile, onDevice ? device : nullptr);
                    ASSERT_TRUE(result);
                    if (const auto difference = PipelineTest::Compare(*result, *reference, 0.0))
                        ADD_FAILURE() << (onDevice ? "device" : "processor") << ", tiles " << tile << ": "
                                      << difference->Describe();
                }
            }
        }
    }
    if (!device) GTEST_SKIP() << "no OpenCL device: only processor tilings were compared";
}

TEST(ProceduralTextureAgreement, WhatTheDeviceCannotExpressRendersOnTheProcessor) {
    REQUIRE_OPENCL(device);
    // "kernel" is a word of the device language: no kernel text, so every tile renders on the processor.
    const auto config =
        MakeConfig(Config::RGB, {{"kernel / 2", 1}},
                   {ExpressionConstant::Create(ExpressionConstant::Real, "kernel", "", 0, 1)});
    const auto command = MakeCommand(config);
    ProceduralTextureState state;
    ASSERT_TRUE(ProceduralTextureCommand::Init(PixelFormat::RGBA8, {8, 4}, 72, {}, config, nullptr, state));
    EXPECT_EQ(ProceduralTextureCommand::GetSampleText(config, state, PixelFormat::RGBA8,
                                                      Raster::HardwareKernelLanguage::OpenCLC),
              nullptr);
    const auto source = Filled(0, 0, 0, 255, 40, 30);
    auto destination = PipelineTest::MakeDestination(*command, *source);
    RenderJobOptions options;
    options.tileSize = 16;
    options.device = device;
    const auto result = RenderImage(*command, source, destination, nullptr, options);
    ASSERT_TRUE(result.complete) << result.error;
    EXPECT_EQ(result.deviceTiles, 0);
    EXPECT_GT(result.processorTiles, 0);
    EXPECT_EQ(ReadComponents(*destination, 3, 3), Px(127, 0, 0, 255));
}

TEST(ProceduralTextureKernelText, CachedPerConfigAndCompiledForLanguageZero) {
    const auto config = MakeConfig(Config::RGB, {{"x / w", 1}, {"vec3(1, 0, y / h)", 14}});
    ProceduralTextureState state;
    ASSERT_TRUE(ProceduralTextureCommand::Init(PixelFormat::RGBA8, {8, 4}, 72, {}, config, nullptr, state));
    const char* first = ProceduralTextureCommand::GetSampleText(config, state, PixelFormat::RGBA8,
                                                                Raster::HardwareKernelLanguage::OpenCLC);
    ASSERT_NE(first, nullptr);
    EXPECT_EQ(ProceduralTextureCommand::GetSampleText(
                  MakeConfig(Config::RGB, {{"x / w", 1}, {"vec3(1, 0, y / h)", 14}}), state,
                  PixelFormat::RGBA8, Raster::HardwareKernelLanguage::OpenCLC),
              first)
        << "an equal config finds the cached text";
    EXPECT_NE(std::string(first).find("ProceduralProcess2"), std::string::npos);

    REQUIRE_NVRTC();
    for (const FormatCase& c : AgreementCases()) {
        SCOPED_TRACE(Raster::GetPixelFormatName(c.format));
        ASSERT_TRUE(
            ProceduralTextureCommand::Init(c.format, {8, 4}, 72, {}, c.config, AgreementValues(), state));
        // Normal's text and the one the other blend modes share.
        for (const int mode : {0, 12}) {
            const char* text = ProceduralTextureCommand::GetSampleText(
                c.config, state, c.format, Raster::HardwareKernelLanguage::CudaCpp, mode);
            ASSERT_NE(text, nullptr);
            auto descriptor = DescribeKernel<ProceduralTextureStages::Plain<PixelFormat::RGBA8>>(
                Raster::HardwareKernelLanguage::CudaCpp, {c.format, c.format, std::nullopt, false});
            ASSERT_TRUE(descriptor);
            (*descriptor)[Raster::HardwareKernelFragment::Sample] = text;
            const auto ptx = Raster::CompileToPtx(
                Raster::AssembleKernelSource(*descriptor, Raster::HardwareKernelLanguage::CudaCpp),
                descriptor->entryPoint);
            EXPECT_TRUE(ptx.ptx) << ptx.log;
        }
    }
}

TEST(ProceduralTextureCommandForm, SaveAndLoadKeepEverything) {
    using C = ExpressionConstant;
    const auto config =
        MakeConfig(Config::RGB, {{"k * x / w", 7}}, {C::Create(C::Real, "k", "", 0, 2)}, false);
    const auto values =
        Kernel::MakeCounted<ExpressionConstantValues>(std::vector<ExpressionConstantValue>{1.5});
    const auto command = Kernel::MakeCounted<ProceduralTextureCommand>(
        true, Kernel::PointT<double>{3.5, -2.0}, 0.75, 5, config, values);
    Kernel::FileStore store;
    const auto loaded = Kernel::CountedCast<ProceduralTextureCommand>(
        Kernel::DeserialiseObject(Kernel::SerialiseObject(*command), store));
    ASSERT_TRUE(loaded);
    EXPECT_EQ(loaded->GetConfig(), config) << "the loaded config is the same consolidated object";
    ASSERT_TRUE(loaded->GetConstantValues());
    EXPECT_TRUE(*loaded->GetConstantValues() == *values);
    EXPECT_EQ(loaded->GetOrigin(), (Kernel::PointT<double>{3.5, -2.0}));
    EXPECT_EQ(loaded->GetOpacity(), 0.75);
    EXPECT_EQ(loaded->GetBlendMode(), 5);
    EXPECT_TRUE(loaded->IsLiveEffect());
    EXPECT_EQ(loaded->GetDescription().GetEnglish(), "Procedural Texture");
    EXPECT_EQ(loaded->GetAssociatedToolID(), ToolID::ProceduralTexture);

    // A values object of another class counts as none; an unknown blend mode keeps the field.
    Kernel::OutSerialiser out;
    out.SaveObject(Kernel::MakeFourCC("Cnfg"), *config);
    out.SaveObject(Kernel::MakeFourCC("CVls"), *config->GetConstantSet().GetConstants()[0]);
    out.SaveType(Kernel::MakeFourCC("BleM"), std::int32_t(99));
    const Kernel::InSerialiser in(out.GetBytes());
    auto odd = Kernel::CountedCast<ProceduralTextureCommand>(
        ProceduralTextureCommand::GetTypeClassProperties().CreateObject());
    ASSERT_TRUE(odd);
    const int before = odd->GetBlendMode();
    odd->Load(in, store, 1);
    EXPECT_EQ(odd->GetConfig(), config);
    EXPECT_FALSE(odd->GetConstantValues());
    EXPECT_EQ(odd->GetBlendMode(), before);

    // Without a config there is nothing to render: refused.
    Kernel::OutSerialiser empty;
    const Kernel::InSerialiser none(empty.GetBytes());
    EXPECT_FALSE(odd->Load(none, store, 1));
}

TEST(ProceduralTextureShortForm, ChannelsBeforeTheEqualsSign) {
    auto eq = ProceduralTextureCommand::ParseEquation(Config::RGB, "rgb=x / w");
    ASSERT_TRUE(eq);
    EXPECT_EQ(eq->GetChannelMask(), 7u);
    EXPECT_EQ(eq->GetText(), "x / w");
    EXPECT_EQ(ProceduralTextureCommand::ParseEquation(Config::RGB, "A=t = 1; t")->GetText(), "t = 1; t");
    EXPECT_EQ(ProceduralTextureCommand::ParseEquation(Config::Lab, "l,lb=1")->GetChannelMask(), 5u);
    EXPECT_EQ(ProceduralTextureCommand::ParseEquation(Config::Lab, "la=1")->GetChannelMask(), 2u);
    EXPECT_EQ(ProceduralTextureCommand::ParseEquation(Config::CMYK, "cmyka=1")->GetChannelMask(), 31u);
    std::string error;
    EXPECT_FALSE(ProceduralTextureCommand::ParseEquation(Config::RGB, "rgq=1", &error));
    EXPECT_NE(error.find("\"q\""), std::string::npos) << error;
    EXPECT_FALSE(ProceduralTextureCommand::ParseEquation(Config::RGB, "x / w"));
    EXPECT_FALSE(ProceduralTextureCommand::ParseEquation(Config::RGB, "=1"));
    EXPECT_EQ(ProceduralTextureCommand::FormatEquation(Config::RGB, *eq), "rgb=x / w");
    EXPECT_EQ(ProceduralTextureCommand::FormatEquation(Config::Lab, ProceduralTextureEquation("1", 5)),
              "l,lb=1");
}
