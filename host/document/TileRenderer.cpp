#include "host/document/TileRenderer.h"

#include "host/kernel/Abort.h"

#include <oneapi/tbb/info.h>
#include <oneapi/tbb/task_arena.h>
#include <oneapi/tbb/task_group.h>

#include <algorithm>
#include <atomic>
#include <cctype>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <exception>
#include <mutex>
#include <string_view>
#include <vector>

namespace {

std::int64_t FloorDiv(std::int64_t a, std::int64_t b) {
    const std::int64_t q = a / b;
    return (a % b != 0 && (a < 0) != (b < 0)) ? q - 1 : q;
}

// The cells of the grid that the area touches, in the order they are handed out. Coordinates are worked in
// 64 bits: an area may span the whole int range, and so may its count of tiles and pixels (up to
// (2^32 - 1)^2).
//
// The rows of cells are split into as many bands as there are threads, and consecutive cells come from
// different bands, each band row by row. Threads that start cells at about the same time then work on rows
// far apart: on neighbouring cells of one row each core's prefetches reach into the lines that the other is
// writing, and two threads rendered a fast filter hardly faster than one.
class TileGrid {
public:
    TileGrid(const Kernel::RectT<int>& area, int tileSize, int bands)
        : m_Area(area) {
        if (tileSize <= 0) return; // one tile, the whole area
        m_Pitch = tileSize;
        m_FirstColumn = FloorDiv(area.left, m_Pitch);
        m_FirstRow = FloorDiv(area.top, m_Pitch);
        m_Columns =
            static_cast<std::uint64_t>(FloorDiv(std::int64_t(area.right) - 1, m_Pitch) - m_FirstColumn + 1);
        m_Rows =
            static_cast<std::uint64_t>(FloorDiv(std::int64_t(area.bottom) - 1, m_Pitch) - m_FirstRow + 1);
        m_Bands = std::clamp<std::uint64_t>(std::uint64_t(std::max(bands, 1)), 1, m_Rows);
    }

    std::uint64_t Count() const noexcept { return m_Columns * m_Rows; }

    Kernel::RectT<int> Tile(std::uint64_t index) const noexcept {
        if (m_Pitch == 0) return m_Area;
        index = RowByRow(index);
        const std::int64_t x = (m_FirstColumn + static_cast<std::int64_t>(index % m_Columns)) * m_Pitch;
        const std::int64_t y = (m_FirstRow + static_cast<std::int64_t>(index / m_Columns)) * m_Pitch;
        // Clipped to the area, so every coordinate fits an int again.
        return {static_cast<int>(std::max<std::int64_t>(x, m_Area.left)),
                static_cast<int>(std::max<std::int64_t>(y, m_Area.top)),
                static_cast<int>(std::min<std::int64_t>(x + m_Pitch, m_Area.right)),
                static_cast<int>(std::min<std::int64_t>(y + m_Pitch, m_Area.bottom))};
    }

private:
    // The row-by-row number of the cell handed out index-th. Every band has whole rows of rows / bands or
    // one more (the first rows % bands bands): the bands take turns over their common rows, then the longer
    // ones over their last.
    std::uint64_t RowByRow(std::uint64_t index) const noexcept {
        const std::uint64_t rows = m_Rows / m_Bands, longer = m_Rows % m_Bands;
        const std::uint64_t common = m_Bands * rows * m_Columns;
        std::uint64_t band = index % m_Bands, within = index / m_Bands;
        if (index >= common) {
            band = (index - common) % longer;
            within = rows * m_Columns + (index - common) / longer;
        }
        return (band * rows + std::min(band, longer)) * m_Columns + within;
    }

    Kernel::RectT<int> m_Area;
    std::int64_t m_Pitch = 0;
    std::int64_t m_FirstColumn = 0;
    std::int64_t m_FirstRow = 0;
    std::uint64_t m_Columns = 1;
    std::uint64_t m_Rows = 1;
    std::uint64_t m_Bands = 1;
};

std::uint64_t PixelCount(const Kernel::RectT<int>& r) noexcept {
    return static_cast<std::uint64_t>(std::int64_t(r.right) - r.left) *
           static_cast<std::uint64_t>(std::int64_t(r.bottom) - r.top);
}

// One call of RenderTiles: the tiles not yet handed out, and what the workers report back.
class TileRun {
public:
    TileRun(const Kernel::RectT<int>& area, const TileRenderOptions& options, int threads,
            const std::function<bool(const Kernel::RectT<int>&)>& renderTile)
        : m_Grid(area, options.tileSize, threads)
        , m_Count(m_Grid.Count())
        , m_TotalPixels(PixelCount(area))
        // Progress is worth a call per thousandth of the area, not per tile: tiles may be single pixels.
        , m_ReportStep(std::max<std::uint64_t>(1, (m_TotalPixels + 999) / 1000))
        , m_Options(options)
        , m_RenderTile(renderTile) {}

    std::uint64_t Count() const noexcept { return m_Count; }

    // Read by the caller once the workers are done: pairs with the release at the end of each Work, so that
    // what the workers wrote (an exception, the tile function's own results) is visible to the caller.
    void Collect() noexcept { (void)m_Finished.load(std::memory_order_acquire); }

    // A worker: takes the next tile until none is left, the abort flag is set or a tile failed.
    void Work() noexcept {
        for (;;) {
            if (m_Stop.load(std::memory_order_acquire)) break;
            if (Kernel::IsAborted(m_Options.abort)) {
                Fail();
                break;
            }
            const std::uint64_t index = m_Next.fetch_add(1, std::memory_order_relaxed);
            if (index >= m_Count) break;
            const Kernel::RectT<int> tile = m_Grid.Tile(index);
            try {
                if (!m_RenderTile(tile)) {
                    Fail();
                    break;
                }
                Report(PixelCount(tile));
            } catch (...) {
                Keep(std::current_exception());
                Fail();
                break;
            }
        }
        m_Finished.fetch_add(1, std::memory_order_acq_rel);
    }

    bool Succeeded() const noexcept { return !m_Failed.load(std::memory_order_acquire); }

    void RethrowIfAny() const {
        if (m_Error) std::rethrow_exception(m_Error);
    }

private:
    void Fail() noexcept {
        m_Failed.store(true, std::memory_order_release);
        m_Stop.store(true, std::memory_order_release);
    }

    void Keep(std::exception_ptr error) noexcept {
        std::lock_guard lock(m_ErrorMutex);
        if (!m_Error) m_Error = std::move(error);
    }

    void Report(std::uint64_t pixels) {
        const std::uint64_t done = m_DonePixels.fetch_add(pixels, std::memory_order_acq_rel) + pixels;
        if (!m_Options.progress) return;
        std::unique_lock lock(m_ProgressMutex, std::defer_lock);
        if (done == m_TotalPixels) {
            lock.lock(); // the last tile: 1.0 must not be skipped
        } else {
            if (done - m_ReportedHint.load(std::memory_order_relaxed) < m_ReportStep) return;
            // Another thread is reporting; it or a later tile covers this one.
            if (!lock.try_lock()) return;
        }
        // Read again under the lock: the counter only rises, so successive reports rise too, whichever
        // thread makes them.
        const std::uint64_t now = m_DonePixels.load(std::memory_order_acquire);
        if (now <= m_ReportedPixels) return;
        // Another thread may have reported since this one looked: keep the steps a thousandth apart.
        if (now != m_TotalPixels && now - m_ReportedPixels < m_ReportStep) return;
        m_ReportedPixels = now;
        m_ReportedHint.store(now, std::memory_order_relaxed);
        double fraction = 1.0;
        if (now != m_TotalPixels) // not rounded up to 1.0: that value means finished
            fraction = std::min(double(now) / double(m_TotalPixels), std::nextafter(1.0, 0.0));
        m_Options.progress(fraction);
    }

    const TileGrid m_Grid;
    const std::uint64_t m_Count;
    const std::uint64_t m_TotalPixels;
    const std::uint64_t m_ReportStep;
    const TileRenderOptions& m_Options;
    const std::function<bool(const Kernel::RectT<int>&)>& m_RenderTile;

    std::atomic<int> m_Finished{0};
    std::atomic<std::uint64_t> m_Next{0};
    std::atomic<bool> m_Stop{false};
    std::atomic<bool> m_Failed{false};
    std::atomic<std::uint64_t> m_DonePixels{0};
    std::atomic<std::uint64_t> m_ReportedHint{0};

    std::mutex m_ProgressMutex;
    std::uint64_t m_ReportedPixels = 0; // guarded by m_ProgressMutex

    std::mutex m_ErrorMutex;
    std::exception_ptr m_Error; // the first exception; guarded by m_ErrorMutex until the workers are done
};

// oneTBB passes a task to another thread inside its own library, where the thread sanitizer cannot see it.
// The tasks are therefore built first, then published here with a release that each task acquires before
// it reads what it captured; the renderer needs nothing else from it.
std::atomic<unsigned> g_TaskHandOff{0};

} // namespace

bool RenderTiles(Kernel::RectT<int> area, const TileRenderOptions& options,
                 const std::function<bool(const Kernel::RectT<int>& tile)>& renderTile) {
    if (area.IsEmpty()) return true;
    // More threads than cores cannot run at once anyway, and an arena's size costs memory.
    const int cores = std::max(1, tbb::info::default_concurrency());
    const int threads = options.threads > 0 ? std::min(options.threads, cores) : cores;
    // The bands follow the threads asked for, so that the order of tiles does not depend on the machine.
    TileRun run(area, options, options.threads > 0 ? options.threads : cores, renderTile);
    const auto workers = static_cast<int>(std::min<std::uint64_t>(std::uint64_t(threads), run.Count()));

    if (workers == 1) {
        run.Work();
    } else {
        // The arena bounds the threads; the calling thread is one of them.
        tbb::task_arena arena(threads);
        arena.execute([&] {
            tbb::task_group group;
            std::vector<tbb::task_handle> tasks;
            for (int i = 1; i < workers; ++i)
                tasks.push_back(group.defer([&run] {
                    (void)g_TaskHandOff.load(std::memory_order_acquire);
                    run.Work();
                }));
            g_TaskHandOff.fetch_add(1, std::memory_order_release);
            for (auto& task : tasks)
                group.run(std::move(task));
            run.Work();
            group.wait();
        });
    }
    run.Collect();
    run.RethrowIfAny();
    return run.Succeeded();
}

namespace {

std::string_view Trimmed(std::string_view text) {
    while (!text.empty() && std::isspace(static_cast<unsigned char>(text.front())))
        text.remove_prefix(1);
    while (!text.empty() && std::isspace(static_cast<unsigned char>(text.back())))
        text.remove_suffix(1);
    return text;
}

const char* BackEndName(Raster::HardwareSelector::Choice choice) {
    switch (choice) {
    case Raster::HardwareSelector::Choice::Auto:
        return "auto";
    case Raster::HardwareSelector::Choice::Cpu:
        return "cpu";
    case Raster::HardwareSelector::Choice::OpenCL:
        return "opencl";
    case Raster::HardwareSelector::Choice::Cuda:
        return "cuda";
    }
    return "";
}

std::string Normalised(const Raster::HardwareSelector& selector) {
    std::string text = BackEndName(selector.choice);
    if (selector.index) text += ":" + std::to_string(*selector.index);
    return text;
}

} // namespace

DeviceSelection ResolveDeviceSelector(const std::string& commandLine) {
    DeviceSelection selection;
    std::string_view value = Trimmed(commandLine);
    if (!value.empty()) {
        selection.origin = "--device " + std::string(value);
    } else if (const char* variable = std::getenv(Raster::Hardware::SelectorVariable);
               variable && !Trimmed(variable).empty()) {
        value = Trimmed(variable);
        selection.origin = std::string(Raster::Hardware::SelectorVariable) + "=" + std::string(value);
    } else {
        selection.selector = "auto";
        selection.origin = "default";
        return selection;
    }
    if (const auto parsed = Raster::ParseHardwareSelector(value)) {
        selection.selector = Normalised(*parsed);
    } else {
        selection.error = selection.origin +
                          ": unknown device (expected auto, cpu, opencl or cuda; opencl and cuda may name a "
                          "device by number, as in opencl:1)";
    }
    return selection;
}

RenderDevice FindRenderDevice(const DeviceSelection& selection) {
    RenderDevice result;
    const auto parsed =
        selection.IsValid() ? Raster::ParseHardwareSelector(selection.selector) : std::nullopt;
    if (!parsed) {
        result.error = selection.IsValid() ? selection.origin + ": unknown device" : selection.error;
        return result;
    }
    using Choice = Raster::HardwareSelector::Choice;
    if (parsed->choice == Choice::Cpu) return result;
    result.device = Raster::Hardware::GetDevice(selection.selector);
    // "auto" may find nothing and render on the processor; a named back end must be there.
    if (result.device || parsed->choice == Choice::Auto) return result;

    const auto backEnd =
        parsed->choice == Choice::Cuda ? Raster::HardwareBackEnd::Cuda : Raster::HardwareBackEnd::OpenCL;
    const char* name = parsed->choice == Choice::Cuda ? "CUDA" : "OpenCL";
    const auto& devices = Raster::Hardware::GetDevices();
    const auto found = std::count_if(devices.begin(), devices.end(), [&](const auto& device) {
        return device && device->GetBackEnd() == backEnd;
    });
    if (found == 0 || !parsed->index)
        result.error = selection.origin + ": no " + name + " device found";
    else
        result.error = selection.origin + ": no " + name + " device " + std::to_string(*parsed->index) +
                       " (" + std::to_string(found) + (found == 1 ? " device" : " devices") +
                       ", numbered from 0)";
    return result;
}
