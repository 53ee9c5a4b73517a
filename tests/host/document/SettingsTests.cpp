// The settings store: typed values survive a reload, bad files are kept aside, failed writes are reported.

#include "host/document/VeyraController.h"
#include "host/kernel/AtomicFile.h"

#include <fstream>
#include <gtest/gtest.h>
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
