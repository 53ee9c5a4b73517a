// The vertical edge detect Sample stage as kernel text, per source format: the six weighted neighbours in
// the accumulator, the magnitude of each colour lane, the format's clamp, and the centre's other channels.
#include "filters/tonal/EdgeDetectStages.h"

#include "host/raster/KernelText.h"

#include <array>
#include <string>
#include <vector>

namespace RasterTools {

namespace {

using Language = HardwareKernelLanguage;
using Raster::PixelFormat;

// %1 takes the magnitudes of the colour lanes, %2 copies the colour channels of the result into initial.
constexpr const char* SampleBody =
    R"(source_accumulator_type acc = accumulator_from_source(source_minimum());
acc = acc - accumulator_from_source(Extend(TransformPixelCenterToInt(make_int2((int)((uint)location.x-1u),(int)((uint)location.y-1u)),transform_params),source_bounds,input_pixels,source_params));
acc = acc + accumulator_from_source(Extend(TransformPixelCenterToInt(make_int2((int)((uint)location.x+1u),(int)((uint)location.y-1u)),transform_params),source_bounds,input_pixels,source_params));
acc = acc - accumulator_from_source(Extend(TransformPixelCenterToInt(make_int2((int)((uint)location.x-1u),location.y),transform_params),source_bounds,input_pixels,source_params))*2.0f;
source_type initial = Extend(TransformPixelCenterToInt(location,transform_params),source_bounds,input_pixels,source_params);
acc = acc + accumulator_from_source(Extend(TransformPixelCenterToInt(make_int2((int)((uint)location.x+1u),location.y),transform_params),source_bounds,input_pixels,source_params))*2.0f;
acc = acc - accumulator_from_source(Extend(TransformPixelCenterToInt(make_int2((int)((uint)location.x-1u),(int)((uint)location.y+1u)),transform_params),source_bounds,input_pixels,source_params));
acc = acc + accumulator_from_source(Extend(TransformPixelCenterToInt(make_int2((int)((uint)location.x+1u),(int)((uint)location.y+1u)),transform_params),source_bounds,input_pixels,source_params));
%1source_clamp_accumulator(acc);
const source_type clamped = source_from_accumulator(acc);
%2(void)sampler_params;
(void)sampler_bounds;
(void)sampler_pixels;
return initial;)";

struct EdgeFormat {
    std::vector<const char*> lanes;    // the accumulator's colour lanes
    std::vector<const char*> channels; // and the matching colour channels of a pixel
};

EdgeFormat Describe(PixelFormat format) {
    switch (format) {
    case PixelFormat::RGBA8:
    case PixelFormat::RGBA16:
    case PixelFormat::RGBAUF:
    case PixelFormat::LabA16:
        return {{"x", "y", "z"}, {"x", "y", "z"}};
    case PixelFormat::IA8:
    case PixelFormat::IA16:
        return {{"x"}, {"x"}};
    case PixelFormat::CMYKA8:
        return {{"s0", "s1", "s2", "s3"}, {"cmyk[0]", "cmyk[1]", "cmyk[2]", "cmyk[3]"}};
    default:
        return {};
    }
}

std::string BuildText(PixelFormat format, Language language) {
    if (!Raster::IsKernelTextLanguage(language)) return {};
    const EdgeFormat f = Describe(format);
    if (f.lanes.empty()) return {};
    std::string magnitudes, copies;
    for (std::size_t c = 0; c < f.lanes.size(); ++c) {
        magnitudes += std::string("acc.") + f.lanes[c] + " = rt_fabs(acc." + f.lanes[c] + ");\n";
        copies += std::string("initial.") + f.channels[c] + " = clamped." + f.channels[c] + ";\n";
    }
    return MakeStage(StageSignature::Sample, Raster::FormatKernelText(SampleBody, {magnitudes, copies}));
}

} // namespace

const char* StageText<EdgeDetectSampler>::Get(Language language, PixelFormat source) {
    using Table = std::array<Raster::KernelTextPair, Raster::PixelFormatCount>;
    static const Table table = [] {
        return [&]<std::size_t... I>(std::index_sequence<I...>) {
            return Table{Raster::KernelTextPair(
                [](Language l) { return BuildText(static_cast<PixelFormat>(I), l); })...};
        }
        (std::make_index_sequence<Raster::PixelFormatCount>{});
    }();
    if (!Raster::IsValidPixelFormat(source)) return nullptr;
    return table[static_cast<std::size_t>(source)].Get(language);
}

} // namespace RasterTools
