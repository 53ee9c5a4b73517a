#pragma once
// Saving and loading documents (.rtd): layers with their pixels, live filters, selections and history in one
// checked file.

#include "host/document/Document.h"

#include <cstddef>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace DocumentFile {

// Writes document atomically. Returns an error message naming the file, or nothing.
std::optional<std::string> Save(const Document& document, const std::filesystem::path& path);

// Reads a document. A damaged, truncated or foreign file is refused with a message; nothing is
// allocated beyond what the file's own size can hold.
std::optional<std::string> Load(const std::filesystem::path& path, Kernel::Counted<Document>& document);

// Whether path is a regular file that starts as a document does (it may still be damaged).
bool IsDocument(const std::filesystem::path& path);

// The same from and to memory, for tests and fuzzing.
std::vector<std::byte> Encode(const Document& document, std::string* error = nullptr);
std::optional<std::string> Decode(std::span<const std::byte> bytes, Kernel::Counted<Document>& document);

// Files above this size are refused before reading.
constexpr std::size_t kMaxFileBytes = std::size_t(4) << 30;

} // namespace DocumentFile
