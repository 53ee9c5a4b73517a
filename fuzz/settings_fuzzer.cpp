// Feeds arbitrary bytes to the settings store as its file, then commits a key, writes it back and reads it
// again: no input may crash the store, and a commit that reports no error must be there when reloaded.

#include "host/document/VeyraController.h"

#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <unistd.h>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const std::filesystem::path folder = [] {
        // The store reports every unreadable file; thousands of such reports are noise here.
        std::cerr.rdbuf(nullptr);
        // Each commit is flushed to disk: memory-backed files keep the runs fast.
        std::error_code error;
        const std::filesystem::path base = std::filesystem::is_directory("/dev/shm", error)
                                               ? std::filesystem::path("/dev/shm")
                                               : std::filesystem::temp_directory_path();
        return base / ("rastertools-settings-fuzz-" + std::to_string(::getpid()));
    }();
    // Registered after the folder's name exists, so that it runs before that name is destroyed.
    static const bool cleanup = (std::atexit([] {
                                     std::error_code ignored;
                                     std::filesystem::remove_all(folder, ignored);
                                 }),
                                 true);
    (void)cleanup;
    // A fresh folder each time, so that copies kept aside do not pile up.
    std::error_code ignored;
    std::filesystem::remove_all(folder, ignored);
    std::filesystem::create_directories(folder, ignored);
    const auto file = folder / "settings.json";
    {
        std::ofstream out(file, std::ios::binary);
        out.write(reinterpret_cast<const char*>(data), std::streamsize(size));
        if (!out) return 0;
    }

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
