#pragma once
// The device mirror of one image: which rectangles each side holds newest, and the copies that bring a side
// up to date. Renders share one mirror per image, so a source is uploaded once for all the tiles of a render.

#include "host/kernel/Countable.h"
#include "host/kernel/Geometry.h"
#include "host/raster/DynamicBuffer.h"
#include "host/raster/device/HardwareBuffer.h"

#include <mutex>
#include <vector>

namespace Raster {

class HardwareCache : public virtual Kernel::Countable {
public:
    // A mirror of image, bound to a device on its first SyncHardwareCache. Null for a null image.
    static Kernel::Counted<HardwareCache> Create(Kernel::Counted<DynamicBuffer> image);

    DynamicBuffer& GetImage() const noexcept { return *m_Image; }
    // The device the mirror lives on; null before the first device sync.
    const HardwareDevice* GetDevice() const noexcept;

    // Makes the device copy current inside rect (clipped to the image), copying from the host where the
    // host holds newer pixels. Binds the mirror to device on first use. False for no device, a device other
    // than the bound one, or a failed allocation or copy; the bookkeeping then stays as it was.
    bool SyncHardwareCache(const HardwareDevice* device, const Kernel::RectT<int>& rect);
    // Makes the host pixels current inside rect, copying from the device where it holds newer pixels.
    bool SyncHostCache(const Kernel::RectT<int>& rect);
    // The host's pixels in rect changed: the device copy is stale there.
    void InvalidateHardwareCache(const Kernel::RectT<int>& rect);
    // The device's pixels in rect changed: the host copy is stale there.
    void InvalidateHostCache(const Kernel::RectT<int>& rect);

    // The device buffer; null before the first device sync.
    Kernel::Counted<HardwareBuffer> GetHardwareBuffer() const;

    // Whether each side holds the newest pixels everywhere inside rect.
    bool IsHostCurrent(const Kernel::RectT<int>& rect) const;
    bool IsHardwareCurrent(const Kernel::RectT<int>& rect) const;

    // Renders using the device buffer right now; the mirror neither drops nor replaces it meanwhile.
    int GetRetainCount() const noexcept;

protected:
    explicit HardwareCache(Kernel::Counted<DynamicBuffer> image);
    ~HardwareCache() override;

private:
    friend class HardwareCacheLease;
    using RectList = std::vector<Kernel::RectT<int>>;

    Kernel::Counted<DynamicBuffer> m_Image;
    mutable std::mutex m_Mutex;
    Kernel::Counted<const HardwareDevice> m_Device;
    Kernel::Counted<HardwareBuffer> m_Buffer;
    RectList m_HostNewer;   // the device copy is stale here
    RectList m_DeviceNewer; // the host copy is stale here
    int m_Retained = 0;
};

// Marks a mirror's device buffer as in use by a kernel for as long as it lives.
class HardwareCacheLease : public virtual Kernel::Countable {
public:
    explicit HardwareCacheLease(Kernel::Counted<HardwareCache> cache);
    HardwareCacheLease(const HardwareCacheLease&) = delete;
    HardwareCacheLease& operator=(const HardwareCacheLease&) = delete;

protected:
    ~HardwareCacheLease() override;

private:
    Kernel::Counted<HardwareCache> m_Cache;
};

// What RetainHardwareBuffer hands out for one image of a kernel: the buffer to bind, the rectangle the kernel
// may touch, and the interlock that keeps the mirror's buffer in place until the device work is done.
struct HardwareRetention {
    Kernel::Counted<HardwareBuffer> buffer;
    Kernel::RectT<int> rect{};
    Kernel::Counted<HardwareCacheLease> interlock;
    explicit operator bool() const noexcept { return bool(buffer); }
};

// Keeps what a kernel uses alive until its device work has completed; the executor releases it then.
// Subclasses hold their own retentions.
class Prolongation : public virtual Kernel::Countable {
public:
    Prolongation() = default;
    Prolongation(const Prolongation&) = delete;
    Prolongation& operator=(const Prolongation&) = delete;

    // Keeps retention alive with this prolongation.
    void Keep(HardwareRetention retention);
    std::size_t GetKeptCount() const;

protected:
    ~Prolongation() override = default;

private:
    mutable std::mutex m_Mutex;
    std::vector<HardwareRetention> m_Kept;
};

// The mirror's device buffer for a kernel on device's queue over rect; the mirror must already be
// synchronised to device (SyncHardwareCache). Empty for another device, a queue that is not the device's, or
// a mirror without a buffer.
HardwareRetention RetainHardwareBuffer(const HardwareDevice* device, const HardwareQueue& queue,
                                       const Kernel::Counted<HardwareCache>& cache,
                                       const Kernel::RectT<int>& rect);

} // namespace Raster
