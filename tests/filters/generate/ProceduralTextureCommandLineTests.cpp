// rastertools with procedural textures as a user runs it: equations on the command line and in a JSON file,
// refusals that name the equation and the column, the same file from the processor and the OpenCL device, a
// live layer saved, loaded and rendered, and the tool's history and presets through play.

#include "tests/app/CommandLineSupport.h"

namespace {

using AppTests::Result;

// The command-line fixture (a private folder, the built program) and the files it leaves there.
class ProceduralTextureCommandLine : public AppTests::CommandLine {
protected:
    std::string Bytes(const std::string& name) {
        std::string bytes;
        const auto error = Kernel::ReadWholeFile(m_Folder / name, bytes, 1 << 24);
        EXPECT_FALSE(error) << name << ": " << error.value_or("");
        return bytes;
    }
};

constexpr const char* Equations = "--eq 'rgb=sin(rx / 7) * 0.5 + 0.5' --eq 'g=fract(hypot(rx, ry) / 13)' "
                                  "--eq 'a=1' --angles rad --origin 40,30";

TEST_F(ProceduralTextureCommandLine, EquationsRenderAlikeOnBothPathsAndInEveryTiling) {
    const std::string in = "'" EXAMPLE_IMAGE "'";
    ASSERT_EQ(Run(std::string("apply proceduraltexture ") + Equations + " --device cpu " + in + " cpu.png")
                  .exitCode,
              0);
    ASSERT_EQ(Run(std::string("apply proceduraltexture ") + Equations + " --device cpu --tile 37 " + in +
                  " tiles.png")
                  .exitCode,
              0);
    EXPECT_EQ(Bytes("cpu.png"), Bytes("tiles.png"));
    const Result device =
        Run(std::string("apply proceduraltexture ") + Equations + " --device opencl " + in + " device.png");
    if (device.output.find("on opencl") == std::string::npos) GTEST_SKIP() << "no OpenCL device";
    ASSERT_EQ(device.exitCode, 0) << device.output;
    EXPECT_NE(device.output.find(", 0 on the processor"), std::string::npos) << device.output;
    EXPECT_EQ(Bytes("cpu.png"), Bytes("device.png"));
}

TEST_F(ProceduralTextureCommandLine, ConfigFilesAndRefusals) {
    const std::string in = "'" EXAMPLE_IMAGE "'";
    Write("rings.json", "{\"colourFormat\": \"RGB\", \"anglesInRadians\": true, \"equations\": ["
                        "{\"channels\": \"rgb\", \"text\": \"fract(hypot(rx, ry) / spacing)\"}, "
                        "{\"channels\": \"a\", \"text\": \"1\"}], \"inputs\": [{\"name\": \"spacing\", "
                        "\"kind\": \"real\", \"min\": 2, \"max\": 100, \"value\": 30}]}");
    const Result ok = Run("apply proceduraltexture --config rings.json --device cpu " + in + " rings.png");
    EXPECT_EQ(ok.exitCode, 0) << ok.output;
    // The input's value from the command line gives another picture.
    EXPECT_EQ(
        Run("apply proceduraltexture --config rings.json --input spacing=9 --device cpu " + in + " other.png")
            .exitCode,
        0);
    EXPECT_NE(Bytes("rings.png"), Bytes("other.png"));

    const Result bad =
        Run("apply proceduraltexture --eq 'rgb=x / w' --eq 'a=x + foo' --device cpu " + in + " x.png");
    EXPECT_EQ(bad.exitCode, 1);
    EXPECT_NE(bad.output.find("equation 2"), std::string::npos) << bad.output;
    EXPECT_NE(bad.output.find("unknown name \"foo\" at column 5"), std::string::npos) << bad.output;
    EXPECT_FALSE(std::filesystem::exists(m_Folder / "x.png"));

    Write("broken.json", "{\"equations\": [{\"channels\": \"rgq\", \"text\": \"1\"}]}");
    const Result broken = Run("apply proceduraltexture --config broken.json --device cpu " + in + " y.png");
    EXPECT_EQ(broken.exitCode, 1) << broken.output;
    EXPECT_NE(broken.output.find("equations[0].channels"), std::string::npos) << broken.output;
    EXPECT_EQ(Run("apply proceduraltexture --config missing.json " + in + " x.png").exitCode, 1);
    EXPECT_EQ(Run("apply proceduraltexture --eq 'rgb=1' --config rings.json " + in + " x.png").exitCode, 1);
    EXPECT_NE(Run("apply proceduraltexture --eq 'nonsense' " + in + " x.png").exitCode, 0);
}

TEST_F(ProceduralTextureCommandLine, LiveLayerSavesLoadsAndRendersAsApplied) {
    const std::string in = "'" EXAMPLE_IMAGE "'";
    ASSERT_EQ(
        Run(std::string("apply proceduraltexture ") + Equations + " --device cpu " + in + " applied.png")
            .exitCode,
        0);
    ASSERT_EQ(Run("doc new " + in + " -o t.rtd").exitCode, 0);
    const Result added = Run(std::string("doc filter t.rtd proceduraltexture ") + Equations + " --live");
    ASSERT_EQ(added.exitCode, 0) << added.output;
    const Result rendered = Run("doc render t.rtd live.png --device cpu");
    ASSERT_EQ(rendered.exitCode, 0) << rendered.output;
    // The texture is opaque, so the live layer shows exactly what apply wrote.
    EXPECT_EQ(Bytes("applied.png"), Bytes("live.png"));
}

TEST_F(ProceduralTextureCommandLine, BlendModeSurvivesALiveLayerSavedAndLoaded) {
    const std::string in = "'" EXAMPLE_IMAGE "'";
    const std::string texture =
        "--eq 'rgb=vec3(fract(x / 17), 0.4, y / h)' --blend colour-dodge --opacity 0.8";
    ASSERT_EQ(Run("apply proceduraltexture " + texture + " --device cpu " + in + " dodge.png").exitCode, 0);
    ASSERT_EQ(Run("apply proceduraltexture --eq 'rgb=vec3(fract(x / 17), 0.4, y / h)' --opacity 0.8 "
                  "--device cpu " +
                  in + " normal.png")
                  .exitCode,
              0);
    EXPECT_NE(Bytes("dodge.png"), Bytes("normal.png")) << "the blend mode changes the picture";
    ASSERT_EQ(Run("doc new " + in + " -o b.rtd").exitCode, 0);
    const Result added = Run("doc filter b.rtd proceduraltexture " + texture + " --live");
    ASSERT_EQ(added.exitCode, 0) << added.output;
    const Result rendered = Run("doc render b.rtd live.png --device cpu");
    ASSERT_EQ(rendered.exitCode, 0) << rendered.output;
    EXPECT_EQ(Bytes("dodge.png"), Bytes("live.png"));

    const Result unknown = Run("apply proceduraltexture --eq 'rgb=1' --blend dissolve " + in + " x.png");
    EXPECT_EQ(unknown.exitCode, 1);
    EXPECT_NE(unknown.output.find("colour-dodge"), std::string::npos) << unknown.output;
}

TEST_F(ProceduralTextureCommandLine, ToolHistoryAndPresetsThroughPlay) {
    Write("t.play", "tool proceduraltexture\nstart\nshow hint\nset Prst 3\nset AdEq x\nset Eq03 a=x/w\n"
                    "click 40,30\nset TUnd x\nshow reflected\nset TRed x\ncommit\nshow history\n");
    const Result play = Run("play t.play");
    ASSERT_EQ(play.exitCode, 0) << play.output;
    EXPECT_NE(play.output.find("|CLICK| or |DRAG| to set texture origin (ox, oy)."), std::string::npos);
    EXPECT_NE(
        play.output.find("Hist \"History\" string = Start | Apply preset | Add equation | *Change equation | "
                         "Set origin"),
        std::string::npos)
        << play.output;
    EXPECT_NE(play.output.find("Eq01 \"Equation\" string = rgb=mod(floor(rx / size) + floor(ry / size), 2)"),
              std::string::npos)
        << play.output;
    EXPECT_NE(play.output.find("Orgn=40,30"), std::string::npos) << "redo restores the origin\n"
                                                                 << play.output;
    EXPECT_NE(play.output.find("history: Procedural Texture applied"), std::string::npos) << play.output;
}

} // namespace
