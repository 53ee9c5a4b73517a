#pragma once
// The add-noise random generator and per-pixel seeding, written once: processor code expands it here and the
// kernel text pastes the very same tokens (GetNoiseGeneratorText), so both paths draw identical noise.
//
// The source is in the dialect of host/raster/KernelMath.h (OpenCL C, CUDA C++ and host C++ at once).
// RT_NOISE_FUNCTION starts every function: `inline` at file level, `static` inside language 0's local
// structure. params_address_space is the kernels' address space of the parameter array.

#include "host/raster/KernelMath.h"

#include <cmath>
#include <cstdint>
#include <utility>

// The sampler block's floats by name: the affine (six: x' = x*p0 + y*p1 + p2, y' = x*p3 + y*p4 + p5), sigma,
// the raster's width (for the seed), then add noise's mono and gaussian switches. The processor's enum and
// the kernel text's constants are both made from this list.
#define RT_NOISE_SAMPLER_INDICES(X)                                                                          \
    X(AffineIndex, 0)                                                                                        \
    X(SigmaIndex, 6)                                                                                         \
    X(WidthIndex, 7)                                                                                         \
    X(MonoIndex, 8)                                                                                          \
    X(GaussianIndex, 9)                                                                                      \
    X(SamplerFloatCount, 10)

// Hash seeds the generator; RandomGet (host fragments) is a linear congruential step returning 16 bits.
// Uniform noise is one draw in [-sigma, sigma]; gaussian noise sums twelve draws (standard deviation
// sigma / 6, always within +-sigma). The seed is the hash of the pixel's place under the sampler affine,
// row-major with the raster's width, so that it does not depend on tiling: noise maps the pixel's centre
// and floors, diffuse maps the integer location and truncates toward zero. NoiseDraws draws the noise of
// `channels` channels in channel order (mono: one draw for all). Diffuse moves a location by two draws,
// each scaled to at most 512 × sigma and truncated toward zero, with 32-bit wrap-around.
#define RT_NOISE_GENERATOR_SOURCE                                                                            \
    enum { NoiseGaussianDraws = 12 };                                                                        \
    RT_NOISE_FUNCTION uint Hash(uint a) {                                                                    \
        a = (a ^ 61u) ^ (a >> 16);                                                                           \
        a = a + (a << 3);                                                                                    \
        a = a ^ (a >> 4);                                                                                    \
        a = a * 0x27D4EB2Du;                                                                                 \
        a = a ^ (a >> 15);                                                                                   \
        return a;                                                                                            \
    }                                                                                                        \
    RT_NOISE_FUNCTION float GetRandom(uint* state) {                                                         \
        return (float)RandomGet(state) / (float)RandomMax;                                                   \
    }                                                                                                        \
    RT_NOISE_FUNCTION float UniformFromRandom(float random, float sigma) {                                   \
        return (sigma * (random - 0.5f)) * 2.0f;                                                             \
    }                                                                                                        \
    RT_NOISE_FUNCTION float GaussianFromSum(float sum, float sigma) {                                        \
        return (sum - 6.0f) * 1.0f / 6.0f * sigma;                                                           \
    }                                                                                                        \
    RT_NOISE_FUNCTION float GetUniformNoise(float sigma, uint* state) {                                      \
        return UniformFromRandom(GetRandom(state), sigma);                                                   \
    }                                                                                                        \
    RT_NOISE_FUNCTION float GetGaussianNoise(float sigma, uint* state) {                                     \
        float sum = 0.0f;                                                                                    \
        for (int i = 0; i < NoiseGaussianDraws; ++i)                                                         \
            sum += GetRandom(state);                                                                         \
        return GaussianFromSum(sum, sigma);                                                                  \
    }                                                                                                        \
    RT_NOISE_FUNCTION float GetNoise(bool gaussian, float sigma, uint* state) {                              \
        return gaussian ? GetGaussianNoise(sigma, state) : GetUniformNoise(sigma, state);                    \
    }                                                                                                        \
    RT_NOISE_FUNCTION float2 SamplerAffine(float2 location, params_address_space float* sampler_params) {    \
        params_address_space float* p = sampler_params + AffineIndex;                                        \
        return float2_literal(location.x * p[0] + location.y * p[1] + p[2],                                  \
                              location.x * p[3] + location.y * p[4] + p[5]);                                 \
    }                                                                                                        \
    RT_NOISE_FUNCTION uint NoiseSeed(int2 at, params_address_space float* sampler_params) {                  \
        const int2 seedAt = convert_int2(floor(SamplerAffine(convert_float2(at) + 0.5f, sampler_params)));   \
        return Hash((uint)seedAt.y * (uint)(int)sampler_params[WidthIndex] + (uint)seedAt.x);                \
    }                                                                                                        \
    RT_NOISE_FUNCTION void NoiseDraws(int channels, params_address_space float* sampler_params, uint* state, \
                                      float* noise) {                                                        \
        const bool gaussian = sampler_params[GaussianIndex] != 0.0f;                                         \
        const float sigma = sampler_params[SigmaIndex];                                                      \
        if (sampler_params[MonoIndex] != 0.0f) {                                                             \
            const float n = GetNoise(gaussian, sigma, state);                                                \
            for (int c = 0; c < channels; ++c)                                                               \
                noise[c] = n;                                                                                \
        } else {                                                                                             \
            for (int c = 0; c < channels; ++c)                                                               \
                noise[c] = GetNoise(gaussian, sigma, state);                                                 \
        }                                                                                                    \
    }                                                                                                        \
    RT_NOISE_FUNCTION int DiffuseOffset(float random, float sigma) {                                         \
        return rt_sat_int((random * 1024.0f - 512.0f) * sigma);                                              \
    }                                                                                                        \
    RT_NOISE_FUNCTION int MovedBy(int at, int offset) {                                                      \
        return (int)((uint)at + (uint)offset);                                                               \
    }                                                                                                        \
    RT_NOISE_FUNCTION uint DiffuseSeed(int2 at, params_address_space float* sampler_params) {                \
        const float2 place = SamplerAffine(convert_float2(at), sampler_params);                              \
        return Hash((uint)rt_sat_int(place.y) * (uint)(int)sampler_params[WidthIndex] +                      \
                    (uint)rt_sat_int(place.x));                                                              \
    }                                                                                                        \
    RT_NOISE_FUNCTION int2 DiffuseMoved(int2 location, int2 at,                                              \
                                        params_address_space float* sampler_params) {                        \
        uint state = DiffuseSeed(at, sampler_params);                                                        \
        const float sigma = sampler_params[SigmaIndex];                                                      \
        const int dx = DiffuseOffset(GetRandom(&state), sigma);                                              \
        const int dy = DiffuseOffset(GetRandom(&state), sigma);                                              \
        return make_int2(MovedBy(location.x, dx), MovedBy(location.y, dy));                                  \
    }                                                                                                        \
    RT_NOISE_FUNCTION int NoiseToInteger(float sum, int maximum) {                                           \
        return rt_clampi(rt_sat_int(sum), 0, maximum);                                                       \
    }

namespace RasterTools::NoiseGenerator {

using namespace Raster::KernelMath;

// The sampler block's floats, by index.
enum SamplerIndex : int {
#define RT_NOISE_ENUMERATOR(name, value) name = value,
    RT_NOISE_SAMPLER_INDICES(RT_NOISE_ENUMERATOR)
#undef RT_NOISE_ENUMERATOR
};

#define RT_NOISE_FUNCTION inline
#define params_address_space const
RT_NOISE_GENERATOR_SOURCE
#undef params_address_space
#undef RT_NOISE_FUNCTION

// The sampler block's width entry for a raster's bounds: right minus left, truncated toward zero; 0 for
// widths that no raster can have.
inline float TruncatedWidth(double left, double right) noexcept {
    const double width = std::trunc(right - left);
    return std::isfinite(width) && std::fabs(width) < 2147483647.0 ? float(int(width)) : 0.0f;
}

// The names the generator text defines, which language 1 keeps apart from other fragments' by renaming.
inline constexpr const char* DefinedNames[] = {
#define RT_NOISE_NAME(name, value) #name,
    RT_NOISE_SAMPLER_INDICES(RT_NOISE_NAME)
#undef RT_NOISE_NAME
        "NoiseGaussianDraws",
    "Hash",
    "GetRandom",
    "UniformFromRandom",
    "GaussianFromSum",
    "GetUniformNoise",
    "GetGaussianNoise",
    "GetNoise",
    "SamplerAffine",
    "NoiseSeed",
    "NoiseDraws",
    "DiffuseSeed",
    "DiffuseOffset",
    "MovedBy",
    "DiffuseMoved",
    "NoiseToInteger"};

// The sampler block's names as kernel text: an enum with the values above.
inline constexpr std::pair<const char*, int> SamplerIndexNames[] = {
#define RT_NOISE_PAIR(name, value) {#name, name},
    RT_NOISE_SAMPLER_INDICES(RT_NOISE_PAIR)
#undef RT_NOISE_PAIR
};

// The generator source as kernel text, after the enum of the sampler block's names (RT_NOISE_FUNCTION and
// params_address_space left for the including text to define).
const char* GetNoiseGeneratorText();

// ---- Span kernels: the same numbers for 32 pixels at a time, written so that the compiler vectorises
// across pixels. Bit-identical to the functions above (see the tests).

inline constexpr int SpanPixels = 32;

// The seeds of pixels (x0 + i, y), i < 32, whose integer source location is their own (the identity
// transform stage): NoiseSeed's, and DiffuseSeed's.
void SpanSeeds(int x0, int y, const float* samplerParams, std::uint32_t* seeds) noexcept;
void SpanDiffuseSeeds(int x0, int y, const float* samplerParams, std::uint32_t* seeds) noexcept;

// The noise of `channels` channels for 32 seeds, as GetNoise draws it channel after channel from each seed:
// noise[c][i] for pixel i. channels is 1 to 4.
using SpanChannelNoise = float[SpanPixels];
void SpanNoise(const std::uint32_t* seeds, int channels, bool gaussian, float sigma,
               SpanChannelNoise* noise) noexcept;

// The first `draws` GetRandom values of each of 32 seeds: values[k][i] is draw k + 1 from seeds[i]. draws is
// 1 to MaxJump.
void SpanUnitDraws(const std::uint32_t* seeds, int draws, SpanChannelNoise* values) noexcept;

// Adds the noise of each colour channel c (noise[c][i], already drawn) to n interleaved pixels of `channels`
// components, alpha last and untouched (its row of noise is read but not used): integer components truncate
// and clamp as NoiseToInteger does, float components keep the sum. channels is 2, 4 or 5.
void SpanAddNoise(std::uint8_t* components, int channels, const SpanChannelNoise* noise, int n) noexcept;
void SpanAddNoise(std::uint16_t* components, int channels, const SpanChannelNoise* noise, int n) noexcept;
void SpanAddNoise(float* components, int channels, const SpanChannelNoise* noise, int n) noexcept;

// GetRandom's value for a 16-bit draw r, without a division. In binary r / 65535 is 0.rrrr... (r's 16 bits
// repeating), so it is r·2^-16 + r·2^-32 + a tail below r·2^-47. The sum a + b' of r·2^-16 (exact) and
// b' = r·(2^-32 + 2^-48) (one rounding, strictly above r·2^-32) rounds to the same float as the true
// quotient: no midpoint lies between them. The tests check all 65536 draws.
inline float RandomToUnit(uint draw) noexcept {
    static_assert(RandomMax == 65535u, "the identity above is for 16-bit draws");
    const float r = float(int(draw));
    return r * 0x1p-16f + r * (0x1p-32f + 0x1p-48f);
}

// The generator state after k steps from state s is Multiplier(k) * s + Increment(k) (mod 2^32), derived from
// RandomGet itself. k from 1 to MaxJump.
inline constexpr int MaxJump = 5 * NoiseGaussianDraws;
struct Jump {
    std::uint32_t multiplier;
    std::uint32_t increment;
};
const Jump* GetJumps() noexcept; // [MaxJump + 1], entry 0 the identity

} // namespace RasterTools::NoiseGenerator
