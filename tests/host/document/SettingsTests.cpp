// The settings store: typed values survive a reload, bad files are kept aside (each of them), hostile files
// are refused, failed writes are reported, concurrent commits from several processes keep every key.

#include "host/document/VeyraController.h"
#include "host/kernel/AtomicFile.h"
#include "tests/host/ProcessTestSupport.h"

#include <fstream>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

class SettingsStore : public ::testing::Test {
protected:
    void SetUp() override {
        m_Folder = std::filesystem::temp_directory_path() /
                   ("rastertools-settings-" + std::to_string(::getpid()) + "-" +
                    ::testing::UnitTest::GetInstance()->current_test_info()->name());
        std::filesystem::remove_all(m_Folder);
        m_File = m_Folder / "nested" / "settings.json";
        VeyraController::GetInstance().SetFile(m_File);
    }
    void TearDown() override {
        std::error_code ignored;
        std::filesystem::remove_all(m_Folder, ignored);
    }
    std::filesystem::path m_Folder, m_File;
};

} // namespace

TEST_F(SettingsStore, TypedValuesSurviveAReload) {
    auto& store = VeyraController::GetInstance();
    EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 1.5), 1.5);
    EXPECT_FALSE(std::filesystem::exists(m_File)) << "reading must not create the file";
    store.SetDoubleForKey("tools.x.d", 0.1);
    store.SetBoolForKey("tools.x.b", true);
    store.SetIntForKey("tools.x.i", -7);
    store.SetDoubleForKey("other.key", 3);

    store.SetFile(m_File); // forget the memory copy
    EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 0), 0.1);
    EXPECT_EQ(store.GetBoolForKey("tools.x.b", false), true);
    EXPECT_EQ(store.GetIntForKey("tools.x.i", 0), -7);
    // A key of another type gives the fallback rather than a converted value.
    EXPECT_EQ(store.GetBoolForKey("tools.x.d", false), false);
    EXPECT_EQ(store.GetIntForKey("tools.x.d", 42), 42);

    const auto entries = store.GetEntries("tools.");
    ASSERT_EQ(entries.size(), 3u);
    EXPECT_EQ(entries[0], (std::pair<std::string, std::string>{"tools.x.b", "true"}));
    EXPECT_EQ(entries[1], (std::pair<std::string, std::string>{"tools.x.d", "0.1"}));
    EXPECT_EQ(entries[2], (std::pair<std::string, std::string>{"tools.x.i", "-7"}));
}

TEST_F(SettingsStore, AnUnreadableFileIsKeptAsideNotOverwritten) {
    std::filesystem::create_directories(m_File.parent_path());
    {
        std::ofstream out(m_File);
        out << "{ \"tools.x.d\": 0.5, oops";
    }
    auto& store = VeyraController::GetInstance();
    EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 9), 9);
    ASSERT_TRUE(store.GetLastError());
    EXPECT_NE(store.GetLastError()->find("settings.json"), std::string::npos);
    std::string kept;
    ASSERT_FALSE(Kernel::ReadWholeFile(m_File.string() + ".bad", kept, 1 << 20));
    EXPECT_EQ(kept, "{ \"tools.x.d\": 0.5, oops");
    store.SetDoubleForKey("tools.x.d", 0.25);
    store.SetFile(m_File);
    EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 0), 0.25);
}

TEST_F(SettingsStore, AFailedWriteIsReportedAndTheValueKeptInMemory) {
    // A settings path below a regular file cannot be written, whoever runs the test.
    std::filesystem::create_directories(m_Folder);
    { std::ofstream(m_Folder / "plain-file") << "not a folder"; }
    auto& store = VeyraController::GetInstance();
    store.SetFile(m_Folder / "plain-file" / "settings.json");
    store.SetDoubleForKey("tools.x.d", 2.0);
    ASSERT_TRUE(store.GetLastError());
    EXPECT_NE(store.GetLastError()->find("plain-file"), std::string::npos) << *store.GetLastError();
    EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 0), 2.0);
    std::string untouched;
    ASSERT_FALSE(Kernel::ReadWholeFile(m_Folder / "plain-file", untouched, 100));
    EXPECT_EQ(untouched, "not a folder");
}

// A file of deeply nested arrays, alone or as a value, is refused before it is parsed and kept aside like any
// unreadable file; a commit then writes a sound file.
TEST_F(SettingsStore, DeepNestingIsRefusedAndKeptAside) {
    std::filesystem::create_directories(m_File.parent_path());
    const std::string arrays = std::string(100000, '[') + std::string(100000, ']');
    auto& store = VeyraController::GetInstance();
    for (const std::string& nested : {arrays, R"({"tools.x.n": )" + arrays + "}"}) {
        std::filesystem::remove(m_File.string() + ".bad");
        ASSERT_FALSE(Kernel::WriteFileAtomically(m_File, nested));
        store.SetFile(m_File);
        EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 9), 9);
        ASSERT_TRUE(store.GetLastError());
        EXPECT_NE(store.GetLastError()->find("nested deeper than 8 levels"), std::string::npos)
            << *store.GetLastError();
        std::string kept;
        ASSERT_FALSE(Kernel::ReadWholeFile(m_File.string() + ".bad", kept, 1 << 20));
        EXPECT_EQ(kept, nested);
        store.SetDoubleForKey("tools.x.d", 0.5);
        EXPECT_FALSE(store.GetLastError());
        store.SetFile(m_File);
        EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 0), 0.5);
        EXPECT_EQ(store.GetEntries("tools.").size(), 1u);
    }
    // Shallow nesting inside strings or values is no reason to refuse a file.
    ASSERT_FALSE(
        Kernel::WriteFileAtomically(m_File, std::string_view(R"({"tools.x.d": 2, "s": "[[[[[[[[[[[["})")));
    store.SetFile(m_File);
    EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 0), 2);
}

// Every unreadable file is kept: a second one does not replace the first copy.
TEST_F(SettingsStore, EachUnreadableFileGetsItsOwnCopy) {
    std::filesystem::create_directories(m_File.parent_path());
    auto& store = VeyraController::GetInstance();
    const std::string damaged[] = {"first {", "second {", "third {"};
    for (const auto& text : damaged) {
        ASSERT_FALSE(Kernel::WriteFileAtomically(m_File, text));
        store.SetFile(m_File);
        EXPECT_EQ(store.GetIntForKey("tools.x.i", 4), 4);
    }
    const std::string names[] = {".bad", ".bad.1", ".bad.2"};
    for (int i = 0; i < 3; ++i) {
        std::string kept;
        ASSERT_FALSE(Kernel::ReadWholeFile(m_File.string() + names[i], kept, 100)) << names[i];
        EXPECT_EQ(kept, damaged[i]);
    }
    EXPECT_NE(store.GetLastError()->find("kept as " + m_File.string() + ".bad.2"), std::string::npos)
        << *store.GetLastError();
}

// A folder where the file should be is reported as such, never set aside, and never written over.
TEST_F(SettingsStore, AFolderInPlaceOfTheFileIsReportedAndLeft) {
    std::filesystem::create_directories(m_File / "inside");
    auto& store = VeyraController::GetInstance();
    EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 3), 3);
    ASSERT_TRUE(store.GetLastError());
    EXPECT_EQ(*store.GetLastError(), m_File.string() + ": is a folder, not a file");
    store.SetDoubleForKey("tools.x.d", 1);
    ASSERT_TRUE(store.GetLastError());
    EXPECT_EQ(*store.GetLastError(), m_File.string() + ": is a folder, not a file");
    EXPECT_EQ(store.GetDoubleForKey("tools.x.d", 3), 1) << "the value is kept in memory";
    EXPECT_TRUE(std::filesystem::is_directory(m_File / "inside"));
    EXPECT_FALSE(std::filesystem::exists(m_File.string() + ".bad"));
}

TEST_F(SettingsStore, ACommitKeepsTheFilesPermissions) {
    auto& store = VeyraController::GetInstance();
    store.SetIntForKey("tools.x.i", 1);
    ASSERT_EQ(::chmod(m_File.c_str(), 0600), 0);
    store.SetIntForKey("tools.x.i", 2);
    struct stat info {};
    ASSERT_EQ(::stat(m_File.c_str(), &info), 0);
    EXPECT_EQ(info.st_mode & 07777, 0600u);
}

// Processes committing at the same time each merge their key into what the file holds under its lock: no
// key is lost.
TEST_F(SettingsStore, ConcurrentCommitsFromProcessesKeepEveryKey) {
    constexpr int kProcesses = 4, kKeys = 20;
    HostTests::RunInProcesses(kProcesses, [&](int p) {
        auto& store = VeyraController::GetInstance();
        store.SetFile(m_File);
        for (int k = 0; k < kKeys; ++k) {
            store.SetIntForKey("tools.p" + std::to_string(p) + ".k" + std::to_string(k), k);
            if (store.GetLastError()) return 2;
        }
        return 0;
    });
    auto& store = VeyraController::GetInstance();
    store.SetFile(m_File);
    EXPECT_EQ(store.GetEntries("tools.p").size(), std::size_t(kProcesses * kKeys));
    for (int p = 0; p < kProcesses; ++p)
        for (int k = 0; k < kKeys; ++k)
            EXPECT_EQ(store.GetIntForKey("tools.p" + std::to_string(p) + ".k" + std::to_string(k), -1), k);
}

TEST(AtomicFile, ReplacesWholeFilesOnly) {
    const auto path =
        std::filesystem::temp_directory_path() / ("rastertools-atomic-" + std::to_string(::getpid()));
    ASSERT_FALSE(Kernel::WriteFileAtomically(path, std::string_view("first")));
    ASSERT_FALSE(Kernel::WriteFileAtomically(path, std::string_view("second, longer")));
    std::string text;
    ASSERT_FALSE(Kernel::ReadWholeFile(path, text, 100));
    EXPECT_EQ(text, "second, longer");
    // Size limits are enforced before reading.
    const auto refused = Kernel::ReadWholeFile(path, text, 4);
    ASSERT_TRUE(refused);
    EXPECT_NE(refused->find("larger than 4 bytes"), std::string::npos);
    // No temporary is left behind.
    int siblings = 0;
    for (const auto& entry : std::filesystem::directory_iterator(path.parent_path()))
        if (entry.path().filename().string().find(path.filename().string()) != std::string::npos) ++siblings;
    EXPECT_EQ(siblings, 1);
    std::filesystem::remove(path);
    EXPECT_TRUE(
        Kernel::WriteFileAtomically(path.parent_path() / "missing-folder" / "x", std::string_view("x")));
}
