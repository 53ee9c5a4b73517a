// The twirl and sphere Transform stages as kernel text: DistortMath's source, then a Transform that calls the
// mapping with the stage's four floats.
#include "filters/distort/DistortStages.h"
#include "filters/distort/RasterSphereCommand.h"
#include "filters/distort/RasterTwirlCommand.h"
#include "frame/Registration.h"

#include "host/raster/KernelText.h"

#include <string>

namespace RasterTools {

// The filters enter the catalogue and the host's class list when the library loads.
[[maybe_unused]] const FilterRegistration<TwirlFilter> kTwirlRegistration;
[[maybe_unused]] const FilterRegistration<SphereFilter> kSphereRegistration;

const char* DistortMath::GetSourceText() {
    static const char* const text = RASTER_KERNEL_STRINGIFY(RT_DISTORT_SOURCE);
    return text;
}

namespace {

using Language = HardwareKernelLanguage;

std::string BuildText(Language language, const char* map) {
    const std::string source = DistortMath::GetSourceText();
    const std::string call = std::string("(location,transform_params);");
    if (language == Language::CudaCpp) {
        // One function: a chain pastes each part as one static member, so the mapping's functions live in a
        // local structure inside it.
        return MakeStage(
            StageSignature::Transform,
            "struct DistortMath\n{\n#define RT_DISTORT_FUNCTION static\n#define RT_DISTORT_SQRT "
            "sqrtf\n" +
                source + "\n#undef RT_DISTORT_SQRT\n#undef RT_DISTORT_FUNCTION\n};\nreturn DistortMath::" +
                map + call);
    }
    if (language == Language::OpenCLC) {
        // At file level, once per kernel however many stages call it.
        return "#ifndef RT_DISTORT_SOURCE_DEFINED\n#define RT_DISTORT_SOURCE_DEFINED\n#define "
               "RT_DISTORT_FUNCTION "
               "inline\n#define RT_DISTORT_SQRT sqrt\n" +
               source + "\n#undef RT_DISTORT_SQRT\n#undef RT_DISTORT_FUNCTION\n#endif\n" +
               MakeStage(StageSignature::Transform, std::string("return ") + map + call);
    }
    return {};
}

// The sampler: pixel centres read their pixel, other locations go to the bilinear Sample, renamed.
constexpr const char* SampleBody =
    R"(float2 flocation = TransformPixelCenterToFloat(location,transform_params);
flocation-=0.5f;
int ix = rt_sat_int(flocation.x);
if (flocation.x < 0.0f) ix -= 1;
int iy = rt_sat_int(flocation.y);
if (flocation.y < 0.0f) iy -= 1;
if (flocation.x - (float)ix == 0.0f && flocation.y - (float)iy == 0.0f)
    return Extend(make_int2(ix,iy),source_bounds,input_pixels,source_params);
return %1(location,source_bounds,input_pixels,source_params,transform_params,sampler_params,sampler_bounds,sampler_pixels);)";

std::string BuildSampleText(Language language) {
    const char* bilinear = GetBilinearSampleText(language);
    if (!bilinear) return {};
    if (language == Language::CudaCpp)
        return MakeStage(StageSignature::Sample,
                         "struct Bilinear\n{\nstatic " + std::string(bilinear) + "};\n" +
                             Raster::FormatKernelText(SampleBody, {"Bilinear::Sample"}));
    if (language == Language::OpenCLC)
        return "#pragma push_macro(\"Sample\")\n#undef Sample\n#define Sample DistortBilinearSample\n" +
               std::string(bilinear) + "#undef Sample\n#pragma pop_macro(\"Sample\")\n" +
               MakeStage(StageSignature::Sample,
                         Raster::FormatKernelText(SampleBody, {"DistortBilinearSample"}));
    return {};
}

} // namespace

const char* StageText<SpanBilinearSampler>::Get(Language language) {
    static const Raster::KernelTextPair texts(BuildSampleText);
    return texts.Get(language);
}

const char* StageText<TwirlTransform>::Get(Language language) {
    static const Raster::KernelTextPair texts([](Language l) { return BuildText(l, "TwirlMap"); });
    return texts.Get(language);
}

const char* StageText<SphereTransform>::Get(Language language) {
    static const Raster::KernelTextPair texts([](Language l) { return BuildText(l, "SphereMap"); });
    return texts.Get(language);
}

} // namespace RasterTools
