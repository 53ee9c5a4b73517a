#pragma once
// What each compute back end (OpenCL, CUDA) provides to the device layer. Internal to HostDevice.

#include "host/raster/device/Hardware.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>

namespace Raster::Detail {

// Raw memory on one device.
class DeviceAllocation {
public:
    explicit DeviceAllocation(std::size_t bytes)
        : m_Bytes(bytes) {}
    virtual ~DeviceAllocation() = default;
    DeviceAllocation(const DeviceAllocation&) = delete;
    DeviceAllocation& operator=(const DeviceAllocation&) = delete;
    std::size_t GetByteSize() const noexcept { return m_Bytes; }

private:
    std::size_t m_Bytes;
};

// A compiled program with its entry point resolved.
class CompiledProgram {
public:
    virtual ~CompiledProgram() = default;
};

// A rectangle of bytes shared by a host image and a device allocation at the same position: xBytes and y
// locate its first byte in both, each with its own row pitch.
struct RectCopy {
    std::size_t xBytes = 0;
    std::size_t y = 0;
    std::size_t widthBytes = 0;
    std::size_t rows = 0;
    std::size_t devicePitch = 0;
    std::size_t hostPitch = 0;
};

// One kernel argument as the back end binds it.
struct LaunchArgument {
    enum class Kind { Memory, Int, Int2, Float };
    Kind kind = Kind::Int;
    const DeviceAllocation* memory = nullptr;
    std::int32_t ints[2] = {0, 0};
    float value = 0.0f;
};

struct CompileResult {
    std::unique_ptr<CompiledProgram> program; // null when the compile failed
    std::string log;
};

// One device's back end. Every function is thread-safe and reports failure by its result (with a reason in
// SetLastHardwareError), never by throwing.
class DeviceBackEnd {
public:
    virtual ~DeviceBackEnd() = default;

    virtual HardwareKernelLanguage GetLanguage() const noexcept = 0;
    // The largest single allocation the device accepts.
    virtual std::size_t GetMaxAllocationBytes() const noexcept = 0;

    virtual CompileResult Compile(const std::string& source, const std::string& entryPoint) = 0;
    virtual std::unique_ptr<DeviceAllocation> Allocate(std::size_t bytes) = 0;
    virtual bool CopyToDevice(DeviceAllocation& memory, const RectCopy& copy, const void* hostImage) = 0;
    virtual bool CopyToHost(const DeviceAllocation& memory, const RectCopy& copy, void* hostImage) = 0;
    // Runs program over width × height items and waits for it.
    virtual bool Launch(CompiledProgram& program, std::size_t width, std::size_t height,
                        std::span<const LaunchArgument> arguments) = 0;
};

// Records why an operation failed, for GetLastHardwareError; returns false so callers can `return Fail(...)`.
bool Fail(std::string reason);

// Devices found by each back end, in their own order (GPUs before CPU devices).
HardwareDeviceList EnumerateOpenCLDevices();
HardwareDeviceList EnumerateCudaDevices();

} // namespace Raster::Detail
