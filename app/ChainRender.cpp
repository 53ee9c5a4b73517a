// Chains rendered in bands: every image between two filters is allocated at its full size but only written
// where a band needs it (fresh pages cost nothing until written) and handed back to the system once no later
// band reads it, so a chain of filters holds about a band of each image between them.
#include "app/ChainRender.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <optional>
#include <sys/mman.h>
#include <unistd.h>

namespace App {

namespace {

// The most rows a band of a chain has.
constexpr int kBandRows = 256;

// Rows [top, bottom) of an image; empty when bottom <= top.
struct Rows {
    int top = 0;
    int bottom = 0;
    bool IsEmpty() const noexcept { return bottom <= top; }
};

// The rows of the command's input that rendering rows of its output (the whole width) in tiles of this side
// reads (0: as one tile); nothing when the command reads an unbounded area. Tile by tile, because a filter's
// read area is a box about what it renders: a band's box can be far taller than its tiles' (a motion blur at
// an angle reads along a slanted line).
std::optional<Rows> ReadRows(const RasterCommand& command, Rows rows, int width, int inputHeight, int tile) {
    if (rows.IsEmpty()) return rows;
    const int step = tile > 0 ? tile : std::max(width, rows.bottom);
    Rows read{inputHeight, 0};
    for (int top = rows.top - rows.top % step; top < rows.bottom; top += step)
        for (int left = 0; left < width; left += step) {
            Kernel::RectT<double> area{double(left), double(std::max(top, rows.top)),
                                       double(std::min(left + step, width)),
                                       double(std::min(top + step, rows.bottom))};
            command.PrepareInputRectangle(area);
            constexpr double kFar = double(1 << 30);
            if (area.IsUnbounded() || !std::isfinite(area.top) || !std::isfinite(area.bottom) ||
                area.top < -kFar || area.bottom > kFar)
                return std::nullopt;
            read.top = std::min(read.top, std::clamp(int(std::floor(area.top)), 0, inputHeight));
            read.bottom = std::max(read.bottom, std::clamp(int(std::ceil(area.bottom)), 0, inputHeight));
        }
    return read.IsEmpty() ? Rows{} : read;
}

// Whether the channels a link's write mask leaves alone come from its input: where the output has the input's
// size and format.
bool KeepsInputChannels(const ChainLink& link, const Raster::DynamicBuffer& input,
                        const Raster::DynamicBuffer& output) {
    return link.channelMask >= 0 && output.GetWidth() == input.GetWidth() &&
           output.GetHeight() == input.GetHeight() && output.GetFormat() == input.GetFormat();
}

// Gives the pages wholly inside rows [from, to) back to the system; they read as zero afterwards.
void ReleaseRows(Raster::DynamicBuffer& image, int from, int to) {
    to = std::min(to, image.GetHeight());
    if (to <= from) return;
    const auto page = std::uintptr_t(::sysconf(_SC_PAGESIZE));
    const auto begin = reinterpret_cast<std::uintptr_t>(image.RowBytes(from));
    const std::uintptr_t end = begin + std::uintptr_t(to - from) * std::uintptr_t(image.Stride());
    const std::uintptr_t first = (begin + page - 1) & ~(page - 1), last = end & ~(page - 1);
    // Advice only: where it is refused the pages stay, and nothing reads them again.
    if (last > first) (void)::madvise(reinterpret_cast<void*>(first), last - first, MADV_DONTNEED);
}

class ChainRenderer {
public:
    ChainRenderer(const std::vector<ChainLink>& links, const ChainOptions& options, ChainResult& result)
        : m_Links(links)
        , m_Options(options)
        , m_Result(result) {}

    // Renders links [first, last] from input (whole) into a new image, which it returns (null on failure).
    Kernel::Counted<Raster::DynamicBuffer> RenderRun(Kernel::Counted<Raster::DynamicBuffer> input,
                                                     std::size_t first, std::size_t last, double progressFrom,
                                                     double progressShare) {
        std::vector<Kernel::Counted<Raster::DynamicBuffer>> images; // link k's output at k - first
        for (std::size_t k = first; k <= last; ++k) {
            const auto& shape = m_Links[k].shape;
            auto image = Raster::DynamicBuffer::Create(shape.width, shape.height, shape.format);
            if (!image)
                return Fail(k,
                            "a " + std::to_string(shape.width) + "x" + std::to_string(shape.height) + " " +
                                std::string(Raster::GetPixelFormatName(shape.format)) + " image is too large",
                            false);
            images.push_back(image);
        }
        const auto inputOf = [&](std::size_t k) { return k == first ? input : images[k - first - 1]; };
        const auto& output = *images.back();
        // A filter on its own renders all of its image in one job, whose tiles keep every thread busy. In a
        // run of several, tiles are at most kBandRows and a band is one of the last filter's tiles high: a
        // filter that prefers large tiles (a long motion blur) gets smaller ones, which its pixels do not
        // depend on, and the rows each band reads of the images between filters stay few.
        std::vector<int> tiles; // each filter's tile side at k - first
        for (std::size_t k = first; k <= last; ++k)
            tiles.push_back(
                first == last
                    ? m_Links[k].tileSize
                    : std::clamp(m_Links[k].tileSize > 0 ? m_Links[k].tileSize : kBandRows, 1, kBandRows));
        const int bandHeight = first == last ? output.GetHeight() : tiles.back();
        const int bands = (output.GetHeight() + bandHeight - 1) / bandHeight;

        // The rows of every image between the filters that each band needs: its own rows of the output, grown
        // backwards through the later filters' read areas.
        const std::size_t between = last - first; // images before the run's last
        std::vector<std::vector<Rows>> needed(between, std::vector<Rows>(std::size_t(bands)));
        for (int b = 0; b < bands; ++b) {
            Rows rows{b * bandHeight, std::min(output.GetHeight(), (b + 1) * bandHeight)};
            for (std::size_t k = last; k > first; --k) {
                const auto& into = *images[k - first];
                const auto& from = *inputOf(k);
                const auto read =
                    ReadRows(*m_Links[k].command, rows, into.GetWidth(), from.GetHeight(), tiles[k - first]);
                if (!read) return Fail(k, "its read area is unbounded");
                // A write mask keeps the input's own rows in the channels it leaves alone.
                if (KeepsInputChannels(m_Links[k], from, into) && !rows.IsEmpty())
                    rows = read->IsEmpty()
                               ? rows
                               : Rows{std::min(rows.top, read->top), std::max(rows.bottom, read->bottom)};
                else
                    rows = *read;
                needed[k - first - 1][std::size_t(b)] = rows;
            }
        }
        // The first row a band from b on still reads, for giving rows back.
        std::vector<std::vector<int>> stillRead(between, std::vector<int>(std::size_t(bands) + 1));
        for (std::size_t i = 0; i < between; ++i) {
            stillRead[i][std::size_t(bands)] = images[i]->GetHeight();
            for (int b = bands - 1; b >= 0; --b) {
                const Rows& rows = needed[i][std::size_t(b)];
                stillRead[i][std::size_t(b)] = rows.IsEmpty()
                                                   ? stillRead[i][std::size_t(b) + 1]
                                                   : std::min(rows.top, stillRead[i][std::size_t(b) + 1]);
            }
        }

        std::vector<std::vector<char>> done;
        for (const auto& image : images)
            done.emplace_back(std::size_t(image->GetHeight()), char(0));
        std::vector<int> released(between, 0);
        for (int b = 0; b < bands; ++b) {
            for (std::size_t k = first; k <= last; ++k) {
                const Rows rows =
                    k == last ? Rows{b * bandHeight, std::min(output.GetHeight(), (b + 1) * bandHeight)}
                              : needed[k - first][std::size_t(b)];
                auto& rendered = done[k - first];
                // Each run of rows not rendered yet, once.
                for (int y = rows.top; y < rows.bottom;) {
                    if (rendered[std::size_t(y)]) {
                        ++y;
                        continue;
                    }
                    int end = y;
                    while (end < rows.bottom && !rendered[std::size_t(end)])
                        ++end;
                    const auto progress = [&](double fraction) {
                        if (m_Options.progress && first == last)
                            m_Options.progress(progressFrom + progressShare * fraction);
                    };
                    if (!Render(k, inputOf(k), images[k - first], Rows{y, end}, tiles[k - first], progress))
                        return nullptr;
                    std::fill(rendered.begin() + y, rendered.begin() + end, char(1));
                    y = end;
                }
            }
            for (std::size_t i = 0; i < between; ++i) {
                const int until = stillRead[i][std::size_t(b) + 1];
                if (until > released[i]) {
                    ReleaseRows(*images[i], released[i], until);
                    released[i] = until;
                }
            }
            if (m_Options.progress) m_Options.progress(progressFrom + progressShare * double(b + 1) / bands);
        }
        return images.back();
    }

private:
    Kernel::Counted<Raster::DynamicBuffer> Fail(std::size_t link, std::string error, bool byFilter = true) {
        m_Result.failedLink = link;
        m_Result.filterFailed = byFilter;
        m_Result.error = std::move(error);
        return nullptr;
    }

    // Renders rows of link k's output, the whole width.
    bool Render(std::size_t k, const Kernel::Counted<Raster::DynamicBuffer>& input,
                const Kernel::Counted<Raster::DynamicBuffer>& output, Rows rows, int tile,
                const std::function<void(double)>& progress) {
        const ChainLink& link = m_Links[k];
        if (KeepsInputChannels(link, *input, *output))
            for (int y = rows.top; y < rows.bottom; ++y)
                std::memcpy(output->RowBytes(y), input->RowBytes(y), input->GetRowBytes());
        RasterTools::RenderJobOptions job;
        job.tileSize = tile;
        job.threads = m_Options.threads;
        job.device = m_Options.device;
        job.channelMask = link.channelMask;
        job.area = {0, rows.top, output->GetWidth(), rows.bottom};
        job.progress = progress;
        const auto result = RasterTools::RenderImage(*link.pipeline, input, output, link.mask, job);
        m_Result.deviceTiles += result.deviceTiles;
        m_Result.processorTiles += result.processorTiles;
        if (!result.complete) {
            Fail(k, result.error);
            return false;
        }
        return true;
    }

    const std::vector<ChainLink>& m_Links;
    const ChainOptions& m_Options;
    ChainResult& m_Result;
};

} // namespace

std::vector<bool> GetWholeInputLinks(const std::vector<ChainLink>& links, bool onDevice) {
    std::vector<bool> whole(links.size(), true);
    for (std::size_t k = 1; k < links.size() && !onDevice; ++k) {
        whole[k] = !ReadRows(*links[k].command, Rows{0, links[k].shape.height}, links[k].shape.width,
                             links[k - 1].shape.height, 0);
    }
    return whole;
}

ChainResult RenderChain(Kernel::Counted<Raster::DynamicBuffer> source, const std::vector<ChainLink>& links,
                        const ChainOptions& options) {
    ChainResult result;
    if (!source || links.empty()) {
        result.error = "nothing to render";
        return result;
    }
    const std::vector<bool> whole = GetWholeInputLinks(links, bool(options.device));
    ChainRenderer renderer(links, options, result);
    Kernel::Counted<Raster::DynamicBuffer> current = source;
    for (std::size_t first = 0; first < links.size();) {
        std::size_t last = first;
        while (last + 1 < links.size() && !whole[last + 1])
            ++last;
        const double from = double(first) / double(links.size());
        const double share = double(last + 1 - first) / double(links.size());
        current = renderer.RenderRun(current, first, last, from, share);
        if (!current) return result;
        first = last + 1;
    }
    result.image = current;
    return result;
}

} // namespace App
