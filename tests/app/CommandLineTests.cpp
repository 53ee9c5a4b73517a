// rastertools as a user meets it: list, play scripts, their errors and exit codes, the settings file.

#include "tests/app/CommandLineSupport.h"

#include <fstream>

using namespace AppTests;

TEST_F(CommandLine, ListShowsTheThreePairsWithTheirCodes) {
    const Result result = Run("list");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "NoiseTool  tool id 55")) << result.output;
    EXPECT_TRUE(Contains(result.output, "command RasterAddNoiseCommand  class code \"RANC\" 0x52414E43"));
    EXPECT_TRUE(Contains(result.output, "command RasterDiffuseCommand  class code \"RDf2\""));
    EXPECT_TRUE(Contains(result.output, "command RasterUnsharpMaskCommand  class code \"RUSC\""));
    EXPECT_TRUE(Contains(result.output, "tools.unsharpmask.factor"));
}

TEST_F(CommandLine, APlayedSessionCommitsToTheSettingsFile) {
    Write("session.play",
          "tool unsharpmask\nstart\ndrag 0,0 3,4\nset fact 2\ncommit\nshow history\n"
          "tool addnoise\nstart\ndrag 0,0 512,0 4 # a comment\nset gaus false\nleave\nshow params\n");
    const Result result = Run("play session.play");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "1. Unsharp Mask radius=5 factor=2 threshold=0")) << result.output;
    // 512 units of drag at 1/512 a unit store intensity 1, a spread of the whole channel: 100 percent.
    EXPECT_TRUE(Contains(result.output, "intensity=100\nmono=false\ngaussian=false")) << result.output;
    const std::string settings = Settings();
    EXPECT_TRUE(Contains(settings, "\"tools.unsharpmask.radius\": 5.0")) << settings;
    EXPECT_TRUE(Contains(settings, "\"tools.unsharpmask.factor\": 2.0")) << settings;
    EXPECT_TRUE(Contains(settings, "\"tools.addnoise.intensity\": 1.0")) << settings;
    EXPECT_TRUE(Contains(settings, "\"tools.addnoise.gaussian\": false")) << settings;
}

TEST_F(CommandLine, ScriptErrorsNameTheLineAndFail) {
    const struct {
        const char* script;
        const char* message;
    } cases[] = {
        {"tool addnoise\nfly away\n", "session.play:2: unknown verb \"fly\""},
        {"tool nonesuch\n",
         // The list is sorted by name; later filters may land anywhere in it.
         "session.play:1: unknown tool \"nonesuch\" (tools: addnoise, "},
        {"start\n", "session.play:1: no tool chosen"},
        {"tool addnoise\n\n# only a comment\ndrag 0,0\n", "session.play:4: usage: drag X0,Y0 X1,Y1 [STEPS]"},
        {"tool addnoise\nclick here\n", "session.play:2: \"here\" is not a point"},
        {"tool addnoise\nset inte lots\n", "session.play:2: inte: \"lots\" is not a number"},
        {"tool addnoise\nset inte 101\n", "session.play:2: inte must lie within 0 .. 100 %"},
        {"tool addnoise\nset xxxx 1\n", "session.play:2: the tool has no property \"xxxx\""},
        {"select-live 0\n", "session.play:1: layer 0 is not a live filter layer"},
        {"select 7\n", "session.play:1: \"7\" is not a layer index (0 to 0)"},
        {"load missing.rtd\n", "session.play:1: missing.rtd: cannot open"},
    };
    for (const auto& test : cases) {
        Write("session.play", test.script);
        const Result result = Run("play session.play");
        EXPECT_EQ(result.exitCode, 1) << test.script;
        EXPECT_TRUE(Contains(result.output, test.message))
            << "expected: " << test.message << "\ngot: " << result.output;
    }
    // Nothing was committed, so no settings file was written.
    EXPECT_FALSE(std::filesystem::exists(m_Folder / "settings.json"));
}

TEST_F(CommandLine, ADamagedDocumentIsRefusedAndLeftAlone) {
    Write("session.play", "add-live diffuse intensity=0.5\nsave doc.rtd\n");
    ASSERT_EQ(Run("play session.play").exitCode, 0);
    std::string saved;
    ASSERT_FALSE(Kernel::ReadWholeFile(m_Folder / "doc.rtd", saved, 1 << 20));
    saved[saved.size() / 2] ^= 0x01;
    std::ofstream(m_Folder / "doc.rtd", std::ios::binary) << saved;
    Write("session.play", "load doc.rtd\n");
    const Result result = Run("play session.play");
    EXPECT_EQ(result.exitCode, 1);
    EXPECT_TRUE(Contains(result.output, "doc.rtd: the document is damaged")) << result.output;
    std::string after;
    ASSERT_FALSE(Kernel::ReadWholeFile(m_Folder / "doc.rtd", after, 1 << 20));
    EXPECT_EQ(after, saved);
}

TEST_F(CommandLine, BadCommandLinesExitWithUsage) {
    EXPECT_EQ(Run("").exitCode, 2);
    const Result unknown = Run("frobnicate");
    EXPECT_EQ(unknown.exitCode, 2);
    EXPECT_TRUE(Contains(unknown.output, "unknown command \"frobnicate\""));
    EXPECT_EQ(Run("play").exitCode, 2);
    EXPECT_EQ(Run("list --settings").exitCode, 2);
    const Result twice = Run("--settings a.json list --settings b.json");
    EXPECT_EQ(twice.exitCode, 2);
    EXPECT_TRUE(Contains(twice.output, "--settings is given more than once")) << twice.output;
    EXPECT_EQ(Run("play nowhere.play").exitCode, 1);
    // A folder or a device given as the script is named for what it is, not read as an empty script.
    std::filesystem::create_directory(m_Folder / "scripts");
    const Result folder = Run("play scripts");
    EXPECT_EQ(folder.exitCode, 1);
    EXPECT_TRUE(Contains(folder.output, "scripts: is a folder, not a file")) << folder.output;
    const Result device = Run("play /dev/null");
    EXPECT_EQ(device.exitCode, 1);
    EXPECT_TRUE(Contains(device.output, "/dev/null: is not a regular file")) << device.output;
    EXPECT_EQ(Run("--help").exitCode, 0);
}
