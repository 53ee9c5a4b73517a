// The host's kernel fragments: image access, extends, the normal blend, conversion wrappers and the per-pixel
// loop, for both kernel languages.
#include "host/raster/BlendModeMath.h"
#include "host/raster/KernelFragments.h"
#include "host/raster/KernelText.h"

#include <array>

namespace Raster {

namespace {

using Language = HardwareKernelLanguage;

// ---- Image access

std::string AccessText(KernelImageRole role) {
    switch (role) {
    case KernelImageRole::Source:
        return "inline source_type LoadSource(constant_address_space source_type* pixels, uint2 bounds, "
               "int2 location)\n{\n    return pixels[location.y * (int)bounds.x + location.x];\n}\n";
    case KernelImageRole::Dest:
        return "inline device_address_space dest_type* DestAddress(device_address_space dest_type* pixels, "
               "uint2 bounds, int2 location)\n{\n    return pixels + (location.y * (int)bounds.x + "
               "location.x);\n}\n";
    case KernelImageRole::Mask:
        return "inline mask_type LoadMask(constant_address_space mask_type* pixels, uint2 bounds, int2 "
               "location)\n"
               "{\n    return pixels[location.y * (int)bounds.x + location.x];\n}\n";
    }
    return {};
}

// ---- Extends. One function each, so that a mask's copy can become a static member (language 0) or be
// renamed (language 1). %1 is the pixel type, %2 the load function, %3 the value outside for Zero.

constexpr const char* ExtendSignature =
    "inline %1 Extend(int2 location, uint2 bounds, constant_address_space %1* "
    "pixels, params_address_space float* params)\n{\n    (void)params;\n";

enum class ExtendKind { Safe, Zero, Wrap, Repeat, Mirror, Full };

std::string ExtendText(ExtendKind kind, bool mask) {
    const char* type = mask ? "mask_type" : "source_type";
    const char* load = mask ? "LoadMask" : "LoadSource";
    const char* outside = mask ? "(mask_type)0" : "source_minimum()";
    std::string body;
    switch (kind) {
    case ExtendKind::Safe:
        body = "    return %2(pixels, bounds, make_int2(rt_clampi(location.x, 0, (int)bounds.x - 1), "
               "rt_clampi(location.y, 0, (int)bounds.y - 1)));\n";
        break;
    case ExtendKind::Zero:
        body = "    if (location.x < 0 || location.y < 0 || location.x >= (int)bounds.x || location.y >= "
               "(int)bounds.y)\n        return %3;\n    return %2(pixels, bounds, location);\n";
        break;
    case ExtendKind::Wrap:
        body = "    return %2(pixels, bounds, make_int2(rt_wrapi(location.x, (int)bounds.x), "
               "rt_clampi(location.y, 0, (int)bounds.y - 1)));\n";
        break;
    case ExtendKind::Repeat:
        body = "    return %2(pixels, bounds, make_int2(rt_wrapi(location.x, (int)bounds.x), "
               "rt_wrapi(location.y, (int)bounds.y)));\n";
        break;
    case ExtendKind::Mirror:
        body = "    return %2(pixels, bounds, make_int2(rt_mirrori(location.x, (int)bounds.x), "
               "rt_mirrori(location.y, (int)bounds.y)));\n";
        break;
    case ExtendKind::Full:
        body = "    return %2(pixels, bounds, location);\n";
        break;
    }
    return FormatKernelText(std::string(ExtendSignature) + body + "}\n", {type, load, outside});
}

template <ExtendKind Kind, bool Mask>
const char* CachedExtend(Language language) {
    static const KernelTextPair texts([](Language) { return ExtendText(Kind, Mask); });
    return texts.Get(language);
}

// ---- The per-pixel loop

constexpr const char* LoopParameters =
    "(\n"
    "    constant_address_space source_type* input_pixels, int source_width, int source_height,\n"
    "    device_address_space dest_type* dest_pixels, int dest_width, int dest_height,\n"
    "    constant_address_space mask_type* mask_pixels, int mask_width, int mask_height,\n"
    "    constant_address_space mask_type* secondary_mask_pixels, int secondary_mask_width, "
    "int secondary_mask_height,\n"
    "    constant_address_space void* sampler_pixels, int sampler_width, int sampler_height,\n"
    "    params_address_space float* params, int params_length,\n"
    "    constant_address_space void* process_pixels, int2 rect_origin, int2 rect_size)\n{\n";

std::string LoopText(Language language, unsigned flags) {
    const bool readsMask = flags & 1, processReadsDestination = flags & 2, samplesSource = flags & 4,
               blends = flags & 8, skipsEmptyMask = flags & 16;
    std::string text;
    if (language == Language::OpenCLC) {
        text = std::string("kernel void ") + KernelPerPixel<Horizontal>::EntryPoint + LoopParameters +
               "    const int2 offset = make_int2((int)get_global_id(0), (int)get_global_id(1));\n";
    } else if (language == Language::CudaCpp) {
        text = std::string("extern \"C\" __global__ void ") + KernelPerPixel<Horizontal>::EntryPoint +
               LoopParameters +
               "    const int2 offset = make_int2((int)(blockIdx.x * blockDim.x + threadIdx.x), "
               "(int)(blockIdx.y * blockDim.y + threadIdx.y));\n";
    } else {
        return {};
    }
    text += "    if (offset.x >= rect_size.x || offset.y >= rect_size.y) return;\n"
            "    (void)params_length;\n"
            "    const int2 location = make_int2(rect_origin.x + offset.x, rect_origin.y + offset.y);\n"
            "    params_address_space float* source_params = params + (int)params[0];\n"
            "    params_address_space float* transform_params = params + (int)params[2];\n"
            "    params_address_space float* process_params = params + (int)params[3];\n"
            "    params_address_space float* sampler_params = params + (int)params[4];\n"
            "    params_address_space float* mask_params = params + (int)params[5];\n"
            "    params_address_space float* filter_params = params + (int)params[6];\n"
            "    const uint2 source_bounds = make_uint2((uint)source_width, (uint)source_height);\n"
            "    const uint2 dest_bounds = make_uint2((uint)dest_width, (uint)dest_height);\n"
            "    const uint2 mask_bounds = make_uint2((uint)mask_width, (uint)mask_height);\n"
            "    const uint2 secondary_mask_bounds = make_uint2((uint)secondary_mask_width, "
            "(uint)secondary_mask_height);\n"
            "    const uint2 sampler_bounds = make_uint2((uint)sampler_width, (uint)sampler_height);\n"
            "    (void)source_params; (void)transform_params; (void)sampler_params; (void)mask_params;\n"
            "    (void)source_bounds; (void)mask_bounds; (void)secondary_mask_bounds; (void)sampler_bounds;\n"
            "    device_address_space dest_type* stream = DestAddress(dest_pixels, dest_bounds, location);\n";
    if (readsMask) {
        text += "    const float mask = ReadMask(location, mask_bounds, mask_pixels, secondary_mask_bounds, "
                "secondary_mask_pixels, mask_params);\n";
        if (skipsEmptyMask) text += "    if (mask <= 0.0f) return;\n";
    } else {
        text += "    const float mask = 1.0f;\n";
    }
    const bool readsDestination = processReadsDestination || blends || !samplesSource;
    if (readsDestination) text += "    const dest_type dest = *stream;\n";
    if (samplesSource)
        text += "    const dest_type converted = ConvertSourceToDest(Sample(location, source_bounds, "
                "input_pixels, "
                "source_params, transform_params, sampler_params, sampler_bounds, sampler_pixels));\n";
    else
        text += "    const dest_type converted = dest;\n";
    text += std::string("    dest_type result = Process(converted, ") +
            (processReadsDestination ? "dest" : "converted") + ", mask, process_params, process_pixels);\n";
    if (blends) text += "    result = Blend(result, dest, mask);\n";
    text += "    Filter(result, stream, filter_params);\n}\n";
    return text;
}

// ---- Conversions

constexpr const char* JointOpenCL = R"(#define Convert ConvertSourceToWorking
inline rgbauf_type Convert(source_type source)
{

%1

}
#undef Convert
#define Convert ConvertWorkingToDest
inline dest_type Convert(rgbauf_type source)
{

%2

}
#undef Convert
inline dest_type ConvertSourceToDest(source_type source)
{
    return ConvertWorkingToDest(ConvertSourceToWorking(source));
}
)";

constexpr const char* JointCuda = R"(struct SourceToWorking
{
    static inline rgbauf_type Convert(source_type source)
    {

%1

    }
};
struct WorkingToDest
{
    static inline dest_type Convert(rgbauf_type source)
    {

%2

    }
};
inline dest_type ConvertSourceToDest(source_type source)
{
    return WorkingToDest::Convert(SourceToWorking::Convert(source));
}
)";

// One Convert body from argument to result, reached as the free function `function`: renamed by #define for
// language 1; for language 0 a static member of `structure`, which the free function forwards to. %1
// function, %2 structure, %3 result type, %4 argument type, %5 the body.
constexpr const char* ConvertFunctionOpenCL = R"(#define Convert %1
inline %3 Convert(%4 source)
{

%5

}
#undef Convert
)";

constexpr const char* ConvertFunctionCuda = R"(struct %2
{
    static inline %3 Convert(%4 source)
    {

%5

    }
};
inline %3 %1(%4 source)
{
    return %2::Convert(source);
}
)";

struct ConvertFunction {
    std::string_view function, structure, result, argument;
};
constexpr ConvertFunction WorkingToDest{"ConvertWorkingToDest", "WorkingToDest", "dest_type", "rgbauf_type"};
constexpr ConvertFunction SamplerToWorking{"ConvertSamplerToWorking", "SamplerToWorking", "rgbauf_type",
                                           "sampler_type"};

std::string ConvertFunctionText(Language language, const ConvertFunction& f, std::string_view body) {
    const std::initializer_list<std::string_view> arguments{f.function, f.structure, f.result, f.argument,
                                                            body};
    switch (language) {
    case Language::OpenCLC:
        return FormatKernelText(ConvertFunctionOpenCL, arguments);
    case Language::CudaCpp:
        return FormatKernelText(ConvertFunctionCuda, arguments);
    default:
        return {};
    }
}

// Both languages.
constexpr const char* SamplerReader =
    R"(inline rgbauf_type ReadSampler(int2 location, uint2 sampler_bounds, constant_address_space void* sampler_pixels)
{
    const int x = rt_clampi(location.x, 0, (int)sampler_bounds.x - 1);
    const int y = rt_clampi(location.y, 0, (int)sampler_bounds.y - 1);
    return ConvertSamplerToWorking(((constant_address_space sampler_type*)sampler_pixels)[y * (int)sampler_bounds.x + x]);
}
)";

constexpr const char* SamplerToDest = R"(inline dest_type ConvertSamplerToDest(sampler_type source)
{
    return ConvertWorkingToDest(ConvertSamplerToWorking(source));
}
)";

// The sampler's traits, ConvertSamplerToWorking and ReadSampler.
std::string SamplerText(Language language, std::string_view traits, std::string_view toWorking) {
    const std::string convert = ConvertFunctionText(language, SamplerToWorking, toWorking);
    if (convert.empty()) return {};
    return "\n" + std::string(traits) + "\n" + convert + SamplerReader;
}

} // namespace

const char* GetImageAccessFragment(KernelImageRole role, HardwareKernelLanguage language) {
    static const std::array<KernelTextPair, 3> texts{
        KernelTextPair([](Language) { return AccessText(KernelImageRole::Source); }),
        KernelTextPair([](Language) { return AccessText(KernelImageRole::Dest); }),
        KernelTextPair([](Language) { return AccessText(KernelImageRole::Mask); }),
    };
    return texts[static_cast<std::size_t>(role)].Get(language);
}

#define RASTER_DEFINE_EXTEND_FRAGMENTS(Type)                                                                 \
    const char* Type::GetHardwareFragment(HardwareKernelLanguage language) {                                 \
        return CachedExtend<ExtendKind::Type, false>(language);                                              \
    }                                                                                                        \
    const char* Type::GetMaskHardwareFragment(HardwareKernelLanguage language) {                             \
        return CachedExtend<ExtendKind::Type, true>(language);                                               \
    }
RASTER_DEFINE_EXTEND_FRAGMENTS(Safe)
RASTER_DEFINE_EXTEND_FRAGMENTS(Zero)
RASTER_DEFINE_EXTEND_FRAGMENTS(Wrap)
RASTER_DEFINE_EXTEND_FRAGMENTS(Repeat)
RASTER_DEFINE_EXTEND_FRAGMENTS(Mirror)
RASTER_DEFINE_EXTEND_FRAGMENTS(Full)
#undef RASTER_DEFINE_EXTEND_FRAGMENTS

const char* NormalBlend::GetHardwareFragment(HardwareKernelLanguage language) {
    static const KernelTextPair texts([](Language) -> std::string {
        return "inline dest_type Blend(dest_type source, dest_type dest, float mask)\n{\n"
               "    if (mask >= 1.0f) return source;\n"
               "    if (mask <= 0.0f) return dest;\n"
               "    return dest_from_accumulator(rt_mix(accumulator_from_dest(dest), "
               "accumulator_from_dest(source), "
               "mask));\n}\n";
    });
    return texts.Get(language);
}

const char* GetBlendFragment(BlendMode mode, HardwareKernelLanguage language) {
    switch (mode) {
    case BlendMode::Normal:
        return NormalBlend::GetHardwareFragment(language);
    }
    return nullptr;
}

const char* GetBlendModeMathText(HardwareKernelLanguage language) {
    static const KernelTextPair texts([](Language textLanguage) -> std::string {
        const char* sqrt = textLanguage == Language::OpenCLC   ? "sqrt"
                           : textLanguage == Language::CudaCpp ? "sqrtf"
                                                               : nullptr;
        if (!sqrt) return {};
        return std::string("#ifndef RT_BLEND_MODE_MATH\n#define RT_BLEND_MODE_MATH\n#define rt_sqrt ") +
               sqrt + "\n" + RASTER_KERNEL_STRINGIFY(RT_BLEND_MODE_SOURCE) + "\n#endif\n";
    });
    return texts.Get(language);
}

const char* KernelPerPixel<Horizontal>::GetHardwareFragment(HardwareKernelLanguage language, bool readsMask,
                                                            bool processReadsDestination, bool samplesSource,
                                                            bool blends, bool skipsEmptyMask) {
    static const auto texts = [] {
        return [&]<unsigned... F>(std::integer_sequence<unsigned, F...>) {
            return std::array<KernelTextPair, 32>{
                KernelTextPair([](Language textLanguage) { return LoopText(textLanguage, F); })...};
        }
        (std::make_integer_sequence<unsigned, 32>{});
    }();
    const unsigned flags = (readsMask ? 1u : 0u) | (processReadsDestination ? 2u : 0u) |
                           (samplesSource ? 4u : 0u) | (blends ? 8u : 0u) | (skipsEmptyMask ? 16u : 0u);
    return texts[flags].Get(language);
}

const char* GetIdentityConversionFragment(HardwareKernelLanguage language) {
    static const KernelTextPair texts(
        [](Language) -> std::string { return "#define ConvertSourceToDest(source) (source)\n"; });
    return texts.Get(language);
}

std::string GetJointConversionFragment(HardwareKernelLanguage language, std::string_view toWorking,
                                       std::string_view fromWorking) {
    switch (language) {
    case Language::OpenCLC:
        return FormatKernelText(JointOpenCL, {toWorking, fromWorking});
    case Language::CudaCpp:
        return FormatKernelText(JointCuda, {toWorking, fromWorking});
    default:
        return {};
    }
}

std::string GetNoSourceConversionFragment(HardwareKernelLanguage language, std::string_view fromWorking) {
    return ConvertFunctionText(language, WorkingToDest, fromWorking);
}

std::string GetSamplerConversionFragment(HardwareKernelLanguage language, std::string_view conversion,
                                         std::string_view samplerTraits, std::string_view samplerToWorking) {
    const std::string sampler = SamplerText(language, samplerTraits, samplerToWorking);
    if (sampler.empty()) return {};
    return std::string(conversion) + sampler;
}

std::string GetSamplerReferenceConversionFragment(HardwareKernelLanguage language,
                                                  std::string_view fromWorking,
                                                  std::string_view samplerTraits,
                                                  std::string_view samplerToWorking) {
    const std::string sampler = SamplerText(language, samplerTraits, samplerToWorking);
    if (sampler.empty()) return {};
    return GetNoSourceConversionFragment(language, fromWorking) + sampler + SamplerToDest;
}

} // namespace Raster
