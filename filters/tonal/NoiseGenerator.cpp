// The add-noise generator as kernel text, and its span kernels for the processor.
#include "filters/tonal/NoiseGenerator.h"

#include "host/kernel/Simd.h"
#include "host/raster/KernelText.h"

#include <array>
#include <bit>
#include <cmath>
#include <cstring>
#include <limits>
#include <string>
#include <type_traits>

namespace RasterTools::NoiseGenerator {

const char* GetNoiseGeneratorText() {
    static const std::string text = [] {
        std::string names = "enum {";
        for (const auto& [name, value] : SamplerIndexNames)
            names += std::string(" ") + name + " = " + std::to_string(value) + ",";
        names.back() = ' ';
        return names + "};\n" + RASTER_KERNEL_STRINGIFY(RT_NOISE_GENERATOR_SOURCE);
    }();
    return text.c_str();
}

namespace {

std::array<Jump, MaxJump + 1> BuildJumps() {
    std::array<Jump, MaxJump + 1> jumps{};
    // k steps from 0 give the increment; from 1, multiplier plus increment.
    uint fromZero = 0, fromOne = 1;
    jumps[0] = {1u, 0u};
    for (int k = 1; k <= MaxJump; ++k) {
        (void)RandomGet(&fromZero);
        (void)RandomGet(&fromOne);
        jumps[std::size_t(k)] = {fromOne - fromZero, fromZero};
    }
    return jumps;
}

const std::array<Jump, MaxJump + 1> Jumps = BuildJumps();

// Far inside the int range, so that a floor needs no saturation.
constexpr float SmallCoordinate = 4194304.0f; // 2^22

// Pixel by pixel, channel by channel: with the channel count fixed the compiler vectorises across the span;
// whole spans (all but a row's ends) also get a loop of known length.
template <int Channels, class Component>
[[gnu::always_inline]] inline void AddNoiseToPixels(Component* __restrict components,
                                                    const SpanChannelNoise* __restrict noise,
                                                    int count) noexcept {
    constexpr bool Integer = std::is_integral_v<Component>;
    constexpr float Maximum = Integer ? float(std::numeric_limits<Component>::max()) : 1.0f;
    // Alpha goes through the loop too and is selected back unchanged: a loop that skipped it would leave a
    // gap in every pixel, which the vectoriser handles by running the last span scalar.
    for (int i = 0; i < count; ++i)
        for (int c = 0; c < Channels; ++c) {
            const Component original = components[i * Channels + c];
            const float sum = float(original) + noise[c][i] * Maximum;
            Component changed;
            if constexpr (Integer) // NoiseToInteger as selects: truncation, the range, and NaN to 0
                changed = Component(int(sum > 0.0f ? (sum < Maximum ? sum : Maximum) : 0.0f));
            else
                changed = sum;
            components[i * Channels + c] = c == Channels - 1 ? original : changed;
        }
}

// Four 8-bit components are one 32-bit word: the lanes stay contiguous, with the channels taken apart by
// shifts. The same arithmetic as above.
inline std::uint32_t NoisyByte(std::uint32_t value, float noise) noexcept {
    const float sum = float(int(value)) + noise * 255.0f;
    return std::uint32_t(int(sum > 0.0f ? (sum < 255.0f ? sum : 255.0f) : 0.0f));
}
template <>
[[gnu::always_inline]] inline void AddNoiseToPixels<4, std::uint8_t>(std::uint8_t* __restrict components,
                                                                     const SpanChannelNoise* __restrict noise,
                                                                     int count) noexcept {
    alignas(64) std::uint32_t words[SpanPixels];
    std::memcpy(words, components, std::size_t(count) * 4);
    static_assert(std::endian::native == std::endian::little, "the first component is the low byte");
    for (int i = 0; i < count; ++i) {
        const std::uint32_t w = words[i];
        words[i] = NoisyByte(w & 0xFFu, noise[0][i]) | NoisyByte((w >> 8) & 0xFFu, noise[1][i]) << 8 |
                   NoisyByte((w >> 16) & 0xFFu, noise[2][i]) << 16 | (w & 0xFF000000u);
    }
    std::memcpy(components, words, std::size_t(count) * 4);
}

template <int Channels, class Component>
[[gnu::always_inline]] inline void AddNoiseToSpan(Component* components, const SpanChannelNoise* noise,
                                                  int n) noexcept {
    if (n == SpanPixels)
        AddNoiseToPixels<Channels>(components, noise, SpanPixels);
    else
        AddNoiseToPixels<Channels>(components, noise, n);
}

template <class Component>
[[gnu::always_inline]] inline void AddNoiseToSpan(Component* components, int channels,
                                                  const SpanChannelNoise* noise, int n) noexcept {
    switch (channels) {
    case 2:
        return AddNoiseToSpan<2>(components, noise, n);
    case 4:
        return AddNoiseToSpan<4>(components, noise, n);
    case 5:
        return AddNoiseToSpan<5>(components, noise, n);
    default:
        return;
    }
}

} // namespace

RT_AVX2_DISPATCH(SpanAddNoise, AddNoiseToSpan,
                 (std::uint8_t * components, int channels, const SpanChannelNoise* noise, int n),
                 (components, channels, noise, n))
RT_AVX2_DISPATCH(SpanAddNoise, AddNoiseToSpan,
                 (std::uint16_t * components, int channels, const SpanChannelNoise* noise, int n),
                 (components, channels, noise, n))
RT_AVX2_DISPATCH(SpanAddNoise, AddNoiseToSpan,
                 (float* components, int channels, const SpanChannelNoise* noise, int n),
                 (components, channels, noise, n))

const Jump* GetJumps() noexcept {
    return Jumps.data();
}

namespace {

// The seeds of a span: the sampler affine of each pixel's centre, floored (NoiseSeed), or of its integer
// location, truncated (DiffuseSeed). Huge, infinite or NaN places saturate: those spans go pixel by pixel.
template <bool Centre>
[[gnu::always_inline]] inline void SeedSpan(int x0, int y, const float* samplerParams,
                                            std::uint32_t* seeds) noexcept {
    constexpr float Shift = Centre ? 0.5f : 0.0f;
    alignas(64) float xs[SpanPixels], ys[SpanPixels];
    const float placeY = float(y) + Shift;
    int outside = 0;
    for (int i = 0; i < SpanPixels; ++i) {
        const float2 at = SamplerAffine(make_float2(float(x0 + i) + Shift, placeY), samplerParams);
        xs[i] = at.x;
        ys[i] = at.y;
        outside |= int(!(std::fabs(at.x) < SmallCoordinate)) | int(!(std::fabs(at.y) < SmallCoordinate));
    }
    if (outside) {
        for (int i = 0; i < SpanPixels; ++i)
            seeds[i] = Centre ? NoiseSeed(make_int2(x0 + i, y), samplerParams)
                              : DiffuseSeed(make_int2(x0 + i, y), samplerParams);
        return;
    }
    const uint width = (uint)(int)samplerParams[WidthIndex];
    for (int i = 0; i < SpanPixels; ++i) {
        int tx = int(xs[i]), ty = int(ys[i]);
        if constexpr (Centre) {
            tx -= int(float(tx) > xs[i]);
            ty -= int(float(ty) > ys[i]);
        }
        seeds[i] = Hash(uint(ty) * width + uint(tx));
    }
}

} // namespace

RT_AVX2_DISPATCH(SpanSeeds, SeedSpan<true>, (int x0, int y, const float* samplerParams, std::uint32_t* seeds),
                 (x0, y, samplerParams, seeds))
RT_AVX2_DISPATCH(SpanDiffuseSeeds, SeedSpan<false>,
                 (int x0, int y, const float* samplerParams, std::uint32_t* seeds),
                 (x0, y, samplerParams, seeds))

// Each draw's state comes straight from the seed (state k = multiplier(k) * seed + increment(k)), so the
// draws of a pixel are independent and the lanes carry pixels; all channels are drawn side by side.
template <int Channels>
[[gnu::always_inline]] inline void DrawSpanNoise(const std::uint32_t* __restrict seeds, bool gaussian,
                                                 float sigma, SpanChannelNoise* __restrict noise) noexcept {
    const Jump* jumps = Jumps.data() + 1;
    if (!gaussian) {
        for (int c = 0; c < Channels; ++c) {
            const std::uint32_t multiplier = jumps[c].multiplier, increment = jumps[c].increment;
            for (int i = 0; i < SpanPixels; ++i)
                noise[c][i] =
                    UniformFromRandom(RandomToUnit((seeds[i] * multiplier + increment) >> 16), sigma);
        }
        return;
    }
    // Draw by draw across the 32 pixels: each pixel's sum keeps its draw order, and the sums of the pixels
    // and channels are independent chains that run side by side.
    alignas(64) float sums[Channels][SpanPixels];
    for (int c = 0; c < Channels; ++c)
        for (int i = 0; i < SpanPixels; ++i)
            sums[c][i] = 0.0f;
    for (int j = 0; j < NoiseGaussianDraws; ++j)
        for (int c = 0; c < Channels; ++c) {
            const Jump& jump = jumps[c * NoiseGaussianDraws + j];
            const std::uint32_t multiplier = jump.multiplier, increment = jump.increment;
            for (int i = 0; i < SpanPixels; ++i)
                sums[c][i] += RandomToUnit((seeds[i] * multiplier + increment) >> 16);
        }
    for (int c = 0; c < Channels; ++c)
        for (int i = 0; i < SpanPixels; ++i)
            noise[c][i] = GaussianFromSum(sums[c][i], sigma);
}

namespace {

inline void UnitDraws(const std::uint32_t* seeds, int draws, SpanChannelNoise* values) noexcept {
    const Jump* jumps = Jumps.data() + 1;
    for (int k = 0; k < draws && k < MaxJump; ++k) {
        const std::uint32_t multiplier = jumps[k].multiplier, increment = jumps[k].increment;
        for (int i = 0; i < SpanPixels; ++i)
            values[k][i] = RandomToUnit((seeds[i] * multiplier + increment) >> 16);
    }
}

inline void NoiseOfSpan(const std::uint32_t* seeds, int channels, bool gaussian, float sigma,
                        SpanChannelNoise* noise) noexcept {
    switch (channels) {
    case 1:
        return DrawSpanNoise<1>(seeds, gaussian, sigma, noise);
    case 2:
        return DrawSpanNoise<2>(seeds, gaussian, sigma, noise);
    case 3:
        return DrawSpanNoise<3>(seeds, gaussian, sigma, noise);
    case 4:
        return DrawSpanNoise<4>(seeds, gaussian, sigma, noise);
    default:
        return;
    }
}

} // namespace

RT_AVX2_DISPATCH(SpanUnitDraws, UnitDraws, (const std::uint32_t* seeds, int draws, SpanChannelNoise* values),
                 (seeds, draws, values))
RT_AVX2_DISPATCH(SpanNoise, NoiseOfSpan,
                 (const std::uint32_t* seeds, int channels, bool gaussian, float sigma,
                  SpanChannelNoise* noise),
                 (seeds, channels, gaussian, sigma, noise))

} // namespace RasterTools::NoiseGenerator
