// Pixel format table, channel lists and the DynamicBuffer / DynamicBitmap storage rules.

#include "host/raster/DynamicBuffer.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <fstream>
#include <limits>
#include <sys/resource.h>
#include <type_traits>
#include <unistd.h>
#include <vector>

using namespace Raster;

namespace {

std::vector<PixelFormat> AllFormats() {
    std::vector<PixelFormat> formats;
    for (int i = 0; i < PixelFormatCount; ++i)
        formats.push_back(static_cast<PixelFormat>(i));
    return formats;
}

// Compile-time mapping in both directions, checked against lists written out by hand.
static_assert(FormatOf_v<Red8, Green8, Blue8, Alpha8, X5> == PixelFormat::RGBA8);
static_assert(FormatOf_v<Cyan8, Magenta8, Yellow8, Black8, Alpha8> == PixelFormat::CMYKA8);
static_assert(FormatOf_v<Intensity16, Alpha16, X3, X4, X5> == PixelFormat::IA16);
static_assert(FormatOf_v<AlphaF, X2, X3, X4, X5> == PixelFormat::MaskAF);
static_assert(FormatOf_v<RedF, GreenF, BlueF, AlphaF, X5> == PixelFormat::RGBAF);
static_assert(std::is_same_v<FormatChannels<PixelFormat::LabA16>::C2, AOpponent16>);
static_assert(std::is_same_v<FormatChannels<PixelFormat::RGBAUF>::C4, AlphaF>);
static_assert(std::is_same_v<FormatChannels<PixelFormat::IntensityUF>::C1, IntensityUF>);
static_assert(std::is_same_v<FormatComponent<PixelFormat::IA16>, std::uint16_t>);
static_assert(std::is_same_v<FormatComponent<PixelFormat::RGBAUF>, float>);

// A list that is not a host format has no value, so code that asks for one does not compile.
template <class L, class = void>
struct HasFormat : std::false_type {};
template <class... C>
struct HasFormat<FormatOf<C...>, std::void_t<decltype(FormatOf<C...>::value)>> : std::true_type {};
static_assert(HasFormat<FormatOf<Red8, Green8, Blue8, Alpha8, X5>>::value);
static_assert(!HasFormat<FormatOf<Red8, Green8, Blue8, Alpha16, X5>>::value);
static_assert(!HasFormat<FormatOf<Alpha8, Red8, Green8, Blue8, X5>>::value);

static_assert(Alpha8::Max == 255 && Red16::Max == 65535 && AlphaF::Max == 1.0f);
static_assert(AOpponent16::Middle == 32768 && Intensity8::Middle == 128);
static_assert(RedUF::IsUnbounded && !RedF::IsUnbounded && !AlphaF::IsUnbounded);
static_assert(X3::IsPlaceholder && X3::Slot == 3 && !Black8::IsPlaceholder);

TEST(PixelFormatTable, SizesWorkedOutByHand) {
    struct Expected {
        PixelFormat format;
        int channels, bytesPerComponent, bytesPerPixel;
        bool layer, mask, isFloat;
    };
    const Expected expected[] = {
        {PixelFormat::RGBA8, 4, 1, 4, true, false, false},
        {PixelFormat::RGBA16, 4, 2, 8, true, false, false},
        {PixelFormat::RGBAUF, 4, 4, 16, true, false, true},
        {PixelFormat::IA8, 2, 1, 2, true, false, false},
        {PixelFormat::IA16, 2, 2, 4, true, false, false},
        {PixelFormat::CMYKA8, 5, 1, 5, true, false, false},
        {PixelFormat::LabA16, 4, 2, 8, true, false, false},
        {PixelFormat::MaskA8, 1, 1, 1, false, true, false},
        {PixelFormat::MaskA16, 1, 2, 2, false, true, false},
        {PixelFormat::MaskAF, 1, 4, 4, false, true, true},
        {PixelFormat::IntensityUF, 1, 4, 4, false, false, true},
        {PixelFormat::RGBAF, 4, 4, 16, false, false, true},
    };
    ASSERT_EQ(std::size(expected), std::size_t(PixelFormatCount));
    for (const Expected& e : expected) {
        SCOPED_TRACE(GetPixelFormatName(e.format));
        EXPECT_EQ(GetChannelCount(e.format), e.channels);
        EXPECT_EQ(GetBytesPerComponent(e.format), e.bytesPerComponent);
        EXPECT_EQ(GetBytesPerPixel(e.format), e.bytesPerPixel);
        EXPECT_EQ(IsLayerFormat(e.format), e.layer);
        EXPECT_EQ(IsMaskFormat(e.format), e.mask);
        EXPECT_EQ(IsFloatFormat(e.format), e.isFloat);
    }
}

TEST(PixelFormatTable, NamesParseBackAndStrangersAreRefused) {
    const char* names[] = {"rgba8",  "rgba16", "rgbauf",  "ia8",    "ia16",        "cmyka8",
                           "laba16", "maska8", "maska16", "maskaf", "intensityuf", "rgbaf"};
    for (const char* name : names) {
        const auto format = ParsePixelFormat(name);
        ASSERT_TRUE(format.has_value()) << name;
        EXPECT_EQ(GetPixelFormatName(*format), name);
    }
    EXPECT_EQ(ParsePixelFormat("LabA16"), PixelFormat::LabA16);
    EXPECT_EQ(ParsePixelFormat("RGBA8"), PixelFormat::RGBA8);
    for (const char* stranger : {"", "rgb8", "rgba", "rgba8 ", " rgba8", "rgba88", "cmyk8", "mask"})
        EXPECT_FALSE(ParsePixelFormat(stranger).has_value()) << '"' << stranger << '"';
}

TEST(PixelFormatTable, CompatibleMaskFollowsComponentDepth) {
    EXPECT_EQ(DynamicBase::GetCompatibleMaskFormat(PixelFormat::RGBA8), PixelFormat::MaskA8);
    EXPECT_EQ(DynamicBase::GetCompatibleMaskFormat(PixelFormat::IA8), PixelFormat::MaskA8);
    EXPECT_EQ(DynamicBase::GetCompatibleMaskFormat(PixelFormat::CMYKA8), PixelFormat::MaskA8);
    EXPECT_EQ(DynamicBase::GetCompatibleMaskFormat(PixelFormat::RGBA16), PixelFormat::MaskA16);
    EXPECT_EQ(DynamicBase::GetCompatibleMaskFormat(PixelFormat::IA16), PixelFormat::MaskA16);
    EXPECT_EQ(DynamicBase::GetCompatibleMaskFormat(PixelFormat::LabA16), PixelFormat::MaskA16);
    EXPECT_EQ(DynamicBase::GetCompatibleMaskFormat(PixelFormat::RGBAUF), PixelFormat::MaskAF);
    EXPECT_EQ(DynamicBase::GetCompatibleMaskFormat(PixelFormat::IntensityUF), PixelFormat::MaskAF);
    for (PixelFormat mask : {PixelFormat::MaskA8, PixelFormat::MaskA16, PixelFormat::MaskAF})
        EXPECT_EQ(DynamicBase::GetCompatibleMaskFormat(mask), mask);
}

TEST(PixelFormatTable, DispatchReachesTheMatchingInstantiation) {
    for (PixelFormat format : AllFormats()) {
        const auto [seen, componentBytes] = DispatchPixelFormat(format, [](auto tag) {
            using L = FormatChannels<decltype(tag)::value>;
            return std::pair{
                FormatOf_v<typename L::C1, typename L::C2, typename L::C3, typename L::C4, typename L::C5>,
                int(sizeof(typename L::Component))};
        });
        EXPECT_EQ(seen, format);
        EXPECT_EQ(componentBytes, GetBytesPerComponent(format));
    }
}

TEST(DynamicBuffer, RowsAreAlignedPaddedAndZeroed) {
    for (PixelFormat format : AllFormats()) {
        for (int width : {1, 13, 16, 64, 100, 256}) {
            SCOPED_TRACE(std::string(GetPixelFormatName(format)) + " width " + std::to_string(width));
            const int height = 7;
            auto buffer = DynamicBuffer::Create(width, height, format);
            ASSERT_TRUE(buffer);
            EXPECT_EQ(buffer->GetWidth(), width);
            EXPECT_EQ(buffer->GetHeight(), height);
            EXPECT_EQ(buffer->GetFormat(), format);
            const std::size_t rowBytes = std::size_t(width) * std::size_t(GetBytesPerPixel(format));
            EXPECT_EQ(buffer->GetRowBytes(), rowBytes);
            EXPECT_EQ(buffer->Stride() % 64, 0);
            EXPECT_GE(std::size_t(buffer->Stride()), rowBytes);
            // At most one line of alignment, and one more to make a long row's line count odd.
            EXPECT_LT(std::size_t(buffer->Stride()), rowBytes + (buffer->Stride() >= 1024 ? 128 : 64));
            if (buffer->Stride() >= 1024) {
                EXPECT_EQ(buffer->Stride() / 64 % 2, 1);
            }
            for (int y = 0; y < height; ++y) {
                EXPECT_EQ(reinterpret_cast<std::uintptr_t>(buffer->RowBytes(y)) % 64, 0u);
                for (std::size_t i = 0; i < rowBytes; ++i)
                    ASSERT_EQ(buffer->RowBytes(y)[i], std::byte{0});
            }
            // Fill every row completely with its own value; a stride shorter than a row would let rows
            // overlap.
            for (int y = 0; y < height; ++y)
                std::memset(buffer->RowBytes(y), 0x40 + y, rowBytes);
            for (int y = 0; y < height; ++y)
                for (std::size_t i = 0; i < rowBytes; ++i)
                    ASSERT_EQ(buffer->Row<std::uint8_t>(y)[i], std::uint8_t(0x40 + y)) << "row " << y;
        }
    }
}

TEST(DynamicBuffer, StrideWorkedOutByHand) {
    // CMYKA8, 13 pixels: 65 bytes, so the next 64-byte boundary is 128.
    EXPECT_EQ(DynamicBuffer::Create(13, 2, PixelFormat::CMYKA8)->Stride(), 128);
    // RGBAUF, 4 pixels: exactly 64 bytes, no padding.
    EXPECT_EQ(DynamicBuffer::Create(4, 2, PixelFormat::RGBAUF)->Stride(), 64);
    // MaskA8, 1 pixel: one byte still takes a whole aligned row.
    EXPECT_EQ(DynamicBuffer::Create(1, 3, PixelFormat::MaskA8)->Stride(), 64);
    EXPECT_EQ(DynamicBuffer::ComputeStorageBytes(13, 3, PixelFormat::CMYKA8), 384u);
    // From 1 KiB up, rows are an odd number of 64-byte lines apart, so that a column's pixels fall in
    // different cache sets: 4096 RGBA8 pixels take 257 lines, 300 take 19 as they are.
    EXPECT_EQ(DynamicBuffer::Create(4096, 2, PixelFormat::RGBA8)->Stride(), 257 * 64);
    EXPECT_EQ(DynamicBuffer::Create(300, 2, PixelFormat::RGBA8)->Stride(), 19 * 64);
    EXPECT_EQ(DynamicBuffer::Create(128, 2, PixelFormat::RGBA16)->Stride(), 17 * 64);
    EXPECT_EQ(DynamicBuffer::Create(128, 2, PixelFormat::MaskA8)->Stride(), 128);
}

TEST(DynamicBuffer, TypedRowsSeeComponentsInChannelOrder) {
    auto buffer = DynamicBuffer::Create(3, 2, PixelFormat::RGBA16);
    ASSERT_TRUE(buffer);
    std::uint16_t* row = buffer->Row<std::uint16_t>(1);
    row[4 * 2 + 3] = 0xBEEF; // alpha of pixel 2 on row 1
    const auto* bytes = buffer->RowBytes(1);
    std::uint16_t alpha = 0;
    std::memcpy(&alpha, bytes + 2 * 8 + 6, 2);
    EXPECT_EQ(alpha, 0xBEEF);
    EXPECT_EQ(static_cast<const DynamicBuffer&>(*buffer).Row<std::uint16_t>(1)[11], 0xBEEF);
}

TEST(DynamicBuffer, SizesOutsideTheLimitsAreRefusedWithoutAnObject) {
    const long before = Kernel::Countable::GetLiveObjectCount();
    EXPECT_FALSE(DynamicBuffer::Create(0, 10, PixelFormat::RGBA8));
    EXPECT_FALSE(DynamicBuffer::Create(10, 0, PixelFormat::RGBA8));
    EXPECT_FALSE(DynamicBuffer::Create(-1, 10, PixelFormat::RGBA8));
    EXPECT_FALSE(DynamicBuffer::Create(10, std::numeric_limits<int>::min(), PixelFormat::RGBA8));
    EXPECT_FALSE(DynamicBuffer::Create(65537, 1, PixelFormat::MaskA8));
    EXPECT_FALSE(DynamicBuffer::Create(1, 65537, PixelFormat::MaskA8));
    EXPECT_FALSE(DynamicBuffer::Create(std::numeric_limits<int>::max(), 1, PixelFormat::MaskA8));
    // 65536 x 8192 RGBA8 is exactly 2^31 bytes; one more row is over.
    EXPECT_FALSE(DynamicBuffer::Create(65536, 8193, PixelFormat::RGBA8));
    EXPECT_FALSE(DynamicBuffer::Create(65536, 65536, PixelFormat::RGBAUF));
    EXPECT_FALSE(DynamicBuffer::Create(4, 4, static_cast<PixelFormat>(PixelFormatCount)));
    EXPECT_EQ(Kernel::Countable::GetLiveObjectCount(), before);

    // Where the odd stride would break the limit, the plain one is kept.
    EXPECT_EQ(DynamicBuffer::ComputeStorageBytes(65536, 8192, PixelFormat::RGBA8), std::uint64_t(1) << 31);
    EXPECT_EQ(DynamicBuffer::ComputeStorageBytes(65536, 8191, PixelFormat::RGBA8), 262144u * 8191u);
    EXPECT_EQ(DynamicBuffer::ComputeStorageBytes(65536, 8000, PixelFormat::RGBA8), (262144u + 64u) * 8000u);
    EXPECT_EQ(DynamicBuffer::ComputeStorageBytes(65536, 8193, PixelFormat::RGBA8), 0u);
    // Padding counts: 1-byte rows take 64 bytes, so 65536 rows of width 1 are far below the limit ...
    EXPECT_EQ(DynamicBuffer::ComputeStorageBytes(1, 65536, PixelFormat::MaskA8), 64u * 65536u);
    // ... and 65536 x 65536 one-byte pixels are exactly 2^32 bytes, over it.
    EXPECT_EQ(DynamicBuffer::ComputeStorageBytes(65536, 65536, PixelFormat::MaskA8), 0u);
    EXPECT_EQ(DynamicBuffer::ComputeStorageBytes(std::int64_t(1) << 40, 1, PixelFormat::MaskA8), 0u);

    // The largest sides themselves are allowed.
    auto wide = DynamicBuffer::Create(65536, 1, PixelFormat::MaskA8);
    auto tall = DynamicBuffer::Create(1, 65536, PixelFormat::MaskA8);
    ASSERT_TRUE(wide);
    ASSERT_TRUE(tall);
    wide->RowBytes(0)[65535] = std::byte{1};
    tall->RowBytes(65535)[0] = std::byte{1};
}

TEST(DynamicBuffer, ReferencesKeepTheBufferAliveAndTheLastReleaseFreesIt) {
    const long before = Kernel::Countable::GetLiveObjectCount();
    {
        auto a = DynamicBuffer::Create(8, 8, PixelFormat::IA8);
        ASSERT_TRUE(a);
        Kernel::Counted<DynamicBuffer> b = a;
        EXPECT_EQ(a->GetReferenceCount(), 2);
        a.Reset();
        EXPECT_EQ(b->GetReferenceCount(), 1);
        EXPECT_EQ(Kernel::Countable::GetLiveObjectCount(), before + 1);
    }
    EXPECT_EQ(Kernel::Countable::GetLiveObjectCount(), before);
}

#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
// Address-space limits upset the sanitizers' own mappings, so this runs in plain builds only.
TEST(DynamicBuffer, FailedAllocationGivesNull) {
    long pages = 0;
    std::ifstream("/proc/self/statm") >> pages;
    ASSERT_GT(pages, 0);
    const rlim_t used = rlim_t(pages) * rlim_t(sysconf(_SC_PAGESIZE));
    rlimit saved{};
    ASSERT_EQ(getrlimit(RLIMIT_AS, &saved), 0);
    rlimit tight = saved;
    tight.rlim_cur = used + (rlim_t(256) << 20);
    ASSERT_EQ(setrlimit(RLIMIT_AS, &tight), 0);
    const long before = Kernel::Countable::GetLiveObjectCount();
    auto big = DynamicBuffer::Create(32768, 8192, PixelFormat::RGBA16); // 2 GiB, allowed by size
    auto small = DynamicBuffer::Create(64, 64, PixelFormat::RGBA16);
    setrlimit(RLIMIT_AS, &saved);
    EXPECT_FALSE(big);
    EXPECT_TRUE(small);
    EXPECT_EQ(Kernel::Countable::GetLiveObjectCount(), before + (small ? 1 : 0));
}
#endif

TEST(DynamicBitmap, IsALayerBufferWithAnOrigin) {
    auto bitmap = DynamicBitmap::Create(20, 10, PixelFormat::LabA16, {-5, 7});
    ASSERT_TRUE(bitmap);
    EXPECT_EQ(bitmap->GetOrigin(), (Kernel::PointT<int>{-5, 7}));
    EXPECT_EQ(bitmap->GetDocumentBounds(), (Kernel::RectT<int>{-5, 7, 15, 17}));
    EXPECT_EQ(bitmap->GetBounds(), (Kernel::RectT<int>{0, 0, 20, 10}));
    EXPECT_EQ(bitmap->Stride() % 64, 0);

    // It travels as a DynamicBuffer and can be recovered from one.
    Kernel::Counted<DynamicBuffer> asBuffer = bitmap;
    EXPECT_EQ(asBuffer->GetFormat(), PixelFormat::LabA16);
    EXPECT_EQ(Kernel::CountedCast<DynamicBitmap>(asBuffer), bitmap);
    EXPECT_FALSE(Kernel::CountedCast<DynamicBitmap>(DynamicBuffer::Create(2, 2, PixelFormat::RGBA8)));

    bitmap->SetOrigin({std::numeric_limits<int>::max() - 3, std::numeric_limits<int>::min()});
    EXPECT_EQ(bitmap->GetDocumentBounds(),
              (Kernel::RectT<int>{std::numeric_limits<int>::max() - 3, std::numeric_limits<int>::min(),
                                  std::numeric_limits<int>::max(), std::numeric_limits<int>::min() + 10}));
}

TEST(DynamicBitmap, OnlyLayerFormatsAndValidSizesAreAccepted) {
    for (PixelFormat format : AllFormats())
        EXPECT_EQ(bool(DynamicBitmap::Create(4, 4, format)), IsLayerFormat(format))
            << GetPixelFormatName(format);
    EXPECT_FALSE(DynamicBitmap::Create(0, 4, PixelFormat::RGBA8));
    EXPECT_FALSE(DynamicBitmap::Create(65536, 65536, PixelFormat::RGBA8));
}

} // namespace
