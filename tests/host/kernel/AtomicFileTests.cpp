// Whole-file writes, reads and locks: permissions survive a replacement, special files are refused by name,
// killed writers leave no temporary files, and locks serialise read-change-write across threads and
// processes.

#include "host/kernel/AtomicFile.h"
#include "tests/host/ProcessTestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <csignal>
#include <fstream>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace {

class AtomicFiles : public ::testing::Test {
protected:
    void SetUp() override {
        m_Folder = std::filesystem::temp_directory_path() /
                   ("rastertools-atomic-" + std::to_string(::getpid()) + "-" +
                    ::testing::UnitTest::GetInstance()->current_test_info()->name());
        std::filesystem::remove_all(m_Folder);
        std::filesystem::create_directories(m_Folder);
    }
    void TearDown() override {
        std::error_code ignored;
        std::filesystem::remove_all(m_Folder, ignored);
    }

    // Every name in the folder, sorted.
    std::vector<std::string> Names() const {
        std::vector<std::string> names;
        for (const auto& entry : std::filesystem::directory_iterator(m_Folder))
            names.push_back(entry.path().filename().string());
        std::sort(names.begin(), names.end());
        return names;
    }

    std::filesystem::path m_Folder;
};

mode_t Mode(const std::filesystem::path& path) {
    struct stat info {};
    EXPECT_EQ(::stat(path.c_str(), &info), 0) << path;
    return info.st_mode & 07777;
}

std::string Read(const std::filesystem::path& path) {
    std::string text;
    const auto error = Kernel::ReadWholeFile(path, text, 1 << 20);
    EXPECT_FALSE(error) << *error;
    return text;
}

// A process id that no process has: a child that has exited and been reaped.
pid_t DeadProcessId() {
    const pid_t child = ::fork();
    if (child == 0) ::_exit(0);
    ::waitpid(child, nullptr, 0);
    return child;
}

} // namespace

TEST_F(AtomicFiles, ReplacingAFileKeepsItsPermissions) {
    const auto path = m_Folder / "private.rtd";
    const mode_t mask = ::umask(022);
    ASSERT_FALSE(Kernel::WriteFileAtomically(path, std::string_view("first")));
    EXPECT_EQ(Mode(path), mode_t(0644)) << "a new file gets 0666 less the umask";
    for (const mode_t mode : {mode_t(0600), mode_t(0640), mode_t(0604)}) {
        ASSERT_EQ(::chmod(path.c_str(), mode), 0);
        ASSERT_FALSE(Kernel::WriteFileAtomically(path, std::string_view("again")));
        EXPECT_EQ(Mode(path), mode) << std::oct << mode;
    }
    ::umask(mask);
    EXPECT_EQ(Read(path), "again");
}

TEST_F(AtomicFiles, FoldersAndSpecialFilesAreRefusedByName) {
    std::string text = "untouched";
    const auto folder = Kernel::ReadWholeFile(m_Folder, text, 4);
    ASSERT_TRUE(folder);
    EXPECT_EQ(*folder, m_Folder.string() + ": is a folder, not a file");
    const auto device = Kernel::ReadWholeFile("/dev/null", text, 1 << 20);
    ASSERT_TRUE(device);
    EXPECT_EQ(*device, "/dev/null: is not a regular file");
    // A named pipe without a writer is refused at once rather than waited on.
    const auto pipe = m_Folder / "pipe";
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    const auto fifo = Kernel::ReadWholeFile(pipe, text, 1 << 20);
    ASSERT_TRUE(fifo);
    EXPECT_EQ(*fifo, pipe.string() + ": is not a regular file");
    EXPECT_EQ(text, "untouched");

    // Writing over a folder says so and leaves it.
    std::filesystem::create_directory(m_Folder / "sub");
    const auto over = Kernel::WriteFileAtomically(m_Folder / "sub", std::string_view("x"));
    ASSERT_TRUE(over);
    EXPECT_EQ(*over, (m_Folder / "sub").string() + ": is a folder, not a file");
    EXPECT_TRUE(std::filesystem::is_directory(m_Folder / "sub"));

    // Size limits hold for regular files, and files at the limit are read whole.
    ASSERT_FALSE(Kernel::WriteFileAtomically(m_Folder / "five", std::string_view("12345")));
    const auto large = Kernel::ReadWholeFile(m_Folder / "five", text, 4);
    ASSERT_TRUE(large);
    EXPECT_EQ(*large, (m_Folder / "five").string() + ": the file is larger than 4 bytes");
    ASSERT_FALSE(Kernel::ReadWholeFile(m_Folder / "five", text, 5));
    EXPECT_EQ(text, "12345");
}

TEST_F(AtomicFiles, ASuccessfulWriteRemovesTheTemporariesOfKilledWriters) {
    const auto path = m_Folder / "doc.rtd";
    const std::string stale = ".doc.rtd." + std::to_string(DeadProcessId()) + ".a1B2c3";
    // A writer that still runs (our parent) is at work: its file stays, as do other targets' and other names.
    const std::string live = ".doc.rtd." + std::to_string(::getppid()) + ".x9Y8z7";
    for (const std::string& name :
         {stale, live, std::string(".other.rtd.1.abcdef"), std::string(".doc.rtd.notes")})
        std::ofstream(m_Folder / name) << "partial";
    ASSERT_FALSE(Kernel::WriteFileAtomically(path, std::string_view("whole")));
    std::vector<std::string> kept{".doc.rtd.notes", ".other.rtd.1.abcdef", live, "doc.rtd"};
    std::sort(kept.begin(), kept.end());
    EXPECT_EQ(Names(), kept);
}

// A process killed by SIGINT, SIGTERM or SIGHUP in the middle of writing removes its temporary file and
// still ends by that signal. The child writes without pause, so the signal almost always lands mid-write.
TEST_F(AtomicFiles, ASignalledWriterLeavesNoTemporaryFile) {
    const auto path = m_Folder / "big.bin";
    for (const int signal : {SIGTERM, SIGINT, SIGHUP}) {
        std::filesystem::remove(path);
        const pid_t child = ::fork();
        ASSERT_GE(child, 0);
        if (child == 0) {
            Kernel::InstallTemporaryFileCleanup();
            const std::vector<std::byte> bytes(std::size_t(8) << 20, std::byte{0x5a});
            for (;;)
                if (Kernel::WriteFileAtomically(path, bytes)) ::_exit(3);
        }
        // Let it finish one write and get well into the next ones.
        for (int i = 0; i < 2000 && !std::filesystem::exists(path); ++i)
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        std::this_thread::sleep_for(std::chrono::milliseconds(30));
        ASSERT_EQ(::kill(child, signal), 0);
        int status = 0;
        ASSERT_EQ(::waitpid(child, &status, 0), child);
        ASSERT_TRUE(WIFSIGNALED(status)) << "exit status " << status;
        EXPECT_EQ(WTERMSIG(status), signal);
        EXPECT_EQ(Names(), std::vector<std::string>{"big.bin"}) << "signal " << signal;
    }
}

TEST_F(AtomicFiles, ALockWaitsForItsHolderThenTimesOut) {
    const auto path = m_Folder / "doc.rtd";
    ASSERT_FALSE(Kernel::WriteFileAtomically(path, std::string_view("v1")));
    Kernel::FileLock holder;
    ASSERT_FALSE(holder.Acquire(path, std::chrono::milliseconds(0), false));
    ASSERT_TRUE(holder.IsHeld());

    // Another holder in the same process waits, and gives up with a message when the time runs out.
    Kernel::FileLock second;
    const auto busy = second.Acquire(path, std::chrono::milliseconds(100), false);
    ASSERT_TRUE(busy);
    EXPECT_EQ(
        *busy,
        path.string() +
            ": is in use by another process (still locked after 0.1 s); try again when it has finished");
    EXPECT_FALSE(second.IsHeld());

    // The holder replaces the file and lets go: the waiter gets the new file, not the old one it opened.
    std::atomic<bool> released{false};
    std::thread waiter([&] {
        Kernel::FileLock lock;
        EXPECT_FALSE(lock.Acquire(path, std::chrono::seconds(20), false));
        EXPECT_TRUE(released.load());
        EXPECT_EQ(Read(path), "v2");
        Kernel::FileLock third;
        EXPECT_TRUE(third.Acquire(path, std::chrono::milliseconds(0), false))
            << "the waiter's lock must be on the file now in place";
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    ASSERT_FALSE(Kernel::WriteFileAtomically(path, std::string_view("v2")));
    released = true;
    holder.Release();
    waiter.join();

    // A missing file needs no lock unless it is a lock file, which is made.
    Kernel::FileLock none;
    EXPECT_FALSE(none.Acquire(m_Folder / "missing", std::chrono::milliseconds(0), false));
    EXPECT_FALSE(none.IsHeld());
    EXPECT_FALSE(none.Acquire(m_Folder / "made.lock", std::chrono::milliseconds(0), true));
    EXPECT_TRUE(none.IsHeld());
    EXPECT_TRUE(std::filesystem::exists(m_Folder / "made.lock"));
}

// Processes that each read a counter, add one and write it back atomically under the lock lose no update,
// although every write replaces the file they lock.
TEST_F(AtomicFiles, LockedReadChangeWriteLosesNoUpdateAcrossProcesses) {
    const auto path = m_Folder / "counter";
    ASSERT_FALSE(Kernel::WriteFileAtomically(path, std::string_view("0")));
    constexpr int kProcesses = 4, kSteps = 50;
    HostTests::RunInProcesses(kProcesses, [&](int) {
        for (int i = 0; i < kSteps; ++i) {
            Kernel::FileLock lock;
            if (lock.Acquire(path, std::chrono::seconds(30), false) || !lock.IsHeld()) return 2;
            std::string text;
            if (Kernel::ReadWholeFile(path, text, 64)) return 3;
            const std::string next = std::to_string(std::stoi(text) + 1);
            // Writers without a lock would interleave here.
            std::this_thread::sleep_for(std::chrono::microseconds(200));
            if (Kernel::WriteFileAtomically(path, next)) return 4;
        }
        return 0;
    });
    EXPECT_EQ(Read(path), std::to_string(kProcesses * kSteps));
}
