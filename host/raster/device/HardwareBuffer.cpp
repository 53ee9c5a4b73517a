// Device buffers, their rectangle copies, the per-device pool and the device-buffer semaphore.
#include "host/raster/device/HardwareBuffer.h"

#include "host/raster/device/detail/DeviceState.h"

#include <optional>

namespace Raster {

namespace {

std::recursive_mutex& BufferSemaphore() {
    static std::recursive_mutex semaphore;
    return semaphore;
}

// The copy of rect between a host image and a buffer, or nothing when rect or stride do not fit.
std::optional<Detail::RectCopy> PlanCopy(const HardwareBuffer& buffer, std::size_t hostStride,
                                         const Kernel::RectT<int>& rect) {
    if (rect.left < 0 || rect.top < 0 || rect.right > buffer.GetWidth() || rect.bottom > buffer.GetHeight()) {
        Detail::Fail("the rectangle reaches outside the buffer");
        return std::nullopt;
    }
    if (hostStride < buffer.GetRowBytes()) {
        Detail::Fail("the host stride is shorter than a row of the buffer");
        return std::nullopt;
    }
    const auto bpp = static_cast<std::size_t>(buffer.GetBytesPerPixel());
    Detail::RectCopy copy;
    copy.xBytes = static_cast<std::size_t>(rect.left) * bpp;
    copy.y = static_cast<std::size_t>(rect.top);
    copy.widthBytes = static_cast<std::size_t>(rect.Width()) * bpp;
    copy.rows = static_cast<std::size_t>(rect.Height());
    copy.devicePitch = buffer.GetRowBytes();
    copy.hostPitch = hostStride;
    return copy;
}

} // namespace

HardwareBuffer::HardwareBuffer(Kernel::Counted<const HardwareDevice> device,
                               std::unique_ptr<Detail::DeviceAllocation> allocation, int width, int height,
                               int bytesPerPixel)
    : m_Device(std::move(device))
    , m_Allocation(std::move(allocation))
    , m_Width(width)
    , m_Height(height)
    , m_BytesPerPixel(bytesPerPixel) {}

HardwareBuffer::~HardwareBuffer() {
    m_Device->GetBufferPool().Give(std::move(m_Allocation));
}

bool HardwareBuffer::Upload(const void* hostPixels, std::size_t hostStride, const Kernel::RectT<int>& rect) {
    if (!hostPixels) return Detail::Fail("no host pixels to upload");
    if (rect.IsEmpty()) return true;
    const auto copy = PlanCopy(*this, hostStride, rect);
    if (!copy) return false;
    try {
        return m_Device->GetImplementation()->CopyToDevice(*m_Allocation, *copy, hostPixels);
    } catch (...) {
        return Detail::Fail("the upload failed");
    }
}

bool HardwareBuffer::Download(void* hostPixels, std::size_t hostStride,
                              const Kernel::RectT<int>& rect) const {
    if (!hostPixels) return Detail::Fail("no host pixels to download into");
    if (rect.IsEmpty()) return true;
    const auto copy = PlanCopy(*this, hostStride, rect);
    if (!copy) return false;
    try {
        return m_Device->GetImplementation()->CopyToHost(*m_Allocation, *copy, hostPixels);
    } catch (...) {
        return Detail::Fail("the download failed");
    }
}

Kernel::Counted<HardwareBuffer> CreateHardwareBuffer(const HardwareDevice* device, const void* hostPixels,
                                                     std::size_t hostStride, int width, int height,
                                                     int bytesPerPixel) {
    if (!device || !device->GetImplementation()) {
        Detail::Fail("no compute device");
        return {};
    }
    if (width <= 0 || height <= 0 || bytesPerPixel <= 0 || bytesPerPixel > HardwareBuffer::MaxBytesPerPixel) {
        Detail::Fail("buffer sizes out of range");
        return {};
    }
    // width × height fits in 64 bits; the pixel size is checked against the limit before multiplying by it.
    const auto pixels = static_cast<std::size_t>(width) * static_cast<std::size_t>(height);
    auto& backEnd = *device->GetImplementation();
    const auto bpp = static_cast<std::size_t>(bytesPerPixel);
    if (pixels > backEnd.GetMaxAllocationBytes() / bpp) {
        Detail::Fail("the buffer is larger than the device can allocate");
        return {};
    }
    const std::size_t bytes = pixels * bpp;
    try {
        auto allocation = device->GetBufferPool().Take(backEnd, bytes);
        if (!allocation) return {};
        Kernel::Counted<HardwareBuffer> buffer(
            new HardwareBuffer(Kernel::Counted<const HardwareDevice>(device), std::move(allocation), width,
                               height, bytesPerPixel));
        if (hostPixels && !buffer->Upload(hostPixels, hostStride)) return {};
        return buffer;
    } catch (...) {
        Detail::Fail("out of memory creating a buffer");
        return {};
    }
}

HardwareBufferPoolStatistics GetHardwareBufferPoolStatistics(const HardwareDevice* device) {
    return device ? device->GetBufferPool().GetStatistics() : HardwareBufferPoolStatistics{};
}

void TrimHardwareBufferPool(const HardwareDevice* device) {
    if (device) device->GetBufferPool().Trim();
}

HardwareBufferSemaphoreGuard GetRetainHardwareBufferSemaphoreGuard(const HardwareDevice*) {
    return HardwareBufferSemaphoreGuard(std::unique_lock(BufferSemaphore()));
}

HardwareBufferSemaphoreGuard TryGetRetainHardwareBufferSemaphoreGuard(const HardwareDevice*) {
    return HardwareBufferSemaphoreGuard(std::unique_lock(BufferSemaphore(), std::try_to_lock));
}

namespace Detail {

std::unique_ptr<DeviceAllocation> BufferPool::Take(DeviceBackEnd& backEnd, std::size_t bytes) {
    {
        std::lock_guard lock(m_Mutex);
        if (const auto found = m_Free.find(bytes); found != m_Free.end()) {
            auto allocation = std::move(found->second);
            m_Free.erase(found);
            m_PooledBytes -= bytes;
            ++m_Reuses;
            return allocation;
        }
    }
    auto allocation = backEnd.Allocate(bytes);
    if (allocation) {
        std::lock_guard lock(m_Mutex);
        ++m_Allocations;
    }
    return allocation;
}

void BufferPool::Give(std::unique_ptr<DeviceAllocation> allocation) noexcept {
    if (!allocation) return;
    const std::size_t bytes = allocation->GetByteSize();
    std::lock_guard lock(m_Mutex);
    if (bytes > MaxPooledBytes - m_PooledBytes) return; // over the limit: freed as it leaves scope
    try {
        m_Free.emplace(bytes, std::move(allocation));
        m_PooledBytes += bytes;
    } catch (...) {
        // No room to remember it: the allocation is simply freed.
    }
}

void BufferPool::Trim() noexcept {
    std::multimap<std::size_t, std::unique_ptr<DeviceAllocation>> freed;
    {
        std::lock_guard lock(m_Mutex);
        freed.swap(m_Free);
        m_PooledBytes = 0;
    }
}

HardwareBufferPoolStatistics BufferPool::GetStatistics() const {
    std::lock_guard lock(m_Mutex);
    return {m_Allocations, m_Reuses, m_PooledBytes};
}

} // namespace Detail

} // namespace Raster
