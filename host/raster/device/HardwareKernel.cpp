// Kernel descriptors, the per-device kernel cache and the background compiler thread.
#include "host/raster/device/HardwareKernel.h"

#include "host/raster/device/detail/DeviceState.h"

#include <chrono>
#include <deque>
#include <functional>
#include <string_view>
#include <thread>

namespace Raster {

namespace {

constexpr std::array<const char*, HardwareKernelDescriptor::FragmentCount> FragmentNames{
    "source traits",
    "destination traits",
    "mask traits",
    "conversion",
    "per-pixel loop",
    "source access",
    "destination access",
    "read mask",
    "process",
    "transform",
    "sample",
    "blend",
    "extend",
    "filter",
};

bool IsAborted(const bool* abort) noexcept {
    return abort && __atomic_load_n(abort, __ATOMIC_RELAXED);
}

bool CanCompile(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor) {
    if (!device || !device->GetImplementation()) return Detail::Fail("no compute device");
    if (!descriptor.IsComplete())
        return Detail::Fail("the kernel descriptor lacks a fragment or its entry point");
    return true;
}

// The host's compiler thread: compiles queued kernels one after another, so that render threads never wait
// for a compiler. Started on first use; joined at exit so that no compile runs while drivers unload.
class CompileQueue {
public:
    static CompileQueue& Get() {
        static CompileQueue queue;
        return queue;
    }

    void Push(Kernel::Counted<HardwareKernel> kernel) {
        {
            std::lock_guard lock(m_Mutex);
            if (m_Stopping) return;
            m_Queue.push_back(std::move(kernel));
            if (!m_Worker.joinable()) m_Worker = std::thread([this] { Run(); });
        }
        m_Wake.notify_one();
    }

    ~CompileQueue() {
        {
            std::lock_guard lock(m_Mutex);
            m_Stopping = true;
            m_Queue.clear();
        }
        m_Wake.notify_all();
        if (m_Worker.joinable()) m_Worker.join();
    }

private:
    CompileQueue() = default;

    void Run() {
        for (;;) {
            Kernel::Counted<HardwareKernel> kernel;
            {
                std::unique_lock lock(m_Mutex);
                m_Wake.wait(lock, [this] { return m_Stopping || !m_Queue.empty(); });
                if (m_Stopping) return;
                kernel = std::move(m_Queue.front());
                m_Queue.pop_front();
            }
            Detail::KernelCache::CompileIfUnclaimed(*kernel);
        }
    }

    std::mutex m_Mutex;
    std::condition_variable m_Wake;
    std::deque<Kernel::Counted<HardwareKernel>> m_Queue;
    bool m_Stopping = false;
    std::thread m_Worker;
};

} // namespace

bool HardwareKernelDescriptor::IsComplete() const noexcept {
    if (!entryPoint || !*entryPoint) return false;
    for (const char* fragment : fragments)
        if (!fragment) return false;
    return true;
}

std::string AssembleKernelSource(const HardwareKernelDescriptor& descriptor,
                                 HardwareKernelLanguage language) {
    if (!descriptor.IsComplete()) return {};
    std::string source;
    switch (language) {
    case HardwareKernelLanguage::OpenCLC:
        source = "#pragma OPENCL FP_CONTRACT OFF\n";
        break;
    case HardwareKernelLanguage::CudaCpp:
        break; // contraction is switched off by a compiler option
    case HardwareKernelLanguage::None:
        return {};
    default:
        return {};
    }
    for (const HardwareKernelFragment fragment : KernelCompileOrder) {
        const auto index = static_cast<std::size_t>(fragment);
        source += "\n// ";
        source += FragmentNames[index];
        source += '\n';
        source += descriptor.fragments[index];
        source += '\n';
    }
    return source;
}

// ---- HardwareKernel

HardwareKernel::HardwareKernel(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor,
                               std::string source)
    : m_Device(device)
    , m_EntryPoint(descriptor.entryPoint)
    , m_Source(std::move(source)) {
    for (std::size_t i = 0; i < HardwareKernelDescriptor::FragmentCount; ++i)
        m_Fragments[i] = descriptor.fragments[i];
}

HardwareKernel::~HardwareKernel() = default;

HardwareKernel::State HardwareKernel::GetState() const noexcept {
    switch (m_Phase.load(std::memory_order_acquire)) {
    case Phase::Ready:
        return State::Ready;
    case Phase::Broken:
        return State::Broken;
    case Phase::Queued:
    case Phase::Compiling:
        break;
    }
    return State::Pending;
}

std::string HardwareKernel::GetBuildLog() const {
    std::lock_guard lock(m_Mutex);
    return m_Log;
}

Detail::CompiledProgram* HardwareKernel::GetProgram() const noexcept {
    return m_Phase.load(std::memory_order_acquire) == Phase::Ready ? m_Program.get() : nullptr;
}

bool HardwareKernel::WaitUntilCompiled(const bool* abort) const {
    std::unique_lock lock(m_Mutex);
    for (;;) {
        const Phase phase = m_Phase.load(std::memory_order_acquire);
        if (phase == Phase::Ready) return true;
        if (phase == Phase::Broken || IsAborted(abort)) return false;
        // The abort flag is the host's plain bool and signals nothing, so look at it now and then.
        if (abort)
            m_Finished.wait_for(lock, std::chrono::milliseconds(5));
        else
            m_Finished.wait(lock);
    }
}

bool HardwareKernel::Matches(const HardwareKernelDescriptor& descriptor) const noexcept {
    if (m_EntryPoint != std::string_view(descriptor.entryPoint)) return false;
    for (std::size_t i = 0; i < HardwareKernelDescriptor::FragmentCount; ++i)
        if (m_Fragments[i] != std::string_view(descriptor.fragments[i])) return false;
    return true;
}

bool HardwareKernel::ClaimCompilation() noexcept {
    Phase expected = Phase::Queued;
    return m_Phase.compare_exchange_strong(expected, Phase::Compiling, std::memory_order_acq_rel);
}

void HardwareKernel::Compile() {
    Detail::CompileResult result;
    try {
        if (auto* backEnd = m_Device->GetImplementation())
            result = backEnd->Compile(m_Source, m_EntryPoint);
        else
            result.log = "no compute device";
    } catch (const std::exception& error) {
        result = {nullptr, std::string("the compiler failed: ") + error.what()};
    } catch (...) {
        result = {nullptr, "the compiler failed"};
    }
    const bool failed = !result.program;
    if (failed && result.log.empty())
        result.log = "the kernel did not compile and the compiler left no message";
    m_Device->GetKernelCache().CountCompilation(failed);
    Finish(std::move(result.program), std::move(result.log));
}

void HardwareKernel::Finish(std::unique_ptr<Detail::CompiledProgram> program, std::string log) {
    {
        std::lock_guard lock(m_Mutex);
        const bool ready = program != nullptr;
        m_Program = std::move(program);
        m_Log = std::move(log);
        m_Phase.store(ready ? Phase::Ready : Phase::Broken, std::memory_order_release);
    }
    m_Finished.notify_all();
}

// ---- KernelCache

namespace Detail {

std::size_t KernelCache::Hash(const HardwareKernelDescriptor& descriptor) noexcept {
    const std::hash<std::string_view> hash;
    std::size_t h = hash(descriptor.entryPoint);
    for (const char* fragment : descriptor.fragments) {
        // Order matters and fragment boundaries matter: mix before adding each text's own hash.
        h = (h ^ (h >> 31)) * 0x9E3779B97F4A7C15ull;
        h ^= hash(fragment);
    }
    return h;
}

Kernel::Counted<HardwareKernel> KernelCache::FindLocked(const HardwareKernelDescriptor& descriptor,
                                                        std::size_t hash) const {
    const auto bucket = m_Kernels.find(hash);
    if (bucket == m_Kernels.end()) return {};
    for (const auto& kernel : bucket->second)
        if (kernel->Matches(descriptor)) return kernel;
    return {};
}

Kernel::Counted<HardwareKernel> KernelCache::Find(const HardwareKernelDescriptor& descriptor) const {
    const std::size_t hash = Hash(descriptor);
    std::shared_lock lock(m_Mutex);
    return FindLocked(descriptor, hash);
}

Kernel::Counted<HardwareKernel> KernelCache::FindOrCreate(const HardwareKernelDescriptor& descriptor,
                                                          bool& created) {
    created = false;
    const std::size_t hash = Hash(descriptor);
    {
        std::shared_lock lock(m_Mutex);
        if (auto kernel = FindLocked(descriptor, hash)) return kernel;
    }
    // Assembled outside the lock: it can be long, and a racing thread merely wastes one copy.
    std::string source = AssembleKernelSource(descriptor, m_Device->GetLanguage());
    std::unique_lock lock(m_Mutex);
    if (auto kernel = FindLocked(descriptor, hash)) return kernel;
    Kernel::Counted<HardwareKernel> kernel(new HardwareKernel(m_Device, descriptor, std::move(source)));
    m_Kernels[hash].push_back(kernel);
    ++m_Count;
    created = true;
    return kernel;
}

void KernelCache::CompileIfUnclaimed(HardwareKernel& kernel) {
    if (kernel.ClaimCompilation()) kernel.Compile();
}

void KernelCache::CountCompilation(bool failed) noexcept {
    m_Compilations.fetch_add(1, std::memory_order_relaxed);
    if (failed) m_Failures.fetch_add(1, std::memory_order_relaxed);
}

HardwareKernelCacheStatistics KernelCache::GetStatistics() const {
    HardwareKernelCacheStatistics statistics;
    statistics.compilations = m_Compilations.load(std::memory_order_relaxed);
    statistics.failures = m_Failures.load(std::memory_order_relaxed);
    std::shared_lock lock(m_Mutex);
    statistics.kernels = m_Count;
    return statistics;
}

} // namespace Detail

// ---- the cache's public face

Kernel::Counted<HardwareKernel> FindKernel(const HardwareDevice* device,
                                           const HardwareKernelDescriptor& descriptor) {
    if (!CanCompile(device, descriptor)) return {};
    try {
        return device->GetKernelCache().Find(descriptor);
    } catch (...) {
        Detail::Fail("out of memory looking up a kernel");
        return {};
    }
}

bool IsKernelBroken(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor) {
    if (!CanCompile(device, descriptor)) return true;
    const auto kernel = FindKernel(device, descriptor);
    return kernel && kernel->IsBroken();
}

bool IsKernelPendingCompilation(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor,
                                bool wait, const bool* abort) {
    if (!CanCompile(device, descriptor)) return false;
    try {
        bool created = false;
        auto kernel = device->GetKernelCache().FindOrCreate(descriptor, created);
        if (!kernel) return false;
        if (created) {
            CompileQueue::Get().Push(kernel);
            // The request that starts a compilation always reports it pending, however fast the compiler is.
            if (!wait) return true;
        }
        if (wait) kernel->WaitUntilCompiled(abort);
        return kernel->GetState() == HardwareKernel::State::Pending;
    } catch (...) {
        // Cannot tell: report it pending so that the caller renders on the processor this time.
        Detail::Fail("out of memory queueing a kernel compilation");
        return true;
    }
}

Kernel::Counted<HardwareKernel> CompileKernelNow(const HardwareDevice* device,
                                                 const HardwareKernelDescriptor& descriptor) {
    if (!CanCompile(device, descriptor)) return {};
    try {
        bool created = false;
        auto kernel = device->GetKernelCache().FindOrCreate(descriptor, created);
        if (!kernel) return {};
        Detail::KernelCache::CompileIfUnclaimed(*kernel);
        kernel->WaitUntilCompiled();
        return kernel;
    } catch (...) {
        Detail::Fail("out of memory compiling a kernel");
        return {};
    }
}

std::string GetKernelBuildLog(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor) {
    const auto kernel = FindKernel(device, descriptor);
    return kernel ? kernel->GetBuildLog() : std::string();
}

HardwareKernelCacheStatistics GetKernelCacheStatistics(const HardwareDevice* device) {
    return device ? device->GetKernelCache().GetStatistics() : HardwareKernelCacheStatistics{};
}

} // namespace Raster
