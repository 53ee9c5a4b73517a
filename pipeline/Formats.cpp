// The format table: Convert bodies as text, conversion fragments per pair, channel names.
#include "pipeline/Formats.h"

#include "host/raster/KernelFragments.h"
#include "host/raster/KernelText.h"
#include "host/raster/PixelTraits.h"
#include "pipeline/ConvertBodies.h"

#include <charconv>
#include <mutex>
#include <vector>

namespace RasterTools {

namespace {

using Raster::PixelFormat;
#define RT_TEXT(...) RASTER_KERNEL_STRINGIFY(__VA_ARGS__)

struct FormatEntry {
    PixelFormat format;
    ConvertPair convert;
    std::array<std::string_view, 5> channels; // names in channel order; alpha last where there is one
    std::array<int, 5> bits;                  // the write-mask bits of each name
};

const std::array<FormatEntry, Raster::PixelFormatCount>& Entries() {
    static const std::array<FormatEntry, Raster::PixelFormatCount> entries{{
        {PixelFormat::RGBA8,
         {RT_TEXT(RT_RGBA8_TO_WORKING), RT_TEXT(RT_RGBA8_FROM_WORKING)},
         {"r", "g", "b", "a"},
         {1, 2, 4, 8}},
        {PixelFormat::RGBA16,
         {RT_TEXT(RT_RGBA16_TO_WORKING), RT_TEXT(RT_RGBA16_FROM_WORKING)},
         {"r", "g", "b", "a"},
         {1, 2, 4, 8}},
        {PixelFormat::RGBAUF,
         {RT_TEXT(RT_RGBAUF_TO_WORKING), RT_TEXT(RT_RGBAUF_FROM_WORKING)},
         {"r", "g", "b", "a"},
         {1, 2, 4, 8}},
        {PixelFormat::IA8,
         {RT_TEXT(RT_IA8_TO_WORKING), RT_TEXT(RT_IA8_FROM_WORKING_1) "\n" RT_TEXT(RT_IA8_FROM_WORKING_2)},
         {"i", "a"},
         {7, 8}},
        {PixelFormat::IA16,
         {RT_TEXT(RT_IA16_TO_WORKING), RT_TEXT(RT_IA16_FROM_WORKING_1) "\n" RT_TEXT(RT_IA16_FROM_WORKING_2)},
         {"i", "a"},
         {7, 8}},
        {PixelFormat::CMYKA8,
         {RT_TEXT(RT_CMYKA8_TO_WORKING), RT_TEXT(RT_CMYKA8_FROM_WORKING)},
         {"c", "m", "y", "k", "a"},
         {1, 2, 4, 8, 16}},
        {PixelFormat::LabA16,
         {RT_TEXT(RT_LABA16_TO_WORKING), RT_TEXT(RT_LABA16_FROM_WORKING)},
         {"L", "a", "b", "alpha"},
         {1, 2, 4, 8}},
        {PixelFormat::MaskA8,
         {RT_TEXT(RT_MASKA8_TO_WORKING), RT_TEXT(RT_MASKA8_FROM_WORKING)},
         {"alpha"},
         {1}},
        {PixelFormat::MaskA16,
         {RT_TEXT(RT_MASKA16_TO_WORKING), RT_TEXT(RT_MASKA16_FROM_WORKING)},
         {"alpha"},
         {1}},
        {PixelFormat::MaskAF,
         {RT_TEXT(RT_MASKAF_TO_WORKING), RT_TEXT(RT_MASKAF_FROM_WORKING)},
         {"alpha"},
         {1}},
        {PixelFormat::IntensityUF, {}, {"i"}, {1}},
        {PixelFormat::RGBAF, {}, {"r", "g", "b", "a"}, {1, 2, 4, 8}},
    }};
    return entries;
}

const FormatEntry* Find(PixelFormat format) {
    if (!Raster::IsValidPixelFormat(format)) return nullptr;
    return &Entries()[static_cast<std::size_t>(format)];
}

std::string BuildConversion(PixelFormat source, PixelFormat dest, Raster::HardwareKernelLanguage language) {
    if (source == dest) {
        const char* identity = Raster::GetIdentityConversionFragment(language);
        return identity ? identity : std::string();
    }
    const ConvertPair from = GetConvertPair(source), to = GetConvertPair(dest);
    if (from.toWorking.empty() || to.fromWorking.empty()) return {};
    return Raster::GetJointConversionFragment(language, from.toWorking, to.fromWorking);
}

} // namespace

ConvertPair GetConvertPair(PixelFormat format) {
    const FormatEntry* entry = Find(format);
    return entry ? entry->convert : ConvertPair{};
}

ConvertPair GetColourOnlyConvertPair() {
    return {RT_TEXT(RT_COLOUR_ONLY_TO_WORKING), RT_TEXT(RT_COLOUR_ONLY_FROM_WORKING)};
}

const char* GetConversionFragment(PixelFormat source, PixelFormat dest,
                                  Raster::HardwareKernelLanguage language) {
    constexpr std::size_t N = Raster::PixelFormatCount;
    using Table = std::array<Raster::KernelTextPair, N * N>;
    static const Table table = [] {
        return [&]<std::size_t... I>(std::index_sequence<I...>) {
            return Table{Raster::KernelTextPair([](Raster::HardwareKernelLanguage l) {
                return BuildConversion(static_cast<PixelFormat>(I / N), static_cast<PixelFormat>(I % N), l);
            })...};
        }
        (std::make_index_sequence<N * N>{});
    }();
    if (!Raster::IsValidPixelFormat(source) || !Raster::IsValidPixelFormat(dest)) return nullptr;
    return table[static_cast<std::size_t>(source) * N + static_cast<std::size_t>(dest)].Get(language);
}

namespace {

// Texts built on first use and kept for the process: one slot per key and language.
template <std::size_t Keys>
class LazyTexts {
public:
    template <class Build>
    const char* Get(std::size_t key, Raster::HardwareKernelLanguage language, Build&& build) {
        if (!Raster::IsKernelTextLanguage(language) || key >= Keys) return nullptr;
        Slot& slot = m_Slots[key * 2 + static_cast<std::size_t>(language)];
        std::call_once(slot.once, [&] { slot.text = build(); });
        return slot.text.empty() ? nullptr : slot.text.c_str();
    }

private:
    struct Slot {
        std::once_flag once;
        std::string text;
    };
    std::array<Slot, Keys * 2> m_Slots;
};

constexpr std::size_t N = Raster::PixelFormatCount;

std::size_t Index(PixelFormat format) {
    return static_cast<std::size_t>(format);
}

} // namespace

const char* GetSamplerConversionFragment(PixelFormat source, PixelFormat dest, PixelFormat sampler,
                                         Raster::HardwareKernelLanguage language) {
    static LazyTexts<N * N * N> texts;
    if (!Raster::IsValidPixelFormat(sampler)) return nullptr;
    return texts.Get((Index(source) * N + Index(dest)) * N + Index(sampler), language, [&]() -> std::string {
        const char* conversion = GetConversionFragment(source, dest, language);
        const char* traits = Raster::GetTraitsFragment(sampler, Raster::KernelTraitsRole::Sampler, language);
        const std::string_view toWorking = GetConvertPair(sampler).toWorking;
        if (!conversion || !traits || toWorking.empty()) return {};
        return Raster::GetSamplerConversionFragment(language, conversion, traits, toWorking);
    });
}

const char* GetSamplerReferenceConversionFragment(PixelFormat dest, PixelFormat sampler,
                                                  Raster::HardwareKernelLanguage language) {
    static LazyTexts<N * N> texts;
    if (!Raster::IsValidPixelFormat(dest) || !Raster::IsValidPixelFormat(sampler)) return nullptr;
    return texts.Get(Index(dest) * N + Index(sampler), language, [&]() -> std::string {
        const char* traits = Raster::GetTraitsFragment(sampler, Raster::KernelTraitsRole::Sampler, language);
        const std::string_view toWorking = GetConvertPair(sampler).toWorking;
        const std::string_view fromWorking = GetConvertPair(dest).fromWorking;
        if (!traits || toWorking.empty() || fromWorking.empty()) return {};
        return Raster::GetSamplerReferenceConversionFragment(language, fromWorking, traits, toWorking);
    });
}

std::optional<int> ParseChannelMask(PixelFormat format, std::string_view text) {
    const FormatEntry* entry = Find(format);
    if (!entry || text.empty()) return std::nullopt;
    const int all = Raster::AllChannelsMask(format);
    int value = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error == std::errc() && end == text.data() + text.size()) {
        if (value < 0 || (value & ~all) != 0) return std::nullopt;
        return value;
    }
    std::vector<std::string_view> names;
    if (text.find(',') != std::string_view::npos) {
        for (std::size_t start = 0; start <= text.size();) {
            const std::size_t comma = std::min(text.find(',', start), text.size());
            names.push_back(text.substr(start, comma - start));
            start = comma + 1;
        }
    } else if (text == "alpha") {
        names.push_back(text);
    } else {
        for (std::size_t i = 0; i < text.size(); ++i)
            names.push_back(text.substr(i, 1));
    }
    int mask = 0;
    for (std::string_view name : names) {
        int bits = 0;
        for (std::size_t c = 0; c < entry->channels.size(); ++c)
            if (!entry->channels[c].empty() && entry->channels[c] == name) bits = entry->bits[c];
        if (bits == 0 && name == "alpha")
            bits = Raster::GetPixelFormatInfo(format).alphaIndex >= 0 ? (all + 1) / 2 : 0;
        if (bits == 0) return std::nullopt;
        mask |= bits;
    }
    return mask;
}

std::string DescribeChannelNames(PixelFormat format) {
    const FormatEntry* entry = Find(format);
    if (!entry) return {};
    std::string text;
    for (std::string_view name : entry->channels)
        if (!name.empty()) text += (text.empty() ? "" : ", ") + std::string(name);
    return text;
}

} // namespace RasterTools
