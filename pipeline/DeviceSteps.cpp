// The device side of filters that run their own kernels in several steps.
#include "pipeline/DeviceSteps.h"

namespace RasterTools {

namespace {

constexpr const char* OpenCLStepsPrelude = R"(#pragma OPENCL EXTENSION cl_khr_fp64 : enable
#define KERNEL(name) kernel void name
#define GLOBAL global
#define GLOBAL_X ((int)get_global_id(0))
#define GLOBAL_Y ((int)get_global_id(1))
typedef long rt_index;
#define rt_fabsf fabs
#define rt_fminf fmin
#define rt_fmaxf fmax
)";

constexpr const char* CudaStepsPrelude = R"(typedef unsigned char uchar;
typedef unsigned short ushort;
typedef unsigned int uint;
#define KERNEL(name) extern "C" __global__ void name
#define GLOBAL
#define GLOBAL_X ((int)(blockIdx.x * blockDim.x + threadIdx.x))
#define GLOBAL_Y ((int)(blockIdx.y * blockDim.y + threadIdx.y))
typedef long long rt_index;
#define rt_fabsf fabsf
#define rt_fminf fminf
#define rt_fmaxf fmaxf
)";

// What Prolong hands a queued kernel: the retentions, shared with the render.
class StepsProlongation final : public Raster::Prolongation {};

} // namespace

Raster::HardwareKernelDescriptor DeviceKernelText::Descriptor() const {
    Raster::HardwareKernelDescriptor descriptor;
    descriptor.fragments.fill("");
    descriptor[Raster::HardwareKernelFragment::PerPixelLoop] = text.c_str();
    descriptor.entryPoint = entryPoint.c_str();
    return descriptor;
}

const char* DeviceStepsPrelude(Raster::HardwareKernelLanguage language) noexcept {
    switch (language) {
    case Raster::HardwareKernelLanguage::OpenCLC:
        return OpenCLStepsPrelude;
    case Raster::HardwareKernelLanguage::CudaCpp:
        return CudaStepsPrelude;
    default:
        return "";
    }
}

bool DeviceKernelsReady(const Raster::HardwareDevice* device,
                        std::initializer_list<const DeviceKernelText*> kernels, bool wait,
                        const bool* abort) {
    if (!device) return false;
    bool ready = true;
    // Every kernel is asked for before any answer counts, so that all of them start compiling at once.
    for (const DeviceKernelText* kernel : kernels) {
        const Raster::HardwareKernelDescriptor descriptor = kernel->Descriptor();
        if (Raster::IsKernelPendingCompilation(device, descriptor, wait, abort)) ready = false;
    }
    for (const DeviceKernelText* kernel : kernels)
        if (Raster::IsKernelBroken(device, kernel->Descriptor())) return false;
    return ready;
}

DeviceSteps::DeviceSteps(const RenderTarget& target, const Kernel::RectT<int>& rect)
    : m_Target(target)
    , m_Rect(rect)
    , m_Device(target.device.Get())
    , m_Guard(Raster::GetRetainHardwareBufferSemaphoreGuard(m_Device)) {
    if (!m_Device || Kernel::IsAborted(target.abort)) return;
    m_Queue = m_Device->GetHardwareWriteQueue();
    auto mirror = [](const PipelineImage& image) {
        return image.cache ? image.cache : Raster::HardwareCache::Create(image.pixels);
    };
    // A job's shared mirrors, or mirrors for this rectangle alone.
    m_DestinationCache = mirror(target.destination);
    const bool distinct = target.source.pixels != target.destination.pixels;
    const Kernel::Counted<Raster::HardwareCache> source =
        distinct ? mirror(target.source) : (target.source.cache ? target.source.cache : m_DestinationCache);
    const Kernel::Counted<Raster::HardwareCache> mask = target.mask ? mirror(target.mask) : nullptr;
    const Kernel::Counted<Raster::HardwareCache> sampler = target.sampler ? mirror(target.sampler) : nullptr;
    if (!m_DestinationCache || !source) return;
    const Kernel::RectT<int> sourceBounds = target.source.pixels->GetBounds();
    if (!m_DestinationCache->SyncHardwareCache(m_Device, rect)) return;
    if (!source->SyncHardwareCache(m_Device, sourceBounds)) return;
    if (mask && !mask->SyncHardwareCache(m_Device, target.mask.pixels->GetBounds())) return;
    if (sampler && !sampler->SyncHardwareCache(m_Device, target.sampler.pixels->GetBounds())) return;
    m_Destination = Raster::RetainHardwareBuffer(m_Device, m_Queue, m_DestinationCache, rect);
    m_Source = Raster::RetainHardwareBuffer(m_Device, m_Queue, source, sourceBounds);
    if (mask) {
        m_MaskRetention =
            Raster::RetainHardwareBuffer(m_Device, m_Queue, mask, target.mask.pixels->GetBounds());
        m_Mask = m_MaskRetention.buffer;
    } else {
        m_Mask = Raster::Hardware::GetIdentityBuffer(m_Device);
    }
    if (sampler) {
        m_SamplerRetention =
            Raster::RetainHardwareBuffer(m_Device, m_Queue, sampler, target.sampler.pixels->GetBounds());
        m_Sampler = m_SamplerRetention.buffer;
    } else {
        m_Sampler = Raster::Hardware::GetIdentityBuffer(m_Device);
    }
    m_Ready = m_Destination && m_Source && m_Mask && m_Sampler;
}

Kernel::Counted<Raster::HardwareBuffer> DeviceSteps::Scratch(int width, int height, int bytesPerPixel) const {
    return Raster::CreateHardwareBuffer(m_Device, nullptr, 0, width, height, bytesPerPixel);
}

Kernel::Counted<Raster::Prolongation> DeviceSteps::Prolong() const {
    auto prolongation = Kernel::MakeCounted<StepsProlongation>();
    for (const Raster::HardwareRetention* retention :
         {&m_Source, &m_Destination, &m_MaskRetention, &m_SamplerRetention})
        if (*retention) prolongation->Keep(*retention);
    return prolongation;
}

bool DeviceSteps::Run(const DeviceKernelText& kernel, int width, int height,
                      const Raster::HardwareKernelArguments& arguments) const {
    if (!m_Ready || Kernel::IsAborted(m_Target.abort)) return false;
    // Whole 16 × 16 blocks on every device, as CUDA runs them: an OpenCL implementation that specialises
    // its code for each work-group shape then builds a step once, not once per rectangle size.
    auto blocks = [](int size) { return size <= 0 ? 0 : (size + 15) / 16 * 16; };
    return Raster::ExecuteKernel(m_Device, kernel.Descriptor(), blocks(width), blocks(height), arguments,
                                 m_Target.abort);
}

bool DeviceSteps::Finish() {
    if (!m_Ready) return false;
    m_DestinationCache->InvalidateHostCache(m_Rect);
    // Nobody else will read back a mirror made for this rectangle alone.
    const bool done = m_Target.destination.cache || m_DestinationCache->SyncHostCache(m_Rect);
    m_Guard.Release();
    return done;
}

} // namespace RasterTools
