// The host's pipeline pieces on their own: kernel math worked out by hand, placeholder text, spans, the
// per-tile template on one format, and the device mirror's bookkeeping.

#include "host/raster/KernelText.h"
#include "host/raster/ProcessTile.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>

using namespace Raster;
using namespace Raster::KernelMath;

namespace {

TEST(KernelMath, ConversionsToIntegersSaturateAndTruncate) {
    const float nan = std::numeric_limits<float>::quiet_NaN();
    const float inf = std::numeric_limits<float>::infinity();
    EXPECT_EQ(rt_sat_uchar(254.99f), 254);
    EXPECT_EQ(rt_sat_uchar(255.5f), 255);
    EXPECT_EQ(rt_sat_uchar(-0.9f), 0);
    EXPECT_EQ(rt_sat_uchar(nan), 0);
    EXPECT_EQ(rt_sat_ushort(inf), 65535);
    EXPECT_EQ(rt_sat_int(-inf), std::numeric_limits<int>::min());
    EXPECT_EQ(rt_sat_int(3e9f), std::numeric_limits<int>::max());
    EXPECT_EQ(rt_sat_int(-7.9f), -7);
    EXPECT_EQ(convert_int2(floor(make_float2(-0.5f, 2.5f))), make_int2(-1, 2));
    // Rounding is half away from zero, as in both kernel languages.
    EXPECT_EQ(rt_to_uchar4(make_float4(127.5f, 0.5f, 254.5f, -3.0f)), make_uchar4(128, 1, 255, 0));
}

TEST(KernelMath, SixteenBitPremultiplicationIsIntegerAndSkipsOpaque) {
    // 1000 × 30000 / 65535 = 457.77: truncated to 457.
    const float4 half = rt_premultiplied(make_ushort4(1000, 65535, 7, 30000));
    EXPECT_EQ(half.x, 457.0f);
    EXPECT_EQ(half.y, 30000.0f); // 65535 × 30000 / 65535 is exact
    EXPECT_EQ(half.w, 30000.0f);
    const float4 opaque = rt_premultiplied(make_ushort4(1000, 2, 3, 65535));
    EXPECT_EQ(opaque.x, 1000.0f);
    // 8-bit premultiplies in float: 100 × 51 / 255 = 20.
    EXPECT_EQ(rt_premultiplied(make_uchar4(100, 0, 0, 51)).x, 20.0f);
}

TEST(KernelMath, PostdivisionSkipsFullAndVanishingAlpha) {
    EXPECT_EQ(rt_postdivided(make_float4(0.25f, 0.5f, 0.0f, 0.5f), 1.0f).x, 0.5f);
    // Alpha exactly 1 (the maximum): no division at all.
    EXPECT_EQ(rt_postdivided(make_float4(100.0f, 0.0f, 0.0f, 255.0f), 255.0f).x, 100.0f);
    // Below 1e-20 in magnitude the premultiplied colour stays, instead of being divided towards infinity.
    const float4 faint = rt_postdivided(make_float4(1e-25f, 3.0f, -2.0f, 5e-21f), 1.0f);
    EXPECT_EQ(faint.x, 1e-25f);
    EXPECT_EQ(faint.y, 3.0f);
    const float4 justAbove = rt_postdivided(make_float4(2e-20f, 0.0f, 0.0f, 2e-20f), 1.0f);
    EXPECT_EQ(justAbove.x, 1.0f);
}

TEST(KernelMath, EdgeIndexRules) {
    EXPECT_EQ(rt_wrapi(-1, 5), 4);
    EXPECT_EQ(rt_wrapi(11, 5), 1);
    EXPECT_EQ(rt_mirrori(-1, 5), 0);
    EXPECT_EQ(rt_mirrori(-2, 5), 1);
    EXPECT_EQ(rt_mirrori(5, 5), 4);
    EXPECT_EQ(rt_mirrori(10, 5), 0);
    EXPECT_EQ(rt_clampi(-3, 0, 4), 0);
}

TEST(KernelText, PlaceholdersAreReplacedInOnePass) {
    EXPECT_EQ(FormatKernelText("%2(%1)+%1 100%%", {"x", "f"}), "f(x)+x 100%");
    // An argument's own placeholders are not expanded again; a missing argument stays as written.
    EXPECT_EQ(FormatKernelText("%1 %3", {"%2", "never"}), "%2 %3");
    EXPECT_NE(std::string(GetKernelMathText(HardwareKernelLanguage::OpenCLC)).find("RandomMax 65535u"),
              std::string::npos);
    EXPECT_EQ(GetKernelMathText(HardwareKernelLanguage::None), nullptr);
}

TEST(Spans, InterleavedAndPlanarRoundTripAndMasksMerge) {
    InterleavedPixelSpan<PixelFormat::CMYKA8> pixels, back;
    pixels.count = 19;
    for (int i = 0; i < pixels.count; ++i)
        pixels.pixels[i] = rt_make_cmyka8(uchar(i), uchar(2 * i), uchar(3 * i), uchar(4 * i), uchar(255 - i));
    PlanarPixelSpan<PixelFormat::CMYKA8> planes;
    Deinterleave(pixels, planes);
    EXPECT_EQ(planes.planes[3][5], 20);
    EXPECT_EQ(planes.planes[4][5], 250);
    Interleave(planes, back);
    for (int i = 0; i < pixels.count; ++i)
        EXPECT_EQ(back.pixels[i], pixels.pixels[i]) << i;

    MaskSpan a, b;
    a.count = b.count = 3;
    const float wa[3] = {1.0f, 0.5f, 0.0f}, wb[3] = {0.25f, 0.5f, 1.0f};
    std::memcpy(a.planes[0], wa, sizeof wa);
    std::memcpy(b.planes[0], wb, sizeof wb);
    PlanarMergeMaskSpans(a, b);
    EXPECT_EQ(a.planes[0][0], 0.25f);
    EXPECT_EQ(a.planes[0][1], 0.25f);
    EXPECT_EQ(a.planes[0][2], 0.0f);

    // Blending by the weights: all of the result, a quarter of the way, none of it.
    InterleavedPixelSpan<PixelFormat::RGBA8> result, dest;
    result.count = dest.count = 3;
    for (int i = 0; i < 3; ++i) {
        result.pixels[i] = make_uchar4(200, 200, 200, 255);
        dest.pixels[i] = make_uchar4(0, 100, 200, 0);
    }
    SpanApplyMask(result, dest, a);
    EXPECT_EQ(result.pixels[0], make_uchar4(50, 125, 200, 64));
    EXPECT_EQ(result.pixels[1], make_uchar4(50, 125, 200, 64));
    EXPECT_EQ(result.pixels[2], make_uchar4(0, 100, 200, 0));
}

// ---- The per-tile template on one format

using RGBA16 = Bitmap<Red16, Green16, Blue16, Alpha16, X5>;

bool CopyTile(DynamicBuffer& source, DynamicBuffer& dest, Kernel::RectT<int> rect, TileOptions options) {
    const RGBA16 from(&source);
    RGBA16 to(&dest);
    return ProcessBase<Copy>::ProcessTile<PixelProcessor<Horizontal>, Red16, Green16, Blue16, Alpha16, X5,
                                          Red16, Green16, Blue16, Alpha16, X5, X1, X2, X3, X4, X5, RGBA16,
                                          RGBA16, Copy, IdentityMask, IdentitySampler, IdentityTransform,
                                          Zero, NormalBlend>(&from, &to, Copy{}, rect, nullptr, nullptr,
                                                             nullptr, options);
}

Kernel::Counted<DynamicBuffer> Numbered(int width, int height, int offset) {
    auto image = DynamicBuffer::Create(width, height, PixelFormat::RGBA16);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x)
            image->Row<ushort4>(y)[x] =
                make_ushort4(ushort(x + offset), ushort(y + offset), ushort(x * y), ushort(1000 + offset));
    return image;
}

TEST(ProcessTile, WritesOnlyTheRectangleAndTheMaskedChannels) {
    auto source = Numbered(70, 6, 0);
    auto dest = Numbered(70, 6, 5000);
    // Unaligned on both sides, so a partial span, an aligned block and a partial span meet in each row.
    ASSERT_TRUE(CopyTile(*source, *dest, {3, 1, 69, 5}, TileOptions{5, nullptr}));
    for (int y = 0; y < 6; ++y)
        for (int x = 0; x < 70; ++x) {
            const ushort4 was = Numbered(70, 6, 5000)->Row<ushort4>(y)[x], from = source->Row<ushort4>(y)[x];
            const bool inside = x >= 3 && x < 69 && y >= 1 && y < 5;
            // Mask 5: red and blue from the source, green and alpha kept.
            const ushort4 expected = inside ? make_ushort4(from.x, was.y, from.z, was.w) : was;
            ASSERT_EQ(dest->Row<ushort4>(y)[x], expected) << x << "," << y;
        }
}

TEST(ProcessTile, ASetAbortFlagStopsBeforeTheFirstRow) {
    auto source = Numbered(40, 4, 0);
    auto dest = Numbered(40, 4, 7);
    const bool abort = true;
    EXPECT_FALSE(CopyTile(*source, *dest, dest->GetBounds(), TileOptions{-1, &abort}));
    EXPECT_EQ(dest->Row<ushort4>(2)[20], make_ushort4(27, 9, 40, 1007));
    // A destination of another format is refused.
    auto wrong = DynamicBuffer::Create(40, 4, PixelFormat::RGBA8);
    EXPECT_FALSE(CopyTile(*source, *wrong, wrong->GetBounds(), {}));
}

// ---- Device mirrors

TEST(HardwareCache, TracksWhichSideIsNewestAndCopiesOnlyThat) {
    const auto device = Hardware::GetDevice("opencl");
    if (!device) GTEST_SKIP() << "no OpenCL device: install pocl-opencl-icd";
    auto image = Numbered(50, 40, 0);
    auto cache = HardwareCache::Create(image);
    EXPECT_FALSE(cache->IsHardwareCurrent({0, 0, 1, 1}));
    ASSERT_TRUE(cache->SyncHardwareCache(device.Get(), {0, 0, 50, 40}));
    EXPECT_TRUE(cache->IsHardwareCurrent(image->GetBounds()));

    // The device gets other pixels in a rectangle: the host is stale there only.
    const auto changed = Numbered(50, 40, 300);
    ASSERT_TRUE(cache->GetHardwareBuffer()->Upload(changed->RowBytes(0), std::size_t(changed->Stride()),
                                                   {10, 5, 30, 25}));
    cache->InvalidateHostCache({10, 5, 30, 25});
    EXPECT_FALSE(cache->IsHostCurrent({29, 24, 31, 26}));
    EXPECT_TRUE(cache->IsHostCurrent({30, 0, 50, 40}));
    ASSERT_TRUE(cache->SyncHostCache({0, 0, 20, 40})); // brings back the left half of the changed area
    EXPECT_EQ(image->Row<ushort4>(7)[15], changed->Row<ushort4>(7)[15]);
    EXPECT_EQ(image->Row<ushort4>(7)[25], Numbered(50, 40, 0)->Row<ushort4>(7)[25])
        << "copied beyond the rect";
    ASSERT_TRUE(cache->SyncHostCache(image->GetBounds()));
    EXPECT_EQ(image->Row<ushort4>(7)[25], changed->Row<ushort4>(7)[25]);
    EXPECT_TRUE(cache->IsHostCurrent(image->GetBounds()));

    // The host changes a rectangle: only the device is stale, and a sync uploads it.
    image->Row<ushort4>(30)[40] = make_ushort4(1, 2, 3, 4);
    cache->InvalidateHardwareCache({40, 30, 41, 31});
    EXPECT_FALSE(cache->IsHardwareCurrent({40, 30, 41, 31}));
    ASSERT_TRUE(cache->SyncHardwareCache(device.Get(), {35, 25, 45, 35}));
    auto fresh = Numbered(50, 40, 999);
    ASSERT_TRUE(cache->GetHardwareBuffer()->Download(fresh->RowBytes(0), std::size_t(fresh->Stride())));
    EXPECT_EQ(fresh->Row<ushort4>(30)[40], make_ushort4(1, 2, 3, 4));

    // A mirror serves one device; retention on its write queue marks it in use until the lease goes.
    const HardwareQueue queue = device->GetHardwareWriteQueue();
    ASSERT_TRUE(queue.IsOn(device.Get()));
    {
        const auto retained = RetainHardwareBuffer(device.Get(), queue, cache, {0, 0, 5, 5});
        ASSERT_TRUE(retained);
        EXPECT_EQ(cache->GetRetainCount(), 1);
    }
    EXPECT_EQ(cache->GetRetainCount(), 0);
    EXPECT_FALSE(RetainHardwareBuffer(nullptr, queue, cache, {0, 0, 5, 5}));
    EXPECT_FALSE(RetainHardwareBuffer(device.Get(), HardwareQueue(), cache, {0, 0, 5, 5}));
    // A device that only describes itself has no queue at all.
    const Kernel::Counted<HardwareDevice> listed(
        new HardwareDevice("listed", "opencl:9.9", HardwareBackEnd::OpenCL, HardwareDeviceKind::Cpu));
    EXPECT_FALSE(listed->GetHardwareWriteQueue());
    EXPECT_FALSE(RetainHardwareBuffer(device.Get(), listed->GetHardwareWriteQueue(), cache, {0, 0, 5, 5}));
}

} // namespace

namespace {

// The processor's own round, floor, fmin and fmax stand in for the C library's: they must agree everywhere,
// halves, signed zeros, the edge of exact integers, infinities and NaN included.
TEST(KernelMath, ScalarFunctionsMatchTheCLibrary) {
    std::vector<float> values{0.0f,
                              -0.0f,
                              0.5f,
                              -0.5f,
                              1.5f,
                              2.5f,
                              -2.5f,
                              0.49999997f,
                              -0.49999997f,
                              8388607.5f,
                              8388608.0f,
                              -8388609.0f,
                              1e30f,
                              -1e-30f,
                              std::numeric_limits<float>::infinity(),
                              -std::numeric_limits<float>::infinity()};
    for (std::uint32_t bits = 0x3E000000u; bits < 0x4B800000u; bits += 0x00010001u) {
        float v;
        std::memcpy(&v, &bits, sizeof v);
        values.push_back(v);
        values.push_back(-v);
    }
    const auto same = [](float a, float b) { return std::memcmp(&a, &b, sizeof a) == 0; };
    for (const float v : values) {
        EXPECT_TRUE(same(rt_round(v), std::round(v))) << v;
        EXPECT_TRUE(v == 0.0f || same(rt_floor(v), std::floor(v))) << v;
        EXPECT_EQ(rt_fmin(v, 0.25f), std::fmin(v, 0.25f)) << v;
        EXPECT_EQ(rt_fmax(v, 0.25f), std::fmax(v, 0.25f)) << v;
    }
    const float nan = std::numeric_limits<float>::quiet_NaN();
    EXPECT_TRUE(std::isnan(rt_round(nan)));
    EXPECT_EQ(rt_fmin(nan, 2.0f), 2.0f);
    EXPECT_EQ(rt_fmax(3.0f, nan), 3.0f);
}

} // namespace
