#include "host/document/VeyraController.h"

#include "host/kernel/AtomicFile.h"

#include <nlohmann/json.hpp>

#include <atomic>
#include <cstdlib>
#include <iostream>
#include <system_error>

struct VeyraController::State {
    mutable std::mutex mutex;
    std::filesystem::path file;
    bool loaded = false;
    nlohmann::json values = nlohmann::json::object();
    std::optional<std::string> lastError;
    std::atomic<unsigned long> accesses{0};
};

namespace {
// Settings files are small; anything larger is not ours.
constexpr std::size_t kMaxSettingsBytes = 4u << 20;
} // namespace

VeyraController& VeyraController::GetInstance() {
    static VeyraController instance;
    return instance;
}

VeyraController::VeyraController()
    : m_State(std::make_unique<State>()) {}
VeyraController::~VeyraController() = default;

std::filesystem::path VeyraController::DefaultFile() {
    if (const char* explicitFile = std::getenv("RASTERTOOLS_SETTINGS"); explicitFile && *explicitFile)
        return explicitFile;
    std::filesystem::path folder;
    if (const char* xdg = std::getenv("XDG_CONFIG_HOME"); xdg && *xdg)
        folder = xdg;
    else if (const char* home = std::getenv("HOME"); home && *home)
        folder = std::filesystem::path(home) / ".config";
    else
        folder = ".";
    return folder / "rastertools" / "settings.json";
}

void VeyraController::SetFile(std::filesystem::path file) {
    std::lock_guard lock(m_State->mutex);
    m_State->file = std::move(file);
    m_State->loaded = false;
    m_State->values = nlohmann::json::object();
    m_State->lastError.reset();
}

std::filesystem::path VeyraController::GetFile() const {
    std::lock_guard lock(m_State->mutex);
    return m_State->file.empty() ? DefaultFile() : m_State->file;
}

namespace {

void EnsureLoaded(VeyraController::State& state) {
    if (state.loaded) return;
    state.loaded = true;
    if (state.file.empty()) state.file = VeyraController::DefaultFile();
    std::error_code error;
    if (!std::filesystem::exists(state.file, error)) return;
    std::string text;
    std::optional<std::string> failure = Kernel::ReadWholeFile(state.file, text, kMaxSettingsBytes);
    if (!failure) {
        auto parsed = nlohmann::json::parse(text, nullptr, false);
        if (parsed.is_object()) {
            state.values = std::move(parsed);
            return;
        }
        failure = state.file.string() + ": not a settings file (expected a JSON object)";
    }
    // Keep the unreadable file for the user instead of overwriting it with the next change.
    const std::filesystem::path aside = state.file.string() + ".bad";
    std::filesystem::rename(state.file, aside, error);
    state.lastError = *failure + (error ? "" : "; kept as " + aside.string());
    std::cerr << "settings: " << *state.lastError << '\n';
}

void Store(VeyraController::State& state) {
    std::error_code error;
    if (state.file.has_parent_path()) std::filesystem::create_directories(state.file.parent_path(), error);
    state.lastError = Kernel::WriteFileAtomically(state.file, state.values.dump(2) + "\n");
    if (state.lastError) std::cerr << "settings: " << *state.lastError << '\n';
}

template <class T>
T Get(VeyraController::State& state, const std::string& key, T fallback) {
    std::lock_guard lock(state.mutex);
    ++state.accesses;
    EnsureLoaded(state);
    const auto it = state.values.find(key);
    if (it == state.values.end()) return fallback;
    if constexpr (std::is_same_v<T, bool>) {
        return it->is_boolean() ? it->template get<bool>() : fallback;
    } else if constexpr (std::is_same_v<T, int>) {
        return it->is_number_integer() ? it->template get<int>() : fallback;
    } else {
        return it->is_number() ? it->template get<double>() : fallback;
    }
}

template <class T>
void Set(VeyraController::State& state, const std::string& key, T value) {
    std::lock_guard lock(state.mutex);
    ++state.accesses;
    EnsureLoaded(state);
    state.values[key] = value;
    Store(state);
}

} // namespace

double VeyraController::GetDoubleForKey(const std::string& key, double fallback) {
    return Get(*m_State, key, fallback);
}
bool VeyraController::GetBoolForKey(const std::string& key, bool fallback) {
    return Get(*m_State, key, fallback);
}
int VeyraController::GetIntForKey(const std::string& key, int fallback) {
    return Get(*m_State, key, fallback);
}
void VeyraController::SetDoubleForKey(const std::string& key, double value) {
    Set(*m_State, key, value);
}
void VeyraController::SetBoolForKey(const std::string& key, bool value) {
    Set(*m_State, key, value);
}
void VeyraController::SetIntForKey(const std::string& key, int value) {
    Set(*m_State, key, value);
}

std::vector<std::pair<std::string, std::string>> VeyraController::GetEntries(const std::string& prefix) {
    std::lock_guard lock(m_State->mutex);
    EnsureLoaded(*m_State);
    std::vector<std::pair<std::string, std::string>> entries;
    for (const auto& [key, value] : m_State->values.items())
        if (key.starts_with(prefix)) entries.emplace_back(key, value.dump());
    return entries; // nlohmann's objects iterate in key order
}

std::optional<std::string> VeyraController::GetLastError() const {
    std::lock_guard lock(m_State->mutex);
    return m_State->lastError;
}

unsigned long VeyraController::GetAccessCount() const noexcept {
    return m_State->accesses.load();
}
