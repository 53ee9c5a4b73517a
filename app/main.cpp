// rastertools: the command-line editor built on the RasterTools library and its reference host.

#include "app/Options.h"
#include "app/Progress.h"
#include "host/document/Document.h"
#include "host/document/VeyraController.h"
#include "host/kernel/AtomicFile.h"

#include <cerrno>
#include <cstdlib>
#include <iostream>
#include <utility>

namespace {

constexpr std::string_view kUsage = R"(usage: rastertools [--settings FILE] COMMAND [ARGS...]

commands:
  list            every tool and command: class codes, tool identifiers, descriptions, parameters
  play SCRIPT     drive a tool as an editor would and print what the host sees
  apply FILTER [--PARAM VALUE]... INPUT OUTPUT
                  one filter on one image (apply copy [--format F] [--scale SX,SY] IN OUT), with
                  --device auto|cpu|opencl|cuda, --tile N, --threads N, --mask GREY.png (white selects)
                  and --channels (the channels written, e.g. rgb)
  doc new IMAGE -o DOC [--format F] [--force]
                  a new document (.rtd) holding the image as its one raster layer; an existing file that
                  is not a document is only replaced with --force
  doc filter DOC FILTER [--PARAM VALUE]... [--live]
                  changes the selected raster layers (else the top one) with a filter, or with --live adds
                  a live filter layer on top that holds it
  doc render DOC OUTPUT [--format F] [--device D] [--tile N] [--threads N]
                  flattens the document into an image file
  doc show DOC    layers, live filters, pixel selection and history
  doc undo DOC, doc redo DOC
                  undoes (redoes) one step and saves the document

options:
  --settings FILE the settings file (default: $RASTERTOOLS_SETTINGS, else
                  $XDG_CONFIG_HOME/rastertools/settings.json)
  --quiet         no progress bars (they appear on a terminal for work that takes a while)
  --help          this text

environment:
  RASTERTOOLS_LOCK_TIMEOUT    seconds a doc command waits for another one changing the same document
                              (default 10)
  RASTERTOOLS_HISTORY_BUDGET  bytes of pixels a document's history keeps for undo before dropping its
                              oldest entries (default 256M; K, M and G suffixes allowed)
)";

// RASTERTOOLS_HISTORY_BUDGET: a byte count, optionally with a K, M or G (binary) suffix.
void ApplyHistoryBudget() {
    const char* text = std::getenv("RASTERTOOLS_HISTORY_BUDGET");
    if (!text || !*text) return;
    errno = 0;
    char* end = nullptr;
    const unsigned long long value = std::strtoull(text, &end, 10);
    int shift = 0;
    if (*end == 'K' || *end == 'k')
        shift = 10;
    else if (*end == 'M' || *end == 'm')
        shift = 20;
    else if (*end == 'G' || *end == 'g')
        shift = 30;
    if (shift) ++end;
    if (end == text || *end != '\0' || errno == ERANGE || text[0] == '-' || value > (~0ull >> 34))
        throw App::UsageError(std::string("RASTERTOOLS_HISTORY_BUDGET: \"") + text +
                              "\" is not a number of bytes (for example 268435456 or 256M)");
    Document::SetDefaultHistoryBudget(std::size_t(value << shift));
}

int Run(std::vector<std::string> args) {
    ApplyHistoryBudget();
    // Global options may stand anywhere; take them out before the subcommand sees its arguments.
    bool settingsGiven = false;
    for (std::size_t i = 0; i < args.size();) {
        if (args[i] == "--settings") {
            if (i + 1 >= args.size()) throw App::UsageError("--settings needs a file name");
            // Two files would leave it to the order which one is written.
            if (std::exchange(settingsGiven, true))
                throw App::UsageError("--settings is given more than once");
            VeyraController::GetInstance().SetFile(args[i + 1]);
            args.erase(args.begin() + std::ptrdiff_t(i), args.begin() + std::ptrdiff_t(i) + 2);
        } else if (args[i] == "--quiet" || args[i] == "-q") {
            App::SetQuiet(true);
            args.erase(args.begin() + std::ptrdiff_t(i));
        } else if (args[i] == "--help" || args[i] == "-h") {
            std::cout << kUsage;
            return 0;
        } else {
            ++i;
        }
    }
    if (args.empty()) throw App::UsageError("no command given");
    const std::string command = args.front();
    args.erase(args.begin());
    if (command == "list") return App::RunList(args);
    if (command == "play") return App::RunPlay(args);
    if (command == "apply") return App::RunApply(args);
    if (command == "doc") return App::RunDoc(args);
    if (command == "help") {
        std::cout << kUsage;
        return 0;
    }
    throw App::UsageError("unknown command \"" + command + "\" (commands: list, play, apply, doc)");
}

} // namespace

int main(int argc, char** argv) {
    // An interrupted write must not leave its temporary file behind.
    Kernel::InstallTemporaryFileCleanup();
    try {
        return Run(std::vector<std::string>(argv + 1, argv + argc));
    } catch (const App::Error& error) {
        std::cerr << "rastertools: " << error.what() << '\n';
        if (error.GetExitCode() == App::kExitUsage) std::cerr << "Try 'rastertools --help'.\n";
        return error.GetExitCode();
    } catch (const std::exception& error) {
        std::cerr << "rastertools: " << error.what() << '\n';
        return App::kExitFailure;
    }
}
