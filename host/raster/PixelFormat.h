#pragma once
// The host's pixel formats: their properties, names, and the compile-time link to their five channel types.

#include "host/raster/Channels.h"

#include <array>
#include <cstdint>
#include <optional>
#include <string_view>
#include <type_traits>
#include <utility>

namespace Raster {

// Layer formats first (RGBA8 .. LabA16), then masks, the single-channel float map and the float scratch
// format.
enum class PixelFormat : std::uint8_t {
    RGBA8,
    RGBA16,
    RGBAUF,
    IA8,
    IA16,
    CMYKA8,
    LabA16,
    MaskA8,
    MaskA16,
    MaskAF,
    IntensityUF,
    RGBAF,
};

inline constexpr int PixelFormatCount = 12;

struct PixelFormatInfo {
    PixelFormat format;
    std::string_view name; // short lower-case name used on the command line and in messages
    int channelCount;      // stored channels; placeholders excluded
    int bytesPerComponent; // every channel of a format has the same component type
    int bytesPerPixel;     // interleaved: channelCount * bytesPerComponent
    bool isLayer;          // can be the pixels of a layer (source and destination of a filter)
    bool isMask;           // a selection or mask format (alpha only)
    bool isFloat;          // components are 32-bit floats, otherwise unsigned integers
    int alphaIndex;        // component index of alpha within a pixel, -1 when there is none
};

inline constexpr std::array<PixelFormatInfo, PixelFormatCount> PixelFormatTable{{
    {PixelFormat::RGBA8, "rgba8", 4, 1, 4, true, false, false, 3},
    {PixelFormat::RGBA16, "rgba16", 4, 2, 8, true, false, false, 3},
    {PixelFormat::RGBAUF, "rgbauf", 4, 4, 16, true, false, true, 3},
    {PixelFormat::IA8, "ia8", 2, 1, 2, true, false, false, 1},
    {PixelFormat::IA16, "ia16", 2, 2, 4, true, false, false, 1},
    {PixelFormat::CMYKA8, "cmyka8", 5, 1, 5, true, false, false, 4},
    {PixelFormat::LabA16, "laba16", 4, 2, 8, true, false, false, 3},
    {PixelFormat::MaskA8, "maska8", 1, 1, 1, false, true, false, 0},
    {PixelFormat::MaskA16, "maska16", 1, 2, 2, false, true, false, 0},
    {PixelFormat::MaskAF, "maskaf", 1, 4, 4, false, true, true, 0},
    {PixelFormat::IntensityUF, "intensityuf", 1, 4, 4, false, false, true, -1},
    {PixelFormat::RGBAF, "rgbaf", 4, 4, 16, false, false, true, 3},
}};

constexpr bool IsValidPixelFormat(PixelFormat format) noexcept {
    return static_cast<unsigned>(format) < static_cast<unsigned>(PixelFormatCount);
}
// The format must be valid (IsValidPixelFormat); every enumerator is.
constexpr const PixelFormatInfo& GetPixelFormatInfo(PixelFormat format) noexcept {
    return PixelFormatTable[static_cast<std::size_t>(format)];
}
constexpr int GetChannelCount(PixelFormat format) noexcept {
    return GetPixelFormatInfo(format).channelCount;
}
constexpr int GetBytesPerComponent(PixelFormat format) noexcept {
    return GetPixelFormatInfo(format).bytesPerComponent;
}
constexpr int GetBytesPerPixel(PixelFormat format) noexcept {
    return GetPixelFormatInfo(format).bytesPerPixel;
}
constexpr bool IsLayerFormat(PixelFormat format) noexcept {
    return GetPixelFormatInfo(format).isLayer;
}
constexpr bool IsMaskFormat(PixelFormat format) noexcept {
    return GetPixelFormatInfo(format).isMask;
}
constexpr bool IsFloatFormat(PixelFormat format) noexcept {
    return GetPixelFormatInfo(format).isFloat;
}
constexpr std::string_view GetPixelFormatName(PixelFormat format) noexcept {
    return GetPixelFormatInfo(format).name;
}

// Parses a short name ("rgba8", "laba16"); letter case is ignored. Nothing for an unknown name.
constexpr std::optional<PixelFormat> ParsePixelFormat(std::string_view text) noexcept {
    for (const PixelFormatInfo& info : PixelFormatTable) {
        if (info.name.size() != text.size()) continue;
        bool same = true;
        for (std::size_t i = 0; i < text.size() && same; ++i) {
            char c = text[i];
            if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
            same = c == info.name[i];
        }
        if (same) return info.format;
    }
    return std::nullopt;
}

// The mask format with the same component depth: 8-bit -> MaskA8, 16-bit -> MaskA16, float -> MaskAF.
constexpr PixelFormat GetCompatibleMaskFormat(PixelFormat format) noexcept {
    switch (GetBytesPerComponent(format)) {
    case 1:
        return PixelFormat::MaskA8;
    case 2:
        return PixelFormat::MaskA16;
    default:
        return PixelFormat::MaskAF;
    }
}

// Five-channel list of each format, and the format of a five-channel list. FormatOf<...> has no `value`
// for a list that is not a host format, so a wrong list fails to compile where it is used.
template <PixelFormat F>
struct FormatChannels;
template <class C1, class C2, class C3, class C4, class C5>
struct FormatOf {};

#define RASTER_DECLARE_FORMAT(F, A, B, C, D, E)                                                              \
    template <>                                                                                              \
    struct FormatChannels<PixelFormat::F> {                                                                  \
        using C1 = A;                                                                                        \
        using C2 = B;                                                                                        \
        using C3 = C;                                                                                        \
        using C4 = D;                                                                                        \
        using C5 = E;                                                                                        \
        using Component = typename A::Component;                                                             \
    };                                                                                                       \
    template <>                                                                                              \
    struct FormatOf<A, B, C, D, E> {                                                                         \
        static constexpr PixelFormat value = PixelFormat::F;                                                 \
    };

RASTER_DECLARE_FORMAT(RGBA8, Red8, Green8, Blue8, Alpha8, X5)
RASTER_DECLARE_FORMAT(RGBA16, Red16, Green16, Blue16, Alpha16, X5)
RASTER_DECLARE_FORMAT(RGBAUF, RedUF, GreenUF, BlueUF, AlphaF, X5)
RASTER_DECLARE_FORMAT(IA8, Intensity8, Alpha8, X3, X4, X5)
RASTER_DECLARE_FORMAT(IA16, Intensity16, Alpha16, X3, X4, X5)
RASTER_DECLARE_FORMAT(CMYKA8, Cyan8, Magenta8, Yellow8, Black8, Alpha8)
RASTER_DECLARE_FORMAT(LabA16, Lightness16, AOpponent16, BOpponent16, Alpha16, X5)
RASTER_DECLARE_FORMAT(MaskA8, Alpha8, X2, X3, X4, X5)
RASTER_DECLARE_FORMAT(MaskA16, Alpha16, X2, X3, X4, X5)
RASTER_DECLARE_FORMAT(MaskAF, AlphaF, X2, X3, X4, X5)
RASTER_DECLARE_FORMAT(IntensityUF, IntensityUF, X2, X3, X4, X5)
RASTER_DECLARE_FORMAT(RGBAF, RedF, GreenF, BlueF, AlphaF, X5)

#undef RASTER_DECLARE_FORMAT

template <class C1, class C2, class C3, class C4, class C5>
inline constexpr PixelFormat FormatOf_v = FormatOf<C1, C2, C3, C4, C5>::value;

template <PixelFormat F>
using FormatComponent = typename FormatChannels<F>::Component;

template <PixelFormat F>
using FormatTag = std::integral_constant<PixelFormat, F>;

// The one seam between a run-time format and compile-time code: calls f(FormatTag<F>{}) for the format's F.
// Every branch must return the same type.
template <class Function>
constexpr decltype(auto) DispatchPixelFormat(PixelFormat format, Function&& f) {
    switch (format) {
    case PixelFormat::RGBA8:
        return f(FormatTag<PixelFormat::RGBA8>{});
    case PixelFormat::RGBA16:
        return f(FormatTag<PixelFormat::RGBA16>{});
    case PixelFormat::RGBAUF:
        return f(FormatTag<PixelFormat::RGBAUF>{});
    case PixelFormat::IA8:
        return f(FormatTag<PixelFormat::IA8>{});
    case PixelFormat::IA16:
        return f(FormatTag<PixelFormat::IA16>{});
    case PixelFormat::CMYKA8:
        return f(FormatTag<PixelFormat::CMYKA8>{});
    case PixelFormat::LabA16:
        return f(FormatTag<PixelFormat::LabA16>{});
    case PixelFormat::MaskA8:
        return f(FormatTag<PixelFormat::MaskA8>{});
    case PixelFormat::MaskA16:
        return f(FormatTag<PixelFormat::MaskA16>{});
    case PixelFormat::MaskAF:
        return f(FormatTag<PixelFormat::MaskAF>{});
    case PixelFormat::IntensityUF:
        return f(FormatTag<PixelFormat::IntensityUF>{});
    case PixelFormat::RGBAF:
        break;
    }
    return f(FormatTag<PixelFormat::RGBAF>{});
}

// LabA16 storage. L: 0..65535 for L* 0..100. a, b: (value + 128) * 256, so 32768 is neutral and the stored
// range covers -128 .. +127.996 in steps of 1/256 (the 16-bit ICC-v2 and TIFF 16-bit CIELab scale, offset to
// unsigned).
namespace LabA16Encoding {
inline constexpr double LightnessScale = 65535.0 / 100.0;
inline constexpr double OpponentScale = 256.0;
inline constexpr std::uint16_t OpponentNeutral = 32768;
} // namespace LabA16Encoding

// Compile-time agreement between the table and the channel lists.
namespace Detail {
template <PixelFormat F>
constexpr bool ChannelsMatchTable() {
    using L = FormatChannels<F>;
    constexpr int stored = !L::C1::IsPlaceholder + !L::C2::IsPlaceholder + !L::C3::IsPlaceholder +
                           !L::C4::IsPlaceholder + !L::C5::IsPlaceholder;
    return stored == GetChannelCount(F) &&
           static_cast<int>(sizeof(typename L::Component)) == GetBytesPerComponent(F) &&
           std::is_floating_point_v<typename L::Component> == IsFloatFormat(F) &&
           FormatOf_v<typename L::C1, typename L::C2, typename L::C3, typename L::C4, typename L::C5> == F &&
           GetPixelFormatInfo(F).format == F && ParsePixelFormat(GetPixelFormatName(F)) == F &&
           GetChannelCount(F) * GetBytesPerComponent(F) == GetBytesPerPixel(F);
}
template <std::size_t... I>
constexpr bool AllChannelsMatchTable(std::index_sequence<I...>) {
    return (ChannelsMatchTable<static_cast<PixelFormat>(I)>() && ...);
}
static_assert(AllChannelsMatchTable(std::make_index_sequence<PixelFormatCount>{}));
} // namespace Detail

} // namespace Raster
