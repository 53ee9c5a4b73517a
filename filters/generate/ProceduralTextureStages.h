#pragma once
// The procedural texture's evaluation: the state that Init prepares from a config (the constants table, the
// compiled equations and their effective channel masks), the per-thread evaluator that runs them over spans
// of 32 pixels, and the Sample stage through which the pipeline's processor path calls it.

#include "filters/generate/ProceduralTextureMath.h"
#include "host/document/ProceduralTexture.h"
#include "host/kernel/ExpressionParser.h"
#include "pipeline/Pipeline.h"

#include <algorithm>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

namespace RasterTools {

// What Init builds for one raster format: immutable once built, shared by every thread of a render.
struct ProceduralTextureState {
    using Parser = Kernel::ExpressionParser;
    struct Compiled {
        std::shared_ptr<Parser::ParseInfo> parseInfo;
        Kernel::Counted<Parser::ByteCode> byteCode; // numeric
        std::uint32_t mask = 0;                     // effective: allowed, not claimed by an earlier equation
        int equationIndex = 0;                      // in the config's list
    };

    ProceduralTextureConfig::ColourFormat colourFormat = ProceduralTextureConfig::RGB;
    Kernel::Counted<Parser::Constants> constants;
    Kernel::Counted<Parser::ExecuteInfo> executeInfo;
    Kernel::Counted<Parser::Constant> x, y, rx, ry, ox, oy, w, h;
    std::vector<Kernel::Counted<Parser::Constant>> channels; // in mask order
    std::vector<Kernel::Counted<Parser::Constant>> inputs;   // in set order
    std::shared_ptr<Parser::UnitConverter> converter;        // the parse infos point at it
    std::vector<Compiled> equations;
    std::string error; // why Init failed: the equation, the column and the reason
};

// One thread's evaluation: its own copies of the volatile constants and one session per equation.
class ProceduralTextureEvaluator {
public:
    static constexpr int Lanes = Kernel::ExpressionParser::Lanes;
    static constexpr int MaxChannels = 5;

    // block: the render's sampler block, whose ox, oy, w and h the equations read.
    ProceduralTextureEvaluator(const ProceduralTextureState& state, const float* block);
    ProceduralTextureEvaluator(const ProceduralTextureEvaluator&) = delete;
    ProceduralTextureEvaluator& operator=(const ProceduralTextureEvaluator&) = delete;

    // Evaluates n (1..32) pixels of row y from x0: source holds each channel's normalised source values, and
    // each channel an equation writes gets its new (unscaled) value in result. Returns the channels written.
    unsigned Evaluate(int x0, int y, int n, const float* block, const float (*source)[Lanes],
                      float (*result)[Lanes]);
    ProceduralTextureConfig::ColourFormat GetColourFormat() const noexcept { return m_State.colourFormat; }

private:
    const ProceduralTextureState& m_State;
    Kernel::Counted<Kernel::ExpressionParser::ExecuteInfo> m_Info;
    Kernel::Counted<Kernel::ExpressionParser::Constant> m_X, m_Y, m_RX, m_RY, m_OX, m_OY, m_W, m_H;
    std::vector<Kernel::Counted<Kernel::ExpressionParser::Constant>> m_Channels;
    std::vector<std::unique_ptr<Kernel::ExpressionParser::ByteCode::Session>> m_Sessions;
};

// Reads the source pixel at the transformed pixel centre and writes what the equations give.
struct ProceduralTextureSampler {
    struct Params {
        static constexpr int FloatCount = ProceduralTextureMath::BlockFloats;
        float block[FloatCount];
        ProceduralTextureEvaluator* evaluator = nullptr; // the rendering thread's; none leaves pixels as read

        Params() noexcept {
            std::fill(block, block + FloatCount, 0.0f);
            block[0] = block[4] = 1.0f;
            block[ProceduralTextureMath::OpacityIndex] = 1.0f;
        }
        void Write(float* out) const noexcept { std::copy(block, block + FloatCount, out); }
    };

    template <class Transform, class Extend, class Image>
    static typename Image::Stored Sample(const Image& image, Raster::KernelMath::int2 location,
                                         const Raster::PreparedTransform<Transform>& t,
                                         const Params& params) noexcept {
        typename Image::Stored out;
        SampleSpan<Transform, Extend>(image, t, params, location.x, location.y, 1, &out);
        return out;
    }

    template <class Transform, class Extend, class Image>
    static void SampleSpan(const Image& image, const Raster::PreparedTransform<Transform>& t,
                           const Params& params, int x0, int y, int n, typename Image::Stored* out) noexcept {
        using Raster::KernelMath::make_int2;
        constexpr Raster::PixelFormat F = Image::Format;
        constexpr int Channels = Raster::GetChannelCount(F);
        using Component = Raster::FormatComponent<F>;
        constexpr float Maximum = Raster::PixelTraits<F>::Maximum;
        constexpr int Lanes = ProceduralTextureEvaluator::Lanes;
        constexpr int MaxChannels = ProceduralTextureEvaluator::MaxChannels;
        static_assert(Channels <= MaxChannels);

        for (int i = 0; i < n; ++i)
            out[i] =
                Extend::Read(image, Raster::TransformPixelCenterToInt<Transform>(make_int2(x0 + i, y), t));
        if (!params.evaluator) return;

        alignas(64) float raw[Channels][Lanes];
        alignas(64) float source[Channels][Lanes];
        alignas(64) float result[Channels][Lanes];
        for (int i = 0; i < n; ++i) {
            Component components[Channels];
            std::memcpy(components, &out[i], sizeof components);
            for (int c = 0; c < Channels; ++c) {
                raw[c][i] = float(components[c]);
                source[c][i] = raw[c][i] / Maximum;
            }
        }
        const unsigned written = params.evaluator->Evaluate(x0, y, n, params.block, source, result);
        if (!written) return;
        const float opacity = params.block[ProceduralTextureMath::OpacityIndex];
        const int mode = int(params.block[ProceduralTextureMath::BlendIndex]);
        // The blend, in place in result: the channels it gives are the same for every pixel of the span.
        unsigned stored = written;
        if (mode != 0) {
            const int colourFormat = int(params.evaluator->GetColourFormat());
            for (int i = 0; i < n; ++i) {
                // Sized for any format, so that the blend's channel indexing stays in bounds for every one.
                float layer[MaxChannels] = {}, texture[MaxChannels] = {};
                for (int c = 0; c < Channels; ++c) {
                    layer[c] = source[c][i];
                    texture[c] = (written & (1u << c)) ? result[c][i] : layer[c];
                }
                stored = ProceduralTextureMath::ProceduralBlend(mode, colourFormat, written,
                                                                !Raster::IsFloatFormat(F), layer, texture);
                for (int c = 0; c < Channels; ++c)
                    result[c][i] = texture[c];
            }
        }
        for (int i = 0; i < n; ++i) {
            Component components[Channels];
            std::memcpy(components, &out[i], sizeof components);
            for (int c = 0; c < Channels; ++c) {
                if (!(stored & (1u << c))) continue;
                if constexpr (Raster::IsFloatFormat(F))
                    components[c] = ProceduralTextureMath::ProceduralFloatChannel(result[c][i], raw[c][i],
                                                                                  opacity, c == Channels - 1);
                else
                    components[c] = Component(ProceduralTextureMath::ProceduralIntegerChannel(
                        result[c][i], raw[c][i], Maximum, opacity));
            }
            std::memcpy(&out[i], components, sizeof components);
        }
    }
};

namespace ProceduralTextureStages {

template <Raster::PixelFormat F>
using Plain = PipelineStages<Raster::Copy, Raster::IdentityMask, ProceduralTextureSampler,
                             Raster::IdentityTransform, Raster::Zero, FormatList<F>, FormatList<F>>;
template <Raster::PixelFormat F>
using Masked = PipelineStages<Raster::Copy, Raster::BitmapMask, ProceduralTextureSampler,
                              Raster::IdentityTransform, Raster::Zero, FormatList<F>, FormatList<F>>;

} // namespace ProceduralTextureStages

// The generic Sample text is the one without equations (pixels as read); a config's own text replaces it at
// render time (ProceduralTextureCommand::GetSampleText).
template <>
struct StageText<ProceduralTextureSampler> {
    static const char* Get(HardwareKernelLanguage language, Raster::PixelFormat source);
};

} // namespace RasterTools

// One layer format's processor renders.
#define RT_INSTANTIATE_PROCEDURALTEXTURE(Format)                                                             \
    RT_INSTANTIATE_PROCESSOR(RasterTools::ProceduralTextureStages::Plain<Raster::PixelFormat::Format>,       \
                             Format)                                                                         \
    RT_INSTANTIATE_PROCESSOR(RasterTools::ProceduralTextureStages::Masked<Raster::PixelFormat::Format>,      \
                             Format)
