#pragma once
// Renders a chain of filters (apply A : B : C) in bands of rows carried through every filter at once, so that
// the images between filters never need to be held whole.

#include "host/document/Command.h"
#include "pipeline/RenderJob.h"

#include <functional>
#include <string>
#include <vector>

namespace App {

// One filter of a chain: the image it writes, and how.
struct ChainLink {
    const RasterCommand* command = nullptr;                 // for its read area
    const RasterTools::PipelineCommand* pipeline = nullptr; // the same command, rendering
    RasterTools::OutputShape shape;
    int channelMask = -1;
    Kernel::Counted<Raster::DynamicBuffer> mask; // the size of shape, or null
    int tileSize = 256;
};

struct ChainOptions {
    int threads = 0;
    Kernel::Counted<Raster::HardwareDevice> device; // null: the processor
    std::function<void(double fraction)> progress;
};

struct ChainResult {
    Kernel::Counted<Raster::DynamicBuffer> image; // the last filter's output; null on failure
    long deviceTiles = 0;
    long processorTiles = 0;
    std::string error;         // why not, when image is null
    bool filterFailed = false; // the error is that of filter failedLink, not of an image's size
    std::size_t failedLink = 0;
};

// Which filters of links start a run rendered whole, from a complete input (the first always does): a filter
// whose read area is unbounded cannot take its input a band at a time. On a device every filter does (the
// device mirrors whole images).
std::vector<bool> GetWholeInputLinks(const std::vector<ChainLink>& links, bool onDevice);

// Renders links one after another from source. Within a run, the output is rendered in bands of rows; each
// band asks the filters before it for the rows its read area needs (grown by every later filter's margin),
// rendering only rows not rendered yet, and rows no later band reads are given back to the system. The
// pixels are those of rendering each filter over the whole image in turn.
ChainResult RenderChain(Kernel::Counted<Raster::DynamicBuffer> source, const std::vector<ChainLink>& links,
                        const ChainOptions& options);

} // namespace App
