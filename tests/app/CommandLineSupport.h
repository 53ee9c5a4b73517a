#pragma once
// Runs the built rastertools in a private folder and collects its output and exit code, for the command-line
// tests.

#include "host/io/ImageIO.h"
#include "host/kernel/AtomicFile.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <string>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace AppTests {

struct Result {
    int exitCode = -1;
    std::string output; // standard output and standard error together
};

class CommandLine : public ::testing::Test {
protected:
    void SetUp() override {
        m_Folder = std::filesystem::temp_directory_path() /
                   ("rastertools-cli-" + std::to_string(::getpid()) + "-" +
                    ::testing::UnitTest::GetInstance()->current_test_info()->name());
        std::filesystem::remove_all(m_Folder);
        std::filesystem::create_directories(m_Folder);
    }
    void TearDown() override { std::filesystem::remove_all(m_Folder); }

    std::filesystem::path Write(const std::string& name, const std::string& text) {
        const auto path = m_Folder / name;
        std::ofstream(path) << text;
        return path;
    }

    // environment: NAME=VALUE words set for this run only.
    Result Run(const std::string& arguments, const std::string& environment = "") {
        const std::string command = "cd '" + m_Folder.string() + "' && RASTERTOOLS_SETTINGS='" +
                                    (m_Folder / "settings.json").string() + "' " + environment +
                                    " '" RASTERTOOLS_PROGRAM "' " + arguments + " 2>&1";
        Result result;
        FILE* pipe = ::popen(command.c_str(), "r");
        if (!pipe) return result;
        char buffer[4096];
        for (std::size_t n; (n = std::fread(buffer, 1, sizeof buffer, pipe)) > 0;)
            result.output.append(buffer, n);
        const int status = ::pclose(pipe);
        result.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
        return result;
    }

    std::string Settings() {
        std::string text;
        Kernel::ReadWholeFile(m_Folder / "settings.json", text, 1 << 20);
        return text;
    }

    std::filesystem::path m_Folder;
};

// The pixel bytes of an image file, row after row without padding; empty (and a failure) when it cannot be
// read.
inline std::vector<std::byte> Pixels(const std::filesystem::path& path) {
    const IO::ReadResult read = IO::ReadImage(path);
    EXPECT_TRUE(read) << read.error;
    std::vector<std::byte> bytes;
    if (!read) return bytes;
    for (int y = 0; y < read.image->GetHeight(); ++y)
        bytes.insert(bytes.end(), read.image->RowBytes(y),
                     read.image->RowBytes(y) + read.image->GetRowBytes());
    return bytes;
}

inline bool Contains(const std::string& text, const std::string& part) {
    return text.find(part) != std::string::npos;
}

} // namespace AppTests
