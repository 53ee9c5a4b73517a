// Device enumeration and selection, counters, and the device-buffer semaphore.
#include "DeviceTestSupport.h"
#include "SelectorVariable.h"

#include <cstdlib>
#include <latch>
#include <optional>
#include <set>
#include <thread>

using namespace Raster;
using DeviceTest::OpenCLDevice;
using DeviceTest::SelectorVariable;

namespace {

Kernel::Counted<HardwareDevice> Describing(const char* id, HardwareBackEnd backEnd, HardwareDeviceKind kind) {
    return Kernel::Counted<HardwareDevice>(new HardwareDevice(id, id, backEnd, kind));
}

std::string Picked(const HardwareDeviceList& devices, std::string_view selector) {
    const auto parsed = ParseHardwareSelector(selector);
    if (!parsed) return "unparsed";
    const auto device = SelectHardwareDevice(devices, *parsed);
    return device ? device->GetIdentifier() : "none";
}

} // namespace

TEST(DeviceSelector, ParsesWordsAndIndicesIgnoringCaseAndBlanks) {
    using Choice = HardwareSelector::Choice;
    EXPECT_EQ(ParseHardwareSelector("auto"), (HardwareSelector{Choice::Auto, {}}));
    EXPECT_EQ(ParseHardwareSelector(" CPU\t"), (HardwareSelector{Choice::Cpu, {}}));
    EXPECT_EQ(ParseHardwareSelector("OpenCL"), (HardwareSelector{Choice::OpenCL, {}}));
    EXPECT_EQ(ParseHardwareSelector("cuda"), (HardwareSelector{Choice::Cuda, {}}));
    EXPECT_EQ(ParseHardwareSelector("opencl:0"), (HardwareSelector{Choice::OpenCL, 0}));
    EXPECT_EQ(ParseHardwareSelector("cuda:12"), (HardwareSelector{Choice::Cuda, 12}));
}

TEST(DeviceSelector, RefusesUnknownWordsAndMalformedIndices) {
    for (const char* text : {"", "gpu", "open cl", "opencl:", "opencl:x", "opencl:-1", "opencl:1:2",
                             "cuda:1a", "cpu:0", "auto:1", "opencl 1", "autox"})
        EXPECT_EQ(ParseHardwareSelector(text), std::nullopt) << "'" << text << "'";
}

TEST(DeviceSelector, AutoPrefersCudaThenOpenCLGpuAndNeverAProcessorDevice) {
    const auto oclCpu = Describing("opencl:0.0", HardwareBackEnd::OpenCL, HardwareDeviceKind::Cpu);
    const auto oclGpu = Describing("opencl:1.0", HardwareBackEnd::OpenCL, HardwareDeviceKind::Gpu);
    const auto oclGpu2 = Describing("opencl:1.1", HardwareBackEnd::OpenCL, HardwareDeviceKind::Gpu);
    const auto cuda0 = Describing("cuda:0", HardwareBackEnd::Cuda, HardwareDeviceKind::Gpu);
    const auto cuda1 = Describing("cuda:1", HardwareBackEnd::Cuda, HardwareDeviceKind::Gpu);
    // Listed in an order that differs from the preference, so that "first in the list" would be wrong.
    const HardwareDeviceList all{oclCpu, oclGpu, cuda0, oclGpu2, cuda1};
    EXPECT_EQ(Picked(all, "auto"), "cuda:0");
    EXPECT_EQ(Picked(all, "cpu"), "none");
    EXPECT_EQ(Picked(all, "cuda"), "cuda:0");
    EXPECT_EQ(Picked(all, "cuda:1"), "cuda:1");
    EXPECT_EQ(Picked(all, "cuda:2"), "none");
    EXPECT_EQ(Picked(all, "opencl"), "opencl:1.0");
    EXPECT_EQ(Picked(all, "opencl:0"), "opencl:0.0");
    EXPECT_EQ(Picked(all, "opencl:2"), "opencl:1.1");
    EXPECT_EQ(Picked(all, "opencl:3"), "none");

    const HardwareDeviceList noCuda{oclCpu, oclGpu};
    EXPECT_EQ(Picked(noCuda, "auto"), "opencl:1.0");
    EXPECT_EQ(Picked(noCuda, "cuda"), "none");
    EXPECT_EQ(Picked({oclCpu}, "auto"), "none") << "the processor path beats OpenCL on the processor";
    EXPECT_EQ(Picked({oclCpu}, "opencl"), "opencl:0.0");
    EXPECT_EQ(Picked({}, "auto"), "none");
}

TEST(DeviceSelector, EnvironmentVariableAppliesOnlyWithoutAnExplicitSelector) {
    const auto autoDevice = Hardware::GetDevice("auto");
    const auto opencl = Hardware::GetDevice("opencl");
    {
        SelectorVariable variable(nullptr);
        EXPECT_EQ(Hardware::GetDevice(), autoDevice);
    }
    {
        SelectorVariable variable("cpu");
        EXPECT_EQ(Hardware::GetDevice(), nullptr);
        EXPECT_EQ(Hardware::GetDevice("  "), nullptr) << "a blank selector counts as none";
        EXPECT_EQ(Hardware::GetDevice("opencl"), opencl) << "an explicit selector wins over the variable";
    }
    {
        SelectorVariable variable(" OpenCL ");
        EXPECT_EQ(Hardware::GetDevice(), opencl);
    }
    {
        SelectorVariable variable("");
        EXPECT_EQ(Hardware::GetDevice(), autoDevice) << "an empty variable means auto";
    }
    {
        SelectorVariable variable("warp-drive");
        EXPECT_EQ(Hardware::GetDevice(), nullptr) << "an unknown selector renders on the processor";
        EXPECT_NE(GetLastHardwareError().find("warp-drive"), std::string::npos) << GetLastHardwareError();
    }
    EXPECT_EQ(Hardware::GetDevice("cpu"), nullptr);
}

TEST(DeviceEnumeration, IsDoneOnceAndAgreesAcrossThreads) {
    constexpr int threads = 8;
    std::vector<const HardwareDeviceList*> seen(threads);
    std::latch start(threads);
    std::vector<std::thread> workers;
    for (int t = 0; t < threads; ++t)
        workers.emplace_back([&, t] {
            start.arrive_and_wait();
            seen[t] = &Hardware::GetDevices();
        });
    for (auto& worker : workers)
        worker.join();
    for (const auto* list : seen)
        EXPECT_EQ(list, &Hardware::GetDevices());

    std::set<std::string> identifiers;
    bool sawOpenCLCpuBeforeGpu = false, sawCpu = false;
    for (const auto& device : Hardware::GetDevices()) {
        ASSERT_TRUE(device);
        EXPECT_FALSE(device->GetName().empty());
        EXPECT_TRUE(identifiers.insert(device->GetIdentifier()).second)
            << "duplicate " << device->GetIdentifier();
        const bool cuda = device->GetBackEnd() == HardwareBackEnd::Cuda;
        EXPECT_EQ(device->GetIdentifier().rfind(cuda ? "cuda:" : "opencl:", 0), 0u) << device->Describe();
        EXPECT_EQ(GetKernelLanguage(device.Get()),
                  cuda ? HardwareKernelLanguage::CudaCpp : HardwareKernelLanguage::OpenCLC);
        EXPECT_NE(device->GetImplementation(), nullptr);
        if (!cuda && device->GetKind() == HardwareDeviceKind::Cpu) sawCpu = true;
        if (!cuda && device->GetKind() == HardwareDeviceKind::Gpu && sawCpu) sawOpenCLCpuBeforeGpu = true;
    }
    EXPECT_FALSE(sawOpenCLCpuBeforeGpu) << "OpenCL GPUs are listed before OpenCL CPU devices";
    EXPECT_EQ(GetKernelLanguage(nullptr), HardwareKernelLanguage::None);
}

TEST(DeviceEnumeration, FindsTheOpenCLCpuDevice) {
    REQUIRE_OPENCL_DEVICE(device);
    EXPECT_EQ(device->GetBackEnd(), HardwareBackEnd::OpenCL);
    EXPECT_EQ(device->GetLanguage(), HardwareKernelLanguage::OpenCLC);
    // Auto takes an OpenCL device only when it is a GPU.
    if (device->GetKind() == HardwareDeviceKind::Cpu && Hardware::GetDevice("cuda") == nullptr) {
        EXPECT_EQ(Hardware::GetDevice("auto"), nullptr);
    }
    std::cout << "[ info     ] OpenCL device: " << device->Describe() << "\n";
}

TEST(DeviceCounters, FailedKernelsCountPerDeviceAndWithoutDevice) {
    const auto a = Describing("opencl:7.0", HardwareBackEnd::OpenCL, HardwareDeviceKind::Gpu);
    const auto b = Describing("opencl:7.1", HardwareBackEnd::OpenCL, HardwareDeviceKind::Gpu);
    const long none = Hardware::GetFailedKernels(nullptr);
    Hardware::IncrementFailedKernels(a.Get());
    Hardware::IncrementFailedKernels(a.Get());
    Hardware::IncrementFailedKernels(nullptr);
    EXPECT_EQ(Hardware::GetFailedKernels(a.Get()), 2);
    EXPECT_EQ(Hardware::GetFailedKernels(b.Get()), 0);
    EXPECT_EQ(Hardware::GetFailedKernels(nullptr), none + 1);

    // Render threads count at the same time.
    std::vector<std::thread> workers;
    for (int t = 0; t < 4; ++t)
        workers.emplace_back([&] {
            for (int i = 0; i < 1000; ++i)
                Hardware::IncrementFailedKernels(b.Get());
        });
    for (auto& worker : workers)
        worker.join();
    EXPECT_EQ(Hardware::GetFailedKernels(b.Get()), 4000);
}

TEST(DeviceCounters, DescribingOnlyDevicesRunNothing) {
    const auto device = Describing("cuda:9", HardwareBackEnd::Cuda, HardwareDeviceKind::Gpu);
    EXPECT_EQ(GetKernelLanguage(device.Get()), HardwareKernelLanguage::CudaCpp);
    EXPECT_EQ(CreateHardwareBuffer(device.Get(), nullptr, 0, 4, 4, 4), nullptr);
    EXPECT_EQ(Hardware::GetIdentityBuffer(device.Get()), nullptr);
    const auto kernel = DeviceTest::LoopOnly("extern \"C\" __global__ void k() {}", "k");
    EXPECT_TRUE(IsKernelBroken(device.Get(), kernel.Descriptor()));
    EXPECT_FALSE(IsKernelPendingCompilation(device.Get(), kernel.Descriptor()));
}

TEST(BufferSemaphore, ExcludesOtherThreadsButNotTheHolder) {
    auto guard = GetRetainHardwareBufferSemaphoreGuard();
    ASSERT_TRUE(guard.OwnsSemaphore());
    auto tryFromAnotherThread = [] {
        bool owned = true;
        std::thread([&] { owned = TryGetRetainHardwareBufferSemaphoreGuard().OwnsSemaphore(); }).join();
        return owned;
    };
    EXPECT_FALSE(tryFromAnotherThread());
    {
        // A bitmap's cache sync may take it again on the thread that already holds it.
        auto again = TryGetRetainHardwareBufferSemaphoreGuard(OpenCLDevice().Get());
        EXPECT_TRUE(again.OwnsSemaphore());
    }
    EXPECT_FALSE(tryFromAnotherThread()) << "the outer guard still holds it";
    HardwareBufferSemaphoreGuard moved = std::move(guard);
    EXPECT_TRUE(moved.OwnsSemaphore());
    EXPECT_FALSE(guard.OwnsSemaphore());
    moved.Release();
    EXPECT_TRUE(tryFromAnotherThread());
}
