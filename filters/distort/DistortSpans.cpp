// The distortions' span mappings, built for AVX2 and for any x86-64: eight lanes instead of four for the
// square roots, divisions and polynomials, with the same floats (no fused multiply-add in either).
#include "filters/distort/DistortStages.h"
#include "host/kernel/Simd.h"

namespace RasterTools::DistortStages {

RT_AVX2_DISPATCH(MapSpan, MapSpanInline<Chain<TwirlTransform>>,
                 (const Raster::PreparedTransform<Chain<TwirlTransform>>& t, int x0, int y, float* xs,
                  float* ys),
                 (t, x0, y, xs, ys))
RT_AVX2_DISPATCH(MapSpan, MapSpanInline<Chain<SphereTransform>>,
                 (const Raster::PreparedTransform<Chain<SphereTransform>>& t, int x0, int y, float* xs,
                  float* ys),
                 (t, x0, y, xs, ys))

} // namespace RasterTools::DistortStages
