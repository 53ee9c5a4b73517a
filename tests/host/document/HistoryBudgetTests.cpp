// History within its memory budget: the oldest done entries go once the undo pixels exceed it, what stays
// still undoes and redoes exactly, and the number dropped survives saving and loading.

#include "host/document/DocumentFile.h"
#include "host/document/PixelEffect.h"
#include "tests/host/document/PixelDocumentSupport.h"

#include <algorithm>
#include <cstring>
#include <gtest/gtest.h>

using namespace DocumentTests;
using Raster::PixelFormat;

namespace {

constexpr int kSide = 64;
constexpr std::size_t kPatchBytes = std::size_t(kSide) * kSide * 4; // one whole RGBA8 layer

struct Inverted {
    Kernel::Counted<Document> document;
    Kernel::Counted<RasterNode> layer;
    std::vector<std::vector<std::byte>> states; // the layer's pixels after 0, 1, 2, ... inverts
};

// A layer inverted count times, each a history entry holding the whole layer's previous pixels.
Inverted InvertRepeatedly(int count, std::size_t budget) {
    Inverted result;
    result.document = Kernel::MakeCounted<Document>();
    result.document->SetHistoryBudget(budget);
    result.layer =
        Kernel::MakeCounted<RasterNode>("layer", MakeNoiseImage(kSide, kSide, PixelFormat::RGBA8, 3));
    result.document->InsertLayer(0, result.layer);
    result.document->SetSelection({Kernel::Counted<Node>(result.layer)});
    result.states.push_back(PixelBytes(*result.layer->GetPixels()));
    for (int i = 0; i < count; ++i) {
        EXPECT_FALSE(
            ApplyPixelCommand(*result.document, Kernel::Counted<RasterCommand>(new InvertCommand())));
        result.states.push_back(PixelBytes(*result.layer->GetPixels()));
    }
    return result;
}

} // namespace

TEST(HistoryBudget, OldestEntriesGoOnceThePixelsExceedIt) {
    // Two whole-layer entries fit, three do not.
    auto run = InvertRepeatedly(10, 2 * kPatchBytes + kPatchBytes / 2);
    Document& document = *run.document;
    ASSERT_EQ(document.GetHistory().size(), 2u);
    EXPECT_EQ(document.GetHistoryCursor(), 2u);
    EXPECT_EQ(document.GetDroppedHistoryCount(), 8u);
    EXPECT_EQ(document.GetHistoryBytes(), 2 * kPatchBytes);

    // What stays undoes to the state after the last dropped entry, and no further; redo comes back exactly.
    ASSERT_TRUE(document.Undo());
    EXPECT_EQ(PixelBytes(*run.layer->GetPixels()), run.states[9]);
    ASSERT_TRUE(document.Undo());
    EXPECT_EQ(PixelBytes(*run.layer->GetPixels()), run.states[8]);
    EXPECT_FALSE(document.Undo());
    ASSERT_TRUE(document.Redo());
    ASSERT_TRUE(document.Redo());
    EXPECT_EQ(PixelBytes(*run.layer->GetPixels()), run.states[10]);

    // A smaller budget drops done entries only: an undone one stays to be redone, whatever its size.
    ASSERT_TRUE(document.Undo());
    document.SetHistoryBudget(1);
    ASSERT_EQ(document.GetHistory().size(), 1u);
    EXPECT_EQ(document.GetHistoryCursor(), 0u);
    EXPECT_EQ(document.GetDroppedHistoryCount(), 9u);
    EXPECT_EQ(PixelBytes(*run.layer->GetPixels()), run.states[9]);
    ASSERT_TRUE(document.Redo());
    EXPECT_EQ(PixelBytes(*run.layer->GetPixels()), run.states[10]);
    // The newest entry stays although it alone exceeds the budget.
    document.SetHistoryBudget(1);
    EXPECT_EQ(document.GetHistory().size(), 1u);
    ASSERT_TRUE(document.Undo());
    EXPECT_EQ(PixelBytes(*run.layer->GetPixels()), run.states[9]);
}

TEST(HistoryBudget, TwoHundredCommitsStayWithinIt) {
    auto run = InvertRepeatedly(200, 16 * kPatchBytes);
    EXPECT_EQ(run.document->GetHistory().size(), 16u);
    EXPECT_LE(run.document->GetHistoryBytes(), 16 * kPatchBytes);
    EXPECT_EQ(run.document->GetDroppedHistoryCount(), 184u);
    // Without a budget of their own, documents get the default.
    EXPECT_EQ(Kernel::MakeCounted<Document>()->GetHistoryBudget(), Document::kDefaultHistoryBudget);
}

TEST(HistoryBudget, TheDroppedCountSurvivesSavingAndVersionTwoFilesStillLoad) {
    auto run = InvertRepeatedly(5, 2 * kPatchBytes);
    ASSERT_EQ(run.document->GetDroppedHistoryCount(), 3u);
    const auto bytes = DocumentFile::Encode(*run.document);
    ASSERT_FALSE(bytes.empty());
    Kernel::Counted<Document> loaded;
    ASSERT_FALSE(DocumentFile::Decode(bytes, loaded));
    EXPECT_EQ(loaded->GetHistory().size(), 2u);
    EXPECT_EQ(loaded->GetDroppedHistoryCount(), 3u);

    // The same file as version 2 wrote it: no dropped count after the history's entry count and cursor, and
    // neither the layer's colour profile nor the document's metadata (empty blocks, 20 bytes of zeros after
    // the layer's pixels: magic, version, counts, the name "layer", kind, placement and image header take
    // 55).
    const std::uint32_t counts[2] = {2, 2};
    const std::uint64_t dropped = 3;
    std::vector<std::byte> field(16);
    std::memcpy(field.data(), counts, 8);
    std::memcpy(field.data() + 8, &dropped, 8);
    const auto at = std::search(bytes.begin(), bytes.end(), field.begin(), field.end());
    ASSERT_NE(at, bytes.end());
    std::vector<std::byte> old(bytes.begin(), at + 8);
    old.insert(old.end(), at + 16, bytes.end());
    std::uint64_t frame = 0;
    std::memcpy(&frame, old.data() + 47, 8);
    const auto profiles = old.begin() + std::ptrdiff_t(55 + frame);
    ASSERT_EQ(std::vector<std::byte>(profiles, profiles + 20), std::vector<std::byte>(20));
    old.erase(profiles, profiles + 20);
    const std::uint32_t two = 2;
    std::memcpy(old.data() + 8, &two, 4);
    std::uint64_t hash = 0xcbf29ce484222325ull;
    for (std::size_t i = 0; i + 8 < old.size(); ++i)
        hash = (hash ^ std::uint64_t(old[i])) * 0x100000001b3ull;
    std::memcpy(old.data() + old.size() - 8, &hash, 8);
    ASSERT_FALSE(DocumentFile::Decode(old, loaded));
    EXPECT_EQ(loaded->GetHistory().size(), 2u);
    EXPECT_EQ(loaded->GetDroppedHistoryCount(), 0u);
    ASSERT_TRUE(loaded->Undo());
    ASSERT_TRUE(loaded->Undo());
    EXPECT_FALSE(loaded->Undo());
}
