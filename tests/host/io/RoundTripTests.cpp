// Write-then-read round trips through each file type, and agreement with an independent decode of a photo.

#include "tests/host/io/TestImages.h"

#include <gtest/gtest.h>

#include <png.h>
#include <tiffio.h>

using namespace IOTest;
using Raster::PixelFormat;

namespace {

const PixelFormat LayerFormats[] = {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF,
                                    PixelFormat::IA8,   PixelFormat::IA16,   PixelFormat::CMYKA8,
                                    PixelFormat::LabA16};

TEST(TiffRoundTrip, EveryLayerFormatIsBitExact) {
    ScratchFolder folder;
    // Odd sizes leave row padding and partial strips; the tall one spans several strips of the writer.
    const std::pair<int, int> sizes[] = {{1, 1}, {37, 23}, {300, 130}};
    std::uint32_t seed = 1;
    for (PixelFormat format : LayerFormats) {
        for (auto [width, height] : sizes) {
            SCOPED_TRACE(std::string(Raster::GetPixelFormatName(format)) + " " + std::to_string(width) + "x" +
                         std::to_string(height));
            auto original = Noise(format, width, height, seed++);
            const auto path = folder / "round.tif";
            const IO::WriteResult written = IO::WriteImage(path, *original);
            ASSERT_TRUE(written) << written.error;
            const IO::ReadResult read = IO::ReadImage(path);
            ASSERT_TRUE(read) << read.error;
            EXPECT_EQ(read.type, IO::FileType::TIFF);
            EXPECT_EQ(Difference(*original, *read.image), "");
        }
    }
}

TEST(TiffRoundTrip, MemoryAndFilePathsGiveTheSameBytes) {
    ScratchFolder folder;
    auto original = Noise(PixelFormat::LabA16, 19, 11, 99);
    const IO::EncodeResult encoded = IO::EncodeImage(*original, IO::FileType::TIFF, "lab.tif");
    ASSERT_TRUE(encoded) << encoded.error;
    ASSERT_TRUE(IO::WriteImage(folder / "lab.tiff", *original));
    EXPECT_EQ(ReadBytes(folder / "lab.tiff"), encoded.bytes);
    const IO::ReadResult decoded = IO::DecodeImage(encoded.bytes, "lab.tif");
    ASSERT_TRUE(decoded) << decoded.error;
    EXPECT_EQ(Difference(*original, *decoded.image), "");
}

TEST(TiffRoundTrip, LabIsStoredAsSignedCIELab) {
    // L 32768 (about L* 50), a* = 0 (32768), b* = +10 (32768 + 10 × 256), partly transparent so that the
    // alpha sample is stored.
    auto lab = Raster::DynamicBuffer::Create(1, 1, PixelFormat::LabA16);
    const std::uint16_t pixel[4] = {32768, 32768, 32768 + 256 * 10, 40000}; // b* = +10
    std::memcpy(lab->RowBytes(0), pixel, sizeof pixel);
    const IO::EncodeResult encoded = IO::EncodeImage(*lab, IO::FileType::TIFF, "lab.tif");
    ASSERT_TRUE(encoded) << encoded.error;
    // libtiff's raw strip, read on its own, must hold a* and b* as signed 16-bit values in 1/256 units.
    ScratchFolder folder;
    WriteBytes(folder / "lab.tif", encoded.bytes);
    TIFF* tif = TIFFOpen((folder / "lab.tif").c_str(), "r");
    ASSERT_NE(tif, nullptr);
    std::uint16_t photometric = 0;
    TIFFGetField(tif, TIFFTAG_PHOTOMETRIC, &photometric);
    EXPECT_EQ(photometric, PHOTOMETRIC_CIELAB);
    std::int16_t samples[4] = {};
    ASSERT_EQ(TIFFReadEncodedStrip(tif, 0, samples, sizeof samples), tmsize_t(sizeof samples));
    TIFFClose(tif);
    EXPECT_EQ(std::uint16_t(samples[0]), 32768);
    EXPECT_EQ(samples[1], 0);
    EXPECT_EQ(samples[2], 2560);
    EXPECT_EQ(std::uint16_t(samples[3]), 40000);
}

TEST(PngRoundTrip, EightAndSixteenBitGreyAndColourAreBitExact) {
    ScratchFolder folder;
    std::uint32_t seed = 10;
    for (PixelFormat format :
         {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::IA8, PixelFormat::IA16}) {
        SCOPED_TRACE(Raster::GetPixelFormatName(format));
        auto original = Noise(format, 45, 17, seed++);
        ASSERT_TRUE(IO::WriteImage(folder / "round.png", *original));
        const IO::ReadResult read = IO::ReadImage(folder / "round.png");
        ASSERT_TRUE(read) << read.error;
        EXPECT_EQ(read.type, IO::FileType::PNG);
        EXPECT_EQ(Difference(*original, *read.image), "");
    }
}

TEST(JpegRoundTrip, ColourAndGreyStayWithinTheQuantisationError) {
    ScratchFolder folder;
    for (PixelFormat format : {PixelFormat::RGBA8, PixelFormat::IA8}) {
        SCOPED_TRACE(Raster::GetPixelFormatName(format));
        auto original = Ramps(format, 64, 48);
        for (int quality : {92, 100}) {
            ASSERT_TRUE(IO::WriteImage(folder / "round.jpg", *original, {.quality = quality}));
            const IO::ReadResult read = IO::ReadImage(folder / "round.jpg");
            ASSERT_TRUE(read) << read.error;
            EXPECT_EQ(read.type, IO::FileType::JPEG);
            ASSERT_EQ(read.image->GetFormat(), format);
            // Colour conversion and the quantiser each round; beyond these bounds something else went wrong.
            EXPECT_LE(MaxDifference8(*original, *read.image), quality == 100 ? 5 : 10)
                << "quality " << quality;
        }
    }
}

TEST(JpegRoundTrip, AlphaIsDroppedAndReadsOpaque) {
    ScratchFolder folder;
    auto original = Ramps(PixelFormat::RGBA8, 16, 16);
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 16; ++x)
            original->Row<std::uint8_t>(y)[x * 4 + 3] = std::uint8_t(x * 16);
    ASSERT_TRUE(IO::WriteImage(folder / "alpha.jpeg", *original));
    const IO::ReadResult read = IO::ReadImage(folder / "alpha.jpeg");
    ASSERT_TRUE(read) << read.error;
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 16; ++x)
            ASSERT_EQ(Component<std::uint8_t>(*read.image, x, y, 3), 255);
}

TEST(SamplePhoto, AgreesWithLibpngsOwnDecodeAndSurvivesPngAndTiff) {
    const auto path = DataFolder() / "chelsea.png";
    const IO::ReadResult read = IO::ReadImage(path);
    ASSERT_TRUE(read) << read.error;
    const Raster::DynamicBuffer& image = *read.image;
    ASSERT_EQ(image.GetFormat(), PixelFormat::RGBA8);
    ASSERT_EQ(image.GetWidth(), 451);
    ASSERT_EQ(image.GetHeight(), 300);

    // libpng's simplified reader as a second, independent decoder.
    png_image reference{};
    reference.version = PNG_IMAGE_VERSION;
    ASSERT_TRUE(png_image_begin_read_from_file(&reference, path.c_str()));
    reference.format = PNG_FORMAT_RGBA;
    std::vector<std::uint8_t> pixels(PNG_IMAGE_SIZE(reference));
    ASSERT_TRUE(png_image_finish_read(&reference, nullptr, pixels.data(), 0, nullptr));
    for (int y = 0; y < 300; ++y)
        ASSERT_EQ(std::memcmp(image.RowBytes(y), pixels.data() + std::size_t(y) * 451 * 4, 451 * 4), 0)
            << "row " << y;

    ScratchFolder folder;
    for (const char* name : {"cat.png", "cat.tif"}) {
        ASSERT_TRUE(IO::WriteImage(folder / name, image));
        const IO::ReadResult again = IO::ReadImage(folder / name);
        ASSERT_TRUE(again) << again.error;
        EXPECT_EQ(Difference(image, *again.image), "") << name;
    }
}

} // namespace
