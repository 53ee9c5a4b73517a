// Flattening documents: compositing in the working colour over the tile renderer, live filters through their
// span populators.
#include "host/document/DocumentRender.h"

#include "host/document/TileRenderer.h"
#include "host/document/WorkingPixels.h"
#include "host/kernel/Abort.h"
#include "host/renderer/SpanPopulator.h"

#include <vector>

namespace {

constexpr Raster::PixelFormat kWorking = Raster::PixelFormat::RGBAUF;

// Runs render over area in tiles, reporting its share [first, first + share) of the whole.
bool RenderStep(Kernel::RectT<int> area, const FlattenOptions& options, double first, double share,
                const std::function<bool(const Kernel::RectT<int>&)>& render) {
    TileRenderOptions tiles;
    tiles.tileSize = options.tileSize;
    tiles.threads = options.threads;
    tiles.abort = options.abort;
    if (options.progress)
        tiles.progress = [&](double fraction) {
            // The last step's 1.0 is the flatten's own, reported when it is done.
            const double overall = first + share * fraction;
            if (overall < 1.0) options.progress(overall);
        };
    return RenderTiles(area, tiles, render);
}

void CompositeLayer(const RasterNode& layer, const Raster::DynamicBuffer& pixels,
                    Raster::DynamicBuffer& canvas, Kernel::RectT<int> canvasBounds,
                    const Kernel::RectT<int>& tile) {
    // tile is in canvas pixels; the layer's part of it in layer pixels.
    const Kernel::PointT<int> offset = layer.GetOffset();
    const int dx = canvasBounds.left - offset.x, dy = canvasBounds.top - offset.y;
    const int width = tile.Width();
    std::vector<float> row(std::size_t(width) * 4);
    const std::size_t bpp = std::size_t(pixels.GetBytesPerPixel());
    for (int y = tile.top; y < tile.bottom; ++y) {
        WorkingPixels::ToWorking(pixels.GetFormat(),
                                 pixels.RowBytes(y + dy) + std::size_t(tile.left + dx) * bpp, row.data(),
                                 width);
        float* dest = canvas.Row<float>(y) + std::size_t(tile.left) * 4;
        for (int x = 0; x < width; ++x)
            CompositeOver(&row[std::size_t(x) * 4], dest + std::size_t(x) * 4);
    }
}

// One tile of pixels between the working canvas and a buffer of a layer format, either way.
void ConvertTile(const Raster::DynamicBuffer& from, Raster::DynamicBuffer& to,
                 const Kernel::RectT<int>& tile) {
    const bool toWorking = to.GetFormat() == kWorking;
    const Raster::PixelFormat other = toWorking ? from.GetFormat() : to.GetFormat();
    const std::size_t bpp = std::size_t(Raster::GetBytesPerPixel(other));
    const std::size_t workingOffset = std::size_t(tile.left) * 4, otherOffset = std::size_t(tile.left) * bpp;
    for (int y = tile.top; y < tile.bottom; ++y) {
        if (toWorking)
            WorkingPixels::ToWorking(other, from.RowBytes(y) + otherOffset, to.Row<float>(y) + workingOffset,
                                     tile.Width());
        else
            WorkingPixels::FromWorking(other, from.Row<float>(y) + workingOffset,
                                       to.RowBytes(y) + otherOffset, tile.Width());
    }
}

} // namespace

void CompositeOver(const float* source, float* dest) noexcept {
    const float sa = source[3];
    if (sa >= 1.0f) {
        std::copy(source, source + 4, dest);
        return;
    }
    if (!(sa > 0.0f)) return; // transparent (or NaN) pixels change nothing
    const float below = dest[3] * (1.0f - sa);
    const float alpha = sa + below;
    for (int c = 0; c < 3; ++c)
        dest[c] = (source[c] * sa + dest[c] * below) / alpha;
    dest[3] = alpha;
}

Kernel::RectT<int> GetDocumentBounds(const Document& document) {
    Kernel::RectT<int> bounds;
    bool any = false;
    for (const auto& node : document.GetLayers()) {
        const auto* raster = dynamic_cast<const RasterNode*>(node.Get());
        if (!raster || !raster->GetPixels()) continue;
        const Kernel::RectT<int> own = raster->GetDocumentBounds();
        bounds =
            any ? Kernel::RectT<int>{std::min(bounds.left, own.left), std::min(bounds.top, own.top),
                                     std::max(bounds.right, own.right), std::max(bounds.bottom, own.bottom)}
                : own;
        any = true;
    }
    return bounds;
}

FlattenResult FlattenDocument(const Document& document, const FlattenOptions& options) {
    FlattenResult result;
    const RasterNode* bottom = nullptr;
    for (const auto& node : document.GetLayers())
        if (const auto* raster = dynamic_cast<const RasterNode*>(node.Get()); raster && raster->GetPixels()) {
            bottom = raster;
            break;
        }
    if (!bottom) {
        result.error = "the document has no raster layer to render";
        return result;
    }
    const Raster::PixelFormat format = options.format.value_or(bottom->GetPixels()->GetFormat());
    if (!Raster::IsValidPixelFormat(format) || !Raster::IsLayerFormat(format)) {
        result.error = "the result's format must be a layer format";
        return result;
    }
    result.bounds = GetDocumentBounds(document);
    const int width = result.bounds.Width(), height = result.bounds.Height();
    Kernel::Counted<Raster::DynamicBuffer> canvas = Raster::DynamicBuffer::Create(width, height, kWorking);
    if (!canvas) {
        result.error =
            "a " + std::to_string(width) + "x" + std::to_string(height) + " image is too large to render";
        return result;
    }
    const Kernel::RectT<int> area = canvas->GetBounds();
    const auto& layers = document.GetLayers();
    // The canvas holds the document's RGB numbers; layers whose profile says otherwise are converted to them.
    const Raster::ColourProfiles documentProfiles = document.GetProfiles();
    Raster::ColourProfiles canvasProfiles;
    canvasProfiles.rgb = documentProfiles.rgb;
    const double steps = double(layers.size() + 1);
    bool* abort = const_cast<bool*>(options.abort); // the span populators take it mutable but only read it

    for (std::size_t i = 0; i < layers.size(); ++i) {
        const Node& node = *layers[i];
        bool rendered = true;
        if (const auto* raster = dynamic_cast<const RasterNode*>(&node)) {
            if (!raster->GetPixels()) continue;
            Kernel::Counted<Raster::DynamicBuffer> pixels = raster->GetPixels();
            Raster::ColourProfiles layerProfiles;
            layerProfiles.Add(raster->GetColourProfile());
            if (Raster::ICCManager::NeedsProfileConversion(pixels->GetFormat(), layerProfiles, kWorking,
                                                           canvasProfiles)) {
                std::string why;
                if (auto managed = Raster::ICCManager::ConvertImage(*pixels, layerProfiles, kWorking,
                                                                    canvasProfiles, why))
                    pixels = std::move(managed);
                else
                    result.warnings.push_back("layer \"" + node.GetName() +
                                              "\": its colour profile was not used (" + why + ")");
            }
            const Kernel::RectT<int> own = raster->GetDocumentBounds();
            const Kernel::RectT<int> part{own.left - result.bounds.left, own.top - result.bounds.top,
                                          own.right - result.bounds.left, own.bottom - result.bounds.top};
            rendered = RenderStep(part, options, double(i) / steps, 1.0 / steps,
                                  [&](const Kernel::RectT<int>& tile) {
                                      CompositeLayer(*raster, *pixels, *canvas, result.bounds, tile);
                                      return true;
                                  });
        } else if (const auto* live = dynamic_cast<const FilterRasterNode*>(&node)) {
            const auto filter = live->GetFilter();
            const auto* populator =
                dynamic_cast<const Renderer::SpanPopulatorBitmapFillMutationHost*>(filter.Get());
            if (!populator) {
                result.warnings.push_back(
                    "live filter layer \"" + node.GetName() + "\" (" +
                    (filter ? filter->GetDescription().Localise() : std::string("no filter")) +
                    ") cannot render; skipped");
                continue;
            }
            // The filter sees the composite in the document's format, as it would see a layer of it: integer
            // formats get their own rounding and clamping, not the working floats'. Where the document's
            // profiles give that format's numbers their meaning (Lab or CMYK of a profiled picture), both
            // ways go through them, as the flattened image does.
            const bool profiled =
                format != kWorking && Raster::ICCManager::NeedsProfileConversion(kWorking, canvasProfiles,
                                                                                 format, documentProfiles);
            std::string why;
            auto beneath = format == kWorking ? canvas
                           : profiled ? Raster::ICCManager::ConvertImage(*canvas, canvasProfiles, format,
                                                                         documentProfiles, why)
                                      : Raster::DynamicBuffer::Create(width, height, format);
            auto destination = Raster::DynamicBuffer::Create(width, height, format);
            if (!beneath || !destination) {
                result.error = "cannot render live filter layer \"" + node.GetName() +
                               "\": " + (why.empty() ? std::string("not enough memory") : why);
                return result;
            }
            const Kernel::RectT<double> bounds{0.0, 0.0, double(width), double(height)};
            // All of it first: the filter may read beyond the tile it renders.
            const bool converts = beneath != canvas && !profiled;
            const double share = converts ? 0.5 / steps : 0.0;
            if (converts)
                rendered =
                    RenderStep(area, options, double(i) / steps, share, [&](const Kernel::RectT<int>& tile) {
                        ConvertTile(*canvas, *beneath, tile);
                        return !Kernel::IsAborted(options.abort);
                    });
            rendered = rendered && RenderStep(area, options, double(i) / steps + share, 1.0 / steps - share,
                                              [&](const Kernel::RectT<int>& tile) {
                                                  populator->PrepareSpanPopulator(
                                                      beneath, 0, bounds, Raster::AffineTransform::Params{},
                                                      tile, destination, abort);
                                                  if (converts) ConvertTile(*destination, *canvas, tile);
                                                  return !Kernel::IsAborted(options.abort);
                                              });
            if (format == kWorking) {
                canvas = std::move(destination);
            } else if (profiled && rendered) {
                auto back = Raster::ICCManager::ConvertImage(*destination, documentProfiles, kWorking,
                                                             canvasProfiles, why);
                if (!back) {
                    result.error = "cannot render live filter layer \"" + node.GetName() + "\": " + why;
                    return result;
                }
                canvas = std::move(back);
            }
        }
        if (!rendered || Kernel::IsAborted(options.abort)) {
            result.error = "the render was aborted";
            return result;
        }
    }

    if (format == kWorking) {
        result.image = canvas;
    } else if (Raster::ICCManager::NeedsProfileConversion(kWorking, canvasProfiles, format,
                                                          documentProfiles)) {
        // Into another colour model from profiled RGB: through the profiles, not the built-in formulas.
        std::string why;
        result.image =
            Raster::ICCManager::ConvertImage(*canvas, canvasProfiles, format, documentProfiles, why);
        if (!result.image) {
            result.error = "the rendered image could not be converted to " +
                           std::string(Raster::GetPixelFormatName(format)) + " (" + why + ")";
            return result;
        }
    } else {
        auto image = Raster::DynamicBuffer::Create(width, height, format);
        if (!image) {
            result.error = "not enough memory for the rendered image";
            return result;
        }
        const bool converted = RenderStep(area, options, double(layers.size()) / steps, 1.0 / steps,
                                          [&](const Kernel::RectT<int>& tile) {
                                              ConvertTile(*canvas, *image, tile);
                                              return true;
                                          });
        if (!converted) {
            result.error = "the render was aborted";
            return result;
        }
        result.image = std::move(image);
    }
    if (options.progress) options.progress(1.0);
    return result;
}

Raster::ImageMetadata GetFlattenedMetadata(const Document& document, Raster::PixelFormat format) {
    Raster::ImageMetadata metadata = document.GetMetadata();
    metadata.iccProfile = document.GetProfiles().For(format);
    return metadata;
}
