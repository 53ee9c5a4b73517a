// WebP, AVIF, HEIC and OpenEXR; what the written files hold (no alpha channel added to opaque pictures, grey
// kept grey, CMYK JPEG); quality and compression choices; damaged and oversized files of the new types.

#include "tests/host/io/TestImages.h"

#include <gtest/gtest.h>

#include <png.h>
#include <tiffio.h>

using namespace IOTest;
using Raster::PixelFormat;

namespace {

bool Contains(const std::string& text, const std::string& part) {
    return text.find(part) != std::string::npos;
}

IO::ReadResult RoundTrip(const Raster::DynamicBuffer& image, IO::FileType type,
                         const IO::WriteOptions& options = {}) {
    const IO::EncodeResult encoded = IO::EncodeImage(image, type, "round", options);
    EXPECT_TRUE(encoded) << encoded.error;
    IO::ReadResult read = IO::DecodeImage(encoded.bytes, "round");
    EXPECT_TRUE(read) << read.error;
    EXPECT_EQ(read.type, type);
    return read;
}

// Whole-file samples per pixel as libpng and libtiff report them.
int PngChannels(const std::vector<std::byte>& bytes) {
    png_image image{};
    image.version = PNG_IMAGE_VERSION;
    EXPECT_TRUE(png_image_begin_read_from_memory(&image, bytes.data(), bytes.size()));
    const int channels = int(PNG_IMAGE_SAMPLE_CHANNELS(image.format));
    png_image_free(&image);
    return channels;
}

int TiffSamples(const std::vector<std::byte>& bytes) {
    ScratchFolder folder;
    WriteBytes(folder / "s.tif", bytes);
    TIFF* tif = TIFFOpen((folder / "s.tif").c_str(), "r");
    EXPECT_NE(tif, nullptr);
    std::uint16_t samples = 0;
    TIFFGetField(tif, TIFFTAG_SAMPLESPERPIXEL, &samples);
    TIFFClose(tif);
    return samples;
}

} // namespace

TEST(NewFormats, LosslessPathsAreBitExact) {
    // OpenEXR keeps every float as it is: negatives, above 1, signed zero, infinities, subnormals.
    for (auto [w, h] : {std::pair(1, 1), std::pair(37, 23), std::pair(130, 70)}) {
        const auto floats = Noise(PixelFormat::RGBAUF, w, h, std::uint32_t(w));
        const IO::ReadResult exr = RoundTrip(*floats, IO::FileType::EXR);
        ASSERT_TRUE(exr);
        EXPECT_EQ(Difference(*floats, *exr.image), "");
        // WebP at quality 100 is its lossless coder, alpha included.
        const auto rgba = Noise(PixelFormat::RGBA8, w, h, std::uint32_t(h));
        const IO::ReadResult webp = RoundTrip(*rgba, IO::FileType::WebP, {.quality = 100});
        ASSERT_TRUE(webp);
        EXPECT_EQ(Difference(*rgba, *webp.image), "");
    }
}

TEST(NewFormats, LossyCodersStayWithinTheirError) {
    const auto colour = Ramps(PixelFormat::RGBA8, 64, 48);
    const auto grey = Ramps(PixelFormat::IA8, 63, 47); // odd sides: chroma planes and coding blocks overhang
    for (IO::FileType type : {IO::FileType::WebP, IO::FileType::AVIF, IO::FileType::HEIC}) {
        SCOPED_TRACE(std::string(IO::GetFileTypeName(type)));
        const IO::ReadResult read = RoundTrip(*colour, type, {.quality = 95});
        ASSERT_TRUE(read);
        ASSERT_EQ(read.image->GetFormat(), PixelFormat::RGBA8);
        // Chroma at half resolution (4:2:0) costs more than the quantiser on these ramps.
        EXPECT_LE(MaxDifference8(*colour, *read.image), 20);
        if (type == IO::FileType::WebP) continue; // WebP has no grey; it is written as colour
        const IO::ReadResult greyRead = RoundTrip(*grey, type, {.quality = 95});
        ASSERT_TRUE(greyRead);
        ASSERT_EQ(greyRead.image->GetFormat(), PixelFormat::IA8);
        EXPECT_LE(MaxDifference8(*grey, *greyRead.image), 12);
    }
    // Quality matters: a low one makes a smaller file.
    for (IO::FileType type : {IO::FileType::JPEG, IO::FileType::WebP, IO::FileType::AVIF}) {
        const auto small = IO::EncodeImage(*colour, type, "q", {.quality = 10});
        const auto large = IO::EncodeImage(*colour, type, "q", {.quality = 95});
        ASSERT_TRUE(small && large);
        EXPECT_LT(small.bytes.size(), large.bytes.size()) << IO::GetFileTypeName(type);
    }
}

TEST(NewFormats, TranslucentPixelsKeepTheirAlpha) {
    auto image = Ramps(PixelFormat::RGBA8, 32, 32);
    for (int y = 0; y < 32; ++y)
        for (int x = 0; x < 32; ++x)
            image->Row<std::uint8_t>(y)[x * 4 + 3] = std::uint8_t(x * 8);
    for (IO::FileType type : {IO::FileType::AVIF, IO::FileType::HEIC, IO::FileType::WebP}) {
        SCOPED_TRACE(std::string(IO::GetFileTypeName(type)));
        const IO::ReadResult read = RoundTrip(*image, type, {.quality = 100});
        ASSERT_TRUE(read);
        int worst = 0;
        for (int y = 0; y < 32; ++y)
            for (int x = 0; x < 32; ++x)
                worst = std::max(worst, std::abs(int(Component<std::uint8_t>(*read.image, x, y, 3)) - x * 8));
        EXPECT_LE(worst, 4);
    }
}

TEST(WrittenLayout, OpaquePicturesGetNoAlphaChannelAndGreyStaysGrey) {
    const auto opaque = Noise(PixelFormat::RGBA8, 9, 7, 4);
    for (int y = 0; y < 7; ++y)
        for (int x = 0; x < 9; ++x)
            opaque->Row<std::uint8_t>(y)[x * 4 + 3] = 255;
    const auto greyOpaque = Noise(PixelFormat::IA16, 9, 7, 5);
    for (int y = 0; y < 7; ++y)
        for (int x = 0; x < 9; ++x)
            greyOpaque->Row<std::uint16_t>(y)[x * 2 + 1] = 65535;
    const auto translucent = Noise(PixelFormat::RGBA8, 9, 7, 6);
    translucent->Row<std::uint8_t>(3)[4 * 4 + 3] = 7; // at least one pixel that is not opaque

    const auto png = IO::EncodeImage(*opaque, IO::FileType::PNG, "o.png");
    EXPECT_EQ(PngChannels(png.bytes), 3);
    EXPECT_EQ(PngChannels(IO::EncodeImage(*greyOpaque, IO::FileType::PNG, "g.png").bytes), 1);
    EXPECT_EQ(PngChannels(IO::EncodeImage(*translucent, IO::FileType::PNG, "t.png").bytes), 4);
    EXPECT_EQ(TiffSamples(IO::EncodeImage(*opaque, IO::FileType::TIFF, "o.tif").bytes), 3);
    EXPECT_EQ(TiffSamples(IO::EncodeImage(*greyOpaque, IO::FileType::TIFF, "g.tif").bytes), 1);
    EXPECT_EQ(TiffSamples(IO::EncodeImage(*translucent, IO::FileType::TIFF, "t.tif").bytes), 4);
    // Without the channel, the pixels still come back exactly, opaque.
    for (IO::FileType type : {IO::FileType::PNG, IO::FileType::TIFF}) {
        EXPECT_EQ(Difference(*opaque, *RoundTrip(*opaque, type).image), "");
        EXPECT_EQ(Difference(*greyOpaque, *RoundTrip(*greyOpaque, type).image), "");
    }
    for (PixelFormat format : {PixelFormat::RGBAUF, PixelFormat::CMYKA8, PixelFormat::LabA16}) {
        auto image = Noise(format, 6, 5, 8);
        const int bytes = Raster::GetBytesPerComponent(format);
        const int alpha = Raster::GetBytesPerPixel(format) - bytes;
        for (int y = 0; y < 5; ++y)
            for (int x = 0; x < 6; ++x) {
                std::byte* p = image->RowBytes(y) + x * Raster::GetBytesPerPixel(format) + alpha;
                if (bytes == 4) {
                    const float one = 1.0f;
                    std::memcpy(p, &one, 4);
                } else {
                    std::memset(p, 0xFF, std::size_t(bytes));
                }
            }
        const auto tiff = IO::EncodeImage(*image, IO::FileType::TIFF, "f.tif");
        EXPECT_EQ(TiffSamples(tiff.bytes), format == PixelFormat::CMYKA8 ? 4 : 3)
            << Raster::GetPixelFormatName(format);
        EXPECT_EQ(Difference(*image, *IO::DecodeImage(tiff.bytes, "f.tif").image), "");
    }
}

TEST(WrittenLayout, CmykPixelsMakeACmykJpeg) {
    auto cmyk = Raster::DynamicBuffer::Create(32, 24, PixelFormat::CMYKA8);
    for (int y = 0; y < 24; ++y)
        for (int x = 0; x < 32; ++x) {
            std::uint8_t* p = cmyk->Row<std::uint8_t>(y) + x * 5;
            p[0] = std::uint8_t(x * 8);
            p[1] = std::uint8_t(y * 10);
            p[2] = std::uint8_t(255 - x * 8);
            p[3] = std::uint8_t((x + y) * 4);
            p[4] = 255;
        }
    ASSERT_TRUE(IO::CanWrite(IO::FileType::JPEG, PixelFormat::CMYKA8));
    const IO::ReadResult read = RoundTrip(*cmyk, IO::FileType::JPEG, {.quality = 100});
    ASSERT_TRUE(read);
    ASSERT_EQ(read.image->GetFormat(), PixelFormat::CMYKA8);
    EXPECT_LE(MaxDifference8(*cmyk, *read.image), 4);
}

TEST(WriteOptions, CompressionChoicesAreHonouredAndUnknownOnesListTheValidOnes) {
    const auto image = Ramps(PixelFormat::RGBA8, 96, 64);
    std::size_t none = 0, best = 0;
    for (std::string_view name : IO::GetCompressionNames(IO::FileType::PNG)) {
        const IO::ReadResult read = RoundTrip(*image, IO::FileType::PNG, {.compression = std::string(name)});
        ASSERT_TRUE(read) << name;
        EXPECT_EQ(Difference(*image, *read.image), "") << name;
        const std::size_t size =
            IO::EncodeImage(*image, IO::FileType::PNG, "c", {.compression = std::string(name)}).bytes.size();
        if (name == "none") none = size;
        if (name == "best") best = size;
    }
    EXPECT_GT(none, 96u * 64u * 3u); // stored: at least every sample
    EXPECT_LT(best, none / 2);
    const auto noise = Noise(PixelFormat::RGBA16, 33, 21, 3);
    for (std::string_view name : IO::GetCompressionNames(IO::FileType::TIFF)) {
        const IO::ReadResult read = RoundTrip(*noise, IO::FileType::TIFF, {.compression = std::string(name)});
        ASSERT_TRUE(read) << name;
        EXPECT_EQ(Difference(*noise, *read.image), "") << name;
    }
    const auto zip = IO::EncodeImage(*image, IO::FileType::PNG, "x.png", {.compression = "zip"});
    EXPECT_FALSE(zip);
    EXPECT_EQ(zip.error,
              "x.png: PNG compression \"zip\" is unknown; choose one of none, fast, default, best");
    const auto tiff = IO::EncodeImage(*image, IO::FileType::TIFF, "x.tif", {.compression = "jpeg"});
    EXPECT_TRUE(Contains(tiff.error, "none, deflate, lzw, packbits, zstd")) << tiff.error;
    const auto jpeg = IO::EncodeImage(*image, IO::FileType::JPEG, "x.jpg", {.compression = "best"});
    EXPECT_EQ(jpeg.error, "x.jpg: JPEG has no compression choices (compression \"best\" given)");
    for (IO::FileType type : {IO::FileType::WebP, IO::FileType::AVIF, IO::FileType::HEIC}) {
        const auto bad = IO::EncodeImage(*image, type, "q", {.quality = 101});
        EXPECT_TRUE(Contains(bad.error, "quality 101 is outside 1..100")) << bad.error;
    }
}

TEST(FileTypes, NamesExtensionsAndSignatures) {
    const std::pair<const char*, IO::FileType> names[] = {
        {"png", IO::FileType::PNG},   {"JPG", IO::FileType::JPEG},  {"jpeg", IO::FileType::JPEG},
        {"tif", IO::FileType::TIFF},  {"TIFF", IO::FileType::TIFF}, {"webp", IO::FileType::WebP},
        {"avif", IO::FileType::AVIF}, {"heic", IO::FileType::HEIC}, {"HEIF", IO::FileType::HEIC},
        {"exr", IO::FileType::EXR}};
    for (auto [name, type] : names) {
        EXPECT_EQ(IO::GetFileTypeForName(name), type) << name;
        EXPECT_EQ(IO::GetFileTypeForExtension(std::string("a/b.") + name), type) << name;
    }
    EXPECT_FALSE(IO::GetFileTypeForName("bmp"));
    EXPECT_FALSE(IO::GetFileTypeForName(""));
    EXPECT_FALSE(IO::GetFileTypeForExtension("webp")); // a bare name has no extension
    // What each encoder writes is recognised as its own type, whatever the name.
    const auto rgba = Ramps(PixelFormat::RGBA8, 8, 8);
    const auto floats = Noise(PixelFormat::RGBAUF, 8, 8, 1);
    for (IO::FileType type :
         {IO::FileType::WebP, IO::FileType::AVIF, IO::FileType::HEIC, IO::FileType::EXR}) {
        const auto encoded = IO::EncodeImage(type == IO::FileType::EXR ? *floats : *rgba, type, "t");
        ASSERT_TRUE(encoded) << encoded.error;
        EXPECT_EQ(IO::DetectFileType(encoded.bytes), type) << IO::GetFileTypeName(type);
    }
}

TEST(HostileInput, NewTypesRefuseEveryTruncationAndOversizedClaims) {
    const auto rgba = Ramps(PixelFormat::RGBA8, 40, 30);
    const auto floats = Noise(PixelFormat::RGBAUF, 40, 30, 2);
    for (IO::FileType type :
         {IO::FileType::WebP, IO::FileType::AVIF, IO::FileType::HEIC, IO::FileType::EXR}) {
        SCOPED_TRACE(std::string(IO::GetFileTypeName(type)));
        const auto encoded =
            IO::EncodeImage(type == IO::FileType::EXR ? *floats : *rgba, type, "t", {.quality = 60});
        ASSERT_TRUE(encoded) << encoded.error;
        const std::size_t n = encoded.bytes.size();
        for (std::size_t length = 0; length < n; length += std::max<std::size_t>(1, n / 97)) {
            const std::vector<std::byte> cut(encoded.bytes.begin(),
                                             encoded.bytes.begin() + std::ptrdiff_t(length));
            const IO::ReadResult read = IO::DecodeImage(cut, "cut");
            EXPECT_FALSE(read.image) << "cut to " << length << " of " << n;
            EXPECT_EQ(read.error.rfind("cut: ", 0), 0u) << read.error;
        }
    }
    // A header that claims 100000 pixels a side is refused before any pixel is allocated.
    auto patch = [](std::vector<std::byte> bytes, std::string_view marker, std::size_t skip,
                    const std::vector<std::uint8_t>& value) {
        const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
        const std::size_t at = text.find(marker);
        EXPECT_NE(at, std::string_view::npos) << marker;
        if (at != std::string_view::npos)
            for (std::size_t i = 0; i < value.size(); ++i)
                bytes[at + marker.size() + skip + i] = std::byte(value[i]);
        return bytes;
    };
    // HEIF's image size box: version and flags, then width and height, big-endian.
    const auto heic = IO::EncodeImage(*rgba, IO::FileType::HEIC, "h");
    const auto hugeHeic = patch(heic.bytes, "ispe", 4, {0, 1, 0x86, 0xA0, 0, 1, 0x86, 0xA0});
    const IO::ReadResult heifRead = IO::DecodeImage(hugeHeic, "huge.heic");
    EXPECT_FALSE(heifRead.image);
    EXPECT_EQ(heifRead.error.rfind("huge.heic: ", 0), 0u) << heifRead.error;
    // OpenEXR's data window: name, type, size, then four little-endian ints; the last corner moves out.
    const auto exr = IO::EncodeImage(*floats, IO::FileType::EXR, "e");
    const auto hugeExr = patch(exr.bytes, std::string_view("dataWindow\0box2i\0", 17), 4 + 8,
                               {0x9F, 0x86, 0x01, 0, 0x9F, 0x86, 0x01, 0});
    const IO::ReadResult exrRead = IO::DecodeImage(hugeExr, "huge.exr");
    EXPECT_FALSE(exrRead.image);
    EXPECT_EQ(exrRead.error.rfind("huge.exr: ", 0), 0u) << exrRead.error;
    // An attribute of a kind OpenEXR does not know, claiming 1.75 GiB in a file of a few hundred bytes:
    // OpenEXR would allocate all of it before finding the file short. Refused before.
    std::vector<std::byte> claims = exr.bytes;
    const std::string_view text(reinterpret_cast<const char*>(claims.data()), claims.size());
    const std::size_t at = text.find(std::string_view("compression\0compression\0", 24));
    ASSERT_NE(at, std::string_view::npos);
    claims[at] = claims[at + 12] = std::byte('X');
    claims[at + 24 + 3] = std::byte(0x70);
    const IO::ReadResult claimsRead = IO::DecodeImage(claims, "claims.exr");
    EXPECT_FALSE(claimsRead.image);
    EXPECT_EQ(claimsRead.error,
              "claims.exr: truncated or damaged OpenEXR data (attribute \"Xompression\" claims "
              "more bytes than the file holds)");
}
