// rastertools doc: documents made from an image, filtered destructively and live, rendered, shown and undone,
// and their errors. The filter is any catalogue filter that renders pixels; its effect is checked against
// `rastertools apply` of the same filter.

#include "host/io/ImageIO.h"
#include "tests/app/CommandLineSupport.h"

#include <cstring>

using namespace AppTests;

namespace {

// A catalogue filter that renders, with its default parameters.
const std::string kFilter = "copy";

std::vector<std::byte> Pixels(const std::filesystem::path& path) {
    const IO::ReadResult read = IO::ReadImage(path);
    EXPECT_TRUE(read) << read.error;
    std::vector<std::byte> bytes;
    if (!read) return bytes;
    for (int y = 0; y < read.image->GetHeight(); ++y)
        bytes.insert(bytes.end(), read.image->RowBytes(y),
                     read.image->RowBytes(y) + read.image->GetRowBytes());
    return bytes;
}

std::string ReadBytes(const std::filesystem::path& path) {
    std::string text;
    Kernel::ReadWholeFile(path, text, 1 << 24);
    return text;
}

class DocCommand : public CommandLine {
protected:
    // An 8 × 6 RGBA8 picture with every colour different and no fully transparent pixel (their colour is
    // not kept by compositing).
    void SetUp() override {
        CommandLine::SetUp();
        auto image = Raster::DynamicBuffer::Create(8, 6, Raster::PixelFormat::RGBA8);
        for (int y = 0; y < 6; ++y)
            for (int x = 0; x < 8; ++x) {
                auto* p = image->Row<std::uint8_t>(y) + 4 * x;
                p[0] = std::uint8_t(30 * x);
                p[1] = std::uint8_t(40 * y);
                p[2] = std::uint8_t(7 * x * y);
                p[3] = std::uint8_t(x == 0 ? 255 : 100 + 20 * y);
            }
        ASSERT_TRUE(IO::WriteImage(m_Folder / "in.png", *image));
    }
};

} // namespace

TEST_F(DocCommand, NewFilterRenderShowAndUndoEndToEnd) {
    Result result = Run("doc new in.png -o d.rtd");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "raster layer \"in\" 8x6 rgba8")) << result.output;
    result = Run("doc render d.rtd plain.png --device cpu");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_EQ(Pixels(m_Folder / "plain.png"), Pixels(m_Folder / "in.png"));

    // Destructive: the same pixels as applying the filter to the image.
    ASSERT_EQ(Run("apply " + kFilter + " in.png once.png --device cpu").exitCode, 0);
    result = Run("doc filter d.rtd " + kFilter);
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "layer \"in\" 8x6 at 0,0")) << result.output;
    ASSERT_EQ(Run("doc render d.rtd destructive.png --device cpu").exitCode, 0);
    EXPECT_EQ(Pixels(m_Folder / "destructive.png"), Pixels(m_Folder / "once.png"));

    // Live on top, rendered in tiles on whatever device the environment picks: applied once more.
    ASSERT_EQ(Run("apply " + kFilter + " once.png twice.png --device cpu").exitCode, 0);
    result = Run("doc filter d.rtd " + kFilter + " --live");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    result = Run("doc render d.rtd live.png --tile 16 --threads 2");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "live.png: 8x6 rgba8 from 2 layers")) << result.output;
    EXPECT_EQ(Pixels(m_Folder / "live.png"), Pixels(m_Folder / "twice.png"));

    result = Run("doc show d.rtd");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output,
                         "d.rtd: 2 layers, bottom to top\n  0   raster \"in\" 8x6 rgba8 at 0,0\n"
                         "  1   live filter \"Copy\": copy format=-1 scale=1,1\n"))
        << result.output;
    EXPECT_TRUE(Contains(result.output,
                         "history: 2 entries, 0 undone\n  1. Copy: copy format=-1 scale=1,1; "
                         "pixels of \"in\" 8x6 at 0,0\n"
                         "  2. Copy: copy format=-1 scale=1,1; live filter layer \"Copy\" added\n"))
        << result.output;

    // Undo twice brings back the original pixels; a third undo has nothing to do and changes nothing.
    ASSERT_EQ(Run("doc undo d.rtd").exitCode, 0);
    result = Run("doc show d.rtd");
    EXPECT_TRUE(Contains(result.output, "2. (undone) Copy")) << result.output;
    EXPECT_TRUE(Contains(result.output, "1 layers")) << result.output;
    ASSERT_EQ(Run("doc undo d.rtd").exitCode, 0);
    ASSERT_EQ(Run("doc render d.rtd undone.png").exitCode, 0);
    EXPECT_EQ(Pixels(m_Folder / "undone.png"), Pixels(m_Folder / "in.png"));
    const std::string saved = ReadBytes(m_Folder / "d.rtd");
    result = Run("doc undo d.rtd");
    EXPECT_EQ(result.exitCode, 1);
    EXPECT_TRUE(Contains(result.output, "d.rtd: nothing to undo")) << result.output;
    EXPECT_EQ(ReadBytes(m_Folder / "d.rtd"), saved);
}

TEST_F(DocCommand, NewConvertsToTheChosenFormat) {
    ASSERT_EQ(Run("doc new in.png -o d.rtd --format rgba16").exitCode, 0);
    Result result = Run("doc show d.rtd");
    EXPECT_TRUE(Contains(result.output, "8x6 rgba16")) << result.output;
    // 8-bit values widen exactly, so rendering back to 8 bits gives the picture again.
    ASSERT_EQ(Run("doc render d.rtd back.png --format rgba8").exitCode, 0);
    EXPECT_EQ(Pixels(m_Folder / "back.png"), Pixels(m_Folder / "in.png"));
    result = Run("doc render d.rtd back.jpg --format rgba16");
    EXPECT_EQ(result.exitCode, 1);
    EXPECT_TRUE(Contains(result.output, "JPEG cannot hold rgba16 pixels")) << result.output;
}

TEST_F(DocCommand, ErrorsAreClearAndLeaveTheDocumentAlone) {
    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0);
    const std::string saved = ReadBytes(m_Folder / "d.rtd");
    const struct {
        std::string arguments;
        int exitCode;
        std::string message;
    } cases[] = {
        {"doc filter d.rtd nonesuch", 2, "unknown filter \"nonesuch\" (filters: "},
        {"doc filter d.rtd " + kFilter + " --bogus 1", 2, "has no parameter --bogus (it takes --"},
        {"doc filter d.rtd copy --scale lots", 2, "--scale: \"lots\" is not a point"},
        {"doc filter d.rtd copy --scale 100", 2, "--scale must lie within 0.125 .. 8"},
        {"doc filter d.rtd", 2, "usage: rastertools doc filter DOC FILTER"},
        {"doc render d.rtd out.bmp", 2, "out.bmp: unknown file type"},
        {"doc render d.rtd out.png --device nonesuch", 2, "nonesuch"},
        {"doc render d.rtd out.png --tile 0", 2, "--tile needs a whole number from 16 to 65536"},
        {"doc show d.rtd --live", 2, "--live belongs to doc filter"},
        {"doc frob d.rtd", 2, "unknown doc subcommand \"frob\""},
        {"doc new in.png", 2, "doc new needs the document to write: -o DOC"},
        {"doc new in.png -o d.rtd --format maska8", 2, "--format maska8: not a layer format"},
        {"doc show missing.rtd", 1, "missing.rtd: cannot open"},
        {"doc new missing.png -o d.rtd", 1, "missing.png"},
    };
    for (const auto& test : cases) {
        const Result result = Run(test.arguments);
        EXPECT_EQ(result.exitCode, test.exitCode) << test.arguments << "\n" << result.output;
        EXPECT_TRUE(Contains(result.output, test.message))
            << test.arguments << "\nexpected: " << test.message << "\ngot: " << result.output;
        EXPECT_EQ(ReadBytes(m_Folder / "d.rtd"), saved) << test.arguments;
    }
    EXPECT_FALSE(std::filesystem::exists(m_Folder / "out.png"));

    // A damaged document is refused by every subcommand and kept as it was.
    std::string damaged = saved;
    damaged[damaged.size() / 3] ^= 0x04;
    std::ofstream(m_Folder / "d.rtd", std::ios::binary) << damaged;
    for (const std::string& arguments :
         {std::string("doc show d.rtd"), "doc filter d.rtd " + kFilter, std::string("doc undo d.rtd"),
          std::string("doc render d.rtd out.png")}) {
        const Result result = Run(arguments);
        EXPECT_EQ(result.exitCode, 1) << arguments;
        EXPECT_TRUE(Contains(result.output, "d.rtd: the document is damaged"))
            << arguments << ": " << result.output;
        EXPECT_EQ(ReadBytes(m_Folder / "d.rtd"), damaged) << arguments;
    }
}

TEST_F(DocCommand, PlayScriptsSaveLoadAndRenderPixelDocuments) {
    Write("session.play", "save a.rtd\nrender a.png\nadd-live copy\nrender b.tif\nsave b.rtd\nload a.rtd\n"
                          "render c.png\nload b.rtd\nshow layers\nrender d.tif\n");
    const Result result = Run("play session.play");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "rendered a.png (1024x768 rgba8)")) << result.output;
    EXPECT_TRUE(Contains(result.output, "1   live filter \"Copy\": Copy format=-1 scale=1,1"))
        << result.output;
    EXPECT_EQ(Pixels(m_Folder / "a.png"), Pixels(m_Folder / "c.png"));
    EXPECT_EQ(Pixels(m_Folder / "b.tif"), Pixels(m_Folder / "d.tif"));
    Write("session.play", "render out.bmp\n");
    const Result bad = Run("play session.play");
    EXPECT_EQ(bad.exitCode, 1);
    EXPECT_TRUE(Contains(bad.output, "session.play:1: out.bmp: unknown file type")) << bad.output;
}

// Noise is seeded by each pixel's place in the layer: a live noise layer read back from the file and rendered
// in small tiles on any device gives exactly what applying the filter to the picture gives, and so does the
// destructive form.
TEST_F(DocCommand, SavedNoiseRendersAsApplyingItDoes) {
    ASSERT_EQ(Run("apply addnoise --intensity 0.5 --gaussian false in.png direct.png --device cpu").exitCode,
              0);
    ASSERT_NE(Pixels(m_Folder / "direct.png"), Pixels(m_Folder / "in.png"));

    ASSERT_EQ(Run("doc new in.png -o live.rtd").exitCode, 0);
    Result result = Run("doc filter live.rtd addnoise --intensity 0.5 --gaussian false --live");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    result = Run("doc show live.rtd");
    EXPECT_TRUE(Contains(result.output, "live filter \"Add Noise\": addnoise intensity=0.5 mono=false "
                                        "gaussian=false"))
        << result.output;
    ASSERT_EQ(Run("doc render live.rtd live.png --tile 16 --threads 2").exitCode, 0);
    EXPECT_EQ(Pixels(m_Folder / "live.png"), Pixels(m_Folder / "direct.png"));

    ASSERT_EQ(Run("doc new in.png -o destructive.rtd").exitCode, 0);
    ASSERT_EQ(Run("doc filter destructive.rtd addnoise --intensity 0.5 --gaussian false").exitCode, 0);
    ASSERT_EQ(Run("doc render destructive.rtd destructive.png").exitCode, 0);
    EXPECT_EQ(Pixels(m_Folder / "destructive.png"), Pixels(m_Folder / "direct.png"));
}
