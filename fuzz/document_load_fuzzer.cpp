// Feeds arbitrary bytes to document loading, with the checksum patched so that the parser is reached.

#include "filters/Catalogue.h"
#include "host/document/DocumentFile.h"

#include <cstring>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const bool linked = !RasterTools::GetFilterCatalogue().empty();
    (void)linked;
    std::vector<std::byte> bytes(reinterpret_cast<const std::byte*>(data),
                                 reinterpret_cast<const std::byte*>(data) + size);
    Kernel::Counted<Document> document;
    DocumentFile::Decode(bytes, document);
    // With a correct magic and checksum the body itself is what gets tested.
    static const char magic[8] = {'R', 'T', 'D', 'O', 'C', '\r', '\n', '\x1a'};
    std::vector<std::byte> sealed(8 + bytes.size() + 8);
    std::memcpy(sealed.data(), magic, 8);
    if (!bytes.empty()) std::memcpy(sealed.data() + 8, bytes.data(), bytes.size());
    std::uint64_t hash = 0xcbf29ce484222325ull;
    for (std::size_t i = 0; i < sealed.size() - 8; ++i)
        hash = (hash ^ std::uint64_t(sealed[i])) * 0x100000001b3ull;
    std::memcpy(sealed.data() + sealed.size() - 8, &hash, 8);
    if (DocumentFile::Decode(sealed, document) == std::nullopt && document) {
        // A document that loads must save again.
        if (DocumentFile::Encode(*document).empty()) __builtin_trap();
    }
    return 0;
}
