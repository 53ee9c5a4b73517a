// The diffuse Sample stage as kernel text: the noise generator's text, then the stage that seeds, draws the
// two offsets and reads the chosen pixel.
#include "filters/tonal/DiffuseStages.h"
#include "filters/tonal/NoiseStages.h"

#include "host/raster/KernelText.h"

namespace RasterTools {

namespace {

// The processor's DiffuseSampler::Sample, Offset and Moved, step for step.
constexpr const char* SampleBody =
    R"(const int2 coords = TransformPixelCenterToInt(location,transform_params);
// MapPixelCenter! The seed is taken as the noise filter takes it (NoiseSeed maps the pixel centre).
uint random = NoiseSeed(coords,sampler_params);
const int dx = rt_sat_int((GetRandom(&random)*1024.0f-512.0f)*sampler_params[6]);
const int dy = rt_sat_int((GetRandom(&random)*1024.0f-512.0f)*sampler_params[6]);
const int2 moved = make_int2((int)((uint)location.x+(uint)dx),(int)((uint)location.y+(uint)dy));
(void)sampler_bounds;
(void)sampler_pixels;
return Extend(TransformPixelCenterToInt(moved,transform_params),source_bounds,input_pixels,source_params);)";

} // namespace

const char* StageText<DiffuseSampler>::Get(HardwareKernelLanguage language) {
    static const Raster::KernelTextPair texts(
        [](HardwareKernelLanguage l) { return MakeGeneratorSampleStage(l, "Diffuse", SampleBody); });
    return texts.Get(language);
}

} // namespace RasterTools
