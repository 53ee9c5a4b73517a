// Colour profiles and EXIF, XMP and IPTC through every file type that holds them: read back by the project's
// reader and by libexiv2 on its own; orientation kept by default and applied on request.

#include "tests/host/io/TestImages.h"

#include <gtest/gtest.h>

#include "tests/host/TestProfiles.h"

#include <lcms2.h>

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
#include <exiv2/exiv2.hpp>
#pragma GCC diagnostic pop

#include <functional>

using namespace IOTest;
using Raster::PixelFormat;

namespace {

using HostTests::SaveProfile;

// A CMYK output profile's header and description: all the writers look at.
std::vector<std::byte> CmykProfile() {
    cmsHPROFILE profile = cmsCreateProfilePlaceholder(nullptr);
    cmsSetDeviceClass(profile, cmsSigOutputClass);
    cmsSetColorSpace(profile, cmsSigCmykData);
    cmsSetPCS(profile, cmsSigLabData);
    cmsMLU* text = cmsMLUalloc(nullptr, 1);
    cmsMLUsetASCII(text, "en", "US", "Test CMYK");
    cmsWriteTag(profile, cmsSigProfileDescriptionTag, text);
    cmsMLUfree(text);
    return SaveProfile(profile);
}

std::vector<std::byte> ToBytes(const Exiv2::Blob& blob) {
    const auto* p = reinterpret_cast<const std::byte*>(blob.data());
    return {p, p + blob.size()};
}

// What a camera and a photographer put into a file.
Raster::ImageMetadata CameraMetadata(int orientation) {
    Exiv2::XmpParser::initialize();
    Raster::ImageMetadata metadata;
    Exiv2::ExifData exif;
    exif["Exif.Image.Make"] = "Testmaker";
    exif["Exif.Image.Model"] = "Model 7";
    exif["Exif.Image.Artist"] = "Ada Photographer";
    exif["Exif.Image.Copyright"] = "(c) 2026 Ada";
    exif["Exif.Image.Orientation"] = std::uint16_t(orientation);
    exif["Exif.Photo.DateTimeOriginal"] = "2026:05:01 10:20:30";
    exif["Exif.GPSInfo.GPSLatitudeRef"] = "N";
    exif["Exif.GPSInfo.GPSLatitude"] = "48/1 51/1 30/1";
    Exiv2::Blob blob;
    Exiv2::ExifParser::encode(blob, Exiv2::littleEndian, exif);
    metadata.exif = ToBytes(blob);
    Exiv2::XmpData xmp;
    xmp["Xmp.dc.creator"] = "Ada Photographer";
    xmp["Xmp.xmp.Rating"] = "4";
    EXPECT_EQ(Exiv2::XmpParser::encode(metadata.xmp, xmp), 0);
    Exiv2::IptcData iptc;
    iptc["Iptc.Application2.Byline"] = "Ada Photographer";
    iptc["Iptc.Application2.City"] = "Paris";
    const Exiv2::DataBuf encoded = Exiv2::IptcParser::encode(iptc);
    const auto* p = reinterpret_cast<const std::byte*>(encoded.pData_);
    metadata.iptc.assign(p, p + encoded.size_);
    return metadata;
}

Exiv2::ExifData DecodeExif(const std::vector<std::byte>& blob) {
    Exiv2::ExifData exif;
    if (!blob.empty())
        Exiv2::ExifParser::decode(exif, reinterpret_cast<const Exiv2::byte*>(blob.data()),
                                  std::uint32_t(blob.size()));
    return exif;
}

std::string Text(const Exiv2::ExifData& exif, const char* key) {
    const auto found = exif.findKey(Exiv2::ExifKey(key));
    return found == exif.end() ? "(none)" : found->toString();
}

std::string XmpText(const std::string& packet, const char* key) {
    Exiv2::XmpData xmp;
    if (packet.empty() || Exiv2::XmpParser::decode(xmp, packet) != 0) return "(none)";
    const auto found = xmp.findKey(Exiv2::XmpKey(key));
    return found == xmp.end() ? "(none)" : found->toString();
}

std::string IptcText(const std::vector<std::byte>& blob, const char* key) {
    Exiv2::IptcData iptc;
    if (blob.empty() || Exiv2::IptcParser::decode(iptc, reinterpret_cast<const Exiv2::byte*>(blob.data()),
                                                  std::uint32_t(blob.size())))
        return "(none)";
    const auto found = iptc.findKey(Exiv2::IptcKey(key));
    return found == iptc.end() ? "(none)" : found->toString();
}

struct Target {
    IO::FileType type;
    PixelFormat format;
    bool lossless;
};

const Target ColourTargets[] = {
    {IO::FileType::PNG, PixelFormat::RGBA8, true},   {IO::FileType::PNG, PixelFormat::RGBA16, true},
    {IO::FileType::JPEG, PixelFormat::RGBA8, false}, {IO::FileType::TIFF, PixelFormat::RGBA8, true},
    {IO::FileType::TIFF, PixelFormat::RGBA16, true}, {IO::FileType::WebP, PixelFormat::RGBA8, false},
    {IO::FileType::AVIF, PixelFormat::RGBA8, false}, {IO::FileType::HEIC, PixelFormat::RGBA8, false},
};

std::string Describe(const Target& target) {
    return std::string(IO::GetFileTypeName(target.type)) + " " +
           std::string(Raster::GetPixelFormatName(target.format));
}

} // namespace

TEST(Profiles, SurviveARoundTripThroughEveryTypeThatHoldsOne) {
    const std::vector<std::byte> prophoto = HostTests::ProPhotoProfile(), grey = HostTests::GreyProfile(2.2),
                                 cmyk = CmykProfile();
    std::vector<Target> targets(std::begin(ColourTargets), std::end(ColourTargets));
    for (IO::FileType type : {IO::FileType::PNG, IO::FileType::JPEG, IO::FileType::TIFF})
        targets.push_back({type, PixelFormat::IA8, type != IO::FileType::JPEG});
    targets.push_back({IO::FileType::JPEG, PixelFormat::CMYKA8, false});
    targets.push_back({IO::FileType::TIFF, PixelFormat::CMYKA8, true});
    for (const Target& target : targets) {
        SCOPED_TRACE(Describe(target));
        const bool isGrey = target.format == PixelFormat::IA8;
        const bool isCmyk = target.format == PixelFormat::CMYKA8;
        const std::vector<std::byte>& profile = isGrey ? grey : isCmyk ? cmyk : prophoto;
        const auto image = isGrey || isCmyk || Raster::GetBytesPerComponent(target.format) > 1
                               ? Noise(target.format, 24, 16, 5)
                               : Ramps(target.format, 24, 16);
        IO::WriteOptions options;
        options.metadata.iccProfile = profile;
        const IO::EncodeResult encoded = IO::EncodeImage(*image, target.type, "p", options);
        ASSERT_TRUE(encoded) << encoded.error;
        const IO::ReadResult read = IO::DecodeImage(encoded.bytes, "p");
        ASSERT_TRUE(read) << read.error;
        EXPECT_EQ(read.metadata.iccProfile, profile);
        // libexiv2 finds the same profile where it reads that type's profile itself.
        if (target.type == IO::FileType::PNG || target.type == IO::FileType::JPEG) {
            auto file = Exiv2::ImageFactory::open(reinterpret_cast<const Exiv2::byte*>(encoded.bytes.data()),
                                                  long(encoded.bytes.size()));
            file->readMetadata();
            ASSERT_TRUE(file->iccProfileDefined());
            const auto* p = reinterpret_cast<const std::byte*>(file->iccProfile()->pData_);
            EXPECT_EQ(std::vector<std::byte>(p, p + file->iccProfile()->size_), profile);
        }
        // A profile of another colour model would misdescribe the pixels, so it is left out.
        IO::WriteOptions wrong;
        wrong.metadata.iccProfile = isGrey ? prophoto : grey;
        const IO::EncodeResult mismatched = IO::EncodeImage(*image, target.type, "p", wrong);
        ASSERT_TRUE(mismatched) << mismatched.error;
        EXPECT_TRUE(IO::DecodeImage(mismatched.bytes, "p").metadata.iccProfile.empty());
    }
}

TEST(Metadata, SurvivesARoundTripThroughEveryTypeThatHoldsIt) {
    const Raster::ImageMetadata camera = CameraMetadata(6);
    for (const Target& target : ColourTargets) {
        SCOPED_TRACE(Describe(target));
        const auto image = target.lossless ? Noise(target.format, 20, 12, 3) : Ramps(target.format, 20, 12);
        IO::WriteOptions options;
        options.metadata = camera;
        options.metadata.iccProfile = HostTests::ProPhotoProfile();
        const IO::EncodeResult encoded = IO::EncodeImage(*image, target.type, "m", options);
        ASSERT_TRUE(encoded) << encoded.error;

        const IO::ReadResult read = IO::DecodeImage(encoded.bytes, "m");
        ASSERT_TRUE(read) << read.error;
        // Writing the metadata leaves the pixels and the profile as the encoder wrote them.
        if (target.lossless && target.type != IO::FileType::TIFF) {
            EXPECT_EQ(Difference(*image, *read.image), "");
        }
        EXPECT_EQ(read.metadata.iccProfile, options.metadata.iccProfile);
        const Exiv2::ExifData exif = DecodeExif(read.metadata.exif);
        EXPECT_EQ(Text(exif, "Exif.Image.Make"), "Testmaker");
        EXPECT_EQ(Text(exif, "Exif.Image.Artist"), "Ada Photographer");
        EXPECT_EQ(Text(exif, "Exif.Image.Copyright"), "(c) 2026 Ada");
        EXPECT_EQ(Text(exif, "Exif.Photo.DateTimeOriginal"), "2026:05:01 10:20:30");
        EXPECT_EQ(Text(exif, "Exif.GPSInfo.GPSLatitude"), "48/1 51/1 30/1");
        EXPECT_EQ(XmpText(read.metadata.xmp, "Xmp.dc.creator"), "Ada Photographer");
        const bool heif = target.type == IO::FileType::AVIF || target.type == IO::FileType::HEIC;
        // TIFF and HEIF pixels come out upright (the type's own rules), so their tag then says so.
        const bool upright = heif || target.type == IO::FileType::TIFF;
        if (target.type == IO::FileType::TIFF) {
            // The TIFF's own orientation tag now says 6, so the reader turned the stored rows upright: the
            // stored top-left pixel is shown top-right.
            ASSERT_EQ(read.image->GetWidth(), image->GetHeight());
            const std::size_t pixel = std::size_t(image->GetBytesPerPixel());
            EXPECT_EQ(std::memcmp(read.image->RowBytes(0) + (image->GetHeight() - 1) * pixel,
                                  image->RowBytes(0), pixel),
                      0);
        }
        EXPECT_EQ(Text(exif, "Exif.Image.Orientation"), upright ? "1" : "6");
        const bool holdsIptc = target.type == IO::FileType::PNG || target.type == IO::FileType::JPEG ||
                               target.type == IO::FileType::TIFF;
        EXPECT_EQ(IptcText(read.metadata.iptc, "Iptc.Application2.City"), holdsIptc ? "Paris" : "(none)");

        // libexiv2 reading the file on its own finds the same, for the types it reads.
        if (heif) continue;
        auto file = Exiv2::ImageFactory::open(reinterpret_cast<const Exiv2::byte*>(encoded.bytes.data()),
                                              long(encoded.bytes.size()));
        file->readMetadata();
        EXPECT_EQ(Text(file->exifData(), "Exif.Image.Model"), "Model 7");
        EXPECT_EQ(Text(file->exifData(), "Exif.Image.Orientation"), "6");
        const auto creator = file->xmpData().findKey(Exiv2::XmpKey("Xmp.dc.creator"));
        ASSERT_NE(creator, file->xmpData().end());
        EXPECT_EQ(creator->toString(), "Ada Photographer");
        if (holdsIptc) {
            const auto city = file->iptcData().findKey(Exiv2::IptcKey("Iptc.Application2.City"));
            ASSERT_NE(city, file->iptcData().end());
            EXPECT_EQ(city->toString(), "Paris");
        }
    }
}

// WebP and HEIF have no IPTC block: the author, copyright and place a photographer set in IPTC come back as
// the XMP properties that stand for them, from the project's reader and from libexiv2's, while a property the
// XMP already had keeps its value; types with an IPTC block keep the XMP as it was.
TEST(Metadata, IptcIsKeptAsXmpWhereTheTypeHasNoIptcBlock) {
    Exiv2::XmpParser::initialize();
    Exiv2::enableBMFF(true);
    Exiv2::IptcData iptc;
    iptc["Iptc.Application2.Byline"] = "Ada Photographer";
    iptc["Iptc.Application2.Copyright"] = "(c) 2026 Ada";
    iptc["Iptc.Application2.City"] = "Paris";
    iptc["Iptc.Application2.Headline"] = "Spring";
    const Exiv2::DataBuf encoded = Exiv2::IptcParser::encode(iptc);
    Raster::ImageMetadata onlyIptc;
    const auto* p = reinterpret_cast<const std::byte*>(encoded.pData_);
    onlyIptc.iptc.assign(p, p + encoded.size_);
    Raster::ImageMetadata both = onlyIptc;
    Exiv2::XmpData xmp;
    xmp["Xmp.photoshop.Headline"] = "Spring in Paris";
    xmp["Xmp.xmp.Rating"] = "4";
    ASSERT_EQ(Exiv2::XmpParser::encode(both.xmp, xmp), 0);

    // 128 × 96: libexiv2 0.27 finds no metadata in a HEIC cropped from a larger coded picture (sides under
    // 64).
    for (const IO::FileType type : {IO::FileType::WebP, IO::FileType::AVIF, IO::FileType::HEIC}) {
        for (const bool withXmp : {false, true}) {
            SCOPED_TRACE(std::string(IO::GetFileTypeName(type)) + (withXmp ? " with XMP" : ""));
            IO::WriteOptions options;
            options.metadata = withXmp ? both : onlyIptc;
            const IO::EncodeResult written =
                IO::EncodeImage(*Ramps(PixelFormat::RGBA8, 128, 96), type, "m", options);
            ASSERT_TRUE(written) << written.error;
            const IO::ReadResult read = IO::DecodeImage(written.bytes, "m");
            ASSERT_TRUE(read) << read.error;
            EXPECT_EQ(XmpText(read.metadata.xmp, "Xmp.dc.creator"), "Ada Photographer");
            EXPECT_EQ(XmpText(read.metadata.xmp, "Xmp.dc.rights"), "lang=\"x-default\" (c) 2026 Ada");
            EXPECT_EQ(XmpText(read.metadata.xmp, "Xmp.photoshop.City"), "Paris");
            EXPECT_EQ(XmpText(read.metadata.xmp, "Xmp.photoshop.Headline"),
                      withXmp ? "Spring in Paris" : "Spring");
            EXPECT_EQ(XmpText(read.metadata.xmp, "Xmp.xmp.Rating"), withXmp ? "4" : "(none)");

            auto file = Exiv2::ImageFactory::open(reinterpret_cast<const Exiv2::byte*>(written.bytes.data()),
                                                  long(written.bytes.size()));
            ASSERT_TRUE(file.get());
            file->readMetadata();
            const auto creator = file->xmpData().findKey(Exiv2::XmpKey("Xmp.dc.creator"));
            ASSERT_NE(creator, file->xmpData().end());
            EXPECT_EQ(creator->toString(), "Ada Photographer");
            const auto rights = file->xmpData().findKey(Exiv2::XmpKey("Xmp.dc.rights"));
            ASSERT_NE(rights, file->xmpData().end());
            EXPECT_EQ(rights->toString(), "lang=\"x-default\" (c) 2026 Ada");
        }
    }
    // Where IPTC has its own block it is written there, and the XMP is left as it was.
    IO::WriteOptions options;
    options.metadata = both;
    const IO::EncodeResult jpeg =
        IO::EncodeImage(*Ramps(PixelFormat::RGBA8, 16, 12), IO::FileType::JPEG, "m", options);
    ASSERT_TRUE(jpeg) << jpeg.error;
    const IO::ReadResult read = IO::DecodeImage(jpeg.bytes, "m");
    ASSERT_TRUE(read) << read.error;
    EXPECT_EQ(IptcText(read.metadata.iptc, "Iptc.Application2.Byline"), "Ada Photographer");
    EXPECT_EQ(XmpText(read.metadata.xmp, "Xmp.dc.creator"), "(none)");
}

TEST(Metadata, OpenExrHoldsNoneAndIsStillWritten) {
    IO::WriteOptions options;
    options.metadata = CameraMetadata(1);
    const auto image = Noise(PixelFormat::RGBAUF, 5, 4, 1);
    const IO::EncodeResult encoded = IO::EncodeImage(*image, IO::FileType::EXR, "m.exr", options);
    ASSERT_TRUE(encoded) << encoded.error;
    const IO::ReadResult read = IO::DecodeImage(encoded.bytes, "m.exr");
    ASSERT_TRUE(read) << read.error;
    EXPECT_EQ(Difference(*image, *read.image), "");
    EXPECT_TRUE(read.metadata.IsEmpty());
}

namespace {

// Where the stored pixel (x, y) of a w × h image appears once shown as orientation o asks, from the tag's
// definition: which side of the picture the stored first row and first column belong to.
std::pair<int, int> Shown(int o, int x, int y, int w, int h) {
    switch (o) {
    case 2: // row 0 top, column 0 right
        return {w - 1 - x, y};
    case 3: // bottom, right
        return {w - 1 - x, h - 1 - y};
    case 4: // bottom, left
        return {x, h - 1 - y};
    case 5: // row 0 left, column 0 top
        return {y, x};
    case 6: // right, top
        return {h - 1 - y, x};
    case 7: // right, bottom
        return {h - 1 - y, w - 1 - x};
    case 8: // left, bottom
        return {y, w - 1 - x};
    default:
        return {x, y};
    }
}

} // namespace

TEST(Orientation, IsKeptByDefaultAndAppliedOnRequest) {
    const int w = 5, h = 3;
    const auto image = Noise(PixelFormat::RGBA8, w, h, 17);
    for (int o = 1; o <= 8; ++o) {
        SCOPED_TRACE("orientation " + std::to_string(o));
        IO::WriteOptions options;
        options.metadata = CameraMetadata(o);
        const IO::EncodeResult encoded = IO::EncodeImage(*image, IO::FileType::PNG, "o.png", options);
        ASSERT_TRUE(encoded) << encoded.error;

        const IO::ReadResult kept = IO::DecodeImage(encoded.bytes, "o.png");
        ASSERT_TRUE(kept) << kept.error;
        EXPECT_EQ(Difference(*image, *kept.image), "");
        EXPECT_EQ(Text(DecodeExif(kept.metadata.exif), "Exif.Image.Orientation"), std::to_string(o));

        const IO::ReadResult turned = IO::DecodeImage(encoded.bytes, "o.png", {}, {.autoOrient = true});
        ASSERT_TRUE(turned) << turned.error;
        const bool swap = o >= 5;
        ASSERT_EQ(turned.image->GetWidth(), swap ? h : w);
        ASSERT_EQ(turned.image->GetHeight(), swap ? w : h);
        for (int y = 0; y < h; ++y)
            for (int x = 0; x < w; ++x) {
                const auto [sx, sy] = Shown(o, x, y, w, h);
                ASSERT_EQ(std::memcmp(turned.image->RowBytes(sy) + sx * 4, image->RowBytes(y) + x * 4, 4), 0)
                    << "stored " << x << "," << y << " expected at " << sx << "," << sy;
            }
        const Exiv2::ExifData exif = DecodeExif(turned.metadata.exif);
        EXPECT_EQ(Text(exif, "Exif.Image.Orientation"), "1");
        EXPECT_EQ(Text(exif, "Exif.Image.Make"), "Testmaker"); // the rest is untouched

        // Written again, the upright picture carries the reset tag, as libexiv2 reads it.
        IO::WriteOptions again;
        again.metadata = turned.metadata;
        const IO::EncodeResult rewritten = IO::EncodeImage(*turned.image, IO::FileType::JPEG, "o.jpg", again);
        ASSERT_TRUE(rewritten) << rewritten.error;
        auto file = Exiv2::ImageFactory::open(reinterpret_cast<const Exiv2::byte*>(rewritten.bytes.data()),
                                              long(rewritten.bytes.size()));
        file->readMetadata();
        EXPECT_EQ(Text(file->exifData(), "Exif.Image.Orientation"), "1");
    }
}
