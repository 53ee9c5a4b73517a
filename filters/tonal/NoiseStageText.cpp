// The add-noise Sample stage as kernel text, per source format and language: the generator text that the
// processor compiles (NoiseGenerator.h), then the Sample stage that seeds, draws and adds.
#include "filters/tonal/NoiseStages.h"
#include "filters/tonal/RasterAddNoiseCommand.h"
#include "frame/Registration.h"

#include "host/raster/KernelText.h"

#include <array>
#include <string>
#include <vector>

namespace RasterTools {

// The filter enters the catalogue and the host's class list when the library loads.
[[maybe_unused]] const FilterRegistration<AddNoiseFilter> kAddNoiseRegistration;

namespace {

using Language = HardwareKernelLanguage;
using Raster::PixelFormat;

// %1 is the number of accumulator channels, %2 the list of their draws (taken before the literal, whose
// components are evaluated in no fixed order), %3 the stores of the colour channels.
constexpr const char* SampleBody =
    R"(const int2 coords = TransformPixelCenterToInt(location,transform_params);
const source_type pixel = Extend(coords,source_bounds,input_pixels,source_params);
// MapPixelCenter! The sampler affine maps the pixel centre here (+0.5, then a floor), with the processor's
// arithmetic, so that both paths seed every pixel alike.
uint random = NoiseSeed(coords,sampler_params);
float n[%1];
NoiseDraws(%1,sampler_params,&random,n);
const source_accumulator_type noise = source_accumulator_literal(%2);
source_accumulator_type acc = accumulator_from_source(pixel) + noise*source_channel_maximum();
source_type result = pixel;
%3(void)sampler_bounds;
(void)sampler_pixels;
return result;)";

struct NoiseFormat {
    int channels;                 // accumulator channels, alpha last
    const char* component;        // stored type of a component; null for float
    const char* maximum;          // as an integer literal
    std::vector<const char*> out; // the colour channels of the result
    std::vector<const char*> acc; // and the matching accumulator components
};

NoiseFormat Describe(PixelFormat format) {
    switch (format) {
    case PixelFormat::RGBA8:
        return {4, "uchar", "255", {"x", "y", "z"}, {"x", "y", "z"}};
    case PixelFormat::RGBA16:
    case PixelFormat::LabA16:
        return {4, "ushort", "65535", {"x", "y", "z"}, {"x", "y", "z"}};
    case PixelFormat::RGBAUF:
        return {4, nullptr, nullptr, {"x", "y", "z"}, {"x", "y", "z"}};
    case PixelFormat::IA8:
        return {2, "uchar", "255", {"x"}, {"x"}};
    case PixelFormat::IA16:
        return {2, "ushort", "65535", {"x"}, {"x"}};
    case PixelFormat::CMYKA8:
        return {5, "uchar", "255", {"cmyk[0]", "cmyk[1]", "cmyk[2]", "cmyk[3]"}, {"s0", "s1", "s2", "s3"}};
    default:
        return {0, nullptr, nullptr, {}, {}};
    }
}

std::string BuildBody(PixelFormat format) {
    const NoiseFormat f = Describe(format);
    if (f.channels == 0) return {};
    std::string list, stores;
    for (int c = 0; c < f.channels; ++c)
        list += (c ? ",n[" : "n[") + std::to_string(c) + "]";
    if (!f.component) stores += "source_clamp_accumulator(acc);\n"; // the float format's own clamp rule
    for (std::size_t c = 0; c < f.out.size(); ++c) {
        const std::string value = std::string("acc.") + f.acc[c];
        stores +=
            std::string("result.") + f.out[c] + " = " +
            (f.component ? std::string("(") + f.component + ")NoiseToInteger(" + value + "," + f.maximum + ")"
                         : value) +
            ";\n";
    }
    return Raster::FormatKernelText(SampleBody, {std::to_string(f.channels), list, stores});
}

// The stage signature's parameters, as a call passes them on.
constexpr const char* SampleArguments =
    "location,source_bounds,input_pixels,source_params,transform_params,sampler_params,sampler_bounds,"
    "sampler_pixels";

std::string BuildText(PixelFormat format, Language language) {
    const std::string body = BuildBody(format);
    if (body.empty()) return {};
    return MakeGeneratorSampleStage(language, "AddNoise", body);
}

} // namespace

std::string MakeGeneratorSampleStage(Language language, std::string_view scope, std::string_view body) {
    const std::string generator = NoiseGenerator::GetNoiseGeneratorText();
    if (language == Language::CudaCpp) {
        // Everything lives in a local structure: the generator as static members, then the stage itself.
        std::string member(StageSignature::Sample);
        member.replace(0, std::string_view("inline").size(), "static");
        const std::string name(scope);
        return MakeStage(StageSignature::Sample,
                         "struct " + name + "\n{\n#define RT_NOISE_FUNCTION static\n" + generator +
                             "\n#undef RT_NOISE_FUNCTION\n" + MakeStage(member, body) + "};\nreturn " + name +
                             "::Sample(" + SampleArguments + ");");
    }
    if (language == Language::OpenCLC) {
        // No scopes: the generator's names are redefined for this fragment and restored after it.
        std::string text;
        for (const char* name : NoiseGenerator::DefinedNames)
            text += std::string("#pragma push_macro(\"") + name + "\")\n#undef " + name + "\n#define " +
                    name + " " + std::string(scope) + name + "\n";
        text += "#define RT_NOISE_FUNCTION inline\n" + generator + "\n#undef RT_NOISE_FUNCTION\n";
        text += MakeStage(StageSignature::Sample, body);
        for (const char* name : NoiseGenerator::DefinedNames)
            text += std::string("#undef ") + name + "\n#pragma pop_macro(\"" + name + "\")\n";
        return text;
    }
    return {};
}

const char* StageText<NoiseSampler>::Get(Language language, PixelFormat source) {
    static const PerFormatStageText texts(BuildText);
    return texts.Get(language, source);
}

} // namespace RasterTools
