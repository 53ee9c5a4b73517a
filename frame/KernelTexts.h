#pragma once
// The device kernel texts of a single-pass command for one layer format, without and with a mask, for checks
// that compile them without running them (the catalogue hands them out).

#include "host/raster/device/HardwareKernel.h"
#include "pipeline/DeviceSteps.h"
#include "pipeline/KernelAssembly.h"

#include <optional>
#include <vector>

namespace RasterTools {

// An entry with empty text stands for a kernel whose fragments are missing in that language.
template <class Command>
std::vector<DeviceKernelText> GetSinglePassKernelTexts(Raster::HardwareKernelLanguage language,
                                                       Raster::PixelFormat format) {
    std::vector<DeviceKernelText> texts;
    LayerFormatList::Dispatch(format, [&](auto layer) {
        constexpr Raster::PixelFormat F = decltype(layer)::value;
        const auto add = [&](auto stages, const KernelShape& shape) {
            const auto descriptor = DescribeKernel<decltype(stages)>(language, shape);
            if (descriptor)
                texts.push_back(
                    {Raster::AssembleKernelSource(*descriptor, language), descriptor->entryPoint});
            else
                texts.push_back({});
        };
        add(typename Command::template PlainStages<F>{}, {F, F, std::nullopt, false});
        add(typename Command::template MaskedStages<F>{}, {F, F, Raster::PixelFormat::MaskA8, true});
        return true;
    });
    return texts;
}

} // namespace RasterTools
