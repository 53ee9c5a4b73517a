// Whole-image renders over the tile renderer, and the host's buffer form of a render.
#include "pipeline/RenderJob.h"

#include "host/document/TileRenderer.h"

#include <atomic>

namespace RasterTools {

namespace {
Kernel::RectT<double> BoundsOf(const Raster::DynamicBuffer& image) {
    return {0.0, 0.0, double(image.GetWidth()), double(image.GetHeight())};
}
} // namespace

RenderJobResult RenderImage(const PipelineCommand& command, Kernel::Counted<Raster::DynamicBuffer> source,
                            Kernel::Counted<Raster::DynamicBuffer> destination,
                            Kernel::Counted<Raster::DynamicBuffer> mask, const RenderJobOptions& options) {
    RenderJobResult result;
    if (!source || !destination) {
        result.error = "no image to render";
        return result;
    }
    RenderTarget target;
    target.source.pixels = source;
    target.destination.pixels = destination;
    target.mask.pixels = mask;
    target.device = options.device;
    target.channelMask = options.channelMask;
    target.abort = options.abort;
    target.bounds = options.bounds.IsEmpty() ? BoundsOf(*source) : options.bounds;
    target.transform = options.transform;
    if (options.device) {
        // One mirror per image for all tiles: the source goes to the device once.
        target.source.cache = Raster::HardwareCache::Create(source);
        target.destination.cache =
            source == destination ? target.source.cache : Raster::HardwareCache::Create(destination);
        if (mask) target.mask.cache = Raster::HardwareCache::Create(mask);
        if (options.waitForKernel) command.PrepareDevice(target);
    }

    std::atomic<long> deviceTiles{0}, processorTiles{0};
    std::atomic<int> failure{-1};
    TileRenderOptions tiles;
    tiles.tileSize = options.tileSize;
    tiles.threads = options.threads;
    tiles.abort = options.abort;
    tiles.progress = options.progress;
    const Kernel::RectT<int> area =
        options.area.IsEmpty() ? destination->GetBounds() : options.area.Intersect(destination->GetBounds());
    const bool rendered = RenderTiles(area, tiles, [&](const Kernel::RectT<int>& tile) {
        RenderTarget own = target;
        own.rect = tile;
        const RenderPath path = command.Render(own);
        switch (path) {
        case RenderPath::Device:
            ++deviceTiles;
            return true;
        case RenderPath::Processor:
            ++processorTiles;
            return true;
        case RenderPath::Nothing:
            return true;
        case RenderPath::Aborted:
        case RenderPath::Failed:
            break;
        }
        failure = static_cast<int>(path);
        return false;
    });
    result.deviceTiles = deviceTiles;
    result.processorTiles = processorTiles;
    if (target.destination.cache && !target.destination.cache->SyncHostCache(destination->GetBounds())) {
        result.error = "the result could not be copied back from the device";
        return result;
    }
    if (!rendered) {
        result.error = failure == static_cast<int>(RenderPath::Failed)
                           ? "the command cannot render these formats"
                           : "the render was aborted";
        return result;
    }
    result.complete = true;
    return result;
}

void PipelineCommand::PrepareSpanPopulator(const Renderer::SpanPopulatorBitmapFillMutationTarget* target,
                                           Kernel::RectT<int> rect,
                                           Kernel::Counted<Raster::DynamicBuffer> buffer,
                                           Raster::AffineTransform::Params transform, bool, bool* abort,
                                           int) const {
    if (!target) return;
    PrepareSpanPopulator(target->GetSource(), 0, target->GetBounds(), transform, rect, std::move(buffer),
                         abort);
}

void PipelineCommand::PrepareSpanPopulator(Kernel::Counted<Raster::DynamicBuffer> source, int,
                                           Kernel::RectT<double> bounds,
                                           Raster::AffineTransform::Params transform, Kernel::RectT<int> rect,
                                           Kernel::Counted<Raster::DynamicBuffer> destination,
                                           bool* abort) const {
    if (!source) return;
    RenderTarget target;
    target.bounds = bounds.IsEmpty() ? BoundsOf(*source) : bounds;
    target.transform = transform;
    target.source.pixels = std::move(source);
    target.destination.pixels = std::move(destination);
    target.rect = rect;
    target.device = Raster::Hardware::GetDevice();
    target.abort = abort;
    Render(target);
}

Kernel::RectT<int> PipelineCommand::RenderDirectly(const MutableRasterInterface& raster) const {
    const Kernel::Counted<Raster::DynamicBuffer> pixels = raster.GetPixels();
    if (!pixels) return {};
    const Kernel::RectT<int> area = GetEffectArea(raster).Intersect(pixels->GetBounds());
    if (area.IsEmpty()) return {};
    // Stages may read around the pixel they write, so they read an untouched copy.
    const Kernel::Counted<Raster::DynamicBuffer> source = pixels->Clone();
    if (!source) return {};
    RenderJobOptions options;
    options.area = area;
    options.abort = raster.GetAbort();
    if (raster.GetTileSize() > 0) options.tileSize = raster.GetTileSize();
    options.threads = raster.GetThreads();
    options.progress = [&raster](double fraction) { raster.Progress(fraction); };
    const RenderJobResult result = RenderImage(*this, source, pixels, nullptr, options);
    return result.complete ? area : Kernel::RectT<int>{};
}

} // namespace RasterTools
