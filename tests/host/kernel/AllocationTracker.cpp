#include "AllocationTracker.h"

#include <atomic>
#include <cstdlib>
#include <new>

namespace {

std::atomic<int> g_Scopes{0};
std::atomic<std::size_t> g_Largest{0};

void Record(std::size_t size) noexcept {
    if (g_Scopes.load(std::memory_order_relaxed) == 0) return;
    std::size_t seen = g_Largest.load(std::memory_order_relaxed);
    while (size > seen && !g_Largest.compare_exchange_weak(seen, size, std::memory_order_relaxed)) {
    }
}

} // namespace

namespace KernelTests {

AllocationScope::AllocationScope() {
    g_Largest.store(0, std::memory_order_relaxed);
    g_Scopes.fetch_add(1, std::memory_order_relaxed);
}

AllocationScope::~AllocationScope() {
    g_Scopes.fetch_sub(1, std::memory_order_relaxed);
}

std::size_t AllocationScope::GetLargestRequest() const {
    return g_Largest.load(std::memory_order_relaxed);
}

} // namespace KernelTests

void* operator new(std::size_t size) {
    Record(size);
    if (void* p = std::malloc(size ? size : 1)) return p;
    throw std::bad_alloc();
}

void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
    Record(size);
    return std::malloc(size ? size : 1);
}

void operator delete(void* p) noexcept {
    std::free(p);
}
void operator delete(void* p, std::size_t) noexcept {
    std::free(p);
}
void operator delete(void* p, const std::nothrow_t&) noexcept {
    std::free(p);
}
