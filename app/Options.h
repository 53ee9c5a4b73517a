#pragma once
// Small helpers shared by the rastertools subcommands: errors with exit codes, argument parsing.

#include "host/kernel/AtomicFile.h"

#include <filesystem>
#include <iosfwd>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

namespace App {

// Exit codes: 0 success, 1 failure while working, 2 bad command line.
constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;

// A problem to report to the user; the message is complete and names what is wrong.
class Error : public std::runtime_error {
public:
    Error(std::string message, int exitCode = kExitFailure)
        : std::runtime_error(std::move(message))
        , m_ExitCode(exitCode) {}
    int GetExitCode() const noexcept { return m_ExitCode; }

private:
    int m_ExitCode;
};

class UsageError : public Error {
public:
    explicit UsageError(std::string message)
        : Error(std::move(message), kExitUsage) {}
};

// Holds the document at path against other commands that change it, from before it is read until it has
// been written back; waits RASTERTOOLS_LOCK_TIMEOUT seconds (default 10), then fails saying it is in use.
Kernel::FileLock LockDocument(const std::string& path);

// How a play script runs: whether the verbs that read or write files (save, load, render) are allowed, and
// the size of the document's background layer.
struct PlayOptions {
    bool filesAllowed = true;
    int width = 1024;
    int height = 768;
    std::filesystem::path folder; // where the script's file names are taken from; empty: the working folder
};
// Runs a play script read from in, writing what the host sees to out; name labels the errors.
void PlayScript(std::istream& in, std::ostream& out, const std::string& name,
                const PlayOptions& options = {});

int RunList(const std::vector<std::string>& args);
int RunPlay(const std::vector<std::string>& args);
int RunApply(const std::vector<std::string>& args);
int RunDoc(const std::vector<std::string>& args);

} // namespace App
