// Language-0 kernels: NVRTC compiles them to PTX without a GPU; a CUDA device, where there is one, runs them.
#include "DeviceTestSupport.h"

#include "host/raster/device/CudaCompiler.h"

using namespace Raster;

namespace {

std::string SampleText() {
    const auto kernel = DeviceTest::AdjustKernel(HardwareKernelLanguage::CudaCpp);
    return AssembleKernelSource(kernel.Descriptor(), HardwareKernelLanguage::CudaCpp);
}

} // namespace

#define REQUIRE_NVRTC()                                                                                      \
    if (!IsNvrtcAvailable())                                                                                 \
    GTEST_SKIP() << "NVRTC not found, language-0 texts cannot be compiled here: " << DescribeNvrtc()

TEST(Nvrtc, CompilesTheSampleKernelToPtx) {
    REQUIRE_NVRTC();
    std::cout << "[ info     ] " << DescribeNvrtc() << "\n";
    const auto result = CompileToPtx(SampleText(), "adjust");
    ASSERT_TRUE(result.ptx) << result.log;
    EXPECT_NE(result.ptx->find(".entry adjust"), std::string::npos);
    // Contraction is off: the multiply and add of the kernel stay two roundings, as on the processor.
    EXPECT_EQ(result.ptx->find("fma.rn.f32"), std::string::npos) << "fused multiply-add in the PTX";

    const auto hopper = CompileToPtx(SampleText(), "adjust", "compute_90");
    ASSERT_TRUE(hopper.ptx) << hopper.log;
    EXPECT_NE(hopper.ptx->find(".target sm_90"), std::string::npos);
}

TEST(Nvrtc, ReportsErrorsInTheLog) {
    REQUIRE_NVRTC();
    const auto syntax =
        CompileToPtx("extern \"C\" __global__ void k(float* v) { v[0] = missing_name_z4; }", "k");
    EXPECT_FALSE(syntax.ptx);
    EXPECT_NE(syntax.log.find("missing_name_z4"), std::string::npos) << syntax.log;

    // Without extern "C" the kernel's name is mangled and cannot be found by its plain name.
    const auto mangled = CompileToPtx("__global__ void plain_name(float* v) { v[0] = 1.0f; }", "plain_name");
    EXPECT_FALSE(mangled.ptx);
    EXPECT_NE(mangled.log.find("extern \"C\""), std::string::npos) << mangled.log;

    const auto wrongEntry = CompileToPtx(SampleText(), "adjus");
    EXPECT_FALSE(wrongEntry.ptx) << "a prefix of the entry's name is not the entry";

    const auto architecture = CompileToPtx(SampleText(), "adjust", "compute_1");
    EXPECT_FALSE(architecture.ptx);
    EXPECT_FALSE(architecture.log.empty());
}

TEST(CudaDevice, RunsTheSampleKernel) {
    const auto device = Hardware::GetDevice("cuda");
    if (!device)
        GTEST_SKIP() << "no CUDA device (needs libcuda, NVRTC and a GPU): the CUDA path is not run here";
    EXPECT_EQ(device->GetLanguage(), HardwareKernelLanguage::CudaCpp);
    EXPECT_EQ(Hardware::GetDevice("auto"), device) << "auto prefers a CUDA GPU";
    DeviceTest::RunAdjustKernel(device.Get(), DeviceTest::AdjustKernel(HardwareKernelLanguage::CudaCpp));

    // The parameter limit holds on this back end too.
    DeviceTest::AdjustImages images;
    auto values =
        CreateHardwareBuffer(device.Get(), images.values.data(), 7 * sizeof(float), 7, 5, sizeof(float));
    auto pixels = CreateHardwareBuffer(device.Get(), images.pixels.data(),
                                       DeviceTest::AdjustImages::PixelStride, 7, 5, 4);
    ASSERT_TRUE(values && pixels);
    std::vector<float> params(MaxHardwareKernelParams, 0.0f);
    params.back() = 3.0f;
    const auto descriptor = DeviceTest::AdjustKernel(HardwareKernelLanguage::CudaCpp).Descriptor();
    auto arguments = [&] {
        HardwareKernelArguments a;
        a.AddBuffer(values)
            .AddBuffer(pixels)
            .AddParams(params)
            .AddInt(7)
            .AddInt(5)
            .AddInt2(0, 0)
            .AddInt2(0, 0)
            .AddFloat(1.0f);
        return a;
    };
    ASSERT_TRUE(ExecuteKernel(device.Get(), descriptor, 7, 5, arguments())) << GetLastHardwareError();
    std::vector<float> out(35);
    ASSERT_TRUE(values->Download(out.data(), 7 * sizeof(float)));
    for (int i = 0; i < 35; ++i)
        EXPECT_EQ(out[i], static_cast<float>(i) * 0.5f + 3.0f);
    params.push_back(1.0f);
    EXPECT_FALSE(ExecuteKernel(device.Get(), descriptor, 7, 5, arguments()));
}

TEST(CudaDevice, BrokenLanguage0KernelKeepsTheCompilerLog) {
    const auto device = Hardware::GetDevice("cuda");
    if (!device) GTEST_SKIP() << "no CUDA device (needs libcuda, NVRTC and a GPU)";
    const auto kernel = DeviceTest::LoopOnly(
        "extern \"C\" __global__ void broken_cuda(float* v) { v[0] = not_declared_w2; }", "broken_cuda");
    const auto compiled = CompileKernelNow(device.Get(), kernel.Descriptor());
    ASSERT_TRUE(compiled);
    EXPECT_TRUE(compiled->IsBroken());
    EXPECT_NE(compiled->GetBuildLog().find("not_declared_w2"), std::string::npos) << compiled->GetBuildLog();
}
