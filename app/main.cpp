// rastertools: the command-line editor built on the RasterTools library and its reference host.

#include "app/CommandLine.h"
#include "app/FilterArguments.h"
#include "app/Options.h"
#include "app/Progress.h"
#include "host/document/Document.h"
#include "host/document/VeyraController.h"
#include "host/kernel/AtomicFile.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <iostream>
#include <utility>

namespace {

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

bool AsksForHelp(const std::vector<std::string>& args) {
    return std::any_of(args.begin(), args.end(),
                       [](const std::string& arg) { return arg == "--help" || arg == "-h"; });
}

int Run(std::vector<std::string> args) {
    ApplyHistoryBudget();
    // Global options may stand anywhere; take them out before the subcommand sees its arguments.
    bool settingsGiven = false;
    for (std::size_t i = 0; i < args.size();) {
        std::string file;
        std::size_t taken = 0;
        if (args[i] == "--settings") {
            if (i + 1 >= args.size()) throw App::UsageError("--settings needs a file name");
            file = args[i + 1];
            taken = 2;
        } else if (args[i].starts_with("--settings=")) {
            file = args[i].substr(11);
            taken = 1;
        } else if (args[i] == "--quiet" || args[i] == "-q") {
            App::SetQuiet(true);
            args.erase(args.begin() + std::ptrdiff_t(i));
            continue;
        } else {
            ++i;
            continue;
        }
        if (file.empty()) throw App::UsageError("--settings needs a file name");
        // Two files would leave it to the order which one is written.
        if (std::exchange(settingsGiven, true)) throw App::UsageError("--settings is given more than once");
        VeyraController::GetInstance().SetFile(file);
        args.erase(args.begin() + std::ptrdiff_t(i), args.begin() + std::ptrdiff_t(i + taken));
    }
    if (args.empty()) throw App::UsageError("no command given");
    const std::string command = args.front();
    args.erase(args.begin());
    if (command == "--help" || command == "-h" || command == "help") {
        std::string topic;
        for (const auto& word : args)
            topic += (topic.empty() ? "" : " ") + word;
        if (topic.empty()) {
            std::cout << App::TopLevelHelp();
        } else if (topic.starts_with("apply ") && RasterTools::FindFilter(topic.substr(6))) {
            std::cout << App::FilterHelp(*RasterTools::FindFilter(topic.substr(6)));
        } else {
            const std::string text = App::CommandHelp(topic);
            if (text.empty()) throw App::UsageError("no help on \"" + App::EscapeBytes(topic) + "\"");
            std::cout << text;
        }
        return 0;
    }
    if (command == "--version") {
        std::cout << "rastertools " << App::Version() << '\n';
        return 0;
    }
    if (command == "list" || command == "play") {
        if (AsksForHelp(args)) {
            std::cout << App::CommandHelp(command);
            return 0;
        }
        return command == "list" ? App::RunList(args) : App::RunPlay(args);
    }
    if (command == "apply") return App::RunApply(args);
    if (command == "doc") return App::RunDoc(args);
    if (command == "completion") {
        std::cout << App::BashCompletion();
        return 0;
    }
    if (command == "manual") {
        std::cout << App::ManualPage();
        return 0;
    }
    throw App::UsageError("unknown command \"" + App::EscapeBytes(command) +
                          "\" (commands: list, play, apply, doc, completion, manual)");
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
