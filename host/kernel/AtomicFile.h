#pragma once
// Writes a whole file so that readers see either the old content or the new, never a part.

#include <cstddef>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace Kernel {

// Writes to a temporary file beside the target, flushes it and renames it into place.
// Returns an error message naming the file and the reason, or nothing on success.
std::optional<std::string> WriteFileAtomically(const std::filesystem::path& path,
                                               std::span<const std::byte> bytes);
std::optional<std::string> WriteFileAtomically(const std::filesystem::path& path, std::string_view text);

// Reads a whole file, refusing files above maxBytes. Returns an error message or nothing.
std::optional<std::string> ReadWholeFile(const std::filesystem::path& path, std::string& contents,
                                         std::size_t maxBytes);

} // namespace Kernel
