// What a photographer's files keep through the command line: a wide-gamut picture's profile, its camera
// metadata and its orientation, through apply and through a document; its Lab from its own profile.

#include "host/document/DocumentFile.h"
#include "host/io/ImageIO.h"
#include "host/raster/ICCManager.h"
#include "tests/app/CommandLineSupport.h"
#include "tests/host/TestProfiles.h"

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
#include <exiv2/exiv2.hpp>
#pragma GCC diagnostic pop

#include <cstring>

using namespace AppTests;
using Raster::PixelFormat;

namespace {

// Made once: a profile records when it was made, so two calls a second apart differ.
const std::vector<std::byte>& ProPhoto() {
    static const std::vector<std::byte> profile = HostTests::ProPhotoProfile();
    return profile;
}

// A 6 × 4 portrait as a camera stores it: sideways, with Orientation 6, a maker and a copyright.
Raster::ImageMetadata Camera() {
    Raster::ImageMetadata metadata;
    metadata.iccProfile = ProPhoto();
    Exiv2::ExifData exif;
    exif["Exif.Image.Make"] = "Testmaker";
    exif["Exif.Image.Copyright"] = "(c) 2026 Ada";
    exif["Exif.Image.Orientation"] = std::uint16_t(6);
    Exiv2::Blob blob;
    Exiv2::ExifParser::encode(blob, Exiv2::littleEndian, exif);
    const auto* p = reinterpret_cast<const std::byte*>(blob.data());
    metadata.exif.assign(p, p + blob.size());
    return metadata;
}

Kernel::Counted<Raster::DynamicBuffer> Picture() {
    auto image = Raster::DynamicBuffer::Create(6, 4, PixelFormat::RGBA8);
    for (int y = 0; y < 4; ++y)
        for (int x = 0; x < 6; ++x) {
            std::uint8_t* p = image->Row<std::uint8_t>(y) + x * 4;
            p[0] = std::uint8_t(40 * x);
            p[1] = std::uint8_t(60 * y);
            p[2] = std::uint8_t(200 - 20 * x);
            p[3] = 255;
        }
    return image;
}

std::string Tag(const Raster::ImageMetadata& metadata, const char* key) {
    Exiv2::ExifData exif;
    if (metadata.exif.empty()) return "(none)";
    Exiv2::ExifParser::decode(exif, reinterpret_cast<const Exiv2::byte*>(metadata.exif.data()),
                              std::uint32_t(metadata.exif.size()));
    const auto found = exif.findKey(Exiv2::ExifKey(key));
    return found == exif.end() ? "(none)" : found->toString();
}

class ImageFlow : public CommandLine {
protected:
    void SetUp() override {
        CommandLine::SetUp();
        IO::WriteOptions options;
        options.metadata = Camera();
        ASSERT_TRUE(IO::WriteImage(m_Folder / "portrait.png", *Picture(), options));
    }
};

} // namespace

TEST_F(ImageFlow, ApplyAndDocumentsKeepProfileMetadataAndOrientation) {
    for (const char* output : {"out.png", "out.jpg", "out.tif", "out.webp"}) {
        SCOPED_TRACE(output);
        const Result run = Run(std::string("apply copy portrait.png ") + output + " --device cpu");
        ASSERT_EQ(run.exitCode, 0) << run.output;
        const IO::ReadResult read = IO::ReadImage(m_Folder / output);
        ASSERT_TRUE(read) << read.error;
        EXPECT_EQ(read.metadata.iccProfile, ProPhoto());
        EXPECT_EQ(Tag(read.metadata, "Exif.Image.Make"), "Testmaker");
        EXPECT_EQ(Tag(read.metadata, "Exif.Image.Copyright"), "(c) 2026 Ada");
        // Kept as the camera set it (TIFF readers apply it on reading: the picture comes out turned).
        const bool tiff = std::string(output) == "out.tif";
        EXPECT_EQ(Tag(read.metadata, "Exif.Image.Orientation"), tiff ? "1" : "6");
        EXPECT_EQ(read.image->GetWidth(), tiff ? 4 : 6);
    }
    const Result made = Run("doc new portrait.png -o photo.rtd");
    ASSERT_EQ(made.exitCode, 0) << made.output;
    const Result rendered = Run("doc render photo.rtd rendered.png --device cpu");
    ASSERT_EQ(rendered.exitCode, 0) << rendered.output;
    const IO::ReadResult read = IO::ReadImage(m_Folder / "rendered.png");
    ASSERT_TRUE(read) << read.error;
    EXPECT_EQ(read.metadata.iccProfile, ProPhoto());
    EXPECT_EQ(Tag(read.metadata, "Exif.Image.Make"), "Testmaker");
    EXPECT_EQ(Tag(read.metadata, "Exif.Image.Orientation"), "6");
}

TEST_F(ImageFlow, LabFromATaggedPictureUsesItsProfile) {
    // The document's layer is converted by the host on the way in: through the picture's profile.
    const Result run = Run("doc new portrait.png -o lab.rtd --format laba16");
    ASSERT_EQ(run.exitCode, 0) << run.output;
    Kernel::Counted<Document> document;
    const auto error = DocumentFile::Load(m_Folder / "lab.rtd", document);
    ASSERT_FALSE(error) << *error;
    const auto layer = Kernel::CountedCast<RasterNode>(document->GetLayer(0));
    ASSERT_TRUE(layer);
    ASSERT_EQ(layer->GetPixels()->GetFormat(), PixelFormat::LabA16);
    EXPECT_TRUE(layer->GetColourProfile().empty()); // Lab needs none
    EXPECT_EQ(document->GetMetadata().iccProfile, ProPhoto());
    EXPECT_EQ(Tag(document->GetMetadata(), "Exif.Image.Make"), "Testmaker");
    Raster::ColourProfiles profiles;
    profiles.Add(ProPhoto());
    std::string why;
    const auto expected =
        Raster::ICCManager::ConvertImage(*Picture(), profiles, PixelFormat::LabA16, {}, why);
    ASSERT_TRUE(expected) << why;
    for (int y = 0; y < 4; ++y)
        EXPECT_EQ(std::memcmp(layer->GetPixels()->RowBytes(y), expected->RowBytes(y), 6 * 8), 0)
            << "row " << y;
    // What the built-in sRGB conversion would give differs: the profile was used.
    const auto srgb = Raster::ICCManager::ConvertImage(*Picture(), {}, PixelFormat::LabA16, {}, why);
    EXPECT_NE(std::memcmp(srgb->RowBytes(0), expected->RowBytes(0), 6 * 8), 0);
}

// A play script that loads a document renders pictures that carry what the document's picture carried.
TEST_F(ImageFlow, PlayRendersKeepTheDocumentsProfileAndMetadata) {
    const Result made = Run("doc new portrait.png -o photo.rtd");
    ASSERT_EQ(made.exitCode, 0) << made.output;
    Write("render.play", "load photo.rtd\nadd-live copy\nrender played.png\nrender played.jpg\n");
    const Result played = Run("play render.play");
    ASSERT_EQ(played.exitCode, 0) << played.output;
    for (const char* output : {"played.png", "played.jpg"}) {
        SCOPED_TRACE(output);
        const IO::ReadResult read = IO::ReadImage(m_Folder / output);
        ASSERT_TRUE(read) << read.error;
        EXPECT_EQ(read.metadata.iccProfile, ProPhoto());
        EXPECT_EQ(Tag(read.metadata, "Exif.Image.Make"), "Testmaker");
        EXPECT_EQ(Tag(read.metadata, "Exif.Image.Copyright"), "(c) 2026 Ada");
        EXPECT_EQ(Tag(read.metadata, "Exif.Image.Orientation"), "6");
    }
    // A script's own document was made from no picture: its renders carry nothing.
    Write("fresh.play", "render fresh.png\n");
    ASSERT_EQ(Run("play fresh.play").exitCode, 0);
    const IO::ReadResult fresh = IO::ReadImage(m_Folder / "fresh.png");
    ASSERT_TRUE(fresh) << fresh.error;
    EXPECT_TRUE(fresh.metadata.IsEmpty());
}
