// How a render decides and behaves: the parameter array's layout and limit, pending and empty kernels, abort,
// and the kernel texts compiled for the languages this machine has.

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

// ---- Language 0

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
