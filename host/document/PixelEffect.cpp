// Direct pixel changes: each target layer opened as a MutableRasterInterface over a working copy, the changed
// rectangle kept as the history entry's patch.
#include "host/document/PixelEffect.h"

#include "host/kernel/Abort.h"

#include <algorithm>
#include <cstring>

namespace {

class LayerRaster final : public MutableRasterInterface {
public:
    LayerRaster(Kernel::Counted<Raster::DynamicBuffer> pixels, Raster::AffineTransform::Params transform,
                const SelectionRasterNode* selection, const PixelEffectOptions& options, double first,
                double share, std::uint64_t layerId)
        : m_Pixels(std::move(pixels))
        , m_Transform(transform)
        , m_Selection(selection)
        , m_Options(options)
        , m_First(first)
        , m_Share(share)
        , m_LayerId(layerId) {}

    Kernel::Counted<Raster::DynamicBuffer> GetPixels() const override { return m_Pixels; }
    Kernel::RectT<int> GetRasterBoundingBox() const override { return m_Pixels->GetBounds(); }
    Raster::AffineTransform::Params GetTransform() const override { return m_Transform; }
    const SelectionRasterNode* GetSelection() const override { return m_Selection; }
    std::uint64_t GetLayerId() const override { return m_LayerId; }
    const bool* GetAbort() const override { return m_Options.abort; }
    int GetTileSize() const override { return m_Options.tileSize; }
    int GetThreads() const override { return m_Options.threads; }
    void Progress(double fraction) const override {
        if (m_Options.progress) m_Options.progress(m_First + m_Share * std::clamp(fraction, 0.0, 1.0));
    }

private:
    Kernel::Counted<Raster::DynamicBuffer> m_Pixels;
    Raster::AffineTransform::Params m_Transform;
    const SelectionRasterNode* m_Selection;
    const PixelEffectOptions& m_Options;
    double m_First;
    double m_Share;
    std::uint64_t m_LayerId;
};

Kernel::Counted<Raster::DynamicBuffer> Crop(const Raster::DynamicBuffer& image, Kernel::RectT<int> rect) {
    auto crop = Raster::DynamicBuffer::Create(rect.Width(), rect.Height(), image.GetFormat());
    if (!crop) return crop;
    const std::size_t bpp = std::size_t(image.GetBytesPerPixel());
    for (int y = 0; y < rect.Height(); ++y)
        std::memcpy(crop->RowBytes(y), image.RowBytes(rect.top + y) + std::size_t(rect.left) * bpp,
                    crop->GetRowBytes());
    return crop;
}

} // namespace

std::vector<Kernel::Counted<RasterNode>> GetPixelTargets(const Document& document) {
    std::vector<Kernel::Counted<RasterNode>> targets;
    // In stack order, whatever order they were selected in.
    for (const auto& node : document.GetLayers())
        if (auto raster = Kernel::CountedCast<RasterNode>(node))
            if (std::find(document.GetSelection().begin(), document.GetSelection().end(), node) !=
                document.GetSelection().end())
                targets.push_back(raster);
    if (targets.empty())
        for (auto it = document.GetLayers().rbegin(); it != document.GetLayers().rend(); ++it)
            if (auto raster = Kernel::CountedCast<RasterNode>(*it)) {
                targets.push_back(raster);
                break;
            }
    return targets;
}

std::optional<std::string> ApplyPixelCommand(Document& document,
                                             const Kernel::Counted<RasterCommand>& command,
                                             const PixelEffectOptions& options) {
    if (!command) return "no command to apply";
    command->SetSelection(document.GetSelection());
    const auto targets = GetPixelTargets(document);
    HistoryEntry entry{.kind = HistoryEntry::Kind::PixelChange, .command = command};
    const SelectionRasterNode* selection = document.GetPixelSelection().Get();
    for (std::size_t i = 0; i < targets.size(); ++i) {
        const auto& layer = targets[i];
        if (!layer->GetPixels()) continue;
        // The command works on a copy: the layer changes only when the entry is pushed, all layers at once.
        auto work = layer->GetPixels()->Clone();
        if (!work) return "not enough memory to change layer \"" + layer->GetName() + "\"";
        LayerRaster raster(work, layer->GetTransform(), selection, options,
                           double(i) / double(targets.size()), 1.0 / double(targets.size()), layer->GetId());
        const Kernel::RectT<int> changed =
            command->DoEffect(Kernel::NonCounted<MutableRasterInterface>(&raster))
                .Intersect(work->GetBounds());
        if (Kernel::IsAborted(options.abort)) return std::string("the change was aborted");
        if (changed.IsEmpty()) continue;
        auto patch = Crop(*work, changed);
        if (!patch) return "not enough memory to keep the change of layer \"" + layer->GetName() + "\"";
        entry.patches.push_back({.layer = layer, .rect = changed, .pixels = std::move(patch)});
    }
    document.PushHistory(std::move(entry));
    if (options.progress) options.progress(1.0);
    return std::nullopt;
}
