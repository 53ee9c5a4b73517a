// The library's stage texts and their composition.
#include "pipeline/StageText.h"

#include "host/raster/KernelText.h"

#include <array>
#include <vector>

namespace RasterTools {

namespace {

using Language = HardwareKernelLanguage;
using Raster::FormatKernelText;
using Raster::KernelTextPair;

// ---- Chains. Language 0 nests each part as a static member of a local structure; language 1 has no such
// scopes, so each part is pasted at file level with its names redefined, and the macros restored after.

constexpr const char* TransformChainCuda =
    R"(inline float2 Transform(float2 location, params_address_space float* transform_params)
{
    struct Left
    {
        static %1
    };
    struct Right
    {
        static %2
    };
    return Right::Transform(Left::Transform(location,transform_params+1),transform_params+(int)transform_params[0]+1);
}
)";

constexpr const char* TransformChainOpenCL = R"(#pragma push_macro("Transform")
#undef Transform
#define Transform Transform%5_%6_%3
%1
#undef Transform
#pragma pop_macro("Transform")
#pragma push_macro("Transform")
#undef Transform
#define Transform Transform%5_%6_%4
%2
#undef Transform
#pragma pop_macro("Transform")
inline float2 Transform(float2 location, params_address_space float* transform_params)
{
    return Transform%5_%6_%4(Transform%5_%6_%3(location,transform_params+1),transform_params+(int)transform_params[0]+1);
}
)";

// The six names a mask part defines, and what they become inside a chain (n appended).
constexpr std::array<std::pair<const char*, const char*>, 6> MaskNames{{
    {"ReadMask", "ReadMask"},
    {"Sample", "SampleMask"},
    {"Transform", "TransformMask"},
    {"TransformPixelCenterToFloat", "TransformPixelCenterToFloatMask"},
    {"TransformPixelCenterToInt", "TransformPixelCenterToIntMask"},
    {"Extend", "ExtendMask"},
}};

using Renaming = std::vector<std::pair<std::string, std::string>>;

// Pastes text with each name redefined as its replacement, and the names' previous macros restored after.
std::string WrapRenamed(std::string_view text, const Renaming& renaming) {
    std::string out;
    for (const auto& [name, replacement] : renaming)
        out += "#pragma push_macro(\"" + name + "\")\n#undef " + name + "\n#define " + name + " " +
               replacement + "\n";
    out += text;
    if (!out.empty() && out.back() != '\n') out += '\n';
    for (const auto& [name, replacement] : renaming)
        out += "#undef " + name + "\n#pragma pop_macro(\"" + name + "\")\n";
    return out;
}

// A chain part's names: ReadMask2, SampleMask2, ... for the left part, 3 for the right.
Renaming ChainPartRenaming(const std::string& suffix) {
    Renaming renaming;
    for (const auto& [name, renamed] : MaskNames)
        renaming.emplace_back(name, renamed + suffix);
    return renaming;
}

constexpr const char* MaskArgumentsLeft =
    "(location,mask_bounds,mask_pixels,secondary_mask_bounds,secondary_mask_pixels,mask_params+1)";
constexpr const char* MaskArgumentsRight = "(location,mask_bounds,mask_pixels,secondary_mask_bounds,"
                                           "secondary_mask_pixels,mask_params+(int)mask_params[0]+1)";

// ---- Helpers and fixed stage texts

constexpr const char* HelperToFloat =
    "inline float2 TransformPixelCenterToFloat(int2 location, params_address_space float* transform_params)\n"
    "{\n    return Transform(convert_float2(location)+0.5f,transform_params);\n}\n";
constexpr const char* HelperToInt =
    "inline int2 TransformPixelCenterToInt(int2 location, params_address_space float* transform_params)\n"
    "{\n    return convert_int2(floor(Transform(convert_float2(location)+0.5f,transform_params)));\n}\n";

// The processor's BilinearSampler: the interpolation's tokens (Stages.h), reading through Extend.
const std::string& BilinearBody() {
    static const std::string body =
        std::string("float2 flocation = TransformPixelCenterToFloat(location,transform_params);\n"
                    "flocation-=0.5f;\n"
                    "#define RASTER_BILINEAR_READ(x,y) "
                    "premultiplied_accumulator_from_source(Extend(make_int2(x,y),source_bounds,input_pixels,"
                    "source_params))\n") +
        RASTER_KERNEL_STRINGIFY(RASTER_BILINEAR_INTERPOLATION(source_accumulator_type, RASTER_BILINEAR_READ,
                                                              accumulator_from_source(source_minimum()))) +
        "\n#undef RASTER_BILINEAR_READ\n"
        "(void)sampler_params; (void)sampler_bounds; (void)sampler_pixels;\n"
        "return source_from_accumulator(postdivide_source(result));";
    return body;
}

constexpr const char* BitmapMaskBody =
    R"(params_address_space float* transform_block = mask_params + (int)mask_params[0] + 1;
params_address_space float* sampler_block = transform_block + (int)transform_block[0] + 1;
(void)secondary_mask_bounds;
(void)secondary_mask_pixels;
return normalise_mask(%1Sample(location,mask_bounds,mask_pixels,mask_params+1,transform_block+1,sampler_block+1,make_uint2(0u,0u),mask_pixels));)";

std::string Static(std::string_view text) {
    return "static " + std::string(text);
}

std::string BuildBitmapReadMask(Language language) {
    const char* extend = Raster::Zero::GetMaskHardwareFragment(language);
    const char* access = Raster::BitmapOf<Raster::PixelFormat::MaskA8>::GetMaskHardwareFragment(language);
    const char* transform = StageText<Raster::AffineTransform>::Get(language);
    if (!extend || !access || !transform) return {};
    const std::string sample = MakeStage(StageSignature::MaskSample, StageBody::NearestMaskSample);
    if (language == Language::CudaCpp) {
        std::string members;
        for (const std::string& part : {std::string(access), std::string(extend), std::string(transform),
                                        std::string(HelperToFloat), std::string(HelperToInt), sample})
            members += Static(part);
        std::string body =
            "struct Mask\n{\n" + members + "};\n" + FormatKernelText(BitmapMaskBody, {"Mask::"});
        return MakeStage(StageSignature::ReadMask, body);
    }
    if (language == Language::OpenCLC) {
        // C wants each function before its first call: access, extend, transform, helpers, sample.
        std::string parts = std::string(access) + extend + transform + HelperToFloat + HelperToInt + sample;
        parts += MakeStage(StageSignature::ReadMask, FormatKernelText(BitmapMaskBody, {""}));
        // The mask's own stages get names of their own (MaskSampleBitmap, ...); the ReadMask after them
        // forwards under the name the context expects.
        Renaming renaming;
        for (const auto& [name, renamed] : MaskNames)
            renaming.emplace_back(name, std::string("Mask") + name + "Bitmap");
        renaming.emplace_back("LoadMask", "MaskLoadMaskBitmap");
        return WrapRenamed(parts, renaming) +
               MakeStage(StageSignature::ReadMask,
                         "return MaskReadMaskBitmap(location,mask_bounds,mask_pixels,"
                         "secondary_mask_bounds,secondary_mask_pixels,mask_params);");
    }
    return {};
}

std::string FilterBody(Raster::PixelFormat format, bool masked) {
    if (!masked) return std::string(StageBody::Filter);
    const std::string head = "int mask = (int)filter_params[0];\n";
    if (format == Raster::PixelFormat::CMYKA8)
        return head + "if (mask & 1) stream->cmyk[0] = dest.cmyk[0];\nif (mask & 2) stream->cmyk[1] = "
                      "dest.cmyk[1];\n"
                      "if (mask & 4) stream->cmyk[2] = dest.cmyk[2];\nif (mask & 8) stream->cmyk[3] = "
                      "dest.cmyk[3];\n"
                      "if (mask & 16) stream->a = dest.a;";
    switch (Raster::GetChannelCount(format)) {
    case 1:
        return head + "if (mask & 1) *stream = dest;";
    case 2:
        // Intensity answers to any colour bit, alpha to 8: a colour-only mask (7) means the same everywhere.
        return head + "if (mask & 7) stream->x = dest.x;\nif (mask & 8) stream->y = dest.y;";
    default:
        return head + "if (mask & 1) stream->x = dest.x;\nif (mask & 2) stream->y = dest.y;\n"
                      "if (mask & 4) stream->z = dest.z;\nif (mask & 8) stream->w = dest.w;";
    }
}

std::string ColourOnlyFilterBody(Raster::PixelFormat format, Language language) {
    if (format == Raster::PixelFormat::CMYKA8)
        // Arrays are not assignable in either language, so the four inks go one by one.
        return "stream->cmyk[0] = dest.cmyk[0];\nstream->cmyk[1] = dest.cmyk[1];\nstream->cmyk[2] = "
               "dest.cmyk[2];\nstream->cmyk[3] = dest.cmyk[3];";
    switch (Raster::GetChannelCount(format)) {
    case 1:
        return "(void)dest;\n(void)stream;"; // a mask has no colour
    case 2:
        return "stream->x = dest.x;";
    default:
        // Language 0's vector types have no swizzles.
        return language == Language::OpenCLC
                   ? "stream->xyz = dest.xyz;"
                   : "stream->x = dest.x;\nstream->y = dest.y;\nstream->z = dest.z;";
    }
}

} // namespace

std::string MakeStage(std::string_view signature, std::string_view body) {
    std::string text(signature);
    text += "\n{\n";
    text += body;
    text += "\n}\n";
    return text;
}

std::string ChainTransforms(Language language, std::string_view left, std::string_view right,
                            std::string_view prefix, int level) {
    switch (language) {
    case Language::CudaCpp:
        return FormatKernelText(TransformChainCuda, {left, right});
    case Language::OpenCLC:
        return FormatKernelText(TransformChainOpenCL, {left, right, "2", "3", prefix, std::to_string(level)});
    default:
        return {};
    }
}

std::string ChainReadMasks(Language language, std::string_view left, std::string_view right,
                           std::string_view prefix) {
    switch (language) {
    case Language::CudaCpp: {
        const std::string combine = std::string("return Left::ReadMask") + MaskArgumentsLeft +
                                    "*Right::ReadMask" + MaskArgumentsRight + ";";
        return MakeStage(StageSignature::ReadMask, "struct Left\n{\n" + Static(left) +
                                                       "};\nstruct Right\n{\n" + Static(right) + "};\n" +
                                                       combine);
    }
    case Language::OpenCLC: {
        const std::string leftName = std::string(prefix) + "2", rightName = std::string(prefix) + "3";
        const std::string combine = "return ReadMask" + leftName + MaskArgumentsLeft + "*ReadMask" +
                                    rightName + MaskArgumentsRight + ";";
        return WrapRenamed(left, ChainPartRenaming(leftName)) +
               WrapRenamed(right, ChainPartRenaming(rightName)) +
               MakeStage(StageSignature::ReadMask, combine);
    }
    default:
        return {};
    }
}

const char* GetTransformHelpersText(Language language) {
    static const KernelTextPair texts([](Language) { return std::string(HelperToFloat) + HelperToInt; });
    return texts.Get(language);
}

const char* GetBitmapReadMaskText(Language language) {
    return StageText<Raster::BitmapMask>::Get(language);
}

const char* GetBilinearSampleText(Language language) {
    return StageText<Raster::BilinearSampler>::Get(language);
}

const char* GetFilterText(Raster::PixelFormat dest, bool channelMasked, Language language) {
    static const PerFormatStageText plain([](Raster::PixelFormat f, Language) {
        return MakeStage(StageSignature::Filter, FilterBody(f, false));
    });
    static const PerFormatStageText masked([](Raster::PixelFormat f, Language) {
        return MakeStage(StageSignature::Filter, FilterBody(f, true));
    });
    return (channelMasked ? masked : plain).Get(language, dest);
}

const char* GetColourOnlyFilterText(Raster::PixelFormat dest, Language language) {
    static const PerFormatStageText texts([](Raster::PixelFormat f, Language l) {
        return MakeStage(StageSignature::Filter, ColourOnlyFilterBody(f, l));
    });
    return texts.Get(language, dest);
}

#define RT_DEFINE_STAGE_TEXT(Type, Build)                                                                    \
    const char* StageText<Type>::Get(Language language) {                                                    \
        static const KernelTextPair texts(Build);                                                            \
        return texts.Get(language);                                                                          \
    }

RT_DEFINE_STAGE_TEXT(Raster::Copy,
                     [](Language) { return MakeStage(StageSignature::Process, StageBody::Process); })
RT_DEFINE_STAGE_TEXT(Raster::IdentityTransform, [](Language) {
    return MakeStage(StageSignature::Transform, StageBody::IdentityTransform);
})
RT_DEFINE_STAGE_TEXT(Raster::ScaleTransform,
                     [](Language) { return MakeStage(StageSignature::Transform, StageBody::ScaleTransform); })
RT_DEFINE_STAGE_TEXT(Raster::AffineTransform, [](Language) {
    return MakeStage(StageSignature::Transform, StageBody::AffineTransform);
})
RT_DEFINE_STAGE_TEXT(Raster::IdentitySampler,
                     [](Language) { return MakeStage(StageSignature::Sample, StageBody::NearestSample); })
RT_DEFINE_STAGE_TEXT(Raster::BilinearSampler,
                     [](Language) { return MakeStage(StageSignature::Sample, BilinearBody()); })
RT_DEFINE_STAGE_TEXT(Raster::IdentityMask,
                     [](Language) { return MakeStage(StageSignature::ReadMask, StageBody::ReadMask); })
RT_DEFINE_STAGE_TEXT(Raster::ConstantMask, [](Language) {
    return MakeStage(StageSignature::ReadMask, StageBody::ConstantReadMask);
})
RT_DEFINE_STAGE_TEXT(Raster::BitmapMask, BuildBitmapReadMask)
#undef RT_DEFINE_STAGE_TEXT

} // namespace RasterTools
