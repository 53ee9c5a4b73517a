#pragma once
// What the pixel brush commands share: the choice of composition path, the colour offsets in hue,
// saturation and lightness, and the dab colour as a pixel of the target's format.

#include "host/brush/DabComposite.h"
#include "host/brush/RasterBrush.h"
#include "host/document/DocumentController.h"
#include "host/raster/ICCManager.h"
#include "host/raster/device/Hardware.h"
#include "host/renderer/Colour.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>

namespace RasterTools {

// Nozzle mode 1 stamps; mode 0 is opaque at strength exactly 1 and blended otherwise; other modes paint
// nothing.
std::optional<Raster::DabPath> ChooseDabPath(int mode, double strength) noexcept;

struct HueSaturationLightness {
    double hue = 0.0; // 0..1
    double saturation = 0.0;
    double lightness = 0.0;
};
HueSaturationLightness ToHueSaturationLightness(double r, double g, double b) noexcept;
void FromHueSaturationLightness(const HueSaturationLightness& hsl, double& r, double& g, double& b) noexcept;
// Hue plus its offset wrapped into [0, 1); saturation and lightness plus theirs, clamped to [0, 1].
HueSaturationLightness OffsetHueSaturationLightness(HueSaturationLightness hsl, double hue, double saturation,
                                                    double lightness) noexcept;

// The colour's alpha times the nozzle opacity in the three precisions: 8-bit products rounded, 16-bit
// products truncated, the float form the 16-bit result over 65535.
struct ColourCoverage {
    std::uint8_t alpha8 = 0;
    std::uint16_t alpha16 = 0;
    float alphaF = 0.0f;
};
ColourCoverage MakeColourCoverage(double alpha, double opacity) noexcept;

// One pixel of a layer format, as bytes.
using PixelBytes = std::array<std::byte, 32>;
// The colour (straight, alpha ignored) as a pixel of format, converted through the document's profiles and
// colour format, with alpha taken from coverage in the format's precision. Nothing for a non-layer format.
std::optional<PixelBytes> GetRasterDynamicPixel(const Renderer::ConsolidatedColour& colour,
                                                const Raster::ColourProfiles& profiles, int documentFormat,
                                                Raster::PixelFormat format, const ColourCoverage& coverage);

// The brush dynamic's factor for the nozzle: its value when the brush has an active dynamic, else 1.
double GetDynamicFactor(const Raster::RasterBrush& brush, const Raster::BrushNozzle& nozzle) noexcept;
// The brush's mask texture in the mask format compatible with the target when its texture mode is 1.
Kernel::Counted<Raster::DynamicBuffer> GetDabTexture(const Raster::RasterBrush& brush,
                                                     Raster::PixelFormat target);

// What every pixel command does first: the nozzle's target (bitmap, else mask), its rect rounded and cut to
// the target, and a coverage mask that fits the rect. Nothing when the dab has nothing to change.
struct DabTarget {
    Raster::DynamicBuffer* target = nullptr;
    Kernel::RectT<int> rect;
    Kernel::Counted<Raster::DynamicBuffer> coverage;
};
std::optional<DabTarget> PrepareDab(Raster::BrushNozzle& nozzle, const Raster::RasterBrush* brush);

// The compute device the pixel commands compose their dabs on; none (the default) composes on the
// processor. A dab the device cannot compose falls back to the processor, with the same pixels.
void SetDabDevice(Kernel::Counted<Raster::HardwareDevice> device);
Kernel::Counted<Raster::HardwareDevice> GetDabDevice();
// Composes a dab on the dab device if there is one, else (or when it fails) on the processor.
bool ComposeDab(Raster::DynamicBuffer& target, Kernel::RectT<int> rect, const Raster::DynamicBuffer& coverage,
                const Raster::DabRequest& request);

} // namespace RasterTools
