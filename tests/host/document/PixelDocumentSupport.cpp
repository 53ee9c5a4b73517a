#include "tests/host/document/PixelDocumentSupport.h"

#include "host/document/RasterInterface.h"
#include "host/kernel/Abort.h"

#include <cmath>
#include <cstring>

namespace DocumentTests {

namespace {
template <class T>
Kernel::Counted<Kernel::Serialisable> Create() {
    return Kernel::Counted<Kernel::Serialisable>(new T());
}
} // namespace

const Kernel::ClassProperties
    InvertCommand::ms_ClassProperties(Kernel::MakeFourCC("TInv"), &Create<InvertCommand>, 1, nullptr,
                                      &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());
const Kernel::ClassProperties
    OpaqueCommand::ms_ClassProperties(Kernel::MakeFourCC("TOpq"), &Create<OpaqueCommand>, 1, nullptr,
                                      &RasterDevicePreviewableFilterLayerCommand::GetTypeClassProperties());

Kernel::Counted<DocumentCommand> InvertCommand::Clone() const {
    return Kernel::Counted<DocumentCommand>(new InvertCommand(IsLiveEffect()));
}

Kernel::Counted<DocumentCommand> OpaqueCommand::Clone() const {
    return Kernel::Counted<DocumentCommand>(new OpaqueCommand());
}

Kernel::RectT<int> InvertCommand::DoEffect(Kernel::NonCounted<MutableRasterInterface> raster) const {
    const auto pixels = raster->GetPixels();
    if (!pixels || pixels->GetFormat() != Raster::PixelFormat::RGBA8) return {};
    const Kernel::RectT<int> area = GetEffectArea(*raster);
    for (int y = area.top; y < area.bottom; ++y) {
        auto* row = pixels->Row<std::uint8_t>(y);
        for (int x = area.left; x < area.right; ++x)
            for (int c = 0; c < 3; ++c)
                row[4 * x + c] = std::uint8_t(255 - row[4 * x + c]);
        raster->Progress(double(y - area.top + 1) / area.Height());
    }
    return area;
}

void InvertCommand::PrepareSpanPopulator(const Renderer::SpanPopulatorBitmapFillMutationTarget* target,
                                         Kernel::RectT<int> rect,
                                         Kernel::Counted<Raster::DynamicBuffer> buffer,
                                         Raster::AffineTransform::Params transform, bool, bool* abort,
                                         int) const {
    if (target)
        PrepareSpanPopulator(target->GetSource(), 0, target->GetBounds(), transform, rect, std::move(buffer),
                             abort);
}

namespace {

template <class Component>
void InvertRows(const Raster::DynamicBuffer& source, Raster::DynamicBuffer& destination,
                Kernel::RectT<int> rect, Component maximum) {
    for (int y = rect.top; y < rect.bottom; ++y)
        for (int x = rect.left; x < rect.right; ++x) {
            const Component* in = source.Row<Component>(y) + 4 * x;
            Component* out = destination.Row<Component>(y) + 4 * x;
            for (int c = 0; c < 3; ++c)
                out[c] = Component(maximum - in[c]);
            out[3] = in[3];
        }
}

} // namespace

void InvertCommand::PrepareSpanPopulator(Kernel::Counted<Raster::DynamicBuffer> source, int,
                                         Kernel::RectT<double>, Raster::AffineTransform::Params,
                                         Kernel::RectT<int> rect,
                                         Kernel::Counted<Raster::DynamicBuffer> destination,
                                         bool* abort) const {
    if (Kernel::IsAborted(abort) || source->GetFormat() != destination->GetFormat()) return;
    switch (source->GetFormat()) {
    case Raster::PixelFormat::RGBA8:
        return InvertRows<std::uint8_t>(*source, *destination, rect, 255);
    case Raster::PixelFormat::RGBA16:
    case Raster::PixelFormat::LabA16:
        return InvertRows<std::uint16_t>(*source, *destination, rect, 65535);
    case Raster::PixelFormat::RGBAUF:
        return InvertRows<float>(*source, *destination, rect, 1.0f);
    default:
        return; // other formats stay unfiltered, which the tests would notice
    }
}

Kernel::Counted<Raster::DynamicBuffer> MakeNoiseImage(int width, int height, Raster::PixelFormat format,
                                                      std::uint32_t seed) {
    auto image = Raster::DynamicBuffer::Create(width, height, format);
    std::uint32_t state = seed * 2654435761u + 1u;
    for (int y = 0; y < height; ++y)
        for (std::size_t i = 0; i < image->GetRowBytes(); ++i) {
            state = state * 1664525u + 1013904223u;
            image->RowBytes(y)[i] = std::byte(state >> 24);
        }
    return image;
}

Kernel::Counted<Raster::DynamicBuffer> MakeFilled(int width, int height, Raster::PixelFormat format,
                                                  std::vector<double> components) {
    auto image = Raster::DynamicBuffer::Create(width, height, format);
    const int channels = Raster::GetChannelCount(format);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x)
            for (int c = 0; c < channels; ++c) {
                const double v = components[std::size_t(c)];
                std::byte* at = image->RowBytes(y) + std::size_t(x) * std::size_t(image->GetBytesPerPixel());
                switch (Raster::GetBytesPerComponent(format)) {
                case 1:
                    at[c] = std::byte(std::uint8_t(std::lround(v * 255.0)));
                    break;
                case 2: {
                    const auto value = std::uint16_t(std::lround(v * 65535.0));
                    std::memcpy(at + 2 * c, &value, 2);
                    break;
                }
                default: {
                    const auto value = float(v);
                    std::memcpy(at + 4 * c, &value, 4);
                    break;
                }
                }
            }
    return image;
}

std::vector<std::byte> PixelBytes(const Raster::DynamicBuffer& image) {
    std::vector<std::byte> bytes;
    for (int y = 0; y < image.GetHeight(); ++y)
        bytes.insert(bytes.end(), image.RowBytes(y), image.RowBytes(y) + image.GetRowBytes());
    return bytes;
}

} // namespace DocumentTests
