// The kernel traits fragments: per format and role, the names that stage bodies and Convert bodies use.
#include "host/raster/PixelTraits.h"

#include "host/raster/KernelText.h"
#include "host/raster/LabFragments.h"

#include <array>
#include <string>

namespace Raster {

namespace {

// How a format's pixels are spelled in kernel text; PixelTraits<F> is the processor's side of each row.
struct FormatText {
    const char* stored;       // the stored pixel type
    const char* accumulator;  // its accumulator type
    int lanes;                // components an accumulator literal takes
    const char* maximum;      // the largest component, as a float literal
    const char* toStored;     // accumulator -> stored, rounding and saturating
    const char* clamp;        // the clamp rule, %1 the accumulator
    const char* maximumPixel; // the stored pixel of maximum components
    const char* minimumPixel; // and of zeros
    const char* middle;       // the neutral value of one component (a, b of Lab)
    const char* convertDest;  // convert_dest(v) from the float vector of the same width; null where none
};

constexpr FormatText Texts[PixelFormatCount] = {
    // RGBA8
    {"uchar4", "float4", 4, "255.0f", "rt_to_uchar4", "rt_clamp_all(%1, 255.0f)",
     "make_uchar4(255, 255, 255, 255)", "make_uchar4(0, 0, 0, 0)", "((uchar)128)", "convert_uchar4(%1)"},
    // RGBA16
    {"ushort4", "float4", 4, "65535.0f", "rt_to_ushort4", "rt_clamp_all(%1, 65535.0f)",
     "make_ushort4(65535, 65535, 65535, 65535)", "make_ushort4(0, 0, 0, 0)", "((ushort)32768)",
     "convert_ushort4(%1)"},
    // RGBAUF
    {"float4", "float4", 4, "1.0f", "rt_to_float4", "rt_clamp_alpha(%1)",
     "make_float4(1.0f, 1.0f, 1.0f, 1.0f)", "make_float4(0.0f, 0.0f, 0.0f, 0.0f)", "0.5f", "(%1)"},
    // IA8
    {"uchar2", "float2", 2, "255.0f", "rt_to_uchar2", "rt_clamp_all(%1, 255.0f)", "make_uchar2(255, 255)",
     "make_uchar2(0, 0)", "((uchar)128)", "convert_uchar2(%1)"},
    // IA16
    {"ushort2", "float2", 2, "65535.0f", "rt_to_ushort2", "rt_clamp_all(%1, 65535.0f)",
     "make_ushort2(65535, 65535)", "make_ushort2(0, 0)", "((ushort)32768)", "convert_ushort2(%1)"},
    // CMYKA8
    {"cmyka8", "float8", 5, "255.0f", "rt_to_cmyka8", "rt_clamp_all(%1, 255.0f)",
     "rt_make_cmyka8(255, 255, 255, 255, 255)", "rt_make_cmyka8(0, 0, 0, 0, 0)", "((uchar)128)", nullptr},
    // LabA16
    {"ushort4", "float4", 4, "65535.0f", "rt_to_ushort4", "rt_clamp_all(%1, 65535.0f)",
     "make_ushort4(65535, 65535, 65535, 65535)", "make_ushort4(0, 0, 0, 0)", "((ushort)32768)",
     "convert_ushort4(%1)"},
    // MaskA8
    {"uchar", "float", 1, "255.0f", "rt_to_uchar", "rt_clamp_all(%1, 255.0f)", "((uchar)255)", "((uchar)0)",
     "((uchar)128)", "rt_sat_uchar(%1)"},
    // MaskA16
    {"ushort", "float", 1, "65535.0f", "rt_to_ushort", "rt_clamp_all(%1, 65535.0f)", "((ushort)65535)",
     "((ushort)0)", "((ushort)32768)", "rt_sat_ushort(%1)"},
    // MaskAF
    {"float", "float", 1, "1.0f", "rt_to_float", "rt_clamp_all(%1, 1.0f)", "1.0f", "0.0f", "0.5f", "(%1)"},
    // IntensityUF
    {"float", "float", 1, "1.0f", "rt_to_float", "rt_clamp_none(%1)", "1.0f", "0.0f", "0.5f", "(%1)"},
    // RGBAF
    {"float4", "float4", 4, "1.0f", "rt_to_float4", "rt_clamp_all(%1, 1.0f)",
     "make_float4(1.0f, 1.0f, 1.0f, 1.0f)", "make_float4(0.0f, 0.0f, 0.0f, 0.0f)", "0.5f", "(%1)"},
};

std::string AccumulatorLiteral(const FormatText& t, const std::string& name) {
    switch (t.lanes) {
    case 1:
        return "#define " + name + "(a) ((float)(a))\n";
    case 2:
        return "#define " + name + "(a, b) make_float2((a), (b))\n";
    case 5:
        return "#define " + name + "(a, b, c, d, e) make_float8((a), (b), (c), (d), (e), 0.0f, 0.0f, 0.0f)\n";
    default:
        return "#define " + name + "(a, b, c, d) make_float4((a), (b), (c), (d))\n";
    }
}

// The source and destination roles differ only in their prefix.
std::string PixelRoleText(const FormatText& t, const std::string& role, const char* fromAccumulatorName) {
    std::string text;
    text += "typedef " + std::string(t.stored) + " " + role + "_type;\n";
    text += "typedef " + std::string(t.accumulator) + " " + role + "_accumulator_type;\n";
    text += AccumulatorLiteral(t, role + "_accumulator_literal");
    text += "#define accumulator_from_" + role + "(p) rt_accumulate(p)\n";
    text += "#define premultiplied_accumulator_from_" + role + "(p) rt_premultiplied(p)\n";
    text += "#define postdivide_" + role + "(acc) rt_postdivided((acc), " + t.maximum + ")\n";
    text += "#define " + std::string(fromAccumulatorName) + "(acc) " + t.toStored + "(acc)\n";
    text += "#define " + role + "_clamp_accumulator(acc) ((acc) = " + FormatKernelText(t.clamp, {"(acc)"}) +
            ")\n";
    text += "#define " + role + "_maximum() " + t.maximumPixel + "\n";
    text += "#define " + role + "_minimum() " + t.minimumPixel + "\n";
    text += "#define " + role + "_middle() " + t.middle + "\n";
    text += "#define " + role + "_channel_maximum() " + t.maximum + "\n";
    return text;
}

std::string BuildTraits(PixelFormat format, KernelTraitsRole role, HardwareKernelLanguage language) {
    const char* math = GetKernelMathText(language);
    if (!math) return {};
    const FormatText& t = Texts[static_cast<std::size_t>(format)];
    std::string text = math;
    // Lab pixels convert through labaf_to_rgbauf and rgbauf_to_labaf; a kernel with LabA16 on both sides
    // gets them once.
    if (format == PixelFormat::LabA16 && role != KernelTraitsRole::Mask) {
        const char* lab = GetLabConversionFragment(static_cast<int>(language));
        if (!lab) return {};
        text += "#ifndef RT_LAB_CONVERSIONS\n#define RT_LAB_CONVERSIONS\n";
        text += lab;
        text += "#endif\n";
    }
    text += "// ";
    text += GetPixelFormatName(format);
    switch (role) {
    case KernelTraitsRole::Source:
        text += " source\n";
        text += PixelRoleText(t, "source", "source_from_accumulator");
        break;
    case KernelTraitsRole::Dest:
        text += " destination\n";
        text += PixelRoleText(t, "dest", "dest_from_accumulator");
        if (t.convertDest)
            text += "#define convert_dest(v) " + FormatKernelText(t.convertDest, {"(v)"}) + "\n";
        break;
    case KernelTraitsRole::Sampler:
        text += " sampler\n";
        text += PixelRoleText(t, "sampler", "sampler_from_accumulator");
        break;
    case KernelTraitsRole::Mask:
        text += " mask\n";
        text += "typedef " + std::string(t.stored) + " mask_type;\n";
        text += "#define normalise_mask(v) (rt_accumulate(v) / " + std::string(t.maximum) + ")\n";
        text += "#define mask_channel_maximum() " + std::string(t.maximum) + "\n";
        break;
    }
    return text;
}

template <KernelTraitsRole Role>
const char* CachedTraits(PixelFormat format, HardwareKernelLanguage language) {
    using Table = std::array<KernelTextPair, PixelFormatCount>;
    static const Table table = [] {
        return [&]<std::size_t... I>(std::index_sequence<I...>) {
            return Table{KernelTextPair([](HardwareKernelLanguage textLanguage) {
                return BuildTraits(static_cast<PixelFormat>(I), Role, textLanguage);
            })...};
        }
        (std::make_index_sequence<PixelFormatCount>{});
    }();
    if (!IsValidPixelFormat(format)) return nullptr;
    return table[static_cast<std::size_t>(format)].Get(language);
}

} // namespace

const char* GetTraitsFragment(PixelFormat format, KernelTraitsRole role, HardwareKernelLanguage language) {
    switch (role) {
    case KernelTraitsRole::Source:
        return CachedTraits<KernelTraitsRole::Source>(format, language);
    case KernelTraitsRole::Dest:
        return CachedTraits<KernelTraitsRole::Dest>(format, language);
    case KernelTraitsRole::Mask:
        return CachedTraits<KernelTraitsRole::Mask>(format, language);
    case KernelTraitsRole::Sampler:
        return CachedTraits<KernelTraitsRole::Sampler>(format, language);
    }
    return nullptr;
}

const char* GetNoMaskTraitsFragment(HardwareKernelLanguage language) {
    static const KernelTextPair texts([](HardwareKernelLanguage l) -> std::string {
        const char* math = GetKernelMathText(l);
        if (!math) return {};
        return std::string(math) + "// no mask\ntypedef uchar mask_type;\n#define normalise_mask(v) 1.0f\n";
    });
    return texts.Get(language);
}

} // namespace Raster
