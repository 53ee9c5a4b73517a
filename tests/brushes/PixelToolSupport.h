#pragma once
// A one-layer document with the pixel tool, and helpers to read its pixels.

#include "brushes/RasterPixelTool.h"
#include "host/document/DocumentController.h"

#include <string>
#include <vector>

struct PixelToolDocument {
    Kernel::Counted<Document> document = Kernel::MakeCounted<Document>();
    Kernel::Counted<RasterNode> layer;
    Kernel::Counted<DocumentController> controller;
    Kernel::Counted<RasterTools::RasterPixelTool> tool;
    std::vector<std::string> events;

    explicit PixelToolDocument(int width = 64, int height = 48,
                               Raster::PixelFormat format = Raster::PixelFormat::RGBA8);
    Raster::DynamicBuffer& Pixels() const { return *layer->GetPixels(); }
    // The component bytes of pixel (x, y) of the layer.
    std::vector<std::uint8_t> PixelAt(int x, int y) const;
    bool Saw(const std::string& event) const;
};

// A copy of the pixels of image, for comparing before and after.
std::vector<std::uint8_t> Bytes(const Raster::DynamicBuffer& image);
