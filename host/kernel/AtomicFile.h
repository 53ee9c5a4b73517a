#pragma once
// Writes a whole file so that readers see either the old content or the new, never a part; reads whole files
// with clear refusals; locks files across processes for read-change-write sequences.

#include <chrono>
#include <cstddef>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace Kernel {

// Writes to a temporary file beside the target, flushes it and renames it into place. An existing target's
// permissions are kept; a new file gets the usual ones (0666 less the umask). Temporary files that an
// earlier, killed writer of the same target left behind are removed after a successful write. Returns an
// error message naming the file and the reason, or nothing on success.
std::optional<std::string> WriteFileAtomically(const std::filesystem::path& path,
                                               std::span<const std::byte> bytes);
std::optional<std::string> WriteFileAtomically(const std::filesystem::path& path, std::string_view text);

// Reads a whole regular file, refusing folders, devices and other special files and files above maxBytes.
// Returns an error message or nothing.
std::optional<std::string> ReadWholeFile(const std::filesystem::path& path, std::string& contents,
                                         std::size_t maxBytes);

// Makes SIGINT, SIGTERM and SIGHUP remove the temporary files of writes in progress before the process ends
// as the signal would have ended it. Programs call it once at start.
void InstallTemporaryFileCleanup();
// Removes the temporary files of every write in progress; async-signal-safe (what the handlers call).
void RemoveLiveTemporaryFiles() noexcept;

// An exclusive advisory lock on a file, held for as long as the object lives, so that the read-change-write
// sequences of several processes (or threads) do not interleave.
class FileLock {
public:
    FileLock() = default;
    FileLock(FileLock&& other) noexcept;
    FileLock& operator=(FileLock&& other) noexcept;
    FileLock(const FileLock&) = delete;
    FileLock& operator=(const FileLock&) = delete;
    ~FileLock();

    // Locks the file now at path, waiting up to timeout for whoever holds it. A file that is replaced by an
    // atomic write while waiting is locked in its new form. With create, a missing file is made (lock files);
    // without, a missing or unopenable file leaves nothing to lock and nothing is held. Returns a message
    // saying the file is in use when the wait ran out.
    std::optional<std::string> Acquire(const std::filesystem::path& path, std::chrono::milliseconds timeout,
                                       bool create);
    bool IsHeld() const noexcept { return m_Fd >= 0; }
    void Release() noexcept;

private:
    int m_Fd = -1;
};

} // namespace Kernel
