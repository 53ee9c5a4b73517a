// The direct CMYKA8 to LabA16 conversion of spans.
#include "pipeline/Conversions.h"

namespace RasterTools {

namespace {

using namespace Raster::KernelMath;

// One pixel: the CMYK arithmetic of the Convert body, alpha by the reciprocal, colour through the colour
// manager with count 1, Lab alpha rounded by adding 0.5 and truncating.
ushort4 ToLab(uchar c, uchar m, uchar y, uchar k, uchar a) noexcept {
    const float4 working =
        ConvertCode::Convert<Raster::PixelFormat::CMYKA8>::ToWorking(rt_make_cmyka8(c, m, y, k, a));
    const float alpha = float(a) * 0.003921569f;
    float rgba[4] = {working.x, working.y, working.z, alpha};
    ushort lab[4];
    Raster::ICCManager::GetInstance().DoRGBAFToLABA16Transform(reinterpret_cast<unsigned char*>(rgba),
                                                               reinterpret_cast<unsigned char*>(lab), 1);
    return make_ushort4(lab[0], lab[1], lab[2], static_cast<ushort>(alpha * 65535.0f + 0.5f));
}

} // namespace

void ConvertCMYKA8ToLabA16(const cmyka8* in, ushort4* out, int n) noexcept {
    for (int i = 0; i < n; ++i)
        out[i] = ToLab(in[i].cmyk[0], in[i].cmyk[1], in[i].cmyk[2], in[i].cmyk[3], in[i].a);
}

void ConvertCMYKA8ToLabA16(const Raster::InterleavedPixelSpan<Raster::PixelFormat::CMYKA8>& in,
                           Raster::InterleavedPixelSpan<Raster::PixelFormat::LabA16>& out) noexcept {
    out.count = in.count;
    ConvertCMYKA8ToLabA16(in.pixels, out.pixels, in.count);
}

void ConvertCMYKA8ToLabA16(const Raster::PlanarPixelSpan<Raster::PixelFormat::CMYKA8>& in,
                           Raster::PlanarPixelSpan<Raster::PixelFormat::LabA16>& out) noexcept {
    out.count = in.count;
    for (int i = 0; i < in.count; ++i) {
        const ushort4 lab =
            ToLab(in.planes[0][i], in.planes[1][i], in.planes[2][i], in.planes[3][i], in.planes[4][i]);
        out.planes[0][i] = lab.x;
        out.planes[1][i] = lab.y;
        out.planes[2][i] = lab.z;
        out.planes[3][i] = lab.w;
    }
}

} // namespace RasterTools
