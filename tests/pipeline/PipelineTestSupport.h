#pragma once
// Shared by the pipeline tests: images with varied pixels, image comparison that names the worst pixel,
// renders whole and in tiles, and the OpenCL device.

#include "host/raster/Bitmap.h"
#include "pipeline/PipelineCommand.h"

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

namespace PipelineTest {

using Raster::PixelFormat;

// An image of format whose pixels cover each channel's range, edges included: per pixel a hash of its
// position and seed. Alpha is 0, full, or in between; float colour also goes below 0 and above 1.
Kernel::Counted<Raster::DynamicBuffer> MakeImage(PixelFormat format, int width, int height, unsigned seed);
// Every pixel the same bytes.
Kernel::Counted<Raster::DynamicBuffer> MakeFilled(PixelFormat format, int width, int height,
                                                  const void* pixel);

// The components of pixel (x, y) as doubles, in channel order.
std::vector<double> ReadComponents(const Raster::DynamicBuffer& image, int x, int y);

// Where two images of one size and format differ most, in units of the last stored bit (float components:
// units of the last bit at the value's magnitude, at least at 1). Nothing when no component differs by more
// than tolerance.
struct Difference {
    int x = 0, y = 0, channel = 0;
    double a = 0.0, b = 0.0;
    double units = 0.0;
    std::string Describe() const;
};
std::optional<Difference> Compare(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b,
                                  double tolerance = 0.0);

// CMYKA8 images compared by what their pixels mean: both converted to working RGBA, in units of 1/255.
std::optional<Difference> CompareCMYKMeaning(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b,
                                             double tolerance);

// The first OpenCL device; null where none is installed.
Kernel::Counted<Raster::HardwareDevice> OpenCLDevice();

// Renders command over all of destination in square tiles of tileSize (0: whole) one after another, with
// or without device; the device mirrors are shared by the tiles. Returns the paths the tiles took.
struct TiledResult {
    int device = 0, processor = 0, other = 0;
};
TiledResult RenderTiled(const RasterTools::PipelineCommand& command, const RasterTools::RenderTarget& base,
                        int tileWidth, int tileHeight, int originX = 0, int originY = 0);

// A fresh destination for command and source: its output shape, filled from a fixed pattern so that pixels a
// render fails to write show up.
Kernel::Counted<Raster::DynamicBuffer> MakeDestination(const RasterTools::PipelineCommand& command,
                                                       const Raster::DynamicBuffer& source);

// How a whole-image render sees its raster.
struct View {
    Kernel::RectT<double> bounds;              // empty: the image's own
    Raster::AffineTransform::Params transform; // raster pixels to the view
};

// The command's render of source into a fresh image (MakeDestination) through the tile renderer, in square
// tiles of tileSize (0: whole), on device when given (every tile must then run there). Null when the render
// did not complete.
Kernel::Counted<Raster::DynamicBuffer>
Render(const RasterTools::PipelineCommand& command, const Kernel::Counted<Raster::DynamicBuffer>& source,
       int tileSize, const Kernel::Counted<Raster::HardwareDevice>& device = nullptr, const View& view = {});

} // namespace PipelineTest

#define REQUIRE_OPENCL(name)                                                                                 \
    const auto name = ::PipelineTest::OpenCLDevice();                                                        \
    if (!name) GTEST_SKIP() << "no OpenCL device: install pocl-opencl-icd to run the device path"
