// The blurs' four- and eight-lane routines against the shared scalar source (BlurMath.h, which the device
// steps paste as text): bilinear samples, premultiplied sums and resolved sums equal bit for bit, over
// translucent and transparent neighbours, pixel centres, the grid's edges and locations beyond them.

#include "filters/blur/BlurPixels.h"
#include "host/raster/DynamicBuffer.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <random>
#include <vector>

namespace {

using Raster::PixelFormat;
using namespace RasterTools;

template <PixelFormat F>
struct Format {
    static constexpr PixelFormat Value = F;
};
using FourComponentFormats = ::testing::Types<Format<PixelFormat::RGBA8>, Format<PixelFormat::RGBA16>,
                                              Format<PixelFormat::RGBAUF>, Format<PixelFormat::LabA16>>;

template <class P>
class BlurLanes : public ::testing::Test {};
TYPED_TEST_SUITE(BlurLanes, FourComponentFormats);

template <PixelFormat F>
typename Blur::Layout<F>::T Component(std::mt19937& random, bool alpha) {
    using L = Blur::Layout<F>;
    const std::uint32_t kind = random() % 4;
    if (alpha && kind == 0) return typename L::T(L::Max); // opaque
    if (alpha && kind == 1) return typename L::T(0);      // transparent
    if constexpr (L::IsFloat)
        return std::uniform_real_distribution<float>(alpha ? 0.0f : -0.5f, alpha ? 1.0f : 1.5f)(random);
    else
        return typename L::T(random() % (std::uint32_t(L::Max) + 1));
}

template <PixelFormat F>
Kernel::Counted<Raster::DynamicBuffer> Grid(int width, int height, std::uint32_t seed) {
    using L = Blur::Layout<F>;
    auto image = Raster::DynamicBuffer::Create(width, height, F);
    std::mt19937 random(seed);
    for (int y = 0; y < height; ++y) {
        auto* row = image->template Row<typename L::T>(y);
        for (int i = 0; i < width * L::N; ++i)
            row[i] = Component<F>(random, i % L::N == L::A);
    }
    return image;
}

TYPED_TEST(BlurLanes, FourSamplesEqualFourSingleSamples) {
    constexpr PixelFormat F = TypeParam::Value;
    using L = Blur::Layout<F>;
    const auto image = Grid<F>(23, 17, 5);
    // A frame that does not start at the origin, as the motion blur's grids do.
    const Blur::RowGrid<F> grid{*image, -4, 9};
    std::mt19937 random(9);
    std::uniform_real_distribution<double> along(-8.0, 22.0), down(6.0, 29.0);
    int compared = 0;
    for (int round = 0; round < 20000; ++round) {
        double xs[4], ys[4];
        for (int i = 0; i < 4; ++i) {
            const std::uint32_t kind = random() % 4;
            xs[i] = kind == 0 ? double(int(random() % 30) - 6) : along(random); // pixel centres too
            ys[i] = kind == 1 ? double(int(random() % 24) + 7) : down(random);
        }
        typename L::T lanes[4 * L::N], single[4 * L::N], scalar[4 * L::N];
        Blur::SampleBilinear4<F>(grid, xs, ys, lanes);
        for (int i = 0; i < 4; ++i) {
            Blur::SampleBilinear<F>(grid, xs[i], ys[i], single + i * L::N);
            Blur::SampleBilinearScalar<F>(grid, xs[i], ys[i], scalar + i * L::N);
        }
        ASSERT_EQ(std::memcmp(lanes, scalar, sizeof lanes), 0)
            << "round " << round << ", first location (" << xs[0] << ", " << ys[0] << ")";
        ASSERT_EQ(std::memcmp(single, scalar, sizeof single), 0)
            << "round " << round << ", first location (" << xs[0] << ", " << ys[0] << ")";
        ++compared;
    }
    EXPECT_EQ(compared, 20000);
}

using LayerFormats =
    ::testing::Types<Format<PixelFormat::RGBA8>, Format<PixelFormat::RGBA16>, Format<PixelFormat::RGBAUF>,
                     Format<PixelFormat::IA8>, Format<PixelFormat::IA16>, Format<PixelFormat::CMYKA8>,
                     Format<PixelFormat::LabA16>>;
template <class P>
class BlurRuns : public ::testing::Test {};
TYPED_TEST_SUITE(BlurRuns, LayerFormats);

// Runs of samples take eight lanes where the processor has AVX2 (in every format), four otherwise, and the
// rest one by one; both grids, every run length around the batch sizes, and locations far outside the grid.
TYPED_TEST(BlurRuns, RunsOfSamplesEqualSingleSamples) {
    constexpr PixelFormat F = TypeParam::Value;
    using L = Blur::Layout<F>;
    using T = typename L::T;
    const auto image = Grid<F>(29, 19, 21);
    const Blur::RowGrid<F> rows{*image, 3, -5};
    const Blur::LineGrid<F> lines{*image, -7, 2, 17}; // 17 of the 19 rows, each a column of the frame
    const auto thin = Grid<F>(1, 19, 23);
    std::mt19937 random(31);
    std::uniform_real_distribution<double> anywhere(-12.0, 40.0);
    std::vector<double> xs(160), ys(160);
    std::vector<T> run(160 * L::N), single(160 * L::N);
    for (int round = 0; round < 400; ++round) {
        const int first = int(random() % 5), last = first + round % 150;
        for (std::size_t i = 0; i < xs.size(); ++i) {
            const auto kind = random() % 5;
            xs[i] = kind == 0 ? double(int(random() % 40) - 10) : anywhere(random); // pixel centres too
            ys[i] = kind <= 1 ? double(int(random() % 30) - 8) : anywhere(random);
        }
        auto position = [&](int i, double& x, double& y) {
            x = xs[std::size_t(i)];
            y = ys[std::size_t(i)];
        };
        auto check = [&](const auto& grid, const char* name) {
            std::fill(run.begin(), run.end(), T(7));
            std::fill(single.begin(), single.end(), T(7));
            Blur::SampleBilinearRun<F>(grid, first, last, position, run.data());
            for (int i = first; i < last; ++i)
                Blur::SampleBilinearScalar<F>(grid, xs[std::size_t(i)], ys[std::size_t(i)],
                                              single.data() + i * L::N);
            for (int i = 0; i < 160; ++i)
                ASSERT_EQ(std::memcmp(run.data() + i * L::N, single.data() + i * L::N, sizeof(T) * L::N), 0)
                    << name << ", run " << first << ".." << last << ", sample " << i << " at ("
                    << xs[std::size_t(i)] << ", " << ys[std::size_t(i)] << ")";
        };
        check(rows, "rows");
        check(lines, "lines");
        // Grids one pixel across, whose neighbours cannot be fetched in pairs.
        check(Blur::RowGrid<F>{*thin, 0, 2}, "rows of one column");
        check(Blur::LineGrid<F>{*thin, 1, -3, 17}, "lines of one pixel");
    }
}

TYPED_TEST(BlurLanes, FourResolvesEqualFourSingleResolves) {
    constexpr PixelFormat F = TypeParam::Value;
    using L = Blur::Layout<F>;
    std::mt19937 random(13);
    for (int round = 0; round < 20000; ++round) {
        const int rows = 1 + int(random() % 40);
        const float weight = float(rows) + (random() % 2 ? 0.5f : 0.0f);
        float sums[4][4];
        for (auto& sum : sums) {
            // Sums of premultiplied rows: alpha from none to every row opaque, colour up to what alpha
            // allows.
            const float coverage = random() % 5 == 0 ? 0.0f : float(random() % 1001) / 1000.0f;
            sum[3] = coverage * L::Max * weight;
            for (int c = 0; c < 3; ++c)
                sum[c] = float(random() % 1001) / 1000.0f * sum[3] * L::PremultipliedScale;
        }
        typename L::T lanes[16], single[16];
        L::Resolve4(sums, weight, lanes);
        for (int i = 0; i < 4; ++i)
            L::M::rt_resolve(sums[i], 1.0f / weight, single + 4 * i);
        ASSERT_EQ(std::memcmp(lanes, single, sizeof lanes), 0) << "round " << round;
    }
}

// The running sums' four-lane premultiply (integer formats of four components) against the shared one.
TYPED_TEST(BlurLanes, VectorSumsEqualTheSharedSums) {
    constexpr PixelFormat F = TypeParam::Value;
    using L = Blur::Layout<F>;
    const auto image = Grid<F>(64, 8, 17);
    typename L::Acc lanes[4] = {}, scalar[4] = {};
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 64; ++x) {
            const typename L::T* p = image->template Row<typename L::T>(y) + x * L::N;
            L::Accumulate(lanes, p);
            L::M::rt_accumulate(scalar, p);
            if (x % 3 == 0) {
                L::Remove(lanes, p);
                L::M::rt_remove(scalar, p);
            }
            ASSERT_EQ(std::memcmp(lanes, scalar, sizeof lanes), 0) << "at (" << x << ", " << y << ")";
        }
}

} // namespace
