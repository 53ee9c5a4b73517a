// Kernel execution on the OpenCL device: results worked out by hand, the parameter limit, refusals.
#include "DeviceTestSupport.h"

#include <thread>

using namespace Raster;
using DeviceTest::AdjustImages;
using DeviceTest::KernelText;

namespace {

// The sample kernel's buffers and a runner that reports whether the device accepted the arguments.
struct AdjustRun {
    const HardwareDevice* device;
    KernelText kernel = DeviceTest::AdjustKernel(HardwareKernelLanguage::OpenCLC);
    AdjustImages images;
    Kernel::Counted<HardwareBuffer> values, pixels;

    explicit AdjustRun(const HardwareDevice* d)
        : device(d) {
        constexpr int W = AdjustImages::Width, H = AdjustImages::Height;
        values = CreateHardwareBuffer(device, images.values.data(), W * sizeof(float), W, H, sizeof(float));
        pixels = CreateHardwareBuffer(device, images.pixels.data(), AdjustImages::PixelStride, W, H, 4);
    }

    HardwareKernelArguments Arguments(const std::vector<float>& params, float scale = 2.0f) const {
        HardwareKernelArguments arguments;
        arguments.AddBuffer(values)
            .AddBuffer(pixels)
            .AddParams(params)
            .AddInt(AdjustImages::Width)
            .AddInt(AdjustImages::Height)
            .AddInt2(2, 1)
            .AddInt2(6, 4)
            .AddFloat(scale);
        return arguments;
    }

    std::vector<float> Values() const {
        std::vector<float> out(AdjustImages::Width * AdjustImages::Height);
        EXPECT_TRUE(values->Download(out.data(), AdjustImages::Width * sizeof(float)));
        return out;
    }
    std::vector<std::uint8_t> Pixels() const {
        std::vector<std::uint8_t> out(AdjustImages::PixelStride * AdjustImages::Height, 0xEE);
        EXPECT_TRUE(pixels->Download(out.data(), AdjustImages::PixelStride));
        return out;
    }
    bool Run(const HardwareKernelArguments& arguments, int width = AdjustImages::Width,
             int height = AdjustImages::Height, const bool* abort = nullptr) const {
        return ExecuteKernel(device, kernel.Descriptor(), width, height, arguments, abort);
    }
};

} // namespace

TEST(ExecuteKernel, AddsParameterAndInvertsRectangleOnOpenCL) {
    REQUIRE_OPENCL_DEVICE(device);
    DeviceTest::RunAdjustKernel(device.Get(), DeviceTest::AdjustKernel(HardwareKernelLanguage::OpenCLC));
}

TEST(ExecuteKernel, AcceptsExactly1024ParametersAndRefuses1025) {
    REQUIRE_OPENCL_DEVICE(device);
    AdjustRun run(device.Get());
    ASSERT_TRUE(run.values && run.pixels);

    std::vector<float> params(MaxHardwareKernelParams, 0.0f);
    params.back() = -7.25f;
    ASSERT_TRUE(run.Run(run.Arguments(params, 1.0f))) << GetLastHardwareError();
    auto values = run.Values();
    for (int i = 0; i < static_cast<int>(values.size()); ++i)
        EXPECT_EQ(values[i], static_cast<float>(i) * 0.5f - 7.25f) << "the kernel read params[1023]";

    params.push_back(100.0f);
    const auto arguments = run.Arguments(params, 1.0f);
    EXPECT_FALSE(arguments.IsValid());
    EXPECT_FALSE(run.Run(arguments));
    EXPECT_NE(GetLastHardwareError().find("1025"), std::string::npos) << GetLastHardwareError();
    EXPECT_EQ(run.Values(), values) << "a refused kernel changes nothing";
}

TEST(ExecuteKernel, RefusesMalformedCallsWithoutTouchingBuffers) {
    REQUIRE_OPENCL_DEVICE(device);
    AdjustRun run(device.Get());
    ASSERT_TRUE(run.values && run.pixels);
    const std::vector<float> params{1.0f};
    const auto values = run.Values();
    const auto pixels = run.Pixels();

    // One argument short of the kernel's list: OpenCL can tell, and nothing runs.
    HardwareKernelArguments shortList;
    shortList.AddBuffer(run.values)
        .AddBuffer(run.pixels)
        .AddParams(params)
        .AddInt(7)
        .AddInt(5)
        .AddInt2(2, 1)
        .AddInt2(6, 4);
    EXPECT_FALSE(run.Run(shortList));
    EXPECT_NE(GetLastHardwareError().find("arguments"), std::string::npos) << GetLastHardwareError();

    HardwareKernelArguments nullBuffer;
    nullBuffer.AddBuffer(nullptr)
        .AddBuffer(run.pixels)
        .AddParams(params)
        .AddInt(7)
        .AddInt(5)
        .AddInt2(2, 1)
        .AddInt2(6, 4)
        .AddFloat(1.0f);
    EXPECT_FALSE(nullBuffer.IsValid());
    EXPECT_FALSE(run.Run(nullBuffer));

    HardwareKernelArguments twoArrays = run.Arguments(params);
    twoArrays.AddParams(params);
    EXPECT_FALSE(twoArrays.IsValid());
    EXPECT_FALSE(run.Run(twoArrays));

    const bool abort = true;
    EXPECT_FALSE(run.Run(run.Arguments(params), AdjustImages::Width, AdjustImages::Height, &abort));
    EXPECT_FALSE(run.Run(run.Arguments(params), -1, 3));
    EXPECT_FALSE(ExecuteKernel(nullptr, run.kernel.Descriptor(), 7, 5, run.Arguments(params)));

    // An empty grid has nothing to do and succeeds.
    EXPECT_TRUE(run.Run(run.Arguments(params), 0, AdjustImages::Height));
    EXPECT_TRUE(run.Run(run.Arguments(params), AdjustImages::Width, 0));

    EXPECT_EQ(run.Values(), values);
    EXPECT_EQ(run.Pixels(), pixels);
}

TEST(ExecuteKernel, RunsFromManyThreadsAtOnce) {
    REQUIRE_OPENCL_DEVICE(device);
    constexpr int threads = 4;
    std::vector<std::unique_ptr<AdjustRun>> runs;
    for (int t = 0; t < threads; ++t)
        runs.push_back(std::make_unique<AdjustRun>(device.Get()));
    std::vector<int> ok(threads, 0); // not vector<bool>: its bits share bytes across threads
    std::vector<std::thread> workers;
    for (int t = 0; t < threads; ++t)
        workers.emplace_back([&, t] {
            // Each thread its own scale and parameter: a launch that borrowed another's arguments shows.
            ok[t] = runs[t]->Run(runs[t]->Arguments({static_cast<float>(t)}, static_cast<float>(t + 1)));
        });
    for (auto& worker : workers)
        worker.join();
    for (int t = 0; t < threads; ++t) {
        ASSERT_TRUE(ok[t]) << "thread " << t;
        const auto values = runs[t]->Values();
        for (int i = 0; i < static_cast<int>(values.size()); ++i)
            EXPECT_EQ(values[i],
                      static_cast<float>(i) * 0.5f * static_cast<float>(t + 1) + static_cast<float>(t))
                << "thread " << t << " value " << i;
    }
}

TEST(ExecuteKernel, RunsAKernelAlreadyLookedUp) {
    REQUIRE_OPENCL_DEVICE(device);
    AdjustRun run(device.Get());
    const auto kernel = CompileKernelNow(device.Get(), run.kernel.Descriptor());
    ASSERT_TRUE(kernel && kernel->IsReady());
    ASSERT_TRUE(
        ExecuteKernel(*kernel, AdjustImages::Width, AdjustImages::Height, run.Arguments({0.5f}, 4.0f)))
        << GetLastHardwareError();
    const auto values = run.Values();
    for (int i = 0; i < static_cast<int>(values.size()); ++i)
        EXPECT_EQ(values[i], static_cast<float>(i) * 2.0f + 0.5f);
}
