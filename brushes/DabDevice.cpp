#include "brushes/DabDevice.h"

#include "host/raster/device/ExecuteKernel.h"
#include "host/raster/device/HardwareBuffer.h"

#include <array>
#include <mutex>

namespace RasterTools {

namespace {

// The processor's arithmetic in kernel text: weights in 8 or 16 bits, rounded 8-bit products, truncated
// 16-bit ones, float targets moved by the 16-bit weight over 65535. Work item (i, j) is pixel (i, j) of the
// rect, whose copy lies packed in target.
constexpr const char* DabKernelBody = R"(
RT_DEVICE uint rt_dab_multiply(uint a, uint b, int bits) {
    const uint t = a * b;
    return bits == 8 ? (t + 128u + (t >> 8)) >> 8 : t / 65535u;
}
RT_DEVICE uint rt_dab_read(GLOBAL const uchar* mask, int format, rt_index at, int bits) {
    const uint full = bits == 8 ? 255u : 65535u;
    if (format == 0) {
        const uint v = mask[at];
        return bits == 8 ? v : v * 257u;
    }
    if (format == 1) {
        const uint v = ((GLOBAL const ushort*)mask)[at];
        return bits == 8 ? (v * 255u + 32767u) / 65535u : v;
    }
    const float f = ((GLOBAL const float*)mask)[at];
    if (!(f > 0.0f)) return 0u;
    if (f >= 1.0f) return full;
    return (uint)RT_ROUNDF(f * (float)full);
}
RT_DEVICE uint rt_dab_move_int(uint d, uint v, uint w, int bits) {
    const uint distance = v > d ? v - d : d - v;
    const uint step = rt_dab_multiply(distance, w, bits);
    return v > d ? d + step : d - step;
}
RT_DEVICE float rt_dab_move_float(float d, float v, uint w) {
    if (w == 65535u) return v;
    return d + (v - d) * ((float)w / 65535.0f);
}
KERNEL(rt_pixel_dab)(GLOBAL uchar* target, int bytes, int channels, int alpha, int width, int height,
                     GLOBAL const uchar* coverage, int coverageFormat, int coverageWidth, int coverageX, int coverageY,
                     GLOBAL const uchar* colour, GLOBAL const uchar* source, int write, int stamp, int factor,
                     int bits, GLOBAL const uchar* texture, int textureFormat, int textureWidth, int hasTexture,
                     GLOBAL const int* texelX, GLOBAL const int* texelY) {
    const int i = GLOBAL_X, j = GLOBAL_Y;
    if (i >= width || j >= height) return;
    const uint full = bits == 8 ? 255u : 65535u;
    uint w = rt_dab_multiply(
        rt_dab_read(coverage, coverageFormat, (rt_index)(coverageY + j) * coverageWidth + coverageX + i, bits),
        (uint)factor, bits);
    if (hasTexture)
        w = rt_dab_multiply(w, rt_dab_read(texture, textureFormat, (rt_index)texelY[j] * textureWidth + texelX[i], bits),
                            bits);
    if (w == 0u) return;
    if (stamp) {
        if (w < (bits == 8 ? 128u : 32768u)) return;
        w = full;
    }
    const rt_index pixel = ((rt_index)j * width + i) * channels;
    for (int c = 0; c < channels; ++c) {
        // 0 colour, 1 clear alpha, 2 copy, 3 full mask
        if (write == 1 && c != alpha) continue;
        const rt_index at = pixel + c;
        if (bytes == 1) {
            const uint value = write == 0 ? colour[c] : write == 2 ? source[at] : write == 3 ? 255u : 0u;
            target[at] = (uchar)rt_dab_move_int(target[at], value, w, bits);
        } else if (bytes == 2) {
            GLOBAL ushort* t = (GLOBAL ushort*)target;
            const uint value = write == 0   ? ((GLOBAL const ushort*)colour)[c]
                               : write == 2 ? ((GLOBAL const ushort*)source)[at]
                               : write == 3 ? 65535u
                                            : 0u;
            t[at] = (ushort)rt_dab_move_int(t[at], value, w, bits);
        } else {
            GLOBAL float* t = (GLOBAL float*)target;
            const float value = write == 0   ? ((GLOBAL const float*)colour)[c]
                                : write == 2 ? ((GLOBAL const float*)source)[at]
                                : write == 3 ? 1.0f
                                             : 0.0f;
            t[at] = rt_dab_move_float(t[at], value, w);
        }
    }
}
)";

std::string BuildText(Raster::HardwareKernelLanguage language) {
    const bool cuda = language == Raster::HardwareKernelLanguage::CudaCpp;
    return std::string(DeviceStepsPrelude(language)) +
           (cuda ? "#define RT_DEVICE __device__\n#define RT_ROUNDF roundf\n"
                 : "#define RT_DEVICE\n#define RT_ROUNDF round\n") +
           DabKernelBody;
}

int MaskCode(Raster::PixelFormat format) {
    return format == Raster::PixelFormat::MaskA8 ? 0 : format == Raster::PixelFormat::MaskA16 ? 1 : 2;
}

int WriteCode(Raster::DabWrite write) {
    switch (write) {
    case Raster::DabWrite::Colour:
        return 0;
    case Raster::DabWrite::ClearAlpha:
        return 1;
    case Raster::DabWrite::Copy:
        return 2;
    default:
        return 3;
    }
}

// A packed copy of rect of image on the device.
Kernel::Counted<Raster::HardwareBuffer> Upload(const Raster::HardwareDevice* device,
                                               const Raster::DynamicBuffer& image, Kernel::RectT<int> rect) {
    const std::size_t bpp = std::size_t(image.GetBytesPerPixel());
    return Raster::CreateHardwareBuffer(device, image.RowBytes(rect.top) + std::size_t(rect.left) * bpp,
                                        std::size_t(image.Stride()), rect.Width(), rect.Height(), int(bpp));
}

} // namespace

DeviceKernelText GetDabKernelText(Raster::HardwareKernelLanguage language) {
    return {BuildText(language), "rt_pixel_dab"};
}

bool CompositeDabOnDevice(const Raster::HardwareDevice* device, Raster::DynamicBuffer& target,
                          Kernel::RectT<int> rect, const Raster::DynamicBuffer& coverage,
                          const Raster::DabRequest& request, bool wait, const bool* abort) {
    const int language = static_cast<int>(Raster::GetKernelLanguage(device));
    if (language < 0 || language > 1) return false;
    static std::once_flag once;
    static std::array<DeviceKernelText, 2> texts;
    std::call_once(once, [] {
        texts[0] = GetDabKernelText(Raster::HardwareKernelLanguage::CudaCpp);
        texts[1] = GetDabKernelText(Raster::HardwareKernelLanguage::OpenCLC);
    });
    const DeviceKernelText& text = texts[std::size_t(language)];
    const auto plan = Raster::PlanDab(target, rect, coverage, request);
    if (!plan) return false;
    if (plan->rect.IsEmpty()) return true;
    if (!DeviceKernelsReady(device, {&text}, wait, abort)) return false;

    const Kernel::RectT<int> r = plan->rect;
    const auto& info = Raster::GetPixelFormatInfo(target.GetFormat());
    const auto targetBuffer = Upload(device, target, r);
    const auto coverageBuffer = Upload(device, coverage, coverage.GetBounds());
    std::array<std::byte, 32> colourBytes{};
    if (request.colour) std::copy(request.colour, request.colour + info.bytesPerPixel, colourBytes.begin());
    const auto colourBuffer = Raster::CreateHardwareBuffer(device, colourBytes.data(), colourBytes.size(), 1,
                                                           1, int(colourBytes.size()));
    const auto sourceBuffer = request.source
                                  ? Upload(device, *request.source, request.source->GetBounds())
                                  : Raster::CreateHardwareBuffer(device, colourBytes.data(), 4, 1, 1, 4);
    std::vector<int> texelX(std::size_t(r.Width()), 0), texelY(std::size_t(r.Height()), 0);
    if (request.texture) {
        for (int i = 0; i < r.Width(); ++i)
            texelX[std::size_t(i)] = Raster::DabTexel(request.targetOrigin.x + r.left + i,
                                                      request.textureScale, request.texture->GetWidth());
        for (int j = 0; j < r.Height(); ++j)
            texelY[std::size_t(j)] = Raster::DabTexel(request.targetOrigin.y + r.top + j,
                                                      request.textureScale, request.texture->GetHeight());
    }
    const auto textureBuffer = request.texture
                                   ? Upload(device, *request.texture, request.texture->GetBounds())
                                   : Raster::CreateHardwareBuffer(device, colourBytes.data(), 4, 1, 1, 4);
    const auto texelXBuffer = Raster::CreateHardwareBuffer(device, texelX.data(), texelX.size() * sizeof(int),
                                                           int(texelX.size()), 1, int(sizeof(int)));
    const auto texelYBuffer = Raster::CreateHardwareBuffer(device, texelY.data(), texelY.size() * sizeof(int),
                                                           int(texelY.size()), 1, int(sizeof(int)));
    if (!targetBuffer || !coverageBuffer || !colourBuffer || !sourceBuffer || !textureBuffer ||
        !texelXBuffer || !texelYBuffer)
        return false;

    Raster::HardwareKernelArguments arguments;
    arguments.AddBuffer(targetBuffer)
        .AddInt(info.bytesPerComponent)
        .AddInt(info.channelCount)
        .AddInt(info.alphaIndex);
    arguments.AddInt(r.Width()).AddInt(r.Height());
    arguments.AddBuffer(coverageBuffer).AddInt(MaskCode(coverage.GetFormat())).AddInt(coverage.GetWidth());
    arguments.AddInt(plan->coverageAt.x).AddInt(plan->coverageAt.y);
    arguments.AddBuffer(colourBuffer).AddBuffer(sourceBuffer).AddInt(WriteCode(request.write));
    arguments.AddInt(plan->stamp ? 1 : 0).AddInt(int(plan->factor)).AddInt(plan->precisionBits);
    arguments.AddBuffer(textureBuffer).AddInt(request.texture ? MaskCode(request.texture->GetFormat()) : 0);
    arguments.AddInt(request.texture ? request.texture->GetWidth() : 1).AddInt(request.texture ? 1 : 0);
    arguments.AddBuffer(texelXBuffer).AddBuffer(texelYBuffer);
    if (!Raster::ExecuteKernel(device, text.Descriptor(), r.Width(), r.Height(), arguments, abort))
        return false;
    // The whole rect comes back; pixels the dab left alone come back as they went.
    const std::size_t bpp = std::size_t(info.bytesPerPixel);
    return targetBuffer->Download(target.RowBytes(r.top) + std::size_t(r.left) * bpp,
                                  std::size_t(target.Stride()));
}

} // namespace RasterTools
