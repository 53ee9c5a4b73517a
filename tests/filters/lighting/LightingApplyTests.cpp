// rastertools apply lighting and doc filter lighting as a user runs them: the whole settings from a JSON file
// (the same picture as the short flags for one light, coloured lights worked by hand, the same picture from
// a live layer in a document), and files and flags that must be refused with a clear message.

#include "host/io/ImageIO.h"
#include "host/raster/PixelFormat.h"
#include "tests/app/CommandLineSupport.h"

namespace {

using AppTests::Contains;
using AppTests::Result;

class ApplyLighting : public AppTests::CommandLine {
protected:
    // 8-bit RGBA, 31 × 23: a flat grey (128, 64, 200) left half, a gradient right half.
    void WriteInput(const std::string& name) {
        auto image = Raster::DynamicBuffer::Create(31, 23, Raster::PixelFormat::RGBA8);
        ASSERT_TRUE(image);
        for (int y = 0; y < 23; ++y) {
            auto* row = reinterpret_cast<std::uint8_t*>(image->RowBytes(y));
            for (int x = 0; x < 31; ++x) {
                const bool flat = x < 15;
                row[4 * x + 0] = std::uint8_t(flat ? 128 : x * 8);
                row[4 * x + 1] = std::uint8_t(flat ? 64 : y * 11);
                row[4 * x + 2] = std::uint8_t(flat ? 200 : (x * y) & 0xFF);
                row[4 * x + 3] = 255;
            }
        }
        const auto written = IO::WriteImage(m_Folder / name, *image);
        ASSERT_TRUE(written) << written.error;
    }
};

TEST_F(ApplyLighting, AJsonFileWithOneWhiteLightGivesTheShortFlagsPicture) {
    WriteInput("in.png");
    Write("one.json", R"({"ambient": 0.1, "diffuse": 0.8, "specular": 0.7, "shininess": 12, "depth": -2,
        "bumpOpacity": 0.6, "lights": [{"type": "point", "spin": 20, "tilt": 60, "centre": [30, 4],
        "distance": 25}]})");
    const Result file = Run("apply lighting --params one.json in.png file.png");
    ASSERT_EQ(file.exitCode, 0) << file.output;
    const Result flags = Run("apply lighting --ambient 0.1 --diffuse 0.8 --specular 0.7 --shininess 12 "
                             "--depth -2 --bumpopacity 0.6 --light 1 --spin 20 --tilt 60 --centre 30,4 "
                             "--distance 25 in.png flags.png");
    ASSERT_EQ(flags.exitCode, 0) << flags.output;
    EXPECT_EQ(AppTests::Pixels(m_Folder / "file.png"), AppTests::Pixels(m_Folder / "flags.png"));
}

// Over the flat half (no relief), a red light from straight above at full diffuse: red is lit
// 128 × (0.5 ambient + 1) = 192, green and blue take the ambient alone, 64 × 0.5 = 32 and 200 × 0.5 = 100;
// no specular. A second, blue light adds 200 × 0.25 = 50 to the blue alone.
TEST_F(ApplyLighting, ColouredLightsTintTheirChannelsAndSum) {
    WriteInput("in.png");
    const char* red = R"({"type": "point", "colour": [1, 0, 0], "centre": [7, 11], "distance": 50})";
    const char* blue = R"({"type": "point", "colour": [0, 0, 0.25], "centre": [7, 11], "distance": 50})";
    Write("red.json", std::string(R"({"ambient": 0.5, "specular": 0, "lights": [)") + red + "]}");
    Write("both.json",
          std::string(R"({"ambient": 0.5, "specular": 0, "lights": [)") + red + ", " + blue + "]}");
    for (const auto& [name, expected] :
         {std::pair<std::string, std::array<int, 4>>{"red", {192, 32, 100, 255}},
          {"both", {192, 32, 150, 255}}}) {
        const Result result = Run("apply lighting --params " + name + ".json in.png " + name + ".png");
        ASSERT_EQ(result.exitCode, 0) << result.output;
        const auto pixels = AppTests::Pixels(m_Folder / (name + ".png"));
        ASSERT_EQ(pixels.size(), std::size_t(31 * 23 * 4));
        const std::size_t at = (11 * 31 + 7) * 4;
        for (int c = 0; c < 4; ++c)
            EXPECT_EQ(int(pixels[at + std::size_t(c)]), expected[std::size_t(c)]) << name << " channel " << c;
    }
    // The short form with --colour is one such light.
    const Result short_ =
        Run("apply lighting --ambient 0.5 --specular 0 --light 1 --centre 7,11 --distance 50 "
            "--colour 1,0,0 in.png short.png");
    ASSERT_EQ(short_.exitCode, 0) << short_.output;
    EXPECT_EQ(AppTests::Pixels(m_Folder / "short.png"), AppTests::Pixels(m_Folder / "red.png"));
}

TEST_F(ApplyLighting, ALiveLayerFromAJsonFileKeepsEveryLightInTheDocument) {
    WriteInput("in.png");
    Write("two.json", R"({"ambientColour": [1, 0.9, 0.8], "depth": 3, "lights": [
        {"type": "spot", "colour": [1, 0.2, 0.2], "spin": 45, "tilt": 40, "centre": [5, 5], "distance": 30},
        {"type": "directional", "colour": [0.2, 0.4, 1], "spin": -120, "tilt": 55}]})");
    ASSERT_EQ(Run("apply lighting --params two.json in.png applied.png").exitCode, 0);
    ASSERT_EQ(Run("doc new in.png -o live.rtd").exitCode, 0);
    const Result live = Run("doc filter live.rtd lighting --live --params two.json");
    ASSERT_EQ(live.exitCode, 0) << live.output;
    ASSERT_EQ(Run("doc render live.rtd live.png").exitCode, 0);
    ASSERT_EQ(Run("doc new in.png -o flat.rtd").exitCode, 0);
    ASSERT_EQ(Run("doc filter flat.rtd lighting --params two.json").exitCode, 0);
    ASSERT_EQ(Run("doc render flat.rtd flat.png").exitCode, 0);
    const auto applied = AppTests::Pixels(m_Folder / "applied.png");
    EXPECT_EQ(AppTests::Pixels(m_Folder / "live.png"), applied);
    EXPECT_EQ(AppTests::Pixels(m_Folder / "flat.png"), applied);
}

TEST_F(ApplyLighting, ABumpMapFromAnImageFileReliefsTheLightByFlagOrFromTheJsonFile) {
    WriteInput("in.png");
    // Rings of brightness, 12 × 9, stretched over the layer.
    auto bump = Raster::DynamicBuffer::Create(12, 9, Raster::PixelFormat::RGBA8);
    for (int y = 0; y < 9; ++y)
        for (int x = 0; x < 12; ++x) {
            auto* pixel = reinterpret_cast<std::uint8_t*>(bump->RowBytes(y)) + 4 * x;
            pixel[0] = pixel[1] = pixel[2] = std::uint8_t(((x - 6) * (x - 6) + (y - 4) * (y - 4)) * 9);
            pixel[3] = 255;
        }
    std::filesystem::create_directories(m_Folder / "maps");
    ASSERT_TRUE(IO::WriteImage(m_Folder / "maps" / "bump.png", *bump));
    const std::string light = "--depth 3 --light 2 --tilt 35 --spin 60 ";
    ASSERT_EQ(Run("apply lighting " + light + "in.png own.png").exitCode, 0);
    const Result flagged = Run("apply lighting " + light + "--bump maps/bump.png in.png flag.png");
    ASSERT_EQ(flagged.exitCode, 0) << flagged.output;
    EXPECT_NE(AppTests::Pixels(m_Folder / "flag.png"), AppTests::Pixels(m_Folder / "own.png"));
    // The file's relative name is beside the settings file.
    Write("maps/settings.json", R"({"depth": 3, "bump": "bump.png",
        "lights": [{"type": "directional", "tilt": 35, "spin": 60}]})");
    const Result file = Run("apply lighting --params maps/settings.json in.png file.png");
    ASSERT_EQ(file.exitCode, 0) << file.output;
    EXPECT_EQ(AppTests::Pixels(m_Folder / "file.png"), AppTests::Pixels(m_Folder / "flag.png"));

    const Result missing = Run("apply lighting --bump nothere.png in.png out.png");
    EXPECT_NE(missing.exitCode, 0);
    EXPECT_TRUE(Contains(missing.output, "nothere.png")) << missing.output;
    Write("notimage.png", "not an image at all");
    const Result garbage = Run("apply lighting --bump notimage.png in.png out.png");
    EXPECT_NE(garbage.exitCode, 0);
    EXPECT_TRUE(Contains(garbage.output, "notimage.png")) << garbage.output;
    Write("lost.json", R"({"bump": "lost.png"})");
    const Result lost = Run("apply lighting --params lost.json in.png out.png");
    EXPECT_NE(lost.exitCode, 0);
    EXPECT_TRUE(Contains(lost.output, "lost.json: bump: ")) << lost.output;
    EXPECT_NE(Run("apply lighting --params maps/settings.json --bump maps/bump.png in.png out.png").exitCode,
              0);
    EXPECT_FALSE(std::filesystem::exists(m_Folder / "out.png"));
}

TEST_F(ApplyLighting, HostileSettingsFilesAndFlagsAreRefusedWithTheirReason) {
    WriteInput("in.png");
    std::string lights17 = R"({"lights": [)";
    for (int i = 0; i < 17; ++i)
        lights17 += std::string(i ? "," : "") + "{}";
    lights17 += "]}";
    const std::pair<std::string, std::string> files[] = {
        {"[1, 2", "not a JSON object"},
        {"", "not a JSON object"},
        {std::string("\x00\xff\xfe{", 4), "not a JSON object"},
        {"[]", "not a JSON object"},
        {R"({"ambiant": 0.5})", "ambiant: not a lighting setting"},
        {R"({"ambient": "bright"})", "ambient: expected a number"},
        {R"({"depth": 1e400})", "not a JSON object"},
        {R"({"depth": 20000})", "depth: must lie within"},
        {R"({"ambientColour": [1, 1]})", "ambientColour: expected [r, g, b]"},
        {R"({"specularColour": [1, -1, 1]})", "specularColour: expected [r, g, b]"},
        {R"({"fitWidth": 1})", "fitWidth: expected true or false"},
        {R"({"lights": {}})", "lights: expected an array"},
        {lights17, "lights: expected an array of at most 16"},
        {R"({"lights": [5]})", "lights[0]: expected an object"},
        {R"({"lights": [{}, {"type": "laser"}]})", "lights[1].type: expected"},
        {R"({"lights": [{"centre": [1]}]})", "lights[0].centre: expected [x, y]"},
        {R"({"lights": [{"tilt": 91}]})", "lights[0].tilt: must lie within"},
        {R"({"lights": [{"colour": [1, 1, 1], "color": [1, 1, 1]}]})", "lights[0].color: not a lighting"},
        {std::string(2000, '[') + std::string(2000, ']'), "not a JSON object"},
    };
    int index = 0;
    for (const auto& [text, reason] : files) {
        const std::string name = "bad" + std::to_string(index++) + ".json";
        Write(name, text);
        const Result result = Run("apply lighting --params " + name + " in.png out.png");
        EXPECT_NE(result.exitCode, 0) << name;
        EXPECT_TRUE(Contains(result.output, name + ": " + reason)) << name << ": " << result.output;
        EXPECT_FALSE(std::filesystem::exists(m_Folder / "out.png")) << name;
    }
    Write("good.json", "{}");
    const std::pair<std::string, std::string> flags[] = {
        {"--params missing.json", "missing.json: cannot be read"},
        {"--params good.json --params good.json", "--params is given more than once"},
        {"--params good.json --ambient 0.5", "--params holds every setting"},
        {"--params good.json --colour 1,0,0", "--params holds every setting"},
        {"--colour 1,0", "--colour: \"1,0\" is not R,G,B"},
        {"--colour 1,0,nan", "is not R,G,B"},
        {"--colour 1,0,0 --colour 0,1,0", "--colour is given more than once"},
    };
    for (const auto& [arguments, reason] : flags) {
        const Result result = Run("apply lighting " + arguments + " in.png out.png");
        EXPECT_NE(result.exitCode, 0) << arguments;
        EXPECT_TRUE(Contains(result.output, reason)) << arguments << ": " << result.output;
        EXPECT_FALSE(std::filesystem::exists(m_Folder / "out.png")) << arguments;
    }
    // The document is unchanged by a refused live filter.
    ASSERT_EQ(Run("doc new in.png -o doc.rtd").exitCode, 0);
    std::string before, after;
    Kernel::ReadWholeFile(m_Folder / "doc.rtd", before, 1 << 24);
    EXPECT_NE(Run("doc filter doc.rtd lighting --live --params bad4.json").exitCode, 0);
    Kernel::ReadWholeFile(m_Folder / "doc.rtd", after, 1 << 24);
    EXPECT_EQ(before, after);
}

} // namespace
