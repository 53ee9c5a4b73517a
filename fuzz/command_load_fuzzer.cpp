// Feeds arbitrary bytes to command loading: every registered command class must refuse or load them
// without crashing, reading out of bounds or allocating without bound.

#include "filters/Catalogue.h"
#include "host/kernel/Serialiser.h"

#include <cstddef>
#include <cstdint>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const bool linked =
        !RasterTools::GetFilterCatalogue().empty(); // keeps the library's registrations
    (void)linked;
    Kernel::FileStore store;
    const auto bytes = std::span(reinterpret_cast<const std::byte*>(data), size);
    if (auto object = Kernel::DeserialiseObject(bytes, store)) {
        // Whatever loaded must serialise again and load to the same bytes.
        const auto again = Kernel::SerialiseObject(*object);
        auto reloaded = Kernel::DeserialiseObject(again, store);
        if (!reloaded || Kernel::SerialiseObject(*reloaded) != again) __builtin_trap();
    }
    // The same bytes as the records of each command class, as a document's nested command would be read.
    Kernel::InSerialiser in(bytes);
    for (const auto& info : RasterTools::GetFilterCatalogue()) {
        auto command = info.makeCommand(false, {});
        command->Load(in, store, 1);
    }
    return 0;
}
