// The diffuse Sample stage as kernel text: the noise generator's text, then the stage that seeds, draws the
// two offsets and reads the chosen pixel.
#include "filters/tonal/DiffuseStages.h"
#include "filters/tonal/NoiseStages.h"
#include "filters/tonal/RasterDiffuseCommand.h"
#include "frame/Registration.h"

#include "host/raster/KernelText.h"

namespace RasterTools {

// The filter enters the catalogue and the host's class list when the library loads.
[[maybe_unused]] const FilterRegistration<DiffuseFilter> kDiffuseRegistration;

namespace {

// The processor's DiffuseSampler::Sample: the generator's DiffuseMoved, then the read. The seed maps the
// integer location, not its centre: no MapPixelCenter here.
constexpr const char* SampleBody =
    R"(const int2 coords = TransformPixelCenterToInt(location,transform_params);
const int2 moved = DiffuseMoved(location,coords,sampler_params);
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
