// Values and options as a hostile user gives them: every route to a renderer (play's panel edits, drags,
// settings, live filters, loaded documents, the command line) is bounded; extreme values that are accepted
// render sane pixels; duplicated or unknown options and unreadable script lines give short, clean messages.

#include "host/io/ImageIO.h"
#include "tests/app/CommandLineSupport.h"

#include <cstring>

using namespace AppTests;

namespace {

Kernel::Counted<Raster::DynamicBuffer> ReadPixels(const std::filesystem::path& path) {
    IO::ReadResult read = IO::ReadImage(path);
    EXPECT_TRUE(read) << read.error;
    return read ? read.image : nullptr;
}

// The largest difference of any byte between two RGBA8 images of one size; 256 when they differ in size.
int LargestDifference(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b) {
    if (a.GetWidth() != b.GetWidth() || a.GetHeight() != b.GetHeight() || a.GetFormat() != b.GetFormat())
        return 256;
    int largest = 0;
    for (int y = 0; y < a.GetHeight(); ++y)
        for (std::size_t i = 0; i < a.GetRowBytes(); ++i)
            largest =
                std::max(largest, std::abs(int(a.Row<std::uint8_t>(y)[i]) - int(b.Row<std::uint8_t>(y)[i])));
    return largest;
}

int LargestAlpha(const Raster::DynamicBuffer& image) {
    int largest = 0;
    for (int y = 0; y < image.GetHeight(); ++y)
        for (int x = 0; x < image.GetWidth(); ++x)
            largest = std::max(largest, int(image.Row<std::uint8_t>(y)[4 * x + 3]));
    return largest;
}

// Every occurrence of the double from replaced by to, and the document's closing checksum made right again
// (FNV-1a over everything before it), as a hand-edited document would be.
void PatchDocument(const std::filesystem::path& path, double from, double to) {
    std::string bytes;
    ASSERT_FALSE(Kernel::ReadWholeFile(path, bytes, 1 << 24));
    char needle[8], replacement[8];
    std::memcpy(needle, &from, 8);
    std::memcpy(replacement, &to, 8);
    int found = 0;
    for (std::size_t at = bytes.find(std::string(needle, 8)); at != std::string::npos;
         at = bytes.find(std::string(needle, 8), at + 8), ++found)
        bytes.replace(at, 8, replacement, 8);
    ASSERT_GT(found, 0);
    ASSERT_GT(bytes.size(), 16u);
    std::uint64_t hash = 0xcbf29ce484222325ull;
    for (std::size_t i = 0; i + 8 < bytes.size(); ++i)
        hash = (hash ^ std::uint64_t(std::uint8_t(bytes[i]))) * 0x100000001b3ull;
    std::memcpy(bytes.data() + bytes.size() - 8, &hash, 8);
    std::ofstream(path, std::ios::binary) << bytes;
}

class Values : public CommandLine {
protected:
    // A 12 × 10 opaque picture with every colour different, and a flat one of one colour.
    void SetUp() override {
        CommandLine::SetUp();
        auto image = Raster::DynamicBuffer::Create(12, 10, Raster::PixelFormat::RGBA8);
        auto flat = Raster::DynamicBuffer::Create(12, 10, Raster::PixelFormat::RGBA8);
        for (int y = 0; y < 10; ++y)
            for (int x = 0; x < 12; ++x) {
                auto* p = image->Row<std::uint8_t>(y) + 4 * x;
                p[0] = std::uint8_t(20 * x);
                p[1] = std::uint8_t(25 * y);
                p[2] = std::uint8_t(3 * x * y);
                p[3] = 255;
                auto* q = flat->Row<std::uint8_t>(y) + 4 * x;
                q[0] = 90, q[1] = 160, q[2] = 30, q[3] = 255;
            }
        ASSERT_TRUE(IO::WriteImage(m_Folder / "in.png", *image));
        ASSERT_TRUE(IO::WriteImage(m_Folder / "flat.png", *flat));
    }
};

} // namespace

TEST_F(Values, EveryPlayRouteBoundsTheUnsharpRadius) {
    // A typed value is checked as apply checks it; a drag is bounded.
    Write("session.play", "tool unsharpmask\nstart\nset radi 1e6\n");
    Result result = Run("play session.play");
    EXPECT_EQ(result.exitCode, 1);
    EXPECT_TRUE(Contains(result.output, "session.play:3: radi must lie within 0 .. 100")) << result.output;
    Write("session.play", "tool unsharpmask\nstart\nset radi 100\nshow params\n"
                          "drag 0,0 900,1200\nshow params\ncommit\n");
    result = Run("play session.play");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "radi=100\n")) << result.output;
    EXPECT_FALSE(Contains(result.output, "radius=1e+06")) << result.output;
    EXPECT_FALSE(Contains(result.output, "radius=1500")) << result.output;
    EXPECT_TRUE(Contains(Settings(), "\"tools.unsharpmask.radius\": 100")) << Settings();

    // A settings file edited by hand.
    Write("settings.json", "{\"tools.unsharpmask.radius\": 1000000.0}\n");
    Write("session.play", "tool unsharpmask\nstart\nshow params\n");
    result = Run("play session.play");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "radius=100\n")) << result.output;

    // A live filter made by a script is refused with the accepted range.
    Write("session.play", "add-live unsharpmask radius=1e6\n");
    result = Run("play session.play");
    EXPECT_EQ(result.exitCode, 1);
    EXPECT_TRUE(Contains(result.output, "session.play:1: radius must lie within 0 .. 100")) << result.output;
}

TEST_F(Values, ADocumentHoldingHugeValuesLoadsThemBounded) {
    for (const char* name : {"unsharp.rtd", "twirl.rtd"})
        ASSERT_EQ(Run(std::string("doc new in.png -o ") + name).exitCode, 0);
    ASSERT_EQ(Run("doc filter unsharp.rtd unsharpmask --radius 37.25 --live").exitCode, 0);
    ASSERT_EQ(Run("doc filter twirl.rtd twirl --angle 90 --radius 41.75 --live").exitCode, 0);
    PatchDocument(m_Folder / "unsharp.rtd", 37.25, 1e6);
    Result result = Run("doc show unsharp.rtd");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "unsharpmask radius=100 ")) << result.output;
    EXPECT_FALSE(Contains(result.output, "1e+06")) << result.output;
    result = Run("doc render unsharp.rtd unsharp.png --device cpu");
    EXPECT_EQ(result.exitCode, 0) << result.output;

    // Squares of this radius overflow single precision: the twirl rendered nothing at all.
    PatchDocument(m_Folder / "twirl.rtd", 41.75, 1.9e19);
    result = Run("doc render twirl.rtd twirl.png --device cpu");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    const auto twirled = ReadPixels(m_Folder / "twirl.png");
    ASSERT_TRUE(twirled);
    EXPECT_EQ(LargestAlpha(*twirled), 255);
}

TEST_F(Values, TheCommandLineRefusesWhatThePanelsWouldBound) {
    const struct {
        const char* arguments;
        const char* message;
    } cases[] = {
        {"apply twirl --radius 1.9e19 in.png out.png", "--radius must lie within 0 .. 1e+06"},
        {"apply unsharpmask --radius 1e6 in.png out.png", "--radius must lie within 0 .. 100"},
        {"apply diffuse --intensity 1e30 in.png out.png", "--intensity must lie within 0 .. 64"},
        {"apply copy --scale 1e9 in.png out.png", "--scale must lie within 0.125 .. 8 on both axes"},
        {"apply copy --tile 1 in.png out.png", "--tile needs a whole number from 16 to 65536, not \"1\""},
        {"apply copy --threads 100000 in.png out.png", "--threads needs a whole number from 0 to 256"},
        {"doc render d.rtd out.png --tile 4", "--tile needs a whole number from 16"},
    };
    for (const auto& test : cases) {
        const Result result = Run(test.arguments);
        EXPECT_EQ(result.exitCode, 2) << test.arguments;
        EXPECT_TRUE(Contains(result.output, test.message)) << test.arguments << "\n" << result.output;
    }
}

TEST_F(Values, ExtremeAcceptedValuesRenderSanePixels) {
    const auto input = ReadPixels(m_Folder / "in.png");
    const auto flat = ReadPixels(m_Folder / "flat.png");
    ASSERT_TRUE(input && flat);
    const struct {
        const char* arguments;
        const char* image;
        int tolerance; // largest byte difference from the input; -1: only checked to be visible
    } cases[] = {
        // Two whole turns at the centre, falling off by 0.0144 degrees a pixel: the picture in place.
        {"twirl --radius 1000000 --angle 720", "in.png", 2},
        {"twirl --radius 1000000 --angle -720", "in.png", 2},
        {"twirl --radius 1000000 --angle 0", "in.png", 0},
        // Every pixel outside the circle.
        {"twirl --radius 1000000 --angle 720 --centre 1000000,-1000000", "in.png", 0},
        {"sphere --radius 1000000 --intensity 100", "in.png", -1},
        {"sphere --radius 1000000 --intensity -100", "in.png", -1},
        {"sphere --radius 1000000 --intensity 100 --centre -1000000,1000000", "in.png", 0},
        {"sphere --radius 1000000 --intensity 0", "in.png", 0},
        // A flat picture stays flat under any blur, scatter or sharpening.
        {"motionblur --radius 500 --angle 360", "flat.png", 0},
        {"motionblur --radius 500 --angle -40", "flat.png", 0},
        {"unsharpmask --radius 100 --factor 5", "flat.png", 0},
        {"diffuse --intensity 64", "flat.png", 0},
        {"addnoise --intensity 100", "in.png", -1},
    };
    for (const auto& test : cases) {
        const Result result =
            Run(std::string("apply ") + test.arguments + " --device cpu " + test.image + " out.png");
        ASSERT_EQ(result.exitCode, 0) << test.arguments << "\n" << result.output;
        const auto output = ReadPixels(m_Folder / "out.png");
        ASSERT_TRUE(output);
        EXPECT_EQ(LargestAlpha(*output), 255) << test.arguments;
        if (test.tolerance >= 0) {
            EXPECT_LE(LargestDifference(*output, std::string(test.image) == "flat.png" ? *flat : *input),
                      test.tolerance)
                << test.arguments;
        }
    }
    for (const char* scale : {"8", "0.125"}) {
        ASSERT_EQ(Run(std::string("apply copy --scale ") + scale + " in.png out.png").exitCode, 0);
        const auto output = ReadPixels(m_Folder / "out.png");
        ASSERT_TRUE(output);
        EXPECT_EQ(LargestAlpha(*output), 255) << scale;
    }
}

TEST_F(Values, DuplicatedOptionsAreUsageErrors) {
    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0);
    const char* cases[] = {
        "apply unsharpmask --radius 3 --radius 4 in.png out.png",
        "apply copy --tile 32 --tile 64 in.png out.png",
        "apply addnoise --format rgba16 --format rgba8 in.png out.png",
        "doc render d.rtd out.png --tile 32 --tile 64",
        "doc filter d.rtd unsharpmask --radius 3 --radius 4",
    };
    for (const char* arguments : cases) {
        const Result result = Run(arguments);
        EXPECT_EQ(result.exitCode, 2) << arguments;
        EXPECT_TRUE(Contains(result.output, "is given more than once")) << arguments << "\n" << result.output;
    }
    EXPECT_FALSE(std::filesystem::exists(m_Folder / "out.png"));
}

TEST_F(Values, AnUnknownFormatListsTheFormats) {
    for (const char* format : {"9", "-2", "maska8", "purple"}) {
        const Result result = Run(std::string("apply copy --format ") + format + " in.png out.png");
        EXPECT_EQ(result.exitCode, 2) << format;
        EXPECT_TRUE(Contains(result.output,
                             "is not a layer format (rgba8, rgba16, rgbauf, ia8, ia16, cmyka8, laba16)"))
            << result.output;
        EXPECT_FALSE(Contains(result.output, "must lie within")) << result.output;
    }
}

TEST_F(Values, ScriptErrorsQuoteAShortCleanExcerpt) {
    std::string line = "\x01\x02\xff\xfe";
    line += std::string(5000, 'A');
    Write("session.play", "tool addnoise\n" + line + " more words\n");
    Result result = Run("play session.play");
    EXPECT_EQ(result.exitCode, 1);
    const auto at = result.output.find("session.play:2: unknown verb \"\\x01\\x02\\xff\\xfeAAAA");
    ASSERT_NE(at, std::string::npos) << result.output.substr(0, 400);
    const std::string error = result.output.substr(at, result.output.find('\n', at) - at);
    EXPECT_LT(error.size(), 400u) << error;
    for (const char c : result.output)
        EXPECT_TRUE(c == '\n' ||
                    (static_cast<unsigned char>(c) >= 0x20 && static_cast<unsigned char>(c) < 0x7F))
            << int(static_cast<unsigned char>(c));

    Write("session.play", "tool addnoise\nset inte \x1b[2J" + std::string(100, '9') + "\n");
    result = Run("play session.play");
    EXPECT_EQ(result.exitCode, 1);
    EXPECT_TRUE(Contains(result.output, "session.play:2: inte: \"\\x1b[2J9999")) << result.output;
    EXPECT_TRUE(Contains(result.output, "\"... is not a number")) << result.output;
}
