// Feeds arbitrary bytes to the play interpreter as a script, on a small document and with the verbs that
// touch files refused. Every input must end in success or in a reported error whose message quotes no raw
// control bytes.

#include "app/Options.h"
#include "filters/Catalogue.h"
#include "host/document/VeyraController.h"

#include <cstdio>
#include <filesystem>
#include <sstream>
#include <string>
#include <unistd.h>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const bool prepared = [] {
        // Commits write the settings store: keep it in a scratch file of this process.
        VeyraController::GetInstance().SetFile(
            std::filesystem::temp_directory_path() /
            ("play_fuzzer_settings_" + std::to_string(getpid()) + ".json"));
        return !RasterTools::GetFilterCatalogue().empty();
    }();
    (void)prepared;
    std::istringstream script(std::string(reinterpret_cast<const char*>(data), size));
    std::ostringstream transcript;
    try {
        App::PlayScript(script, transcript, "fuzz", {.filesAllowed = false, .width = 24, .height = 16});
    } catch (const App::Error& error) {
        const std::string message = error.what();
        for (const char c : message)
            if (static_cast<unsigned char>(c) < 0x20) __builtin_trap();
    }
    for (const char c : transcript.str())
        if (static_cast<unsigned char>(c) < 0x20 && c != '\n') __builtin_trap();
    return 0;
}
