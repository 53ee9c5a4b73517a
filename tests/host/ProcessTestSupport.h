#pragma once
// Runs one body in several processes at once, for what must hold when separate programs share a file.

#include <gtest/gtest.h>

#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace HostTests {

// Forks count processes that each run body(index) and exit with what it returns, waits for them all and
// expects each to have exited with 0.
template <class Body>
void RunInProcesses(int count, Body body) {
    std::vector<pid_t> children;
    for (int p = 0; p < count; ++p) {
        const pid_t child = ::fork();
        ASSERT_GE(child, 0);
        if (child == 0) ::_exit(body(p));
        children.push_back(child);
    }
    for (const pid_t child : children) {
        int status = 0;
        ASSERT_EQ(::waitpid(child, &status, 0), child);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
    }
}

} // namespace HostTests
