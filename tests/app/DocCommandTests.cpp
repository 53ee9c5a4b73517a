// rastertools doc: documents made from an image, filtered destructively and live, rendered, shown and undone,
// and their errors. The filter is any catalogue filter that renders pixels; its effect is checked against
// `rastertools apply` of the same filter.

#include "host/io/ImageIO.h"
#include "tests/app/CommandLineSupport.h"

#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <thread>
#include <vector>

using namespace AppTests;

namespace {

// A catalogue filter that renders, with its default parameters.
const std::string kFilter = "copy";

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

// Commands changing one document at the same time each lock it from reading to writing: every edit is in
// the history afterwards.
TEST_F(DocCommand, ConcurrentEditsOfOneDocumentAreAllKept) {
    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0);
    constexpr int kCommands = 6;
    std::vector<Result> results(kCommands);
    std::vector<std::thread> threads;
    for (int i = 0; i < kCommands; ++i)
        threads.emplace_back([&, i] {
            results[std::size_t(i)] =
                Run(i % 2 ? "doc filter d.rtd copy --live" : "doc filter d.rtd " + kFilter,
                    "RASTERTOOLS_LOCK_TIMEOUT=120 RASTERTOOLS_DEVICE=cpu");
        });
    for (auto& thread : threads)
        thread.join();
    for (const auto& result : results)
        EXPECT_EQ(result.exitCode, 0) << result.output;
    const Result shown = Run("doc show d.rtd");
    EXPECT_TRUE(Contains(shown.output, "d.rtd: 4 layers")) << shown.output;
    EXPECT_TRUE(Contains(shown.output, "history: 6 entries, 0 undone\n")) << shown.output;
}

// A document another command holds is waited for, then refused with a message; it is left as it was.
TEST_F(DocCommand, ADocumentInUseIsRefusedAfterTheWait) {
    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0);
    const std::string saved = ReadBytes(m_Folder / "d.rtd");
    Kernel::FileLock held;
    ASSERT_FALSE(held.Acquire(m_Folder / "d.rtd", std::chrono::milliseconds(0), false));
    Write("save.play", "save d.rtd\n");
    for (const std::string& arguments :
         {"doc filter d.rtd " + kFilter, std::string("doc undo d.rtd"),
          std::string("doc new in.png -o d.rtd"), std::string("play save.play")}) {
        const Result result = Run(arguments, "RASTERTOOLS_LOCK_TIMEOUT=0.2");
        EXPECT_EQ(result.exitCode, 1) << arguments;
        EXPECT_TRUE(Contains(result.output, "d.rtd: is in use by another process (still locked after 0.2 s)"))
            << arguments << ": " << result.output;
        EXPECT_EQ(ReadBytes(m_Folder / "d.rtd"), saved) << arguments;
    }
    // Reading needs no lock.
    EXPECT_EQ(Run("doc show d.rtd").exitCode, 0);
    held.Release();
    EXPECT_EQ(Run("doc filter d.rtd " + kFilter).exitCode, 0);
    const Result bad = Run("doc show d.rtd", "RASTERTOOLS_LOCK_TIMEOUT=soon");
    EXPECT_EQ(bad.exitCode, 0) << "only commands that change a document wait";
    const Result refused = Run("doc undo d.rtd", "RASTERTOOLS_LOCK_TIMEOUT=soon");
    EXPECT_EQ(refused.exitCode, 2);
    EXPECT_TRUE(Contains(refused.output, "RASTERTOOLS_LOCK_TIMEOUT: \"soon\" is not a number of seconds"))
        << refused.output;
}

// doc new replaces a document but nothing else unless told to.
TEST_F(DocCommand, NewReplacesOnlyDocumentsUnlessForced) {
    const std::string picture = ReadBytes(m_Folder / "in.png");
    Result result = Run("doc new in.png -o in.png");
    EXPECT_EQ(result.exitCode, 1);
    EXPECT_TRUE(Contains(result.output, "in.png: exists and is not a RasterTools document; not replaced "
                                        "(--force replaces it)"))
        << result.output;
    EXPECT_EQ(ReadBytes(m_Folder / "in.png"), picture);
    std::filesystem::create_directory(m_Folder / "folder.rtd");
    result = Run("doc new in.png -o folder.rtd");
    EXPECT_EQ(result.exitCode, 1);
    EXPECT_TRUE(Contains(result.output, "folder.rtd: exists and is not a RasterTools document"))
        << result.output;

    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0);
    ASSERT_EQ(Run("doc filter d.rtd " + kFilter).exitCode, 0);
    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0) << "a document is replaced without --force";
    EXPECT_TRUE(Contains(Run("doc show d.rtd").output, "history: 0 entries")) << Run("doc show d.rtd").output;

    result = Run("doc new in.png -o in.png --force");
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(Run("doc show in.png").output, "in.png: 1 layers"));
    result = Run("doc show d.rtd --force");
    EXPECT_EQ(result.exitCode, 2);
    EXPECT_TRUE(Contains(result.output, "--force belongs to doc new")) << result.output;
}

// Saving keeps the document's permissions; a folder given as a document is named as one.
TEST_F(DocCommand, FilesKeepTheirPermissionsAndFoldersAreNamed) {
    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0);
    ASSERT_EQ(::chmod((m_Folder / "d.rtd").c_str(), 0600), 0);
    ASSERT_EQ(Run("doc filter d.rtd " + kFilter).exitCode, 0);
    ASSERT_EQ(Run("doc undo d.rtd").exitCode, 0);
    struct stat info {};
    ASSERT_EQ(::stat((m_Folder / "d.rtd").c_str(), &info), 0);
    EXPECT_EQ(info.st_mode & 07777, 0600u);

    std::filesystem::create_directory(m_Folder / "folder.rtd");
    for (const std::string& arguments :
         {std::string("doc show folder.rtd"), "doc filter folder.rtd " + kFilter}) {
        const Result result = Run(arguments);
        EXPECT_EQ(result.exitCode, 1) << arguments;
        EXPECT_TRUE(Contains(result.output, "folder.rtd: is a folder, not a file")) << result.output;
        EXPECT_TRUE(std::filesystem::is_directory(m_Folder / "folder.rtd"));
    }
}

// History keeps its undo pixels within a budget; doc show and doc filter say when older entries went.
TEST_F(DocCommand, HistoryStaysWithinItsBudget) {
    ASSERT_EQ(Run("doc new in.png -o d.rtd").exitCode, 0);
    // Each entry holds the 8 × 6 RGBA8 layer's pixels, 384 bytes with rows padded to 64: two fit in 800,
    // three do not.
    const std::string budget = "RASTERTOOLS_HISTORY_BUDGET=800";
    ASSERT_EQ(Run("doc filter d.rtd " + kFilter, budget).exitCode, 0);
    ASSERT_EQ(Run("doc filter d.rtd " + kFilter, budget).exitCode, 0);
    Result result = Run("doc filter d.rtd " + kFilter, budget);
    ASSERT_EQ(result.exitCode, 0) << result.output;
    EXPECT_TRUE(Contains(result.output, "; history reached its memory budget: 1 oldest entry dropped"))
        << result.output;
    ASSERT_EQ(Run("doc filter d.rtd " + kFilter, budget).exitCode, 0);
    result = Run("doc show d.rtd", budget);
    EXPECT_TRUE(Contains(result.output, "history: 2 entries, 0 undone; 2 older entries were dropped to keep "
                                        "history within its memory budget\n"))
        << result.output;
    // The default budget keeps them all; a budget that is no size is refused.
    ASSERT_EQ(Run("doc new in.png -o e.rtd").exitCode, 0);
    for (int i = 0; i < 4; ++i)
        ASSERT_EQ(Run("doc filter e.rtd " + kFilter).exitCode, 0);
    EXPECT_TRUE(Contains(Run("doc show e.rtd").output, "history: 4 entries, 0 undone\n"));
    result = Run("doc show e.rtd", "RASTERTOOLS_HISTORY_BUDGET=lots");
    EXPECT_EQ(result.exitCode, 2);
    EXPECT_TRUE(Contains(result.output, "RASTERTOOLS_HISTORY_BUDGET: \"lots\" is not a number of bytes"))
        << result.output;
}

// rastertools interrupted while it writes a document removes its temporary file and ends by the signal; the
// document is not created.
TEST_F(DocCommand, AnInterruptedWriteLeavesNoTemporaryFile) {
    // Random bytes do not compress, so writing the document takes a while.
    auto image = Raster::DynamicBuffer::Create(2048, 2048, Raster::PixelFormat::RGBA8);
    std::uint64_t state = 0x9e3779b97f4a7c15ull;
    for (int y = 0; y < image->GetHeight(); ++y)
        for (std::size_t x = 0; x < image->GetRowBytes(); x += 8) {
            state ^= state << 13, state ^= state >> 7, state ^= state << 17;
            std::memcpy(image->RowBytes(y) + x, &state, 8);
        }
    ASSERT_TRUE(IO::WriteImage(m_Folder / "big.tif", *image));
    const auto temporaries = [&](pid_t writer) {
        int count = 0;
        const std::string prefix = ".d.rtd." + std::to_string(writer) + ".";
        for (const auto& entry : std::filesystem::directory_iterator(m_Folder))
            count += entry.path().filename().string().starts_with(prefix);
        return count;
    };
    bool caught = false;
    for (int attempt = 0; attempt < 5 && !caught; ++attempt) {
        std::filesystem::remove(m_Folder / "d.rtd");
        const pid_t child = ::fork();
        ASSERT_GE(child, 0);
        if (child == 0) {
            if (::chdir(m_Folder.c_str()) != 0) ::_exit(126);
            ::setenv("RASTERTOOLS_SETTINGS", (m_Folder / "settings.json").c_str(), 1);
            const int null = ::open("/dev/null", O_WRONLY);
            ::dup2(null, 1), ::dup2(null, 2);
            ::execl(RASTERTOOLS_PROGRAM, RASTERTOOLS_PROGRAM, "doc", "new", "big.tif", "-o", "d.rtd",
                    nullptr);
            ::_exit(127);
        }
        const int signal = attempt % 2 ? SIGINT : SIGTERM;
        int status = 0;
        for (;;) {
            if (::waitpid(child, &status, WNOHANG) == child) break; // finished before it could be caught
            if (temporaries(child) > 0) {
                caught = true;
                ::kill(child, signal);
                ASSERT_EQ(::waitpid(child, &status, 0), child);
                break;
            }
            std::this_thread::sleep_for(std::chrono::microseconds(200));
        }
        if (!caught) continue;
        ASSERT_TRUE(WIFSIGNALED(status)) << "status " << status;
        EXPECT_EQ(WTERMSIG(status), signal);
        EXPECT_EQ(temporaries(child), 0);
        EXPECT_FALSE(std::filesystem::exists(m_Folder / "d.rtd"));
    }
    EXPECT_TRUE(caught) << "every write finished before it could be interrupted";
}

// doc filter takes apply's rendering options: a filter that reads around each pixel changes a layer into the
// same pixels whatever the tiles and threads, the pixels apply gives; bad values are refused before the
// document is touched.
TEST_F(DocCommand, FilterRendersTheSamePixelsInEveryTiling) {
    auto image = Raster::DynamicBuffer::Create(75, 50, Raster::PixelFormat::RGBA8);
    std::uint32_t state = 12345;
    for (int y = 0; y < 50; ++y)
        for (int x = 0; x < 4 * 75; ++x) {
            state = state * 1664525u + 1013904223u;
            image->Row<std::uint8_t>(y)[x] = std::uint8_t(x % 4 == 3 ? 255 : state >> 24);
        }
    ASSERT_TRUE(IO::WriteImage(m_Folder / "big.png", *image));
    const std::string filter = "motionblur --radius 6 --angle 30";
    ASSERT_EQ(Run("apply " + filter + " big.png applied.png --device cpu").exitCode, 0);
    ASSERT_NE(Pixels(m_Folder / "applied.png"), Pixels(m_Folder / "big.png"));
    for (const std::string options : {"", "--tile 16 --threads 1", "--tile 16 --threads 3",
                                      "--tile=32 --threads=2", "--threads 0 --tile 48"}) {
        ASSERT_EQ(Run("doc new big.png -o d.rtd").exitCode, 0);
        const Result result = Run("doc filter d.rtd " + filter + " " + options);
        ASSERT_EQ(result.exitCode, 0) << options << "\n" << result.output;
        ASSERT_EQ(Run("doc render d.rtd out.png --device cpu").exitCode, 0);
        EXPECT_EQ(Pixels(m_Folder / "out.png"), Pixels(m_Folder / "applied.png")) << options;
    }

    const std::string saved = ReadBytes(m_Folder / "d.rtd");
    const std::pair<std::string, std::string> refused[] = {
        {"--tile 8", "--tile needs a whole number from 16 to 65536, not \"8\""},
        {"--tile big", "--tile needs a whole number from 16 to 65536, not \"big\""},
        {"--threads -1", "--threads needs a whole number from 0 to 256, not \"-1\""},
        {"--threads 2 --threads 3", "--threads is given more than once"},
        {"--tile", "\"--tile\" needs a value"},
        {"--device nonesuch", "nonesuch"},
        {"--live --tile 16", "--tile sets how pixels are changed now; a live filter layer is rendered by doc "
                             "render"},
    };
    for (const auto& [options, message] : refused) {
        const Result result = Run("doc filter d.rtd " + filter + " " + options);
        EXPECT_EQ(result.exitCode, 2) << options << "\n" << result.output;
        EXPECT_TRUE(Contains(result.output, message))
            << options << "\nexpected: " << message << "\ngot: " << result.output;
        EXPECT_EQ(ReadBytes(m_Folder / "d.rtd"), saved) << options;
    }
    const Result help = Run("doc filter --help");
    EXPECT_TRUE(Contains(help.output, "--tile") && Contains(help.output, "--threads") &&
                Contains(help.output, "--device"))
        << help.output;
}
