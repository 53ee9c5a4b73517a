#pragma once
// Colours as the renderer consumes them, and their text form for reflected properties.

#include "host/kernel/Reflection.h"

#include <charconv>
#include <cmath>
#include <string>
#include <string_view>
#include <system_error>

namespace Renderer {

// A colour in the renderer's working space: straight (not premultiplied) r, g, b and alpha, nominally 0..1
// but not clamped, so that values beyond the range survive.
struct ConsolidatedColour {
    float r = 0.0f;
    float g = 0.0f;
    float b = 0.0f;
    float a = 0.0f;
    friend bool operator==(const ConsolidatedColour&, const ConsolidatedColour&) = default;
};

} // namespace Renderer

namespace Kernel {

// "r,g,b,a": shortest text that reads back as the same floats; parsing takes exactly four finite floats.
template <>
struct ReflectedValueTraits<Renderer::ConsolidatedColour> {
    static constexpr std::string_view kName = "colour";

    static std::string Format(const Renderer::ConsolidatedColour& value) {
        std::string text;
        const float channels[4] = {value.r, value.g, value.b, value.a};
        for (int i = 0; i < 4; ++i) {
            if (i != 0) text += ',';
            char buffer[32];
            const auto result = std::to_chars(buffer, buffer + sizeof buffer, channels[i]);
            text.append(buffer, result.ptr);
        }
        return text;
    }

    static bool Parse(std::string_view text, Renderer::ConsolidatedColour& value) {
        float channels[4] = {};
        for (int i = 0; i < 4; ++i) {
            const std::size_t comma = i < 3 ? text.find(',') : text.size();
            if (comma == std::string_view::npos) return false;
            const std::string_view part = text.substr(0, comma);
            if (part.empty()) return false;
            const auto result = std::from_chars(part.data(), part.data() + part.size(), channels[i]);
            if (result.ec != std::errc() || result.ptr != part.data() + part.size() ||
                !std::isfinite(channels[i]))
                return false;
            text.remove_prefix(i < 3 ? comma + 1 : comma);
        }
        value = {channels[0], channels[1], channels[2], channels[3]};
        return true;
    }
};

} // namespace Kernel
