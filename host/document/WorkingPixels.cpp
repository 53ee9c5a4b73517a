// Conversions between the layer formats and the working colour on the processor, with the same formulas and
// rounding that the pixel pipeline's conversions use.
#include "host/document/WorkingPixels.h"

#include "host/kernel/UnalignedBytes.h"
#include "host/raster/ICCManager.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>

namespace WorkingPixels {

namespace {

// Rounds to nearest, halves away from zero, after clamping to 0..maximum; NaN stores as 0.
float Quantise(float v, float maximum) noexcept {
    if (!(v > 0.0f)) return 0.0f;
    return std::round(std::min(v, 1.0f) * maximum);
}

float Saturate(float v, float maximum) noexcept {
    if (!(v > 0.0f)) return 0.0f;
    return std::min(v, maximum);
}

} // namespace

void ToWorking(Raster::PixelFormat format, const std::byte* in, float* out, int n) noexcept {
    using Raster::PixelFormat;
    switch (format) {
    case PixelFormat::RGBA8:
        for (int i = 0; i < 4 * n; ++i)
            out[i] = float(std::uint8_t(in[i])) / 255.0f;
        return;
    case PixelFormat::RGBA16:
        for (int i = 0; i < 4 * n; ++i)
            out[i] = float(Kernel::LoadBytes<std::uint16_t>(in + 2 * i)) / 65535.0f;
        return;
    case PixelFormat::RGBAUF:
        std::memcpy(out, in, std::size_t(n) * 16);
        return;
    case PixelFormat::IA8:
        for (int i = 0; i < n; ++i, out += 4) {
            out[0] = out[1] = out[2] = float(std::uint8_t(in[2 * i])) / 255.0f;
            out[3] = float(std::uint8_t(in[2 * i + 1])) / 255.0f;
        }
        return;
    case PixelFormat::IA16:
        for (int i = 0; i < n; ++i, out += 4) {
            out[0] = out[1] = out[2] = float(Kernel::LoadBytes<std::uint16_t>(in + 4 * i)) / 65535.0f;
            out[3] = float(Kernel::LoadBytes<std::uint16_t>(in + 4 * i + 2)) / 65535.0f;
        }
        return;
    case PixelFormat::CMYKA8:
        for (int i = 0; i < n; ++i, out += 4) {
            const std::byte* p = in + 5 * i;
            const float k = float(std::uint8_t(p[3])) * 0.003921569f;
            for (int c = 0; c < 3; ++c)
                out[c] = 1.0f - std::min(1.0f, float(std::uint8_t(p[c])) * 0.003921569f * (1.0f - k) + k);
            out[3] = float(std::uint8_t(p[4])) / 255.0f;
        }
        return;
    case PixelFormat::LabA16:
        Raster::ICCManager::GetInstance().DoLABA16ToRGBAFTransform(
            reinterpret_cast<unsigned char*>(const_cast<std::byte*>(in)),
            reinterpret_cast<unsigned char*>(out), n);
        return;
    default:
        std::fill(out, out + 4 * n, 0.0f);
        return;
    }
}

void FromWorking(Raster::PixelFormat format, const float* in, std::byte* out, int n) noexcept {
    using Raster::PixelFormat;
    switch (format) {
    case PixelFormat::RGBA8:
        for (int i = 0; i < 4 * n; ++i)
            out[i] = std::byte(std::uint8_t(Quantise(in[i], 255.0f)));
        return;
    case PixelFormat::RGBA16:
        for (int i = 0; i < 4 * n; ++i)
            Kernel::StoreBytes(out + 2 * i, std::uint16_t(Quantise(in[i], 65535.0f)));
        return;
    case PixelFormat::RGBAUF:
        std::memcpy(out, in, std::size_t(n) * 16);
        return;
    case PixelFormat::IA8:
    case PixelFormat::IA16: {
        // Luminance from the unclamped colour, as the pipeline's conversion does.
        const bool wide = format == PixelFormat::IA16;
        const float maximum = wide ? 65535.0f : 255.0f;
        for (int i = 0; i < n; ++i, in += 4) {
            const float grey =
                Saturate(std::round(maximum * (in[0] * 0.299f + in[1] * 0.587f + in[2] * 0.114f)), maximum);
            const float alpha = Saturate(std::round(in[3] * maximum), maximum);
            if (wide) {
                Kernel::StoreBytes(out + 4 * i, std::uint16_t(grey));
                Kernel::StoreBytes(out + 4 * i + 2, std::uint16_t(alpha));
            } else {
                out[2 * i] = std::byte(std::uint8_t(grey));
                out[2 * i + 1] = std::byte(std::uint8_t(alpha));
            }
        }
        return;
    }
    case PixelFormat::CMYKA8:
        for (int i = 0; i < n; ++i, in += 4) {
            float rgb[3];
            for (int c = 0; c < 3; ++c)
                rgb[c] = std::clamp(std::isnan(in[c]) ? 0.0f : in[c], 0.0f, 1.0f);
            const float a = std::clamp(std::isnan(in[3]) ? 0.0f : in[3], 0.0f, 1.0f);
            // Black takes what the three inks share; pure black needs no division.
            const float k = std::min(1.0f - rgb[0], std::min(1.0f - rgb[1], 1.0f - rgb[2]));
            std::byte* p = out + 5 * i;
            for (int c = 0; c < 3; ++c)
                p[c] = std::byte(
                    std::uint8_t(k < 1.0f ? std::round((1.0f - rgb[c] - k) / (1.0f - k) * 255.0f) : 0.0f));
            p[3] = std::byte(std::uint8_t(std::round(k * 255.0f)));
            p[4] = std::byte(std::uint8_t(std::round(a * 255.0f)));
        }
        return;
    case PixelFormat::LabA16:
        Raster::ICCManager::GetInstance().DoRGBAFToLABA16Transform(
            reinterpret_cast<unsigned char*>(const_cast<float*>(in)), reinterpret_cast<unsigned char*>(out),
            n);
        return;
    default:
        return;
    }
}

} // namespace WorkingPixels
