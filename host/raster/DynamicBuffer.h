#pragma once
// Reference-counted interleaved images: DynamicBuffer (scratch pixels) and DynamicBitmap (a layer's pixels).

#include "host/kernel/Countable.h"
#include "host/kernel/Geometry.h"
#include "host/raster/PixelFormat.h"

#include <cstddef>
#include <cstdint>

namespace Raster {

// Size and format of an image, without its pixels.
class DynamicBase {
public:
    int GetWidth() const noexcept { return m_Width; }
    int GetHeight() const noexcept { return m_Height; }
    PixelFormat GetFormat() const noexcept { return m_Format; }
    // (0, 0, width, height) in the image's own pixel coordinates.
    Kernel::RectT<int> GetBounds() const noexcept { return {0, 0, m_Width, m_Height}; }

    static constexpr PixelFormat GetCompatibleMaskFormat(PixelFormat format) noexcept {
        return Raster::GetCompatibleMaskFormat(format);
    }

protected:
    DynamicBase(int width, int height, PixelFormat format) noexcept
        : m_Width(width)
        , m_Height(height)
        , m_Format(format) {}
    ~DynamicBase() = default;
    DynamicBase(const DynamicBase&) = default;
    DynamicBase& operator=(const DynamicBase&) = default;

private:
    int m_Width;
    int m_Height;
    PixelFormat m_Format;
};

// Pixels stored interleaved (all components of a pixel together, in channel order), rows top to bottom. Every
// row starts on a 64-byte boundary and the stride is a multiple of 64 bytes, an odd multiple from 1 KiB up
// (within the size limit); the padding after a row is never read as pixels. New buffers are all zero
// (transparent black).
class DynamicBuffer : public DynamicBase, public virtual Kernel::Countable {
public:
    static constexpr int MaxSide = 65536; // pixels, either side
    // Stride × height, row padding included: 2 GiB.
    static constexpr std::uint64_t MaxStorageBytes = std::uint64_t(1) << 31;
    static constexpr std::size_t RowAlignment = 64;

    // Null when a side is below 1 or above MaxSide, when the storage would exceed MaxStorageBytes, when the
    // format is not a valid PixelFormat, or when memory cannot be had.
    static Kernel::Counted<DynamicBuffer> Create(int width, int height, PixelFormat format);
    // A new buffer with the same size, format and pixels; null when memory cannot be had.
    Kernel::Counted<DynamicBuffer> Clone() const;

    // Storage in bytes that Create would allocate for this size, or 0 when Create refuses the size. Takes
    // 64-bit sides so that readers can check a file's claimed size before narrowing it.
    static std::uint64_t ComputeStorageBytes(std::int64_t width, std::int64_t height,
                                             PixelFormat format) noexcept;
    static bool IsSizeAllowed(std::int64_t width, std::int64_t height, PixelFormat format) noexcept {
        return ComputeStorageBytes(width, height, format) != 0;
    }

    DynamicBuffer(const DynamicBuffer&) = delete;
    DynamicBuffer& operator=(const DynamicBuffer&) = delete;

    std::ptrdiff_t Stride() const noexcept { return m_Stride; }
    int GetBytesPerPixel() const noexcept { return Raster::GetBytesPerPixel(GetFormat()); }
    // Bytes of one row that hold pixels (width × bytes per pixel).
    std::size_t GetRowBytes() const noexcept {
        return std::size_t(GetWidth()) * std::size_t(GetBytesPerPixel());
    }
    std::size_t GetStorageBytes() const noexcept { return std::size_t(m_Stride) * std::size_t(GetHeight()); }

    // Row y, 0 <= y < height. T is the component type or a pixel record of the buffer's format.
    std::byte* RowBytes(int y) noexcept { return m_Data + std::ptrdiff_t(y) * m_Stride; }
    const std::byte* RowBytes(int y) const noexcept { return m_Data + std::ptrdiff_t(y) * m_Stride; }
    template <class T>
    T* Row(int y) noexcept {
        static_assert(alignof(T) <= RowAlignment);
        return reinterpret_cast<T*>(RowBytes(y));
    }
    template <class T>
    const T* Row(int y) const noexcept {
        static_assert(alignof(T) <= RowAlignment);
        return reinterpret_cast<const T*>(RowBytes(y));
    }

protected:
    struct Storage {
        void* block = nullptr; // what the allocator returned; freed by the destructor
        std::byte* data = nullptr;
        std::ptrdiff_t stride = 0;
    };
    // Allocates zeroed storage for Create; block is null on failure or a refused size.
    static Storage AllocateStorage(int width, int height, PixelFormat format) noexcept;
    static void FreeStorage(Storage& storage) noexcept;

    DynamicBuffer(int width, int height, PixelFormat format, Storage storage) noexcept;
    ~DynamicBuffer() override;

private:
    void* m_Block;
    std::byte* m_Data;
    std::ptrdiff_t m_Stride;
};

// A layer's pixels: a DynamicBuffer in a layer format (IsLayerFormat) whose top-left pixel sits at an integer
// origin in document coordinates. It is a subclass, so everything that takes a DynamicBuffer takes a layer.
class DynamicBitmap : public DynamicBuffer {
public:
    // Null for a non-layer format and wherever DynamicBuffer::Create would give null.
    static Kernel::Counted<DynamicBitmap> Create(int width, int height, PixelFormat format,
                                                 Kernel::PointT<int> origin = {});

    Kernel::PointT<int> GetOrigin() const noexcept { return m_Origin; }
    void SetOrigin(Kernel::PointT<int> origin) noexcept { m_Origin = origin; }
    // The pixels' rectangle in document coordinates; saturates at the int range instead of overflowing.
    Kernel::RectT<int> GetDocumentBounds() const noexcept;

protected:
    DynamicBitmap(int width, int height, PixelFormat format, Storage storage,
                  Kernel::PointT<int> origin) noexcept;
    ~DynamicBitmap() override = default;

private:
    Kernel::PointT<int> m_Origin;
};

} // namespace Raster
