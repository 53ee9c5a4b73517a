#include "host/kernel/Simd.h"

#include <atomic>
#include <cstdlib>
#include <string_view>

namespace Kernel {

namespace {

std::atomic<bool>& SimdSwitch() noexcept {
    static std::atomic<bool> enabled{[] {
        const char* value = std::getenv("RASTERTOOLS_NO_SIMD");
        return value == nullptr || std::string_view(value).empty() || std::string_view(value) == "0";
    }()};
    return enabled;
}

} // namespace

bool IsSimdEnabled() noexcept {
    return SimdSwitch().load(std::memory_order_relaxed);
}

void SetSimdEnabled(bool enabled) noexcept {
    SimdSwitch().store(enabled, std::memory_order_relaxed);
}

} // namespace Kernel
