// The Voronoi Sample stage as kernel text, per source format and language: VoronoiMath's source, a
// VoronoiDiagram record of the pixel's grid, and the Sample that finds the closest site, weighs the border
// and blends.
#include "filters/lighting/RasterVoronoiCommand.h"
#include "frame/Registration.h"

#include "host/raster/KernelText.h"

#include <charconv>
#include <cstring>
#include <string>

namespace RasterTools {

// The filter enters the catalogue and the host's class list when the library loads.
[[maybe_unused]] const FilterRegistration<VoronoiFilter> kVoronoiRegistration;

const char* VoronoiMath::GetSourceText() {
    static const char* const text = RASTER_KERNEL_STRINGIFY(RT_VORONOI_SOURCE);
    return text;
}

namespace {

using Language = HardwareKernelLanguage;
using Raster::PixelFormat;

// The pixel's grid: cell size, line width and origin from the sampler block, its row and column, the line
// colour, and how many cells a side it looks at (5 with lines: the closest site's neighbours too).
constexpr const char* DiagramType = R"(typedef struct
{
    float cell;
    float lineWidth;
    float2 origin;
    int row;
    int col;
    source_accumulator_type line;
    int dimension;
} VoronoiDiagram;
)";

// The processor's VoronoiSampler::SampleSpan for one pixel, without its caches. %1 is the line colour as an
// accumulator literal, %2 the stores of the colour channels.
constexpr const char* SampleBody =
    R"(VoronoiDiagram v;
v.cell = sampler_params[0];
v.lineWidth = sampler_params[1];
v.origin = float2_literal(sampler_params[2],sampler_params[3]);
const float2 p = convert_float2(location);
v.row = VoronoiCellIndex(p.y,v.origin.y,v.cell);
v.col = VoronoiCellIndex(p.x,v.origin.x,v.cell);
v.line = %1;
v.dimension = v.lineWidth > 0.0f ? 5 : 3;
const int reach = v.dimension / 2;
float2 sites[25];
for (int r = 0; r < v.dimension; ++r)
    for (int c = 0; c < v.dimension; ++c)
        sites[(r + 2 - reach) * 5 + c + 2 - reach] = VoronoiSite(v.row - reach + r,v.col - reach + c,v.cell,v.origin);
float2 around[9];
for (int r = 0; r < 3; ++r)
    for (int c = 0; c < 3; ++c)
        around[r * 3 + c] = sites[(r + 1) * 5 + c + 1];
float d2[9];
const int closest = VoronoiClosest(around,p,d2);
float w = 0.0f;
if (v.lineWidth > 0.0f) {
    float2 ring[9];
    for (int r = 0; r < 3; ++r)
        for (int c = 0; c < 3; ++c)
            ring[r * 3 + c] = sites[(closest / 3 + r) * 5 + closest % 3 + c];
    float4 edges[8];
    float scales[8];
    VoronoiEdges(ring,edges,scales);
    w = VoronoiLineWeight(VoronoiBorderDistance(edges,scales,p),v.lineWidth);
}
source_type result = Extend(TransformPixelCenterToInt(location,transform_params),source_bounds,input_pixels,source_params);
source_accumulator_type acc = v.line;
if (w != 1.0f) {
    const float best = d2[closest];
    const float minD = VoronoiMinDistance(best);
    const float threshold = VoronoiThreshold(minD);
    source_accumulator_type sum = accumulator_from_source(source_minimum());
    float total = 0.0f;
    for (int s = 0; s < 9; ++s) {
        const float weight = VoronoiBlendWeight(d2[s],best,minD,threshold,around[s],p);
        if (weight > 0.0f) {
            const source_type site = Extend(convert_int2(Transform(around[s],transform_params)),source_bounds,input_pixels,source_params);
            sum += accumulator_from_source(site) * weight;
            total += weight;
        }
    }
    acc = sum / total;
    acc = acc * (1.0f - w) + v.line * w;
}
source_clamp_accumulator(acc);
const source_type colour = source_from_accumulator(acc);
%2(void)sampler_bounds;
(void)sampler_pixels;
return result;)";

// The stage signature's parameters, as a call passes them on.
constexpr const char* SampleArguments =
    "location,source_bounds,input_pixels,source_params,transform_params,sampler_params,sampler_bounds,"
    "sampler_pixels";

std::string FloatLiteral(float value) {
    char digits[32];
    const auto end = std::to_chars(digits, digits + sizeof digits, value).ptr;
    std::string text(digits, end);
    if (text.find_first_of(".e") == std::string::npos) text += ".0";
    return text + "f";
}

// The processor's line colour (VoronoiSampler::LineColour) as an accumulator literal of the format.
std::string LineLiteral(PixelFormat format) {
    std::string text;
    LayerFormatList::Dispatch(format, [&](auto tag) {
        constexpr PixelFormat F = decltype(tag)::value;
        constexpr int Channels = Raster::GetChannelCount(F);
        const auto line = VoronoiSampler::LineColour<F>();
        float lanes[Channels];
        std::memcpy(lanes, &line, sizeof lanes);
        text = "source_accumulator_literal(";
        for (int c = 0; c < Channels; ++c)
            text += (c ? "," : "") + FloatLiteral(lanes[c]);
        text += ")";
        return true;
    });
    return text;
}

// The stores of the colour channels into result; alpha stays.
std::string ColourStores(PixelFormat format) {
    switch (format) {
    case PixelFormat::RGBA8:
    case PixelFormat::RGBA16:
    case PixelFormat::RGBAUF:
    case PixelFormat::LabA16:
        return "result.x = colour.x;\nresult.y = colour.y;\nresult.z = colour.z;\n";
    case PixelFormat::IA8:
    case PixelFormat::IA16:
        return "result.x = colour.x;\n";
    case PixelFormat::CMYKA8:
        return "result.cmyk[0] = colour.cmyk[0];\nresult.cmyk[1] = colour.cmyk[1];\n"
               "result.cmyk[2] = colour.cmyk[2];\nresult.cmyk[3] = colour.cmyk[3];\n";
    default:
        return {};
    }
}

std::string BuildText(PixelFormat format, Language language) {
    const std::string stores = ColourStores(format);
    const std::string line = LineLiteral(format);
    if (stores.empty() || line.empty()) return {};
    const std::string body = Raster::FormatKernelText(SampleBody, {line, stores});
    const std::string source = VoronoiMath::GetSourceText();
    if (language == Language::CudaCpp) {
        // Everything lives in a local structure: the arithmetic as static members, then the stage itself.
        std::string member(StageSignature::Sample);
        member.replace(0, std::string_view("inline").size(), "static");
        return MakeStage(
            StageSignature::Sample,
            "struct Voronoi\n{\n#define RT_VORONOI_FUNCTION static\n#define RT_VORONOI_SQRT "
            "sqrtf\n#define RT_VORONOI_U64 unsigned long long\n#define RT_VORONOI_I64 long "
            "long\n#define RT_VORONOI_CONSTANT(x) x##ULL\n" +
                source +
                "\n#undef RT_VORONOI_CONSTANT\n#undef RT_VORONOI_I64\n#undef RT_VORONOI_U64\n#undef "
                "RT_VORONOI_SQRT\n#undef RT_VORONOI_FUNCTION\n" +
                DiagramType + MakeStage(member, body) + "};\nreturn Voronoi::Sample(" + SampleArguments +
                ");");
    }
    if (language == Language::OpenCLC) {
        // At file level, once per kernel.
        return "#ifndef RT_VORONOI_SOURCE_DEFINED\n#define RT_VORONOI_SOURCE_DEFINED\n#define "
               "RT_VORONOI_FUNCTION inline\n#define RT_VORONOI_SQRT sqrt\n#define RT_VORONOI_U64 "
               "ulong\n#define RT_VORONOI_I64 long\n#define RT_VORONOI_CONSTANT(x) x##UL\n" +
               source +
               "\n#undef RT_VORONOI_CONSTANT\n#undef RT_VORONOI_I64\n#undef RT_VORONOI_U64\n#undef "
               "RT_VORONOI_SQRT\n#undef RT_VORONOI_FUNCTION\n" +
               DiagramType + "#endif\n" + MakeStage(StageSignature::Sample, body);
    }
    return {};
}

} // namespace

const char* StageText<VoronoiSampler>::Get(Language language, PixelFormat source) {
    static const PerFormatStageText texts(BuildText);
    return texts.Get(language, source);
}

} // namespace RasterTools
