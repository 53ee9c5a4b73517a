// Snapshots share pixels with their layers and keep a tile only when it is about to change.

#include "host/document/DocumentController.h"
#include "host/document/LayerSnapshot.h"

#include <gtest/gtest.h>

#include <cstring>

namespace {

// Paints value into rect of the layer's pixels as history does: through a patch swapped in.
void Change(Document& document, const Kernel::Counted<RasterNode>& layer, Kernel::RectT<int> rect,
            std::uint8_t value) {
    auto pixels = Raster::DynamicBuffer::Create(rect.Width(), rect.Height(), layer->GetPixels()->GetFormat());
    for (int y = 0; y < rect.Height(); ++y)
        std::memset(pixels->RowBytes(y), value, pixels->GetRowBytes());
    HistoryEntry entry{.kind = HistoryEntry::Kind::PixelChange};
    entry.patches.push_back({.layer = layer, .rect = rect, .pixels = pixels});
    document.PushHistory(std::move(entry));
}

struct SnapshotDocument {
    Kernel::Counted<Document> document = Kernel::MakeCounted<Document>();
    Kernel::Counted<RasterNode> layer;
    Kernel::Counted<DocumentController> controller;

    explicit SnapshotDocument(int side) {
        layer = Kernel::MakeCounted<RasterNode>("layer", side, side);
        document->InsertLayer(0, layer);
        controller = Kernel::MakeCounted<DocumentController>(document);
    }
};

TEST(LayerSnapshot, ASnapshotOfALargeDocumentCostsOnlyTheTilesThatChangeAfterIt) {
    SnapshotDocument doc(4096);
    const auto& snapshot = doc.controller->NominateSnapshot();
    ASSERT_TRUE(snapshot);
    EXPECT_EQ(snapshot->GetKeptBytes(), 0u);

    // A 10 × 10 change across the corner of four tiles keeps those four tiles and nothing else.
    const int t = LayerSnapshot::kTileSide;
    Change(*doc.document, doc.layer, {t - 5, t - 5, t + 5, t + 5}, 9);
    const std::uint64_t tileBytes =
        Raster::DynamicBuffer::ComputeStorageBytes(t, t, Raster::PixelFormat::RGBA8);
    EXPECT_EQ(doc.controller->GetCurrentSnapshot()->GetKeptBytes(), 4 * tileBytes);
    // A second change within the same tiles costs nothing more.
    Change(*doc.document, doc.layer, {t, t, t + 2, t + 2}, 7);
    EXPECT_EQ(snapshot->GetKeptBytes(), 4 * tileBytes);
    // The layer holds 64 MiB; the snapshot a quarter of a MiB.
    EXPECT_LT(snapshot->GetKeptBytes() * 200, doc.layer->GetPixels()->GetStorageBytes());

    // The snapshot still reads the pixels from before, the layer the new ones.
    const auto before = snapshot->ReadLayerPixels(doc.layer->GetId(), {t - 6, t - 6, t + 6, t + 6});
    ASSERT_TRUE(before);
    for (int y = 0; y < before->GetHeight(); ++y)
        for (std::size_t x = 0; x < before->GetRowBytes(); ++x)
            ASSERT_EQ(std::uint8_t(before->RowBytes(y)[x]), 0) << x << "," << y;
    EXPECT_EQ(std::uint8_t(doc.layer->GetPixels()->RowBytes(t)[std::size_t(t) * 4]), 7);
}

TEST(LayerSnapshot, OnlyTilesWhosePixelsDifferAreKeptFromAChangedRectangle) {
    // A diagonal stroke's change is its bounding box: 512 × 512 of which only the diagonal differs.
    SnapshotDocument doc(1024);
    const auto snapshot = doc.controller->NominateSnapshot();
    auto pixels = Raster::DynamicBuffer::Create(512, 512, Raster::PixelFormat::RGBA8);
    for (int i = 0; i < 512; ++i)
        pixels->Row<std::uint8_t>(i)[i * 4 + 3] = 255;
    HistoryEntry entry{.kind = HistoryEntry::Kind::PixelChange};
    entry.patches.push_back({.layer = doc.layer, .rect = {100, 100, 612, 612}, .pixels = pixels});
    doc.document->PushHistory(std::move(entry));
    // The diagonal from (100, 100) to (611, 611) lies in the five tiles (0, 0) to (4, 4) of 128 pixels.
    EXPECT_EQ(snapshot->GetKeptBytes(),
              5 * Raster::DynamicBuffer::ComputeStorageBytes(
                      LayerSnapshot::kTileSide, LayerSnapshot::kTileSide, Raster::PixelFormat::RGBA8));
    const auto read = snapshot->ReadLayerPixels(doc.layer->GetId(), {100, 100, 612, 612});
    ASSERT_TRUE(read);
    EXPECT_EQ(std::uint8_t(read->RowBytes(300)[300 * 4 + 3]), 0);
    EXPECT_EQ(std::uint8_t(doc.layer->GetPixels()->RowBytes(400)[400 * 4 + 3]), 255);
}

TEST(LayerSnapshot, UndoAndRedoAfterTheSnapshotAreKeptToo) {
    SnapshotDocument doc(300);
    Change(*doc.document, doc.layer, {0, 0, 10, 10}, 50);
    const auto snapshot = doc.controller->NominateSnapshot();
    doc.document->Undo(); // back to zero under the snapshot's feet
    const auto kept = snapshot->ReadLayerPixels(doc.layer->GetId(), {0, 0, 10, 10});
    ASSERT_TRUE(kept);
    EXPECT_EQ(std::uint8_t(kept->RowBytes(9)[39]), 50);
    EXPECT_EQ(std::uint8_t(doc.layer->GetPixels()->RowBytes(9)[39]), 0);
    EXPECT_EQ(snapshot->GetKeptBytes(),
              Raster::DynamicBuffer::ComputeStorageBytes(LayerSnapshot::kTileSide, LayerSnapshot::kTileSide,
                                                         Raster::PixelFormat::RGBA8));
}

TEST(LayerSnapshot, ReplacedBuffersAndStrangeReadsAreHandled) {
    SnapshotDocument doc(100);
    const auto original = doc.layer->GetPixels();
    const auto snapshot = doc.controller->NominateSnapshot();
    // A new buffer leaves the old one alone: nothing to keep.
    doc.layer->SetPixels(Raster::DynamicBuffer::Create(100, 100, Raster::PixelFormat::RGBA8));
    Change(*doc.document, doc.layer, {0, 0, 100, 100}, 3);
    EXPECT_EQ(snapshot->GetKeptBytes(), 0u);
    const auto read = snapshot->ReadLayerPixels(doc.layer->GetId(), {90, 90, 100, 100});
    ASSERT_TRUE(read);
    EXPECT_EQ(std::uint8_t(read->RowBytes(0)[0]), 0);
    EXPECT_FALSE(snapshot->ReadLayerPixels(doc.layer->GetId(), {90, 90, 101, 100}));
    EXPECT_FALSE(snapshot->ReadLayerPixels(doc.layer->GetId(), {5, 5, 5, 9}));
    EXPECT_FALSE(snapshot->ReadLayerPixels(doc.layer->GetId() + 1000, {0, 0, 1, 1}));
    // A snapshot that goes away stops observing its layer.
    doc.controller->SetCurrentSnapshot({});
    Change(*doc.document, doc.layer, {0, 0, 1, 1}, 4);
    (void)original;
}

} // namespace
