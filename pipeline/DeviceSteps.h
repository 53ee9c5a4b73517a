#pragma once
// A filter's own device kernels for one rectangle: several steps through scratch buffers, for renders that
// are not one per-pixel pipeline kernel (blurs that read far along a line, separable passes).

#include "host/raster/device/ExecuteKernel.h"
#include "pipeline/Pipeline.h"

#include <array>
#include <initializer_list>
#include <mutex>
#include <string>

namespace RasterTools {

// One program of kernel text and the entry point to run in it. The text is compiled once per device and
// kept; it should open with DeviceStepsPrelude(language).
struct DeviceKernelText {
    std::string text;
    std::string entryPoint;
    // The descriptor the kernel cache knows the program by (the whole text in the loop fragment).
    Raster::HardwareKernelDescriptor Descriptor() const;
};

// Each language's spelling of what the step kernels share: KERNEL(name) opens an entry point, GLOBAL_X and
// GLOBAL_Y are the work item's ids, GLOBAL qualifies device pointers, rt_index is a 64-bit index; double
// precision is enabled.
const char* DeviceStepsPrelude(Raster::HardwareKernelLanguage language) noexcept;

// Whether every kernel is compiled on the device. The first request starts the compilations in the background
// and answers false; with wait, blocks until they are done (or *abort is set). False for a broken kernel.
bool DeviceKernelsReady(const Raster::HardwareDevice* device,
                        std::initializer_list<const DeviceKernelText*> kernels, bool wait, const bool* abort);

// A filter's kernels (a struct of DeviceKernelTexts) for each kernel language and layer format, assembled by
// build the first time any is asked for and kept for the process.
template <class Kernels>
class DeviceKernelTable {
public:
    using Builder = Kernels (*)(Raster::HardwareKernelLanguage language, Raster::PixelFormat format);
    explicit DeviceKernelTable(Builder build) noexcept
        : m_Build(build) {}

    // The kernels for the target's device and destination format; null without a device.
    const Kernels* Find(const RenderTarget& target) {
        const Raster::HardwareDevice* device = target.device.Get();
        if (!device || !target.destination) return nullptr;
        const int language = static_cast<int>(Raster::GetKernelLanguage(device));
        if (language < 0 || language > 1) return nullptr;
        std::call_once(m_Once, [this] {
            for (std::size_t l = 0; l < 2; ++l)
                for (std::size_t f = 0; f < Formats.size(); ++f)
                    m_Kernels[l][f] = m_Build(static_cast<Raster::HardwareKernelLanguage>(l), Formats[f]);
        });
        const Raster::PixelFormat format = target.destination.pixels->GetFormat();
        for (std::size_t f = 0; f < Formats.size(); ++f)
            if (Formats[f] == format) return &m_Kernels[std::size_t(language)][f];
        return nullptr;
    }

private:
    static constexpr auto Formats = LayerFormatList::Values;
    Builder m_Build;
    std::once_flag m_Once;
    std::array<std::array<Kernels, Formats.size()>, 2> m_Kernels{};
};

// The device side of one rectangle's render: holds the device-buffer semaphore, the source and mask mirrors
// brought up to date, and the destination's over the rectangle, for as long as it lives.
class DeviceSteps {
public:
    DeviceSteps(const RenderTarget& target, const Kernel::RectT<int>& rect);
    DeviceSteps(const DeviceSteps&) = delete;
    DeviceSteps& operator=(const DeviceSteps&) = delete;

    // False when a mirror could not be synchronised or retained: render on the processor instead.
    explicit operator bool() const noexcept { return m_Ready; }
    const Kernel::Counted<Raster::HardwareBuffer>& Source() const noexcept { return m_Source.buffer; }
    // The device's write queue, on which the images were retained.
    const Raster::HardwareQueue& Queue() const noexcept { return m_Queue; }
    const Kernel::Counted<Raster::HardwareBuffer>& Destination() const noexcept {
        return m_Destination.buffer;
    }
    // The mask's pixels, or the device's identity buffer when the target has no mask.
    const Kernel::Counted<Raster::HardwareBuffer>& Mask() const noexcept { return m_Mask; }
    // The sampler image's pixels, or the device's identity buffer when the target has none.
    const Kernel::Counted<Raster::HardwareBuffer>& Sampler() const noexcept { return m_Sampler; }

    // Device memory for intermediate results, freed when the last reference goes.
    Kernel::Counted<Raster::HardwareBuffer> Scratch(int width, int height, int bytesPerPixel) const;
    // Scratch holding values (one row of them), for tables a kernel reads.
    template <class Value>
    Kernel::Counted<Raster::HardwareBuffer> Table(const Value* values, int count) const {
        return Raster::CreateHardwareBuffer(m_Device, values, sizeof(Value) * std::size_t(count), count, 1,
                                            int(sizeof(Value)));
    }

    // Keeps this render's retained buffers until a kernel queued with it is done.
    Kernel::Counted<Raster::Prolongation> Prolong() const;

    // Runs one step over at least a width × height grid (whole 16 × 16 blocks: the kernel returns early for
    // ids beyond its sizes) and waits for it; false on an abort or any device failure.
    bool Run(const DeviceKernelText& kernel, int width, int height,
             const Raster::HardwareKernelArguments& arguments) const;

    // After the last step: the destination's device pixels in the rectangle are the new ones.
    bool Finish();

private:
    const RenderTarget& m_Target;
    Kernel::RectT<int> m_Rect;
    const Raster::HardwareDevice* m_Device;
    Raster::HardwareQueue m_Queue;
    Raster::HardwareBufferSemaphoreGuard m_Guard;
    Kernel::Counted<Raster::HardwareCache> m_DestinationCache;
    Raster::HardwareRetention m_Source, m_Destination, m_MaskRetention, m_SamplerRetention;
    Kernel::Counted<Raster::HardwareBuffer> m_Mask, m_Sampler;
    bool m_Ready = false;
};

} // namespace RasterTools
