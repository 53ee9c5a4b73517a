// Device mirrors: rectangle bookkeeping and the copies between host pixels and device buffers.
#include "host/raster/HardwareCache.h"

namespace Raster {

namespace {

using Rect = Kernel::RectT<int>;

bool Overlaps(const Rect& a, const Rect& b) noexcept {
    return !a.Intersect(b).IsEmpty();
}

// Replaces every rectangle of list by its parts outside cut (at most four each).
void Subtract(std::vector<Rect>& list, const Rect& cut) {
    std::vector<Rect> result;
    result.reserve(list.size() + 4);
    for (const Rect& r : list) {
        if (!Overlaps(r, cut)) {
            result.push_back(r);
            continue;
        }
        const Rect inner = r.Intersect(cut);
        if (r.top < inner.top) result.push_back({r.left, r.top, r.right, inner.top});
        if (inner.bottom < r.bottom) result.push_back({r.left, inner.bottom, r.right, r.bottom});
        if (r.left < inner.left) result.push_back({r.left, inner.top, inner.left, inner.bottom});
        if (inner.right < r.right) result.push_back({inner.right, inner.top, r.right, inner.bottom});
    }
    list = std::move(result);
}

// Adds a rectangle that overlaps nothing in list, joining it to a neighbour that shares a whole side, so that
// the tiles of a render collapse into a few bands instead of growing the list tile by tile.
void Add(std::vector<Rect>& list, Rect r) {
    for (bool merged = true; merged;) {
        merged = false;
        for (auto it = list.begin(); it != list.end(); ++it) {
            const Rect& o = *it;
            const bool sameRows = o.top == r.top && o.bottom == r.bottom;
            const bool sameColumns = o.left == r.left && o.right == r.right;
            if ((sameRows && (o.right == r.left || r.right == o.left)) ||
                (sameColumns && (o.bottom == r.top || r.bottom == o.top))) {
                r = {std::min(o.left, r.left), std::min(o.top, r.top), std::max(o.right, r.right),
                     std::max(o.bottom, r.bottom)};
                list.erase(it);
                merged = true;
                break;
            }
        }
    }
    list.push_back(r);
}

bool AnyOverlaps(const std::vector<Rect>& list, const Rect& rect) {
    for (const Rect& r : list)
        if (Overlaps(r, rect)) return true;
    return false;
}

} // namespace

Kernel::Counted<HardwareCache> HardwareCache::Create(Kernel::Counted<DynamicBuffer> image) {
    if (!image) return nullptr;
    return Kernel::Counted<HardwareCache>(new HardwareCache(std::move(image)));
}

HardwareCache::HardwareCache(Kernel::Counted<DynamicBuffer> image)
    : m_Image(std::move(image))
    , m_HostNewer{m_Image->GetBounds()} {}

HardwareCache::~HardwareCache() = default;

const HardwareDevice* HardwareCache::GetDevice() const noexcept {
    std::lock_guard lock(m_Mutex);
    return m_Device.Get();
}

Kernel::Counted<HardwareBuffer> HardwareCache::GetHardwareBuffer() const {
    std::lock_guard lock(m_Mutex);
    return m_Buffer;
}

int HardwareCache::GetRetainCount() const noexcept {
    std::lock_guard lock(m_Mutex);
    return m_Retained;
}

bool HardwareCache::SyncHardwareCache(const HardwareDevice* device, const Rect& rect) {
    if (!device) return false;
    std::lock_guard lock(m_Mutex);
    if (!m_Device) {
        auto buffer = CreateHardwareBuffer(device, nullptr, 0, m_Image->GetWidth(), m_Image->GetHeight(),
                                           m_Image->GetBytesPerPixel());
        if (!buffer) return false;
        m_Device = Kernel::Counted<const HardwareDevice>(device);
        m_Buffer = std::move(buffer);
    } else if (m_Device.Get() != device) {
        return false;
    }
    const Rect area = rect.Intersect(m_Image->GetBounds());
    if (area.IsEmpty()) return true;
    for (const Rect& stale : m_HostNewer) {
        const Rect piece = stale.Intersect(area);
        if (piece.IsEmpty()) continue;
        if (!m_Buffer->Upload(m_Image->RowBytes(0), std::size_t(m_Image->Stride()), piece)) return false;
    }
    Subtract(m_HostNewer, area);
    return true;
}

bool HardwareCache::SyncHostCache(const Rect& rect) {
    std::lock_guard lock(m_Mutex);
    const Rect area = rect.Intersect(m_Image->GetBounds());
    if (area.IsEmpty() || m_DeviceNewer.empty()) return true;
    for (const Rect& stale : m_DeviceNewer) {
        const Rect piece = stale.Intersect(area);
        if (piece.IsEmpty()) continue;
        if (!m_Buffer->Download(m_Image->RowBytes(0), std::size_t(m_Image->Stride()), piece)) return false;
    }
    Subtract(m_DeviceNewer, area);
    return true;
}

void HardwareCache::InvalidateHardwareCache(const Rect& rect) {
    std::lock_guard lock(m_Mutex);
    const Rect area = rect.Intersect(m_Image->GetBounds());
    if (area.IsEmpty()) return;
    Subtract(m_DeviceNewer, area);
    Subtract(m_HostNewer, area);
    Add(m_HostNewer, area);
}

void HardwareCache::InvalidateHostCache(const Rect& rect) {
    std::lock_guard lock(m_Mutex);
    const Rect area = rect.Intersect(m_Image->GetBounds());
    if (area.IsEmpty() || !m_Device) return;
    Subtract(m_HostNewer, area);
    Subtract(m_DeviceNewer, area);
    Add(m_DeviceNewer, area);
}

bool HardwareCache::IsHostCurrent(const Rect& rect) const {
    std::lock_guard lock(m_Mutex);
    return !AnyOverlaps(m_DeviceNewer, rect);
}

bool HardwareCache::IsHardwareCurrent(const Rect& rect) const {
    std::lock_guard lock(m_Mutex);
    return m_Device && !AnyOverlaps(m_HostNewer, rect);
}

// ---- Leases, retention, prolongation

HardwareCacheLease::HardwareCacheLease(Kernel::Counted<HardwareCache> cache)
    : m_Cache(std::move(cache)) {
    std::lock_guard lock(m_Cache->m_Mutex);
    ++m_Cache->m_Retained;
}

HardwareCacheLease::~HardwareCacheLease() {
    std::lock_guard lock(m_Cache->m_Mutex);
    --m_Cache->m_Retained;
}

void Prolongation::Keep(HardwareRetention retention) {
    std::lock_guard lock(m_Mutex);
    m_Kept.push_back(std::move(retention));
}

std::size_t Prolongation::GetKeptCount() const {
    std::lock_guard lock(m_Mutex);
    return m_Kept.size();
}

HardwareRetention RetainHardwareBuffer(const HardwareDevice* device, const HardwareQueue& queue,
                                       const Kernel::Counted<HardwareCache>& cache, const Rect& rect) {
    if (!device || !queue.IsOn(device) || !cache || cache->GetDevice() != device) return {};
    HardwareRetention retention;
    retention.buffer = cache->GetHardwareBuffer();
    if (!retention.buffer) return {};
    retention.rect = rect.Intersect(cache->GetImage().GetBounds());
    retention.interlock = Kernel::MakeCounted<HardwareCacheLease>(cache);
    return retention;
}

} // namespace Raster
