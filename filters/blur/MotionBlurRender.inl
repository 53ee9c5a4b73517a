// The body of the motion blur's per-format render; included only by the files in instances/.
#include "filters/blur/BlurPixels.h"
#include "filters/blur/MotionBlurRender.h"
#include "host/kernel/Abort.h"

#include <algorithm>
#include <vector>

namespace RasterTools::MotionBlurRender {

// Lines of the intermediate image worked out at a time: the resample out writes every destination pixel that
// the band's lines make, so a wider band gives longer runs, and its two scratch images still stay small.
inline constexpr int Band = 64;
// Rows of every line of a band resampled before the next rows of any: a segment of the band reads about
// Band × SegmentRows source pixels.
inline constexpr int SegmentRows = 64;

// Which line of the box the resample out of a destination row starts its sample in, as a function of x: the
// sampler's own arithmetic (clamp, floor), monotonic in x, so that a band's pixels in a row are one run.
class LineOfPixel {
public:
    LineOfPixel(const Plan& plan, int y) noexcept
        : m_Plan(plan)
        , m_Y(y)
        , m_Base(plan.sine * (double(y) + 0.5 - plan.pivotY) + plan.pivotX - 0.5) {}

    int operator()(int x) const noexcept {
        double at, unused;
        Blur::Turn::rt_turn_out(m_Plan.cosine, m_Plan.sine, m_Plan.pivotX, m_Plan.pivotY, x, m_Y, &at,
                                &unused);
        const double clamped = std::clamp(at, double(m_Plan.box.left), double(m_Plan.box.right - 1));
        return int(std::floor(clamped)) - m_Plan.box.left;
    }

    // The first x in [left, right) from which on the line is at least (cosine >= 0) or below (cosine < 0)
    // line; right when there is none. Worked out, then checked against operator() pixel by pixel.
    int Boundary(int line, int left, int right) const noexcept {
        const double c = m_Plan.cosine;
        auto past = [&](int x) { return c >= 0.0 ? (*this)(x) >= line : (*this)(x) < line; };
        if (c == 0.0) return past(left) ? left : right;
        const double guess = (double(m_Plan.box.left + line) - m_Base) / c + m_Plan.pivotX - 0.5;
        int x = int(std::clamp(std::ceil(guess), double(left), double(right)));
        for (int step = 0; step < 4; ++step) {
            if (x > left && past(x - 1))
                --x;
            else if (x < right && !past(x))
                ++x;
            else
                return x;
        }
        // Far from the guess (it cannot be, but the answer must be exact): search.
        int low = left, high = right;
        while (low < high) {
            const int middle = low + (high - low) / 2;
            if (past(middle))
                high = middle;
            else
                low = middle + 1;
        }
        return low;
    }

private:
    const Plan& m_Plan;
    int m_Y;
    double m_Base; // where the line of the row's pixel x is m_Base + cosine (x + 0.5 - pivotX): for guesses
};

#if RT_AVX2_BUILD
// Step 2 for one line of a format of four integer components with alpha last: the running sum of the
// portable loop below, with eight rows resolved at once. in[r] is the line's row r; rows first..last - 1 are
// blurred into out[r], the sum starting at row start.
template <Raster::PixelFormat F>
RT_TARGET_AVX2 void BlurLineAvx2(const typename Blur::Layout<F>::T* in, typename Blur::Layout<F>::T* out,
                                 int start, int first, int last, const Plan& plan, float weight) noexcept {
    using L = Blur::Layout<F>;
    constexpr int N = 4;
    const int whole = plan.whole;
    __m128i sum = _mm_setzero_si128();
    for (int k = start - whole; k <= start + whole; ++k)
        sum = _mm_add_epi32(sum, Blur::Avx2::Premultiplied(in, k));
    alignas(16) std::uint32_t sums[8][N], outers[8][N];
    const bool fractional = plan.fraction > 0.0f;
    int pending = 0;
    for (int b = start; b < last; ++b) {
        if (b > start)
            sum = _mm_sub_epi32(_mm_add_epi32(sum, Blur::Avx2::Premultiplied(in, b + whole)),
                                Blur::Avx2::Premultiplied(in, b - whole - 1));
        if (b < first) continue;
        _mm_store_si128(reinterpret_cast<__m128i*>(sums[pending]), sum);
        if (fractional)
            _mm_store_si128(reinterpret_cast<__m128i*>(outers[pending]),
                            _mm_add_epi32(Blur::Avx2::Premultiplied(in, b - whole - 1),
                                          Blur::Avx2::Premultiplied(in, b + whole + 1)));
        if (++pending == 8) {
            Blur::Avx2::ResolveSums8(sums, fractional ? outers : nullptr, plan.fraction, weight,
                                     out + std::ptrdiff_t(b - 7) * N);
            pending = 0;
        }
    }
    for (int i = 0; i < pending; ++i) {
        float total[N];
        for (int k = 0; k < N; ++k) {
            total[k] = float(sums[i][k]);
            if (fractional) total[k] += plan.fraction * float(outers[i][k]);
        }
        L::Resolve(total, weight, out + std::ptrdiff_t(last - pending + i) * N);
    }
}
#endif

template <Raster::PixelFormat F>
RenderPath Run(const RenderTarget& target, const Kernel::RectT<int>& rect, const Plan& plan) {
    using L = Blur::Layout<F>;
    using T = typename L::T;
    using Acc = typename L::Acc;
    constexpr int N = L::N;
    const Raster::DynamicBuffer& source = *target.source.pixels;
    Raster::DynamicBuffer& destination = *target.destination.pixels;
    const Raster::DynamicBuffer* mask = target.mask ? target.mask.pixels.Get() : nullptr;
    const int reach = plan.Reach();
    const int width = plan.box.Width();
    const int height = plan.box.Height();
    const double c = plan.cosine, s = plan.sine, px = plan.pivotX, py = plan.pivotY;
    const int period = L::IsFloat ? RestartPeriod(plan.whole) : 0;
    const int lead = period; // rows before the box's first blurred row that a float restart may need

    // The intermediate images are stored transposed: each row of a scratch buffer is one column of the box,
    // a line along the motion, so that the blur and the resample in run through contiguous memory. The
    // lines are worked out a band at a time, and only the rows of each line that the resample out reads
    // (with the blur's reach around them).
    const std::vector<RowRange> needed = NeededRows(rect, plan);
    // Rotated rows (from -lead) whose samples line j needs: the blurred rows, the reach on both sides and,
    // for floats, back to the restart before the first.
    auto sampledRows = [&](int j) {
        const RowRange range = needed[std::size_t(j)];
        if (range.first >= range.last) return range;
        const int from =
            L::IsFloat ? range.first - FloorMod(plan.box.top + range.first, period) : range.first;
        return RowRange{from, range.last + 2 * reach};
    };

    // Both scratch images live for this call only; the counted references free them on every way out.
    const int lines = std::min(Band + 1, width);
    const Kernel::Counted<Raster::DynamicBuffer> rotated =
        Raster::DynamicBuffer::Create(lead + height + 2 * reach, lines, F);
    if (!rotated) return RenderPath::Failed;
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    const Kernel::Counted<Raster::DynamicBuffer> blurred = Raster::DynamicBuffer::Create(height, lines, F);
    if (!blurred) return RenderPath::Failed;

    const Blur::RowGrid<F> sourceGrid{source};
    const float weight = float(double(2 * plan.whole + 1) + 2.0 * double(plan.fraction));
    const int channelMask = target.channelMask;
    const bool writesAll =
        channelMask < 0 || (channelMask & Raster::AllChannelsMask(F)) == Raster::AllChannelsMask(F);
    // Destination pixels whose samples start in lines [first, first + Band) need lines first to
    // first + Band inclusive; the next band starts at the last of them again.
    for (int first = 0; first < width; first += Band) {
        if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
        const int end = std::min(first + Band, width);
        const int count = std::min(end + 1, width) - first;

        // 1. Resample the source into the band's rotated lines, a segment of rows of every line at a time:
        // the band's lines lie side by side, so a segment of all of them reads a compact patch of the source
        // that stays in the first-level cache, where a whole line at a time would sweep hundreds of source
        // rows before the next line came back to them. Every sample position is worked out from its own
        // intermediate coordinates, never stepped along the line, so a pixel depends neither on the tile nor
        // on the segments.
        int lowest = 0;
        for (int i = 0; i < count; ++i)
            lowest = std::min(lowest, sampledRows(first + i).first);
        for (int segment = lowest;; segment += SegmentRows) {
            bool more = false;
            for (int i = 0; i < count; ++i) {
                const int j = first + i;
                const RowRange rows = sampledRows(j);
                const int from = std::max(rows.first, segment),
                          to = std::min(rows.last, segment + SegmentRows);
                more = more || rows.last > segment + SegmentRows;
                if (from >= to) continue;
                T* line = rotated->Row<T>(i) + std::ptrdiff_t(lead) * N;
                auto position = [&](int r, double& x, double& y) {
                    Blur::Turn::rt_turn_in(c, s, px, py, plan.box.left + j, plan.box.top - reach + r, &x, &y);
                };
                Blur::SampleBilinearRun<F>(sourceGrid, from, to, position, line);
            }
            if (!more) break;
        }
        if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;

        // 2. Blur along each line: a running premultiplied sum over 2·whole + 1 rows, so a pixel costs the
        // same whatever the radius; a fractional radius adds the two rows beyond at weight fraction.
        for (int i = 0; i < count; ++i) {
            const int j = first + i;
            const RowRange range = needed[std::size_t(j)];
            if (range.first >= range.last) continue;
            // in[r] is rotated row r; blurred row b is centred on rotated row b + reach.
            const T* in = rotated->Row<T>(i) + std::ptrdiff_t(lead + reach) * N;
            T* out = blurred->Row<T>(i);
            const int start = sampledRows(j).first;
#if RT_AVX2_BUILD
            if constexpr (!L::IsFloat && N == 4 && L::A == 3) {
                if (Kernel::HasAvx2()) {
                    BlurLineAvx2<F>(in, out, start, range.first, range.last, plan, weight);
                    continue;
                }
            }
#endif
            Acc sum[N] = {};
            // Four-component pixels resolve four rows at a time.
            constexpr int Batch = N == 4 && L::A == 3 ? 4 : 1;
            float totals[Batch][N];
            int pending = 0;
            for (int b = start; b < range.last; ++b) {
                if (b == start || (L::IsFloat && FloorMod(plan.box.top + b, period) == 0)) {
                    std::fill_n(sum, N, Acc(0));
                    for (int k = b - plan.whole; k <= b + plan.whole; ++k)
                        L::Accumulate(sum, in + std::ptrdiff_t(k) * N);
                } else {
                    L::Accumulate(sum, in + std::ptrdiff_t(b + plan.whole) * N);
                    L::Remove(sum, in + std::ptrdiff_t(b - plan.whole - 1) * N);
                }
                if (b < range.first) continue;
                float* total = totals[pending];
                for (int k = 0; k < N; ++k)
                    total[k] = float(sum[k]);
                if (plan.fraction > 0.0f) {
                    Acc outer[N] = {};
                    L::Accumulate(outer, in + std::ptrdiff_t(b - plan.whole - 1) * N);
                    L::Accumulate(outer, in + std::ptrdiff_t(b + plan.whole + 1) * N);
                    for (int k = 0; k < N; ++k)
                        total[k] += plan.fraction * float(outer[k]);
                }
                if constexpr (Batch == 4) {
                    if (++pending == Batch) {
                        L::Resolve4(totals, weight, out + std::ptrdiff_t(b - 3) * N);
                        pending = 0;
                    }
                } else {
                    L::Resolve(total, weight, out + std::ptrdiff_t(b) * N);
                }
            }
            for (int k = 0; k < pending; ++k)
                L::Resolve(totals[k], weight, out + std::ptrdiff_t(range.last - pending + k) * N);
        }
        if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;

        // 3. Resample the band back into the destination pixels whose samples start in it, through the
        // inverse rotation. Positions stay in intermediate coordinates, so that a sample's weights do not
        // depend on where this rectangle's box begins.
        const Blur::LineGrid<F> blurredGrid{*blurred, plan.box.left + first, plan.box.top, count};
        for (int y = rect.top; y < rect.bottom; ++y) {
            const LineOfPixel lineOf(plan, y);
            const int a = lineOf.Boundary(first, rect.left, rect.right);
            const int b = lineOf.Boundary(end, rect.left, rect.right);
            const int left = c < 0.0 ? b : a, right = c < 0.0 ? a : b;
            if (left >= right) continue;
            T* out = destination.Row<T>(y);
            const T* original = source.Row<T>(y);
            const std::uint8_t* weights = mask ? mask->Row<std::uint8_t>(y) : nullptr;
            auto position = [&](int x, double& sx, double& sy) {
                Blur::Turn::rt_turn_out(c, s, px, py, x, y, &sx, &sy);
            };
            if (!weights && writesAll) { // straight into the destination
                Blur::SampleBilinearRun<F>(blurredGrid, left, right, position, out);
                continue;
            }
            for (int x = left; x < right; ++x) {
                double sx, sy;
                position(x, sx, sy);
                T value[N];
                Blur::SampleBilinear<F>(blurredGrid, sx, sy, value);
                L::M::rt_write_masked(value, original + std::size_t(x) * N, weights ? weights[x] : 255,
                                      channelMask, out + std::size_t(x) * N);
            }
        }
    }
    return RenderPath::Processor;
}

} // namespace RasterTools::MotionBlurRender

#define RT_INSTANTIATE_MOTION_BLUR(FORMAT)                                                                   \
    template RasterTools::RenderPath RasterTools::MotionBlurRender::Run<Raster::PixelFormat::FORMAT>(        \
        const RasterTools::RenderTarget&, const Kernel::RectT<int>&,                                         \
        const RasterTools::MotionBlurRender::Plan&);
