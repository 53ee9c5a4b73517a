#pragma once
// Four-character codes: four ASCII characters in one 32-bit integer, the first in the top byte.

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace Kernel {

using FourCC = std::uint32_t;

consteval FourCC MakeFourCC(const char (&text)[5]) {
    return (FourCC(std::uint8_t(text[0])) << 24) | (FourCC(std::uint8_t(text[1])) << 16) |
           (FourCC(std::uint8_t(text[2])) << 8) | FourCC(std::uint8_t(text[3]));
}

namespace Literals {
consteval FourCC operator""_4cc(const char* text, std::size_t length) {
    if (length != 4) throw "a four-character code has exactly four characters";
    return (FourCC(std::uint8_t(text[0])) << 24) | (FourCC(std::uint8_t(text[1])) << 16) |
           (FourCC(std::uint8_t(text[2])) << 8) | FourCC(std::uint8_t(text[3]));
}
} // namespace Literals

// "Inte" for 0x496E7465; unprintable bytes are written as '?'.
std::string FourCCToString(FourCC code);
// The code of exactly four printable ASCII characters, or nothing.
std::optional<FourCC> ParseFourCC(std::string_view text);

} // namespace Kernel
