// Feeds arbitrary bytes to the settings store as its file, then commits a key, writes it back and reads it
// again: no input may crash the store, and a commit that reports no error must be there when reloaded.

#include "host/document/VeyraController.h"
#include "host/kernel/AtomicFile.h"

#include <cstdint>
#include <filesystem>
#include <iostream>
#include <span>
#include <unistd.h>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const std::filesystem::path folder = [] {
        // The store reports every unreadable file; thousands of such reports are noise here.
        std::cerr.rdbuf(nullptr);
        return std::filesystem::temp_directory_path() /
               ("rastertools-settings-fuzz-" + std::to_string(::getpid()));
    }();
    // A fresh folder each time, so that copies kept aside do not pile up.
    std::error_code ignored;
    std::filesystem::remove_all(folder, ignored);
    std::filesystem::create_directories(folder, ignored);
    const auto file = folder / "settings.json";
    if (Kernel::WriteFileAtomically(file, std::as_bytes(std::span(data, size)))) return 0;

    auto& store = VeyraController::GetInstance();
    store.SetFile(file);
    (void)store.GetDoubleForKey("tools.fuzz.value", 0);
    (void)store.GetEntries("tools.");
    store.SetDoubleForKey("tools.fuzz.value", 0.25);
    if (!store.GetLastError()) {
        store.SetFile(file);
        if (store.GetDoubleForKey("tools.fuzz.value", 0) != 0.25) __builtin_trap();
    }
    return 0;
}
