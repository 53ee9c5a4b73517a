// The span conversions through working planes against the per-pixel Convert bodies: byte for byte, for
// every pair of formats that has them, over random pixels and the awkward floats (NaN, infinities, values
// just below a rounding half, negative zero, far out of range). The AVX2 kits against the portable loops
// one step at a time, where the processor has AVX2.

#include "host/kernel/Simd.h"
#include "pipeline/Conversions.h"
#if RT_AVX2_BUILD
#include "pipeline/PlanarAvx2.h"
#endif

#include <gtest/gtest.h>

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <memory>
#include <random>

namespace {

using Raster::PixelFormat;
using Raster::StoredPixel;

constexpr float Awkward[] = {0.0f,
                             -0.0f,
                             0.5f / 255.0f,
                             0.49999997f,
                             0.5f,
                             127.5f / 255.0f,
                             0.50196081f,
                             1.0f,
                             1.0000001f,
                             -0.2f,
                             1.7f,
                             2.0f,
                             -1e30f,
                             1e30f,
                             std::numeric_limits<float>::infinity(),
                             -std::numeric_limits<float>::infinity(),
                             std::numeric_limits<float>::quiet_NaN(),
                             std::numeric_limits<float>::denorm_min(),
                             -std::numeric_limits<float>::denorm_min(),
                             std::numeric_limits<float>::max(),
                             -std::numeric_limits<float>::max(),
                             -std::numeric_limits<float>::quiet_NaN(),
                             0.99999994f,
                             254.5f / 255.0f,
                             0.49999997f / 255.0f,
                             32767.5f / 65535.0f,
                             65534.5f / 65535.0f};

template <PixelFormat F>
void FillRandom(StoredPixel<F>* pixels, int n, std::mt19937& random) {
    auto* bytes = reinterpret_cast<unsigned char*>(pixels);
    if constexpr (F == PixelFormat::RGBAUF) {
        std::uniform_int_distribution<int> pick(0, int(std::size(Awkward)) - 1);
        std::uniform_real_distribution<float> spread(-0.5f, 1.5f);
        auto* floats = reinterpret_cast<float*>(pixels);
        for (int i = 0; i < n * 4; ++i)
            floats[i] = random() % 3 == 0 ? Awkward[pick(random)] : spread(random);
    } else {
        for (std::size_t i = 0; i < std::size_t(n) * sizeof(StoredPixel<F>); ++i)
            bytes[i] = static_cast<unsigned char>(random());
        if constexpr (F == PixelFormat::RGBA8 || F == PixelFormat::CMYKA8 || F == PixelFormat::IA8) {
            // The corners of the range too.
            for (int i = 0; i < n; i += 5)
                std::memset(bytes + i * sizeof(StoredPixel<F>), random() % 2 ? 0xff : 0x00,
                            sizeof(StoredPixel<F>));
        }
    }
}

template <PixelFormat Source, PixelFormat Dest>
void ExpectSpanMatchesBodies() {
    if constexpr (Source != Dest && RasterTools::PlanarConvert::HasPlanarPair<Source, Dest>) {
        using Conversion = Raster::PixelConversion<Source, Dest>;
        std::mt19937 random(static_cast<unsigned>(Source) * 31u + static_cast<unsigned>(Dest));
        for (int round = 0; round < 400; ++round) {
            const int n = round % (Raster::SpanLength + 1); // every span length, none and the short ones too
            // The source exactly n long (so that a sanitizer sees reads past it), the results with room after
            // n that must stay as it was.
            const auto in = std::make_unique<StoredPixel<Source>[]>(std::size_t(std::max(n, 1)));
            constexpr int Room = Raster::SpanLength + 8;
            StoredPixel<Dest> span[Room], portable[Room], single[Raster::SpanLength];
            FillRandom<Source>(in.get(), n, random);
            std::memset(span, 0xa5, sizeof span);
            std::memset(portable, 0xa5, sizeof portable);
            std::memset(single, 0, sizeof single);
            // The library's span (the AVX2 form where the processor has it) and the portable loops.
            Conversion::ConvertSpan(in.get(), span, n);
            RasterTools::PlanarConvert::ConvertSpanInline<Source, Dest>(in.get(), portable, n);
            for (int i = 0; i < n; ++i)
                single[i] = Conversion::Convert(in[i]);
            for (int i = 0; i < n; ++i) {
                ASSERT_EQ(std::memcmp(&span[i], &single[i], sizeof(StoredPixel<Dest>)), 0)
                    << Raster::GetPixelFormatName(Source) << " -> " << Raster::GetPixelFormatName(Dest)
                    << ", pixel " << i << " of " << n;
                ASSERT_EQ(std::memcmp(&portable[i], &single[i], sizeof(StoredPixel<Dest>)), 0)
                    << "portable " << Raster::GetPixelFormatName(Source) << " -> "
                    << Raster::GetPixelFormatName(Dest) << ", pixel " << i << " of " << n;
            }
            const auto untouched = [&](const StoredPixel<Dest>* pixels) {
                const auto* bytes = reinterpret_cast<const unsigned char*>(pixels + n);
                return std::all_of(bytes, bytes + (Room - n) * sizeof(StoredPixel<Dest>),
                                   [](unsigned char b) { return b == 0xa5; });
            };
            ASSERT_TRUE(untouched(span)) << Raster::GetPixelFormatName(Source) << " -> "
                                         << Raster::GetPixelFormatName(Dest) << " wrote past " << n;
            ASSERT_TRUE(untouched(portable)) << "portable " << Raster::GetPixelFormatName(Source) << " -> "
                                             << Raster::GetPixelFormatName(Dest) << " wrote past " << n;
        }
    }
}

template <PixelFormat Source, PixelFormat... Dest>
void ExpectFrom() {
    (ExpectSpanMatchesBodies<Source, Dest>(), ...);
}

TEST(PlanarConversions, EqualThePerPixelBodiesForEveryPair) {
#define RT_TO_ALL(S)                                                                                         \
    ExpectFrom<PixelFormat::S, PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF,                 \
               PixelFormat::IA8, PixelFormat::IA16, PixelFormat::CMYKA8>()
    RT_TO_ALL(RGBA8);
    RT_TO_ALL(RGBA16);
    RT_TO_ALL(RGBAUF);
    RT_TO_ALL(IA8);
    RT_TO_ALL(IA16);
    RT_TO_ALL(CMYKA8);
#undef RT_TO_ALL
}

// The integer forms of the 8 <-> 16-bit conversions against the bodies for every component value, in every
// channel (alpha included).
template <PixelFormat Source, PixelFormat Dest>
void ExpectEveryValueMatchesBodies() {
    using Conversion = Raster::PixelConversion<Source, Dest>;
    using Component = Raster::FormatComponent<Source>;
    constexpr int Components = Raster::GetChannelCount(Source);
    constexpr int Values = int(std::numeric_limits<Component>::max()) + 1;
    StoredPixel<Source> in[Raster::SpanLength];
    StoredPixel<Dest> span[Raster::SpanLength];
    for (int first = 0; first < Values; first += Raster::SpanLength) {
        for (int i = 0; i < Raster::SpanLength; ++i) {
            Component components[Components];
            for (int c = 0; c < Components; ++c) // each channel sees every value, shifted by its index
                components[c] = Component((first + i + c * 7) % Values);
            std::memcpy(&in[i], components, sizeof components);
        }
        Conversion::ConvertSpan(in, span, Raster::SpanLength);
        for (int i = 0; i < Raster::SpanLength; ++i) {
            const StoredPixel<Dest> single = Conversion::Convert(in[i]);
            ASSERT_EQ(std::memcmp(&span[i], &single, sizeof single), 0)
                << Raster::GetPixelFormatName(Source) << " -> " << Raster::GetPixelFormatName(Dest)
                << ", value " << first + i;
        }
    }
}

TEST(PlanarConversions, IntegerWideningAndNarrowingEqualTheBodiesForEveryValue) {
    static_assert(RasterTools::PlanarConvert::IsWidening<PixelFormat::RGBA8, PixelFormat::RGBA16>);
    static_assert(RasterTools::PlanarConvert::IsNarrowing<PixelFormat::IA16, PixelFormat::IA8>);
    ExpectEveryValueMatchesBodies<PixelFormat::RGBA8, PixelFormat::RGBA16>();
    ExpectEveryValueMatchesBodies<PixelFormat::RGBA16, PixelFormat::RGBA8>();
    ExpectEveryValueMatchesBodies<PixelFormat::IA8, PixelFormat::IA16>();
    ExpectEveryValueMatchesBodies<PixelFormat::IA16, PixelFormat::IA8>();
}

#if RT_AVX2_BUILD

namespace PC = RasterTools::PlanarConvert;

template <PixelFormat F>
RT_TARGET_AVX2 void KitToWorking(const StoredPixel<F>* in, PC::WorkingPlanes& w, int n) {
    PC::Avx2::Kit<F>::ToWorking(in, w, n);
}
template <PixelFormat F>
RT_TARGET_AVX2 void KitFromWorking(const PC::WorkingPlanes& w, StoredPixel<F>* out, int n) {
    PC::Avx2::Kit<F>::FromWorking(w, out, n);
}

// A working float: an awkward one, any bit pattern (NaNs of every payload and sign, denormals, huge), an
// ordinary colour, or one just either side of a rounding half of 255 or 65535.
float AnyWorkingFloat(std::mt19937& random) {
    switch (random() % 4) {
    case 0:
        return Awkward[random() % std::size(Awkward)];
    case 1:
        return std::bit_cast<float>(std::uint32_t(random()));
    case 2:
        return std::uniform_real_distribution<float>(-0.5f, 1.5f)(random);
    default: {
        const float maximum = random() % 2 ? 255.0f : 65535.0f;
        const float half = (float(random() % std::uint32_t(maximum)) + 0.5f) / maximum;
        const int step = int(random() % 5) - 2;
        return std::bit_cast<float>(std::bit_cast<std::uint32_t>(half) + std::uint32_t(step));
    }
    }
}

bool SameFloats(const float* a, const float* b, int n) {
    return std::memcmp(a, b, std::size_t(n) * sizeof(float)) == 0;
}

// Each AVX2 kit's two steps against Planar's for every length up to a span: the planes (every bit) from
// random stored pixels, and the stored pixels (every byte, none written past n) from random planes.
template <PixelFormat F>
void ExpectKitMatchesPlanar() {
    std::mt19937 random(static_cast<unsigned>(F) + 7u);
    constexpr int Room = Raster::SpanLength + 8;
    for (int round = 0; round < 2000; ++round) {
        const int n = round % (Raster::SpanLength + 1);
        const auto in = std::make_unique<StoredPixel<F>[]>(std::size_t(std::max(n, 1)));
        if constexpr (F == PixelFormat::RGBAUF) {
            auto* floats = reinterpret_cast<float*>(in.get());
            for (int i = 0; i < 4 * n; ++i)
                floats[i] = AnyWorkingFloat(random);
        } else {
            FillRandom<F>(in.get(), n, random);
        }
        PC::WorkingPlanes kit, planar;
        std::memset(&kit, 0, sizeof kit);
        std::memset(&planar, 0, sizeof planar);
        KitToWorking<F>(in.get(), kit, n);
        PC::Planar<F>::ToWorking(in.get(), planar, n);
        ASSERT_TRUE(SameFloats(kit.r, planar.r, n) && SameFloats(kit.g, planar.g, n) &&
                    SameFloats(kit.b, planar.b, n) && SameFloats(kit.a, planar.a, n))
            << Raster::GetPixelFormatName(F) << " to working, " << n << " pixels";

        PC::WorkingPlanes planes;
        for (float* plane : {planes.r, planes.g, planes.b, planes.a})
            for (int i = 0; i < Raster::SpanLength; ++i)
                plane[i] = AnyWorkingFloat(random);
        if (round % 3 == 0) // grey too, for the black of CMYK and the intensity of IA
            for (int i = 0; i < Raster::SpanLength; ++i)
                planes.g[i] = planes.b[i] = planes.r[i];
        StoredPixel<F> fromKit[Room], fromPlanar[Room];
        std::memset(fromKit, 0xa5, sizeof fromKit);
        std::memset(fromPlanar, 0xa5, sizeof fromPlanar);
        KitFromWorking<F>(planes, fromKit, n);
        PC::Planar<F>::FromWorking(planes, fromPlanar, n);
        ASSERT_EQ(std::memcmp(fromKit, fromPlanar, sizeof fromKit), 0)
            << Raster::GetPixelFormatName(F) << " from working, " << n << " pixels";
    }
}

TEST(PlanarConversions, Avx2KitsEqualThePortableLoops) {
    if (!Kernel::HasAvx2()) GTEST_SKIP() << "no AVX2";
    ExpectKitMatchesPlanar<PixelFormat::RGBA8>();
    ExpectKitMatchesPlanar<PixelFormat::RGBA16>();
    ExpectKitMatchesPlanar<PixelFormat::RGBAUF>();
    ExpectKitMatchesPlanar<PixelFormat::IA8>();
    ExpectKitMatchesPlanar<PixelFormat::IA16>();
    ExpectKitMatchesPlanar<PixelFormat::CMYKA8>();
}

// The kits' rounding of a value already within [0, 65535] against the portable one, for the floats from
// first to last at step apart.
RT_TARGET_AVX2 std::uint32_t FirstRoundingDifference(std::uint32_t first, std::uint32_t last,
                                                     std::uint32_t step) {
    for (std::uint64_t bits = first; bits <= last; bits += 8 * std::uint64_t(step)) {
        alignas(32) float values[8];
        alignas(32) int rounded[8];
        for (int j = 0; j < 8; ++j)
            values[j] = std::bit_cast<float>(std::uint32_t(std::min<std::uint64_t>(bits + j * step, last)));
        _mm256_store_si256(reinterpret_cast<__m256i*>(rounded),
                           PC::Avx2::Lanes::RoundInRange(_mm256_load_ps(values)));
        for (int j = 0; j < 8; ++j)
            if (rounded[j] != PC::RoundInRange(values[j])) return std::bit_cast<std::uint32_t>(values[j]);
    }
    return std::numeric_limits<std::uint32_t>::max();
}

// Every float from a quarter up (below it both round to 0, the sum with the near half staying under 1; a
// sample of them is checked too).
TEST(PlanarConversions, Avx2RoundingEqualsThePortableOneOverTheWholeRange) {
    if (!Kernel::HasAvx2()) GTEST_SKIP() << "no AVX2";
    constexpr std::uint32_t None = std::numeric_limits<std::uint32_t>::max();
    const std::uint32_t quarter = std::bit_cast<std::uint32_t>(0.25f);
    const std::uint32_t below = FirstRoundingDifference(0, quarter, 97);
    EXPECT_EQ(below, None) << "at " << std::bit_cast<float>(below);
    const std::uint32_t above = FirstRoundingDifference(quarter, std::bit_cast<std::uint32_t>(65535.0f), 1);
    EXPECT_EQ(above, None) << "at " << std::bit_cast<float>(above);
}

#endif

// Lab goes through the colour manager a pixel at a time and has no planar form; the pairs with it keep
// their per-pixel conversion.
static_assert(!RasterTools::PlanarConvert::HasPlanarPair<PixelFormat::RGBA8, PixelFormat::LabA16>);
static_assert(!RasterTools::PlanarConvert::HasPlanarPair<PixelFormat::LabA16, PixelFormat::RGBA8>);

} // namespace
