#include "host/raster/DynamicBuffer.h"

#include <sys/mman.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <new>

namespace Raster {

std::uint64_t DynamicBuffer::ComputeStorageBytes(std::int64_t width, std::int64_t height,
                                                 PixelFormat format) noexcept {
    if (!IsValidPixelFormat(format)) return 0;
    if (width < 1 || height < 1 || width > MaxSide || height > MaxSide) return 0;
    // Both sides are at most 2^16 and a pixel at most 16 bytes, so nothing here can overflow 64 bits.
    const std::uint64_t rowBytes = std::uint64_t(width) * std::uint64_t(Raster::GetBytesPerPixel(format));
    const std::uint64_t aligned = (rowBytes + RowAlignment - 1) / RowAlignment * RowAlignment;
    // Rows a power of two apart share cache sets, so that a walk down a column (a rotated or transposed
    // read) keeps only a few rows cached. An odd number of cache lines per row spreads the rows over every
    // set; where that extra line would break the size limit, the buffer keeps its plain stride.
    const std::uint64_t spread =
        aligned >= 1024 && aligned / RowAlignment % 2 == 0 ? aligned + RowAlignment : aligned;
    for (const std::uint64_t stride : {spread, aligned}) {
        const std::uint64_t total = stride * std::uint64_t(height);
        if (total <= MaxStorageBytes) return total;
    }
    return 0;
}

namespace {

// Large blocks ask for transparent huge pages: a fresh 64 MB destination otherwise takes sixteen thousand
// page faults on first write, which cost a fast filter a fifth of its time and serialise threads that fault
// at once.
void AdviseHugePages(void* block, std::size_t bytes) noexcept {
    constexpr std::uintptr_t HugePage = std::uintptr_t(2) << 20;
    if (bytes < 4 * HugePage) return;
    const auto begin = reinterpret_cast<std::uintptr_t>(block);
    const std::uintptr_t first = (begin + HugePage - 1) & ~(HugePage - 1);
    const std::uintptr_t last = (begin + bytes) & ~(HugePage - 1);
    // Advice only: a kernel without huge pages refuses it and the block works as before.
    if (last > first) (void)madvise(reinterpret_cast<void*>(first), last - first, MADV_HUGEPAGE);
}

} // namespace

DynamicBuffer::Storage DynamicBuffer::AllocateStorage(int width, int height, PixelFormat format) noexcept {
    Storage storage;
    const std::uint64_t total = ComputeStorageBytes(width, height, format);
    if (total == 0) return storage;
    // calloc rather than an aligned allocation and a memset: large blocks come as fresh zero pages, so a big
    // buffer costs nothing until it is written. The extra bytes let the start be moved to a 64-byte boundary.
    void* block = std::calloc(std::size_t(total) + RowAlignment, 1);
    if (!block) return storage;
    AdviseHugePages(block, std::size_t(total) + RowAlignment);
    const auto address = reinterpret_cast<std::uintptr_t>(block);
    const std::uintptr_t aligned = (address + RowAlignment - 1) & ~std::uintptr_t(RowAlignment - 1);
    storage.block = block;
    storage.data = static_cast<std::byte*>(block) + (aligned - address);
    storage.stride = std::ptrdiff_t(total / std::uint64_t(height));
    return storage;
}

void DynamicBuffer::FreeStorage(Storage& storage) noexcept {
    std::free(storage.block);
    storage = {};
}

Kernel::Counted<DynamicBuffer> DynamicBuffer::Create(int width, int height, PixelFormat format) {
    Storage storage = AllocateStorage(width, height, format);
    if (!storage.block) return nullptr;
    auto* buffer = new (std::nothrow) DynamicBuffer(width, height, format, storage);
    if (!buffer) {
        FreeStorage(storage);
        return nullptr;
    }
    return Kernel::Counted<DynamicBuffer>(buffer);
}

Kernel::Counted<DynamicBuffer> DynamicBuffer::Clone() const {
    Kernel::Counted<DynamicBuffer> copy = Create(GetWidth(), GetHeight(), GetFormat());
    if (copy) std::memcpy(copy->m_Data, m_Data, GetStorageBytes());
    return copy;
}

DynamicBuffer::DynamicBuffer(int width, int height, PixelFormat format, Storage storage) noexcept
    : DynamicBase(width, height, format)
    , m_Block(storage.block)
    , m_Data(storage.data)
    , m_Stride(storage.stride) {}

DynamicBuffer::~DynamicBuffer() {
    std::free(m_Block);
}

Kernel::Counted<DynamicBitmap> DynamicBitmap::Create(int width, int height, PixelFormat format,
                                                     Kernel::PointT<int> origin) {
    if (!IsValidPixelFormat(format) || !IsLayerFormat(format)) return nullptr;
    Storage storage = AllocateStorage(width, height, format);
    if (!storage.block) return nullptr;
    auto* bitmap = new (std::nothrow) DynamicBitmap(width, height, format, storage, origin);
    if (!bitmap) {
        FreeStorage(storage);
        return nullptr;
    }
    return Kernel::Counted<DynamicBitmap>(bitmap);
}

DynamicBitmap::DynamicBitmap(int width, int height, PixelFormat format, Storage storage,
                             Kernel::PointT<int> origin) noexcept
    : DynamicBuffer(width, height, format, storage)
    , m_Origin(origin) {}

Kernel::RectT<int> DynamicBitmap::GetDocumentBounds() const noexcept {
    constexpr std::int64_t lowest = std::numeric_limits<int>::min();
    constexpr std::int64_t highest = std::numeric_limits<int>::max();
    auto clamp = [&](std::int64_t v) { return int(std::clamp(v, lowest, highest)); };
    return {m_Origin.x, m_Origin.y, clamp(std::int64_t(m_Origin.x) + GetWidth()),
            clamp(std::int64_t(m_Origin.y) + GetHeight())};
}

} // namespace Raster
