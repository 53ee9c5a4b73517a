#pragma once
// Compute devices: the kernel languages, one device, and the process-wide list of devices and their
// selection.

#include "host/kernel/Countable.h"

#include <atomic>
#include <cstddef>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace Raster {

// The dialect of kernel text a device compiles.
enum class HardwareKernelLanguage : int {
    None = -1,   // no device: nothing can be compiled
    CudaCpp = 0, // C++ kernel text, compiled by NVRTC and run through the CUDA driver
    OpenCLC = 1, // OpenCL C, run through the system's OpenCL ICD loader
};

enum class HardwareBackEnd { OpenCL, Cuda };

enum class HardwareDeviceKind { Gpu, Cpu, Other };

class HardwareBuffer;

namespace Detail {
class DeviceBackEnd;
class KernelCache;
class BufferPool;
} // namespace Detail

class HardwareDevice;

// A device's in-order command queue: uploads, kernels and read-backs put on one queue run in the order they
// were put there. Each working device has one; a default-made queue is none.
class HardwareQueue {
public:
    HardwareQueue() = default;
    explicit operator bool() const noexcept { return m_Device != nullptr; }
    const HardwareDevice* GetDevice() const noexcept { return m_Device; }
    bool IsOn(const HardwareDevice* device) const noexcept { return m_Device && m_Device == device; }

private:
    friend class HardwareDevice;
    explicit HardwareQueue(const HardwareDevice* device) noexcept
        : m_Device(device) {}
    const HardwareDevice* m_Device = nullptr;
};

// One compute device. Devices are created once by Hardware and live for the whole process.
class HardwareDevice : public virtual Kernel::Countable {
public:
    HardwareDevice(std::string name, std::string identifier, HardwareBackEnd backEnd, HardwareDeviceKind kind,
                   std::unique_ptr<Detail::DeviceBackEnd> implementation);
    // A device that only describes itself and runs nothing (for selection tests and listings).
    HardwareDevice(std::string name, std::string identifier, HardwareBackEnd backEnd,
                   HardwareDeviceKind kind);
    HardwareDevice(const HardwareDevice&) = delete;
    HardwareDevice& operator=(const HardwareDevice&) = delete;

    const std::string& GetName() const noexcept { return m_Name; }
    // "cuda:N" or "opencl:P.D": the back end, then the device's place in that back end's own enumeration.
    const std::string& GetIdentifier() const noexcept { return m_Identifier; }
    HardwareBackEnd GetBackEnd() const noexcept { return m_BackEnd; }
    HardwareDeviceKind GetKind() const noexcept { return m_Kind; }
    HardwareKernelLanguage GetLanguage() const noexcept;
    // One line for logs and `rastertools info`: identifier, name and kind.
    std::string Describe() const;

    // The queue that writes to images on this device go on; none for a describing-only device.
    HardwareQueue GetHardwareWriteQueue() const noexcept {
        return m_Implementation ? HardwareQueue(this) : HardwareQueue();
    }

    // The device layer's own machinery; null for a describing-only device.
    Detail::DeviceBackEnd* GetImplementation() const noexcept { return m_Implementation.get(); }
    Detail::KernelCache& GetKernelCache() const noexcept { return *m_Kernels; }
    Detail::BufferPool& GetBufferPool() const noexcept { return *m_Pool; }

protected:
    ~HardwareDevice() override;

private:
    friend class Hardware;

    std::string m_Name;
    std::string m_Identifier;
    HardwareBackEnd m_BackEnd;
    HardwareDeviceKind m_Kind;
    std::unique_ptr<Detail::DeviceBackEnd> m_Implementation;
    std::unique_ptr<Detail::KernelCache> m_Kernels;
    std::unique_ptr<Detail::BufferPool> m_Pool;
    mutable std::atomic<long> m_FailedKernels{0};
    mutable std::once_flag m_IdentityOnce;
    mutable Kernel::Counted<HardwareBuffer> m_IdentityBuffer;
};

using HardwareDeviceList = std::vector<Kernel::Counted<HardwareDevice>>;

// What a device selector asks for: "auto", "cpu" (no device), "opencl[:N]" or "cuda[:N]".
struct HardwareSelector {
    enum class Choice { Auto, Cpu, OpenCL, Cuda };
    Choice choice = Choice::Auto;
    // N-th device of the named back end, in the order of Hardware::GetDevices().
    std::optional<std::size_t> index;

    friend bool operator==(const HardwareSelector&, const HardwareSelector&) = default;
};

// Parses a selector, ignoring case and surrounding blanks; nothing for an unknown word or a malformed index.
std::optional<HardwareSelector> ParseHardwareSelector(std::string_view text);

// Picks from a list: "auto" prefers a CUDA GPU, then an OpenCL GPU, then an OpenCL CPU device; "cpu" picks
// none.
Kernel::Counted<HardwareDevice> SelectHardwareDevice(const HardwareDeviceList& devices,
                                                     const HardwareSelector& selector);

// The process-wide device registry.
class Hardware {
public:
    // Read by GetDevice when the caller passes no selector.
    static constexpr const char* SelectorVariable = "RASTERTOOLS_DEVICE";

    // Every usable device, found once on first use (thread-safe): CUDA devices, then OpenCL GPUs, then OpenCL
    // CPU devices. Empty where neither back end is present.
    static const HardwareDeviceList& GetDevices();

    // The device for a selector; an empty selector reads RASTERTOOLS_DEVICE, and "auto" when that is unset
    // too. Null means the processor: "cpu", an unknown selector, or no device of the kind asked for.
    static Kernel::Counted<HardwareDevice> GetDevice(std::string_view selector = {});

    // Failed device attempts (each one fell back to the processor). A null device counts separately.
    static void IncrementFailedKernels(const HardwareDevice* device) noexcept;
    static long GetFailedKernels(const HardwareDevice* device) noexcept;

    // A small zero-filled buffer bound to every pixel input a kernel does not use; null without a device.
    static Kernel::Counted<HardwareBuffer> GetIdentityBuffer(const HardwareDevice* device);

private:
    static inline std::atomic<long> s_FailedWithoutDevice{0};
};

// The kernel language of a device; None for no device.
HardwareKernelLanguage GetKernelLanguage(const HardwareDevice* device) noexcept;

// Why the most recent failed device operation on this thread failed (successes leave it as it is).
// For diagnostics and tests only.
const std::string& GetLastHardwareError() noexcept;

} // namespace Raster
