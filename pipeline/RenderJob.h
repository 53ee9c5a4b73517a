#pragma once
// Rendering a whole image with a pipeline command: tiles on the host's tile renderer, device mirrors shared
// by all tiles, and a count of where each tile rendered.

#include "pipeline/PipelineCommand.h"

#include <functional>
#include <string>

namespace RasterTools {

struct RenderJobOptions {
    int tileSize = 256;                             // pixels; 0 renders the image as one tile
    int threads = 0;                                // 0: every core
    Kernel::Counted<Raster::HardwareDevice> device; // null: the processor only
    // Compile the kernel before the first tile, so that no tile falls back while it compiles.
    bool waitForKernel = true;
    int channelMask = -1;
    // The part of the destination to render; empty renders all of it.
    Kernel::RectT<int> area;
    // Handed to the command's stages (see RenderTarget); empty bounds stand for the source's own.
    Kernel::RectT<double> bounds;
    Raster::AffineTransform::Params transform;
    const bool* abort = nullptr;
    std::function<void(double fraction)> progress;
};

struct RenderJobResult {
    bool complete = false; // every tile rendered
    long deviceTiles = 0;
    long processorTiles = 0;
    std::string error; // why not, when not complete
};

// Renders all of destination from source (and mask, which may be empty). The destination's pixels are on
// the host when this returns.
RenderJobResult RenderImage(const PipelineCommand& command, Kernel::Counted<Raster::DynamicBuffer> source,
                            Kernel::Counted<Raster::DynamicBuffer> destination,
                            Kernel::Counted<Raster::DynamicBuffer> mask, const RenderJobOptions& options);

} // namespace RasterTools
