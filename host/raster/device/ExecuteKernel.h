#pragma once
// Runs a compiled kernel over a grid with buffers, a float parameter array and integers.

#include "host/raster/device/HardwareBuffer.h"
#include "host/raster/device/HardwareKernel.h"

#include <cstdint>
#include <span>
#include <string>
#include <vector>

namespace Raster {

// The largest parameter array a kernel is given; a longer one is refused and the caller renders on the
// processor.
inline constexpr std::size_t MaxHardwareKernelParams = 1024;

// The kernel's arguments, in the order of its parameter list. A buffer is a global pointer; the parameter
// array becomes two arguments, a pointer to its floats in device memory (OpenCL: declare it constant or
// global) and its length as an int; Int2 is an int2. Anything malformed (a null buffer, a second parameter
// array, more than MaxHardwareKernelParams floats) marks the whole list invalid, and ExecuteKernel refuses
// it.
class HardwareKernelArguments {
public:
    enum class Kind { Buffer, Params, ParamsLength, Int, Int2, Float };
    struct Argument {
        Kind kind;
        const HardwareBuffer* buffer = nullptr;
        std::int32_t ints[2] = {0, 0};
        float value = 0.0f;
    };

    HardwareKernelArguments& AddBuffer(const Kernel::Counted<HardwareBuffer>& buffer);
    HardwareKernelArguments& AddParams(std::span<const float> params);
    HardwareKernelArguments& AddInt(std::int32_t value);
    HardwareKernelArguments& AddInt2(std::int32_t x, std::int32_t y);
    HardwareKernelArguments& AddFloat(float value);

    bool IsValid() const noexcept { return m_Problem.empty(); }
    // Why the list is invalid; empty when it is valid.
    const std::string& GetProblem() const noexcept { return m_Problem; }
    const std::vector<Argument>& GetArguments() const noexcept { return m_Arguments; }
    const std::vector<float>& GetParams() const noexcept { return m_Params; }

private:
    void Invalidate(std::string problem);

    std::vector<Argument> m_Arguments;
    std::vector<Kernel::Counted<HardwareBuffer>> m_Buffers; // keeps the buffers alive until execution
    std::vector<float> m_Params;
    bool m_HasParams = false;
    std::string m_Problem;
};

// Runs the descriptor's kernel on the device over a width × height grid and waits for it to finish. A kernel
// that was never requested is compiled first, on this thread; one compiling in the background is waited for.
// Returns false, never throws, for: no device, an incomplete descriptor, a broken kernel, invalid arguments,
// buffers of another device, an argument count that does not match the kernel (where the back end can tell),
// an abort, or any failure of the device. An empty grid runs nothing and succeeds.
// OpenCL runs exactly width × height work items. CUDA runs whole 16 × 16 blocks, so a language-0 kernel
// must return early for ids at or beyond the grid size (pass it as ints).
bool ExecuteKernel(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor, int width,
                   int height, const HardwareKernelArguments& arguments, const bool* abort = nullptr);

// The same for a kernel already looked up; false unless it is ready.
bool ExecuteKernel(const HardwareKernel& kernel, int width, int height,
                   const HardwareKernelArguments& arguments, const bool* abort = nullptr);

} // namespace Raster
