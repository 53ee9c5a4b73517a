// Documents with pixels on disk: round trips of layers, placements, pixel selection, history with its undo
// pixels and live layers, colour profiles and metadata; every damaged or truncated file refused and left
// alone; hostile size claims refused before anything is allocated.

#include "host/document/DocumentController.h"
#include "host/document/DocumentFile.h"
#include "host/document/DocumentRender.h"
#include "host/document/PixelEffect.h"
#include "host/kernel/AtomicFile.h"
#include "tests/host/document/PixelDocumentSupport.h"

#include "tests/host/TestProfiles.h"
#include <cstring>
#include <gtest/gtest.h>

#include <lcms2.h>
#include <unistd.h>

using namespace DocumentTests;
using Raster::PixelFormat;

namespace {

std::uint64_t Fnv1a(std::span<const std::byte> bytes) {
    std::uint64_t hash = 0xcbf29ce484222325ull;
    for (std::byte b : bytes)
        hash = (hash ^ std::uint64_t(b)) * 0x100000001b3ull;
    return hash;
}

void Reseal(std::vector<std::byte>& file) {
    const std::uint64_t sum = Fnv1a(std::span(file).first(file.size() - 8));
    std::memcpy(file.data() + file.size() - 8, &sum, 8);
}

template <class T>
void Poke(std::vector<std::byte>& file, std::size_t at, T value) {
    std::memcpy(file.data() + at, &value, sizeof value);
}

class PixelDocumentFiles : public ::testing::Test {
protected:
    void SetUp() override {
        m_Path = std::filesystem::temp_directory_path() /
                 ("rastertools-pixeldoc-" + std::to_string(::getpid()) + "-" +
                  ::testing::UnitTest::GetInstance()->current_test_info()->name() + ".rtd");
    }
    void TearDown() override { std::filesystem::remove(m_Path); }

    // Two raster layers of different formats (the upper one placed off the origin), a destructive invert of
    // the upper one within a pixel selection, and a live invert layer on top.
    Kernel::Counted<Document> Build(int width, int height) {
        auto document = Kernel::MakeCounted<Document>();
        m_Bottom =
            Kernel::MakeCounted<RasterNode>("bottom", MakeNoiseImage(width, height, PixelFormat::RGBA16, 7));
        m_Top = Kernel::MakeCounted<RasterNode>(
            "top", MakeNoiseImage(width - 1, height, PixelFormat::RGBA8, 8), Kernel::PointT<int>{1, 0});
        document->InsertLayer(0, m_Bottom);
        document->InsertLayer(1, m_Top);
        auto mask = Raster::DynamicBuffer::Create(width, height, PixelFormat::MaskA8);
        for (int y = 1; y < height; ++y)
            mask->Row<std::uint8_t>(y)[2] = 255;
        document->SetPixelSelection(Kernel::MakeCounted<SelectionRasterNode>(mask));
        document->SetSelection({Kernel::Counted<Node>(m_Top)});
        m_BeforeEffect = PixelBytes(*m_Top->GetPixels());
        EXPECT_FALSE(ApplyPixelCommand(*document, Kernel::Counted<RasterCommand>(new InvertCommand())));
        auto live = Kernel::Counted<RasterDevicePreviewableFilterLayerCommand>(new InvertCommand(true));
        auto node = Kernel::MakeCounted<FilterRasterNode>("live invert", live);
        document->PushHistory({.kind = HistoryEntry::Kind::LiveLayerAdded,
                               .command = live,
                               .layer = Kernel::Counted<Node>(node),
                               .index = 2});
        return document;
    }

    std::filesystem::path m_Path;
    Kernel::Counted<RasterNode> m_Bottom, m_Top;
    std::vector<std::byte> m_BeforeEffect;
};

std::string Describe(const Document& document) {
    std::string text;
    for (const auto& node : document.GetLayers()) {
        text += node->GetKindName() + ":" + node->GetName();
        if (const auto* raster = dynamic_cast<const RasterNode*>(node.Get()))
            text += "@" + std::to_string(raster->GetOffset().x) + "," +
                    std::to_string(raster->GetOffset().y) + "/" +
                    std::string(Raster::GetPixelFormatName(raster->GetPixels()->GetFormat()));
        text += ";";
    }
    for (const auto& entry : document.GetHistory()) {
        text += " " + std::to_string(int(entry.kind)) + ":" + entry.command->GetDescription().Localise();
        for (const auto& patch : entry.patches)
            text += "[" + patch.layer->GetName() + " " + std::to_string(patch.rect.left) + "," +
                    std::to_string(patch.rect.top) + "," + std::to_string(patch.rect.right) + "," +
                    std::to_string(patch.rect.bottom) + "]";
    }
    return text + " cursor " + std::to_string(document.GetHistoryCursor());
}

Kernel::Counted<RasterNode> FindRaster(const Document& document, const std::string& name) {
    for (const auto& entry : document.GetHistory())
        for (const auto& patch : entry.patches)
            if (patch.layer->GetName() == name) return patch.layer;
    for (const auto& node : document.GetLayers())
        if (node->GetName() == name) return Kernel::CountedCast<RasterNode>(node);
    return {};
}

} // namespace

TEST_F(PixelDocumentFiles, RoundTripKeepsPixelsHistoryAndLiveLayers) {
    const auto document = Build(9, 5);
    const FlattenResult before = FlattenDocument(*document);
    ASSERT_TRUE(before.image) << before.error;
    ASSERT_FALSE(DocumentFile::Save(*document, m_Path));
    Kernel::Counted<Document> loaded;
    ASSERT_FALSE(DocumentFile::Load(m_Path, loaded));
    EXPECT_EQ(Describe(*loaded), Describe(*document));
    EXPECT_EQ(Describe(*loaded),
              "raster:bottom@0,0/rgba16;raster:top@1,0/rgba8;live filter:live invert; 0:Invert[top 1,1,2,5] "
              "1:Invert cursor 2");
    ASSERT_TRUE(loaded->GetPixelSelection());
    EXPECT_EQ(PixelBytes(*loaded->GetPixelSelection()->GetMask()),
              PixelBytes(*document->GetPixelSelection()->GetMask()));
    const FlattenResult after = FlattenDocument(*loaded);
    ASSERT_TRUE(after.image) << after.error;
    EXPECT_EQ(after.image->GetFormat(), PixelFormat::RGBA16);
    EXPECT_EQ(PixelBytes(*after.image), PixelBytes(*before.image));

    // Undo after loading: the live layer goes, then the exact pixels from before the invert come back.
    const auto top = FindRaster(*loaded, "top");
    ASSERT_TRUE(top);
    const auto inverted = PixelBytes(*top->GetPixels());
    ASSERT_TRUE(loaded->Undo());
    EXPECT_EQ(loaded->GetLayers().size(), 2u);
    ASSERT_TRUE(loaded->Undo());
    EXPECT_EQ(PixelBytes(*top->GetPixels()), m_BeforeEffect);

    // Saved while undone, the entry keeps the pixels that redo needs.
    ASSERT_FALSE(DocumentFile::Save(*loaded, m_Path));
    Kernel::Counted<Document> again;
    ASSERT_FALSE(DocumentFile::Load(m_Path, again));
    EXPECT_EQ(again->GetHistoryCursor(), 0u);
    ASSERT_TRUE(again->Redo());
    EXPECT_EQ(PixelBytes(*FindRaster(*again, "top")->GetPixels()), inverted);
    ASSERT_TRUE(again->Redo());
    const FlattenResult redone = FlattenDocument(*again);
    ASSERT_TRUE(redone.image) << redone.error;
    EXPECT_EQ(PixelBytes(*redone.image), PixelBytes(*before.image));
}

TEST_F(PixelDocumentFiles, EveryFlippedByteAndEveryTruncationIsRefusedAndTheFileLeftAlone) {
    const auto bytes = DocumentFile::Encode(*Build(3, 2));
    ASSERT_FALSE(bytes.empty());
    Kernel::Counted<Document> loaded;
    for (std::size_t length = 0; length < bytes.size(); ++length)
        ASSERT_TRUE(DocumentFile::Decode(std::span(bytes).first(length), loaded)) << "length " << length;
    for (std::size_t at = 0; at < bytes.size(); ++at)
        for (const std::byte flip : {std::byte(0x01), std::byte(0x80)}) {
            auto damaged = bytes;
            damaged[at] ^= flip;
            ASSERT_TRUE(DocumentFile::Decode(damaged, loaded)) << "byte " << at;
        }
    EXPECT_FALSE(loaded);

    // Through a file: the message names it and the file keeps its bytes.
    auto damaged = bytes;
    damaged[bytes.size() / 2] ^= std::byte(0x10);
    ASSERT_FALSE(Kernel::WriteFileAtomically(m_Path, damaged));
    const auto error = DocumentFile::Load(m_Path, loaded);
    ASSERT_TRUE(error);
    EXPECT_NE(error->find(m_Path.string() + ": the document is damaged"), std::string::npos) << *error;
    std::string after;
    ASSERT_FALSE(Kernel::ReadWholeFile(m_Path, after, 1 << 20));
    EXPECT_EQ(after.size(), damaged.size());
    EXPECT_EQ(std::memcmp(after.data(), damaged.data(), damaged.size()), 0);
}

TEST_F(PixelDocumentFiles, HostileSizesAndVersionsAreRefusedBeforeAllocating) {
    // One unnamed 1x1 layer: magic 8, version 4, counts 8, name length 4, kind 1, placement 8, then the
    // image: format 1, width 4, height 4, compressed size 8 and the frame.
    auto document = Kernel::MakeCounted<Document>();
    document->InsertLayer(
        0, Kernel::MakeCounted<RasterNode>("", MakeFilled(1, 1, PixelFormat::RGBA8, {1, 0, 0, 1})));
    const auto bytes = DocumentFile::Encode(*document);
    constexpr std::size_t kFormat = 33, kWidth = 34, kHeight = 38, kCompressed = 42;
    ASSERT_EQ(bytes[kFormat], std::byte(0));
    Kernel::Counted<Document> loaded;
    ASSERT_FALSE(DocumentFile::Decode(bytes, loaded));

    const auto refuse = [&](std::vector<std::byte> forged, const std::string& expected) {
        Reseal(forged);
        Kernel::Counted<Document> result;
        const auto error = DocumentFile::Decode(forged, result);
        ASSERT_TRUE(error) << expected;
        EXPECT_NE(error->find(expected), std::string::npos) << *error;
        EXPECT_FALSE(result);
    };
    {
        // 65536 × 32768 RGBA8 is 8 GiB: beyond what any buffer may hold.
        auto forged = bytes;
        Poke(forged, kWidth, std::int32_t(65536));
        Poke(forged, kHeight, std::int32_t(32768));
        refuse(forged, "65536x32768 rgba8 image is beyond the limits");
    }
    {
        // 16384 × 16384 RGBA8 (1 GiB) would be allowed, but the frame says it holds 4 bytes.
        auto forged = bytes;
        Poke(forged, kWidth, std::int32_t(16384));
        Poke(forged, kHeight, std::int32_t(16384));
        refuse(forged, "pixel data does not match the image's size");
    }
    {
        auto forged = bytes;
        Poke(forged, kWidth, std::int32_t(-1));
        refuse(forged, "beyond the limits");
        forged = bytes;
        Poke(forged, kFormat, std::uint8_t(7)); // MaskA8 is no layer format
        refuse(forged, "unknown pixel format 7");
        forged = bytes;
        Poke(forged, kCompressed, std::uint64_t(1) << 40);
        refuse(forged, "pixels truncated");
        forged = bytes;
        Poke(forged, 12, std::uint32_t(0x10000000)); // layer count
        refuse(forged, "the document is damaged (layer count)");
    }
    for (const std::uint32_t version : {1u, 5u}) {
        auto forged = bytes;
        Poke(forged, 8, version);
        Reseal(forged);
        const auto error = DocumentFile::Decode(forged, loaded);
        ASSERT_TRUE(error);
        EXPECT_EQ(*error, "document version " + std::to_string(version) + " is from " +
                              (version == 1 ? "an older" : "a newer") +
                              " rastertools and cannot be read (this program reads versions 2 to 4)");
    }
}

namespace {

// Each made once: a profile records when it was made, so two calls a second apart differ.
const std::vector<std::byte>& ProPhoto() {
    static const std::vector<std::byte> profile = HostTests::ProPhotoProfile();
    return profile;
}
const std::vector<std::byte>& Grey18() {
    static const std::vector<std::byte> profile = HostTests::GreyProfile(1.8);
    return profile;
}

Raster::ImageMetadata SomeMetadata() {
    Raster::ImageMetadata metadata;
    metadata.iccProfile = ProPhoto();
    metadata.exif = {std::byte('I'), std::byte('I'), std::byte(42), std::byte(0), std::byte(8),
                     std::byte(0),   std::byte(0),   std::byte(0),  std::byte(0), std::byte(0)};
    metadata.xmp = "<x:xmpmeta xmlns:x=\"adobe:ns:meta/\"/>";
    metadata.iptc = {std::byte(0x1C), std::byte(2), std::byte(0), std::byte(0),
                     std::byte(2),    std::byte(0), std::byte(4)};
    return metadata;
}

} // namespace

TEST_F(PixelDocumentFiles, ProfilesAndMetadataSurviveSavingAndOldVersionsStillLoad) {
    auto document = Kernel::MakeCounted<Document>();
    auto wide = Kernel::MakeCounted<RasterNode>("wide", MakeNoiseImage(3, 2, PixelFormat::RGBA16, 1));
    wide->SetColourProfile(ProPhoto());
    auto grey = Kernel::MakeCounted<RasterNode>("grey", MakeNoiseImage(3, 2, PixelFormat::IA8, 2));
    grey->SetColourProfile(Grey18());
    auto plain = Kernel::MakeCounted<RasterNode>("plain", MakeNoiseImage(3, 2, PixelFormat::RGBA8, 3));
    document->InsertLayer(0, wide);
    document->InsertLayer(1, grey);
    document->InsertLayer(2, plain);
    document->SetMetadata(SomeMetadata());
    ASSERT_FALSE(DocumentFile::Save(*document, m_Path));
    Kernel::Counted<Document> loaded;
    ASSERT_FALSE(DocumentFile::Load(m_Path, loaded));
    ASSERT_EQ(loaded->GetLayers().size(), 3u);
    const auto* layers = loaded->GetLayers().data();
    EXPECT_EQ(Kernel::CountedCast<RasterNode>(layers[0])->GetColourProfile(), ProPhoto());
    EXPECT_EQ(Kernel::CountedCast<RasterNode>(layers[1])->GetColourProfile(), Grey18());
    EXPECT_TRUE(Kernel::CountedCast<RasterNode>(layers[2])->GetColourProfile().empty());
    EXPECT_EQ(loaded->GetMetadata(), SomeMetadata());
    const Raster::ColourProfiles profiles = loaded->GetProfiles();
    EXPECT_EQ(profiles.rgb, ProPhoto());
    EXPECT_EQ(profiles.grey, Grey18());
    EXPECT_TRUE(profiles.cmyk.empty());
    auto controller = Kernel::MakeCounted<DocumentController>(loaded);
    EXPECT_EQ(controller->GetProfiles(), profiles);
    EXPECT_TRUE(
        Kernel::MakeCounted<DocumentController>(Kernel::Counted<Document>())->GetProfiles().IsEmpty());

    // The same one-layer document as version 3 wrote it: no profile block after the pixels and no metadata.
    auto single = Kernel::MakeCounted<Document>();
    single->InsertLayer(
        0, Kernel::MakeCounted<RasterNode>("", MakeFilled(1, 1, PixelFormat::RGBA8, {1, 0, 0, 1})));
    auto bytes = DocumentFile::Encode(*single);
    std::uint64_t frame = 0;
    std::memcpy(&frame, bytes.data() + 42, 8);
    const std::size_t afterPixels = 50 + std::size_t(frame);
    // Four empty blocks of the layer's profile and the metadata's profile and EXIF, XMP and IPTC.
    ASSERT_EQ(std::vector<std::byte>(bytes.begin() + std::ptrdiff_t(afterPixels),
                                     bytes.begin() + std::ptrdiff_t(afterPixels) + 20),
              std::vector<std::byte>(20));
    bytes.erase(bytes.begin() + std::ptrdiff_t(afterPixels),
                bytes.begin() + std::ptrdiff_t(afterPixels) + 20);
    Poke(bytes, 8, std::uint32_t(3));
    Reseal(bytes);
    Kernel::Counted<Document> old;
    const auto error = DocumentFile::Decode(bytes, old);
    ASSERT_FALSE(error) << *error;
    ASSERT_EQ(old->GetLayers().size(), 1u);
    EXPECT_TRUE(Kernel::CountedCast<RasterNode>(old->GetLayer(0))->GetColourProfile().empty());
    EXPECT_TRUE(old->GetMetadata().IsEmpty());
    EXPECT_EQ(PixelBytes(*Kernel::CountedCast<RasterNode>(old->GetLayer(0))->GetPixels()),
              PixelBytes(*MakeFilled(1, 1, PixelFormat::RGBA8, {1, 0, 0, 1})));
}

TEST(DocumentColour, FlatteningComposesInTheDocumentsProfileAndConvertsThroughIt) {
    // A ProPhoto layer alone: its numbers pass through untouched and the output carries its profile.
    auto document = Kernel::MakeCounted<Document>();
    auto wide = Kernel::MakeCounted<RasterNode>("wide", MakeNoiseImage(4, 3, PixelFormat::RGBA16, 5));
    wide->SetColourProfile(ProPhoto());
    document->InsertLayer(0, wide);
    FlattenResult flat = FlattenDocument(*document);
    ASSERT_TRUE(flat.image) << flat.error;
    EXPECT_EQ(PixelBytes(*flat.image), PixelBytes(*wide->GetPixels()));
    EXPECT_EQ(GetFlattenedMetadata(*document, PixelFormat::RGBA16).iccProfile, ProPhoto());
    EXPECT_TRUE(GetFlattenedMetadata(*document, PixelFormat::LabA16).iccProfile.empty());

    // Into Lab, the document's profile decides: what lcms2 gives for ProPhoto, not the sRGB formula.
    std::string error;
    Raster::ColourProfiles prophoto;
    prophoto.Add(ProPhoto());
    const auto expected =
        Raster::ICCManager::ConvertImage(*wide->GetPixels(), prophoto, PixelFormat::LabA16, {}, error);
    ASSERT_TRUE(expected) << error;
    flat = FlattenDocument(*document, {.format = PixelFormat::LabA16});
    ASSERT_TRUE(flat.image) << flat.error;
    const auto wideLab = PixelBytes(*flat.image);
    const auto managedLab = PixelBytes(*expected);
    ASSERT_EQ(wideLab.size(), managedLab.size());
    int worst = 0; // through 16-bit float working pixels on the one side only
    for (std::size_t i = 0; i + 1 < wideLab.size(); i += 2) {
        std::uint16_t a, b;
        std::memcpy(&a, &wideLab[i], 2);
        std::memcpy(&b, &managedLab[i], 2);
        worst = std::max(worst, std::abs(int(a) - int(b)));
    }
    EXPECT_LE(worst, 2);

    // An sRGB (unprofiled) layer over it is converted into ProPhoto numbers: opaque sRGB red is not
    // ProPhoto's full red but about (0.70, 0.28, 0.10) in it.
    auto red = Kernel::MakeCounted<RasterNode>("red", MakeFilled(4, 3, PixelFormat::RGBA16, {1, 0, 0, 1}));
    document->InsertLayer(1, red);
    flat = FlattenDocument(*document);
    ASSERT_TRUE(flat.image) << flat.error;
    const std::uint16_t* pixel = flat.image->Row<std::uint16_t>(1) + 4;
    EXPECT_NEAR(pixel[0] / 65535.0, 0.70, 0.03);
    EXPECT_NEAR(pixel[1] / 65535.0, 0.28, 0.03);
    EXPECT_NEAR(pixel[2] / 65535.0, 0.10, 0.05);
    EXPECT_EQ(pixel[3], 65535);
}

TEST(DocumentColour, LiveLayersSeeTheDocumentsColoursThroughItsProfile) {
    // A live invert over a ProPhoto layer, flattened to Lab: the filter inverts the Lab that lcms2 gives for
    // ProPhoto, not the sRGB formula's reading of the same numbers.
    auto document = Kernel::MakeCounted<Document>();
    auto wide =
        Kernel::MakeCounted<RasterNode>("wide", MakeFilled(4, 3, PixelFormat::RGBA16, {0.2, 0.55, 0.35, 1}));
    wide->SetColourProfile(ProPhoto());
    document->InsertLayer(0, wide);
    document->InsertLayer(1, Kernel::MakeCounted<FilterRasterNode>(
                                 "invert", Kernel::Counted<RasterDevicePreviewableFilterLayerCommand>(
                                               new InvertCommand(true))));
    std::string error;
    Raster::ColourProfiles prophoto;
    prophoto.Add(ProPhoto());
    const auto lab =
        Raster::ICCManager::ConvertImage(*wide->GetPixels(), prophoto, PixelFormat::LabA16, {}, error);
    ASSERT_TRUE(lab) << error;
    const FlattenResult flat = FlattenDocument(*document, {.format = PixelFormat::LabA16});
    ASSERT_TRUE(flat.image) << flat.error;
    for (int y = 0; y < 3; ++y)
        for (int x = 0; x < 4; ++x) {
            const std::uint16_t* expected = lab->Row<std::uint16_t>(y) + 4 * x;
            const std::uint16_t* got = flat.image->Row<std::uint16_t>(y) + 4 * x;
            for (int c = 0; c < 3; ++c)
                EXPECT_NEAR(got[c], 65535 - expected[c], 4)
                    << "pixel " << x << ", " << y << ", component " << c;
            EXPECT_EQ(got[3], 65535);
        }
}
