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
    // A stored float mask value, multiplied in single precision as a device does.
    static std::uint32_t FromFloat(float f) noexcept {
        if (!(f > 0.0f)) return 0;
        return f >= 1.0f ? kFull : std::uint32_t(std::lround(f * float(kFull)));
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
        return P::FromFloat(mask.Row<float>(y)[x]);
    }
}

template <class P, PixelFormat Coverage>
std::uint32_t ReadCoverage(const DynamicBuffer& coverage, int x, int y) noexcept {
    if constexpr (Coverage == PixelFormat::MaskA8)
        return P::From8(coverage.Row<std::uint8_t>(y)[x]);
    else if constexpr (Coverage == PixelFormat::MaskA16)
        return P::From16(coverage.Row<std::uint16_t>(y)[x]);
    else
        return P::FromFloat(coverage.Row<float>(y)[x]);
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
void Compose(DynamicBuffer& target, const DabPlan& plan, const DynamicBuffer& coverage,
             const DabRequest& request) {
    using P = Precision<sizeof(T) == 1 ? 8 : 16>;
    const PixelFormatInfo& info = GetPixelFormatInfo(target.GetFormat());
    const int channels = info.channelCount;
    const int alpha = info.alphaIndex;
    const Kernel::RectT<int> rect = plan.rect;
    const Kernel::PointT<int> coverageAt = plan.coverageAt;
    const std::uint32_t factor = plan.factor;
    const bool stamp = plan.stamp;
    const bool copy = request.write == DabWrite::Copy;

    T value[5] = {};
    if (request.write == DabWrite::Colour)
        std::memcpy(value, request.colour, sizeof(T) * std::size_t(channels));
    if (request.write == DabWrite::FullMask) value[0] = std::is_floating_point_v<T> ? T(1) : T(P::kFull);

    for (int y = rect.top; y < rect.bottom; ++y) {
        T* row = target.Row<T>(y);
        const T* source = copy ? request.source->Row<T>(y - rect.top) : nullptr;
        const int coverageY = coverageAt.y + y - rect.top;
        const int textureY = request.texture ? DabTexel(request.targetOrigin.y + y, request.textureScale,
                                                        request.texture->GetHeight())
                                             : 0;
        for (int x = rect.left; x < rect.right; ++x) {
            std::uint32_t w = P::Multiply(
                ReadCoverage<P, Coverage>(coverage, coverageAt.x + x - rect.left, coverageY), factor);
            if (request.texture) {
                const int textureX =
                    DabTexel(request.targetOrigin.x + x, request.textureScale, request.texture->GetWidth());
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
bool ComposeFor(PixelFormat coverageFormat, DynamicBuffer& target, const DabPlan& plan,
                const DynamicBuffer& coverage, const DabRequest& request) {
    switch (coverageFormat) {
    case PixelFormat::MaskA8:
        Compose<T, PixelFormat::MaskA8>(target, plan, coverage, request);
        return true;
    case PixelFormat::MaskA16:
        Compose<T, PixelFormat::MaskA16>(target, plan, coverage, request);
        return true;
    case PixelFormat::MaskAF:
        Compose<T, PixelFormat::MaskAF>(target, plan, coverage, request);
        return true;
    default:
        return false;
    }
}

} // namespace

int DabTexel(int documentCoordinate, double scale, int size) noexcept {
    if (size < 1) return 0;
    if (!(scale > 0.0)) scale = 1.0;
    return PositiveModulo((long long)std::floor(double(documentCoordinate) / scale), size);
}

std::optional<DabPlan> PlanDab(const DynamicBuffer& target, Kernel::RectT<int> rect,
                               const DynamicBuffer& coverage, const DabRequest& request) {
    const PixelFormat format = target.GetFormat();
    if (!IsMaskFormat(coverage.GetFormat())) return std::nullopt;
    switch (request.write) {
    case DabWrite::Colour:
        if (!request.colour || IsMaskFormat(format)) return std::nullopt;
        break;
    case DabWrite::ClearAlpha:
        if (GetPixelFormatInfo(format).alphaIndex < 0) return std::nullopt;
        break;
    case DabWrite::Copy:
        if (!request.source || request.source->GetFormat() != format ||
            request.source->GetWidth() != rect.Width() || request.source->GetHeight() != rect.Height())
            return std::nullopt;
        break;
    case DabWrite::FullMask:
        if (!IsMaskFormat(format)) return std::nullopt;
        break;
    }
    if (request.texture && (!IsMaskFormat(request.texture->GetFormat()) || request.texture->GetWidth() < 1 ||
                            request.texture->GetHeight() < 1))
        return std::nullopt;
    DabPlan plan;
    plan.precisionBits = GetBytesPerComponent(format) == 1 ? 8 : 16;
    // The coverage is laid over the rect as asked; clipping moves where it is read from.
    plan.rect = rect.Intersect(target.GetBounds());
    if (plan.rect.IsEmpty()) {
        plan.rect = {};
        return plan;
    }
    if (rect.Width() > coverage.GetWidth() || rect.Height() > coverage.GetHeight()) return std::nullopt;
    if (request.write == DabWrite::Copy && plan.rect != rect) return std::nullopt;
    plan.coverageAt = {plan.rect.left - rect.left, plan.rect.top - rect.top};
    const bool copy = request.write == DabWrite::Copy;
    const bool opaque = !copy && request.path == DabPath::Opaque;
    plan.stamp = !copy && request.path == DabPath::Stamp;
    const double strength = std::isnan(request.strength) ? 0.0 : std::clamp(request.strength, 0.0, 1.0);
    const double dynamic = std::isnan(request.dynamic) ? 0.0 : std::clamp(request.dynamic, 0.0, 1.0);
    const double fraction = opaque ? dynamic : strength * dynamic;
    plan.factor = plan.precisionBits == 8 ? Precision<8>::FromFraction(fraction)
                                          : Precision<16>::FromFraction(fraction);
    return plan;
}

bool CompositeDab(DynamicBuffer& target, Kernel::RectT<int> rect, const DynamicBuffer& coverage,
                  const DabRequest& request) {
    const auto plan = PlanDab(target, rect, coverage, request);
    if (!plan) return false;
    if (plan->rect.IsEmpty()) return true;
    switch (GetBytesPerComponent(target.GetFormat())) {
    case 1:
        return ComposeFor<std::uint8_t>(coverage.GetFormat(), target, *plan, coverage, request);
    case 2:
        return ComposeFor<std::uint16_t>(coverage.GetFormat(), target, *plan, coverage, request);
    default:
        return ComposeFor<float>(coverage.GetFormat(), target, *plan, coverage, request);
    }
}

} // namespace Raster
