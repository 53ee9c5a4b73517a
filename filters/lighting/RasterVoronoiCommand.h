#pragma once
// The Voronoi command: the layer becomes irregular cells, each filled with the
// colour under its site, with optional black border lines; alpha is kept. Also
// its Sample stage for the processor and its kinds of render: one per layer
// format, source and destination alike, without or with a mask.

#include "filters/lighting/Voronoi.h"
#include "filters/lighting/VoronoiMath.h"
#include "frame/SinglePassCommand.h"
#include "pipeline/Conversions.h"
#include "pipeline/Pipeline.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>
#include <cstring>
#include <type_traits>
#include <vector>

namespace RasterTools {

// The sites of the grid cells around one grid row: rows row - 2 .. row + 2 (only the middle three without
// lines) and a window of columns that moves on when a pixel's neighbourhood leaves it; and the border edges
// of the cells that turn out closest. Every value is computed by VoronoiMath as the kernel text computes it
// per pixel, so caching changes no bit.
class VoronoiSpanCells {
public:
    // Starts over unless the grid and row are those already held.
    void Use(int row, float cell, Raster::KernelMath::float2 origin, bool lines) noexcept {
        if (m_Filled >= 0 && row == m_Row && cell == m_Cell && origin.x == m_Origin.x &&
            origin.y == m_Origin.y && lines == (m_FirstRow == 0))
            return;
        m_Row = row;
        m_Cell = cell;
        m_Origin = origin;
        m_FirstRow = lines ? 0 : 1;
        m_LastRow = lines ? 4 : 3;
        m_Filled = -1;
    }

    // Makes the columns col - 2 .. col + 2 available.
    void Cover(int col) noexcept {
        if (m_Filled < 0 || col - 2 < m_FirstColumn || col + 2 >= m_FirstColumn + Columns) {
            m_FirstColumn = col - 2;
            m_Filled = 0;
            std::memset(m_EdgesKnown, 0, sizeof m_EdgesKnown);
        }
        for (; m_FirstColumn + m_Filled <= col + 2; ++m_Filled)
            for (int r = m_FirstRow; r <= m_LastRow; ++r)
                m_Sites[r][m_Filled] =
                    VoronoiMath::VoronoiSite(m_Row - 2 + r, m_FirstColumn + m_Filled, m_Cell, m_Origin);
    }

    // The 3 × 3 sites around grid cell (row + rowOffset, col), row-major; rowOffset is -1, 0 or 1.
    void Around(int rowOffset, int col, Raster::KernelMath::float2* sites) const noexcept {
        for (int r = 0; r < 3; ++r)
            for (int c = 0; c < 3; ++c)
                sites[r * 3 + c] = m_Sites[rowOffset + 1 + r][col - 1 - m_FirstColumn + c];
    }

    struct Edges {
        Raster::KernelMath::float4 edges[8];
        float scales[8];
    };
    // The bisectors between the site of grid cell (row + rowOffset, col) and its 8 neighbours' sites.
    const Edges& EdgesOf(int rowOffset, int col) noexcept {
        const int c = col - m_FirstColumn;
        Edges& edges = m_Edges[rowOffset + 1][c];
        if (!m_EdgesKnown[rowOffset + 1][c]) {
            Raster::KernelMath::float2 ring[9];
            Around(rowOffset, col, ring);
            VoronoiMath::VoronoiEdges(ring, edges.edges, edges.scales);
            m_EdgesKnown[rowOffset + 1][c] = true;
        }
        return edges;
    }

private:
    static constexpr int Columns = 24;
    int m_Row = 0;
    float m_Cell = 0.0f;
    Raster::KernelMath::float2 m_Origin{};
    int m_FirstRow = 1, m_LastRow = 3;
    int m_FirstColumn = 0;
    int m_Filled = -1; // nothing yet: the first Cover places the window
    Raster::KernelMath::float2 m_Sites[5][Columns];
    bool m_EdgesKnown[3][Columns] = {};
    Edges m_Edges[3][Columns];
};

// What the colour pass needs of each pixel of a run of pixels in one grid column and row: the closest of the
// 3 × 3 sites, the border line's weight, whether the full weighing of sites is needed (another site lends
// colour, or ties with the closest), and the source pixel under the pixel's centre (before the extend).
// Format-free, so that one build for AVX2 serves every format. Room for a last block of eight beyond the run,
// which blocks of eight may fill and nothing reads.
struct VoronoiRun {
    static constexpr int Capacity = 256;
    static constexpr int Room = Capacity + 8;
    int sourceX[Room], sourceY[Room];
    int closest[Room];
    float line[Room];
    unsigned char blend[Room];
};

// The closest of the 3 × 3 sites (x coordinates sx, squared y distances dyy) for the pixels x + i, first <= i
// < end, and whether each needs the full weighing; VoronoiClosest's and VoronoiThreshold's floats.
[[gnu::always_inline]] inline void VoronoiClosestScalar(const float* sx, const float* dyy, int x, int first,
                                                        int end, VoronoiRun& run) noexcept {
    using namespace VoronoiMath;
    for (int i = first; i < end; ++i) {
        const float px = (float)(x + i);
        float d2[9];
        for (int s = 0; s < 9; ++s) {
            const float dx = sx[s] - px;
            d2[s] = dx * dx + dyy[s];
        }
        float best = d2[0];
        int closest = 0;
        for (int s = 1; s < 9; ++s) {
            closest = d2[s] < best ? s : closest;
            best = d2[s] < best ? d2[s] : best;
        }
        const float threshold = VoronoiThreshold(VoronoiMinDistance(best));
        int near = 0;
        for (int s = 0; s < 9; ++s)
            near += d2[s] < threshold ? 1 : 0;
        run.closest[i] = closest;
        // The closest lies below the threshold (where rounding says otherwise, the full weighing decides); a
        // second site below it lends colour or ties.
        run.blend[i] = !(best < threshold) || near != 1;
    }
}

// The 8 bisectors of one site's cell along a pixel row y: midpoints ex and directions ez in x, the y terms ey
// = (y - midpoint y) × direction y, and the scales.
struct VoronoiBisectors {
    float ex[8], ez[8], ey[8], scales[8];
};
// Those of the site closest (0 .. 8, row-major in the 3 × 3 cells around grid column col of cells' row).
[[gnu::always_inline]] inline void VoronoiBisectorsOf(VoronoiSpanCells& cells, int col, int closest, float py,
                                                      VoronoiBisectors& b) noexcept {
    const auto& edges = cells.EdgesOf(closest / 3 - 1, col - 1 + closest % 3);
    for (int k = 0; k < 8; ++k) {
        b.ex[k] = edges.edges[k].x;
        b.ez[k] = edges.edges[k].z;
        b.ey[k] = (py - edges.edges[k].y) * edges.edges[k].w;
        b.scales[k] = edges.scales[k];
    }
}

// The border line's weight for the pixels x + i, first <= i < end, from bisectors b; VoronoiBorderDistance's
// and VoronoiLineWeight's floats.
[[gnu::always_inline]] inline void VoronoiLinesOf(const VoronoiBisectors& b, int x, int first, int end,
                                                  float lineWidth, VoronoiRun& run) noexcept {
    using namespace VoronoiMath;
    for (int i = first; i < end; ++i) {
        const float px = (float)(x + i);
        float m = rt_fabs((px - b.ex[0]) * b.ez[0] + b.ey[0]) * b.scales[0];
        for (int k = 1; k < 8; ++k)
            m = rt_fmin(m, rt_fabs((px - b.ex[k]) * b.ez[k] + b.ey[k]) * b.scales[k]);
        run.line[i] = VoronoiLineWeight(m, lineWidth);
    }
}

// The border line's weight for the count pixels from x on, given their closest sites: in stretches that share
// one.
[[gnu::always_inline]] inline void VoronoiLinesScalar(VoronoiSpanCells& cells, int col, float py, int x,
                                                      int count, float lineWidth, VoronoiRun& run) noexcept {
    for (int i = 0; i < count;) {
        const int closest = run.closest[i];
        int end = i + 1;
        while (end < count && run.closest[end] == closest)
            ++end;
        VoronoiBisectors b;
        VoronoiBisectorsOf(cells, col, closest, py, b);
        VoronoiLinesOf(b, x, i, end, lineWidth, run);
        i = end;
    }
}

// The source pixels under the centres of pixels (x + i, y), first <= i < end, as TransformPixelCenterToInt
// finds them.
[[gnu::always_inline]] inline void VoronoiSourcesScalar(const Raster::AffineTransform::Prepared& t, int x,
                                                        int y, int first, int end, VoronoiRun& run) noexcept {
    for (int i = first; i < end; ++i) {
        const auto at = Raster::TransformPixelCenterToInt<Raster::AffineTransform>(
            Raster::KernelMath::make_int2(x + i, y), t);
        run.sourceX[i] = at.x;
        run.sourceY[i] = at.y;
    }
}

// Fills run for the count pixels from (x, y) on, all in grid column col (which cells covers), with the same
// floats as VoronoiMath per pixel: each site's y distance is squared once, and each bisector's y term once
// per site. Ranges does the per-pixel work: Sources, Closest and Lines, with the parameters of
// VoronoiSourcesScalar, VoronoiClosestScalar and VoronoiLinesScalar.
template <class Ranges>
[[gnu::always_inline]] inline void
VoronoiRunGeometryWith(VoronoiSpanCells& cells, const Raster::AffineTransform::Prepared& t, int col, int x,
                       int y, int count, float lineWidth, VoronoiRun& run) noexcept {
    using namespace VoronoiMath;
    const float py = (float)y;
    float2 around[9];
    cells.Around(0, col, around);
    float sx[9], dyy[9];
    for (int s = 0; s < 9; ++s) {
        sx[s] = around[s].x;
        const float dy = around[s].y - py;
        dyy[s] = dy * dy;
    }

    Ranges::Sources(t, x, y, count, run);
    Ranges::Closest(sx, dyy, x, count, run);

    if (!(lineWidth > 0.0f)) {
        for (int i = 0; i < count; ++i)
            run.line[i] = 0.0f;
        return;
    }
    Ranges::Lines(cells, col, py, x, count, lineWidth, run);
}

// VoronoiRunGeometryWith, built for AVX2 where the processor has it (VoronoiSpans.cpp).
void VoronoiRunGeometry(VoronoiSpanCells& cells, const Raster::AffineTransform::Prepared& t, int col, int x,
                        int y, int count, float lineWidth, VoronoiRun& run) noexcept;

// The cell colour of each destination pixel (VoronoiMath), blended towards the line colour by the border
// weight, with the alpha of the source pixel under the destination pixel. Sites are read through Transform
// and Extend; the grid lies in destination pixels.
struct VoronoiSampler {
    struct Params {
        float block[VoronoiMath::SamplerFloatCount] = {2.0f, 0.0f, 0.0f, 0.0f};
    };

    // Opaque black in the format, as its accumulator.
    template <Raster::PixelFormat F>
    static typename Raster::PixelTraits<F>::Accumulator LineColour() noexcept {
        static const auto line = Raster::PixelTraits<F>::Accumulate(
            FromWorking<F>(Raster::KernelMath::make_float4(0.0f, 0.0f, 0.0f, 1.0f)));
        return line;
    }

    // colour's colour channels with source's alpha (the last channel). As whole values, so that the pixel
    // stays in registers where the format allows.
    template <class Component, int Channels, class Stored>
    static Stored WithAlphaOf(Stored colour, Stored source) noexcept {
        if constexpr (sizeof(Stored) == sizeof(Component) * Channels) {
            using Components = std::array<Component, Channels>;
            auto components = std::bit_cast<Components>(colour);
            components[Channels - 1] = std::bit_cast<Components>(source)[Channels - 1];
            return std::bit_cast<Stored>(components);
        } else {
            std::memcpy(&source, &colour, sizeof(Component) * (Channels - 1));
            return source;
        }
    }

    // The pixels of a span go in runs of one grid column (a column changes every cell's width of pixels):
    // their geometry at once (VoronoiRunGeometry), then their colours, where a site's colour is read once per
    // run and the usual pixel, deep inside its cell and off the lines, only copies it.
    template <class Transform, class Extend, class Image>
    static void SampleSpan(const Image& image, const Raster::PreparedTransform<Transform>& t,
                           const Params& params, int x0, int y, int n, typename Image::Stored* out) noexcept {
        using namespace VoronoiMath;
        constexpr Raster::PixelFormat F = Image::Format;
        using Traits = Raster::PixelTraits<F>;
        using Accumulator = typename Traits::Accumulator;
        using Stored = typename Image::Stored;
        using Component = Raster::FormatComponent<F>;
        constexpr int Channels = Raster::GetChannelCount(F);

        const float cell = params.block[CellIndex];
        const float lineWidth = params.block[LineWidthIndex];
        const float2 origin = make_float2(params.block[OriginXIndex], params.block[OriginYIndex]);
        const bool lines = lineWidth > 0.0f;
        const float py = (float)y;
        const int row = VoronoiCellIndex(py, origin.y, cell);
        const Accumulator line = LineColour<F>();
        const Stored lineStored = Traits::FromAccumulator(Traits::Clamp(line));
        // Kept between the spans of a thread: the next row of a tile mostly lies in the same grid row.
        thread_local VoronoiSpanCells cells;
        cells.Use(row, cell, origin, lines);
        VoronoiRun run;
        const auto columnOf = [&](int i) { return VoronoiCellIndex((float)(x0 + i), origin.x, cell); };
        for (int start = 0; start < n;) {
            // The column only grows along the span: the run's end by bisection.
            const int col = columnOf(start);
            int last = start, beyond = std::min(n, start + VoronoiRun::Capacity);
            while (beyond - last > 1) {
                const int middle = last + (beyond - last) / 2;
                if (columnOf(middle) == col)
                    last = middle;
                else
                    beyond = middle;
            }
            const int count = last + 1 - start;
            cells.Cover(col);
            static_assert(std::is_same_v<Transform, Raster::AffineTransform>, "the runs take affine views");
            VoronoiRunGeometry(cells, t, col, x0 + start, y, count, lineWidth, run);
            float2 around[9];
            cells.Around(0, col, around);
            // The sum of one site's colour with the weight 1, and that as a pixel, when first needed.
            Accumulator single[9];
            Stored inside[9];
            bool known[9] = {};
            for (int r = 0; r < count; ++r) {
                const int i = start + r;
                const Stored pixel = Extend::Read(image, make_int2(run.sourceX[r], run.sourceY[r]));
                const float w = run.line[r];
                Stored colour;
                if (w == 1.0f) {
                    colour = lineStored;
                } else if (!run.blend[r]) {
                    const int s = run.closest[r];
                    if (!known[s]) {
                        single[s] = Accumulator{};
                        const int2 at = convert_int2(Transform::Transform(around[s], t));
                        single[s] += Traits::Accumulate(Extend::Read(image, at)) * 1.0f;
                        inside[s] = Traits::FromAccumulator(Traits::Clamp(single[s]));
                        known[s] = true;
                    }
                    colour = w == 0.0f
                                 ? inside[s]
                                 : Traits::FromAccumulator(Traits::Clamp(single[s] * (1.0f - w) + line * w));
                } else {
                    const float2 p = make_float2((float)(x0 + i), py);
                    float d2[9];
                    const int closest = VoronoiClosest(around, p, d2);
                    const float best = d2[closest];
                    const float minD = VoronoiMinDistance(best);
                    const float threshold = VoronoiThreshold(minD);
                    Accumulator sum{};
                    float total = 0.0f;
                    for (int s = 0; s < 9; ++s) {
                        const float weight = VoronoiBlendWeight(d2[s], best, minD, threshold, around[s], p);
                        if (weight > 0.0f) {
                            const int2 at = convert_int2(Transform::Transform(around[s], t));
                            sum += Traits::Accumulate(Extend::Read(image, at)) * weight;
                            total += weight;
                        }
                    }
                    // Dividing by 1, and then mixing in none of the line, change no bit of a sum that starts
                    // at +0 (it is never -0).
                    Accumulator acc = total == 1.0f ? sum : sum / total;
                    if (w != 0.0f || total != 1.0f) acc = acc * (1.0f - w) + line * w;
                    colour = Traits::FromAccumulator(Traits::Clamp(acc));
                }
                // The colour channels; alpha (the last) stays the source pixel's.
                out[i] = WithAlphaOf<Component, Channels>(colour, pixel);
            }
            start = last + 1;
        }
    }
};

namespace VoronoiStages {

// The view's inverse takes sites and pixels to the source; the layer's edge
// pixels continue outwards, so cells whose site lies beyond the layer take the
// nearest edge colour.
template <Raster::PixelFormat F>
using Plain = PipelineStages<Raster::Copy, Raster::IdentityMask, VoronoiSampler, Raster::AffineTransform,
                             Raster::Safe, FormatList<F>, FormatList<F>>;
template <Raster::PixelFormat F>
using Masked = PipelineStages<Raster::Copy, Raster::BitmapMask, VoronoiSampler, Raster::AffineTransform,
                              Raster::Safe, FormatList<F>, FormatList<F>>;

} // namespace VoronoiStages

// The sampler's kernel text, per source format and language (null for an
// unknown language or a format that is not a layer format).
template <>
struct StageText<VoronoiSampler> {
    static const char* Get(HardwareKernelLanguage language, Raster::PixelFormat source);
};

class RasterVoronoiCommand final : public SinglePassCommand<VoronoiFilter> {
public:
    template <Raster::PixelFormat F>
    using PlainStages = VoronoiStages::Plain<F>;
    template <Raster::PixelFormat F>
    using MaskedStages = VoronoiStages::Masked<F>;

    // The largest cell in output pixels: far beyond any layer, and small enough
    // that the grid's single-precision arithmetic keeps whole pixels.
    static constexpr double CellLimit = 16777216.0;

    // For loading: Load then sets the fields.
    RasterVoronoiCommand() = default;
    RasterVoronoiCommand(bool liveEffect, double size, double lineWidth)
        : SinglePassCommand(liveEffect, VoronoiParameters{size, lineWidth}) {}
    // The host's form: the layers selected when the command is made.
    RasterVoronoiCommand(bool liveEffect, double size, double lineWidth,
                         const std::vector<Kernel::Counted<Node>>& selection)
        : SinglePassCommand(liveEffect, VoronoiParameters{size, lineWidth}) {
        SetSelection(selection);
    }
    RasterVoronoiCommand(bool liveEffect, const VoronoiParameters& params)
        : SinglePassCommand(liveEffect, params) {}

    double GetSize() const noexcept { return m_Params.size; }
    double GetLineWidth() const noexcept { return m_Params.lineWidth; }

    bool CanAffectAlpha() const override { return false; }
    // Cells of zero size are no effect at all.
    bool DoesAnything() const noexcept { return std::fabs(m_Params.size) > 1e-6; }

    // A pixel reads sites up to a cell away, and pixels beyond the layer take its
    // cells too: both areas grow by the size, in whole pixels.
    static double Margin(const VoronoiParameters& params) noexcept { return std::ceil(params.size); }

    // How an affine map scales lengths here: the length of its image of (1, 1),
    // over √2.
    static double Scale(const Raster::AffineTransform::Params& transform) noexcept {
        const auto& m = transform.m;
        return std::sqrt(((m[0] + m[1]) * (m[0] + m[1]) + (m[3] + m[4]) * (m[3] + m[4])) * 0.5);
    }
    // The layer was transformed: the cells scale with it. The line width, a
    // percentage, stays.
    void ApplyTransform(const Raster::AffineTransform::Params& transform) {
        m_Params.size *= Scale(transform);
        BoundParameters(m_Params, VoronoiFilter::kParameters);
    }
    // The converse: the size divided by the scale of the inverse map. False,
    // changing nothing, when that scale is 0 (a singular map, whose inverse
    // collapses) or not a number.
    bool ApplyInverseTransform(const Raster::AffineTransform::Params& transform) {
        const double scale = Scale(Raster::AffineTransform::Invert(transform));
        if (!(scale > 0.0) || !std::isfinite(scale)) return false;
        m_Params.size /= scale;
        BoundParameters(m_Params, VoronoiFilter::kParameters);
        return true;
    }

    // The sampler block for a render through view (source pixels to output
    // pixels): the cell in output pixels (the size over the scale of the view's
    // inverse, at least 2 and at most CellLimit, which a singular view, whose
    // inverse has the scale 0, reaches), the line width in output pixels, and the
    // view's translation as the grid's origin.
    VoronoiSampler::Params GetSamplerParams(const Raster::AffineTransform::Params& view) const noexcept {
        double cell = m_Params.size / Scale(Raster::AffineTransform::Invert(view));
        if (!(cell >= 2.0)) cell = 2.0;
        if (cell > CellLimit) cell = CellLimit;
        VoronoiSampler::Params params;
        params.block[VoronoiMath::CellIndex] = float(cell);
        params.block[VoronoiMath::LineWidthIndex] = float(cell * m_Params.lineWidth / 100.0);
        params.block[VoronoiMath::OriginXIndex] = float(view.m[2]);
        params.block[VoronoiMath::OriginYIndex] = float(view.m[5]);
        return params;
    }

    template <class StageParams>
    void FillStageParams(StageParams& params, const Kernel::RectT<double>&,
                         const Raster::AffineTransform::Params& view) const noexcept {
        params.transform = Raster::AffineTransform::Invert(view);
        params.sampler = GetSamplerParams(view);
    }
};

} // namespace RasterTools

// One layer format's processor renders.
#define RT_INSTANTIATE_VORONOI(Format)                                                                       \
    RT_INSTANTIATE_PROCESSOR(RasterTools::VoronoiStages::Plain<Raster::PixelFormat::Format>, Format)         \
    RT_INSTANTIATE_PROCESSOR(RasterTools::VoronoiStages::Masked<Raster::PixelFormat::Format>, Format)
