#pragma once
// Building kernel text: numbered placeholders, stringified shared source, and the per-language text cache.

#include "host/raster/device/Hardware.h"

#include <array>
#include <initializer_list>
#include <string>
#include <string_view>

// The tokens of a macro body as one line of text (the body is expanded first, so a body macro may be passed).
#define RASTER_KERNEL_STRINGIFY_TOKENS(...) #__VA_ARGS__
#define RASTER_KERNEL_STRINGIFY(...) RASTER_KERNEL_STRINGIFY_TOKENS(__VA_ARGS__)

namespace Raster {

// Replaces %1 .. %9 by the numbered arguments in one pass (an argument's own '%' signs stay as they are);
// "%%" is a literal '%'. A placeholder without an argument is left as it stands.
std::string FormatKernelText(std::string_view pattern, std::initializer_list<std::string_view> arguments);

// Languages the host composes text for. Index 0 and 1 are the values of HardwareKernelLanguage.
inline constexpr std::array<HardwareKernelLanguage, 2> KernelTextLanguages{HardwareKernelLanguage::CudaCpp,
                                                                           HardwareKernelLanguage::OpenCLC};

constexpr bool IsKernelTextLanguage(HardwareKernelLanguage language) noexcept {
    return language == HardwareKernelLanguage::CudaCpp || language == HardwareKernelLanguage::OpenCLC;
}

// One text per kernel language, built once by a function of the language (empty text means "none") and
// kept for the life of the process. Get returns null for a language without text.
class KernelTextPair {
public:
    template <class Build>
    explicit KernelTextPair(Build&& build)
        : m_Texts{build(HardwareKernelLanguage::CudaCpp), build(HardwareKernelLanguage::OpenCLC)} {}

    const char* Get(HardwareKernelLanguage language) const noexcept {
        if (!IsKernelTextLanguage(language)) return nullptr;
        const std::string& text = m_Texts[static_cast<std::size_t>(language)];
        return text.empty() ? nullptr : text.c_str();
    }

private:
    std::array<std::string, 2> m_Texts;
};

} // namespace Raster
