#include "host/brush/DabComposite.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <type_traits>

namespace Raster {

namespace {

// Weights in one of two fixed-point precisions: 8 bits for 8-bit targets, 16 bits for the others.
template <int Bits>
struct Precision {
    static constexpr std::uint32_t kFull = Bits == 8 ? 255u : 65535u;
    static constexpr std::uint32_t kHalf = Bits == 8 ? 128u : 32768u;
    static std::uint32_t Multiply(std::uint32_t a, std::uint32_t b) noexcept {
        return Bits == 8 ? DabFixedPoint::Multiply8(a, b) : DabFixedPoint::Multiply16(a, b);
    }
    static std::uint32_t FromFraction(double f) noexcept {
        if (!(f > 0.0)) return 0; // NaN too
        return f >= 1.0 ? kFull : std::uint32_t(std::lround(f * double(kFull)));
    }
    static std::uint32_t From8(std::uint8_t v) noexcept { return Bits == 8 ? v : std::uint32_t(v) * 257u; }
    static std::uint32_t From16(std::uint16_t v) noexcept {
        return Bits == 8 ? (std::uint32_t(v) * 255u + 32767u) / 65535u : v;
    }
};

template <class P>
std::uint32_t ReadWeight(const DynamicBuffer& mask, int x, int y) noexcept {
    switch (mask.GetFormat()) {
    case PixelFormat::MaskA8:
        return P::From8(mask.Row<std::uint8_t>(y)[x]);
    case PixelFormat::MaskA16:
        return P::From16(mask.Row<std::uint16_t>(y)[x]);
    default:
        return P::FromFraction(mask.Row<float>(y)[x]);
    }
}

template <class P, PixelFormat Coverage>
std::uint32_t ReadCoverage(const DynamicBuffer& coverage, int x, int y) noexcept {
    if constexpr (Coverage == PixelFormat::MaskA8)
        return P::From8(coverage.Row<std::uint8_t>(y)[x]);
    else if constexpr (Coverage == PixelFormat::MaskA16)
        return P::From16(coverage.Row<std::uint16_t>(y)[x]);
    else
        return P::FromFraction(coverage.Row<float>(y)[x]);
}

// Moves d towards v by w (of full), never past v; w == full gives v exactly.
template <class T, class P>
T Move(T d, T v, std::uint32_t w) noexcept {
    if constexpr (std::is_floating_point_v<T>) {
        if (w == P::kFull) return v;
        return T(d + (v - d) * (float(w) / 65535.0f));
    } else {
        const std::uint32_t distance = v > d ? std::uint32_t(v - d) : std::uint32_t(d - v);
        const std::uint32_t step = P::Multiply(distance, w);
        return v > d ? T(d + step) : T(d - step);
    }
}

int PositiveModulo(long long value, int modulus) noexcept {
    const long long r = value % modulus;
    return int(r < 0 ? r + modulus : r);
}

template <class T, PixelFormat Coverage>
void Compose(DynamicBuffer& target, Kernel::RectT<int> rect, Kernel::PointT<int> coverageAt,
             const DynamicBuffer& coverage, const DabRequest& request) {
    using P = Precision<sizeof(T) == 1 ? 8 : 16>;
    const PixelFormatInfo& info = GetPixelFormatInfo(target.GetFormat());
    const int channels = info.channelCount;
    const int alpha = info.alphaIndex;
    const bool copy = request.write == DabWrite::Copy;
    const bool opaque = !copy && request.path == DabPath::Opaque;
    const bool stamp = !copy && request.path == DabPath::Stamp;
    const double strength = std::isnan(request.strength) ? 0.0 : std::clamp(request.strength, 0.0, 1.0);
    const double dynamic = std::isnan(request.dynamic) ? 0.0 : std::clamp(request.dynamic, 0.0, 1.0);
    const std::uint32_t factor = P::FromFraction(opaque ? dynamic : strength * dynamic);
    const double scale = request.textureScale > 0.0 ? request.textureScale : 1.0;

    T value[5] = {};
    if (request.write == DabWrite::Colour)
        std::memcpy(value, request.colour, sizeof(T) * std::size_t(channels));
    if (request.write == DabWrite::FullMask) value[0] = std::is_floating_point_v<T> ? T(1) : T(P::kFull);

    for (int y = rect.top; y < rect.bottom; ++y) {
        T* row = target.Row<T>(y);
        const T* source = copy ? request.source->Row<T>(y - rect.top) : nullptr;
        const int coverageY = coverageAt.y + y - rect.top;
        int textureY = 0;
        if (request.texture)
            textureY = PositiveModulo((long long)std::floor(double(request.targetOrigin.y + y) / scale),
                                      request.texture->GetHeight());
        for (int x = rect.left; x < rect.right; ++x) {
            std::uint32_t w = P::Multiply(
                ReadCoverage<P, Coverage>(coverage, coverageAt.x + x - rect.left, coverageY), factor);
            if (request.texture) {
                const int textureX =
                    PositiveModulo((long long)std::floor(double(request.targetOrigin.x + x) / scale),
                                   request.texture->GetWidth());
                w = P::Multiply(w, ReadWeight<P>(*request.texture, textureX, textureY));
            }
            if (w == 0) continue;
            if (stamp) {
                if (w < P::kHalf) continue;
                w = P::kFull;
            }
            T* pixel = row + std::size_t(x) * std::size_t(channels);
            switch (request.write) {
            case DabWrite::Colour:
                for (int c = 0; c < channels; ++c)
                    pixel[c] = Move<T, P>(pixel[c], value[c], w);
                break;
            case DabWrite::ClearAlpha:
                pixel[alpha] = Move<T, P>(pixel[alpha], T(0), w);
                break;
            case DabWrite::Copy: {
                const T* from = source + std::size_t(x - rect.left) * std::size_t(channels);
                for (int c = 0; c < channels; ++c)
                    pixel[c] = Move<T, P>(pixel[c], from[c], w);
                break;
            }
            case DabWrite::FullMask:
                pixel[0] = Move<T, P>(pixel[0], value[0], w);
                break;
            }
        }
    }
}

template <class T>
bool ComposeFor(PixelFormat coverageFormat, DynamicBuffer& target, Kernel::RectT<int> rect,
                Kernel::PointT<int> coverageAt, const DynamicBuffer& coverage, const DabRequest& request) {
    switch (coverageFormat) {
    case PixelFormat::MaskA8:
        Compose<T, PixelFormat::MaskA8>(target, rect, coverageAt, coverage, request);
        return true;
    case PixelFormat::MaskA16:
        Compose<T, PixelFormat::MaskA16>(target, rect, coverageAt, coverage, request);
        return true;
    case PixelFormat::MaskAF:
        Compose<T, PixelFormat::MaskAF>(target, rect, coverageAt, coverage, request);
        return true;
    default:
        return false;
    }
}

} // namespace

bool CompositeDab(DynamicBuffer& target, Kernel::RectT<int> rect, const DynamicBuffer& coverage,
                  const DabRequest& request) {
    const PixelFormat format = target.GetFormat();
    if (!IsMaskFormat(coverage.GetFormat())) return false;
    switch (request.write) {
    case DabWrite::Colour:
        if (!request.colour || IsMaskFormat(format)) return false;
        break;
    case DabWrite::ClearAlpha:
        if (GetPixelFormatInfo(format).alphaIndex < 0) return false;
        break;
    case DabWrite::Copy:
        if (!request.source || request.source->GetFormat() != format ||
            request.source->GetWidth() != rect.Width() || request.source->GetHeight() != rect.Height())
            return false;
        break;
    case DabWrite::FullMask:
        if (!IsMaskFormat(format)) return false;
        break;
    }
    if (request.texture && (!IsMaskFormat(request.texture->GetFormat()) || request.texture->GetWidth() < 1 ||
                            request.texture->GetHeight() < 1))
        return false;
    // The coverage is laid over the rect as asked; clipping moves where it is read from.
    const Kernel::RectT<int> clipped = rect.Intersect(target.GetBounds());
    if (clipped.IsEmpty()) return true;
    if (rect.Width() > coverage.GetWidth() || rect.Height() > coverage.GetHeight()) return false;
    const Kernel::PointT<int> coverageAt{clipped.left - rect.left, clipped.top - rect.top};
    if (request.write == DabWrite::Copy && clipped != rect) return false;
    switch (GetBytesPerComponent(format)) {
    case 1:
        return ComposeFor<std::uint8_t>(coverage.GetFormat(), target, clipped, coverageAt, coverage, request);
    case 2:
        return ComposeFor<std::uint16_t>(coverage.GetFormat(), target, clipped, coverageAt, coverage,
                                         request);
    default:
        return ComposeFor<float>(coverage.GetFormat(), target, clipped, coverageAt, coverage, request);
    }
}

} // namespace Raster
