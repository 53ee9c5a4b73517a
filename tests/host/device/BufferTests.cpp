// Device buffers: rectangle copies between strided host images and the device, refusals, the pool.
#include "DeviceTestSupport.h"

#include <cstring>
#include <limits>

using namespace Raster;

namespace {

struct HostImage {
    int width, height, bpp;
    std::size_t stride;
    std::vector<std::uint8_t> bytes;

    HostImage(int w, int h, int b, std::size_t padding, std::uint8_t fill)
        : width(w)
        , height(h)
        , bpp(b)
        , stride(static_cast<std::size_t>(w * b) + padding)
        , bytes(stride * h, fill) {}

    std::uint8_t* Pixel(int x, int y) { return bytes.data() + y * stride + x * bpp; }
    // Every byte of every pixel distinct for this seed, so a shifted copy cannot pass.
    void Pattern(int seed) {
        for (int y = 0; y < height; ++y)
            for (int x = 0; x < width; ++x)
                for (int c = 0; c < bpp; ++c)
                    Pixel(x, y)[c] = static_cast<std::uint8_t>(seed + x * 7 + y * 53 + c * 131);
    }
};

} // namespace

TEST(HardwareBuffer, SubRectangleRoundTripsExactlyForEveryPixelSize) {
    REQUIRE_OPENCL_DEVICE(device);
    const Kernel::RectT<int> rect{2, 1, 7, 5};
    for (const int bpp : {1, 3, 4, 16}) {
        SCOPED_TRACE("bytes per pixel " + std::to_string(bpp));
        HostImage a(9, 6, bpp, 7, 0xA1), b(9, 6, bpp, 3, 0xB2);
        a.Pattern(1);
        b.Pattern(100);
        auto buffer = CreateHardwareBuffer(device.Get(), a.bytes.data(), a.stride, 9, 6, bpp);
        ASSERT_TRUE(buffer) << GetLastHardwareError();
        EXPECT_EQ(buffer->GetByteSize(), static_cast<std::size_t>(9 * 6 * bpp));

        // b's rectangle over a, read back whole into an image of a third stride.
        ASSERT_TRUE(buffer->Upload(b.bytes.data(), b.stride, rect)) << GetLastHardwareError();
        HostImage whole(9, 6, bpp, 5, 0xCD);
        ASSERT_TRUE(buffer->Download(whole.bytes.data(), whole.stride)) << GetLastHardwareError();
        for (int y = 0; y < 6; ++y) {
            for (int x = 0; x < 9; ++x) {
                const bool inside = x >= rect.left && x < rect.right && y >= rect.top && y < rect.bottom;
                HostImage& source = inside ? b : a;
                EXPECT_EQ(std::memcmp(whole.Pixel(x, y), source.Pixel(x, y), bpp), 0) << x << "," << y;
            }
            for (std::size_t p = 9 * bpp; p < whole.stride; ++p)
                EXPECT_EQ(whole.bytes[y * whole.stride + p], 0xCD);
        }

        // Reading a rectangle writes that rectangle only.
        HostImage part(9, 6, bpp, 1, 0x5A);
        ASSERT_TRUE(buffer->Download(part.bytes.data(), part.stride, {3, 2, 5, 6}));
        const std::vector<std::uint8_t> untouched(bpp, 0x5A);
        for (int y = 0; y < 6; ++y)
            for (int x = 0; x < 9; ++x) {
                const bool inside = x >= 3 && x < 5 && y >= 2;
                const std::uint8_t* expected = inside ? whole.Pixel(x, y) : untouched.data();
                EXPECT_EQ(std::memcmp(part.Pixel(x, y), expected, bpp), 0) << x << "," << y;
            }
    }
}

TEST(HardwareBuffer, RefusesRectanglesAndStridesThatDoNotFit) {
    REQUIRE_OPENCL_DEVICE(device);
    HostImage image(5, 4, 4, 0, 0x11);
    image.Pattern(9);
    auto buffer = CreateHardwareBuffer(device.Get(), image.bytes.data(), image.stride, 5, 4, 4);
    ASSERT_TRUE(buffer);
    HostImage target(5, 4, 4, 0, 0x22);
    const auto pristine = target.bytes;
    for (const Kernel::RectT<int> rect :
         {Kernel::RectT<int>{-1, 0, 2, 2}, {0, -1, 2, 2}, {0, 0, 6, 2}, {0, 0, 2, 5}, {4, 3, 9, 9}}) {
        EXPECT_FALSE(buffer->Download(target.bytes.data(), target.stride, rect));
        EXPECT_FALSE(buffer->Upload(image.bytes.data(), image.stride, rect));
    }
    EXPECT_FALSE(buffer->Download(target.bytes.data(), 5 * 4 - 1)) << "stride shorter than a row";
    EXPECT_FALSE(buffer->Upload(image.bytes.data(), 0));
    EXPECT_FALSE(buffer->Download(nullptr, target.stride));
    EXPECT_FALSE(buffer->Upload(nullptr, image.stride));
    EXPECT_EQ(target.bytes, pristine) << "a refused copy writes nothing";
    // An empty rectangle is nothing to do, wherever it lies.
    EXPECT_TRUE(buffer->Download(target.bytes.data(), target.stride, {3, 3, 3, 9}));
    EXPECT_TRUE(buffer->Download(target.bytes.data(), target.stride, {-9, -9, -9, -9}));
    EXPECT_EQ(target.bytes, pristine);
}

TEST(HardwareBuffer, RefusesImpossibleSizes) {
    EXPECT_EQ(CreateHardwareBuffer(nullptr, nullptr, 0, 4, 4, 4), nullptr);
    REQUIRE_OPENCL_DEVICE(device);
    const int huge = std::numeric_limits<int>::max();
    EXPECT_EQ(CreateHardwareBuffer(device.Get(), nullptr, 0, 0, 4, 4), nullptr);
    EXPECT_EQ(CreateHardwareBuffer(device.Get(), nullptr, 0, 4, -1, 4), nullptr);
    EXPECT_EQ(CreateHardwareBuffer(device.Get(), nullptr, 0, 4, 4, 0), nullptr);
    EXPECT_EQ(CreateHardwareBuffer(device.Get(), nullptr, 0, 4, 4, HardwareBuffer::MaxBytesPerPixel + 1),
              nullptr);
    EXPECT_EQ(CreateHardwareBuffer(device.Get(), nullptr, 0, huge, huge, HardwareBuffer::MaxBytesPerPixel),
              nullptr);
    // Initial pixels with a stride shorter than a row are refused rather than read out of bounds.
    const std::vector<std::uint8_t> pixels(64);
    EXPECT_EQ(CreateHardwareBuffer(device.Get(), pixels.data(), 3, 4, 4, 1), nullptr);
}

TEST(HardwareBuffer, ReleasedMemoryIsReusedFromThePool) {
    REQUIRE_OPENCL_DEVICE(device);
    TrimHardwareBufferPool(device.Get());
    const auto start = GetHardwareBufferPoolStatistics(device.Get());
    EXPECT_EQ(start.pooledBytes, 0u);
    // A size no other test uses.
    auto first = CreateHardwareBuffer(device.Get(), nullptr, 0, 13, 7, 4);
    ASSERT_TRUE(first);
    EXPECT_EQ(GetHardwareBufferPoolStatistics(device.Get()).allocations, start.allocations + 1);
    first.Reset();
    EXPECT_EQ(GetHardwareBufferPoolStatistics(device.Get()).pooledBytes, 13u * 7 * 4);

    // Same byte size, other shape: served from the pool, and its new contents are exactly what was uploaded.
    HostImage image(7, 13, 4, 0, 0);
    image.Pattern(77);
    auto second = CreateHardwareBuffer(device.Get(), image.bytes.data(), image.stride, 7, 13, 4);
    ASSERT_TRUE(second);
    const auto reused = GetHardwareBufferPoolStatistics(device.Get());
    EXPECT_EQ(reused.allocations, start.allocations + 1);
    EXPECT_EQ(reused.reuses, start.reuses + 1);
    EXPECT_EQ(reused.pooledBytes, 0u);
    HostImage back(7, 13, 4, 0, 0);
    ASSERT_TRUE(second->Download(back.bytes.data(), back.stride));
    EXPECT_EQ(back.bytes, image.bytes);

    second.Reset();
    TrimHardwareBufferPool(device.Get());
    EXPECT_EQ(GetHardwareBufferPoolStatistics(device.Get()).pooledBytes, 0u);
}

TEST(HardwareBuffer, IdentityBufferIsOneZeroPixelSharedPerDevice) {
    EXPECT_EQ(Hardware::GetIdentityBuffer(nullptr), nullptr);
    REQUIRE_OPENCL_DEVICE(device);
    const auto identity = Hardware::GetIdentityBuffer(device.Get());
    ASSERT_TRUE(identity);
    EXPECT_EQ(Hardware::GetIdentityBuffer(device.Get()), identity);
    EXPECT_EQ(identity->GetDevice(), device.Get());
    std::vector<std::uint8_t> bytes(identity->GetByteSize(), 0xFF);
    ASSERT_TRUE(identity->Download(bytes.data(), identity->GetRowBytes()));
    EXPECT_EQ(bytes, std::vector<std::uint8_t>(identity->GetByteSize(), 0));
}
