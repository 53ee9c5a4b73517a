#pragma once
// Device memory holding one image, its copies to and from host pixels, and the device-buffer semaphore.

#include "host/kernel/Geometry.h"
#include "host/raster/device/Hardware.h"

#include <cstddef>
#include <memory>
#include <mutex>

namespace Raster {

namespace Detail {
class DeviceAllocation;
}

// width × height pixels of bytesPerPixel bytes, rows packed without padding on the device (a kernel finds
// pixel (x, y) at element y * width + x). Freed memory goes back to the device's pool for reuse.
class HardwareBuffer : public virtual Kernel::Countable {
public:
    static constexpr int MaxBytesPerPixel = 64;

    const HardwareDevice* GetDevice() const noexcept { return m_Device.Get(); }
    int GetWidth() const noexcept { return m_Width; }
    int GetHeight() const noexcept { return m_Height; }
    int GetBytesPerPixel() const noexcept { return m_BytesPerPixel; }
    std::size_t GetRowBytes() const noexcept { return static_cast<std::size_t>(m_Width) * m_BytesPerPixel; }
    std::size_t GetByteSize() const noexcept { return GetRowBytes() * static_cast<std::size_t>(m_Height); }
    Kernel::RectT<int> GetBounds() const noexcept { return {0, 0, m_Width, m_Height}; }

    // Copies rect of a host image into the same rect of this buffer. hostPixels is the host image's pixel
    // (0, 0), its rows hostStride bytes apart; the image has this buffer's width, height and pixel size.
    // False (and nothing copied) for a rect outside the buffer or a stride shorter than a row; an empty rect
    // copies nothing and succeeds.
    bool Upload(const void* hostPixels, std::size_t hostStride, const Kernel::RectT<int>& rect);
    bool Upload(const void* hostPixels, std::size_t hostStride) {
        return Upload(hostPixels, hostStride, GetBounds());
    }
    // The reverse: rect of this buffer into the same rect of the host image; bytes outside it stay untouched.
    bool Download(void* hostPixels, std::size_t hostStride, const Kernel::RectT<int>& rect) const;
    bool Download(void* hostPixels, std::size_t hostStride) const {
        return Download(hostPixels, hostStride, GetBounds());
    }

    // For the device layer.
    Detail::DeviceAllocation& GetAllocation() const noexcept { return *m_Allocation; }

    // Internal: made by CreateHardwareBuffer.
    HardwareBuffer(Kernel::Counted<const HardwareDevice> device,
                   std::unique_ptr<Detail::DeviceAllocation> allocation, int width, int height,
                   int bytesPerPixel);

protected:
    ~HardwareBuffer() override;

private:
    Kernel::Counted<const HardwareDevice> m_Device;
    std::unique_ptr<Detail::DeviceAllocation> m_Allocation;
    int m_Width;
    int m_Height;
    int m_BytesPerPixel;
};

// A buffer on the device, filled from host memory when hostPixels is not null (left undefined otherwise).
// Null for no device, a describing-only device, sizes that are not positive, more than MaxBytesPerPixel,
// more than the device can allocate, or a failed copy.
Kernel::Counted<HardwareBuffer> CreateHardwareBuffer(const HardwareDevice* device, const void* hostPixels,
                                                     std::size_t hostStride, int width, int height,
                                                     int bytesPerPixel);

struct HardwareBufferPoolStatistics {
    long allocations = 0;        // fresh device allocations
    long reuses = 0;             // allocations served from the pool
    std::size_t pooledBytes = 0; // memory kept for reuse now
};

HardwareBufferPoolStatistics GetHardwareBufferPoolStatistics(const HardwareDevice* device);
// Frees the memory the pool keeps (not the memory of live buffers).
void TrimHardwareBufferPool(const HardwareDevice* device);

// Holds the process-wide device-buffer semaphore. Callers take it before syncing bitmap caches and keep it
// until their kernel is queued, so that two renders never interleave buffer retention. The same thread may
// take it again while holding it.
class HardwareBufferSemaphoreGuard {
public:
    HardwareBufferSemaphoreGuard() = default;
    explicit HardwareBufferSemaphoreGuard(std::unique_lock<std::recursive_mutex> lock)
        : m_Lock(std::move(lock)) {}
    HardwareBufferSemaphoreGuard(HardwareBufferSemaphoreGuard&&) noexcept = default;
    HardwareBufferSemaphoreGuard& operator=(HardwareBufferSemaphoreGuard&&) noexcept = default;

    bool OwnsSemaphore() const noexcept { return m_Lock.owns_lock(); }
    void Release() {
        if (m_Lock.owns_lock()) m_Lock.unlock();
    }

private:
    std::unique_lock<std::recursive_mutex> m_Lock;
};

// Blocks until the semaphore is free. The device is accepted for callers that name one; the semaphore is
// shared by all devices.
HardwareBufferSemaphoreGuard GetRetainHardwareBufferSemaphoreGuard(const HardwareDevice* device = nullptr);
// Does not block: the guard owns nothing when another thread holds the semaphore.
HardwareBufferSemaphoreGuard TryGetRetainHardwareBufferSemaphoreGuard(const HardwareDevice* device = nullptr);

} // namespace Raster
