// Dab composition: weights worked out by hand from the fixed-point rules, and every write, path, coverage
// format and layer format against the rule that full coverage replaces and zero coverage keeps.

#include "host/brush/DabComposite.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <vector>

namespace {

using Raster::DabPath;
using Raster::DabWrite;
using Raster::PixelFormat;

Kernel::Counted<Raster::DynamicBuffer> Coverage(PixelFormat format, int width, int height, double fraction) {
    auto mask = Raster::DynamicBuffer::Create(width, height, format);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x) {
            if (format == PixelFormat::MaskA8)
                mask->Row<std::uint8_t>(y)[x] = std::uint8_t(std::lround(fraction * 255));
            else if (format == PixelFormat::MaskA16)
                mask->Row<std::uint16_t>(y)[x] = std::uint16_t(std::lround(fraction * 65535));
            else
                mask->Row<float>(y)[x] = float(fraction);
        }
    return mask;
}

TEST(DabFixedPoint, ProductsRoundIn8BitsAndTruncateIn16) {
    EXPECT_EQ(Raster::DabFixedPoint::Multiply8(255, 128), 128u);
    EXPECT_EQ(Raster::DabFixedPoint::Multiply8(100, 128), 50u); // 12800 + 128 + 50 = 12978, >> 8
    EXPECT_EQ(Raster::DabFixedPoint::Multiply8(1, 255), 1u);
    for (std::uint32_t x = 0; x <= 255; ++x)
        EXPECT_EQ(Raster::DabFixedPoint::Multiply8(x, 255), x);
    EXPECT_EQ(Raster::DabFixedPoint::Multiply16(65535, 65469), 65469u);
    EXPECT_EQ(Raster::DabFixedPoint::Multiply16(1000, 32768), 500u); // 500.0076 truncated
    EXPECT_EQ(Raster::DabFixedPoint::Multiply16(65535, 65535), 65535u);
}

TEST(DabComposite, BlendedWeightsWorkedByHandInEachPrecision) {
    // RGBA8, strength 0.5: the weight is round(127.5) = 128; 200 -> 100 moves by mul8(100, 128) = 50.
    auto rgba8 = Raster::DynamicBuffer::Create(1, 1, PixelFormat::RGBA8);
    const std::uint8_t start8[4] = {200, 0, 255, 255}, colour8[4] = {100, 255, 255, 0};
    std::memcpy(rgba8->Row<std::uint8_t>(0), start8, 4);
    Raster::DabRequest request;
    request.write = DabWrite::Colour;
    request.path = DabPath::Blended;
    request.strength = 0.5;
    request.colour = reinterpret_cast<const std::byte*>(colour8);
    ASSERT_TRUE(
        Raster::CompositeDab(*rgba8, {0, 0, 1, 1}, *Coverage(PixelFormat::MaskA8, 1, 1, 1.0), request));
    const std::uint8_t* p8 = rgba8->Row<std::uint8_t>(0);
    EXPECT_EQ(p8[0], 150);
    EXPECT_EQ(p8[1], 128);
    EXPECT_EQ(p8[2], 255);
    EXPECT_EQ(p8[3], 127); // 255 - mul8(255, 128)

    // RGBA16, strength 0.999: 65469 of 65535, truncated products.
    auto rgba16 = Raster::DynamicBuffer::Create(1, 1, PixelFormat::RGBA16);
    const std::uint16_t colour16[4] = {65535, 1000, 0, 65535};
    request.colour = reinterpret_cast<const std::byte*>(colour16);
    request.strength = 0.999;
    ASSERT_TRUE(
        Raster::CompositeDab(*rgba16, {0, 0, 1, 1}, *Coverage(PixelFormat::MaskA16, 1, 1, 1.0), request));
    const std::uint16_t* p16 = rgba16->Row<std::uint16_t>(0);
    EXPECT_EQ(p16[0], 65469);
    EXPECT_EQ(p16[1], 998); // 1000 * 65469 / 65535 = 998.99, truncated
    EXPECT_EQ(p16[3], 65469);

    // RGBAUF takes the 16-bit weight over 65535: strength 0.5 is 32768 / 65535.
    auto rgbauf = Raster::DynamicBuffer::Create(1, 1, PixelFormat::RGBAUF);
    const float colourF[4] = {1.0f, 3.0f, -2.0f, 1.0f};
    request.colour = reinterpret_cast<const std::byte*>(colourF);
    request.strength = 0.5;
    ASSERT_TRUE(
        Raster::CompositeDab(*rgbauf, {0, 0, 1, 1}, *Coverage(PixelFormat::MaskAF, 1, 1, 1.0), request));
    const float w = 32768.0f / 65535.0f;
    EXPECT_FLOAT_EQ(rgbauf->Row<float>(0)[0], w);
    EXPECT_FLOAT_EQ(rgbauf->Row<float>(0)[1], 3.0f * w); // unbounded colour is kept
    EXPECT_FLOAT_EQ(rgbauf->Row<float>(0)[2], -2.0f * w);
}

TEST(DabComposite, OpaqueIgnoresStrengthAndStampReplacesFromHalfWeight) {
    const std::uint8_t colour[4] = {10, 20, 30, 255};
    Raster::DabRequest request;
    request.colour = reinterpret_cast<const std::byte*>(colour);
    request.strength = 0.25;
    auto image = Raster::DynamicBuffer::Create(3, 1, PixelFormat::RGBA8);
    request.path = DabPath::Opaque;
    ASSERT_TRUE(
        Raster::CompositeDab(*image, {0, 0, 1, 1}, *Coverage(PixelFormat::MaskA8, 1, 1, 1.0), request));
    EXPECT_EQ(std::memcmp(image->Row<std::uint8_t>(0), colour, 4), 0);

    // Stamp at full strength: coverage 127 of 255 stays below half, 128 reaches it.
    request.path = DabPath::Stamp;
    request.strength = 1.0;
    auto coverage = Raster::DynamicBuffer::Create(2, 1, PixelFormat::MaskA8);
    coverage->Row<std::uint8_t>(0)[0] = 127;
    coverage->Row<std::uint8_t>(0)[1] = 128;
    ASSERT_TRUE(Raster::CompositeDab(*image, {1, 0, 3, 1}, *coverage, request));
    const std::uint8_t* row = image->Row<std::uint8_t>(0);
    EXPECT_EQ(row[4 + 3], 0);
    EXPECT_EQ(std::memcmp(row + 8, colour, 4), 0);
}

TEST(DabComposite, MaskTextureRepeatsOverTheDocumentAtItsScale) {
    auto texture = Raster::DynamicBuffer::Create(2, 1, PixelFormat::MaskA8);
    texture->Row<std::uint8_t>(0)[0] = 255;
    const std::uint8_t colour[2] = {200, 255};
    Raster::DabRequest request;
    request.colour = reinterpret_cast<const std::byte*>(colour);
    request.texture = texture.Get();
    for (const double scale : {1.0, 2.0}) {
        auto image = Raster::DynamicBuffer::Create(8, 1, PixelFormat::IA8);
        request.textureScale = scale;
        // The target's pixel 0 sits at document x = 3: document columns, not target ones, pick the texel.
        request.targetOrigin = {3, 0};
        ASSERT_TRUE(
            Raster::CompositeDab(*image, {0, 0, 8, 1}, *Coverage(PixelFormat::MaskA8, 8, 1, 1.0), request));
        for (int x = 0; x < 8; ++x) {
            const long texel = long(std::floor(double(x + 3) / scale)) % 2;
            EXPECT_EQ(image->Row<std::uint8_t>(0)[2 * x + 1], texel == 0 ? 255 : 0)
                << "x " << x << " scale " << scale;
        }
    }
}

// One pixel of any format where every component sits at a fraction of its full value.
std::vector<std::byte> Pixel(PixelFormat format, double fraction) {
    const auto& info = Raster::GetPixelFormatInfo(format);
    std::vector<std::byte> bytes(std::size_t(info.bytesPerPixel));
    for (int c = 0; c < info.channelCount; ++c) {
        std::byte* at = bytes.data() + c * info.bytesPerComponent;
        if (info.bytesPerComponent == 1) {
            const auto v = std::uint8_t(std::lround(fraction * 255));
            std::memcpy(at, &v, 1);
        } else if (info.bytesPerComponent == 2) {
            const auto v = std::uint16_t(std::lround(fraction * 65535));
            std::memcpy(at, &v, 2);
        } else {
            const auto v = float(fraction);
            std::memcpy(at, &v, 4);
        }
    }
    return bytes;
}

double Component(const std::byte* pixel, const Raster::PixelFormatInfo& info, int c) {
    const std::byte* at = pixel + c * info.bytesPerComponent;
    if (info.bytesPerComponent == 1) return double(std::uint8_t(*at));
    if (info.bytesPerComponent == 2) {
        std::uint16_t v;
        std::memcpy(&v, at, 2);
        return v;
    }
    float v;
    std::memcpy(&v, at, 4);
    return v;
}

TEST(DabComposite, EveryWriteAndPathInEveryCoverageAndLayerFormat) {
    const PixelFormat layers[] = {PixelFormat::RGBA8, PixelFormat::RGBA16, PixelFormat::RGBAUF,
                                  PixelFormat::IA8,   PixelFormat::IA16,   PixelFormat::CMYKA8,
                                  PixelFormat::LabA16};
    const PixelFormat coverages[] = {PixelFormat::MaskA8, PixelFormat::MaskA16, PixelFormat::MaskAF};
    const DabWrite writes[] = {DabWrite::Colour, DabWrite::ClearAlpha, DabWrite::Copy};
    const DabPath paths[] = {DabPath::Opaque, DabPath::Blended, DabPath::Stamp};
    for (const PixelFormat layer : layers) {
        const auto& info = Raster::GetPixelFormatInfo(layer);
        const auto start = Pixel(layer, 0.2);
        const auto colour = Pixel(layer, 0.9);
        for (const DabWrite write : writes)
            for (const DabPath path : paths) {
                // Results with full coverage must not depend on the coverage format.
                std::vector<std::byte> fullResult;
                for (const PixelFormat coverageFormat : coverages) {
                    SCOPED_TRACE(testing::Message() << Raster::GetPixelFormatName(layer) << " coverage "
                                                    << Raster::GetPixelFormatName(coverageFormat) << " write "
                                                    << int(write) << " path " << int(path));
                    // Columns: full coverage, none, half.
                    auto image = Raster::DynamicBuffer::Create(3, 1, layer);
                    auto source = Raster::DynamicBuffer::Create(3, 1, layer);
                    for (int x = 0; x < 3; ++x) {
                        std::memcpy(image->RowBytes(0) + x * info.bytesPerPixel, start.data(), start.size());
                        std::memcpy(source->RowBytes(0) + x * info.bytesPerPixel, colour.data(),
                                    colour.size());
                    }
                    auto coverage = Coverage(coverageFormat, 3, 1, 1.0);
                    auto half = Coverage(coverageFormat, 1, 1, 0.5);
                    std::memcpy(coverage->RowBytes(0) + 2 * Raster::GetBytesPerPixel(coverageFormat),
                                half->RowBytes(0), std::size_t(Raster::GetBytesPerPixel(coverageFormat)));
                    std::memset(coverage->RowBytes(0) + Raster::GetBytesPerPixel(coverageFormat), 0,
                                std::size_t(Raster::GetBytesPerPixel(coverageFormat)));
                    Raster::DabRequest request;
                    request.write = write;
                    request.path = path;
                    request.strength = 1.0;
                    request.colour = colour.data();
                    request.source = source.Get();
                    ASSERT_TRUE(Raster::CompositeDab(*image, {0, 0, 3, 1}, *coverage, request));
                    const std::byte* full = image->RowBytes(0);
                    const std::byte* none = full + info.bytesPerPixel;
                    const std::byte* between = none + info.bytesPerPixel;
                    for (int c = 0; c < info.channelCount; ++c) {
                        const bool moves = write != DabWrite::ClearAlpha || c == info.alphaIndex;
                        const double target =
                            write == DabWrite::ClearAlpha ? 0.0 : Component(colour.data(), info, c);
                        const double was = Component(start.data(), info, c);
                        EXPECT_EQ(Component(full, info, c), moves ? target : was) << "channel " << c;
                        EXPECT_EQ(Component(none, info, c), was) << "channel " << c;
                        const double mid = Component(between, info, c);
                        EXPECT_GE(mid, std::min(was, target)) << "channel " << c;
                        EXPECT_LE(mid, std::max(was, target)) << "channel " << c;
                        if (moves && path == DabPath::Stamp && write != DabWrite::Copy) {
                            EXPECT_EQ(mid, target) << "half weight stamps";
                        }
                        if (moves && (path != DabPath::Stamp || write == DabWrite::Copy)) {
                            // Half coverage is 128/255 in 8 bits, a little over a half.
                            EXPECT_NEAR(mid, (was + target) / 2.0,
                                        (info.bytesPerComponent == 4 ? 1e-6 : 1.0) +
                                            0.003 * std::abs(target - was))
                                << "channel " << c;
                        }
                    }
                    std::vector<std::byte> result(full, full + info.bytesPerPixel);
                    if (fullResult.empty())
                        fullResult = result;
                    else
                        EXPECT_EQ(result, fullResult);
                }
            }
    }
}

TEST(DabComposite, RequestsThatCannotBeMetChangeNothing) {
    auto image = Raster::DynamicBuffer::Create(4, 4, PixelFormat::RGBA8);
    const std::uint8_t colour[4] = {1, 2, 3, 4};
    Raster::DabRequest request;
    request.colour = reinterpret_cast<const std::byte*>(colour);
    auto notMask = Raster::DynamicBuffer::Create(4, 4, PixelFormat::RGBA8);
    EXPECT_FALSE(Raster::CompositeDab(*image, {0, 0, 4, 4}, *notMask, request));
    auto coverage = Coverage(PixelFormat::MaskA8, 4, 4, 1.0);
    request.colour = nullptr;
    EXPECT_FALSE(Raster::CompositeDab(*image, {0, 0, 4, 4}, *coverage, request));
    request.write = DabWrite::Copy; // no source
    EXPECT_FALSE(Raster::CompositeDab(*image, {0, 0, 4, 4}, *coverage, request));
    request.write = DabWrite::Colour;
    request.colour = reinterpret_cast<const std::byte*>(colour);
    // Coverage smaller than the rect it is to cover.
    EXPECT_FALSE(
        Raster::CompositeDab(*image, {0, 0, 5, 5}, *Coverage(PixelFormat::MaskA8, 2, 2, 1.0), request));
    // Entirely outside: nothing to do.
    EXPECT_TRUE(Raster::CompositeDab(*image, {100, 100, 104, 104}, *coverage, request));
    // NaN strength and float coverage count as zero.
    request.path = DabPath::Blended;
    request.strength = NAN;
    EXPECT_TRUE(Raster::CompositeDab(*image, {0, 0, 4, 4}, *coverage, request));
    request.strength = 1.0;
    EXPECT_TRUE(
        Raster::CompositeDab(*image, {0, 0, 4, 4}, *Coverage(PixelFormat::MaskAF, 4, 4, NAN), request));
    for (int y = 0; y < 4; ++y)
        for (int x = 0; x < 16; ++x)
            EXPECT_EQ(image->Row<std::uint8_t>(y)[x], 0) << x << "," << y;
}

} // namespace
