// The direct CMYKA8 to LabA16 conversion of spans.
#include "pipeline/Conversions.h"

namespace RasterTools {

namespace {

using namespace Raster::KernelMath;

// One pixel's working colour: the CMYK arithmetic of the Convert body, alpha by the reciprocal.
float4 Working(uchar c, uchar m, uchar y, uchar k, uchar a) noexcept {
    const float4 working =
        ConvertCode::Convert<Raster::PixelFormat::CMYKA8>::ToWorking(rt_make_cmyka8(c, m, y, k, a));
    return make_float4(working.x, working.y, working.z, float(a) * 0.003921569f);
}

// Up to a span of working colours to Lab through the colour manager in one call; the Lab alpha is the alpha
// rounded by adding 0.5 and truncating, which is what the colour manager does with it.
void ToLab(float4* working, ushort4* out, int n) noexcept {
    Raster::ICCManager::GetInstance().DoRGBAFToLABA16Transform(reinterpret_cast<unsigned char*>(working),
                                                               reinterpret_cast<unsigned char*>(out), n);
}

} // namespace

void ConvertCMYKA8ToLabA16(const cmyka8* in, ushort4* out, int n) noexcept {
    float4 working[Raster::SpanLength];
    for (int done = 0; done < n; done += Raster::SpanLength) {
        const int count = n - done < Raster::SpanLength ? n - done : Raster::SpanLength;
        for (int i = 0; i < count; ++i) {
            const cmyka8& p = in[done + i];
            working[i] = Working(p.cmyk[0], p.cmyk[1], p.cmyk[2], p.cmyk[3], p.a);
        }
        ToLab(working, out + done, count);
    }
}

void ConvertCMYKA8ToLabA16(const Raster::InterleavedPixelSpan<Raster::PixelFormat::CMYKA8>& in,
                           Raster::InterleavedPixelSpan<Raster::PixelFormat::LabA16>& out) noexcept {
    out.count = in.count;
    ConvertCMYKA8ToLabA16(in.pixels, out.pixels, in.count);
}

void ConvertCMYKA8ToLabA16(const Raster::PlanarPixelSpan<Raster::PixelFormat::CMYKA8>& in,
                           Raster::PlanarPixelSpan<Raster::PixelFormat::LabA16>& out) noexcept {
    out.count = in.count;
    float4 working[Raster::SpanLength];
    for (int i = 0; i < in.count; ++i)
        working[i] =
            Working(in.planes[0][i], in.planes[1][i], in.planes[2][i], in.planes[3][i], in.planes[4][i]);
    ushort4 lab[Raster::SpanLength];
    ToLab(working, lab, in.count);
    for (int i = 0; i < in.count; ++i) {
        out.planes[0][i] = lab[i].x;
        out.planes[1][i] = lab[i].y;
        out.planes[2][i] = lab[i].z;
        out.planes[3][i] = lab[i].w;
    }
}

} // namespace RasterTools
