#pragma once
// CriticalSectionSpin: a small spin lock for sections that only look up or store a few pointers.

#include <atomic>
#include <thread>

namespace Kernel {

class CriticalSectionSpin {
public:
    void lock() noexcept {
        while (m_Flag.test_and_set(std::memory_order_acquire))
            while (m_Flag.test(std::memory_order_relaxed))
                std::this_thread::yield();
    }
    bool try_lock() noexcept { return !m_Flag.test_and_set(std::memory_order_acquire); }
    void unlock() noexcept { m_Flag.clear(std::memory_order_release); }

private:
    std::atomic_flag m_Flag;
};

} // namespace Kernel
