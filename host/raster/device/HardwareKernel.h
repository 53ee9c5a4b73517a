#pragma once
// Compute kernels: the descriptor naming one, and the per-device cache that compiles them in the background.

#include "host/raster/device/Hardware.h"

#include <array>
#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <string>

namespace Raster {

// The fourteen source fragments of a kernel, in descriptor order.
enum class HardwareKernelFragment : std::size_t {
    SourceTraits,
    DestTraits,
    MaskTraits,
    Conversion,
    PerPixelLoop,
    SourceAccess,
    DestAccess,
    ReadMask,
    Process,
    Transform,
    Sample,
    Blend,
    Extend,
    Filter,
};

// Identifies one kernel: fourteen pieces of source text and the name of the entry point that the per-pixel
// loop defines. The texts are compared by content, never by address, so a rebuilt text finds its kernel.
struct HardwareKernelDescriptor {
    static constexpr std::size_t FragmentCount = 14;

    std::array<const char*, FragmentCount> fragments{};
    const char* entryPoint = nullptr;

    const char*& operator[](HardwareKernelFragment f) noexcept {
        return fragments[static_cast<std::size_t>(f)];
    }
    const char* operator[](HardwareKernelFragment f) const noexcept {
        return fragments[static_cast<std::size_t>(f)];
    }
    // Every fragment and the entry point present (an empty text counts as present, a null one does not).
    bool IsComplete() const noexcept;
};

// The order in which the fragments are pasted into one source text: traits, access, conversion, then the
// stages callees first, and the per-pixel loop (which calls them all and holds the entry point) last.
inline constexpr std::array<HardwareKernelFragment, HardwareKernelDescriptor::FragmentCount>
    KernelCompileOrder{
        HardwareKernelFragment::SourceTraits, HardwareKernelFragment::DestTraits,
        HardwareKernelFragment::MaskTraits,   HardwareKernelFragment::SourceAccess,
        HardwareKernelFragment::DestAccess,   HardwareKernelFragment::Conversion,
        HardwareKernelFragment::Extend,       HardwareKernelFragment::Transform,
        HardwareKernelFragment::Sample,       HardwareKernelFragment::ReadMask,
        HardwareKernelFragment::Process,      HardwareKernelFragment::Blend,
        HardwareKernelFragment::Filter,       HardwareKernelFragment::PerPixelLoop,
    };

// The complete text a device of this language compiles for the descriptor; empty for an incomplete descriptor
// or an unknown language. Both back ends compile without floating-point contraction, so that a*b+c rounds
// as it does on the processor.
std::string AssembleKernelSource(const HardwareKernelDescriptor& descriptor, HardwareKernelLanguage language);

namespace Detail {
class CompiledProgram;
}

// One kernel of one device: compiling, compiled, or broken (with the compiler's log).
class HardwareKernel : public virtual Kernel::Countable {
public:
    enum class State { Pending, Ready, Broken };

    State GetState() const noexcept;
    bool IsReady() const noexcept { return GetState() == State::Ready; }
    bool IsBroken() const noexcept { return GetState() == State::Broken; }
    // The compiler's messages; never empty for a broken kernel.
    std::string GetBuildLog() const;
    const HardwareDevice* GetDevice() const noexcept { return m_Device; }
    const std::string& GetEntryPoint() const noexcept { return m_EntryPoint; }
    const std::string& GetSource() const noexcept { return m_Source; }

    // Blocks until compiled or broken, or until *abort becomes true; true when the kernel is ready.
    bool WaitUntilCompiled(const bool* abort = nullptr) const;

    // For the device layer: the compiled program of a ready kernel, else null.
    Detail::CompiledProgram* GetProgram() const noexcept;

protected:
    ~HardwareKernel() override;

private:
    friend class Detail::KernelCache;

    HardwareKernel(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor,
                   std::string source);
    bool Matches(const HardwareKernelDescriptor& descriptor) const noexcept;
    // Claims the compilation for the calling thread; false when another thread has it or it is done.
    bool ClaimCompilation() noexcept;
    // Runs a claimed compilation and publishes its result.
    void Compile();
    enum class Phase { Queued, Compiling, Ready, Broken };
    void Finish(std::unique_ptr<Detail::CompiledProgram> program, std::string log);

    const HardwareDevice* m_Device;
    std::array<std::string, HardwareKernelDescriptor::FragmentCount> m_Fragments;
    std::string m_EntryPoint;
    std::string m_Source;

    mutable std::mutex m_Mutex;
    mutable std::condition_variable m_Finished;
    std::atomic<Phase> m_Phase{Phase::Queued};
    std::unique_ptr<Detail::CompiledProgram> m_Program;
    std::string m_Log;
};

// Counters of one device's kernel cache.
struct HardwareKernelCacheStatistics {
    long compilations = 0; // compiles run (a broken kernel is compiled once, never again)
    long failures = 0;     // compiles that left a kernel broken
    std::size_t kernels = 0;
};

// The cached kernel for this descriptor on this device, whatever its state; null when never requested.
Kernel::Counted<HardwareKernel> FindKernel(const HardwareDevice* device,
                                           const HardwareKernelDescriptor& descriptor);

// True when the kernel failed to compile, and for a null device or an incomplete descriptor. Starts nothing.
bool IsKernelBroken(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor);

// True while the kernel is compiling. The first request queues the compilation on the host's compiler thread
// and answers true at once; with wait, the call blocks instead until it is done or *abort becomes true.
// False once compiled, broken included (ask IsKernelBroken), and for a null device or incomplete descriptor.
bool IsKernelPendingCompilation(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor,
                                bool wait = false, const bool* abort = nullptr);

// Compiles on the calling thread (or waits for a compilation already running) and returns the kernel in its
// final state; null for a null device or an incomplete descriptor.
Kernel::Counted<HardwareKernel> CompileKernelNow(const HardwareDevice* device,
                                                 const HardwareKernelDescriptor& descriptor);

// The build log of a cached kernel, for diagnostics; empty when none was kept.
std::string GetKernelBuildLog(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor);

HardwareKernelCacheStatistics GetKernelCacheStatistics(const HardwareDevice* device);

} // namespace Raster
