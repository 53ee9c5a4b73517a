#include "host/kernel/AtomicFile.h"

#include <algorithm>
#include <atomic>
#include <cctype>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <pthread.h>
#include <sstream>
#include <sys/file.h>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>
#include <utility>

namespace Kernel {

namespace {

std::string Describe(const std::filesystem::path& path, const std::string& reason) {
    return path.string() + ": " + reason;
}

// The temporary files of writes in progress, for the signal handlers. Fixed slots and atomics only, so
// that a handler can walk them at any moment: a slot is free (0), being filled (1) or names a live file (2).
struct TemporarySlot {
    std::atomic<int> state{0};
    char path[PATH_MAX];
};
constexpr int kTemporarySlots = 64;
TemporarySlot g_Temporaries[kTemporarySlots];

// Returns the slot's index, or -1 when all are taken (the file is then only cleaned up by a later write).
int RegisterTemporary(const std::string& path) noexcept {
    if (path.size() >= PATH_MAX) return -1;
    for (int i = 0; i < kTemporarySlots; ++i) {
        int expected = 0;
        if (!g_Temporaries[i].state.compare_exchange_strong(expected, 1, std::memory_order_acquire)) continue;
        std::memcpy(g_Temporaries[i].path, path.c_str(), path.size() + 1);
        g_Temporaries[i].state.store(2, std::memory_order_release);
        return i;
    }
    return -1;
}

void ForgetTemporary(int slot) noexcept {
    if (slot >= 0) g_Temporaries[slot].state.store(0, std::memory_order_release);
}

extern "C" void RemoveTemporariesAndEnd(int signal) {
    RemoveLiveTemporaryFiles();
    // SA_RESETHAND restored the default action; it ends the process once this handler returns.
    ::raise(signal);
}

// Temporary names carry the writer's process id: ".NAME.PID.XXXXXX". Such a file whose process is gone
// was left by a killed writer; one whose process lives may be another writer's work in progress.
std::string TemporaryPrefix(const std::filesystem::path& path) {
    return "." + path.filename().string() + ".";
}

void RemoveStaleTemporaries(const std::filesystem::path& path) {
    const std::filesystem::path folder =
        path.has_parent_path() ? path.parent_path() : std::filesystem::path(".");
    const std::string prefix = TemporaryPrefix(path);
    std::error_code error;
    std::filesystem::directory_iterator it(folder, error), end;
    for (; !error && it != end; it.increment(error)) {
        const std::string name = it->path().filename().string();
        if (!name.starts_with(prefix)) continue;
        const std::string rest = name.substr(prefix.size()); // PID.XXXXXX
        // Earlier builds named temporaries ".NAME.XXXXXX", without the writer's process: such a file that
        // nobody has touched for ten minutes is a killed writer's.
        if (rest.size() == 6 && std::all_of(rest.begin(), rest.end(), [](char c) {
                return std::isalnum(static_cast<unsigned char>(c));
            })) {
            struct stat old {};
            if (::lstat(it->path().c_str(), &old) == 0 && S_ISREG(old.st_mode) &&
                ::time(nullptr) - old.st_mtime > 600)
                ::unlink(it->path().c_str());
            continue;
        }
        const std::size_t dot = rest.find('.');
        if (dot == 0 || dot == std::string::npos || rest.size() - dot - 1 != 6 || dot > 9 ||
            rest.find_first_not_of("0123456789") != dot)
            continue;
        const pid_t pid = pid_t(std::stol(rest.substr(0, dot)));
        if (pid <= 0 || pid == ::getpid()) continue;
        if (::kill(pid, 0) != 0 && errno == ESRCH) ::unlink(it->path().c_str());
    }
}

} // namespace

void RemoveLiveTemporaryFiles() noexcept {
    for (auto& slot : g_Temporaries)
        if (slot.state.load(std::memory_order_acquire) == 2) ::unlink(slot.path);
}

void InstallTemporaryFileCleanup() {
    for (const int signal : {SIGINT, SIGTERM, SIGHUP}) {
        struct sigaction current {};
        // A signal the process was started ignoring (nohup) stays ignored.
        if (::sigaction(signal, nullptr, &current) == 0 && current.sa_handler == SIG_IGN) continue;
        struct sigaction action {};
        action.sa_handler = RemoveTemporariesAndEnd;
        action.sa_flags = SA_RESETHAND;
        sigemptyset(&action.sa_mask);
        ::sigaction(signal, &action, nullptr);
    }
}

std::optional<std::string> WriteFileAtomically(const std::filesystem::path& path,
                                               std::span<const std::byte> bytes) {
    struct stat existing {};
    const bool exists = ::stat(path.c_str(), &existing) == 0;
    if (exists && S_ISDIR(existing.st_mode)) return Describe(path, "is a folder, not a file");
    const std::filesystem::path folder =
        path.has_parent_path() ? path.parent_path() : std::filesystem::path(".");
    std::string pattern =
        (folder / (TemporaryPrefix(path) + std::to_string(::getpid()) + ".XXXXXX")).string();
    // No terminating signal between making the file and registering it, or its handler would miss it.
    sigset_t terminating, previous;
    sigemptyset(&terminating);
    for (const int signal : {SIGINT, SIGTERM, SIGHUP})
        sigaddset(&terminating, signal);
    ::pthread_sigmask(SIG_BLOCK, &terminating, &previous);
    const int fd = ::mkstemp(pattern.data());
    const int createError = errno;
    const int slot = fd >= 0 ? RegisterTemporary(pattern) : -1;
    ::pthread_sigmask(SIG_SETMASK, &previous, nullptr);
    if (fd < 0)
        return Describe(path, std::string("cannot create a temporary file: ") + std::strerror(createError));

    auto fail = [&](const char* what) {
        const std::string reason = std::string(what) + ": " + std::strerror(errno);
        ::close(fd);
        ::unlink(pattern.c_str());
        ForgetTemporary(slot);
        return Describe(path, reason);
    };
    const std::byte* data = bytes.data();
    std::size_t left = bytes.size();
    while (left > 0) {
        const ssize_t written = ::write(fd, data, left);
        if (written < 0) {
            if (errno == EINTR) continue;
            return fail("cannot write");
        }
        data += written;
        left -= std::size_t(written);
    }
    if (exists && S_ISREG(existing.st_mode)) {
        // Replacing keeps the file's permissions (and its owner where we may set it).
        ::fchmod(fd, existing.st_mode & 07777);
        if (existing.st_uid != ::geteuid() || existing.st_gid != ::getegid())
            (void)!::fchown(fd, existing.st_uid, existing.st_gid);
    } else {
        // New files get the usual permissions rather than mkstemp's private 0600.
        const mode_t mask = ::umask(0);
        ::umask(mask);
        ::fchmod(fd, 0666 & ~mask);
    }
    if (::fsync(fd) != 0) return fail("cannot flush");
    if (::close(fd) != 0) {
        const std::string reason = std::string("cannot close: ") + std::strerror(errno);
        ::unlink(pattern.c_str());
        ForgetTemporary(slot);
        return Describe(path, reason);
    }
    if (::rename(pattern.c_str(), path.c_str()) != 0) {
        const std::string reason = std::string("cannot replace the file: ") + std::strerror(errno);
        ::unlink(pattern.c_str());
        ForgetTemporary(slot);
        return Describe(path, reason);
    }
    ForgetTemporary(slot);
    RemoveStaleTemporaries(path);
    return std::nullopt;
}

std::optional<std::string> WriteFileAtomically(const std::filesystem::path& path, std::string_view text) {
    return WriteFileAtomically(path, std::as_bytes(std::span(text.data(), text.size())));
}

std::optional<std::string> ReadWholeFile(const std::filesystem::path& path, std::string& contents,
                                         std::size_t maxBytes) {
    // Non-blocking, so that opening a named pipe does not wait for a writer before it is refused.
    const int fd = ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) return Describe(path, std::string("cannot open: ") + std::strerror(errno));
    struct stat info {};
    std::optional<std::string> error;
    if (::fstat(fd, &info) != 0)
        error = Describe(path, std::string("cannot determine the size: ") + std::strerror(errno));
    else if (S_ISDIR(info.st_mode))
        error = Describe(path, "is a folder, not a file");
    else if (!S_ISREG(info.st_mode))
        error = Describe(path, "is not a regular file");
    else if (std::uint64_t(info.st_size) > maxBytes)
        error = Describe(path, "the file is larger than " + std::to_string(maxBytes) + " bytes");
    if (error) {
        ::close(fd);
        return error;
    }
    // Read to the end, whatever the size said: the file may change meanwhile, and the limit still holds.
    contents.assign(std::size_t(info.st_size), '\0');
    std::size_t at = 0;
    for (;;) {
        if (at == contents.size()) {
            if (contents.size() > maxBytes) break;
            contents.resize(std::min(maxBytes + 1, std::max<std::size_t>(contents.size() * 2, 4096)));
        }
        const ssize_t got = ::read(fd, contents.data() + at, contents.size() - at);
        if (got < 0) {
            if (errno == EINTR) continue;
            error = Describe(path, std::string("cannot read: ") + std::strerror(errno));
            break;
        }
        if (got == 0) break;
        at += std::size_t(got);
    }
    ::close(fd);
    if (error) return error;
    if (at > maxBytes)
        return Describe(path, "the file is larger than " + std::to_string(maxBytes) + " bytes");
    contents.resize(at);
    return std::nullopt;
}

FileLock::FileLock(FileLock&& other) noexcept
    : m_Fd(std::exchange(other.m_Fd, -1)) {}

FileLock& FileLock::operator=(FileLock&& other) noexcept {
    if (this != &other) {
        Release();
        m_Fd = std::exchange(other.m_Fd, -1);
    }
    return *this;
}

FileLock::~FileLock() {
    Release();
}

void FileLock::Release() noexcept {
    if (m_Fd >= 0) ::close(m_Fd); // closing drops the lock
    m_Fd = -1;
}

std::optional<std::string> FileLock::Acquire(const std::filesystem::path& path,
                                             std::chrono::milliseconds timeout, bool create) {
    Release();
    using Clock = std::chrono::steady_clock;
    const auto deadline = Clock::now() + timeout;
    auto pause = std::chrono::milliseconds(2);
    for (;;) {
        const int fd =
            ::open(path.c_str(), (create ? O_RDWR | O_CREAT : O_RDONLY) | O_NONBLOCK | O_CLOEXEC, 0666);
        // Nothing there to lock (or not ours to open): the caller's own read or write says what is wrong.
        if (fd < 0) return std::nullopt;
        struct stat opened {};
        if (::fstat(fd, &opened) != 0 || !S_ISREG(opened.st_mode)) {
            ::close(fd);
            return std::nullopt;
        }
        for (;;) {
            if (::flock(fd, LOCK_EX | LOCK_NB) == 0) break;
            if (errno == EINTR) continue;
            if (errno != EWOULDBLOCK) {
                // A file system without locks: go on unlocked rather than refuse all work.
                ::close(fd);
                return std::nullopt;
            }
            if (Clock::now() >= deadline) {
                ::close(fd);
                std::ostringstream waited;
                waited << double(timeout.count()) / 1000.0;
                return Describe(path, "is in use by another process (still locked after " + waited.str() +
                                          " s); try again when it has finished");
            }
            std::this_thread::sleep_for(pause);
            pause = std::min(pause * 2, std::chrono::milliseconds(50));
        }
        // A writer that held the lock may have renamed a new file into place: the lock must be on that one.
        struct stat current {};
        if (::stat(path.c_str(), &current) == 0 && current.st_dev == opened.st_dev &&
            current.st_ino == opened.st_ino) {
            m_Fd = fd;
            return std::nullopt;
        }
        ::close(fd);
    }
}

} // namespace Kernel
