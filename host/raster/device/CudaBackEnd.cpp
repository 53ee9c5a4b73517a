// The CUDA back end: the driver library and NVRTC opened at run time, language-0 text compiled to PTX.
// No CUDA header is included and nothing links against CUDA, so the host runs where CUDA is absent; the few
// types and constants used are declared below as the driver and NVRTC documentation describe them.
#include "host/raster/device/CudaCompiler.h"
#include "host/raster/device/detail/BackEnd.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <filesystem>
#include <mutex>
#include <vector>

namespace Raster {

namespace {

// ---- CUDA driver API declarations

using CUresult = int;
using CUdevice = int;
using CUdeviceptr = unsigned long long;
struct CUctx_st;
struct CUmod_st;
struct CUfunc_st;
struct CUstream_st;
struct CUarray_st;
using CUcontext = CUctx_st*;
using CUmodule = CUmod_st*;
using CUfunction = CUfunc_st*;
using CUstream = CUstream_st*;
using CUarray = CUarray_st*;

constexpr CUresult CudaSuccess = 0;
constexpr int AttributeComputeCapabilityMajor = 75;
constexpr int AttributeComputeCapabilityMinor = 76;
constexpr unsigned MemoryTypeHost = 1;
constexpr unsigned MemoryTypeDevice = 2;
constexpr unsigned StreamNonBlocking = 1;
constexpr int JitInfoLogBuffer = 3;
constexpr int JitInfoLogBufferSize = 4;
constexpr int JitErrorLogBuffer = 5;
constexpr int JitErrorLogBufferSize = 6;

// The driver's 2D copy record (CUDA_MEMCPY2D); the memory-type fields are a C enum, hence unsigned.
struct CudaCopy2D {
    std::size_t srcXInBytes;
    std::size_t srcY;
    unsigned srcMemoryType;
    const void* srcHost;
    CUdeviceptr srcDevice;
    CUarray srcArray;
    std::size_t srcPitch;
    std::size_t dstXInBytes;
    std::size_t dstY;
    unsigned dstMemoryType;
    void* dstHost;
    CUdeviceptr dstDevice;
    CUarray dstArray;
    std::size_t dstPitch;
    std::size_t WidthInBytes;
    std::size_t Height;
};

struct DriverApi {
    CUresult (*init)(unsigned) = nullptr;
    CUresult (*deviceGetCount)(int*) = nullptr;
    CUresult (*deviceGet)(CUdevice*, int) = nullptr;
    CUresult (*deviceGetName)(char*, int, CUdevice) = nullptr;
    CUresult (*deviceGetAttribute)(int*, int, CUdevice) = nullptr;
    CUresult (*deviceTotalMem)(std::size_t*, CUdevice) = nullptr;
    CUresult (*primaryCtxRetain)(CUcontext*, CUdevice) = nullptr;
    CUresult (*ctxPushCurrent)(CUcontext) = nullptr;
    CUresult (*ctxPopCurrent)(CUcontext*) = nullptr;
    CUresult (*moduleLoadDataEx)(CUmodule*, const void*, unsigned, int*, void**) = nullptr;
    CUresult (*moduleGetFunction)(CUfunction*, CUmodule, const char*) = nullptr;
    CUresult (*moduleUnload)(CUmodule) = nullptr;
    CUresult (*memAlloc)(CUdeviceptr*, std::size_t) = nullptr;
    CUresult (*memFree)(CUdeviceptr) = nullptr;
    CUresult (*memcpy2D)(const CudaCopy2D*) = nullptr;
    CUresult (*streamCreate)(CUstream*, unsigned) = nullptr;
    CUresult (*streamSynchronize)(CUstream) = nullptr;
    CUresult (*streamDestroy)(CUstream) = nullptr;
    CUresult (*launchKernel)(CUfunction, unsigned, unsigned, unsigned, unsigned, unsigned, unsigned, unsigned,
                             CUstream, void**, void**) = nullptr;
    CUresult (*getErrorName)(CUresult, const char**) = nullptr;
};

// ---- NVRTC declarations

struct NvrtcProgramRecord;
using NvrtcProgram = NvrtcProgramRecord*;
using NvrtcResult = int;
constexpr NvrtcResult NvrtcSuccess = 0;

struct NvrtcApi {
    NvrtcResult (*version)(int*, int*) = nullptr;
    NvrtcResult (*createProgram)(NvrtcProgram*, const char*, const char*, int, const char* const*,
                                 const char* const*) = nullptr;
    NvrtcResult (*compileProgram)(NvrtcProgram, int, const char* const*) = nullptr;
    NvrtcResult (*getProgramLogSize)(NvrtcProgram, std::size_t*) = nullptr;
    NvrtcResult (*getProgramLog)(NvrtcProgram, char*) = nullptr;
    NvrtcResult (*getPtxSize)(NvrtcProgram, std::size_t*) = nullptr;
    NvrtcResult (*getPtx)(NvrtcProgram, char*) = nullptr;
    NvrtcResult (*destroyProgram)(NvrtcProgram*) = nullptr;
    const char* (*getErrorString)(NvrtcResult) = nullptr;
    // Absent from old releases; without them the device's own architecture is asked for as it is.
    NvrtcResult (*getNumSupportedArchs)(int*) = nullptr;
    NvrtcResult (*getSupportedArchs)(int*) = nullptr;
};

// ---- library loading

// Opens the first library that loads; never closed, since compiled modules and contexts refer into them.
void* OpenFirst(const std::vector<std::string>& candidates, std::string& opened) {
    for (const auto& candidate : candidates) {
        if (void* handle = ::dlopen(candidate.c_str(), RTLD_NOW | RTLD_LOCAL)) {
            opened = candidate;
            return handle;
        }
    }
    return nullptr;
}

template <class Function>
bool Resolve(void* library, Function& function, const char* name, bool versioned = false) {
    void* symbol = nullptr;
    // Functions whose arguments grew to 64 bits are exported under a _v2 name beside the old one.
    if (versioned) symbol = ::dlsym(library, (std::string(name) + "_v2").c_str());
    if (!symbol) symbol = ::dlsym(library, name);
    function = reinterpret_cast<Function>(symbol);
    return symbol != nullptr;
}

std::vector<std::string> NvrtcCandidates() {
    const char* names[] = {"libnvrtc.so",      "libnvrtc.so.13",   "libnvrtc.so.12",
                           "libnvrtc.so.11.2", "libnvrtc.so.11.1", "libnvrtc.so.11.0"};
    std::vector<std::string> candidates(std::begin(names), std::end(names));
    std::vector<std::filesystem::path> roots;
    for (const char* variable : {"CUDA_PATH", "CUDA_HOME"})
        if (const char* value = std::getenv(variable); value && *value) roots.emplace_back(value);
    roots.emplace_back("/usr/local/cuda");
    std::error_code error;
    std::vector<std::filesystem::path> versioned;
    for (const auto& entry : std::filesystem::directory_iterator("/usr/local", error))
        if (entry.path().filename().string().rfind("cuda-", 0) == 0) versioned.push_back(entry.path());
    // Newest toolkit first ("cuda-13.0" sorts after "cuda-12.8").
    std::sort(versioned.rbegin(), versioned.rend());
    roots.insert(roots.end(), versioned.begin(), versioned.end());
    for (const auto& root : roots)
        for (const char* folder : {"lib64", "lib", "targets/x86_64-linux/lib"})
            for (const char* name : names)
                candidates.push_back((root / folder / name).string());
    return candidates;
}

struct NvrtcLibrary {
    NvrtcApi api;
    bool available = false;
    std::string description;
};

const NvrtcLibrary& GetNvrtc() {
    static const NvrtcLibrary library = [] {
        NvrtcLibrary result;
        std::string opened;
        const auto candidates = NvrtcCandidates();
        void* handle = OpenFirst(candidates, opened);
        if (!handle) {
            result.description = "NVRTC not found (tried libnvrtc.so, .13, .12, .11 and /usr/local/cuda*)";
            return result;
        }
        NvrtcApi& api = result.api;
        const bool complete = Resolve(handle, api.version, "nvrtcVersion") &&
                              Resolve(handle, api.createProgram, "nvrtcCreateProgram") &&
                              Resolve(handle, api.compileProgram, "nvrtcCompileProgram") &&
                              Resolve(handle, api.getProgramLogSize, "nvrtcGetProgramLogSize") &&
                              Resolve(handle, api.getProgramLog, "nvrtcGetProgramLog") &&
                              Resolve(handle, api.getPtxSize, "nvrtcGetPTXSize") &&
                              Resolve(handle, api.getPtx, "nvrtcGetPTX") &&
                              Resolve(handle, api.destroyProgram, "nvrtcDestroyProgram") &&
                              Resolve(handle, api.getErrorString, "nvrtcGetErrorString");
        Resolve(handle, api.getNumSupportedArchs, "nvrtcGetNumSupportedArchs");
        Resolve(handle, api.getSupportedArchs, "nvrtcGetSupportedArchs");
        if (!complete) {
            result.description = opened + " lacks NVRTC functions";
            return result;
        }
        int major = 0, minor = 0;
        api.version(&major, &minor);
        result.available = true;
        result.description =
            "NVRTC " + std::to_string(major) + "." + std::to_string(minor) + " (" + opened + ")";
        return result;
    }();
    return library;
}

struct DriverLibrary {
    DriverApi api;
    bool available = false; // loaded, complete, and cuInit succeeded
    std::string description;
};

const DriverLibrary& GetDriver() {
    static const DriverLibrary library = [] {
        DriverLibrary result;
        std::string opened;
        // Never the toolkit's stubs folder: its libcuda only stands in for linking.
        void* handle = OpenFirst({"libcuda.so.1", "libcuda.so", "/usr/lib/x86_64-linux-gnu/libcuda.so.1",
                                  "/usr/lib64/libcuda.so.1", "/usr/local/nvidia/lib64/libcuda.so.1",
                                  "/usr/local/nvidia/lib/libcuda.so.1", "/usr/lib/wsl/lib/libcuda.so.1"},
                                 opened);
        if (!handle) {
            result.description = "no CUDA driver library";
            return result;
        }
        DriverApi& api = result.api;
        const bool complete = Resolve(handle, api.init, "cuInit") &&
                              Resolve(handle, api.deviceGetCount, "cuDeviceGetCount") &&
                              Resolve(handle, api.deviceGet, "cuDeviceGet") &&
                              Resolve(handle, api.deviceGetName, "cuDeviceGetName") &&
                              Resolve(handle, api.deviceGetAttribute, "cuDeviceGetAttribute") &&
                              Resolve(handle, api.deviceTotalMem, "cuDeviceTotalMem", true) &&
                              Resolve(handle, api.primaryCtxRetain, "cuDevicePrimaryCtxRetain") &&
                              Resolve(handle, api.ctxPushCurrent, "cuCtxPushCurrent", true) &&
                              Resolve(handle, api.ctxPopCurrent, "cuCtxPopCurrent", true) &&
                              Resolve(handle, api.moduleLoadDataEx, "cuModuleLoadDataEx") &&
                              Resolve(handle, api.moduleGetFunction, "cuModuleGetFunction") &&
                              Resolve(handle, api.moduleUnload, "cuModuleUnload") &&
                              Resolve(handle, api.memAlloc, "cuMemAlloc", true) &&
                              Resolve(handle, api.memFree, "cuMemFree", true) &&
                              Resolve(handle, api.memcpy2D, "cuMemcpy2D", true) &&
                              Resolve(handle, api.streamCreate, "cuStreamCreate") &&
                              Resolve(handle, api.streamSynchronize, "cuStreamSynchronize") &&
                              Resolve(handle, api.streamDestroy, "cuStreamDestroy", true) &&
                              Resolve(handle, api.launchKernel, "cuLaunchKernel") &&
                              Resolve(handle, api.getErrorName, "cuGetErrorName");
        if (!complete) {
            result.description = opened + " lacks driver functions";
            return result;
        }
        const CUresult status = api.init(0);
        if (status != CudaSuccess) {
            result.description = opened + ": cuInit failed (" + std::to_string(status) + ")";
            return result;
        }
        result.available = true;
        result.description = opened;
        return result;
    }();
    return library;
}

std::string CudaErrorText(CUresult code) {
    const char* name = nullptr;
    if (GetDriver().api.getErrorName) GetDriver().api.getErrorName(code, &name);
    return std::string(name ? name : "CUDA error") + " (" + std::to_string(code) + ")";
}

bool CudaFailed(const char* what, CUresult code) {
    return Detail::Fail(std::string(what) + ": " + CudaErrorText(code));
}

// Whether the PTX defines a kernel of this exact (unmangled) name.
bool DefinesEntry(const std::string& ptx, std::string_view entryPoint) {
    const std::string marker = ".entry " + std::string(entryPoint);
    for (auto at = ptx.find(marker); at != std::string::npos; at = ptx.find(marker, at + 1)) {
        const std::size_t after = at + marker.size();
        if (after < ptx.size() &&
            (ptx[after] == '(' || ptx[after] == ' ' || ptx[after] == '\n' || ptx[after] == '\t'))
            return true;
    }
    return false;
}

// The newest virtual architecture NVRTC supports that a device of this capability can run.
std::string ArchitectureFor(int major, int minor) {
    const int wanted = major * 10 + minor;
    int chosen = wanted;
    const NvrtcApi& api = GetNvrtc().api;
    int count = 0;
    if (api.getNumSupportedArchs && api.getSupportedArchs &&
        api.getNumSupportedArchs(&count) == NvrtcSuccess && count > 0) {
        std::vector<int> supported(static_cast<std::size_t>(count));
        if (api.getSupportedArchs(supported.data()) == NvrtcSuccess) {
            chosen = -1;
            for (int arch : supported)
                if (arch <= wanted) chosen = std::max(chosen, arch);
            if (chosen < 0) return {}; // the device is older than anything this NVRTC builds for
        }
    }
    return "compute_" + std::to_string(chosen);
}

// Makes a context current on this thread for the scope's lifetime.
class ContextScope {
public:
    explicit ContextScope(CUcontext context)
        : m_Ok(GetDriver().api.ctxPushCurrent(context) == CudaSuccess) {}
    ~ContextScope() {
        CUcontext previous = nullptr;
        if (m_Ok) GetDriver().api.ctxPopCurrent(&previous);
    }
    ContextScope(const ContextScope&) = delete;
    ContextScope& operator=(const ContextScope&) = delete;
    bool Ok() const noexcept { return m_Ok; }

private:
    bool m_Ok;
};

class CudaAllocation final : public Detail::DeviceAllocation {
public:
    CudaAllocation(CUcontext context, CUdeviceptr pointer, std::size_t bytes)
        : DeviceAllocation(bytes)
        , m_Context(context)
        , m_Pointer(pointer) {}
    ~CudaAllocation() override {
        ContextScope scope(m_Context);
        if (scope.Ok()) GetDriver().api.memFree(m_Pointer);
    }
    CUdeviceptr Get() const noexcept { return m_Pointer; }

private:
    CUcontext m_Context;
    CUdeviceptr m_Pointer;
};

class CudaProgram final : public Detail::CompiledProgram {
public:
    CudaProgram(CUcontext context, CUmodule module, CUfunction function)
        : m_Context(context)
        , m_Module(module)
        , m_Function(function) {}
    ~CudaProgram() override {
        ContextScope scope(m_Context);
        if (scope.Ok()) GetDriver().api.moduleUnload(m_Module);
    }
    CUfunction Get() const noexcept { return m_Function; }

private:
    CUcontext m_Context;
    CUmodule m_Module;
    CUfunction m_Function;
};

class CudaDevice final : public Detail::DeviceBackEnd {
public:
    static constexpr unsigned BlockSide = 16;

    CudaDevice(CUdevice device, int major, int minor, std::size_t memory)
        : m_Device(device)
        , m_Major(major)
        , m_Minor(minor)
        , m_Memory(memory) {}

    HardwareKernelLanguage GetLanguage() const noexcept override { return HardwareKernelLanguage::CudaCpp; }
    std::size_t GetMaxAllocationBytes() const noexcept override { return m_Memory; }

    Detail::CompileResult Compile(const std::string& source, const std::string& entryPoint) override {
        Detail::CompileResult result;
        const std::string architecture = ArchitectureFor(m_Major, m_Minor);
        if (architecture.empty()) {
            result.log = "NVRTC cannot build for compute capability " + std::to_string(m_Major) + "." +
                         std::to_string(m_Minor);
            return result;
        }
        PtxCompilation ptx = CompileToPtx(source, entryPoint, architecture);
        result.log = std::move(ptx.log);
        if (!ptx.ptx) return result;
        if (!EnsureContext()) {
            result.log += "\n" + m_SetupError;
            return result;
        }
        ContextScope scope(m_Context);
        if (!scope.Ok()) {
            result.log += "\ncould not make the CUDA context current";
            return result;
        }
        // The driver turns PTX into machine code here; its complaints go into the build log too.
        std::vector<char> errors(8192, '\0'), info(8192, '\0');
        int options[] = {JitErrorLogBuffer, JitErrorLogBufferSize, JitInfoLogBuffer, JitInfoLogBufferSize};
        void* values[] = {errors.data(), reinterpret_cast<void*>(static_cast<std::uintptr_t>(errors.size())),
                          info.data(), reinterpret_cast<void*>(static_cast<std::uintptr_t>(info.size()))};
        const DriverApi& api = GetDriver().api;
        CUmodule module = nullptr;
        const CUresult loaded = api.moduleLoadDataEx(&module, ptx.ptx->c_str(), 4, options, values);
        errors.back() = info.back() = '\0';
        if (info[0]) result.log += "\n" + std::string(info.data());
        if (loaded != CudaSuccess) {
            result.log += "\ncuModuleLoadDataEx: " + CudaErrorText(loaded) + "\n" + errors.data();
            return result;
        }
        CUfunction function = nullptr;
        const CUresult found = api.moduleGetFunction(&function, module, entryPoint.c_str());
        if (found != CudaSuccess) {
            api.moduleUnload(module);
            result.log += "\nthe module has no kernel named '" + entryPoint + "': " + CudaErrorText(found);
            return result;
        }
        try {
            result.program = std::make_unique<CudaProgram>(m_Context, module, function);
        } catch (...) {
            api.moduleUnload(module);
            result.log += "\nout of memory";
        }
        return result;
    }

    std::unique_ptr<Detail::DeviceAllocation> Allocate(std::size_t bytes) override {
        if (!EnsureContext()) {
            Detail::Fail(m_SetupError);
            return nullptr;
        }
        ContextScope scope(m_Context);
        if (!scope.Ok()) {
            Detail::Fail("could not make the CUDA context current");
            return nullptr;
        }
        CUdeviceptr pointer = 0;
        if (const CUresult status = GetDriver().api.memAlloc(&pointer, bytes); status != CudaSuccess) {
            CudaFailed("cuMemAlloc", status);
            return nullptr;
        }
        try {
            return std::make_unique<CudaAllocation>(m_Context, pointer, bytes);
        } catch (...) {
            GetDriver().api.memFree(pointer);
            throw;
        }
    }

    bool CopyToDevice(Detail::DeviceAllocation& memory, const Detail::RectCopy& copy,
                      const void* hostImage) override {
        CudaCopy2D record{};
        record.srcXInBytes = copy.xBytes;
        record.srcY = copy.y;
        record.srcMemoryType = MemoryTypeHost;
        record.srcHost = hostImage;
        record.srcPitch = copy.hostPitch;
        record.dstXInBytes = copy.xBytes;
        record.dstY = copy.y;
        record.dstMemoryType = MemoryTypeDevice;
        record.dstDevice = static_cast<CudaAllocation&>(memory).Get();
        record.dstPitch = copy.devicePitch;
        record.WidthInBytes = copy.widthBytes;
        record.Height = copy.rows;
        return Copy(record);
    }

    bool CopyToHost(const Detail::DeviceAllocation& memory, const Detail::RectCopy& copy,
                    void* hostImage) override {
        CudaCopy2D record{};
        record.srcXInBytes = copy.xBytes;
        record.srcY = copy.y;
        record.srcMemoryType = MemoryTypeDevice;
        record.srcDevice = static_cast<const CudaAllocation&>(memory).Get();
        record.srcPitch = copy.devicePitch;
        record.dstXInBytes = copy.xBytes;
        record.dstY = copy.y;
        record.dstMemoryType = MemoryTypeHost;
        record.dstHost = hostImage;
        record.dstPitch = copy.hostPitch;
        record.WidthInBytes = copy.widthBytes;
        record.Height = copy.rows;
        return Copy(record);
    }

    bool Launch(Detail::CompiledProgram& compiled, std::size_t width, std::size_t height,
                std::span<const Detail::LaunchArgument> arguments) override {
        const std::size_t blocksX = (width + BlockSide - 1) / BlockSide;
        const std::size_t blocksY = (height + BlockSide - 1) / BlockSide;
        if (blocksX > 0x7FFFFFFFu || blocksY > 65535u) return Detail::Fail("the grid is too large for CUDA");

        // Each argument's value in storage of its own; the driver reads the sizes from the kernel's
        // signature.
        struct alignas(8) Slot {
            unsigned char bytes[8];
        };
        std::vector<Slot> slots(arguments.size());
        std::vector<void*> pointers(arguments.size());
        for (std::size_t i = 0; i < arguments.size(); ++i) {
            const auto& argument = arguments[i];
            switch (argument.kind) {
            case Detail::LaunchArgument::Kind::Memory: {
                const CUdeviceptr pointer = static_cast<const CudaAllocation*>(argument.memory)->Get();
                std::memcpy(slots[i].bytes, &pointer, sizeof pointer);
                break;
            }
            case Detail::LaunchArgument::Kind::Int:
                std::memcpy(slots[i].bytes, argument.ints, 4);
                break;
            case Detail::LaunchArgument::Kind::Int2:
                std::memcpy(slots[i].bytes, argument.ints, 8);
                break;
            case Detail::LaunchArgument::Kind::Float:
                std::memcpy(slots[i].bytes, &argument.value, 4);
                break;
            }
            pointers[i] = slots[i].bytes;
        }

        ContextScope scope(m_Context);
        if (!scope.Ok()) return Detail::Fail("could not make the CUDA context current");
        const DriverApi& api = GetDriver().api;
        // A stream of its own per launch, so that waiting here never waits for other threads' kernels.
        CUstream stream = nullptr;
        if (const CUresult status = api.streamCreate(&stream, StreamNonBlocking); status != CudaSuccess)
            return CudaFailed("cuStreamCreate", status);
        CUresult status =
            api.launchKernel(static_cast<CudaProgram&>(compiled).Get(), static_cast<unsigned>(blocksX),
                             static_cast<unsigned>(blocksY), 1, BlockSide, BlockSide, 1, 0, stream,
                             pointers.empty() ? nullptr : pointers.data(), nullptr);
        const char* step = "cuLaunchKernel";
        if (status == CudaSuccess) {
            status = api.streamSynchronize(stream);
            step = "the kernel";
        }
        api.streamDestroy(stream);
        return status == CudaSuccess || CudaFailed(step, status);
    }

private:
    bool EnsureContext() {
        std::call_once(m_SetupOnce, [this] {
            const CUresult status = GetDriver().api.primaryCtxRetain(&m_Context, m_Device);
            if (status != CudaSuccess) {
                m_Context = nullptr;
                m_SetupError = "cuDevicePrimaryCtxRetain: " + CudaErrorText(status);
            }
        });
        return m_Context != nullptr;
    }

    bool Copy(const CudaCopy2D& record) {
        ContextScope scope(m_Context);
        if (!scope.Ok()) return Detail::Fail("could not make the CUDA context current");
        // Synchronous for pageable host memory: the data has arrived when this returns.
        const CUresult status = GetDriver().api.memcpy2D(&record);
        return status == CudaSuccess || CudaFailed("cuMemcpy2D", status);
    }

    CUdevice m_Device;
    int m_Major;
    int m_Minor;
    std::size_t m_Memory;
    std::once_flag m_SetupOnce;
    CUcontext m_Context = nullptr;
    std::string m_SetupError;
};

} // namespace

bool IsNvrtcAvailable() {
    return GetNvrtc().available;
}

std::string DescribeNvrtc() {
    return GetNvrtc().description;
}

PtxCompilation CompileToPtx(std::string_view text, std::string_view entryPoint,
                            std::string_view architecture) {
    PtxCompilation result;
    const NvrtcLibrary& nvrtc = GetNvrtc();
    if (!nvrtc.available) {
        result.log = nvrtc.description;
        return result;
    }
    const NvrtcApi& api = nvrtc.api;
    try {
        const std::string source(text);
        NvrtcProgram program = nullptr;
        NvrtcResult status = api.createProgram(&program, source.c_str(), "kernel.cu", 0, nullptr, nullptr);
        if (status != NvrtcSuccess) {
            result.log = std::string("nvrtcCreateProgram: ") + api.getErrorString(status);
            return result;
        }
        // Unannotated functions (the static members of the fragments' local structs) are device code.
        std::vector<std::string> options{"--fmad=false", "--device-as-default-execution-space"};
        if (!architecture.empty()) options.push_back("--gpu-architecture=" + std::string(architecture));
        std::vector<const char*> optionTexts;
        for (const auto& option : options)
            optionTexts.push_back(option.c_str());
        status = api.compileProgram(program, static_cast<int>(optionTexts.size()), optionTexts.data());

        std::size_t logSize = 0;
        if (api.getProgramLogSize(program, &logSize) == NvrtcSuccess && logSize > 1) {
            std::string log(logSize, '\0');
            if (api.getProgramLog(program, log.data()) == NvrtcSuccess) result.log = log.c_str();
        }
        std::size_t ptxSize = 0;
        if (status == NvrtcSuccess && api.getPtxSize(program, &ptxSize) == NvrtcSuccess && ptxSize > 0) {
            std::string ptx(ptxSize, '\0');
            if (api.getPtx(program, ptx.data()) == NvrtcSuccess) {
                ptx.resize(std::strlen(ptx.c_str()));
                result.ptx = std::move(ptx);
            }
        }
        api.destroyProgram(&program);
        if (status != NvrtcSuccess) {
            result.log =
                std::string("nvrtcCompileProgram: ") + api.getErrorString(status) + "\n" + result.log;
            return result;
        }
        if (!result.ptx) {
            result.log += "\nNVRTC produced no PTX";
        } else if (!DefinesEntry(*result.ptx, entryPoint)) {
            result.ptx.reset();
            result.log += "\nthe PTX has no kernel named '" + std::string(entryPoint) +
                          "' (a kernel entry must be declared extern \"C\" __global__)";
        }
    } catch (const std::exception& error) {
        result.ptx.reset();
        result.log = std::string("compiling to PTX failed: ") + error.what();
    }
    return result;
}

namespace Detail {

HardwareDeviceList EnumerateCudaDevices() {
    HardwareDeviceList devices;
    try {
        const DriverLibrary& driver = GetDriver();
        if (!driver.available || !IsNvrtcAvailable()) return {};
        const DriverApi& api = driver.api;
        int count = 0;
        if (api.deviceGetCount(&count) != CudaSuccess) return {};
        for (int ordinal = 0; ordinal < count; ++ordinal) {
            CUdevice device = 0;
            if (api.deviceGet(&device, ordinal) != CudaSuccess) continue;
            char name[256] = {};
            if (api.deviceGetName(name, static_cast<int>(sizeof name) - 1, device) != CudaSuccess)
                std::strcpy(name, "CUDA device");
            int major = 0, minor = 0;
            if (api.deviceGetAttribute(&major, AttributeComputeCapabilityMajor, device) != CudaSuccess ||
                api.deviceGetAttribute(&minor, AttributeComputeCapabilityMinor, device) != CudaSuccess)
                continue;
            std::size_t memory = 0;
            if (api.deviceTotalMem(&memory, device) != CudaSuccess || memory == 0)
                memory = std::size_t{1} << 30;
            devices.push_back(Kernel::Counted<HardwareDevice>(new HardwareDevice(
                name, "cuda:" + std::to_string(ordinal), HardwareBackEnd::Cuda, HardwareDeviceKind::Gpu,
                std::make_unique<CudaDevice>(device, major, minor, memory))));
        }
    } catch (...) {
        return {};
    }
    return devices;
}

} // namespace Detail

} // namespace Raster
