// The OpenCL back end: devices found through the ICD loader, programs built from OpenCL C text.
#define CL_TARGET_OPENCL_VERSION 120
#include <CL/cl.h>

#include "host/raster/device/detail/BackEnd.h"

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <mutex>
#include <string>
#include <system_error>
#include <unistd.h>
#include <vector>

namespace Raster::Detail {

namespace {

std::string ErrorText(cl_int code) {
    const char* name = nullptr;
    switch (code) {
    case CL_DEVICE_NOT_FOUND:
        name = "CL_DEVICE_NOT_FOUND";
        break;
    case CL_DEVICE_NOT_AVAILABLE:
        name = "CL_DEVICE_NOT_AVAILABLE";
        break;
    case CL_COMPILER_NOT_AVAILABLE:
        name = "CL_COMPILER_NOT_AVAILABLE";
        break;
    case CL_MEM_OBJECT_ALLOCATION_FAILURE:
        name = "CL_MEM_OBJECT_ALLOCATION_FAILURE";
        break;
    case CL_OUT_OF_RESOURCES:
        name = "CL_OUT_OF_RESOURCES";
        break;
    case CL_OUT_OF_HOST_MEMORY:
        name = "CL_OUT_OF_HOST_MEMORY";
        break;
    case CL_BUILD_PROGRAM_FAILURE:
        name = "CL_BUILD_PROGRAM_FAILURE";
        break;
    case CL_INVALID_VALUE:
        name = "CL_INVALID_VALUE";
        break;
    case CL_INVALID_DEVICE:
        name = "CL_INVALID_DEVICE";
        break;
    case CL_INVALID_CONTEXT:
        name = "CL_INVALID_CONTEXT";
        break;
    case CL_INVALID_COMMAND_QUEUE:
        name = "CL_INVALID_COMMAND_QUEUE";
        break;
    case CL_INVALID_MEM_OBJECT:
        name = "CL_INVALID_MEM_OBJECT";
        break;
    case CL_INVALID_BUILD_OPTIONS:
        name = "CL_INVALID_BUILD_OPTIONS";
        break;
    case CL_INVALID_PROGRAM:
        name = "CL_INVALID_PROGRAM";
        break;
    case CL_INVALID_PROGRAM_EXECUTABLE:
        name = "CL_INVALID_PROGRAM_EXECUTABLE";
        break;
    case CL_INVALID_KERNEL_NAME:
        name = "CL_INVALID_KERNEL_NAME";
        break;
    case CL_INVALID_KERNEL:
        name = "CL_INVALID_KERNEL";
        break;
    case CL_INVALID_ARG_INDEX:
        name = "CL_INVALID_ARG_INDEX";
        break;
    case CL_INVALID_ARG_VALUE:
        name = "CL_INVALID_ARG_VALUE";
        break;
    case CL_INVALID_ARG_SIZE:
        name = "CL_INVALID_ARG_SIZE";
        break;
    case CL_INVALID_KERNEL_ARGS:
        name = "CL_INVALID_KERNEL_ARGS";
        break;
    case CL_INVALID_WORK_DIMENSION:
        name = "CL_INVALID_WORK_DIMENSION";
        break;
    case CL_INVALID_WORK_GROUP_SIZE:
        name = "CL_INVALID_WORK_GROUP_SIZE";
        break;
    case CL_INVALID_GLOBAL_WORK_SIZE:
        name = "CL_INVALID_GLOBAL_WORK_SIZE";
        break;
    case CL_INVALID_EVENT:
        name = "CL_INVALID_EVENT";
        break;
    case CL_INVALID_OPERATION:
        name = "CL_INVALID_OPERATION";
        break;
    case CL_INVALID_BUFFER_SIZE:
        name = "CL_INVALID_BUFFER_SIZE";
        break;
    case CL_EXEC_STATUS_ERROR_FOR_EVENTS_IN_WAIT_LIST:
        name = "CL_EXEC_STATUS_ERROR_FOR_EVENTS_IN_WAIT_LIST";
        break;
    default:
        break;
    }
    return std::string(name ? name : "OpenCL error") + " (" + std::to_string(code) + ")";
}

bool Failed(const char* what, cl_int code) {
    return Fail(std::string(what) + ": " + ErrorText(code));
}

std::string DeviceText(cl_device_id device, cl_device_info what) {
    std::size_t size = 0;
    if (clGetDeviceInfo(device, what, 0, nullptr, &size) != CL_SUCCESS || size == 0) return {};
    std::string text(size, '\0');
    if (clGetDeviceInfo(device, what, size, text.data(), nullptr) != CL_SUCCESS) return {};
    text.resize(text.find('\0') == std::string::npos ? text.size() : text.find('\0'));
    const auto first = text.find_first_not_of(' ');
    const auto last = text.find_last_not_of(' ');
    return first == std::string::npos ? std::string() : text.substr(first, last - first + 1);
}

template <class T>
T DeviceValue(cl_device_id device, cl_device_info what, T fallback) {
    T value{};
    return clGetDeviceInfo(device, what, sizeof value, &value, nullptr) == CL_SUCCESS ? value : fallback;
}

// "OpenCL 1.2 pocl ..." → true for 1.1 and later (the first version with rectangle copies).
bool SupportsRectangleCopies(const std::string& version) {
    int major = 0, minor = 0;
    if (std::sscanf(version.c_str(), "OpenCL %d.%d", &major, &minor) != 2) return false;
    return major > 1 || (major == 1 && minor >= 1);
}

// PoCL keeps compiled kernels in a cache under the user's home; where that is not writable (sandboxes,
// service accounts) its builds fail, so point it at a private folder in the temporary directory instead.
void EnsureWritableCompilerCache() {
    if (std::getenv("POCL_CACHE_DIR")) return;
    std::filesystem::path cache;
    if (const char* xdg = std::getenv("XDG_CACHE_HOME"); xdg && *xdg)
        cache = xdg;
    else if (const char* home = std::getenv("HOME"); home && *home)
        cache = std::filesystem::path(home) / ".cache";
    std::error_code error;
    if (!cache.empty()) {
        std::filesystem::create_directories(cache, error);
        if (!error && ::access(cache.c_str(), W_OK) == 0) return;
    }
    const auto fallback = std::filesystem::temp_directory_path(error) /
                          ("rastertools-kernel-cache-" + std::to_string(::getuid()));
    if (error) return;
    std::filesystem::create_directories(fallback, error);
    if (!error) ::setenv("POCL_CACHE_DIR", fallback.c_str(), 0);
}

class OpenCLAllocation final : public DeviceAllocation {
public:
    OpenCLAllocation(cl_mem memory, std::size_t bytes)
        : DeviceAllocation(bytes)
        , m_Memory(memory) {}
    ~OpenCLAllocation() override { clReleaseMemObject(m_Memory); }
    cl_mem Get() const noexcept { return m_Memory; }

private:
    cl_mem m_Memory;
};

// A built program and a few kernel objects of its entry point. Kernel arguments belong to the kernel object
// and setting them is not thread-safe, so each launch borrows an object of its own.
class OpenCLProgram final : public CompiledProgram {
public:
    OpenCLProgram(cl_program program, cl_kernel first, std::string entryPoint, cl_uint argumentCount)
        : m_Program(program)
        , m_EntryPoint(std::move(entryPoint))
        , m_ArgumentCount(argumentCount)
        , m_Idle{first} {}
    ~OpenCLProgram() override {
        for (cl_kernel kernel : m_Idle)
            clReleaseKernel(kernel);
        clReleaseProgram(m_Program);
    }

    cl_uint GetArgumentCount() const noexcept { return m_ArgumentCount; }

    cl_kernel Borrow() {
        {
            std::lock_guard lock(m_Mutex);
            if (!m_Idle.empty()) {
                cl_kernel kernel = m_Idle.back();
                m_Idle.pop_back();
                return kernel;
            }
        }
        cl_int error = CL_SUCCESS;
        cl_kernel kernel = clCreateKernel(m_Program, m_EntryPoint.c_str(), &error);
        if (error != CL_SUCCESS) {
            Failed("clCreateKernel", error);
            return nullptr;
        }
        return kernel;
    }

    void GiveBack(cl_kernel kernel) {
        std::lock_guard lock(m_Mutex);
        try {
            m_Idle.push_back(kernel);
        } catch (...) {
            clReleaseKernel(kernel);
        }
    }

private:
    cl_program m_Program;
    std::string m_EntryPoint;
    cl_uint m_ArgumentCount;
    std::mutex m_Mutex;
    std::vector<cl_kernel> m_Idle;
};

class OpenCLDevice final : public DeviceBackEnd {
public:
    OpenCLDevice(cl_platform_id platform, cl_device_id device, std::size_t maxAllocation)
        : m_Platform(platform)
        , m_Device(device)
        , m_MaxAllocation(maxAllocation) {}

    // The context and queue live as long as the process: see Hardware::GetDevices.
    ~OpenCLDevice() override {
        if (m_Queue) clReleaseCommandQueue(m_Queue);
        if (m_Context) clReleaseContext(m_Context);
    }

    HardwareKernelLanguage GetLanguage() const noexcept override { return HardwareKernelLanguage::OpenCLC; }

    // OpenCL lets a single-precision division or square root be off by a few units in the last place; a
    // device that can round them exactly is asked to, so that its pixels match the processor's.
    const char* BuildOptions() const {
        const auto config = DeviceValue<cl_device_fp_config>(m_Device, CL_DEVICE_SINGLE_FP_CONFIG, 0);
        return (config & CL_FP_CORRECTLY_ROUNDED_DIVIDE_SQRT) ? "-cl-fp32-correctly-rounded-divide-sqrt" : "";
    }
    std::size_t GetMaxAllocationBytes() const noexcept override { return m_MaxAllocation; }

    CompileResult Compile(const std::string& source, const std::string& entryPoint) override {
        CompileResult result;
        if (!EnsureContext()) {
            result.log = m_SetupError;
            return result;
        }
        const char* text = source.c_str();
        const std::size_t length = source.size();
        cl_int error = CL_SUCCESS;
        cl_program program = clCreateProgramWithSource(m_Context, 1, &text, &length, &error);
        if (error != CL_SUCCESS) {
            result.log = "clCreateProgramWithSource: " + ErrorText(error);
            return result;
        }
        error = clBuildProgram(program, 1, &m_Device, BuildOptions(), nullptr, nullptr);
        result.log = BuildLog(program);
        if (error != CL_SUCCESS) {
            result.log = "clBuildProgram: " + ErrorText(error) + "\n" + result.log;
            clReleaseProgram(program);
            return result;
        }
        cl_kernel kernel = clCreateKernel(program, entryPoint.c_str(), &error);
        if (error != CL_SUCCESS) {
            result.log = "the program has no kernel named '" + entryPoint + "': " + ErrorText(error) + "\n" +
                         result.log;
            clReleaseProgram(program);
            return result;
        }
        cl_uint arguments = 0;
        clGetKernelInfo(kernel, CL_KERNEL_NUM_ARGS, sizeof arguments, &arguments, nullptr);
        try {
            result.program = std::make_unique<OpenCLProgram>(program, kernel, entryPoint, arguments);
        } catch (...) {
            clReleaseKernel(kernel);
            clReleaseProgram(program);
            result.log = "out of memory";
        }
        return result;
    }

    std::unique_ptr<DeviceAllocation> Allocate(std::size_t bytes) override {
        if (!EnsureContext()) {
            Fail(m_SetupError);
            return nullptr;
        }
        cl_int error = CL_SUCCESS;
        cl_mem memory = clCreateBuffer(m_Context, CL_MEM_READ_WRITE, bytes, nullptr, &error);
        if (error != CL_SUCCESS) {
            Failed("clCreateBuffer", error);
            return nullptr;
        }
        try {
            return std::make_unique<OpenCLAllocation>(memory, bytes);
        } catch (...) {
            clReleaseMemObject(memory);
            throw;
        }
    }

    bool CopyToDevice(DeviceAllocation& memory, const RectCopy& copy, const void* hostImage) override {
        const std::size_t origin[3] = {copy.xBytes, copy.y, 0};
        const std::size_t region[3] = {copy.widthBytes, copy.rows, 1};
        const cl_int error = clEnqueueWriteBufferRect(m_Queue, static_cast<OpenCLAllocation&>(memory).Get(),
                                                      CL_TRUE, origin, origin, region, copy.devicePitch, 0,
                                                      copy.hostPitch, 0, hostImage, 0, nullptr, nullptr);
        return error == CL_SUCCESS || Failed("clEnqueueWriteBufferRect", error);
    }

    bool CopyToHost(const DeviceAllocation& memory, const RectCopy& copy, void* hostImage) override {
        const std::size_t origin[3] = {copy.xBytes, copy.y, 0};
        const std::size_t region[3] = {copy.widthBytes, copy.rows, 1};
        const cl_int error = clEnqueueReadBufferRect(
            m_Queue, static_cast<const OpenCLAllocation&>(memory).Get(), CL_TRUE, origin, origin, region,
            copy.devicePitch, 0, copy.hostPitch, 0, hostImage, 0, nullptr, nullptr);
        return error == CL_SUCCESS || Failed("clEnqueueReadBufferRect", error);
    }

    bool Launch(CompiledProgram& compiled, std::size_t width, std::size_t height,
                std::span<const LaunchArgument> arguments) override {
        auto& program = static_cast<OpenCLProgram&>(compiled);
        if (arguments.size() != program.GetArgumentCount())
            return Fail("the kernel takes " + std::to_string(program.GetArgumentCount()) + " arguments, " +
                        std::to_string(arguments.size()) + " were given");
        cl_kernel kernel = program.Borrow();
        if (!kernel) return false;
        cl_event done = nullptr;
        cl_int error = CL_SUCCESS;
        for (cl_uint i = 0; i < arguments.size() && error == CL_SUCCESS; ++i) {
            const LaunchArgument& argument = arguments[i];
            switch (argument.kind) {
            case LaunchArgument::Kind::Memory: {
                const cl_mem memory = static_cast<const OpenCLAllocation*>(argument.memory)->Get();
                error = clSetKernelArg(kernel, i, sizeof memory, &memory);
                break;
            }
            case LaunchArgument::Kind::Int:
                error = clSetKernelArg(kernel, i, sizeof(cl_int), &argument.ints[0]);
                break;
            case LaunchArgument::Kind::Int2: {
                cl_int2 pair;
                pair.s[0] = argument.ints[0];
                pair.s[1] = argument.ints[1];
                error = clSetKernelArg(kernel, i, sizeof pair, &pair);
                break;
            }
            case LaunchArgument::Kind::Float:
                error = clSetKernelArg(kernel, i, sizeof(cl_float), &argument.value);
                break;
            }
        }
        if (error != CL_SUCCESS) {
            program.GiveBack(kernel);
            return Failed("clSetKernelArg", error);
        }
        const std::size_t global[2] = {width, height};
        error = clEnqueueNDRangeKernel(m_Queue, kernel, 2, nullptr, global, nullptr, 0, nullptr, &done);
        // Arguments are captured when the kernel is enqueued, so the object can serve another launch now.
        program.GiveBack(kernel);
        if (error != CL_SUCCESS) return Failed("clEnqueueNDRangeKernel", error);
        error = clWaitForEvents(1, &done);
        cl_int status = CL_COMPLETE;
        if (error == CL_SUCCESS)
            error = clGetEventInfo(done, CL_EVENT_COMMAND_EXECUTION_STATUS, sizeof status, &status, nullptr);
        clReleaseEvent(done);
        if (error != CL_SUCCESS) return Failed("clWaitForEvents", error);
        return status == CL_COMPLETE || Failed("the kernel ended abnormally", status);
    }

private:
    bool EnsureContext() {
        std::call_once(m_SetupOnce, [this] {
            const cl_context_properties properties[] = {
                CL_CONTEXT_PLATFORM, reinterpret_cast<cl_context_properties>(m_Platform), 0};
            cl_int error = CL_SUCCESS;
            m_Context = clCreateContext(properties, 1, &m_Device, nullptr, nullptr, &error);
            if (error != CL_SUCCESS) {
                m_Context = nullptr;
                m_SetupError = "clCreateContext: " + ErrorText(error);
                return;
            }
            m_Queue = clCreateCommandQueue(m_Context, m_Device, 0, &error);
            if (error != CL_SUCCESS) {
                m_Queue = nullptr;
                m_SetupError = "clCreateCommandQueue: " + ErrorText(error);
            }
        });
        return m_Queue != nullptr;
    }

    std::string BuildLog(cl_program program) const {
        std::size_t size = 0;
        if (clGetProgramBuildInfo(program, m_Device, CL_PROGRAM_BUILD_LOG, 0, nullptr, &size) != CL_SUCCESS)
            return {};
        std::string log(size, '\0');
        if (size && clGetProgramBuildInfo(program, m_Device, CL_PROGRAM_BUILD_LOG, size, log.data(),
                                          nullptr) != CL_SUCCESS)
            return {};
        while (!log.empty() && (log.back() == '\0' || log.back() == '\n' || log.back() == ' '))
            log.pop_back();
        return log;
    }

    cl_platform_id m_Platform;
    cl_device_id m_Device;
    std::size_t m_MaxAllocation;
    std::once_flag m_SetupOnce;
    cl_context m_Context = nullptr;
    cl_command_queue m_Queue = nullptr;
    std::string m_SetupError;
};

} // namespace

HardwareDeviceList EnumerateOpenCLDevices() {
    HardwareDeviceList gpus, cpus;
    try {
        EnsureWritableCompilerCache();
        cl_uint platformCount = 0;
        // The ICD loader answers an error, not zero platforms, when none is installed.
        if (clGetPlatformIDs(0, nullptr, &platformCount) != CL_SUCCESS || platformCount == 0) return {};
        std::vector<cl_platform_id> platforms(platformCount);
        if (clGetPlatformIDs(platformCount, platforms.data(), nullptr) != CL_SUCCESS) return {};

        for (cl_uint p = 0; p < platformCount; ++p) {
            cl_uint deviceCount = 0;
            if (clGetDeviceIDs(platforms[p], CL_DEVICE_TYPE_ALL, 0, nullptr, &deviceCount) != CL_SUCCESS)
                continue;
            std::vector<cl_device_id> devices(deviceCount);
            if (clGetDeviceIDs(platforms[p], CL_DEVICE_TYPE_ALL, deviceCount, devices.data(), nullptr) !=
                CL_SUCCESS)
                continue;
            for (cl_uint d = 0; d < deviceCount; ++d) {
                const cl_device_id id = devices[d];
                const auto type = DeviceValue<cl_device_type>(id, CL_DEVICE_TYPE, 0);
                const bool gpu = (type & CL_DEVICE_TYPE_GPU) != 0;
                const bool cpu = (type & CL_DEVICE_TYPE_CPU) != 0;
                if (!gpu && !cpu) continue;
                if (!DeviceValue<cl_bool>(id, CL_DEVICE_AVAILABLE, CL_FALSE) ||
                    !DeviceValue<cl_bool>(id, CL_DEVICE_COMPILER_AVAILABLE, CL_FALSE) ||
                    !SupportsRectangleCopies(DeviceText(id, CL_DEVICE_VERSION)))
                    continue;
                const auto maxAllocation = DeviceValue<cl_ulong>(id, CL_DEVICE_MAX_MEM_ALLOC_SIZE, 0);
                std::string name = DeviceText(id, CL_DEVICE_NAME);
                if (name.empty()) name = "OpenCL device";
                Kernel::Counted<HardwareDevice> device(new HardwareDevice(
                    std::move(name), "opencl:" + std::to_string(p) + "." + std::to_string(d),
                    HardwareBackEnd::OpenCL, gpu ? HardwareDeviceKind::Gpu : HardwareDeviceKind::Cpu,
                    std::make_unique<OpenCLDevice>(platforms[p], id,
                                                   static_cast<std::size_t>(maxAllocation))));
                (gpu ? gpus : cpus).push_back(std::move(device));
            }
        }
    } catch (...) {
        return {};
    }
    gpus.insert(gpus.end(), cpus.begin(), cpus.end());
    return gpus;
}

} // namespace Raster::Detail
