// The vertical edge detect Sample stage as kernel text, per source format: the six weighted neighbours in
// the accumulator, the magnitude of each colour lane, the format's clamp, and the centre's other channels.
#include "filters/tonal/EdgeDetectStages.h"
#include "filters/tonal/RasterVerticalEdgeDetectCommand.h"
#include "frame/Registration.h"

#include "host/raster/KernelText.h"

#include <array>
#include <iterator>
#include <string>
#include <vector>

namespace RasterTools {

// The filter enters the catalogue and the host's class list when the library loads.
[[maybe_unused]] const FilterRegistration<VerticalEdgeDetectFilter> kVerticalEdgeDetectRegistration;

namespace {

using Language = HardwareKernelLanguage;
using Raster::PixelFormat;

// %1 is the taps (EdgeTaps) and the centre's read, %2 takes the magnitudes of the colour lanes, %3 copies the
// colour channels of the result into initial.
constexpr const char* SampleBody =
    R"(source_accumulator_type acc = accumulator_from_source(source_minimum());
%1%2source_clamp_accumulator(acc);
const source_type clamped = source_from_accumulator(acc);
%3(void)sampler_params;
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

// One coordinate of a tap: the location's, moved with the processor's 32-bit wrap-around.
std::string TapCoordinate(const char* axis, int d) {
    const std::string at = std::string("location.") + axis;
    if (d == 0) return at;
    return "(int)((uint)" + at + (d < 0 ? "-" : "+") + std::to_string(d < 0 ? -d : d) + "u)";
}

// The taps in order, each added or taken away with its weight's magnitude (whole numbers), and the centre's
// read among them.
std::string TapsText() {
    std::string text;
    for (int k = 0; k < int(std::size(EdgeTaps)); ++k) {
        if (k == EdgeCentreAfter)
            text += "source_type initial = "
                    "Extend(TransformPixelCenterToInt(location,transform_params),source_bounds,input_pixels,"
                    "source_params);\n";
        const EdgeTap tap = EdgeTaps[k];
        const float magnitude = tap.weight < 0.0f ? -tap.weight : tap.weight;
        text += std::string("acc = acc ") + (tap.weight < 0.0f ? "-" : "+") +
                " accumulator_from_source(Extend(TransformPixelCenterToInt(make_int2(" +
                TapCoordinate("x", tap.dx) + "," + TapCoordinate("y", tap.dy) +
                "),transform_params),source_bounds,input_pixels,source_params))" +
                (magnitude == 1.0f ? std::string() : "*" + std::to_string(int(magnitude)) + ".0f") + ";\n";
    }
    return text;
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
    return MakeStage(StageSignature::Sample,
                     Raster::FormatKernelText(SampleBody, {TapsText(), magnitudes, copies}));
}

} // namespace

const char* StageText<EdgeDetectSampler>::Get(Language language, PixelFormat source) {
    static const PerFormatStageText texts(BuildText);
    return texts.Get(language, source);
}

} // namespace RasterTools
