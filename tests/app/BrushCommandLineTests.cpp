// The pixel tool from the command line: play scripts that paint, restore and erase, and doc paint on a
// document, with the errors that must leave the document alone.

#include "host/io/ImageIO.h"
#include "tests/app/CommandLineSupport.h"

#include <vector>

using namespace AppTests;

namespace {

// The RGBA8 pixel (x, y) of an image file.
std::vector<int> PixelOf(const std::filesystem::path& path, int x, int y) {
    const IO::ReadResult read = IO::ReadImage(path);
    EXPECT_TRUE(read) << read.error;
    if (!read || read.image->GetFormat() != Raster::PixelFormat::RGBA8) return {};
    const auto* p = read.image->Row<std::uint8_t>(y) + 4 * x;
    return {p[0], p[1], p[2], p[3]};
}

std::string FileText(const std::filesystem::path& path) {
    std::string text;
    Kernel::ReadWholeFile(path, text, 1 << 24);
    return text;
}

class BrushCommandLine : public CommandLine {
protected:
    void SetUp() override {
        CommandLine::SetUp();
        auto image = Raster::DynamicBuffer::Create(20, 10, Raster::PixelFormat::RGBA8);
        for (int y = 0; y < 10; ++y)
            for (int x = 0; x < 20; ++x) {
                auto* p = image->Row<std::uint8_t>(y) + 4 * x;
                p[0] = std::uint8_t(10 * x);
                p[1] = std::uint8_t(20 * y);
                p[2] = 7;
                p[3] = 255;
            }
        ASSERT_TRUE(IO::WriteImage(m_Folder / "in.png", *image));
    }
};

} // namespace

TEST_F(BrushCommandLine, APlayScriptPaintsRestoresFromASnapshotAndErases) {
    Write("pixel.play", "tool pixel\n"
                        "colour 255,0,0\n"
                        "stroke 0,0 9,0\n"
                        "snapshot\n"
                        "colour 0,0,255\n"
                        "stroke 0,0 9,0\n"
                        "mode snapshot\n"
                        "stroke 2,0 --secondary\n"
                        "mode erase\n"
                        "latch on\n"
                        "stroke 5,0\n"
                        "show history\n"
                        "render out.png\n");
    const Result result = Run("play pixel.play");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output,
                         "1. Pixel Brush Dabs=10 Colr=1,0,0,1\n2. Pixel Brush Dabs=10 Colr=0,0,1,1\n"
                         "3. Pixel Undo Brush\n4. Pixel Brush\n"))
        << result.output;
    EXPECT_EQ(PixelOf(m_Folder / "out.png", 1, 0), (std::vector<int>{0, 0, 255, 255}));
    EXPECT_EQ(PixelOf(m_Folder / "out.png", 2, 0), (std::vector<int>{255, 0, 0, 255})); // from the snapshot
    EXPECT_EQ(PixelOf(m_Folder / "out.png", 5, 0)[3], 0);                               // erased
    EXPECT_EQ(PixelOf(m_Folder / "out.png", 0, 1)[3], 0);                               // never painted
}

TEST_F(BrushCommandLine, PlayReportsTheMissingSnapshotAndBadBrushVerbs) {
    Write("nosnap.play", "tool pixel\nmode snapshot\nstroke 1,1 --secondary\n");
    Result result = Run("play nosnap.play");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "ModelessMessage title=\"No Snapshot\"")) << result.output;
    for (const std::string line :
         {"colour 256,0,0", "stroke 1", "latch maybe", "mode paint", "brush-size 2"}) {
        Write("bad.play", "tool pixel\n" + line + "\n");
        result = Run("play bad.play");
        EXPECT_NE(result.exitCode, 0) << line;
        EXPECT_TRUE(Contains(result.output, "bad.play:2:")) << line << "\n" << result.output;
    }
    // A point holding control bytes is quoted escaped, as every script error is (found by the play fuzzer).
    Write("control.play", std::string("tool pixel\nstroke 10,\x02\x01 5,5\n"));
    result = Run("play control.play");
    EXPECT_NE(result.exitCode, 0);
    EXPECT_TRUE(Contains(result.output, "is not a point")) << result.output;
    EXPECT_FALSE(Contains(result.output, "\x02")) << "a raw control byte reached the message";
    Write("notool.play", "stroke 1,1\n");
    result = Run("play notool.play");
    EXPECT_TRUE(Contains(result.output, "needs the pixel tool")) << result.output;
}

TEST_F(BrushCommandLine, DocPaintPaintsErasesAndRestoresWithTheStrokeInHistory) {
    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0);
    Result result = Run("doc paint d.rtd --stroke 0,2 19,2 --colour 0,255,0 --size 3");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "d.rtd: Pixel Brush (20 dabs), changed 20x3 at 0,1 of \"in\""))
        << result.output;
    result = Run("doc paint d.rtd --stroke 4,2 --erase");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    ASSERT_EQ(Run("doc render d.rtd painted.png --device cpu").exitCode, 0);
    EXPECT_EQ(PixelOf(m_Folder / "painted.png", 10, 3), (std::vector<int>{0, 255, 0, 255}));
    EXPECT_EQ(PixelOf(m_Folder / "painted.png", 4, 2)[3], 0);
    EXPECT_EQ(PixelOf(m_Folder / "painted.png", 10, 4), (std::vector<int>{100, 80, 7, 255}));

    // Restoring from the document as it was before both strokes, along the painted row.
    result = Run("doc paint d.rtd --stroke 0,2 19,2 --from-snapshot --snapshot 0");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "Pixel Undo Brush (20 dabs)")) << result.output;
    ASSERT_EQ(Run("doc render d.rtd restored.png --device cpu").exitCode, 0);
    EXPECT_EQ(PixelOf(m_Folder / "restored.png", 4, 2), (std::vector<int>{40, 40, 7, 255}));
    EXPECT_EQ(PixelOf(m_Folder / "restored.png", 10, 3), (std::vector<int>{0, 255, 0, 255}));
    result = Run("doc show d.rtd");
    EXPECT_TRUE(Contains(result.output, "3. Pixel Undo Brush")) << result.output;
    ASSERT_EQ(Run("doc undo d.rtd").exitCode, 0);
    ASSERT_EQ(Run("doc render d.rtd undone.png --device cpu").exitCode, 0);
    EXPECT_EQ(PixelOf(m_Folder / "undone.png", 4, 2)[3], 0);
}

TEST_F(BrushCommandLine, DocPaintRefusesBadArgumentsAndLeavesTheDocumentAlone) {
    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0);
    const std::string before = FileText(m_Folder / "d.rtd");
    for (const std::string arguments :
         {"d.rtd", "d.rtd --stroke", "d.rtd --stroke 1,x", "d.rtd --stroke 1,1 --colour 256,0,0",
          "d.rtd --stroke 1,1 --colour 1,2", "d.rtd --stroke 1,1 --erase --from-snapshot",
          "d.rtd --stroke 1,1 --snapshot 0", "d.rtd --stroke 1,1 --size 0", "d.rtd --stroke 1,1 --size 2.5",
          "d.rtd --stroke 1,1 --from-snapshot --snapshot 3", "d.rtd --stroke 1,1 --colour 1,2,3 --erase",
          "d.rtd --stroke 1,1 --bogus", "d.rtd other.rtd --stroke 1,1"}) {
        const Result result = Run("doc paint " + arguments);
        EXPECT_EQ(result.exitCode, 2) << arguments << "\n" << result.output;
    }
    Result result = Run("doc paint missing.rtd --stroke 1,1");
    EXPECT_EQ(result.exitCode, 1) << result.output;
    // A stroke entirely off the layer changes no pixels but is still recorded; nothing is lost either way.
    EXPECT_EQ(FileText(m_Folder / "d.rtd"), before);
    result = Run("doc paint d.rtd --stroke 500,500");
    EXPECT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "no pixels changed")) << result.output;
}
