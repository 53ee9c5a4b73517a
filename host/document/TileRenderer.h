#pragma once
// The host's tile renderer: splits an area into grid-aligned tiles rendered on worker threads, and the
// choice of compute device that renders them.

#include "host/kernel/Countable.h"
#include "host/kernel/Geometry.h"
#include "host/raster/device/Hardware.h"

#include <functional>
#include <string>

struct TileRenderOptions {
    // The grid's pitch in pixels, anchored at document (0, 0); 0 or less renders the area as one tile.
    int tileSize = 256;
    // The most threads rendering at once; 0 (or less) uses every core, 1 renders on the calling thread.
    int threads = 0;
    // Host-owned; may be set from any thread (Kernel::SetAborted). Read before each tile.
    const bool* abort = nullptr;
    // Called from the rendering threads, one call at a time, with a rising fraction of the area's pixels;
    // 1.0 comes last and only when every tile was rendered.
    std::function<void(double fraction)> progress;
};

// Renders area tile by tile: each tile is the area clipped to one cell of the grid, so tile borders do not
// depend on the area. renderTile may run on several threads at once, each call on its own tile. No tile is
// started once the abort flag has been seen set or a tile has failed. True when every tile was rendered and
// returned true; an empty area renders nothing and is a success. An exception from renderTile or progress
// stops the render and is rethrown here once the other threads have finished their tiles.
bool RenderTiles(Kernel::RectT<int> area, const TileRenderOptions& options,
                 const std::function<bool(const Kernel::RectT<int>& tile)>& renderTile);

// Which device the user asked for, and where that came from.
struct DeviceSelection {
    std::string selector; // lower case, without blanks: "auto", "cpu", "opencl", "cuda:1"; empty on error
    std::string origin;   // "--device X", "RASTERTOOLS_DEVICE=X" or "default": for messages
    std::string error;    // a message for the user when the value is not a selector

    bool IsValid() const noexcept { return error.empty(); }
};

// The value of `--device` (empty when the option was not given), else RASTERTOOLS_DEVICE, else "auto".
// Accepts auto, cpu, opencl and cuda, any case, the last two optionally with a device index (opencl:1).
DeviceSelection ResolveDeviceSelector(const std::string& commandLine);

struct RenderDevice {
    // Null renders on the processor: "cpu", or "auto" where no device exists.
    Kernel::Counted<Raster::HardwareDevice> device;
    // Set when the selection was invalid or named a back end (or device index) that is not there, so that
    // the command line can refuse instead of silently rendering on the processor.
    std::string error;

    bool IsValid() const noexcept { return error.empty(); }
};

RenderDevice FindRenderDevice(const DeviceSelection& selection);
