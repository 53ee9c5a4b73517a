// Stages on both paths: every extend's rule, nested transform chains, a selection times an opacity, and
// bilinear sampling worked out by hand. Each stage set is instantiated for the formats its test renders.

#include "StageTestSupport.h"

#include "filters/copy/CopyStages.h"
#include "host/raster/KernelText.h"
#include "tests/pipeline/LanguageZeroCheck.h"

using namespace PipelineTest;
using namespace Raster::KernelMath;
using RasterTools::RenderPath;

namespace {

using Rgba8Only = RasterTools::FormatList<PixelFormat::RGBA8>;

// ---- Extends, chains and masks on both paths

// Renders on the processor and, where there is one, the device; expects the same pixels and returns them.
template <class Stages>
Kernel::Counted<Raster::DynamicBuffer>
RenderOnBoth(Kernel::Counted<Raster::DynamicBuffer> source, int width, int height, PixelFormat format,
             const typename Stages::Params& params, Kernel::Counted<Raster::DynamicBuffer> mask = nullptr) {
    const auto processor = MakeImage(format, width, height, 6u);
    EXPECT_EQ(RenderAll<Stages>(source, processor, params, nullptr, -1, mask), RenderPath::Processor);
    if (const auto device = OpenCLDevice()) {
        const auto onDevice = MakeImage(format, width, height, 6u);
        EXPECT_EQ(RenderAll<Stages>(source, onDevice, params, device, -1, mask), RenderPath::Device)
            << Raster::GetLastHardwareError();
        const auto difference = Compare(*onDevice, *processor);
        EXPECT_FALSE(difference) << "device against processor: " << difference->Describe();
    }
    return processor;
}

using Shifted = Raster::AffineTransform;
template <class Extend>
using ShiftedCopy = RasterTools::PipelineStages<Raster::Copy, Raster::IdentityMask, Raster::IdentitySampler,
                                                Shifted, Extend, Rgba8Only, Rgba8Only>;

template <class Extend>
void CheckExtend(int (*expectedX)(int x, int width), const char* name,
                 int (*expectedY)(int y, int height) = nullptr) {
    if (!expectedY) expectedY = expectedX;
    // A 5 × 4 source read 7 pixels to the left and 2 up: every destination pixel maps outside or in.
    const auto source = MakeImage(PixelFormat::RGBA8, 5, 4, 9u);
    typename ShiftedCopy<Extend>::Params params;
    params.transform.m = {1.0, 0.0, -7.0, 0.0, 1.0, -2.0};
    const auto result = RenderOnBoth<ShiftedCopy<Extend>>(source, 19, 8, PixelFormat::RGBA8, params);
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 19; ++x) {
            const int sx = expectedX(x - 7, 5), sy = expectedY(y - 2, 4);
            const auto expected =
                sx < 0 || sy < 0 ? std::vector<double>{0, 0, 0, 0} : ReadComponents(*source, sx, sy);
            ASSERT_EQ(ReadComponents(*result, x, y), expected) << name << " at " << x << "," << y;
        }
}

TEST(Extends, ReadOutsideTheSourceByTheirRule) {
    CheckExtend<Raster::Zero>([](int v, int n) { return v < 0 || v >= n ? -1 : v; }, "Zero");
    CheckExtend<Raster::Safe>([](int v, int n) { return std::clamp(v, 0, n - 1); }, "Safe");
    CheckExtend<Raster::Repeat>([](int v, int n) { return ((v % n) + n) % n; }, "Repeat");
    CheckExtend<Raster::Mirror>(
        [](int v, int n) {
            const int m = ((v % (2 * n)) + 2 * n) % (2 * n);
            return m < n ? m : 2 * n - 1 - m;
        },
        "Mirror");
    CheckExtend<Raster::Wrap>([](int v, int n) { return ((v % n) + n) % n; }, "Wrap",
                              [](int v, int n) { return std::clamp(v, 0, n - 1); });
}

TEST(Extends, ZeroGivesTransparentBlackBeyondASmallerSource) {
    const auto source = MakeImage(PixelFormat::RGBA16, 25, 20, 3u);
    const auto result = RenderOnBoth<RasterTools::CopyStages::Plain>(source, 40, 30, PixelFormat::RGBA16, {});
    for (int y = 0; y < 30; ++y)
        for (int x = 0; x < 40; ++x)
            ASSERT_EQ(ReadComponents(*result, x, y),
                      (x < 25 && y < 20 ? ReadComponents(*source, x, y) : std::vector<double>{0, 0, 0, 0}))
                << x << "," << y;
}

using InnerChain = Raster::ChainedTransform<Raster::AffineTransform, Raster::ScaleTransform>;
using OuterChain =
    Raster::ChainedTransform<InnerChain,
                             Raster::ChainedTransform<Raster::ScaleTransform, Raster::IdentityTransform>>;
using Rgba16Only = RasterTools::FormatList<PixelFormat::RGBA16>;
using NestedCopy = RasterTools::PipelineStages<Raster::Copy, Raster::IdentityMask, Raster::BilinearSampler,
                                               OuterChain, Raster::Mirror, Rgba16Only, Rgba16Only>;

TEST(Chains, NestedTransformChainsAgreeOnBothPaths) {
    NestedCopy::Params params;
    params.transform.left.left.m = {0.9, 0.2, 3.5, -0.1, 1.1, -2.25};
    params.transform.left.right = {0.75f, 1.5f};
    params.transform.right.left = {1.25f, 0.5f};
    const auto source = MakeImage(PixelFormat::RGBA16, 23, 17, 12u);
    RenderOnBoth<NestedCopy>(source, 37, 21, PixelFormat::RGBA16, params);
}

using Selection = Raster::ChainedMask<Raster::BitmapMask, Raster::ConstantMask>;
using SelectionFormats =
    RasterTools::FormatList<PixelFormat::RGBA8, PixelFormat::CMYKA8, PixelFormat::RGBAUF, PixelFormat::IA16>;
using SelectionCopy =
    RasterTools::PipelineStages<Raster::Copy, Selection, Raster::IdentitySampler, Raster::IdentityTransform,
                                Raster::Zero, SelectionFormats, SelectionFormats>;

TEST(Masks, ASelectionTimesAnOpacityBlendsTheSameOnBothPaths) {
    SelectionCopy::Params params;
    params.mask.right.opacity = 0.75f;
    params.mask.left.transform[2] = 3.0f; // pixel x reads the mask at x + 3
    for (PixelFormat format :
         {PixelFormat::RGBA8, PixelFormat::CMYKA8, PixelFormat::RGBAUF, PixelFormat::IA16}) {
        const auto source = MakeImage(format, 45, 7, 2u);
        const auto mask = MakeImage(PixelFormat::MaskA8, 45, 7, 3u);
        const auto result = RenderOnBoth<SelectionCopy>(source, 45, 7, format, params, mask);
        // The last three columns read beyond the mask, where it is zero: they keep the destination.
        const auto original = MakeImage(format, 45, 7, 6u);
        for (int y = 0; y < 7; ++y)
            for (int x = 42; x < 45; ++x)
                ASSERT_EQ(ReadComponents(*result, x, y), ReadComponents(*original, x, y)) << x << "," << y;
    }
}

// ---- Bilinear sampling

using BilinearFormats = RasterTools::FormatList<PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF>;
using Bilinear =
    RasterTools::PipelineStages<Raster::Copy, Raster::IdentityMask, Raster::BilinearSampler,
                                Raster::IdentityTransform, Raster::Zero, BilinearFormats, BilinearFormats>;

TEST(Bilinear, AtPixelCentresReadsThePixelWithWeightOne) {
    const auto opaque = MakeImage(PixelFormat::RGBA8, 9, 5, 1u);
    for (int y = 0; y < 5; ++y)
        for (int x = 0; x < 9; ++x)
            opaque->Row<uchar4>(y)[x].w = 255;
    const auto result = RenderOnBoth<Bilinear>(opaque, 9, 5, PixelFormat::RGBA8, {});
    EXPECT_FALSE(Compare(*result, *opaque));
}

TEST(Bilinear, SixteenBitPremultipliesInIntegersAndTransparentKeepsItsColour) {
    // 1000 × 30000 / 65535 = 457.77, truncated to 457; divided by 30000/65535 again: 998.3, rounded 998.
    const ushort4 half = make_ushort4(1000, 65535, 0, 30000);
    const auto result =
        RenderOnBoth<Bilinear>(MakeFilled(PixelFormat::RGBA16, 4, 4, &half), 4, 4, PixelFormat::RGBA16, {});
    EXPECT_EQ(ReadComponents(*result, 1, 1), (std::vector<double>{998, 65535, 0, 30000}));
    // Alpha 0: the premultiplied colour (0) is kept rather than divided by zero.
    const float4 clear = make_float4(0.5f, -2.0f, 3.0f, 0.0f);
    const auto transparent =
        RenderOnBoth<Bilinear>(MakeFilled(PixelFormat::RGBAUF, 4, 4, &clear), 4, 4, PixelFormat::RGBAUF, {});
    EXPECT_EQ(ReadComponents(*transparent, 2, 2), (std::vector<double>{0, 0, 0, 0}));
}

// ---- Language 0

TEST(KernelText, EveryLanguageZeroTextCompilesWithNvrtc) {
    REQUIRE_NVRTC();
    using namespace RasterTools;
    const auto check = [](auto stages, const KernelShape& shape) {
        PipelineTest::ExpectLanguageZeroCompiles<decltype(stages)>(shape);
    };
    for (PixelFormat source : RasterTools::LayerFormats)
        for (PixelFormat dest : RasterTools::LayerFormats)
            for (const bool masked : {false, true}) {
                check(CopyStages::Plain{}, {source, dest, std::nullopt, masked});
                check(CopyStages::ScaledMasked{}, {source, dest, PixelFormat::MaskA8, masked});
            }
    check(SelectionCopy{}, {PixelFormat::CMYKA8, PixelFormat::LabA16, PixelFormat::MaskAF, true});
    check(NestedCopy{}, {PixelFormat::RGBA16, PixelFormat::IA8, std::nullopt, false});
}

} // namespace
