#pragma once
// Per-device state kept beside the back end: the kernel cache and the buffer pool. Internal to HostDevice.

#include "host/raster/device/HardwareBuffer.h"
#include "host/raster/device/HardwareKernel.h"
#include "host/raster/device/detail/BackEnd.h"

#include <atomic>
#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <shared_mutex>
#include <unordered_map>
#include <vector>

namespace Raster::Detail {

class KernelCache {
public:
    explicit KernelCache(const HardwareDevice* device)
        : m_Device(device) {}

    Kernel::Counted<HardwareKernel> Find(const HardwareKernelDescriptor& descriptor) const;
    // The cached kernel, or a new one in the queued state (created is then true). Null when the device
    // cannot compile or the descriptor is incomplete.
    Kernel::Counted<HardwareKernel> FindOrCreate(const HardwareKernelDescriptor& descriptor, bool& created);

    // Compiles kernel on the calling thread when no other thread has started it; returns at once otherwise.
    static void CompileIfUnclaimed(HardwareKernel& kernel);
    void CountCompilation(bool failed) noexcept;
    HardwareKernelCacheStatistics GetStatistics() const;

private:
    static std::size_t Hash(const HardwareKernelDescriptor& descriptor) noexcept;
    Kernel::Counted<HardwareKernel> FindLocked(const HardwareKernelDescriptor& descriptor,
                                               std::size_t hash) const;

    const HardwareDevice* m_Device;
    mutable std::shared_mutex m_Mutex;
    std::unordered_map<std::size_t, std::vector<Kernel::Counted<HardwareKernel>>> m_Kernels;
    std::size_t m_Count = 0;
    std::atomic<long> m_Compilations{0};
    std::atomic<long> m_Failures{0};
};

// Device allocations kept for reuse, matched by exact size; beyond a byte limit they are freed instead.
class BufferPool {
public:
    static constexpr std::size_t MaxPooledBytes = std::size_t{256} << 20;

    std::unique_ptr<DeviceAllocation> Take(DeviceBackEnd& backEnd, std::size_t bytes);
    void Give(std::unique_ptr<DeviceAllocation> allocation) noexcept;
    void Trim() noexcept;
    HardwareBufferPoolStatistics GetStatistics() const;

private:
    mutable std::mutex m_Mutex;
    std::multimap<std::size_t, std::unique_ptr<DeviceAllocation>> m_Free;
    std::size_t m_PooledBytes = 0;
    long m_Allocations = 0;
    long m_Reuses = 0;
};

} // namespace Raster::Detail
