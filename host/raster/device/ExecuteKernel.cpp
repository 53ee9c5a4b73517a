// Kernel arguments and kernel execution.
#include "host/raster/device/ExecuteKernel.h"

#include "host/raster/device/detail/DeviceState.h"

namespace Raster {

namespace {

bool IsAborted(const bool* abort) noexcept {
    return abort && __atomic_load_n(abort, __ATOMIC_RELAXED);
}

// Parameter arrays always take a block of the largest size, so that the pool serves every launch.
constexpr std::size_t ParamsBlockBytes = MaxHardwareKernelParams * sizeof(float);

// Returns the parameter block to the pool however the launch ends.
struct PooledMemory {
    Detail::BufferPool& pool;
    std::unique_ptr<Detail::DeviceAllocation> memory;
    ~PooledMemory() { pool.Give(std::move(memory)); }
};

} // namespace

void HardwareKernelArguments::Invalidate(std::string problem) {
    if (m_Problem.empty()) m_Problem = std::move(problem);
}

HardwareKernelArguments& HardwareKernelArguments::AddBuffer(const Kernel::Counted<HardwareBuffer>& buffer) {
    if (!buffer) Invalidate("argument " + std::to_string(m_Arguments.size()) + " is a null buffer");
    m_Buffers.push_back(buffer);
    Argument argument{Kind::Buffer};
    argument.buffer = buffer.Get();
    m_Arguments.push_back(argument);
    return *this;
}

HardwareKernelArguments& HardwareKernelArguments::AddParams(std::span<const float> params) {
    if (m_HasParams) Invalidate("a kernel takes one parameter array");
    if (params.size() > MaxHardwareKernelParams)
        Invalidate(std::to_string(params.size()) + " parameters, more than the " +
                   std::to_string(MaxHardwareKernelParams) + " a kernel may take");
    m_HasParams = true;
    m_Params.assign(params.begin(), params.end());
    m_Arguments.push_back(Argument{Kind::Params});
    Argument length{Kind::ParamsLength};
    length.ints[0] = static_cast<std::int32_t>(params.size());
    m_Arguments.push_back(length);
    return *this;
}

HardwareKernelArguments& HardwareKernelArguments::AddInt(std::int32_t value) {
    Argument argument{Kind::Int};
    argument.ints[0] = value;
    m_Arguments.push_back(argument);
    return *this;
}

HardwareKernelArguments& HardwareKernelArguments::AddInt2(std::int32_t x, std::int32_t y) {
    Argument argument{Kind::Int2};
    argument.ints[0] = x;
    argument.ints[1] = y;
    m_Arguments.push_back(argument);
    return *this;
}

HardwareKernelArguments& HardwareKernelArguments::AddFloat(float value) {
    Argument argument{Kind::Float};
    argument.value = value;
    m_Arguments.push_back(argument);
    return *this;
}

bool ExecuteKernel(const HardwareKernel& kernel, int width, int height,
                   const HardwareKernelArguments& arguments, const bool* abort) {
    try {
        const HardwareDevice* device = kernel.GetDevice();
        Detail::DeviceBackEnd* backEnd = device ? device->GetImplementation() : nullptr;
        if (!backEnd) return Detail::Fail("no compute device");
        if (!arguments.IsValid()) return Detail::Fail(arguments.GetProblem());
        if (width < 0 || height < 0) return Detail::Fail("negative grid size");
        Detail::CompiledProgram* program = kernel.GetProgram();
        if (!program) return Detail::Fail("the kernel is not compiled");
        if (width == 0 || height == 0) return true;

        std::vector<Detail::LaunchArgument> launch;
        launch.reserve(arguments.GetArguments().size());
        PooledMemory params{device->GetBufferPool(), nullptr};
        for (const auto& argument : arguments.GetArguments()) {
            Detail::LaunchArgument bound;
            switch (argument.kind) {
            case HardwareKernelArguments::Kind::Buffer:
                if (argument.buffer->GetDevice() != device)
                    return Detail::Fail("a buffer belongs to another device");
                bound.kind = Detail::LaunchArgument::Kind::Memory;
                bound.memory = &argument.buffer->GetAllocation();
                break;
            case HardwareKernelArguments::Kind::Params: {
                params.memory = device->GetBufferPool().Take(*backEnd, ParamsBlockBytes);
                if (!params.memory) return false;
                const auto& values = arguments.GetParams();
                if (!values.empty()) {
                    Detail::RectCopy copy;
                    copy.widthBytes = values.size() * sizeof(float);
                    copy.rows = 1;
                    copy.devicePitch = copy.hostPitch = copy.widthBytes;
                    if (!backEnd->CopyToDevice(*params.memory, copy, values.data())) return false;
                }
                bound.kind = Detail::LaunchArgument::Kind::Memory;
                bound.memory = params.memory.get();
                break;
            }
            case HardwareKernelArguments::Kind::ParamsLength:
            case HardwareKernelArguments::Kind::Int:
                bound.kind = Detail::LaunchArgument::Kind::Int;
                bound.ints[0] = argument.ints[0];
                break;
            case HardwareKernelArguments::Kind::Int2:
                bound.kind = Detail::LaunchArgument::Kind::Int2;
                bound.ints[0] = argument.ints[0];
                bound.ints[1] = argument.ints[1];
                break;
            case HardwareKernelArguments::Kind::Float:
                bound.kind = Detail::LaunchArgument::Kind::Float;
                bound.value = argument.value;
                break;
            }
            launch.push_back(bound);
        }
        if (IsAborted(abort)) return Detail::Fail("aborted");
        return backEnd->Launch(*program, static_cast<std::size_t>(width), static_cast<std::size_t>(height),
                               launch);
    } catch (const std::exception& error) {
        return Detail::Fail(std::string("executing the kernel failed: ") + error.what());
    } catch (...) {
        return Detail::Fail("executing the kernel failed");
    }
}

bool ExecuteKernel(const HardwareDevice* device, const HardwareKernelDescriptor& descriptor, int width,
                   int height, const HardwareKernelArguments& arguments, const bool* abort) {
    try {
        if (!device || !device->GetImplementation()) return Detail::Fail("no compute device");
        if (!descriptor.IsComplete())
            return Detail::Fail("the kernel descriptor lacks a fragment or its entry point");
        if (!arguments.IsValid()) return Detail::Fail(arguments.GetProblem());
        if (width < 0 || height < 0) return Detail::Fail("negative grid size");
        if (width == 0 || height == 0) return true;
        if (IsAborted(abort)) return Detail::Fail("aborted");
        auto kernel = FindKernel(device, descriptor);
        // Compiles here when nobody asked before, or takes over a compilation still waiting in the queue.
        if (!kernel || kernel->GetState() == HardwareKernel::State::Pending)
            kernel = CompileKernelNow(device, descriptor);
        if (!kernel) return false;
        if (!kernel->IsReady()) return Detail::Fail("the kernel did not compile");
        return ExecuteKernel(*kernel, width, height, arguments, abort);
    } catch (...) {
        return Detail::Fail("executing the kernel failed");
    }
}

} // namespace Raster
