// The lighting Sample stage as kernel text, per source format and language: LightingMath's source, the
// format's conversions to and from the working pixel, then the Sample stage that reads the relief, shades
// and lights the pixel.
#include "filters/lighting/LightingStages.h"
#include "filters/lighting/RasterLightingCommand.h"
#include "frame/Registration.h"
#include "pipeline/Formats.h"

#include "host/raster/KernelText.h"

#include <string>

namespace RasterTools {

// The filter enters the catalogue and the host's class list when the library loads.
[[maybe_unused]] const FilterRegistration<LightingFilter> kLightingRegistration;

const char* LightingMath::GetSourceText() {
    static const std::string text = [] {
        std::string names = "enum {";
#define RT_LIGHTING_TEXT(name, value) names += std::string(" ") + #name + " = " + std::to_string(value) + ",";
        RT_LIGHTING_INDICES(RT_LIGHTING_TEXT)
#undef RT_LIGHTING_TEXT
        names.back() = ' ';
        return names + "};\n" + RASTER_KERNEL_STRINGIFY(RT_LIGHTING_SOURCE);
    }();
    return text.c_str();
}

namespace {

using Language = HardwareKernelLanguage;
using Raster::PixelFormat;

// The stage's body: the four heights (from the sampler image, a bump map of floats, when it has a width;
// otherwise the source's luminance; 0 outside either), the normal, the lights, and the pixel lit in the
// working pixel. LightingToWorking and LightingFromWorking are the format's conversions.
constexpr const char* SampleBody =
    R"(params_address_space float* p = sampler_params;
const float2 v = LightingSurface(location,p);
float4 n = make_float4(0.0f,0.0f,1.0f,0.0f);
if (p[LightingNormalZ] != 0.0f) {
    float h[4];
    const float dx[4] = {0.0f,0.0f,-1.0f,1.0f};
    const float dy[4] = {-1.0f,1.0f,0.0f,0.0f};
    for (int i = 0; i < 4; ++i) {
        const int2 at = LightingBumpAt(v,dx[i],dy[i],p);
        if (sampler_bounds.x > 0u)
            h[i] = at.x < 0 || at.y < 0 || at.x >= (int)sampler_bounds.x || at.y >= (int)sampler_bounds.y
                       ? 0.0f
                       : ((constant_address_space float*)sampler_pixels)[at.y * (int)sampler_bounds.x + at.x];
        else
            h[i] = at.x < 0 || at.y < 0 || at.x >= (int)source_bounds.x || at.y >= (int)source_bounds.y
                       ? 0.0f
                       : LightingLuminance(LightingToWorking(Extend(at,source_bounds,input_pixels,source_params)));
    }
    n = LightingNormal(h[0],h[1],h[2],h[3],p);
}
float4 lit;
float4 shine;
LightingShade(v,n,p,&lit,&shine);
const source_type pixel = Extend(TransformPixelCenterToInt(location,transform_params),source_bounds,input_pixels,source_params);
return LightingFromWorking(LightingLit(LightingToWorking(pixel),lit,shine));)";

// The format's two conversions under the stage's names, as functions of the current scope: %1 the storage
// keyword, %2 the body to the working pixel, %3 the body from it.
constexpr const char* Conversions = R"(%1 rgbauf_type LightingToWorking(source_type source)
{
%2
}
%1 source_type LightingFromWorking(rgbauf_type source)
{
%3
}
)";

// The stage signature's parameters, as a call passes them on.
constexpr const char* SampleArguments =
    "location,source_bounds,input_pixels,source_params,transform_params,sampler_params,sampler_bounds,"
    "sampler_pixels";

std::string BuildText(PixelFormat format, Language language) {
    const ConvertPair pair = GetConvertPair(format);
    if (pair.toWorking.empty() || pair.fromWorking.empty()) return {};
    const std::string source = LightingMath::GetSourceText();
    if (language == Language::CudaCpp) {
        // Everything lives in a local structure: the model and conversions as static members, then the stage.
        std::string member(StageSignature::Sample);
        member.replace(0, std::string_view("inline").size(), "static");
        return MakeStage(
            StageSignature::Sample,
            "struct Lighting\n{\n#define RT_LIGHTING_FUNCTION static\n#define RT_LIGHTING_SQRT "
            "sqrtf\n" +
                source + "\n#undef RT_LIGHTING_SQRT\n#undef RT_LIGHTING_FUNCTION\n" +
                Raster::FormatKernelText(Conversions, {"static", pair.toWorking, pair.fromWorking}) +
                MakeStage(member, SampleBody) + "};\nreturn Lighting::Sample(" + SampleArguments + ");");
    }
    if (language == Language::OpenCLC) {
        // At file level: the names are the stage's own (every one starts with Lighting).
        return "#define RT_LIGHTING_FUNCTION inline\n#define RT_LIGHTING_SQRT sqrt\n" + source +
               "\n#undef RT_LIGHTING_SQRT\n#undef RT_LIGHTING_FUNCTION\n" +
               Raster::FormatKernelText(Conversions, {"inline", pair.toWorking, pair.fromWorking}) +
               MakeStage(StageSignature::Sample, SampleBody);
    }
    return {};
}

} // namespace

const char* StageText<LightingSampler>::Get(Language language, PixelFormat source) {
    static const PerFormatStageText texts(BuildText);
    return texts.Get(language, source);
}

} // namespace RasterTools
