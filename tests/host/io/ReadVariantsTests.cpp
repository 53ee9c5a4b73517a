// Files in layouts the host's own writer never produces, written directly with libpng, libjpeg and libtiff;
// expected pixels are worked out by hand from each format's definition.

#include "tests/host/io/TestImages.h"

#include <gtest/gtest.h>

#include <png.h>
#include <tiffio.h>

#include <random>

using namespace IOTest;
using Raster::PixelFormat;

namespace {

IO::ReadResult Decode(const std::vector<std::byte>& bytes, std::optional<PixelFormat> requested = {}) {
    IO::ReadResult result = IO::DecodeImage(bytes, "test", requested);
    EXPECT_TRUE(result) << result.error;
    return result;
}

template <class T>
std::vector<T> PixelOf(const Raster::DynamicBuffer& image, int x, int y) {
    std::vector<T> values;
    for (int c = 0; c < Raster::GetChannelCount(image.GetFormat()); ++c)
        values.push_back(Component<T>(image, x, y, c));
    return values;
}
using V8 = std::vector<std::uint8_t>;
using V16 = std::vector<std::uint16_t>;
using VF = std::vector<float>;

// ------------------------------------------------------------------------------------------------------------
// PNG

TEST(PngVariants, GreyAndColourWithoutAlphaReadOpaque) {
    PngSpec grey{.width = 4,
                 .height = 1,
                 .bitDepth = 8,
                 .colorType = PNG_COLOR_TYPE_GRAY,
                 .rows = {{0, 100, 200, 255}}};
    auto image = Decode(WritePngDirectly(grey)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::IA8);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 1, 0), (V8{100, 255}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 3, 0), (V8{255, 255}));

    // 16-bit samples are big-endian in the file: 0x12 0x34 is 4660.
    PngSpec grey16{
        .width = 1, .height = 1, .bitDepth = 16, .colorType = PNG_COLOR_TYPE_GRAY, .rows = {{0x12, 0x34}}};
    image = Decode(WritePngDirectly(grey16)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::IA16);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{0x1234, 65535}));

    PngSpec rgb{.width = 2,
                .height = 1,
                .bitDepth = 8,
                .colorType = PNG_COLOR_TYPE_RGB,
                .rows = {{1, 2, 3, 250, 251, 252}}};
    image = Decode(WritePngDirectly(rgb)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::RGBA8);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 1, 0), (V8{250, 251, 252, 255}));

    PngSpec rgb16{.width = 1,
                  .height = 1,
                  .bitDepth = 16,
                  .colorType = PNG_COLOR_TYPE_RGB,
                  .rows = {{0x00, 0x01, 0xAB, 0xCD, 0xFF, 0x00}}};
    image = Decode(WritePngDirectly(rgb16)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::RGBA16);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{0x0001, 0xABCD, 0xFF00, 0xFFFF}));
}

TEST(PngVariants, GreyAlphaAndRgbaKeepTheirAlpha) {
    PngSpec ga{.width = 2,
               .height = 1,
               .bitDepth = 8,
               .colorType = PNG_COLOR_TYPE_GRAY_ALPHA,
               .rows = {{9, 0, 77, 128}}};
    auto image = Decode(WritePngDirectly(ga)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::IA8);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 0, 0), (V8{9, 0}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 1, 0), (V8{77, 128}));

    PngSpec rgba16{.width = 1,
                   .height = 1,
                   .bitDepth = 16,
                   .colorType = PNG_COLOR_TYPE_RGB_ALPHA,
                   .rows = {{0x80, 0x00, 0x00, 0x80, 0x12, 0x34, 0x00, 0x07}}};
    image = Decode(WritePngDirectly(rgba16)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{0x8000, 0x0080, 0x1234, 0x0007}));
}

TEST(PngVariants, PalettesAndLowBitDepthsExpandToEightBits) {
    PngSpec palette{
        .width = 3, .height = 1, .bitDepth = 8, .colorType = PNG_COLOR_TYPE_PALETTE, .rows = {{0, 1, 2}}};
    palette.palette = {255, 0, 0, 0, 0, 255, 10, 20, 30};
    palette.transparency = {128}; // only the first entry is translucent; the others are opaque
    auto image = Decode(WritePngDirectly(palette)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::RGBA8);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 0, 0), (V8{255, 0, 0, 128}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 1, 0), (V8{0, 0, 255, 255}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 2, 0), (V8{10, 20, 30, 255}));

    // Low depths scale to 8 bits by replicating bits: 1 bit -> 0 or 255, 2 bits -> v × 85, 4 bits -> v × 17.
    PngSpec one{
        .width = 4, .height = 1, .bitDepth = 1, .colorType = PNG_COLOR_TYPE_GRAY, .rows = {{0b1011'0000}}};
    image = Decode(WritePngDirectly(one)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::IA8);
    for (int x = 0; x < 4; ++x)
        EXPECT_EQ(Component<std::uint8_t>(*image, x, 0, 0), x == 1 ? 0 : 255) << x;
    PngSpec two{
        .width = 4, .height = 1, .bitDepth = 2, .colorType = PNG_COLOR_TYPE_GRAY, .rows = {{0b00'01'10'11}}};
    image = Decode(WritePngDirectly(two)).image;
    ASSERT_TRUE(image);
    for (int x = 0; x < 4; ++x)
        EXPECT_EQ(Component<std::uint8_t>(*image, x, 0, 0), x * 85) << x;
    PngSpec four{.width = 2, .height = 1, .bitDepth = 4, .colorType = PNG_COLOR_TYPE_GRAY, .rows = {{0x3F}}};
    image = Decode(WritePngDirectly(four)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 0, 0), (V8{51, 255}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 1, 0), (V8{255, 255}));
}

TEST(PngVariants, InterlacedFilesGiveTheSamePixels) {
    std::mt19937 random(5);
    PngSpec spec{.width = 11, .height = 9, .bitDepth = 8, .colorType = PNG_COLOR_TYPE_RGB_ALPHA};
    for (int y = 0; y < spec.height; ++y) {
        spec.rows.emplace_back(std::size_t(spec.width) * 4);
        for (auto& v : spec.rows.back())
            v = std::uint8_t(random());
    }
    auto plain = Decode(WritePngDirectly(spec)).image;
    spec.interlaced = true;
    auto interlaced = Decode(WritePngDirectly(spec)).image;
    ASSERT_TRUE(plain && interlaced);
    EXPECT_EQ(Difference(*plain, *interlaced), "");
    EXPECT_EQ(std::memcmp(plain->RowBytes(8), spec.rows[8].data(), 44), 0);
}

TEST(PngVariants, RequestedFormatIsTakenOnlyWhereLibpngWidensExactly) {
    PngSpec grey{
        .width = 2, .height = 1, .bitDepth = 8, .colorType = PNG_COLOR_TYPE_GRAY, .rows = {{0x12, 0xFF}}};
    const auto bytes = WritePngDirectly(grey);
    auto image = Decode(bytes, PixelFormat::RGBA16).image;
    ASSERT_TRUE(image);
    ASSERT_EQ(image->GetFormat(), PixelFormat::RGBA16);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{0x1212, 0x1212, 0x1212, 0xFFFF}));
    image = Decode(bytes, PixelFormat::IA16).image;
    ASSERT_EQ(image->GetFormat(), PixelFormat::IA16);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 1, 0), (V16{0xFFFF, 0xFFFF}));
    image = Decode(bytes, PixelFormat::RGBA8).image;
    ASSERT_EQ(image->GetFormat(), PixelFormat::RGBA8);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 0, 0), (V8{0x12, 0x12, 0x12, 0xFF}));
    // Nothing lossless leads to these: the natural format comes back.
    EXPECT_EQ(Decode(bytes, PixelFormat::CMYKA8).image->GetFormat(), PixelFormat::IA8);
    PngSpec rgb{.width = 1, .height = 1, .bitDepth = 8, .colorType = PNG_COLOR_TYPE_RGB, .rows = {{1, 2, 3}}};
    EXPECT_EQ(Decode(WritePngDirectly(rgb), PixelFormat::IA8).image->GetFormat(), PixelFormat::RGBA8);
}

// ------------------------------------------------------------------------------------------------------------
// JPEG

// Four flat 8 × 8 blocks: flat blocks survive quality 100 within a unit.
std::vector<std::uint8_t> FlatBlocks(int components, const std::vector<std::vector<std::uint8_t>>& colours) {
    std::vector<std::uint8_t> samples(16 * 16 * std::size_t(components));
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 16; ++x)
            for (int c = 0; c < components; ++c)
                samples[(std::size_t(y) * 16 + std::size_t(x)) * std::size_t(components) + std::size_t(c)] =
                    colours[std::size_t((y / 8) * 2 + x / 8)][std::size_t(c)];
    return samples;
}

TEST(JpegVariants, CmykUndoesAdobeInversionOnlyWhenTheMarkerIsThere) {
    const std::vector<std::vector<std::uint8_t>> ink = {
        {255, 0, 0, 0}, {0, 128, 0, 30}, {10, 20, 200, 0}, {0, 0, 0, 255}};
    std::vector<std::vector<std::uint8_t>> inverted = ink;
    for (auto& colour : inverted)
        for (auto& v : colour)
            v = std::uint8_t(255 - v);

    const auto adobe = Decode(WriteJpegDirectly(16, 16, 4, FlatBlocks(4, inverted), true)).image;
    const auto plain = Decode(WriteJpegDirectly(16, 16, 4, FlatBlocks(4, ink), false)).image;
    ASSERT_TRUE(adobe && plain);
    for (const auto* image : {adobe.Get(), plain.Get()}) {
        ASSERT_EQ(image->GetFormat(), PixelFormat::CMYKA8);
        for (int block = 0; block < 4; ++block) {
            const int x = (block % 2) * 8 + 3;
            const int y = (block / 2) * 8 + 5;
            for (int c = 0; c < 4; ++c)
                EXPECT_NEAR(Component<std::uint8_t>(*image, x, y, c), ink[std::size_t(block)][std::size_t(c)],
                            1)
                    << "block " << block << " ink " << c << (image == adobe.Get() ? " (Adobe)" : " (plain)");
            EXPECT_EQ(Component<std::uint8_t>(*image, x, y, 4), 255);
        }
    }
}

TEST(JpegVariants, GreyReadsAsIntensityOrReplicatedWhenRgbaIsAsked) {
    const auto bytes = WriteJpegDirectly(16, 16, 1, FlatBlocks(1, {{0}, {90}, {180}, {255}}), false);
    const auto grey = Decode(bytes).image;
    ASSERT_TRUE(grey);
    ASSERT_EQ(grey->GetFormat(), PixelFormat::IA8);
    EXPECT_NEAR(Component<std::uint8_t>(*grey, 12, 2, 0), 90, 1);
    EXPECT_EQ(Component<std::uint8_t>(*grey, 12, 2, 1), 255);
    const auto rgba = Decode(bytes, PixelFormat::RGBA8).image;
    ASSERT_TRUE(rgba);
    ASSERT_EQ(rgba->GetFormat(), PixelFormat::RGBA8);
    const std::uint8_t value = Component<std::uint8_t>(*grey, 4, 12, 0);
    EXPECT_EQ(PixelOf<std::uint8_t>(*rgba, 4, 12), (V8{value, value, value, 255}));
}

// ------------------------------------------------------------------------------------------------------------
// TIFF

void Photometric(tiff* tif, std::uint16_t value) {
    TIFFSetField(tif, TIFFTAG_PHOTOMETRIC, value);
}
void Extra(tiff* tif, std::uint16_t type) {
    const std::uint16_t types[1] = {type};
    TIFFSetField(tif, TIFFTAG_EXTRASAMPLES, 1, types);
}

TEST(TiffVariants, BigEndianPlanarTiledSixteenBitMatchesTheSamples) {
    // 20 × 18 with 16 × 16 tiles: partial tiles on the right and bottom, three planes, byte-swapped data.
    std::mt19937 random(3);
    std::vector<std::uint16_t> values(20 * 18 * 3);
    for (auto& v : values)
        v = std::uint16_t(random());
    TiffSpec spec{.width = 20,
                  .height = 18,
                  .samples = 3,
                  .bits = 16,
                  .bigEndian = true,
                  .planar = true,
                  .tileSize = 16};
    spec.pixels.resize(values.size() * 2);
    std::memcpy(spec.pixels.data(), values.data(), spec.pixels.size());
    spec.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_RGB);
        TIFFSetField(tif, TIFFTAG_COMPRESSION, COMPRESSION_ADOBE_DEFLATE);
    };
    const auto image = Decode(WriteTiffDirectly(spec)).image;
    ASSERT_TRUE(image);
    ASSERT_EQ(image->GetFormat(), PixelFormat::RGBA16);
    for (int y = 0; y < 18; ++y)
        for (int x = 0; x < 20; ++x) {
            const std::size_t i = (std::size_t(y) * 20 + std::size_t(x)) * 3;
            ASSERT_EQ(PixelOf<std::uint16_t>(*image, x, y),
                      (V16{values[i], values[i + 1], values[i + 2], 65535}))
                << x << "," << y;
        }
}

TEST(TiffVariants, AssociatedAlphaIsDividedOut) {
    // 8-bit: colour × 255 / alpha, rounded: 64 × 255 / 128 = 127.5 -> 128, 32 × 255 / 128 = 63.75 -> 64.
    TiffSpec spec{.width = 3, .height = 1, .samples = 4, .bits = 8};
    spec.pixels = Samples<std::uint8_t>({64, 32, 0, 128, 10, 10, 10, 0, 200, 255, 100, 255});
    spec.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_RGB);
        Extra(tif, EXTRASAMPLE_ASSOCALPHA);
    };
    auto image = Decode(WriteTiffDirectly(spec)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 0, 0), (V8{128, 64, 0, 128}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 1, 0), (V8{0, 0, 0, 0}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 2, 0), (V8{200, 255, 100, 255}));

    // 16-bit grey: 16384 × 65535 / 32768 = 32767.5 -> 32768.
    TiffSpec grey{.width = 1, .height = 1, .samples = 2, .bits = 16};
    grey.pixels = Samples<std::uint16_t>({16384, 32768});
    grey.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_MINISBLACK);
        Extra(tif, EXTRASAMPLE_ASSOCALPHA);
    };
    image = Decode(WriteTiffDirectly(grey)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::IA16);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{32768, 32768}));

    // Float: divided as it is, unbounded values included.
    TiffSpec floats{.width = 1, .height = 1, .samples = 4, .bits = 32};
    floats.pixels = Samples<float>({0.25f, 0.5f, -0.125f, 0.5f});
    floats.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_RGB);
        TIFFSetField(tif, TIFFTAG_SAMPLEFORMAT, SAMPLEFORMAT_IEEEFP);
        Extra(tif, EXTRASAMPLE_ASSOCALPHA);
    };
    image = Decode(WriteTiffDirectly(floats)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::RGBAUF);
    EXPECT_EQ(PixelOf<float>(*image, 0, 0), (VF{0.5f, 1.0f, -0.25f, 0.5f}));
}

TEST(TiffVariants, GreyLayouts) {
    TiffSpec white{.width = 3, .height = 1, .samples = 1, .bits = 8};
    white.pixels = Samples<std::uint8_t>({0, 55, 255});
    white.setup = [](tiff* tif) { Photometric(tif, PHOTOMETRIC_MINISWHITE); };
    auto image = Decode(WriteTiffDirectly(white)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::IA8);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 0, 0), (V8{255, 255}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 1, 0), (V8{200, 255}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 2, 0), (V8{0, 255}));

    // An extra sample that is not declared as alpha is ignored.
    TiffSpec unspecified{.width = 1, .height = 1, .samples = 2, .bits = 16};
    unspecified.pixels = Samples<std::uint16_t>({1234, 7});
    unspecified.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_MINISBLACK);
        Extra(tif, EXTRASAMPLE_UNSPECIFIED);
    };
    image = Decode(WriteTiffDirectly(unspecified)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::IA16);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{1234, 65535}));

    TiffSpec floats{.width = 2, .height = 1, .samples = 2, .bits = 32};
    floats.pixels = Samples<float>({0.25f, 0.5f, -3.0f, 1.0f});
    floats.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_MINISBLACK);
        TIFFSetField(tif, TIFFTAG_SAMPLEFORMAT, SAMPLEFORMAT_IEEEFP);
        Extra(tif, EXTRASAMPLE_UNASSALPHA);
    };
    image = Decode(WriteTiffDirectly(floats)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::RGBAUF);
    EXPECT_EQ(PixelOf<float>(*image, 0, 0), (VF{0.25f, 0.25f, 0.25f, 0.5f}));
    EXPECT_EQ(PixelOf<float>(*image, 1, 0), (VF{-3.0f, -3.0f, -3.0f, 1.0f}));
}

TEST(TiffVariants, LabEncodingsMapToLabA16) {
    // 8-bit CIELab: L × 257; signed a, b -> (v + 128) × 256.
    TiffSpec cie8{.width = 2, .height = 1, .samples = 3, .bits = 8};
    cie8.pixels = Samples<std::int8_t>({-1 /* L 255 */, -128, 127, 0, 0, -1});
    cie8.setup = [](tiff* tif) { Photometric(tif, PHOTOMETRIC_CIELAB); };
    auto image = Decode(WriteTiffDirectly(cie8)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(image->GetFormat(), PixelFormat::LabA16);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{65535, 0, 65280, 65535}));
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 1, 0), (V16{0, 32768, 32512, 65535}));

    // 8-bit ICCLab: a, b unsigned with 128 neutral -> v × 256.
    TiffSpec icc8{.width = 1, .height = 1, .samples = 3, .bits = 8};
    icc8.pixels = Samples<std::uint8_t>({128, 128, 0});
    icc8.setup = [](tiff* tif) { Photometric(tif, PHOTOMETRIC_ICCLAB); };
    image = Decode(WriteTiffDirectly(icc8)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{32896, 32768, 0, 65535}));

    // 16-bit ICCLab is LabA16's own scale.
    TiffSpec icc16{.width = 1, .height = 1, .samples = 3, .bits = 16};
    icc16.pixels = Samples<std::uint16_t>({1000, 40000, 20000});
    icc16.setup = [](tiff* tif) { Photometric(tif, PHOTOMETRIC_ICCLAB); };
    image = Decode(WriteTiffDirectly(icc16)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{1000, 40000, 20000, 65535}));

    // 16-bit CIELab with straight alpha: signed a, b in 1/256 units, offset by 32768.
    TiffSpec cie16{.width = 1, .height = 1, .samples = 4, .bits = 16};
    cie16.pixels = Samples<std::int16_t>({std::int16_t(40000 - 65536), -256, 512, 30000});
    cie16.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_CIELAB);
        Extra(tif, EXTRASAMPLE_UNASSALPHA);
    };
    image = Decode(WriteTiffDirectly(cie16)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{40000, 32512, 33280, 30000}));

    // Float CIELab: L × 655.35 (50 -> 32767.5 -> 32768), a × 256 + 32768 (-20.5 -> 27520), clamped at 65535.
    TiffSpec cieFloat{.width = 1, .height = 1, .samples = 3, .bits = 32};
    cieFloat.pixels = Samples<float>({50.0f, -20.5f, 200.0f});
    cieFloat.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_CIELAB);
        TIFFSetField(tif, TIFFTAG_SAMPLEFORMAT, SAMPLEFORMAT_IEEEFP);
    };
    image = Decode(WriteTiffDirectly(cieFloat)).image;
    ASSERT_TRUE(image);
    EXPECT_EQ(PixelOf<std::uint16_t>(*image, 0, 0), (V16{32768, 27520, 65535, 65535}));
}

TEST(TiffVariants, CmykLayouts) {
    // 16-bit CMYK rounds to 8 bits: v / 257 to nearest, 128 -> 0, 129 -> 1, 257 × 200 + 129 -> 201.
    TiffSpec deep{.width = 1, .height = 1, .samples = 5, .bits = 16};
    deep.pixels = Samples<std::uint16_t>({128, 129, 257 * 200 + 129, 65535, 257 * 7});
    deep.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_SEPARATED);
        TIFFSetField(tif, TIFFTAG_INKSET, INKSET_CMYK);
        Extra(tif, EXTRASAMPLE_UNASSALPHA);
    };
    auto image = Decode(WriteTiffDirectly(deep)).image;
    ASSERT_TRUE(image);
    ASSERT_EQ(image->GetFormat(), PixelFormat::CMYKA8);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 0, 0), (V8{0, 1, 201, 255, 7}));

    // 8-bit, planar and tiled, without alpha.
    std::mt19937 random(8);
    TiffSpec planar{.width = 17, .height = 5, .samples = 4, .bits = 8, .planar = true, .tileSize = 16};
    planar.pixels.resize(17 * 5 * 4);
    for (auto& v : planar.pixels)
        v = std::byte(random());
    planar.setup = [](tiff* tif) { Photometric(tif, PHOTOMETRIC_SEPARATED); };
    image = Decode(WriteTiffDirectly(planar)).image;
    ASSERT_TRUE(image);
    for (int y = 0; y < 5; ++y)
        for (int x = 0; x < 17; ++x) {
            const auto* p = reinterpret_cast<const std::uint8_t*>(planar.pixels.data()) + (y * 17 + x) * 4;
            ASSERT_EQ(PixelOf<std::uint8_t>(*image, x, y), (V8{p[0], p[1], p[2], p[3], 255}))
                << x << "," << y;
        }
}

TEST(TiffVariants, PaletteAndBilevelGoThroughLibtiffsRenderer) {
    TiffSpec palette{.width = 2, .height = 1, .samples = 1, .bits = 8};
    palette.pixels = Samples<std::uint8_t>({1, 2});
    palette.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_PALETTE);
        static std::uint16_t red[256], green[256], blue[256];
        red[1] = 65535;
        green[2] = 32896; // 128 × 257
        blue[2] = 257 * 9;
        TIFFSetField(tif, TIFFTAG_COLORMAP, red, green, blue);
    };
    auto image = Decode(WriteTiffDirectly(palette)).image;
    ASSERT_TRUE(image);
    ASSERT_EQ(image->GetFormat(), PixelFormat::RGBA8);
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 0, 0), (V8{255, 0, 0, 255}));
    EXPECT_EQ(PixelOf<std::uint8_t>(*image, 1, 0), (V8{0, 128, 9, 255}));
}

TEST(TiffVariants, OrientationIsAppliedAlikeOnEveryRoute) {
    // Stored 3 × 2, pixel k at row k / 3, column k % 3. Each orientation names where the stored first row and
    // column belong; the upright images below are worked out by hand from those definitions.
    const std::vector<std::vector<std::vector<int>>> upright = {
        {{0, 1, 2}, {3, 4, 5}},   // 1 top-left
        {{2, 1, 0}, {5, 4, 3}},   // 2 top-right: mirrored
        {{5, 4, 3}, {2, 1, 0}},   // 3 bottom-right: half a turn
        {{3, 4, 5}, {0, 1, 2}},   // 4 bottom-left: upside down
        {{0, 3}, {1, 4}, {2, 5}}, // 5 left-top: transposed
        {{3, 0}, {4, 1}, {5, 2}}, // 6 right-top: a quarter turn clockwise
        {{5, 2}, {4, 1}, {3, 0}}, // 7 right-bottom: transposed the other way
        {{2, 5}, {1, 4}, {0, 3}}, // 8 left-bottom: a quarter turn anticlockwise
    };
    auto colour = [](int k) {
        return std::vector<std::uint8_t>{std::uint8_t(10 + 40 * k), std::uint8_t(200 - 30 * k),
                                         std::uint8_t(7 * k + 1), 255};
    };
    struct Route {
        const char* name;
        bool palette;
        bool planar;
        int tileSize;
        bool rowStrips; // a strip for each row rather than one for both
    };
    // libtiff 4.5's renderer cannot read palette tiles at all, so the rendered routes are strips only.
    const Route routes[] = {{"strip", false, false, 0, false},
                            {"row strips", false, false, 0, true},
                            {"tiles", false, false, 16, false},
                            {"planar strip", false, true, 0, false},
                            {"planar tiles", false, true, 16, false},
                            {"rendered strip", true, false, 0, false},
                            {"rendered row strips", true, false, 0, true}};
    for (int orientation = 1; orientation <= 8; ++orientation)
        for (const Route& route : routes) {
            SCOPED_TRACE(std::string(route.name) + ", orientation " + std::to_string(orientation));
            TiffSpec spec{.width = 3, .height = 2, .samples = route.palette ? 1 : 3, .bits = 8};
            spec.planar = route.planar;
            spec.tileSize = route.tileSize;
            for (int k = 0; k < 6; ++k) {
                if (route.palette) {
                    spec.pixels.push_back(std::byte(k));
                    continue;
                }
                for (int c = 0; c < 3; ++c)
                    spec.pixels.push_back(std::byte(colour(k)[std::size_t(c)]));
            }
            spec.setup = [&](tiff* tif) {
                if (route.palette) {
                    Photometric(tif, PHOTOMETRIC_PALETTE);
                    static std::uint16_t map[3][256];
                    for (int k = 0; k < 6; ++k)
                        for (int c = 0; c < 3; ++c)
                            map[c][k] = std::uint16_t(colour(k)[std::size_t(c)] * 257);
                    TIFFSetField(tif, TIFFTAG_COLORMAP, map[0], map[1], map[2]);
                } else {
                    Photometric(tif, PHOTOMETRIC_RGB);
                }
                TIFFSetField(tif, TIFFTAG_ORIENTATION, std::uint16_t(orientation));
                if (route.rowStrips) TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, std::uint32_t(1));
            };
            auto image = Decode(WriteTiffDirectly(spec)).image;
            ASSERT_TRUE(image);
            ASSERT_EQ(image->GetFormat(), PixelFormat::RGBA8);
            const auto& expected = upright[std::size_t(orientation - 1)];
            ASSERT_EQ(image->GetHeight(), int(expected.size()));
            ASSERT_EQ(image->GetWidth(), int(expected[0].size()));
            for (int y = 0; y < image->GetHeight(); ++y)
                for (int x = 0; x < image->GetWidth(); ++x)
                    EXPECT_EQ(PixelOf<std::uint8_t>(*image, x, y),
                              colour(expected[std::size_t(y)][std::size_t(x)]))
                        << x << "," << y;
        }
}

TEST(TiffVariants, StripsTooLargeToHoldReadRowByRowAlike) {
    // One strip of 2048 × 1400 RGB16 is 17 MB, above what the reader holds at once; a strip a row is not.
    constexpr int width = 2048, height = 1400;
    TiffSpec spec{.width = width, .height = height, .samples = 3, .bits = 16};
    spec.pixels.resize(std::size_t(width) * height * 3 * 2);
    for (std::size_t i = 0; i < spec.pixels.size() / 2; ++i) {
        const auto v = std::uint16_t(i * 7 + i / 6143);
        std::memcpy(spec.pixels.data() + i * 2, &v, 2);
    }
    for (int orientation : {3, 6, 0}) { // 0: planar, upright
        SCOPED_TRACE("orientation " + std::to_string(orientation));
        spec.planar = orientation == 0;
        if (orientation == 0) orientation = 1;
        Kernel::Counted<Raster::DynamicBuffer> images[2];
        for (std::uint32_t rows : {std::uint32_t(height), std::uint32_t(1)}) {
            spec.setup = [&](tiff* tif) {
                Photometric(tif, PHOTOMETRIC_RGB);
                TIFFSetField(tif, TIFFTAG_ROWSPERSTRIP, rows);
                TIFFSetField(tif, TIFFTAG_ORIENTATION, std::uint16_t(orientation));
            };
            images[rows == 1] = Decode(WriteTiffDirectly(spec)).image;
            ASSERT_TRUE(images[rows == 1]);
        }
        EXPECT_EQ(Difference(*images[0], *images[1]), "");
        const bool turned = orientation >= 5;
        EXPECT_EQ(images[0]->GetWidth(), turned ? height : width);
        // The stored first pixel lands in the corner its orientation names.
        const int x = orientation == 1 ? 0 : images[0]->GetWidth() - 1;
        const int y = orientation == 3 ? images[0]->GetHeight() - 1 : 0;
        EXPECT_EQ(PixelOf<std::uint16_t>(*images[0], x, y), (std::vector<std::uint16_t>{0, 7, 14, 65535}));
    }
}

TEST(TiffVariants, LayoutsWithoutAHostFormatAreRefusedByName) {
    TiffSpec wide{.width = 1, .height = 1, .samples = 1, .bits = 32};
    wide.pixels = Samples<std::uint32_t>({123456});
    wide.setup = [](tiff* tif) { Photometric(tif, PHOTOMETRIC_MINISBLACK); };
    IO::ReadResult result = IO::DecodeImage(WriteTiffDirectly(wide), "wide.tif");
    EXPECT_FALSE(result);
    EXPECT_EQ(result.error, "wide.tif: unsupported TIFF layout (32-bit integer samples)");

    TiffSpec inks{.width = 1, .height = 1, .samples = 3, .bits = 8};
    inks.pixels = Samples<std::uint8_t>({1, 2, 3});
    inks.setup = [](tiff* tif) {
        Photometric(tif, PHOTOMETRIC_SEPARATED);
        TIFFSetField(tif, TIFFTAG_INKSET, INKSET_MULTIINK);
    };
    result = IO::DecodeImage(WriteTiffDirectly(inks), "inks.tif");
    EXPECT_FALSE(result);
    EXPECT_NE(result.error.find("inks.tif: unsupported TIFF layout"), std::string::npos) << result.error;
}

} // namespace
