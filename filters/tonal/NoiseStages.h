#pragma once
// The add-noise Sample stage for the processor (per pixel, and per span of 32 pixels) and the noise
// command's kinds of render: one per layer format, source and destination alike, without or with a mask.

#include "filters/tonal/NoiseGenerator.h"
#include "pipeline/Pipeline.h"

#include <algorithm>
#include <cstring>
#include <string>
#include <string_view>

namespace RasterTools {

// Reads the source pixel through Transform and Extend and adds noise seeded by the pixel's place under the
// sampler affine. Alpha is never changed.
struct NoiseSampler {
    // The ten floats of the sampler block (see NoiseGenerator::SamplerIndex).
    struct Params {
        float block[NoiseGenerator::SamplerFloatCount] = {1.0f, 0.0f, 0.0f, 0.0f, 1.0f,
                                                          0.0f, 0.0f, 0.0f, 0.0f, 0.0f};
    };

    // Noise of every accumulator channel (draws for alpha are consumed and dropped) added to the colour
    // channels; integer channels truncate, then clamp; float colour follows the format's clamp rule.
    template <Raster::PixelFormat F>
    static Raster::StoredPixel<F> AddNoise(Raster::StoredPixel<F> pixel, const float* noise) noexcept {
        using Traits = Raster::PixelTraits<F>;
        using Component = Raster::FormatComponent<F>;
        constexpr int Channels = Raster::GetChannelCount(F);
        Component components[Channels];
        std::memcpy(components, &pixel, sizeof components);
        for (int c = 0; c < Channels - 1; ++c) { // the last channel is alpha
            const float sum = float(components[c]) + noise[c] * Traits::Maximum;
            if constexpr (Raster::IsFloatFormat(F))
                components[c] = sum; // unbounded colour: the clamp rule touches alpha only
            else
                components[c] = Component(NoiseGenerator::NoiseToInteger(sum, int(Traits::Maximum)));
        }
        std::memcpy(&pixel, components, sizeof components);
        return pixel;
    }

    // One pixel, exactly as the kernel text does it.
    template <class Transform, class Extend, class Image>
    static typename Image::Stored Sample(const Image& image, Raster::KernelMath::int2 location,
                                         const Raster::PreparedTransform<Transform>& t,
                                         const Params& params) noexcept {
        using namespace NoiseGenerator;
        constexpr Raster::PixelFormat F = Image::Format;
        constexpr int Channels = Raster::GetChannelCount(F);
        const Raster::KernelMath::int2 at = Raster::TransformPixelCenterToInt<Transform>(location, t);
        const auto pixel = Extend::Read(image, at);
        uint state = NoiseSeed(at, params.block);
        float noise[Channels];
        NoiseDraws(Channels, params.block, &state, noise);
        return AddNoise<F>(pixel, noise);
    }

    // A span of up to 32 pixels: the generator runs across pixels (see NoiseGenerator::SpanNoise). Under
    // the identity transform only; other transforms go pixel by pixel.
    template <class Transform, class Extend, class Image>
    static void SampleSpan(const Image& image, const Raster::PreparedTransform<Transform>& t,
                           const Params& params, int x0, int y, int n, typename Image::Stored* out) noexcept {
        using namespace NoiseGenerator;
        using Raster::KernelMath::make_int2;
        if constexpr (!Raster::IsIdentityTransform<Transform>) {
            for (int i = 0; i < n; ++i)
                out[i] = Sample<Transform, Extend>(image, make_int2(x0 + i, y), t, params);
        } else {
            constexpr Raster::PixelFormat F = Image::Format;
            constexpr int Channels = Raster::GetChannelCount(F);
            if (y >= 0 && y < image.GetHeight() && x0 >= 0 && x0 + n <= image.GetWidth()) {
                std::memcpy(out, image.Row(y) + x0, std::size_t(n) * sizeof *out);
            } else {
                for (int i = 0; i < n; ++i)
                    out[i] = Extend::Read(image, make_int2(x0 + i, y));
            }
            const float* p = params.block;
            const bool gaussian = p[GaussianIndex] != 0.0f;
            const bool mono = p[MonoIndex] != 0.0f;
            alignas(64) std::uint32_t seeds[SpanPixels];
            alignas(64) float noise[Channels][SpanPixels];
            SpanSeeds(x0, y, p, seeds);
            // Mono draws once for all channels; otherwise every colour channel in turn.
            SpanNoise(seeds, mono ? 1 : Channels - 1, gaussian, p[SigmaIndex], noise);
            // Mono uses the first channel's noise everywhere; alpha's row is only read.
            for (int c = mono ? 1 : Channels - 1; c < Channels; ++c)
                std::copy_n(noise[0], SpanPixels, noise[c]);
            SpanAddNoise(reinterpret_cast<Raster::FormatComponent<F>*>(out), Channels, noise, n);
        }
    }
};

namespace NoiseStages {

template <Raster::PixelFormat F>
using Plain = PipelineStages<Raster::Copy, Raster::IdentityMask, NoiseSampler, Raster::IdentityTransform,
                             Raster::Zero, FormatList<F>, FormatList<F>>;
template <Raster::PixelFormat F>
using Masked = PipelineStages<Raster::Copy, Raster::BitmapMask, NoiseSampler, Raster::IdentityTransform,
                              Raster::Zero, FormatList<F>, FormatList<F>>;

} // namespace NoiseStages

// The sampler's kernel text: per source format and language (null for an unknown language or a format
// that is not a layer format).
template <>
struct StageText<NoiseSampler> {
    static const char* Get(HardwareKernelLanguage language, Raster::PixelFormat source);
};

// A Sample stage whose body calls the generator (NoiseGenerator.h): language 0 keeps the generator in a local
// structure named scope, language 1 renames its functions with scope as a prefix, so that several such
// stages can share a kernel. Empty for another language.
std::string MakeGeneratorSampleStage(HardwareKernelLanguage language, std::string_view scope,
                                     std::string_view body);

} // namespace RasterTools

// One layer format's processor renders.
#define RT_INSTANTIATE_NOISE(Format)                                                                         \
    RT_INSTANTIATE_PROCESSOR(RasterTools::NoiseStages::Plain<Raster::PixelFormat::Format>, Format)           \
    RT_INSTANTIATE_PROCESSOR(RasterTools::NoiseStages::Masked<Raster::PixelFormat::Format>, Format)
