#include "brushes/PixelDab.h"

#include "brushes/DabDevice.h"
#include "host/brush/RasterBrushCommand.h"
#include "pipeline/Conversions.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <mutex>

namespace RasterTools {

std::optional<Raster::DabPath> ChooseDabPath(int mode, double strength) noexcept {
    if (mode == 1) return Raster::DabPath::Stamp;
    if (mode != 0) return std::nullopt;
    return strength == 1.0 ? Raster::DabPath::Opaque : Raster::DabPath::Blended;
}

HueSaturationLightness ToHueSaturationLightness(double r, double g, double b) noexcept {
    const double high = std::max({r, g, b}), low = std::min({r, g, b});
    HueSaturationLightness hsl;
    hsl.lightness = (high + low) / 2.0;
    const double range = high - low;
    if (range <= 0.0) return hsl;
    hsl.saturation = hsl.lightness > 0.5 ? range / (2.0 - high - low) : range / (high + low);
    double hue;
    if (high == r)
        hue = (g - b) / range + (g < b ? 6.0 : 0.0);
    else if (high == g)
        hue = (b - r) / range + 2.0;
    else
        hue = (r - g) / range + 4.0;
    hsl.hue = hue / 6.0;
    return hsl;
}

namespace {
double HueChannel(double p, double q, double t) noexcept {
    if (t < 0.0) t += 1.0;
    if (t > 1.0) t -= 1.0;
    if (t < 1.0 / 6.0) return p + (q - p) * 6.0 * t;
    if (t < 0.5) return q;
    if (t < 2.0 / 3.0) return p + (q - p) * (2.0 / 3.0 - t) * 6.0;
    return p;
}
} // namespace

void FromHueSaturationLightness(const HueSaturationLightness& hsl, double& r, double& g, double& b) noexcept {
    if (hsl.saturation <= 0.0) {
        r = g = b = hsl.lightness;
        return;
    }
    const double l = hsl.lightness, s = hsl.saturation;
    const double q = l < 0.5 ? l * (1.0 + s) : l + s - l * s;
    const double p = 2.0 * l - q;
    r = HueChannel(p, q, hsl.hue + 1.0 / 3.0);
    g = HueChannel(p, q, hsl.hue);
    b = HueChannel(p, q, hsl.hue - 1.0 / 3.0);
}

HueSaturationLightness OffsetHueSaturationLightness(HueSaturationLightness hsl, double hue, double saturation,
                                                    double lightness) noexcept {
    const auto finite = [](double v) { return std::isfinite(v) ? v : 0.0; };
    double wrapped = std::fmod(hsl.hue + finite(hue), 1.0);
    if (wrapped < 0.0) wrapped += 1.0;
    // fmod of a tiny negative value plus 1 can round to exactly 1.
    hsl.hue = wrapped >= 1.0 ? 0.0 : wrapped;
    hsl.saturation = std::clamp(hsl.saturation + finite(saturation), 0.0, 1.0);
    hsl.lightness = std::clamp(hsl.lightness + finite(lightness), 0.0, 1.0);
    return hsl;
}

ColourCoverage MakeColourCoverage(double alpha, double opacity) noexcept {
    const auto unit = [](double v) { return std::isnan(v) ? 0.0 : std::clamp(v, 0.0, 1.0); };
    const std::uint32_t a8 = std::uint32_t(std::lround(unit(alpha) * 255.0));
    const std::uint32_t o8 = std::uint32_t(std::lround(unit(opacity) * 255.0));
    const std::uint32_t a16 = std::uint32_t(std::lround(unit(alpha) * 65535.0));
    const std::uint32_t o16 = std::uint32_t(std::lround(unit(opacity) * 65535.0));
    ColourCoverage coverage;
    coverage.alpha8 = std::uint8_t(Raster::DabFixedPoint::Multiply8(a8, o8));
    coverage.alpha16 = std::uint16_t(Raster::DabFixedPoint::Multiply16(a16, o16));
    coverage.alphaF = float(coverage.alpha16) / 65535.0f;
    return coverage;
}

namespace {

template <Raster::PixelFormat F>
PixelBytes ConvertPixel(const Raster::KernelMath::float4& working, const ColourCoverage& coverage) {
    auto stored = FromWorking<F>(working);
    static_assert(sizeof(stored) <= sizeof(PixelBytes));
    PixelBytes bytes{};
    std::memcpy(bytes.data(), &stored, sizeof(stored));
    const Raster::PixelFormatInfo& info = Raster::GetPixelFormatInfo(F);
    std::byte* alpha = bytes.data() + std::size_t(info.alphaIndex) * std::size_t(info.bytesPerComponent);
    if constexpr (Raster::GetBytesPerComponent(F) == 1)
        std::memcpy(alpha, &coverage.alpha8, 1);
    else if constexpr (Raster::GetBytesPerComponent(F) == 2)
        std::memcpy(alpha, &coverage.alpha16, 2);
    else
        std::memcpy(alpha, &coverage.alphaF, 4);
    return bytes;
}

} // namespace

std::optional<PixelBytes> GetRasterDynamicPixel(const Renderer::ConsolidatedColour& colour,
                                                const Raster::ColourProfiles& profiles, int documentFormat,
                                                Raster::PixelFormat format, const ColourCoverage& coverage) {
    // Brush colours are converted by the formats' fixed rules, like the pipeline's own conversions; the
    // document's profiles are not applied to them yet.
    (void)profiles, (void)documentFormat;
    const auto finite = [](float v) { return std::isfinite(v) ? v : 0.0f; };
    Raster::KernelMath::float4 working{};
    working.x = finite(colour.r);
    working.y = finite(colour.g);
    working.z = finite(colour.b);
    working.w = 1.0f;
    using Raster::PixelFormat;
    switch (format) {
    case PixelFormat::RGBA8:
        return ConvertPixel<PixelFormat::RGBA8>(working, coverage);
    case PixelFormat::RGBA16:
        return ConvertPixel<PixelFormat::RGBA16>(working, coverage);
    case PixelFormat::RGBAUF:
        return ConvertPixel<PixelFormat::RGBAUF>(working, coverage);
    case PixelFormat::IA8:
        return ConvertPixel<PixelFormat::IA8>(working, coverage);
    case PixelFormat::IA16:
        return ConvertPixel<PixelFormat::IA16>(working, coverage);
    case PixelFormat::CMYKA8:
        return ConvertPixel<PixelFormat::CMYKA8>(working, coverage);
    case PixelFormat::LabA16:
        return ConvertPixel<PixelFormat::LabA16>(working, coverage);
    default:
        return std::nullopt;
    }
}

double GetDynamicFactor(const Raster::RasterBrush& brush, const Raster::BrushNozzle& nozzle) noexcept {
    const Raster::BrushDynamic* dynamic = brush.GetActiveDynamic();
    return dynamic ? dynamic->GetValue(nozzle.pressure) : 1.0;
}

Kernel::Counted<Raster::DynamicBuffer> GetDabTexture(const Raster::RasterBrush& brush,
                                                     Raster::PixelFormat target) {
    if (brush.GetMaskTextureMode() != 1) return {};
    return brush.GetMaskTexture(Raster::DynamicBase::GetCompatibleMaskFormat(target));
}

std::optional<DabTarget> PrepareDab(Raster::BrushNozzle& nozzle, const Raster::RasterBrush* brush) {
    DabTarget dab;
    dab.target = nozzle.bitmap ? nozzle.bitmap.Get() : nozzle.mask.Get();
    if (!dab.target || !brush) return std::nullopt;
    dab.rect = RoundNozzleRect(nozzle.rect, dab.target->GetWidth(), dab.target->GetHeight());
    if (dab.rect.IsEmpty() || !brush->CanPaint()) return std::nullopt;
    dab.coverage = nozzle.coverage;
    if (!dab.coverage || dab.coverage->GetWidth() != dab.rect.Width() ||
        dab.coverage->GetHeight() != dab.rect.Height())
        dab.coverage = brush->MakeCoverage(dab.rect);
    if (!dab.coverage) return std::nullopt;
    return dab;
}

namespace {
std::mutex g_DabDeviceMutex;
Kernel::Counted<Raster::HardwareDevice> g_DabDevice;
} // namespace

void SetDabDevice(Kernel::Counted<Raster::HardwareDevice> device) {
    std::lock_guard lock(g_DabDeviceMutex);
    g_DabDevice = std::move(device);
}

Kernel::Counted<Raster::HardwareDevice> GetDabDevice() {
    std::lock_guard lock(g_DabDeviceMutex);
    return g_DabDevice;
}

bool ComposeDab(Raster::DynamicBuffer& target, Kernel::RectT<int> rect, const Raster::DynamicBuffer& coverage,
                const Raster::DabRequest& request) {
    if (const auto device = GetDabDevice())
        if (CompositeDabOnDevice(device.Get(), target, rect, coverage, request)) return true;
    return Raster::CompositeDab(target, rect, coverage, request);
}

} // namespace RasterTools
