#include "host/kernel/FourCC.h"
#include "host/kernel/String.h"

namespace Kernel {

std::string FourCCToString(FourCC code) {
    std::string text(4, '?');
    for (int i = 0; i < 4; ++i) {
        const auto c = char((code >> (24 - 8 * i)) & 0xFF);
        if (c >= 0x20 && c < 0x7F) text[std::size_t(i)] = c;
    }
    return text;
}

std::optional<FourCC> ParseFourCC(std::string_view text) {
    if (text.size() != 4) return std::nullopt;
    FourCC code = 0;
    for (char c : text) {
        if (c < 0x20 || c >= 0x7F) return std::nullopt;
        code = (code << 8) | FourCC(std::uint8_t(c));
    }
    return code;
}

std::string LocalisedString::Localise() const {
    return LocaleCatalogue::GetInstance().Find(m_Context, m_English).value_or(m_English);
}

LocaleCatalogue& LocaleCatalogue::GetInstance() {
    static LocaleCatalogue instance;
    return instance;
}

void LocaleCatalogue::Add(const std::string& context, const std::string& english, std::string translation) {
    std::lock_guard lock(m_Mutex);
    m_Entries[{context, english}] = std::move(translation);
}

void LocaleCatalogue::Clear() {
    std::lock_guard lock(m_Mutex);
    m_Entries.clear();
}

std::optional<std::string> LocaleCatalogue::Find(const std::string& context,
                                                 const std::string& english) const {
    std::lock_guard lock(m_Mutex);
    auto it = m_Entries.find({context, english});
    if (it == m_Entries.end()) return std::nullopt;
    return it->second;
}

} // namespace Kernel
