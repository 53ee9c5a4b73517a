#pragma once
// Test commands and pixel helpers for the document pixel tests.

#include "host/document/Document.h"
#include "host/renderer/SpanPopulator.h"

#include <cstdint>
#include <string>
#include <vector>

namespace DocumentTests {

// Inverts colour (alpha kept) of RGBA8 layers directly, and of RGBA8, RGBA16 and working-colour buffers as a
// live filter.
class InvertCommand final : public RasterDevicePreviewableFilterLayerCommand,
                            public Renderer::SpanPopulatorBitmapFillMutationHost {
public:
    explicit InvertCommand(bool liveEffect = false)
        : RasterDevicePreviewableFilterLayerCommand(liveEffect) {}

    Kernel::LocalisedString GetDescription() const override { return {"Invert", "Command description"}; }
    Kernel::Counted<DocumentCommand> Clone() const override;
    Kernel::RectT<int> DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const override;
    void PrepareSpanPopulator(const Renderer::SpanPopulatorBitmapFillMutationTarget* target,
                              Kernel::RectT<int> rect, Kernel::Counted<Raster::DynamicBuffer> buffer,
                              Raster::AffineTransform::Params transform, bool, bool* abort,
                              int) const override;
    void PrepareSpanPopulator(Kernel::Counted<Raster::DynamicBuffer> source, int,
                              Kernel::RectT<double> bounds, Raster::AffineTransform::Params transform,
                              Kernel::RectT<int> rect, Kernel::Counted<Raster::DynamicBuffer> destination,
                              bool* abort) const override;

    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }

private:
    static const Kernel::ClassProperties ms_ClassProperties;
};

// A live filter whose command has no span-populator face: the flatten must skip it.
class OpaqueCommand final : public RasterDevicePreviewableFilterLayerCommand {
public:
    OpaqueCommand()
        : RasterDevicePreviewableFilterLayerCommand(true) {}
    Kernel::LocalisedString GetDescription() const override { return {"Opaque", "Command description"}; }
    Kernel::Counted<DocumentCommand> Clone() const override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }

private:
    static const Kernel::ClassProperties ms_ClassProperties;
};

// An image whose bytes are a fixed pseudo-random function of seed.
Kernel::Counted<Raster::DynamicBuffer> MakeNoiseImage(int width, int height, Raster::PixelFormat format,
                                                      std::uint32_t seed);
// One colour everywhere, from straight 0..1 components (RGBA formats, IA by its first component, RGBAUF).
Kernel::Counted<Raster::DynamicBuffer> MakeFilled(int width, int height, Raster::PixelFormat format,
                                                  std::vector<double> components);
// The pixel bytes, row padding left out.
std::vector<std::byte> PixelBytes(const Raster::DynamicBuffer& image);

} // namespace DocumentTests
