#include "host/document/VeyraController.h"

#include "host/kernel/AtomicFile.h"

#include <nlohmann/json.hpp>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <iostream>
#include <system_error>
#include <unistd.h>

struct VeyraController::State {
    mutable std::mutex mutex;
    std::filesystem::path file;
    bool loaded = false;
    nlohmann::json values = nlohmann::json::object();
    // Keys set here that have not reached the file yet; every write merges them into what the file holds.
    nlohmann::json pending = nlohmann::json::object();
    std::optional<std::string> lastError;
    std::atomic<unsigned long> accesses{0};
};

namespace {
// Settings files are small; anything larger is not ours.
constexpr std::size_t kMaxSettingsBytes = 4u << 20;
// The store holds flat keys; deeper nesting is not ours either, and refusing it early keeps a hostile file
// from costing unbounded work.
constexpr int kMaxSettingsDepth = 8;
// How long a commit waits for another process's commit to the same file.
constexpr std::chrono::milliseconds kLockWait{5000};
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
    m_State->pending = nlohmann::json::object();
    m_State->lastError.reset();
}

std::filesystem::path VeyraController::GetFile() const {
    std::lock_guard lock(m_State->mutex);
    return m_State->file.empty() ? DefaultFile() : m_State->file;
}

namespace {

bool NestsDeeperThan(std::string_view text, int limit) {
    int depth = 0;
    bool inString = false, escaped = false;
    for (const char c : text) {
        if (inString) {
            if (escaped)
                escaped = false;
            else if (c == '\\')
                escaped = true;
            else if (c == '"')
                inString = false;
        } else if (c == '"') {
            inString = true;
        } else if (c == '[' || c == '{') {
            if (++depth > limit) return true;
        } else if (c == ']' || c == '}') {
            --depth;
        }
    }
    return false;
}

struct StoreRead {
    std::optional<nlohmann::json> values; // empty when the file is missing
    std::string error;
    bool damaged = false; // a regular file that is not a settings file: to be kept aside
};

StoreRead ReadStore(const std::filesystem::path& file) {
    StoreRead read;
    std::error_code error;
    const auto status = std::filesystem::status(file, error);
    if (status.type() == std::filesystem::file_type::not_found) {
        read.values = nlohmann::json::object();
        return read;
    }
    std::string text;
    if (auto failure = Kernel::ReadWholeFile(file, text, kMaxSettingsBytes)) {
        read.error = *failure;
        // Only a file too large to be ours is set aside; a folder, a device or one we may not read is left.
        read.damaged = status.type() == std::filesystem::file_type::regular &&
                       std::filesystem::file_size(file, error) > kMaxSettingsBytes;
        return read;
    }
    read.damaged = true;
    if (NestsDeeperThan(text, kMaxSettingsDepth)) {
        read.error = file.string() + ": not a settings file (nested deeper than " +
                     std::to_string(kMaxSettingsDepth) + " levels)";
        return read;
    }
    auto parsed = nlohmann::json::parse(text, nullptr, false);
    if (!parsed.is_object()) {
        read.error = file.string() + ": not a settings file (expected a JSON object)";
        return read;
    }
    read.values = std::move(parsed);
    read.damaged = false;
    return read;
}

// Moves file to the first free name of FILE.bad, FILE.bad.1, ..., never replacing an earlier copy.
std::optional<std::filesystem::path> KeepAside(const std::filesystem::path& file) {
    for (int n = 0; n < 10000; ++n) {
        const std::filesystem::path aside = file.string() + ".bad" + (n ? "." + std::to_string(n) : "");
        // link() refuses an existing name, so two processes cannot pick the same one.
        if (::link(file.c_str(), aside.c_str()) == 0) {
            ::unlink(file.c_str());
            return aside;
        }
        if (errno == EEXIST) continue;
        // A file system without hard links: check, then rename.
        std::error_code error;
        if (std::filesystem::exists(aside, error)) continue;
        std::filesystem::rename(file, aside, error);
        if (error) return std::nullopt;
        return aside;
    }
    return std::nullopt;
}

std::filesystem::path LockFileFor(const std::filesystem::path& file) {
    return file.string() + ".lock";
}

void Report(VeyraController::State& state, std::string message) {
    state.lastError = std::move(message);
    std::cerr << "settings: " << *state.lastError << '\n';
}

// Takes an unreadable file out of the way, reporting what was wrong and where it went.
void SetAside(VeyraController::State& state, const std::string& why) {
    const auto aside = KeepAside(state.file);
    Report(state, why + (aside ? "; kept as " + aside->string() : ""));
}

void EnsureLoaded(VeyraController::State& state) {
    if (state.loaded) return;
    state.loaded = true;
    if (state.file.empty()) state.file = VeyraController::DefaultFile();
    StoreRead read = ReadStore(state.file);
    if (read.values) {
        state.values = std::move(*read.values);
        return;
    }
    if (!read.damaged) return Report(state, read.error);
    // Look again under the lock: another process may have replaced the file meanwhile.
    Kernel::FileLock lock;
    (void)lock.Acquire(LockFileFor(state.file), kLockWait, true);
    read = ReadStore(state.file);
    if (read.values) {
        state.values = std::move(*read.values);
        return;
    }
    if (read.damaged) return SetAside(state, read.error);
    Report(state, read.error);
}

// Writes the pending keys: under the lock, into what the file holds now, so that commits from other
// processes since this one read the file are kept.
void Store(VeyraController::State& state) {
    state.lastError.reset();
    std::error_code error;
    const auto type = std::filesystem::status(state.file, error).type();
    if (type == std::filesystem::file_type::directory)
        return Report(state, state.file.string() + ": is a folder, not a file");
    if (type != std::filesystem::file_type::not_found && type != std::filesystem::file_type::regular &&
        type != std::filesystem::file_type::none)
        return Report(state, state.file.string() + ": is not a regular file");
    if (state.file.has_parent_path()) std::filesystem::create_directories(state.file.parent_path(), error);
    Kernel::FileLock lock;
    if (auto busy = lock.Acquire(LockFileFor(state.file), kLockWait, true)) return Report(state, *busy);
    StoreRead read = ReadStore(state.file);
    if (!read.values) {
        // What cannot be read is not replaced unless it is damaged, and then it is kept aside first.
        if (!read.damaged) return Report(state, read.error);
        SetAside(state, read.error);
        read.values = nlohmann::json::object();
    }
    nlohmann::json merged = std::move(*read.values);
    for (const auto& [key, value] : state.pending.items())
        merged[key] = value;
    state.values = merged;
    if (auto failure = Kernel::WriteFileAtomically(state.file, merged.dump(2) + "\n"))
        return Report(state, *failure);
    state.pending = nlohmann::json::object();
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
    state.pending[key] = value;
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
