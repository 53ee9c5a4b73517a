// The vertical edge detect's span kernels: the gradient across the components of a span, so that the
// compiler vectorises it whatever the channel count.
#include "filters/tonal/EdgeDetectStages.h"
#include "host/kernel/Simd.h"

#include <algorithm>
#include <cstdlib>
#include <limits>

namespace RasterTools::EdgeDetectSpan {

namespace {

// A neighbour one pixel left or right is `Channels` components away, so the whole span is one flat loop.
// 8-bit sums stay within ±1020 and fit 16 bits (twice the lanes of 32-bit sums); 16-bit sums need 32.
template <int Channels, class Component>
[[gnu::always_inline]] inline void Flat(const Component* __restrict above, const Component* __restrict row,
                                        const Component* __restrict below, int count,
                                        Component* __restrict out) noexcept {
    constexpr int C = Channels;
    if constexpr (std::is_integral_v<Component>) {
        using Sum = std::conditional_t<sizeof(Component) == 1, std::int16_t, std::int32_t>;
        constexpr Sum Maximum = Sum(std::numeric_limits<Component>::max());
        for (int k = 0; k < count * C; ++k) {
            const Sum top = Sum(Sum(above[k + C]) - Sum(above[k - C]));
            const Sum middle = Sum(Sum(row[k + C]) - Sum(row[k - C]));
            const Sum bottom = Sum(Sum(below[k + C]) - Sum(below[k - C]));
            const Sum sum = Sum(top + Sum(middle * 2) + bottom);
            const Sum magnitude = sum < 0 ? Sum(-sum) : sum;
            out[k] = Component(magnitude < Maximum ? magnitude : Maximum);
        }
    } else {
        // The accumulation order of the definition, lane by lane: no reassociation.
        for (int k = 0; k < count * C; ++k) {
            float acc = 0.0f - above[k - C];
            acc = acc + above[k + C];
            acc = acc - row[k - C] * 2.0f;
            acc = acc + row[k + C] * 2.0f;
            acc = acc - below[k - C];
            acc = acc + below[k + C];
            out[k] = std::fabs(acc);
        }
    }
    for (int i = 0; i < count; ++i) // alpha is the centre's
        out[i * C + C - 1] = row[i * C + C - 1];
}

template <int Channels, class Component>
[[gnu::always_inline]] inline void Span(const Component* above, const Component* row, const Component* below,
                                        int n, Component* out) noexcept {
    if (n == Raster::SpanLength)
        Flat<Channels>(above, row, below, Raster::SpanLength, out);
    else
        Flat<Channels>(above, row, below, n, out);
}

template <class Component>
[[gnu::always_inline]] inline void Dispatch(const Component* above, const Component* row,
                                            const Component* below, int channels, int n,
                                            Component* out) noexcept {
    switch (channels) {
    case 2:
        return Span<2>(above, row, below, n, out);
    case 4:
        return Span<4>(above, row, below, n, out);
    case 5:
        return Span<5>(above, row, below, n, out);
    default:
        return;
    }
}

} // namespace

RT_AVX2_DISPATCH(Gradient, Dispatch,
                 (const std::uint8_t* above, const std::uint8_t* row, const std::uint8_t* below, int channels,
                  int n, std::uint8_t* out),
                 (above, row, below, channels, n, out))
RT_AVX2_DISPATCH(Gradient, Dispatch,
                 (const std::uint16_t* above, const std::uint16_t* row, const std::uint16_t* below,
                  int channels, int n, std::uint16_t* out),
                 (above, row, below, channels, n, out))
RT_AVX2_DISPATCH(Gradient, Dispatch,
                 (const float* above, const float* row, const float* below, int channels, int n, float* out),
                 (above, row, below, channels, n, out))

} // namespace RasterTools::EdgeDetectSpan
