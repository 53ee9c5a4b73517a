#pragma once
// Applying a command to the pixels of raster layers (DoEffect), recorded in history so that it can be undone.

#include "host/document/Document.h"

#include <functional>
#include <optional>
#include <string>
#include <vector>

struct PixelEffectOptions {
    const bool* abort = nullptr; // host-owned, only read
    // A rising fraction of the work over every target layer, one call at a time.
    std::function<void(double fraction)> progress;
    int tileSize = 0; // the renderer's tile side; 0: its own choice
    int threads = 0;  // worker threads; 0: every core
};

// The layers a pixel command changes: the selected raster layers, else the top raster layer.
std::vector<Kernel::Counted<RasterNode>> GetPixelTargets(const Document& document);

// Runs command's DoEffect on a copy of each target layer, within the document's pixel selection, and pushes a
// PixelChange entry whose patches keep the changed rectangles, so that undo restores the exact pixels. The
// command is given the document's layer selection. Returns an error and leaves the document as it was when
// the work was aborted or memory ran out.
std::optional<std::string> ApplyPixelCommand(Document& document,
                                             const Kernel::Counted<RasterCommand>& command,
                                             const PixelEffectOptions& options = {});
