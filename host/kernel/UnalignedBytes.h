#pragma once
// Values read from and written to byte buffers at any alignment, as pixel and file samples lie.

#include <cstddef>
#include <cstring>

namespace Kernel {

template <class T>
T LoadBytes(const std::byte* p) noexcept {
    T value;
    std::memcpy(&value, p, sizeof value);
    return value;
}

template <class T>
void StoreBytes(std::byte* p, T value) noexcept {
    std::memcpy(p, &value, sizeof value);
}

} // namespace Kernel
