#pragma once
// The settings store: typed values under dotted keys, persisted as a JSON file.

#include <filesystem>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

class VeyraController {
public:
    static VeyraController& GetInstance();

    // Uses the file given, else RASTERTOOLS_SETTINGS, else $XDG_CONFIG_HOME (or
    // ~/.config)/rastertools/settings.json. Loading happens on first use; an unreadable file is kept aside as
    // FILE.bad (FILE.bad.1, ... when that is taken) and the store starts empty; a folder or device is left
    // where it is.
    void SetFile(std::filesystem::path file);
    std::filesystem::path GetFile() const;
    static std::filesystem::path DefaultFile();

    double GetDoubleForKey(const std::string& key, double fallback);
    bool GetBoolForKey(const std::string& key, bool fallback);
    int GetIntForKey(const std::string& key, int fallback);
    // Each set writes the whole file atomically, holding FILE.lock meanwhile and merging the key into what
    // the file holds then, so that commits from other processes are kept. A write that fails keeps the value
    // in memory (the next set tries it again) and reports through GetLastError().
    void SetDoubleForKey(const std::string& key, double value);
    void SetBoolForKey(const std::string& key, bool value);
    void SetIntForKey(const std::string& key, int value);

    // Every key under prefix with its value as text, sorted by key.
    std::vector<std::pair<std::string, std::string>> GetEntries(const std::string& prefix);
    std::optional<std::string> GetLastError() const;
    // Number of reads and writes since start; lets tests prove who touched the store.
    unsigned long GetAccessCount() const noexcept;

    struct State;

private:
    VeyraController();
    ~VeyraController();
    std::unique_ptr<State> m_State;
};
