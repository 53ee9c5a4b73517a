#pragma once
// The library's kernel text for the pipeline's stages: the fixed signatures, the default bodies, chained
// Transform and ReadMask stages for both kernel languages, the bitmap-mask ReadMask, the bilinear Sample and
// the channel-masked Filter. StageText<T>::Get(language) gives the text of a processor stage type T; a filter
// adds its own stage by specialising StageText for its Process type.

#include "host/raster/KernelText.h"
#include "host/raster/Stages.h"

#include <array>
#include <string>
#include <string_view>
#include <utility>

namespace RasterTools {

using Raster::HardwareKernelLanguage;

// The stage signatures, exactly as every fragment spells them.
namespace StageSignature {
inline constexpr std::string_view ReadMask = "inline float ReadMask(int2 location, uint2 mask_bounds, "
                                             "constant_address_space mask_type* mask_pixels, uint2 "
                                             "secondary_mask_bounds, constant_address_space mask_type* "
                                             "secondary_mask_pixels, params_address_space float* "
                                             "mask_params)";
inline constexpr std::string_view Process =
    "inline dest_type Process(dest_type source, dest_type dest, float mask, params_address_space float* "
    "process_params, constant_address_space void* process_pixels)";
inline constexpr std::string_view Transform =
    "inline float2 Transform(float2 location, params_address_space float* transform_params)";
inline constexpr std::string_view Sample =
    "inline source_type Sample(int2 location, uint2 source_bounds, constant_address_space source_type* "
    "input_pixels, params_address_space float* source_params, params_address_space float* transform_params, "
    "params_address_space float* sampler_params, uint2 sampler_bounds, constant_address_space void* "
    "sampler_pixels)";
inline constexpr std::string_view MaskSample =
    "inline mask_type Sample(int2 location, uint2 mask_bounds, constant_address_space mask_type* "
    "mask_pixels, "
    "params_address_space float* mask_params, params_address_space float* transform_params, "
    "params_address_space "
    "float* sampler_params, uint2 sampler_bounds, constant_address_space void* sampler_pixels)";
inline constexpr std::string_view Filter =
    "inline void Filter(dest_type dest, device_address_space dest_type* stream, params_address_space float* "
    "filter_params)";
} // namespace StageSignature

// The default bodies.
namespace StageBody {
inline constexpr std::string_view ReadMask = "return 1.0;";
inline constexpr std::string_view ConstantReadMask = "return mask_params[0];";
inline constexpr std::string_view Process = "return source;";
inline constexpr std::string_view IdentityTransform = "return convert_float2(location);";
inline constexpr std::string_view ScaleTransform =
    "return float2_literal(location.x*transform_params[0],location.y*transform_params[1]);";
inline constexpr std::string_view AffineTransform =
    "return float2_literal(location.x*transform_params[0]+location.y*transform_params[1]+transform_params[2],"
    "location.x*transform_params[3]+location.y*transform_params[4]+transform_params[5]);";
inline constexpr std::string_view NearestSample =
    "return "
    "Extend(TransformPixelCenterToInt(location,transform_params),source_bounds,input_pixels,source_params);";
inline constexpr std::string_view NearestMaskSample =
    "return "
    "Extend(TransformPixelCenterToInt(location,transform_params),mask_bounds,mask_pixels,mask_params);";
inline constexpr std::string_view Filter = "*stream = dest;";
} // namespace StageBody

// A stage function: its signature, then the body between braces.
std::string MakeStage(std::string_view signature, std::string_view body);

// Transform composed of two: Right applied to Left's result, Left's parameters from transform_params + 1 and
// Right's after them (the block starts with Left's float count). prefix and level keep nested chains'
// names apart in language 1 (empty and 1 at the outermost level). Empty for an unknown language.
std::string ChainTransforms(HardwareKernelLanguage language, std::string_view left, std::string_view right,
                            std::string_view prefix = {}, int level = 1);
// ReadMask composed of two: the product of both weights, parameters laid out as for transforms.
std::string ChainReadMasks(HardwareKernelLanguage language, std::string_view left, std::string_view right,
                           std::string_view prefix = {});

// TransformPixelCenterToFloat and TransformPixelCenterToInt over the Transform defined before them.
const char* GetTransformHelpersText(HardwareKernelLanguage language);

// The ReadMask of a mask bitmap: the Zero extend's mask fragment, the mask access fragment, an affine
// Transform and the nearest mask Sample, returning the normalised weight. Its block: [2, width, height,
// 6, affine, 0].
const char* GetBitmapReadMaskText(HardwareKernelLanguage language);

// The bilinear colour Sample.
const char* GetBilinearSampleText(HardwareKernelLanguage language);

// The Filter stage for a destination format: "*stream = dest;" without a channel mask, else the body that
// writes only the channels whose bit is set in filter_params[0].
const char* GetFilterText(Raster::PixelFormat dest, bool channelMasked, HardwareKernelLanguage language);
// The Filter that writes the colour channels and keeps the destination's alpha.
const char* GetColourOnlyFilterText(Raster::PixelFormat dest, HardwareKernelLanguage language);

// One text per pixel format and kernel language, built once by build(format, language) (empty text means
// "none") and kept for the life of the process. Get returns null for an invalid format or a language without
// text.
class PerFormatStageText {
public:
    template <class Build>
    explicit PerFormatStageText(Build build)
        : m_Texts([&]<std::size_t... I>(std::index_sequence<I...>) {
            return Texts{Raster::KernelTextPair([&](HardwareKernelLanguage language) {
                return build(static_cast<Raster::PixelFormat>(I), language);
            })...};
        }(std::make_index_sequence<Raster::PixelFormatCount>{})) {}

    const char* Get(HardwareKernelLanguage language, Raster::PixelFormat format) const noexcept {
        if (!Raster::IsValidPixelFormat(format)) return nullptr;
        return m_Texts[static_cast<std::size_t>(format)].Get(language);
    }

private:
    using Texts = std::array<Raster::KernelTextPair, Raster::PixelFormatCount>;
    Texts m_Texts;
};

// The kernel text of a processor stage type; specialised per type. Get returns null for a language without
// text.
template <class Stage>
struct StageText;

#define RT_DECLARE_STAGE_TEXT(Type)                                                                          \
    template <>                                                                                              \
    struct StageText<Type> {                                                                                 \
        static const char* Get(HardwareKernelLanguage language);                                             \
    };
RT_DECLARE_STAGE_TEXT(Raster::Copy)
RT_DECLARE_STAGE_TEXT(Raster::IdentityTransform)
RT_DECLARE_STAGE_TEXT(Raster::ScaleTransform)
RT_DECLARE_STAGE_TEXT(Raster::AffineTransform)
RT_DECLARE_STAGE_TEXT(Raster::IdentitySampler)
RT_DECLARE_STAGE_TEXT(Raster::BilinearSampler)
RT_DECLARE_STAGE_TEXT(Raster::IdentityMask)
RT_DECLARE_STAGE_TEXT(Raster::ConstantMask)
RT_DECLARE_STAGE_TEXT(Raster::BitmapMask)
#undef RT_DECLARE_STAGE_TEXT

// Chains nest: an inner chain's language-1 names take a prefix from its place (L, R) so that they stay apart.
template <class Left, class Right>
struct StageText<Raster::ChainedTransform<Left, Right>> {
    static const char* Get(HardwareKernelLanguage language);
    static std::string Build(HardwareKernelLanguage language, const std::string& prefix, int level);
};
template <class Left, class Right>
struct StageText<Raster::ChainedMask<Left, Right>> {
    static const char* Get(HardwareKernelLanguage language);
    static std::string Build(HardwareKernelLanguage language, const std::string& prefix, int level);
};

// Descriptor field 11: the Sample stage; a sampler whose text depends on the source format has
// StageText<Sampler>::Get(language, format).
template <class Sampler>
const char* GetSampleStageText(HardwareKernelLanguage language, Raster::PixelFormat source) {
    if constexpr (requires { StageText<Sampler>::Get(language, source); })
        return StageText<Sampler>::Get(language, source);
    else
        return StageText<Sampler>::Get(language);
}

// Descriptor field 10: the Transform followed by the pixel-centre helpers that samplers call.
template <class Transform>
const char* GetTransformStageText(HardwareKernelLanguage language);

} // namespace RasterTools

#include "pipeline/StageText.inl"
