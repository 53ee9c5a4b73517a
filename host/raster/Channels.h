#pragma once
// The host's channel types: empty tags naming one stored channel, its component type and its range.

#include <cstdint>
#include <limits>
#include <type_traits>

namespace Raster {

// What a channel means, so that generic code can find alpha or the colour channels of a format.
enum class ChannelRole : std::uint8_t {
    None, // a placeholder slot without storage
    Red,
    Green,
    Blue,
    Alpha,
    Intensity,
    Cyan,
    Magenta,
    Yellow,
    Black,
    Lightness,
    AOpponent,
    BOpponent,
};

// Largest nominal value of a component: the integer maximum, or 1 for float channels (for the unbounded
// float channels this is the nominal white, not a limit).
template <class T>
inline constexpr T ComponentMax = std::is_floating_point_v<T> ? T(1) : std::numeric_limits<T>::max();

template <class T, ChannelRole R, bool Unbounded = false>
struct ChannelBase {
    using Component = T;
    static constexpr ChannelRole Role = R;
    static constexpr bool IsPlaceholder = false;
    static constexpr bool IsFloat = std::is_floating_point_v<T>;
    // True when stored values may leave 0..Max (RedUF and friends).
    static constexpr bool IsUnbounded = Unbounded;
    static constexpr T Max = ComponentMax<T>;
    // Neutral value of a signed quantity stored unsigned (the a and b opponents): 128, 32768, or 0.5.
    static constexpr T Middle = std::is_floating_point_v<T> ? T(0.5) : T(Max / 2 + 1);
};

// A slot of a five-channel list that holds no channel; N is the slot it fills (1..5).
template <int N>
struct Placeholder {
    static_assert(N >= 1 && N <= 5);
    using Component = void;
    static constexpr ChannelRole Role = ChannelRole::None;
    static constexpr bool IsPlaceholder = true;
    static constexpr int Slot = N;
};

// 8-bit channels, 0..255.
struct Red8 : ChannelBase<std::uint8_t, ChannelRole::Red> {};
struct Green8 : ChannelBase<std::uint8_t, ChannelRole::Green> {};
struct Blue8 : ChannelBase<std::uint8_t, ChannelRole::Blue> {};
struct Alpha8 : ChannelBase<std::uint8_t, ChannelRole::Alpha> {};
struct Intensity8 : ChannelBase<std::uint8_t, ChannelRole::Intensity> {};
struct Cyan8 : ChannelBase<std::uint8_t, ChannelRole::Cyan> {};
struct Magenta8 : ChannelBase<std::uint8_t, ChannelRole::Magenta> {};
struct Yellow8 : ChannelBase<std::uint8_t, ChannelRole::Yellow> {};
struct Black8 : ChannelBase<std::uint8_t, ChannelRole::Black> {};

// 16-bit channels, 0..65535.
struct Red16 : ChannelBase<std::uint16_t, ChannelRole::Red> {};
struct Green16 : ChannelBase<std::uint16_t, ChannelRole::Green> {};
struct Blue16 : ChannelBase<std::uint16_t, ChannelRole::Blue> {};
struct Alpha16 : ChannelBase<std::uint16_t, ChannelRole::Alpha> {};
struct Intensity16 : ChannelBase<std::uint16_t, ChannelRole::Intensity> {};
struct Lightness16 : ChannelBase<std::uint16_t, ChannelRole::Lightness> {};
struct AOpponent16 : ChannelBase<std::uint16_t, ChannelRole::AOpponent> {};
struct BOpponent16 : ChannelBase<std::uint16_t, ChannelRole::BOpponent> {};

// 32-bit float channels: unbounded colour (UF), alpha nominally 0..1.
struct RedUF : ChannelBase<float, ChannelRole::Red, true> {};
struct GreenUF : ChannelBase<float, ChannelRole::Green, true> {};
struct BlueUF : ChannelBase<float, ChannelRole::Blue, true> {};
struct IntensityUF : ChannelBase<float, ChannelRole::Intensity, true> {};
struct AlphaF : ChannelBase<float, ChannelRole::Alpha> {};

// Bounded float colour, only for scratch buffers.
struct RedF : ChannelBase<float, ChannelRole::Red> {};
struct GreenF : ChannelBase<float, ChannelRole::Green> {};
struct BlueF : ChannelBase<float, ChannelRole::Blue> {};

struct X1 : Placeholder<1> {};
struct X2 : Placeholder<2> {};
struct X3 : Placeholder<3> {};
struct X4 : Placeholder<4> {};
struct X5 : Placeholder<5> {};

template <class C>
inline constexpr bool IsPlaceholderChannel = C::IsPlaceholder;

} // namespace Raster
