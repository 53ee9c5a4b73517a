// Kernel source assembly and the kernel cache: identity by content, broken kernels, background compilation.
#include "DeviceTestSupport.h"

#include <algorithm>
#include <latch>
#include <thread>

using namespace Raster;
using DeviceTest::KernelText;
using DeviceTest::LoopOnly;

namespace {

KernelText Marked() {
    KernelText kernel;
    for (std::size_t i = 0; i < kernel.fragments.size(); ++i)
        kernel.fragments[i] = "/*F" + std::to_string(i) + "*/";
    kernel.entryPoint = "entry";
    return kernel;
}

} // namespace

TEST(KernelSource, PastesEveryFragmentOnceInCompileOrder) {
    const KernelText kernel = Marked();
    for (const auto language : {HardwareKernelLanguage::OpenCLC, HardwareKernelLanguage::CudaCpp}) {
        const std::string source = AssembleKernelSource(kernel.Descriptor(), language);
        std::size_t previous = 0;
        for (const HardwareKernelFragment fragment : KernelCompileOrder) {
            const std::string& text = kernel.fragments[static_cast<std::size_t>(fragment)];
            const std::size_t at = source.find(text);
            ASSERT_NE(at, std::string::npos) << text;
            EXPECT_EQ(source.find(text, at + 1), std::string::npos) << text << " pasted twice";
            EXPECT_GT(at, previous) << text << " out of order";
            previous = at;
        }
        const bool pragma = source.rfind("#pragma OPENCL FP_CONTRACT OFF", 0) == 0;
        EXPECT_EQ(pragma, language == HardwareKernelLanguage::OpenCLC);
    }
    // The loop, which holds the entry point and calls everything, comes last.
    EXPECT_EQ(KernelCompileOrder.back(), HardwareKernelFragment::PerPixelLoop);
    std::array<bool, HardwareKernelDescriptor::FragmentCount> listed{};
    for (const auto fragment : KernelCompileOrder)
        listed[static_cast<std::size_t>(fragment)] = true;
    EXPECT_TRUE(std::all_of(listed.begin(), listed.end(), [](bool b) { return b; }));
}

TEST(KernelSource, NothingForAnIncompleteDescriptorOrUnknownLanguage) {
    KernelText kernel = Marked();
    EXPECT_EQ(AssembleKernelSource(kernel.Descriptor(), HardwareKernelLanguage::None), "");
    EXPECT_EQ(AssembleKernelSource(kernel.Descriptor(), static_cast<HardwareKernelLanguage>(7)), "");

    auto missing = kernel.Descriptor();
    missing[HardwareKernelFragment::Blend] = nullptr;
    EXPECT_FALSE(missing.IsComplete());
    EXPECT_EQ(AssembleKernelSource(missing, HardwareKernelLanguage::OpenCLC), "");

    auto noEntry = kernel.Descriptor();
    noEntry.entryPoint = "";
    EXPECT_FALSE(noEntry.IsComplete());

    // An empty fragment is a fragment that adds nothing, not a missing one.
    kernel[HardwareKernelFragment::Blend] = "";
    EXPECT_TRUE(kernel.Descriptor().IsComplete());
}

TEST(KernelCache, RefusesWithoutDeviceOrWithIncompleteDescriptor) {
    const KernelText kernel =
        LoopOnly("kernel void unused_entry(global float* v) { v[0] = 1.0f; }", "unused_entry");
    EXPECT_TRUE(IsKernelBroken(nullptr, kernel.Descriptor()));
    EXPECT_FALSE(IsKernelPendingCompilation(nullptr, kernel.Descriptor()));
    EXPECT_EQ(CompileKernelNow(nullptr, kernel.Descriptor()), nullptr);
    EXPECT_FALSE(ExecuteKernel(nullptr, kernel.Descriptor(), 1, 1, HardwareKernelArguments()));

    REQUIRE_OPENCL_DEVICE(device);
    auto incomplete = kernel.Descriptor();
    incomplete[HardwareKernelFragment::Extend] = nullptr;
    const auto before = GetKernelCacheStatistics(device.Get());
    EXPECT_TRUE(IsKernelBroken(device.Get(), incomplete));
    EXPECT_FALSE(IsKernelPendingCompilation(device.Get(), incomplete));
    EXPECT_EQ(CompileKernelNow(device.Get(), incomplete), nullptr);
    EXPECT_FALSE(ExecuteKernel(device.Get(), incomplete, 1, 1, HardwareKernelArguments()));
    const auto after = GetKernelCacheStatistics(device.Get());
    EXPECT_EQ(after.compilations, before.compilations)
        << "nothing may be compiled for an incomplete descriptor";
    EXPECT_EQ(after.kernels, before.kernels);
}

TEST(KernelCache, FindsKernelsByContentNotByAddress) {
    REQUIRE_OPENCL_DEVICE(device);
    const KernelText original = DeviceTest::AdjustKernel(HardwareKernelLanguage::OpenCLC);
    const auto compiled = CompileKernelNow(device.Get(), original.Descriptor());
    ASSERT_TRUE(compiled);
    ASSERT_TRUE(compiled->IsReady()) << compiled->GetBuildLog();
    const auto before = GetKernelCacheStatistics(device.Get());

    // The same texts rebuilt in other memory find the same kernel.
    const KernelText copy = original;
    ASSERT_NE(copy.Descriptor().fragments[4], original.Descriptor().fragments[4]);
    EXPECT_EQ(FindKernel(device.Get(), copy.Descriptor()), compiled);
    EXPECT_EQ(CompileKernelNow(device.Get(), copy.Descriptor()), compiled);
    EXPECT_FALSE(IsKernelPendingCompilation(device.Get(), copy.Descriptor()));
    EXPECT_FALSE(IsKernelBroken(device.Get(), copy.Descriptor()));

    // Any change of text, of fragment boundaries or of the entry point is another kernel.
    KernelText changed = original;
    changed[HardwareKernelFragment::Blend] = "/* another blend */";
    EXPECT_EQ(FindKernel(device.Get(), changed.Descriptor()), nullptr);

    KernelText shifted = original;
    std::string& process = shifted[HardwareKernelFragment::Process];
    shifted[HardwareKernelFragment::MaskTraits] = process.substr(0, 10);
    process.erase(0, 10);
    EXPECT_EQ(FindKernel(device.Get(), shifted.Descriptor()), nullptr);

    KernelText renamed = original;
    renamed.entryPoint = "adjust2";
    EXPECT_EQ(FindKernel(device.Get(), renamed.Descriptor()), nullptr);

    const auto after = GetKernelCacheStatistics(device.Get());
    EXPECT_EQ(after.compilations, before.compilations) << "looking up never compiles";
    EXPECT_EQ(after.kernels, before.kernels);
}

TEST(KernelCache, BrokenKernelKeepsItsLogAndIsNeverRecompiled) {
    REQUIRE_OPENCL_DEVICE(device);
    const KernelText broken =
        LoopOnly("kernel void broken_entry(global float* v) { v[0] = undeclared_identifier_q7 + 1.0f; }",
                 "broken_entry");
    const auto descriptor = broken.Descriptor();
    const auto before = GetKernelCacheStatistics(device.Get());

    // A wait cut short by the abort flag leaves the kernel compiling in the background.
    const bool abort = true;
    EXPECT_TRUE(IsKernelPendingCompilation(device.Get(), descriptor, true, &abort));

    const auto kernel = CompileKernelNow(device.Get(), descriptor);
    ASSERT_TRUE(kernel);
    EXPECT_TRUE(kernel->IsBroken());
    EXPECT_TRUE(IsKernelBroken(device.Get(), descriptor));
    const std::string log = kernel->GetBuildLog();
    EXPECT_NE(log.find("undeclared_identifier_q7"), std::string::npos) << log;
    EXPECT_EQ(GetKernelBuildLog(device.Get(), descriptor), log);

    // Asking again in every way compiles nothing more.
    EXPECT_FALSE(IsKernelPendingCompilation(device.Get(), descriptor));
    EXPECT_FALSE(IsKernelPendingCompilation(device.Get(), descriptor, true));
    EXPECT_EQ(CompileKernelNow(device.Get(), descriptor), kernel);
    auto values = CreateHardwareBuffer(device.Get(), nullptr, 0, 1, 1, 4);
    ASSERT_TRUE(values);
    EXPECT_FALSE(ExecuteKernel(device.Get(), descriptor, 1, 1, HardwareKernelArguments().AddBuffer(values)));
    EXPECT_TRUE(IsKernelBroken(device.Get(), descriptor));

    const auto after = GetKernelCacheStatistics(device.Get());
    EXPECT_EQ(after.compilations - before.compilations, 1);
    EXPECT_EQ(after.failures - before.failures, 1);
}

TEST(KernelCache, FirstRequestReportsPendingAndMissingEntryPointIsBroken) {
    REQUIRE_OPENCL_DEVICE(device);
    const KernelText kernel =
        LoopOnly("kernel void present_entry(global float* v) { v[0] = 2.0f; }", "absent_entry_point");
    // The first request queues the compilation and reports it pending, however fast the compiler is;
    // CompileKernelNow then takes it over or waits for it.
    EXPECT_TRUE(IsKernelPendingCompilation(device.Get(), kernel.Descriptor()));
    const auto compiled = CompileKernelNow(device.Get(), kernel.Descriptor());
    ASSERT_TRUE(compiled);
    EXPECT_TRUE(compiled->IsBroken());
    EXPECT_FALSE(IsKernelPendingCompilation(device.Get(), kernel.Descriptor()));
    EXPECT_NE(compiled->GetBuildLog().find("absent_entry_point"), std::string::npos)
        << compiled->GetBuildLog();
}

TEST(KernelCache, PendingUntilCompiledWhileManyThreadsAsk) {
    REQUIRE_OPENCL_DEVICE(device);
    const KernelText kernel =
        LoopOnly("kernel void pending_entry(global float* v, float a) { v[get_global_id(0)] += a * 3.0f; }",
                 "pending_entry");
    const auto descriptor = kernel.Descriptor();
    const auto before = GetKernelCacheStatistics(device.Get());
    ASSERT_EQ(FindKernel(device.Get(), descriptor), nullptr) << "this kernel must be new to the cache";

    constexpr int threads = 8;
    std::vector<std::vector<bool>> answers(threads);
    std::latch start(threads);
    std::vector<std::thread> workers;
    for (int t = 0; t < threads; ++t)
        workers.emplace_back([&, t] {
            start.arrive_and_wait();
            // Render threads ask on every tile; each keeps asking until the kernel is ready.
            for (;;) {
                const bool pending = IsKernelPendingCompilation(device.Get(), descriptor);
                answers[t].push_back(pending);
                if (!pending) break;
                std::this_thread::yield();
            }
        });
    for (auto& worker : workers)
        worker.join();

    int firstAnswersPending = 0;
    for (const auto& sequence : answers) {
        ASSERT_FALSE(sequence.empty());
        EXPECT_FALSE(sequence.back());
        firstAnswersPending += sequence.front() ? 1 : 0;
    }
    EXPECT_GE(firstAnswersPending, 1) << "the request that starts the compilation reports it pending";

    EXPECT_FALSE(IsKernelPendingCompilation(device.Get(), descriptor));
    EXPECT_FALSE(IsKernelBroken(device.Get(), descriptor));
    const auto compiled = FindKernel(device.Get(), descriptor);
    ASSERT_TRUE(compiled);
    EXPECT_TRUE(compiled->IsReady()) << compiled->GetBuildLog();

    const auto after = GetKernelCacheStatistics(device.Get());
    EXPECT_EQ(after.compilations - before.compilations, 1) << "one compilation however many threads ask";
    EXPECT_EQ(after.kernels - before.kernels, 1u);
}
