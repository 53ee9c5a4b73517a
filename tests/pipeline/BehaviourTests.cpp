// How a render decides and behaves: the parameter array's layout and limit, pending and empty kernels, abort,
// extends, masks and chained stages on both paths, and bilinear sampling worked out by hand.

#include "StageTestSupport.h"

#include "filters/copy/CopyStages.h"
#include "host/raster/KernelText.h"
#include "host/raster/device/CudaCompiler.h"

using namespace PipelineTest;
using namespace Raster::KernelMath;
using RasterTools::RenderPath;

namespace {

// A Process with a block of N floats that adds the last one to red: the device must have read all N.
template <int N>
struct PaddedProcess {
    struct Params {
        float values[N];
    };
    static constexpr bool ReadsDestination = false;
    Params params{};
    const Params& GetParams() const noexcept { return params; }
    template <PixelFormat F>
    Raster::StoredPixel<F> Process(Raster::StoredPixel<F> source, Raster::StoredPixel<F>,
                                   float) const noexcept {
        source.x += params.values[N - 1];
        return source;
    }
};

// Sets the abort flag when it meets a pixel whose red is -99.
struct AbortingProcess {
    struct Params {};
    static constexpr bool ReadsDestination = false;
    bool* abort = nullptr;
    const Params& GetParams() const noexcept { return m_Params; }
    template <PixelFormat F>
    Raster::StoredPixel<F> Process(Raster::StoredPixel<F> source, Raster::StoredPixel<F>,
                                   float) const noexcept {
        if (source.x == -99.0f) Kernel::SetAborted(abort);
        return source;
    }
    Params m_Params;
};

} // namespace

template <int N>
struct RasterTools::StageText<PaddedProcess<N>> {
    static const char* Get(Raster::HardwareKernelLanguage language) {
        static const Raster::KernelTextPair texts([](Raster::HardwareKernelLanguage) {
            return MakeStage(StageSignature::Process,
                             "source.x += process_params[" + std::to_string(N - 1) + "];\nreturn source;");
        });
        return texts.Get(language);
    }
};

// On a device it would be a plain copy; the test that uses it renders on the processor only.
template <>
struct RasterTools::StageText<AbortingProcess> {
    static const char* Get(Raster::HardwareKernelLanguage language) {
        return StageText<Raster::Copy>::Get(language);
    }
};

namespace {

using FloatOnly = RasterTools::FormatList<PixelFormat::RGBAUF>;
template <int N>
using Padded = RasterTools::PipelineStages<PaddedProcess<N>, Raster::IdentityMask, Raster::IdentitySampler,
                                           Raster::IdentityTransform, Raster::Zero, FloatOnly, FloatOnly>;

// ---- The parameter array

TEST(ParameterArray, ChainedTransformStoresTheLeftCountFirst) {
    using Chain = Raster::ChainedTransform<Raster::IdentityTransform, Raster::ScaleTransform>;
    Chain::Params scaled;
    scaled.right = {2.5f, -3.0f};
    EXPECT_EQ(RasterTools::ParamFloats(scaled), (std::vector<float>{0.0f, 2.5f, -3.0f}));

    using AffineFirst = Raster::ChainedTransform<Raster::AffineTransform, Raster::ScaleTransform>;
    AffineFirst::Params affine;
    affine.left.m = {1.0, 2.0, 3.0, 4.0, 5.0, 0.1};
    affine.right = {7.0f, 8.0f};
    EXPECT_EQ(RasterTools::ParamFloats(affine),
              (std::vector<float>{6.0f, 1.0f, 2.0f, 3.0f, 4.0f, 5.0f, 0.1f, 7.0f, 8.0f}));

    // A bitmap mask times an opacity: [11, [2, w, h], [6, affine], [0]], then the opacity.
    Raster::ChainedMask<Raster::BitmapMask, Raster::ConstantMask>::Params masked;
    masked.right.opacity = 0.5f;
    EXPECT_EQ(RasterTools::ParamFloats(masked), (std::vector<float>{11.0f, 2.0f, 0.0f, 0.0f, 6.0f, 1.0f, 0.0f,
                                                                    0.0f, 0.0f, 1.0f, 0.0f, 0.0f, 0.5f}));
}

TEST(ParameterArray, ScaledCopyHasTheDocumentedLayout) {
    RasterTools::RenderTarget target;
    target.source.pixels = MakeImage(PixelFormat::RGBA8, 10, 8, 1u);
    target.destination.pixels = MakeImage(PixelFormat::RGBA16, 20, 16, 1u);
    RasterTools::CopyStages::Scaled::Params params;
    params.transform.right = {0.5f, 0.5f};
    const auto shape = RasterTools::GetKernelShape<RasterTools::CopyStages::Scaled>(target);
    const auto array = RasterTools::BuildKernelParams<RasterTools::CopyStages::Scaled>(target, shape, params);
    // Header (7, 7+s, 7+s+d, b, b, b, b) with s = d = 2 and b = 7+s+d+3; then width and height of each image,
    // and the transform [0, sx, sy]; the array ends where the empty blocks start.
    EXPECT_EQ(array, (std::vector<float>{7, 9, 11, 14, 14, 14, 14, 10, 8, 20, 16, 0, 0.5f, 0.5f}));
}

TEST(ParameterArray, ExactlyTheLimitRunsOnTheDeviceAndOneMoreFallsBack) {
    REQUIRE_OPENCL(device);
    // 7 header + 2 source + 2 destination floats, then the process block.
    using AtLimit = Padded<1024 - 11>;
    using OverLimit = Padded<1025 - 11>;
    const float4 pixel = make_float4(0.25f, 0.5f, 0.75f, 1.0f);
    const auto source = MakeFilled(PixelFormat::RGBAUF, 4, 3, &pixel);

    AtLimit::Params at;
    at.process.params.values[1024 - 11 - 1] = 0.125f;
    const auto atDestination = MakeImage(PixelFormat::RGBAUF, 4, 3, 1u);
    EXPECT_EQ(RenderAll<AtLimit>(source, atDestination, at, device), RenderPath::Device);
    EXPECT_EQ(ReadComponents(*atDestination, 3, 2), (std::vector<double>{0.375, 0.5, 0.75, 1.0}));

    OverLimit::Params over;
    over.process.params.values[1025 - 11 - 1] = 0.125f;
    const auto overDestination = MakeImage(PixelFormat::RGBAUF, 4, 3, 1u);
    EXPECT_EQ(RenderAll<OverLimit>(source, overDestination, over, device), RenderPath::Processor);
    EXPECT_EQ(ReadComponents(*overDestination, 3, 2), (std::vector<double>{0.375, 0.5, 0.75, 1.0}));
}

// ---- Compilation and empty renders

TEST(DeviceChoice, APendingCompilationRendersOnTheProcessorWithTheSameResult) {
    REQUIRE_OPENCL(device);
    using Stages = Padded<3>; // a kernel no other test asks for, so its first request finds it uncompiled
    Stages::Params params;
    params.process.params.values[2] = -0.5f;
    const auto source = MakeImage(PixelFormat::RGBAUF, 33, 9, 4u);
    RasterTools::RenderTarget target;
    target.source.pixels = source;
    target.destination.pixels = MakeImage(PixelFormat::RGBAUF, 33, 9, 8u);
    target.rect = target.destination.pixels->GetBounds();
    target.device = device;
    const long failures = Raster::Hardware::GetFailedKernels(device.Get());
    bool completed = false;
    target.completed = &completed;
    EXPECT_EQ(RasterTools::Render<Stages>(target, params), RenderPath::Processor);
    EXPECT_TRUE(completed);
    EXPECT_EQ(Raster::Hardware::GetFailedKernels(device.Get()), failures + 1);

    ASSERT_TRUE(RasterTools::WaitForKernel<Stages>(target)) << Raster::GetLastHardwareError();
    RasterTools::RenderTarget again = target;
    again.destination.pixels = MakeImage(PixelFormat::RGBAUF, 33, 9, 8u);
    EXPECT_EQ(RasterTools::Render<Stages>(again, params), RenderPath::Device);
    const auto difference = Compare(*again.destination.pixels, *target.destination.pixels);
    EXPECT_FALSE(difference) << difference->Describe();
}

TEST(DeviceChoice, AnEmptyClippedRectangleCompilesAndExecutesNothing) {
    REQUIRE_OPENCL(device);
    using Stages = Padded<4>;
    RasterTools::RenderTarget target;
    target.source.pixels = MakeImage(PixelFormat::RGBAUF, 10, 10, 1u);
    target.destination.pixels = MakeImage(PixelFormat::RGBAUF, 10, 10, 2u);
    target.device = device;
    const auto descriptor = RasterTools::DescribeKernel<Stages>(device->GetLanguage(),
                                                                RasterTools::GetKernelShape<Stages>(target));
    ASSERT_TRUE(descriptor);
    const auto before = Raster::GetKernelCacheStatistics(device.Get());
    const auto untouched = MakeImage(PixelFormat::RGBAUF, 10, 10, 2u);
    for (const Kernel::RectT<int> rect : {Kernel::RectT<int>{10, 0, 20, 10}, Kernel::RectT<int>{-5, -5, 0, 3},
                                          Kernel::RectT<int>{3, 3, 3, 9}}) {
        target.rect = rect;
        EXPECT_EQ(RasterTools::Render<Stages>(target, {}), RenderPath::Nothing);
    }
    EXPECT_FALSE(Raster::FindKernel(device.Get(), *descriptor)) << "the kernel was requested";
    EXPECT_EQ(Raster::GetKernelCacheStatistics(device.Get()).compilations, before.compilations);
    EXPECT_FALSE(Compare(*target.destination.pixels, *untouched));
}

// ---- Abort

TEST(Abort, ASetFlagRendersNothingOnEitherPath) {
    const bool abort = true;
    for (const bool onDevice : {false, true}) {
        const auto device = onDevice ? OpenCLDevice() : nullptr;
        if (onDevice && !device) continue;
        RasterTools::RenderTarget target;
        target.source.pixels = MakeImage(PixelFormat::RGBA8, 20, 10, 1u);
        target.destination.pixels = MakeImage(PixelFormat::RGBA8, 20, 10, 2u);
        target.rect = target.destination.pixels->GetBounds();
        target.device = device;
        target.abort = &abort;
        EXPECT_EQ(RasterTools::Render<RasterTools::CopyStages::Plain>(target, {}), RenderPath::Aborted);
        EXPECT_FALSE(Compare(*target.destination.pixels, *MakeImage(PixelFormat::RGBA8, 20, 10, 2u)));
    }
}

TEST(Abort, TheProcessorStopsBeforeTheNextRowAndLeavesTheRestUntouched) {
    using Stages = RasterTools::PipelineStages<AbortingProcess, Raster::IdentityMask, Raster::IdentitySampler,
                                               Raster::IdentityTransform, Raster::Zero, FloatOnly, FloatOnly>;
    auto source = MakeImage(PixelFormat::RGBAUF, 40, 9, 3u);
    source->Row<float4>(3)[17].x = -99.0f; // the process sets the flag on row 3
    const auto destination = MakeImage(PixelFormat::RGBAUF, 40, 9, 4u);
    const auto original = MakeImage(PixelFormat::RGBAUF, 40, 9, 4u);
    bool abort = false;
    Stages::Params params;
    params.process.abort = &abort;
    RasterTools::RenderTarget target;
    target.source.pixels = source;
    target.destination.pixels = destination;
    target.rect = destination->GetBounds();
    target.abort = &abort;
    EXPECT_EQ(RasterTools::Render<Stages>(target, params), RenderPath::Aborted);
    for (int y = 0; y < 9; ++y)
        for (int x = 0; x < 40; ++x)
            ASSERT_EQ(ReadComponents(*destination, x, y), ReadComponents(y <= 3 ? *source : *original, x, y))
                << "pixel " << x << "," << y << (y <= 3 ? " should be rendered" : " should be untouched");
}

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
using ShiftedCopy =
    RasterTools::PipelineStages<Raster::Copy, Raster::IdentityMask, Raster::IdentitySampler, Shifted, Extend>;

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
using NestedCopy = RasterTools::PipelineStages<Raster::Copy, Raster::IdentityMask, Raster::BilinearSampler,
                                               OuterChain, Raster::Mirror>;

TEST(Chains, NestedTransformChainsAgreeOnBothPaths) {
    NestedCopy::Params params;
    params.transform.left.left.m = {0.9, 0.2, 3.5, -0.1, 1.1, -2.25};
    params.transform.left.right = {0.75f, 1.5f};
    params.transform.right.left = {1.25f, 0.5f};
    const auto source = MakeImage(PixelFormat::RGBA16, 23, 17, 12u);
    RenderOnBoth<NestedCopy>(source, 37, 21, PixelFormat::RGBA16, params);
}

using Selection = Raster::ChainedMask<Raster::BitmapMask, Raster::ConstantMask>;
using SelectionFormats = RasterTools::FormatList<PixelFormat::RGBA8, PixelFormat::CMYKA8, PixelFormat::RGBAUF,
                                                 PixelFormat::IA16, PixelFormat::LabA16>;
using SelectionCopy = RasterTools::PipelineStages<Raster::Copy, Selection, Raster::IdentitySampler,
                                                  Raster::IdentityTransform, Raster::Zero, SelectionFormats,
                                                  SelectionFormats, RasterTools::MaskFormatList>;

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
    if (!Raster::IsNvrtcAvailable())
        GTEST_SKIP() << "NVRTC is not installed, so language-0 text cannot be compiled here ("
                     << Raster::DescribeNvrtc() << ")";
    using namespace RasterTools;
    const auto check = [](auto stages, const KernelShape& shape) {
        using Stages = decltype(stages);
        const auto descriptor = DescribeKernel<Stages>(Raster::HardwareKernelLanguage::CudaCpp, shape);
        ASSERT_TRUE(descriptor);
        const auto text = Raster::AssembleKernelSource(*descriptor, Raster::HardwareKernelLanguage::CudaCpp);
        const auto ptx = Raster::CompileToPtx(text, descriptor->entryPoint);
        EXPECT_TRUE(ptx.ptx) << Raster::GetPixelFormatName(shape.source) << " to "
                             << Raster::GetPixelFormatName(shape.dest) << ":\n"
                             << ptx.log;
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

namespace {

// The colour-only Filter (for filters that keep alpha) is used by no stage of the copy: compile it here in
// every destination format, for each language that can be compiled on this machine.
TEST(KernelText, ColourOnlyFiltersCompileForEveryDestination) {
    using namespace RasterTools;
    const auto device = OpenCLDevice();
    if (!device && !Raster::IsNvrtcAvailable())
        GTEST_SKIP() << "neither an OpenCL device nor NVRTC is installed";
    for (PixelFormat dest : RasterTools::LayerFormats) {
        for (const auto language :
             {Raster::HardwareKernelLanguage::OpenCLC, Raster::HardwareKernelLanguage::CudaCpp}) {
            auto descriptor = DescribeKernel<CopyStages::Plain>(language, {dest, dest, std::nullopt, false});
            ASSERT_TRUE(descriptor);
            (*descriptor)[Raster::HardwareKernelFragment::Filter] = GetColourOnlyFilterText(dest, language);
            if (language == Raster::HardwareKernelLanguage::OpenCLC && device) {
                const auto kernel = Raster::CompileKernelNow(device.Get(), *descriptor);
                ASSERT_TRUE(kernel);
                EXPECT_TRUE(kernel->IsReady()) << Raster::GetPixelFormatName(dest) << ":\n"
                                               << kernel->GetBuildLog();
            } else if (language == Raster::HardwareKernelLanguage::CudaCpp && Raster::IsNvrtcAvailable()) {
                const auto ptx = Raster::CompileToPtx(Raster::AssembleKernelSource(*descriptor, language),
                                                      descriptor->entryPoint);
                EXPECT_TRUE(ptx.ptx) << Raster::GetPixelFormatName(dest) << ":\n" << ptx.log;
            }
        }
    }
}

} // namespace
