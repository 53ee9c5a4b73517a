// The span conversions of every pair of planar formats, each built for AVX2 (with the AVX2 kit where a format
// has one) and for any x86-64, with the arithmetic inlined into both; the processor's features pick one.
#include "host/kernel/Simd.h"
#include "pipeline/PlanarConversions.h"
#if RT_AVX2_BUILD
#include "pipeline/PlanarAvx2.h"
#endif

namespace RasterTools::PlanarConvert {

namespace {

#if RT_AVX2_BUILD
template <PixelFormat Source, PixelFormat Dest>
[[gnu::flatten]] RT_TARGET_AVX2 void ConvertSpanAvx2(const Raster::StoredPixel<Source>* in,
                                                     Raster::StoredPixel<Dest>* out, int n) noexcept {
    ConvertSpanInline<Source, Dest, Avx2::Kit>(in, out, n);
}
#else
template <PixelFormat Source, PixelFormat Dest>
void ConvertSpanAvx2(const Raster::StoredPixel<Source>*, Raster::StoredPixel<Dest>*, int) noexcept {}
#endif

template <PixelFormat Source, PixelFormat Dest>
[[gnu::flatten]] void ConvertSpanBaseline(const Raster::StoredPixel<Source>* in,
                                          Raster::StoredPixel<Dest>* out, int n) noexcept {
    ConvertSpanInline<Source, Dest>(in, out, n);
}

} // namespace

#define RT_SPAN_PAIR(S, D)                                                                                   \
    template <>                                                                                              \
    void ConvertSpan<PixelFormat::S, PixelFormat::D>(const Raster::StoredPixel<PixelFormat::S>* in,          \
                                                     Raster::StoredPixel<PixelFormat::D>* out,               \
                                                     int n) noexcept {                                       \
        if (Kernel::HasAvx2())                                                                               \
            ConvertSpanAvx2<PixelFormat::S, PixelFormat::D>(in, out, n);                                     \
        else                                                                                                 \
            ConvertSpanBaseline<PixelFormat::S, PixelFormat::D>(in, out, n);                                 \
    }
// clang-format off
RT_SPAN_PAIR(RGBA8, RGBA16) RT_SPAN_PAIR(RGBA8, RGBAUF) RT_SPAN_PAIR(RGBA8, IA8) RT_SPAN_PAIR(RGBA8, IA16) RT_SPAN_PAIR(RGBA8, CMYKA8)
RT_SPAN_PAIR(RGBA16, RGBA8) RT_SPAN_PAIR(RGBA16, RGBAUF) RT_SPAN_PAIR(RGBA16, IA8) RT_SPAN_PAIR(RGBA16, IA16) RT_SPAN_PAIR(RGBA16, CMYKA8)
RT_SPAN_PAIR(RGBAUF, RGBA8) RT_SPAN_PAIR(RGBAUF, RGBA16) RT_SPAN_PAIR(RGBAUF, IA8) RT_SPAN_PAIR(RGBAUF, IA16) RT_SPAN_PAIR(RGBAUF, CMYKA8)
RT_SPAN_PAIR(IA8, RGBA8) RT_SPAN_PAIR(IA8, RGBA16) RT_SPAN_PAIR(IA8, RGBAUF) RT_SPAN_PAIR(IA8, IA16) RT_SPAN_PAIR(IA8, CMYKA8)
RT_SPAN_PAIR(IA16, RGBA8) RT_SPAN_PAIR(IA16, RGBA16) RT_SPAN_PAIR(IA16, RGBAUF) RT_SPAN_PAIR(IA16, IA8) RT_SPAN_PAIR(IA16, CMYKA8)
RT_SPAN_PAIR(CMYKA8, RGBA8) RT_SPAN_PAIR(CMYKA8, RGBA16) RT_SPAN_PAIR(CMYKA8, RGBAUF) RT_SPAN_PAIR(CMYKA8, IA8) RT_SPAN_PAIR(CMYKA8, IA16)
// clang-format on
#undef RT_SPAN_PAIR

} // namespace RasterTools::PlanarConvert
