// The tile renderer: exact coverage on the grid, thread limits, abort, failure and progress.

#include "host/document/TileRenderer.h"
#include "host/kernel/Abort.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <climits>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <thread>
#include <vector>

namespace {

using Rect = Kernel::RectT<int>;

std::int64_t FloorDiv(std::int64_t a, std::int64_t b) {
    return a >= 0 ? a / b : -((-a + b - 1) / b);
}

std::string Describe(const Rect& r) {
    return "[" + std::to_string(r.left) + "," + std::to_string(r.top) + " .. " + std::to_string(r.right) +
           "," + std::to_string(r.bottom) + ")";
}

// Counts how often each pixel of an area is rendered, from any number of threads.
class CoverageMap {
public:
    explicit CoverageMap(const Rect& area)
        : m_Area(area)
        , m_Counts(static_cast<std::size_t>(area.Width()) * static_cast<std::size_t>(area.Height())) {}

    void Add(const Rect& tile) {
        for (int y = tile.top; y < tile.bottom; ++y)
            for (int x = tile.left; x < tile.right; ++x)
                m_Counts[Index(x, y)].fetch_add(1, std::memory_order_relaxed);
    }

    // The first pixel not rendered exactly once, described; empty when there is none.
    std::string FirstFault() const {
        for (int y = m_Area.top; y < m_Area.bottom; ++y)
            for (int x = m_Area.left; x < m_Area.right; ++x)
                if (const int n = m_Counts[Index(x, y)].load(); n != 1)
                    return "pixel " + std::to_string(x) + "," + std::to_string(y) + " rendered " +
                           std::to_string(n) + " times";
        return {};
    }

private:
    std::size_t Index(int x, int y) const {
        return static_cast<std::size_t>(y - m_Area.top) * static_cast<std::size_t>(m_Area.Width()) +
               static_cast<std::size_t>(x - m_Area.left);
    }

    Rect m_Area;
    std::vector<std::atomic<int>> m_Counts;
};

// What a tile must be: inside the area, not empty, within one grid cell, and the whole of that cell's part of
// the area (each edge on a grid line or on the area's edge).
std::string TileFault(const Rect& tile, const Rect& area, int tileSize) {
    if (tile.IsEmpty()) return "empty tile " + Describe(tile);
    if (tile.Intersect(area) != tile) return "tile " + Describe(tile) + " leaves the area";
    if (tileSize <= 0) return tile == area ? std::string() : "tile " + Describe(tile) + " is not the area";
    const std::int64_t s = tileSize;
    if (FloorDiv(tile.left, s) != FloorDiv(std::int64_t(tile.right) - 1, s) ||
        FloorDiv(tile.top, s) != FloorDiv(std::int64_t(tile.bottom) - 1, s))
        return "tile " + Describe(tile) + " crosses a grid line";
    const bool leftOk = tile.left == area.left || tile.left % tileSize == 0;
    const bool topOk = tile.top == area.top || tile.top % tileSize == 0;
    const bool rightOk = tile.right == area.right || tile.right % tileSize == 0;
    const bool bottomOk = tile.bottom == area.bottom || tile.bottom % tileSize == 0;
    if (!(leftOk && topOk && rightOk && bottomOk))
        return "tile " + Describe(tile) + " is only part of its cell";
    return {};
}

// Renders area, checks every tile and the coverage, and returns the number of tiles.
std::size_t RenderAndCheck(const Rect& area, int tileSize, int threads) {
    SCOPED_TRACE("area " + Describe(area) + ", tile size " + std::to_string(tileSize) + ", threads " +
                 std::to_string(threads));
    CoverageMap coverage(area);
    std::atomic<std::size_t> tiles{0};
    std::mutex faultMutex;
    std::string fault;
    TileRenderOptions options;
    options.tileSize = tileSize;
    options.threads = threads;
    const bool ok = RenderTiles(area, options, [&](const Rect& tile) {
        tiles.fetch_add(1, std::memory_order_relaxed);
        if (auto problem = TileFault(tile, area, tileSize); !problem.empty()) {
            std::lock_guard lock(faultMutex);
            if (fault.empty()) fault = std::move(problem);
            return true; // a tile outside the area must not be counted
        }
        coverage.Add(tile);
        return true;
    });
    EXPECT_TRUE(ok);
    EXPECT_EQ(fault, "");
    EXPECT_EQ(coverage.FirstFault(), "");
    return tiles.load();
}

// Records which threads render, and how many at once.
struct ThreadUse {
    std::atomic<int> inFlight{0};
    std::atomic<int> most{0};
    std::mutex mutex;
    std::map<std::thread::id, int> tilesPerThread;

    void Enter() {
        const int now = inFlight.fetch_add(1) + 1;
        int seen = most.load();
        while (now > seen && !most.compare_exchange_weak(seen, now)) {
        }
        std::lock_guard lock(mutex);
        ++tilesPerThread[std::this_thread::get_id()];
    }
    void Leave() { inFlight.fetch_sub(1); }
};

} // namespace

TEST(TileGrid, EveryPixelOnceAndNoTileCrossesTheGrid) {
    const Rect areas[] = {
        {0, 0, 100, 80},      // aligned origin
        {-37, -5, 61, 70},    // negative, unaligned origin
        {-300, -300, -1, -1}, // wholly negative
        {31, 31, 97, 33},     // a strip two rows high
        {5, 7, 6, 8},         // one pixel
        {-64, -64, 64, 64},   // symmetric about the origin, aligned
        {1000, 2000, 1513, 2257},
    };
    const int sizes[] = {1, 7, 32, 33, 256, 5000, 0, -3};
    // Tiles are handed out from as many bands of rows as threads are asked for, however many cores there
    // are: thread counts that split the rows unevenly, or into more bands than rows, must still give every
    // tile once.
    for (const Rect& area : areas)
        for (const int size : sizes)
            for (const int threads : {1, 2, 3, 7, 0})
                RenderAndCheck(area, size, threads);
}

TEST(TileGrid, TilesFollowTheGridAnchoredAtTheOrigin) {
    // Worked by hand: the columns are cut at 0, 32 and 64, the rows at 32.
    const Rect area{-5, 3, 70, 40};
    std::mutex mutex;
    std::vector<std::tuple<int, int, int, int>> tiles;
    TileRenderOptions options;
    options.tileSize = 32;
    ASSERT_TRUE(RenderTiles(area, options, [&](const Rect& t) {
        std::lock_guard lock(mutex);
        tiles.emplace_back(t.top, t.left, t.bottom, t.right);
        return true;
    }));
    std::sort(tiles.begin(), tiles.end());
    const std::vector<std::tuple<int, int, int, int>> expected = {
        {3, -5, 32, 0},  {3, 0, 32, 32},  {3, 32, 32, 64},  {3, 64, 32, 70},
        {32, -5, 40, 0}, {32, 0, 40, 32}, {32, 32, 40, 64}, {32, 64, 40, 70},
    };
    EXPECT_EQ(tiles, expected);

    // The same grid whatever the area: a sub-area's tiles are the big area's tiles clipped to it.
    EXPECT_EQ(RenderAndCheck({-64, -64, 64, 64}, 32, 0), 16u);
    EXPECT_EQ(RenderAndCheck({-63, -63, 63, 63}, 32, 0), 16u);
    EXPECT_EQ(RenderAndCheck({-32, -32, 32, 32}, 32, 0), 4u);
    EXPECT_EQ(RenderAndCheck({-31, -31, 31, 31}, 32, 0), 4u);
}

TEST(TileGrid, EmptyAreasRenderNothingAndSucceed) {
    const Rect empties[] = {{0, 0, 0, 10}, {0, 0, 10, 0}, {5, 5, 3, 9}, {-1, -1, -2, -2}, Rect::Unbounded()};
    for (const Rect& area : empties) {
        std::atomic<int> calls{0}, reports{0};
        TileRenderOptions options;
        options.progress = [&](double) { ++reports; };
        EXPECT_TRUE(RenderTiles(area, options, [&](const Rect&) { return ++calls, true; })) << Describe(area);
        EXPECT_EQ(calls, 0) << Describe(area);
        EXPECT_EQ(reports, 0) << Describe(area);
    }
}

TEST(TileGrid, AreasAtTheEdgesOfTheIntRangeDoNotOverflow) {
    // Small areas in the far corners: every pixel checked.
    RenderAndCheck({INT_MAX - 10, INT_MIN, INT_MAX, INT_MIN + 5}, 7, 0);
    RenderAndCheck({INT_MIN, INT_MAX - 3, INT_MIN + 9, INT_MAX}, 256, 0);
    RenderAndCheck({INT_MIN, INT_MAX - 3, INT_MIN + 9, INT_MAX}, 1, 0);

    // An area wider than an int can count: tiles are checked against the grid, pixels summed in 64 bits.
    const Rect wide{INT_MIN, 0, INT_MAX, 2};
    for (const int size : {0, 1 << 30, INT_MAX}) {
        std::atomic<std::int64_t> pixels{0};
        std::atomic<int> faults{0};
        double last = 0;
        TileRenderOptions options;
        options.tileSize = size;
        options.progress = [&](double f) { last = f; };
        EXPECT_TRUE(RenderTiles(wide, options, [&](const Rect& t) {
            if (!TileFault(t, wide, size).empty()) faults.fetch_add(1);
            pixels.fetch_add((std::int64_t(t.right) - t.left) * (std::int64_t(t.bottom) - t.top));
            return true;
        }));
        EXPECT_EQ(faults.load(), 0) << "tile size " << size;
        EXPECT_EQ(pixels.load(), (std::int64_t(INT_MAX) - INT_MIN) * 2) << "tile size " << size;
        EXPECT_EQ(last, 1.0) << "tile size " << size;
    }
}

TEST(TileThreads, NeverMoreThreadsThanAsked) {
    const Rect area{0, 0, 96, 96};
    const unsigned cores = std::max(1u, std::thread::hardware_concurrency());
    for (const int threads : {1, 2, 3, 0}) {
        ThreadUse use;
        TileRenderOptions options;
        options.tileSize = 16; // 36 tiles, each long enough that the workers overlap
        options.threads = threads;
        ASSERT_TRUE(RenderTiles(area, options, [&](const Rect&) {
            use.Enter();
            std::this_thread::sleep_for(std::chrono::microseconds(500));
            use.Leave();
            return true;
        }));
        const int limit = threads > 0 ? threads : static_cast<int>(cores);
        EXPECT_LE(use.most.load(), limit) << "threads " << threads;
        int total = 0;
        for (const auto& [id, n] : use.tilesPerThread)
            total += n;
        EXPECT_EQ(total, 36);
        if (threads == 1) {
            ASSERT_EQ(use.tilesPerThread.size(), 1u);
            EXPECT_EQ(use.tilesPerThread.begin()->first, std::this_thread::get_id())
                << "one thread means the caller's";
        }
    }
}

TEST(TileThreads, RendersFromInsideAnotherRendersTile) {
    // A tile that splits its own work the same way (a command rendering a scratch buffer) must not deadlock
    // or lose pixels.
    const Rect outer{0, 0, 64, 64};
    CoverageMap coverage(outer);
    TileRenderOptions options;
    options.tileSize = 32;
    EXPECT_TRUE(RenderTiles(outer, options, [&](const Rect& tile) {
        TileRenderOptions inner;
        inner.tileSize = 8;
        return RenderTiles(tile, inner, [&](const Rect& t) { return coverage.Add(t), true; });
    }));
    EXPECT_EQ(coverage.FirstFault(), "");
}

TEST(TileAbort, AFlagSetBeforehandRendersNothing) {
    bool abort = false;
    Kernel::SetAborted(&abort, true);
    std::atomic<int> calls{0}, reports{0};
    TileRenderOptions options;
    options.abort = &abort;
    options.progress = [&](double) { ++reports; };
    EXPECT_FALSE(RenderTiles({0, 0, 1000, 1000}, options, [&](const Rect&) { return ++calls, true; }));
    EXPECT_EQ(calls, 0);
    EXPECT_EQ(reports, 0);

    // Clearing it again renders as usual.
    Kernel::SetAborted(&abort, false);
    EXPECT_TRUE(RenderTiles({0, 0, 1000, 1000}, options, [&](const Rect&) { return ++calls, true; }));
    EXPECT_EQ(calls, 16);
}

TEST(TileAbort, OnOneThreadTheTileThatSetsTheFlagIsTheLast) {
    bool abort = false;
    std::vector<Rect> rendered;
    std::vector<double> reports;
    TileRenderOptions options;
    options.tileSize = 10;
    options.threads = 1;
    options.abort = &abort;
    options.progress = [&](double f) { reports.push_back(f); };
    EXPECT_FALSE(RenderTiles({0, 0, 100, 100}, options, [&](const Rect& t) {
        rendered.push_back(t);
        if (rendered.size() == 5) Kernel::SetAborted(&abort);
        return true;
    }));
    EXPECT_EQ(rendered.size(), 5u);
    ASSERT_FALSE(reports.empty());
    EXPECT_LT(reports.back(), 1.0);
    EXPECT_DOUBLE_EQ(reports.back(), 0.05);
}

TEST(TileAbort, AFlagSetFromAnotherThreadStopsTheRender) {
    const Rect area{0, 0, 64, 64};
    const std::size_t total = 64 * 64; // tile size 1
    for (const int threads : {1, 2, 0}) {
        SCOPED_TRACE("threads " + std::to_string(threads));
        bool abort = false;
        std::atomic<std::size_t> started{0};
        struct Call {
            std::thread::id thread;
            std::size_t order;
            bool flagAtStart;
            bool flagAtEnd;
        };
        std::mutex mutex;
        std::vector<Call> calls;

        std::thread aborter([&] {
            while (started.load() < 20)
                std::this_thread::yield();
            Kernel::SetAborted(&abort);
        });
        TileRenderOptions options;
        options.tileSize = 1;
        options.threads = threads;
        options.abort = &abort;
        const bool ok = RenderTiles(area, options, [&](const Rect&) {
            const std::size_t order = started.fetch_add(1);
            const bool atStart = Kernel::IsAborted(&abort);
            std::this_thread::sleep_for(std::chrono::microseconds(100));
            const bool atEnd = Kernel::IsAborted(&abort);
            std::lock_guard lock(mutex);
            calls.push_back({std::this_thread::get_id(), order, atStart, atEnd});
            return true;
        });
        aborter.join();

        EXPECT_FALSE(ok);
        EXPECT_GE(calls.size(), 20u);
        EXPECT_LT(calls.size(), total / 2) << "the render went on long after the flag was set";
        // A thread that has seen the flag set (at the end of its tile) starts no further tile, and across
        // threads at most one tile each can start in the moment between the renderer's read and the tile's.
        std::sort(calls.begin(), calls.end(), [](const Call& a, const Call& b) { return a.order < b.order; });
        std::map<std::thread::id, bool> sawFlag;
        std::size_t startedAfterFlag = 0;
        for (const Call& call : calls) {
            EXPECT_FALSE(sawFlag[call.thread])
                << "tile " << call.order << " started after its thread saw the flag";
            sawFlag[call.thread] = call.flagAtEnd;
            startedAfterFlag += call.flagAtStart;
        }
        EXPECT_LE(startedAfterFlag, sawFlag.size());
    }
}

TEST(TileFailure, AFailingTileFailsTheRenderAndStopsIt) {
    for (const int threads : {1, 0}) {
        std::atomic<int> calls{0};
        std::vector<double> reports;
        TileRenderOptions options;
        options.tileSize = 16;
        options.threads = threads;
        options.progress = [&](double f) { reports.push_back(f); };
        const bool ok = RenderTiles({0, 0, 160, 160}, options, [&](const Rect& t) {
            calls.fetch_add(1);
            return !(t.left == 48 && t.top == 32); // the 24th tile in row order
        });
        EXPECT_FALSE(ok) << "threads " << threads;
        EXPECT_TRUE(reports.empty() || reports.back() < 1.0) << "threads " << threads;
        if (threads == 1) {
            EXPECT_EQ(calls.load(), 24) << "no tile after the failing one";
        }
        EXPECT_LT(calls.load(), 100) << "threads " << threads;
    }
}

TEST(TileFailure, AnExceptionReachesTheCallerAfterTheWorkersStop) {
    for (const int threads : {1, 0}) {
        std::atomic<int> calls{0};
        TileRenderOptions options;
        options.tileSize = 8;
        options.threads = threads;
        EXPECT_THROW(RenderTiles({0, 0, 64, 64}, options,
                                 [&](const Rect& t) -> bool {
                                     calls.fetch_add(1);
                                     if (t.left == 16 && t.top == 8) throw std::runtime_error("tile broke");
                                     return true;
                                 }),
                     std::runtime_error)
            << "threads " << threads;
        if (threads == 1) {
            EXPECT_EQ(calls.load(), 11);
        }
        const int afterwards = calls.load();
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        EXPECT_EQ(calls.load(), afterwards) << "a worker went on after the call returned";
    }
}

TEST(TileProgress, RisesOneCallAtATimeAndEndsAtOneOnSuccess) {
    for (const int tileSize : {1, 7, 64}) {
        SCOPED_TRACE("tile size " + std::to_string(tileSize));
        std::atomic<int> inside{0};
        std::atomic<bool> overlapped{false};
        std::vector<double> reports; // written by one call at a time, if the renderer keeps its word
        TileRenderOptions options;
        options.tileSize = tileSize;
        options.progress = [&](double f) {
            if (inside.fetch_add(1) != 0) overlapped = true;
            reports.push_back(f);
            std::this_thread::yield();
            inside.fetch_sub(1);
        };
        ASSERT_TRUE(RenderTiles({-50, -20, 150, 130}, options, [](const Rect&) { return true; }));
        EXPECT_FALSE(overlapped.load());
        ASSERT_FALSE(reports.empty());
        for (std::size_t i = 0; i < reports.size(); ++i) {
            EXPECT_GT(reports[i], 0.0);
            EXPECT_LE(reports[i], 1.0);
            if (i > 0) {
                EXPECT_GT(reports[i], reports[i - 1]) << "report " << i;
            }
        }
        EXPECT_EQ(reports.back(), 1.0);
        EXPECT_EQ(std::count(reports.begin(), reports.end(), 1.0), 1);
        // Not one call per tile: a host's progress bar needs no more than a thousand steps.
        EXPECT_LE(reports.size(), 1001u);
    }
}

TEST(TileProgress, CountsPixelsNotTiles) {
    // One tile of 256 × 10 pixels, then one of 44 × 10: 2560 of 3000 pixels, then all.
    std::vector<double> reports;
    TileRenderOptions options;
    options.tileSize = 256;
    options.threads = 1;
    options.progress = [&](double f) { reports.push_back(f); };
    ASSERT_TRUE(RenderTiles({0, 0, 300, 10}, options, [](const Rect&) { return true; }));
    EXPECT_EQ(reports, (std::vector<double>{2560.0 / 3000.0, 1.0}));
}
