#pragma once
// The procedural texture command: paints the layer from user equations over the pixel's position, the
// texture origin, the document size, the pixel's own channels and named inputs. A live filter layer.

#include "filters/generate/ProceduralTexture.h"
#include "filters/generate/ProceduralTextureStages.h"
#include "frame/SinglePassCommand.h"

#include <array>
#include <memory>
#include <mutex>
#include <optional>

namespace RasterTools {

class ProceduralTextureCommand final : public SinglePassCommand<ProceduralTextureFilter> {
public:
    using Config = ProceduralTextureConfig;
    using State = ProceduralTextureState;
    // An index into the host's blend-mode names (Kernel::ReflectedBlendMode); 0 is Normal.
    using BlendModeType = int;
    static constexpr int BlendModeCount = Raster::BlendModeCount;

    template <Raster::PixelFormat F>
    using PlainStages = ProceduralTextureStages::Plain<F>;
    template <Raster::PixelFormat F>
    using MaskedStages = ProceduralTextureStages::Masked<F>;

    ProceduralTextureCommand(bool liveEffect, const Kernel::PointT<double>& origin, double opacity,
                             BlendModeType blendMode, const Config::Handle& config,
                             const Kernel::Counted<const ExpressionConstantValues>& values);
    // A starter preset (the table's "preset"), for the catalogue.
    ProceduralTextureCommand(bool liveEffect, const ProceduralTextureParameters& params);

    const Config::Handle& GetConfig() const noexcept { return m_Config; }
    const Kernel::Counted<const ExpressionConstantValues>& GetConstantValues() const noexcept {
        return m_Values;
    }
    Kernel::PointT<double> GetOrigin() const noexcept { return m_Params.origin; }
    double GetOpacity() const noexcept { return m_Params.opacity; }
    BlendModeType GetBlendMode() const noexcept { return m_BlendMode; }
    // The layer's transform leaves the texture where it is.
    void ApplyTransform(const Raster::AffineTransform::Params&) {}

    bool CanAffectAlpha() const override { return true; }
    bool CanRequireInflation() const override { return false; }

    // True when the config has equations and every one compiles for its colour format.
    static bool ValidateConfig(const Config::Handle& config,
                               const Kernel::Counted<const ExpressionConstantValues>& values,
                               std::string* error = nullptr);
    // Binds the variables and compiles the equations for a raster format; false (state.error says why) for
    // a format of another colour format or an equation that does not compile.
    static bool Init(Raster::PixelFormat format, Kernel::PointT<double> documentSize, double pixelsPerInch,
                     Kernel::PointT<double> origin, const Config::Handle& config,
                     const Kernel::Counted<const ExpressionConstantValues>& values, State& state);
    // The Sample stage text of a config for a source format, language and blend mode, cached per config for
    // the process; null when the device cannot express an equation (the processor then renders).
    static const char* GetSampleText(const Config::Handle& config, const State& state,
                                     Raster::PixelFormat format, HardwareKernelLanguage language,
                                     BlendModeType blendMode = 0);
    // The short form of an equation, "rgb=EXPR": the channels it writes (single-letter names run together,
    // otherwise separated by commas, in any case), '=', then its text. Nothing for an unknown channel or no
    // '='.
    static std::optional<ProceduralTextureEquation>
    ParseEquation(Config::ColourFormat format, std::string_view text, std::string* error = nullptr);
    // A blend mode named as on the command line ("multiply", "colour-dodge" or "color-dodge", any case).
    static std::optional<BlendModeType> ParseBlendMode(std::string_view text);
    static std::string FormatEquation(Config::ColourFormat format, const ProceduralTextureEquation& equation);
    // The catalogue's form for the command line: the table's values and the text flags (see kTextFlags).
    static Kernel::Counted<RasterCommand>
    MakeCommandWithText(bool liveEffect, const std::vector<ParameterValue>& values,
                        const std::vector<std::pair<std::string, std::string>>& texts, std::string& error);
    // The starter presets (stripes, rings, checkerboard, noise marble, colour gradient), with their inputs.
    static const std::vector<ProceduralTextureConfigProperty>& GetStarterPresets();

    // The sampler block for a raster of the given bounds seen through view, with the inputs' values.
    ProceduralTextureSampler::Params GetSamplerParams(const Kernel::RectT<double>& bounds,
                                                      const Raster::AffineTransform::Params& view) const;
    // The base's form: the sampler block alone (the processor's evaluator comes with each render).
    template <class StageParams>
    void FillStageParams(StageParams& params, const Kernel::RectT<double>& bounds,
                         const Raster::AffineTransform::Params& view) const {
        params.sampler = GetSamplerParams(bounds, view);
    }

    RenderPath Render(const RenderTarget& target) const override;
    bool PrepareDevice(const RenderTarget& target) const override;

    bool Merge(Kernel::Counted<const Command> other) override;
    Kernel::Counted<DocumentCommand> Clone() const override;
    Kernel::ReflectedList EnumerateReflecteds() override;
    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;

    // For loading: Load then sets the fields.
    ProceduralTextureCommand();

private:
    // The prepared state for a raster format, made once per command; null for a format without one.
    std::shared_ptr<const State> GetState(Raster::PixelFormat format) const;
    template <class Stages>
    RenderPath RenderWith(const RenderTarget& target) const;
    template <class Stages>
    std::optional<Raster::HardwareKernelDescriptor> Describe(const RenderTarget& target,
                                                             const State* state) const;

    BlendModeType m_BlendMode = 0;
    Config::Handle m_Config;
    Kernel::Counted<const ExpressionConstantValues> m_Values;

    mutable std::mutex m_StateMutex;
    mutable std::array<std::shared_ptr<const State>, Raster::PixelFormatCount> m_States;
    mutable std::array<bool, Raster::PixelFormatCount> m_StateTried{};
};

} // namespace RasterTools
