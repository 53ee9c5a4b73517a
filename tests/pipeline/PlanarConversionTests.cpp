// The span conversions through working planes against the per-pixel Convert bodies: byte for byte, for
// every pair of formats that has them, over random pixels and the awkward floats (NaN, infinities, values
// just below a rounding half, negative zero, far out of range).

#include "pipeline/Conversions.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>
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
            const int n = 1 + round % Raster::SpanLength; // every span length, the short ones included
            StoredPixel<Source> in[Raster::SpanLength];
            StoredPixel<Dest> span[Raster::SpanLength], portable[Raster::SpanLength],
                single[Raster::SpanLength];
            FillRandom<Source>(in, n, random);
            std::memset(span, 0, sizeof span);
            std::memset(portable, 0, sizeof portable);
            std::memset(single, 0, sizeof single);
            // The library's span (the AVX2 form where the processor has it) and the portable loops.
            Conversion::ConvertSpan(in, span, n);
            RasterTools::PlanarConvert::ConvertSpanInline<Source, Dest>(in, portable, n);
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

// Lab goes through the colour manager a pixel at a time and has no planar form; the pairs with it keep
// their per-pixel conversion.
static_assert(!RasterTools::PlanarConvert::HasPlanarPair<PixelFormat::RGBA8, PixelFormat::LabA16>);
static_assert(!RasterTools::PlanarConvert::HasPlanarPair<PixelFormat::LabA16, PixelFormat::RGBA8>);

} // namespace
