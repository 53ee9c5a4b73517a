// The device registry: enumeration, selection and per-device counters.
#include "host/raster/device/Hardware.h"

#include "host/raster/device/HardwareBuffer.h"
#include "host/raster/device/detail/DeviceState.h"

#include <algorithm>
#include <cctype>
#include <charconv>
#include <cstdlib>

namespace Raster {

namespace {

thread_local std::string t_LastError;

std::string Lowered(std::string_view text) {
    std::string out;
    out.reserve(text.size());
    for (char c : text)
        out.push_back(static_cast<char>(std::tolower(static_cast<unsigned char>(c))));
    return out;
}

std::string_view Trimmed(std::string_view text) {
    while (!text.empty() && std::isspace(static_cast<unsigned char>(text.front())))
        text.remove_prefix(1);
    while (!text.empty() && std::isspace(static_cast<unsigned char>(text.back())))
        text.remove_suffix(1);
    return text;
}

const char* KindName(HardwareDeviceKind kind) {
    switch (kind) {
    case HardwareDeviceKind::Gpu:
        return "GPU";
    case HardwareDeviceKind::Cpu:
        return "CPU";
    case HardwareDeviceKind::Other:
        break;
    }
    return "other";
}

} // namespace

namespace Detail {

bool Fail(std::string reason) {
    t_LastError = std::move(reason);
    return false;
}

} // namespace Detail

const std::string& GetLastHardwareError() noexcept {
    return t_LastError;
}

HardwareDevice::HardwareDevice(std::string name, std::string identifier, HardwareBackEnd backEnd,
                               HardwareDeviceKind kind, std::unique_ptr<Detail::DeviceBackEnd> implementation)
    : m_Name(std::move(name))
    , m_Identifier(std::move(identifier))
    , m_BackEnd(backEnd)
    , m_Kind(kind)
    , m_Implementation(std::move(implementation))
    , m_Kernels(std::make_unique<Detail::KernelCache>(this))
    , m_Pool(std::make_unique<Detail::BufferPool>()) {}

HardwareDevice::HardwareDevice(std::string name, std::string identifier, HardwareBackEnd backEnd,
                               HardwareDeviceKind kind)
    : HardwareDevice(std::move(name), std::move(identifier), backEnd, kind, nullptr) {}

HardwareDevice::~HardwareDevice() = default;

HardwareKernelLanguage HardwareDevice::GetLanguage() const noexcept {
    return m_BackEnd == HardwareBackEnd::Cuda ? HardwareKernelLanguage::CudaCpp
                                              : HardwareKernelLanguage::OpenCLC;
}

std::string HardwareDevice::Describe() const {
    return m_Identifier + " " + m_Name + " (" + KindName(m_Kind) + ")";
}

std::optional<HardwareSelector> ParseHardwareSelector(std::string_view text) {
    const std::string word = Lowered(Trimmed(text));
    std::string_view name = word;
    std::optional<std::size_t> index;
    if (const auto colon = name.find(':'); colon != std::string_view::npos) {
        const std::string_view digits = name.substr(colon + 1);
        std::size_t value = 0;
        const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), value);
        if (digits.empty() || error != std::errc() || end != digits.data() + digits.size())
            return std::nullopt;
        index = value;
        name = name.substr(0, colon);
    }
    HardwareSelector selector;
    selector.index = index;
    if (name == "auto")
        selector.choice = HardwareSelector::Choice::Auto;
    else if (name == "cpu")
        selector.choice = HardwareSelector::Choice::Cpu;
    else if (name == "opencl")
        selector.choice = HardwareSelector::Choice::OpenCL;
    else if (name == "cuda")
        selector.choice = HardwareSelector::Choice::Cuda;
    else
        return std::nullopt;
    // An index only makes sense for a named back end.
    if (index && (selector.choice == HardwareSelector::Choice::Auto ||
                  selector.choice == HardwareSelector::Choice::Cpu))
        return std::nullopt;
    return selector;
}

Kernel::Counted<HardwareDevice> SelectHardwareDevice(const HardwareDeviceList& devices,
                                                     const HardwareSelector& selector) {
    auto first = [&](HardwareBackEnd backEnd, std::optional<HardwareDeviceKind> kind) {
        for (const auto& device : devices)
            if (device && device->GetBackEnd() == backEnd && (!kind || device->GetKind() == *kind))
                return device;
        return Kernel::Counted<HardwareDevice>();
    };
    auto nth = [&](HardwareBackEnd backEnd, std::size_t n) {
        for (const auto& device : devices)
            if (device && device->GetBackEnd() == backEnd && n-- == 0) return device;
        return Kernel::Counted<HardwareDevice>();
    };
    auto gpuThenAny = [&](HardwareBackEnd backEnd) {
        if (auto gpu = first(backEnd, HardwareDeviceKind::Gpu)) return gpu;
        if (auto cpu = first(backEnd, HardwareDeviceKind::Cpu)) return cpu;
        return first(backEnd, std::nullopt);
    };

    switch (selector.choice) {
    case HardwareSelector::Choice::Cpu:
        return {};
    case HardwareSelector::Choice::Auto:
        // An OpenCL device that runs on the processor is slower than the processor path it would replace
        // (kernels compiled at run time, buffers copied): only a GPU is worth choosing unasked.
        if (auto cuda = first(HardwareBackEnd::Cuda, HardwareDeviceKind::Gpu)) return cuda;
        return first(HardwareBackEnd::OpenCL, HardwareDeviceKind::Gpu);
    case HardwareSelector::Choice::OpenCL:
        return selector.index ? nth(HardwareBackEnd::OpenCL, *selector.index)
                              : gpuThenAny(HardwareBackEnd::OpenCL);
    case HardwareSelector::Choice::Cuda:
        return selector.index ? nth(HardwareBackEnd::Cuda, *selector.index)
                              : gpuThenAny(HardwareBackEnd::Cuda);
    }
    return {};
}

const HardwareDeviceList& Hardware::GetDevices() {
    // Never destroyed: devices hold driver objects that must not be released while drivers unload at exit.
    static const HardwareDeviceList* devices = [] {
        auto* list = new HardwareDeviceList(Detail::EnumerateCudaDevices());
        HardwareDeviceList opencl = Detail::EnumerateOpenCLDevices();
        list->insert(list->end(), opencl.begin(), opencl.end());
        return list;
    }();
    return *devices;
}

Kernel::Counted<HardwareDevice> Hardware::GetDevice(std::string_view selector) {
    std::string_view text = Trimmed(selector);
    if (text.empty()) {
        const char* variable = std::getenv(SelectorVariable);
        text = variable ? Trimmed(variable) : std::string_view();
        if (text.empty()) text = "auto";
    }
    const auto parsed = ParseHardwareSelector(text);
    if (!parsed) {
        Detail::Fail("unknown device selector '" + std::string(text) + "'");
        return {};
    }
    if (parsed->choice == HardwareSelector::Choice::Cpu) return {};
    return SelectHardwareDevice(GetDevices(), *parsed);
}

void Hardware::IncrementFailedKernels(const HardwareDevice* device) noexcept {
    auto& counter = device ? device->m_FailedKernels : s_FailedWithoutDevice;
    counter.fetch_add(1, std::memory_order_relaxed);
}

long Hardware::GetFailedKernels(const HardwareDevice* device) noexcept {
    return (device ? device->m_FailedKernels : s_FailedWithoutDevice).load(std::memory_order_relaxed);
}

Kernel::Counted<HardwareBuffer> Hardware::GetIdentityBuffer(const HardwareDevice* device) {
    if (!device || !device->GetImplementation()) return {};
    std::call_once(device->m_IdentityOnce, [&] {
        // One pixel of the widest pixel layout, zero: reads of an unused input see transparent black.
        constexpr int bytes = 16;
        const unsigned char zeros[bytes] = {};
        device->m_IdentityBuffer = CreateHardwareBuffer(device, zeros, bytes, 1, 1, bytes);
    });
    return device->m_IdentityBuffer;
}

HardwareKernelLanguage GetKernelLanguage(const HardwareDevice* device) noexcept {
    return device ? device->GetLanguage() : HardwareKernelLanguage::None;
}

} // namespace Raster
