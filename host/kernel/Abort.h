#pragma once
// The host's abort flag: a plain bool that one thread sets while rendering threads read it.

#include <atomic>

namespace Kernel {

static_assert(std::atomic_ref<bool>::required_alignment <= alignof(bool),
              "the abort flag is a plain bool: it must be usable through atomic_ref as it is");

// True when the flag exists and is set. The read is atomic, so a flag set from another thread is no race;
// acquire pairs with SetAborted so that whatever the setter wrote before is visible to the reader.
inline bool IsAborted(const bool* abort) noexcept {
    // atomic_ref needs a mutable object, but a load never writes through it.
    return abort && std::atomic_ref<bool>(*const_cast<bool*>(abort)).load(std::memory_order_acquire);
}

inline void SetAborted(bool* abort, bool value = true) noexcept {
    if (abort) std::atomic_ref<bool>(*abort).store(value, std::memory_order_release);
}

} // namespace Kernel
