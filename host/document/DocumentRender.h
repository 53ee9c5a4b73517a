#pragma once
// Flattening a document to one image: raster layers composited bottom to top, live filter layers rendered
// over what lies beneath them.

#include "host/document/Document.h"

#include <functional>
#include <optional>
#include <string>
#include <vector>

struct FlattenOptions {
    // The result's format (a layer format); nothing takes the bottom raster layer's.
    std::optional<Raster::PixelFormat> format;
    int tileSize = 256; // as TileRenderOptions
    int threads = 0;
    const bool* abort = nullptr; // host-owned, only read
    // A rising fraction of the whole flatten, one call at a time; 1.0 comes last.
    std::function<void(double fraction)> progress;
};

struct FlattenResult {
    Kernel::Counted<Raster::DynamicBuffer> image; // null on failure
    Kernel::RectT<int> bounds;                    // the image's rectangle in document pixels
    std::vector<std::string> warnings;            // layers that were skipped, and why
    std::string error;                            // why there is no image
};

// The union of the raster layers' rectangles in document pixels; empty when there is no raster layer.
Kernel::RectT<int> GetDocumentBounds(const Document& document);

// Composites the layers in the working colour, holding the document's RGB numbers (Document::GetProfiles): a
// layer whose profile says otherwise is converted to them first, and the result goes into another colour
// model through the profiles. Raster layers go on with the normal "over" operator on straight alpha; each
// live filter layer's command renders (through its span-populator face, in tiles) from the composite beneath
// it, taken in the result's format as a layer of that format would be, and its result replaces that
// composite. A live layer whose command has no span-populator face is skipped with a warning.
FlattenResult FlattenDocument(const Document& document, const FlattenOptions& options = {});

// What a flattened image of format carries into a file: the metadata of the image the document was made
// from, with the document's profile for pixels of format (none where it has none of that kind).
Raster::ImageMetadata GetFlattenedMetadata(const Document& document, Raster::PixelFormat format);

// Straight-alpha "over" of one working pixel onto another: both four floats, the result in dest.
void CompositeOver(const float* source, float* dest) noexcept;
