#include "host/kernel/AtomicFile.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <sys/stat.h>
#include <unistd.h>

namespace Kernel {

namespace {
std::string Describe(const std::filesystem::path& path, const std::string& reason) {
    return path.string() + ": " + reason;
}
} // namespace

std::optional<std::string> WriteFileAtomically(const std::filesystem::path& path,
                                               std::span<const std::byte> bytes) {
    const std::filesystem::path folder =
        path.has_parent_path() ? path.parent_path() : std::filesystem::path(".");
    std::string pattern = (folder / ("." + path.filename().string() + ".XXXXXX")).string();
    const int fd = ::mkstemp(pattern.data());
    if (fd < 0) return Describe(path, std::string("cannot create a temporary file: ") + std::strerror(errno));

    auto fail = [&](const char* what) {
        const std::string reason = std::string(what) + ": " + std::strerror(errno);
        ::close(fd);
        ::unlink(pattern.c_str());
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
    // New files get the usual permissions rather than mkstemp's private 0600.
    const mode_t mask = ::umask(0);
    ::umask(mask);
    ::fchmod(fd, 0666 & ~mask);
    if (::fsync(fd) != 0) return fail("cannot flush");
    if (::close(fd) != 0) {
        ::unlink(pattern.c_str());
        return Describe(path, std::string("cannot close: ") + std::strerror(errno));
    }
    if (::rename(pattern.c_str(), path.c_str()) != 0) {
        const std::string reason = std::string("cannot replace the file: ") + std::strerror(errno);
        ::unlink(pattern.c_str());
        return Describe(path, reason);
    }
    return std::nullopt;
}

std::optional<std::string> WriteFileAtomically(const std::filesystem::path& path, std::string_view text) {
    return WriteFileAtomically(path, std::as_bytes(std::span(text.data(), text.size())));
}

std::optional<std::string> ReadWholeFile(const std::filesystem::path& path, std::string& contents,
                                         std::size_t maxBytes) {
    std::ifstream in(path, std::ios::binary);
    if (!in) return Describe(path, std::string("cannot open: ") + std::strerror(errno));
    in.seekg(0, std::ios::end);
    const std::streamoff size = in.tellg();
    if (size < 0) return Describe(path, "cannot determine the size");
    if (std::uint64_t(size) > maxBytes)
        return Describe(path, "the file is larger than " + std::to_string(maxBytes) + " bytes");
    in.seekg(0);
    contents.assign(std::size_t(size), '\0');
    if (!in.read(contents.data(), size)) return Describe(path, "cannot read");
    return std::nullopt;
}

} // namespace Kernel
