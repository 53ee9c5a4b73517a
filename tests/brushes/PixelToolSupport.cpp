#include "PixelToolSupport.h"

#include <algorithm>
#include <cstring>

PixelToolDocument::PixelToolDocument(int width, int height, Raster::PixelFormat format) {
    auto pixels = Raster::DynamicBuffer::Create(width, height, format);
    // A mid-grey, opaque background, so that painting and erasing both show.
    const auto& info = Raster::GetPixelFormatInfo(format);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x)
            for (int c = 0; c < info.channelCount; ++c) {
                std::byte* at =
                    pixels->RowBytes(y) + std::size_t(x * info.bytesPerPixel + c * info.bytesPerComponent);
                const double value = c == info.alphaIndex ? 1.0 : 0.5;
                if (info.bytesPerComponent == 1) {
                    const auto v = std::uint8_t(value * 255 + 0.5);
                    std::memcpy(at, &v, 1);
                } else if (info.bytesPerComponent == 2) {
                    const auto v = std::uint16_t(value * 65535 + 0.5);
                    std::memcpy(at, &v, 2);
                } else {
                    const auto v = float(value);
                    std::memcpy(at, &v, 4);
                }
            }
    layer = Kernel::MakeCounted<RasterNode>("paint", pixels);
    document->InsertLayer(0, layer);
    document->SetSelection({layer});
    controller = Kernel::MakeCounted<DocumentController>(document);
    controller->SetObserver([this](const std::string& event) { events.push_back(event); });
    RasterTools::RasterPixelTool::CreateTool(controller);
    tool = Kernel::CountedCast<RasterTools::RasterPixelTool>(controller->FindTool(ToolID::Pixel));
    controller->SetActiveTool(tool);
    tool->Start({});
}

std::vector<std::uint8_t> PixelToolDocument::PixelAt(int x, int y) const {
    const auto& pixels = Pixels();
    const auto* at = reinterpret_cast<const std::uint8_t*>(pixels.RowBytes(y)) +
                     std::size_t(x) * pixels.GetBytesPerPixel();
    return {at, at + pixels.GetBytesPerPixel()};
}

bool PixelToolDocument::Saw(const std::string& event) const {
    return std::find(events.begin(), events.end(), event) != events.end();
}

std::vector<std::uint8_t> Bytes(const Raster::DynamicBuffer& image) {
    std::vector<std::uint8_t> bytes;
    for (int y = 0; y < image.GetHeight(); ++y)
        bytes.insert(bytes.end(), reinterpret_cast<const std::uint8_t*>(image.RowBytes(y)),
                     reinterpret_cast<const std::uint8_t*>(image.RowBytes(y)) + image.GetRowBytes());
    return bytes;
}
