// What a photographer meets on the command line: help generated from the parameter tables, values in the
// units the panels show, chains, batches, pipes, the default device and interrupted writes.

#include "app/ChainRender.h"
#include "app/FilterArguments.h"
#include "app/Options.h"
#include "filters/Catalogue.h"
#include "host/io/ImageIO.h"
#include "host/raster/device/Hardware.h"
#include "tests/app/CommandLineSupport.h"

#include <chrono>
#include <cmath>
#include <csignal>
#include <numbers>
#include <thread>

using namespace AppTests;

namespace {

Kernel::Counted<Raster::DynamicBuffer> Picture(int width, int height, int seed) {
    auto image = Raster::DynamicBuffer::Create(width, height, Raster::PixelFormat::RGBA8);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x) {
            auto* p = image->Row<std::uint8_t>(y) + 4 * x;
            p[0] = std::uint8_t(x * 7 + seed);
            p[1] = std::uint8_t(y * 5 + x * x % 13);
            p[2] = std::uint8_t((x ^ y) * 3 + seed * 11);
            p[3] = 255;
        }
    return image;
}

class CommandTools : public CommandLine {
protected:
    void SetUp() override {
        CommandLine::SetUp();
        ASSERT_TRUE(IO::WriteImage(m_Folder / "in.png", *Picture(61, 43, 1)));
    }
};

const RasterTools::FilterInfo& Filter(std::string_view name) {
    const auto* filter = RasterTools::FindFilter(name);
    EXPECT_NE(filter, nullptr) << name;
    return *filter;
}

} // namespace

TEST_F(CommandTools, HelpNamesEveryParameterOfEveryFilter) {
    const auto& catalogue = RasterTools::GetFilterCatalogue();
    ASSERT_FALSE(catalogue.empty());
    const Result top = Run("--help");
    EXPECT_EQ(top.exitCode, 0);
    for (const auto& filter : catalogue) {
        EXPECT_TRUE(Contains(top.output, "  " + std::string(filter.name))) << filter.name;
        const Result help = Run("apply " + std::string(filter.name) + " --help");
        ASSERT_EQ(help.exitCode, 0) << filter.name << "\n" << help.output;
        EXPECT_TRUE(Contains(help.output, std::string(filter.description))) << help.output;
        for (const auto& spec : filter.parameters) {
            const App::ShownParameter shown = App::GetShownParameter(spec);
            const auto at = help.output.find("--" + shown.flag + " ");
            ASSERT_NE(at, std::string::npos) << filter.name << " --" << shown.flag << "\n" << help.output;
            const std::string line = help.output.substr(at, help.output.find('\n', at) - at);
            EXPECT_TRUE(Contains(line, std::string(spec.toolLabel))) << line;
            EXPECT_TRUE(Contains(line, "default")) << line;
            EXPECT_TRUE(Contains(line, "e.g. --" + shown.flag)) << line;
            if (spec.type == RasterTools::ParameterType::Double && spec.name != "format") {
                EXPECT_TRUE(Contains(line, App::FormatShownNumber(shown.displayMinimum) + " to " +
                                               App::FormatShownNumber(shown.displayMaximum) +
                                               App::UnitSuffix(shown.unit)))
                    << line;
            }
        }
        // Text flags say what they take, each its own line.
        ASSERT_EQ(filter.textFlagHelp.size(), filter.textFlags.size()) << filter.name;
        for (std::size_t i = 0; i < filter.textFlags.size(); ++i) {
            const auto at = help.output.find("--" + std::string(filter.textFlags[i]) + " ");
            ASSERT_NE(at, std::string::npos) << filter.name << " --" << filter.textFlags[i];
            const std::string line = help.output.substr(at, help.output.find('\n', at) - at);
            EXPECT_TRUE(Contains(line, std::string(filter.textFlagHelp[i]).substr(0, 20))) << line;
        }
        // The same filter's help is reached the other ways too.
        EXPECT_EQ(Run("help apply " + std::string(filter.name)).output, help.output);
    }
    for (const char* command : {"apply --help", "doc --help", "doc filter --help", "doc render --help",
                                "list --help", "play --help"})
        EXPECT_EQ(Run(command).exitCode, 0) << command;
    EXPECT_TRUE(Contains(Run("--version").output, "rastertools "));
    const Result completion = Run("completion");
    for (const auto& filter : catalogue)
        for (const auto& spec : filter.parameters)
            EXPECT_TRUE(Contains(completion.output, "--" + App::GetShownParameter(spec).flag)) << filter.name;
    EXPECT_TRUE(Contains(Run("manual").output, ".TH RASTERTOOLS 1"));
}

// Worked by hand: 90 degrees are pi/2 radians, 50 percent of full strength is a spread of 0.5 channel ranges.
TEST_F(CommandTools, ValuesAreTypedAndShownInDegreesAndPercent) {
    const auto& motion = Filter("motionblur");
    auto values = App::ParseFilterParameters(motion, {{"angle", "90"}, {"radius", "3"}});
    EXPECT_NEAR(std::get<double>(values[1]), std::numbers::pi / 2, 1e-15);
    EXPECT_EQ(App::DescribeParameterValues(motion, values), "radius=3 angle=90");
    values = App::ParseFilterParameters(motion, {{"angle", "-45"}});
    EXPECT_NEAR(std::get<double>(values[1]), -std::numbers::pi / 4, 1e-15);
    EXPECT_THROW(App::ParseFilterParameters(motion, {{"radians", "1"}}), App::UsageError);
    EXPECT_THROW(App::ParseFilterParameters(motion, {{"angle", "361"}}), App::UsageError);

    const auto& noise = Filter("addnoise");
    EXPECT_DOUBLE_EQ(std::get<double>(App::ParseFilterParameters(noise, {{"intensity", "50"}})[0]), 0.5);
    EXPECT_DOUBLE_EQ(std::get<double>(App::ParseFilterParameters(noise, {{"intensity", "100"}})[0]), 1.0);
    EXPECT_EQ(App::FormatShownValue(noise.parameters[0], 0.25), "25");
    try {
        App::ParseFilterParameters(noise, {{"intensity", "101"}});
        ADD_FAILURE() << "101 % accepted";
    } catch (const App::UsageError& error) {
        EXPECT_STREQ(error.what(), "--intensity must lie within 0 .. 100 %");
    }
    try {
        App::ParseFilterParameters(Filter("twirl"), {{"angle", "ninety"}});
        ADD_FAILURE() << "ninety accepted";
    } catch (const App::UsageError& error) {
        EXPECT_STREQ(error.what(), "--angle: \"ninety\" is not a number");
    }
    // The twirl stores degrees already: the same number.
    EXPECT_EQ(std::get<double>(App::ParseFilterParameters(Filter("twirl"), {{"angle", "90"}})[0]), 90.0);

    // On pixels: uniform noise at full strength moves an 8-bit channel by at most 0.341 x 255 = 87 levels;
    // the stored number 100 that --intensity 100 once meant moves every channel to an end.
    auto grey = Raster::DynamicBuffer::Create(40, 30, Raster::PixelFormat::RGBA8);
    for (int y = 0; y < 30; ++y)
        for (int x = 0; x < 160; ++x)
            grey->Row<std::uint8_t>(y)[x] = 128;
    ASSERT_TRUE(IO::WriteImage(m_Folder / "grey.png", *grey));
    const Result result =
        Run("apply addnoise --intensity 100 --gaussian false --device cpu grey.png noisy.png");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    const auto noisy = Pixels(m_Folder / "noisy.png");
    int largest = 0;
    for (std::size_t i = 0; i < noisy.size(); ++i)
        if (i % 4 != 3) largest = std::max(largest, std::abs(int(noisy[i]) - 128));
    EXPECT_LE(largest, 88);
    EXPECT_GE(largest, 60);
}

// A chain renders in bands carried through its filters; whatever the tiles and threads, and whether a filter
// reads around its pixels (unsharp mask, motion blur), changes the image's size (a scaled copy) or reads an
// unbounded area (a twirl about the middle, which needs its input whole), the pixels are those of the filters
// applied one after another.
TEST_F(CommandTools, AChainGivesWhatTheFiltersGiveOneAfterAnother) {
    ASSERT_TRUE(IO::WriteImage(m_Folder / "tall.png", *Picture(67, 150, 4)));
    // Each chain with the options given to all its filters.
    const std::vector<std::pair<std::vector<std::string>, std::string>> chains = {
        {{"twirl --angle 90 --radius 25", "unsharpmask --radius 2 --factor 1.5",
          "motionblur --radius 3 --angle 30"},
         ""},
        {{"twirl --angle 120 --radius 30 --centre 20,40", "motionblur --radius 9 --angle 80",
          "unsharpmask --radius 6 --factor 2"},
         ""},
        {{"unsharpmask --radius 3 --factor 1.5", "twirl --angle 60 --radius 20",
          "motionblur --radius 2 --angle 90"},
         ""},
        {{"motionblur --radius 4 --angle 90", "copy --scale 1.5,0.75", "unsharpmask --radius 5 --factor 1.2"},
         ""},
        {{"copy --format rgba16", "motionblur --radius 5 --angle 100", "unsharpmask --radius 2"}, ""},
        {{"motionblur --radius 5 --angle 100", "unsharpmask --radius 2 --factor 3"}, " --channels rg"},
    };
    for (const auto& [chain, options] : chains) {
        std::string previous = "tall.png";
        for (std::size_t i = 0; i < chain.size(); ++i) {
            const std::string next = "step" + std::to_string(i) + ".png";
            const Result step = Run("apply " + chain[i] + options + " --device cpu " + previous + " " + next);
            ASSERT_EQ(step.exitCode, 0) << chain[i] << "\n" << step.output;
            previous = next;
        }
        const auto expected = Pixels(m_Folder / previous);
        std::string joined;
        for (const auto& filter : chain)
            joined += (joined.empty() ? "" : " : ") + filter;
        for (const std::string tiling :
             {"", "--tile 16 --threads 1", "--tile 16 --threads 3", "--tile 40 --threads 2", "--tile 64"}) {
            SCOPED_TRACE(joined + " " + tiling);
            const Result run =
                Run("apply " + joined + options + " --device cpu " + tiling + " tall.png chain.png");
            ASSERT_EQ(run.exitCode, 0) << run.output;
            EXPECT_EQ(Pixels(m_Folder / "chain.png"), expected);
        }
    }
    EXPECT_NE(Pixels(m_Folder / "chain.png"), Pixels(m_Folder / "tall.png"));

    for (const auto& [arguments, message] : std::vector<std::pair<std::string, std::string>>{
             {"apply twirl in.png out.png :", "must be followed by a filter name"},
             {"apply twirl --device cpu : copy --device cpu in.png out.png",
              "--device is given more than once"},
             {"apply twirl : unsharpmask --angle 3 in.png out.png", "unsharpmask has no parameter --angle"},
         }) {
        const Result result = Run(arguments);
        EXPECT_EQ(result.exitCode, 2) << arguments;
        EXPECT_TRUE(Contains(result.output, message)) << arguments << "\n" << result.output;
    }
}

// Which filters of a chain take their input a band at a time: those whose read area is bounded; a twirl about
// the image's middle (its centre unset) reads an unbounded area, and on a device every filter renders whole.
TEST(ChainRender, OnlyFiltersWithAnUnboundedReadAreaNeedTheirInputWhole) {
    const auto link = [](const char* name, std::vector<std::pair<std::string, std::string>> parameters) {
        App::ChainLink made;
        static std::vector<Kernel::Counted<RasterCommand>> kept;
        kept.push_back(App::MakeFilterCommand(Filter(name), false, parameters));
        made.command = kept.back().Get();
        made.pipeline = dynamic_cast<const RasterTools::PipelineCommand*>(made.command);
        made.shape = {40, 30, Raster::PixelFormat::RGBA8};
        return made;
    };
    const std::vector<App::ChainLink> links = {
        link("twirl", {{"angle", "90"}}),
        link("unsharpmask", {{"radius", "3"}}),
        link("motionblur", {{"radius", "4"}}),
        link("twirl", {{"angle", "90"}}),
        link("twirl", {{"angle", "90"}, {"centre", "10,10"}}),
        link("copy", {{"scale", "2,2"}}),
    };
    EXPECT_EQ(App::GetWholeInputLinks(links, false),
              (std::vector<bool>{true, false, false, true, false, false}));
    EXPECT_EQ(App::GetWholeInputLinks(links, true), std::vector<bool>(links.size(), true));
}

TEST_F(CommandTools, ABatchProcessesTheGoodFilesAndFailsForTheBadOne) {
    ASSERT_TRUE(IO::WriteImage(m_Folder / "b.png", *Picture(30, 20, 2)));
    Write("broken.png", "not a picture at all");
    Result result = Run("apply twirl --angle 45 --device cpu in.png broken.png b.png -o out/");
    EXPECT_EQ(result.exitCode, 1) << result.output;
    EXPECT_TRUE(Contains(result.output, "broken.png")) << result.output;
    EXPECT_TRUE(Contains(result.output, "1 of 3 files failed")) << result.output;
    ASSERT_EQ(Run("apply twirl --angle 45 --device cpu b.png one.png").exitCode, 0);
    EXPECT_EQ(Pixels(m_Folder / "out" / "b.png"), Pixels(m_Folder / "one.png"));
    EXPECT_TRUE(std::filesystem::exists(m_Folder / "out" / "in.png"));
    EXPECT_FALSE(std::filesystem::exists(m_Folder / "out" / "broken.png"));

    result = Run("apply copy in.png b.png -o '{stem}-copy.tif'");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_EQ(Pixels(m_Folder / "b-copy.tif"), Pixels(m_Folder / "b.png"));
    EXPECT_TRUE(std::filesystem::exists(m_Folder / "in-copy.tif"));

    for (const auto& [arguments, message] : std::vector<std::pair<std::string, std::string>>{
             {"apply copy in.png b.png out.png", "several inputs with -o"},
             {"apply copy in.png b.png -o same.png", "several inputs need -o FOLDER/"},
             {"apply copy in.png sub/in.png -o out/", "would both be written to"},
         }) {
        result = Run(arguments);
        EXPECT_EQ(result.exitCode, 2) << arguments;
        EXPECT_TRUE(Contains(result.output, message)) << arguments << "\n" << result.output;
    }
}

TEST_F(CommandTools, PipesReadStandardInputAndWriteStandardOutput) {
    Result result = Run("apply twirl --angle 30 --device cpu - - --output-format tiff < in.png > piped.tif");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    ASSERT_EQ(Run("apply twirl --angle 30 --device cpu in.png file.tif").exitCode, 0);
    EXPECT_EQ(Pixels(m_Folder / "piped.tif"), Pixels(m_Folder / "file.tif"));
    result = Run("apply copy in.png -");
    EXPECT_EQ(result.exitCode, 2);
    EXPECT_TRUE(Contains(result.output, "needs --output-format")) << result.output;
    result = Run("apply copy in.png out.png --output-format gif");
    EXPECT_EQ(result.exitCode, 2);
    EXPECT_TRUE(Contains(result.output, "--output-format: \"gif\" is not a file type")) << result.output;
    result = Run("apply copy in.png out.jpg --quality 0");
    EXPECT_TRUE(Contains(result.output, "--quality needs a whole number from 1 to 100")) << result.output;
    result = Run("apply copy in.png out.png --compression squeeze");
    EXPECT_TRUE(Contains(result.output, "is not a compression")) << result.output;
}

TEST_F(CommandTools, ParametersThatChangeNoPixelAreReported) {
    Result result = Run("apply twirl --angle 0 --device cpu in.png same.png");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "change no pixel")) << result.output;
    result = Run("apply twirl --angle 40 --device cpu in.png changed.png");
    EXPECT_FALSE(Contains(result.output, "change no pixel")) << result.output;
    result = Run("--quiet apply twirl --angle 0 --device cpu in.png quiet.png");
    EXPECT_EQ(result.exitCode, 0);
    EXPECT_EQ(result.output, "") << "--quiet prints nothing but errors";
}

// A processor device under OpenCL is slower than the processor path: auto takes only GPUs.
TEST_F(CommandTools, AutoNeverPicksAnOpenCLProcessorDevice) {
    using namespace Raster;
    auto describing = [](const char* id, HardwareBackEnd backEnd, HardwareDeviceKind kind) {
        return Kernel::Counted<HardwareDevice>(new HardwareDevice(id, id, backEnd, kind));
    };
    const auto cpu = describing("opencl:0.0", HardwareBackEnd::OpenCL, HardwareDeviceKind::Cpu);
    const auto other = describing("opencl:0.1", HardwareBackEnd::OpenCL, HardwareDeviceKind::Other);
    const auto gpu = describing("opencl:1.0", HardwareBackEnd::OpenCL, HardwareDeviceKind::Gpu);
    const auto automatic = *ParseHardwareSelector("auto");
    EXPECT_EQ(SelectHardwareDevice({cpu}, automatic), nullptr);
    EXPECT_EQ(SelectHardwareDevice({cpu, other}, automatic), nullptr);
    EXPECT_EQ(SelectHardwareDevice({cpu, gpu}, automatic), gpu);
    EXPECT_EQ(SelectHardwareDevice({cpu}, *ParseHardwareSelector("opencl")), cpu) << "named, it is used";

    // This machine's devices, through the program.
    bool hasGpu = false;
    for (const auto& device : Hardware::GetDevices())
        hasGpu = hasGpu || device->GetKind() == HardwareDeviceKind::Gpu;
    const Result result = Run("apply copy --device auto in.png out.png", "RASTERTOOLS_DEVICE=");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    if (!hasGpu) {
        EXPECT_TRUE(Contains(result.output, "0 tiles on the device")) << result.output;
    }
}

// The temporary file of an atomic write is removed when the program is interrupted, wherever it is.
TEST_F(CommandTools, AnInterruptedWriteLeavesNoTemporaryFile) {
    ASSERT_TRUE(IO::WriteImage(m_Folder / "big.png", *Picture(2400, 1800, 3)));
    for (const int delay : {40, 120, 250, 400, 600, 900}) {
        for (const int signal : {SIGINT, SIGTERM}) {
            const pid_t child = ::fork();
            ASSERT_GE(child, 0);
            if (child == 0) {
                ::chdir(m_Folder.c_str());
                ::execl(RASTERTOOLS_PROGRAM, RASTERTOOLS_PROGRAM, "--quiet", "apply", "copy", "--device",
                        "cpu", "big.png", "out.tif", static_cast<char*>(nullptr));
                ::_exit(127);
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(delay));
            ::kill(child, signal);
            int status = 0;
            ::waitpid(child, &status, 0);
            for (const auto& entry : std::filesystem::directory_iterator(m_Folder))
                EXPECT_FALSE(entry.path().filename().string().starts_with(".out.tif."))
                    << entry.path() << " left after a signal " << signal << " at " << delay << " ms";
            std::filesystem::remove(m_Folder / "out.tif");
        }
    }
    // A document saved by doc filter, interrupted while it writes.
    ASSERT_EQ(Run("doc new big.png -o big.rtd").exitCode, 0);
    for (const int delay : {100, 300, 600, 1000}) {
        const pid_t child = ::fork();
        ASSERT_GE(child, 0);
        if (child == 0) {
            ::chdir(m_Folder.c_str());
            ::execl(RASTERTOOLS_PROGRAM, RASTERTOOLS_PROGRAM, "--quiet", "doc", "filter", "big.rtd", "copy",
                    static_cast<char*>(nullptr));
            ::_exit(127);
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(delay));
        ::kill(child, SIGINT);
        int status = 0;
        ::waitpid(child, &status, 0);
        for (const auto& entry : std::filesystem::directory_iterator(m_Folder))
            EXPECT_FALSE(entry.path().filename().string().starts_with(".big.rtd."))
                << entry.path() << " left after an interrupt at " << delay << " ms";
    }
    EXPECT_EQ(Run("doc show big.rtd").exitCode, 0) << "the document is whole";
}

// Temporaries that earlier builds named ".NAME.XXXXXX" are cleared by the next write once they are old; a
// fresh one may be a writer's at work and stays.
TEST_F(CommandTools, AnOldStyleLeftoverIsClearedByTheNextWrite) {
    Write(".out.png.Ab12Cd", "partial");
    Write(".out.png.Zz99yy", "partial");
    std::filesystem::last_write_time(m_Folder / ".out.png.Ab12Cd",
                                     std::filesystem::file_time_type::clock::now() - std::chrono::hours(2));
    ASSERT_EQ(Run("apply copy in.png out.png").exitCode, 0);
    EXPECT_FALSE(std::filesystem::exists(m_Folder / ".out.png.Ab12Cd"));
    EXPECT_TRUE(std::filesystem::exists(m_Folder / ".out.png.Zz99yy"));
}

// Scripts name their files relative to themselves, so they run from any folder.
TEST_F(CommandTools, PlayScriptsFindTheirFilesBesideThem) {
    std::filesystem::create_directories(m_Folder / "scripts");
    Write("scripts/save.play", "tool addnoise\nsave made/doc.rtd\nload made/doc.rtd\nrender made/out.png\n");
    const Result result = Run("play scripts/save.play");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(std::filesystem::exists(m_Folder / "scripts" / "made" / "doc.rtd"));
    EXPECT_TRUE(std::filesystem::exists(m_Folder / "scripts" / "made" / "out.png"));
}
