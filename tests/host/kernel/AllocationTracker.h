#pragma once
// Replaces the global operator new for the test program (and so for HostKernel, which the dynamic linker
// binds to it) to record the largest single request while a scope is active.

#include <cstddef>

namespace KernelTests {

class AllocationScope {
public:
    AllocationScope();
    ~AllocationScope();
    AllocationScope(const AllocationScope&) = delete;
    AllocationScope& operator=(const AllocationScope&) = delete;

    // The largest single allocation made on any thread since this scope began.
    std::size_t GetLargestRequest() const;
};

} // namespace KernelTests
