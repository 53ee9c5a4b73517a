#pragma once
// Encoded strings and localised user-visible text.

#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace Kernel {

struct TEncUtf8 {};

// A string in a fixed encoding; the host only uses UTF-8.
template <class Encoding>
class StringT {
public:
    StringT() = default;
    StringT(const char* text)
        : m_Text(text) {}
    StringT(std::string text)
        : m_Text(std::move(text)) {}
    StringT(std::string_view text)
        : m_Text(text) {}

    const std::string& str() const noexcept { return m_Text; }
    const char* c_str() const noexcept { return m_Text.c_str(); }
    bool empty() const noexcept { return m_Text.empty(); }
    std::size_t size() const noexcept { return m_Text.size(); }
    operator std::string_view() const noexcept { return m_Text; }

    friend bool operator==(const StringT&, const StringT&) = default;
    friend auto operator<=>(const StringT&, const StringT&) = default;

private:
    std::string m_Text;
};

using UTF8String = StringT<TEncUtf8>;

// English text plus the context that disambiguates it for translators.
class LocalisedString {
public:
    LocalisedString() = default;
    LocalisedString(std::string english, std::string context)
        : m_English(std::move(english))
        , m_Context(std::move(context)) {}

    const std::string& GetEnglish() const noexcept { return m_English; }
    const std::string& GetContext() const noexcept { return m_Context; }
    // The translation from the current catalogue, or the English text when there is none.
    std::string Localise() const;

    friend bool operator==(const LocalisedString&, const LocalisedString&) = default;

private:
    std::string m_English;
    std::string m_Context;
};

// The translations in use; empty means English throughout.
class LocaleCatalogue {
public:
    static LocaleCatalogue& GetInstance();
    void Add(const std::string& context, const std::string& english, std::string translation);
    void Clear();
    std::optional<std::string> Find(const std::string& context, const std::string& english) const;

private:
    mutable std::mutex m_Mutex;
    std::map<std::pair<std::string, std::string>, std::string> m_Entries;
};

} // namespace Kernel
