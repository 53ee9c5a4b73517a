// Conversions worked out by hand from their defining formulas, on the processor and on the device alike:
// the Convert bodies' fixed texts, the values at the edges of each rule, the channel write masks.

#include "StageTestSupport.h"

#include "pipeline/Conversions.h"
#include "pipeline/Formats.h"

#include <cstring>

using namespace PipelineTest;
using namespace Raster::KernelMath;
using RasterTools::RenderPath;

namespace {

// One pixel converted from format `from` to `to` by a copy, on the processor and (where there is one) on the
// OpenCL device. Returns the stored components of each.
struct Converted {
    std::vector<double> processor;
    std::optional<std::vector<double>> device;
};

template <class Pixel>
Converted Convert(PixelFormat from, const Pixel& pixel, PixelFormat to) {
    EXPECT_EQ(sizeof(Pixel), std::size_t(Raster::GetBytesPerPixel(from)));
    Converted result;
    for (const bool onDevice : {false, true}) {
        const auto device = onDevice ? OpenCLDevice() : nullptr;
        if (onDevice && !device) break;
        const auto source = MakeFilled(from, 3, 2, &pixel);
        const auto destination = MakeImage(to, 3, 2, 5u);
        const RenderPath path = RenderAll<AnyCopy>(source, destination, {}, device);
        EXPECT_EQ(path, onDevice ? RenderPath::Device : RenderPath::Processor)
            << Raster::GetLastHardwareError();
        (onDevice ? result.device.emplace() : result.processor) = ReadComponents(*destination, 2, 1);
    }
    return result;
}

// Checks both paths against the expected components.
#define EXPECT_CONVERTS(from, pixel, to, ...)                                                                \
    do {                                                                                                     \
        const auto converted = Convert(PixelFormat::from, pixel, PixelFormat::to);                           \
        const std::vector<double> expected{__VA_ARGS__};                                                     \
        EXPECT_EQ(converted.processor, expected) << "processor, " #from " to " #to;                          \
        if (converted.device) {                                                                              \
            EXPECT_EQ(*converted.device, expected) << "device, " #from " to " #to;                           \
        }                                                                                                    \
    } while (false)

TEST(ConvertBodies, AreTheFixedTexts) {
    using RasterTools::GetConvertPair;
    EXPECT_EQ(GetConvertPair(PixelFormat::RGBA8).toWorking,
              "return rgbauf_literal(source.x/255.0f,source.y/255.0f,source.z/255.0f,source.w/255.0f);");
    EXPECT_EQ(GetConvertPair(PixelFormat::RGBA8).fromWorking,
              "return convert_dest(round(clamp(source,0.0f,1.0f)*255.0f));");
    EXPECT_EQ(GetConvertPair(PixelFormat::RGBA16).fromWorking,
              "return convert_dest(round(clamp(source,0.0f,1.0f)*65535.0f));");
    EXPECT_EQ(GetConvertPair(PixelFormat::RGBAUF).toWorking, "return source;");
    EXPECT_EQ(GetConvertPair(PixelFormat::IA8).fromWorking,
              "saturate(source);\nreturn "
              "convert_uchar2(round(float2_literal(255.0f*(source.x*0.299f+source.y*0.587f+"
              "source.z*0.114f), source.w*255.0f)));");
    EXPECT_EQ(
        GetConvertPair(PixelFormat::IA16).fromWorking,
        "saturate(source);\nreturn ushort2_literal(round(65535.0f*(source.x*0.299f+source.y*0.587f+source.z*"
        "0.114f)),round(source.w*65535.0f));");
    EXPECT_EQ(GetConvertPair(PixelFormat::LabA16).toWorking,
              "return labaf_to_rgbauf(convert_float4(source)/65535.0f);");
    EXPECT_EQ(GetConvertPair(PixelFormat::LabA16).fromWorking,
              "return convert_ushort4(rgbauf_to_labaf(source)*65535.0f + 0.5f);");
    EXPECT_EQ(GetConvertPair(PixelFormat::MaskA16).toWorking,
              "return rgbauf_literal(0.0f,0.0f,0.0f,source/65535.0f);");
    EXPECT_EQ(GetConvertPair(PixelFormat::MaskAF).fromWorking, "return source.w;");
    EXPECT_EQ(RasterTools::GetColourOnlyConvertPair().toWorking,
              "return rgbauf_literal(source.x,source.y,source.z,1.0f);");
}

TEST(Conversions, EightBitRoundsHalvesUpAndClamps) {
    EXPECT_CONVERTS(RGBA8, make_uchar4(128, 0, 255, 128), RGBAUF, 128.0f / 255.0f, 0.0, 1.0, 128.0f / 255.0f);
    EXPECT_NEAR(128.0f / 255.0f, 0.50196, 1e-5);
    // 0.5 × 255 = 127.5 rounds up; −0.2 clamps to 0 and 1.7 to 255; alpha is clamped too.
    EXPECT_CONVERTS(RGBAUF, make_float4(0.5f, -0.2f, 1.7f, 2.0f), RGBA8, 128, 0, 255, 255);
    EXPECT_CONVERTS(RGBAUF, make_float4(0.5f, -0.2f, 1.7f, -1.0f), RGBA16, 32768, 0, 65535, 0);
}

TEST(Conversions, UnboundedFloatRoundTripsAnyValue) {
    const float4 pixel = make_float4(-3.25f, 17.5f, 1e-30f, 0.125f);
    EXPECT_CONVERTS(RGBAUF, pixel, RGBAUF, -3.25, 17.5, double(1e-30f), 0.125);
    const float4 back =
        RasterTools::FromWorking<PixelFormat::RGBAUF>(RasterTools::ToWorking<PixelFormat::RGBAUF>(pixel));
    EXPECT_EQ(std::memcmp(&back, &pixel, sizeof pixel), 0);
}

TEST(Conversions, CmykCornersFollowTheUndercolourRule) {
    // White: no ink at all; black through k = 1 without a division; alpha scaled on its own.
    EXPECT_CONVERTS(RGBAUF, make_float4(1.0f, 1.0f, 1.0f, 0.5f), CMYKA8, 0, 0, 0, 0, 128);
    EXPECT_CONVERTS(RGBAUF, make_float4(0.0f, 0.0f, 0.0f, 1.0f), CMYKA8, 0, 0, 0, 255, 255);
    // Clamped before anything: far below black is black.
    EXPECT_CONVERTS(RGBAUF, make_float4(-5.0f, -5.0f, -5.0f, 1.0f), CMYKA8, 0, 0, 0, 255, 255);
    // Pure red: k = 0, c = 0, m = y = 1.
    EXPECT_CONVERTS(RGBAUF, make_float4(1.0f, 0.0f, 0.0f, 1.0f), CMYKA8, 0, 255, 255, 0, 255);
    // Full cyan reads as (0, 1, 1): 255 × the single-precision 1/255 rounds to exactly 1.
    EXPECT_CONVERTS(CMYKA8, rt_make_cmyka8(255, 0, 0, 0, 255), RGBAUF, 0.0, 1.0, 1.0, 1.0);
    // Black ink alone, half strength: every channel 1 − 0.5.
    const float k = 128 * 0.003921569f;
    EXPECT_CONVERTS(CMYKA8, rt_make_cmyka8(0, 0, 0, 128, 51), RGBAUF, 1.0f - k, 1.0f - k, 1.0f - k,
                    51.0f / 255.0f);
}

TEST(Conversions, IntensityIsLuminanceOfUnclampedValues) {
    // (2, 2, 2) has luminance 2: above the maximum before the integer conversion, which saturates.
    EXPECT_CONVERTS(RGBAUF, make_float4(2.0f, 2.0f, 2.0f, 1.0f), IA8, 255, 255);
    // (2, −1, 0): 0.598 − 0.587 = 0.011 → 3; had the colour been clamped first it would be 0.299 → 76.
    EXPECT_CONVERTS(RGBAUF, make_float4(2.0f, -1.0f, 0.0f, 1.0f), IA8, 3, 255);
    EXPECT_CONVERTS(RGBAUF, make_float4(2.0f, -1.0f, 0.0f, 0.5f), IA16, 721, 32768);
    // Reading replicates the intensity.
    EXPECT_CONVERTS(IA8, make_uchar2(51, 255), RGBAUF, 51.0f / 255.0f, 51.0f / 255.0f, 51.0f / 255.0f, 1.0);
}

TEST(Conversions, MasksKeepOnlyAlpha) {
    // 0.25 × 255 = 63.75 → 64; the colour is dropped, and nothing is clamped.
    EXPECT_CONVERTS(RGBAUF, make_float4(0.3f, 0.6f, 0.9f, 0.25f), MaskA8, 64);
    EXPECT_CONVERTS(RGBAUF, make_float4(0.3f, 0.6f, 0.9f, 0.25f), MaskA16, 16384);
    EXPECT_CONVERTS(RGBAUF, make_float4(0.3f, 0.6f, 0.9f, 0.25f), MaskAF, 0.25);
    EXPECT_CONVERTS(RGBA8, make_uchar4(10, 20, 30, 200), MaskA8, 200);
    const std::uint8_t selected = 200;
    EXPECT_CONVERTS(MaskA8, selected, RGBAUF, 0.0, 0.0, 0.0, 200.0f / 255.0f);
}

TEST(Conversions, CmykToLabSpansMatchThePixelRoutine) {
    Raster::InterleavedPixelSpan<PixelFormat::CMYKA8> interleaved;
    interleaved.count = 32;
    for (int i = 0; i < 32; ++i)
        interleaved.pixels[i] =
            rt_make_cmyka8(uchar(i * 8), uchar(255 - i * 8), uchar(i * 3), uchar(i * 5), uchar(i * 7));
    Raster::PlanarPixelSpan<PixelFormat::CMYKA8> planar;
    Raster::Deinterleave(interleaved, planar);
    Raster::InterleavedPixelSpan<PixelFormat::LabA16> fromInterleaved, fromPlanar;
    Raster::PlanarPixelSpan<PixelFormat::LabA16> planarLab;
    RasterTools::ConvertCMYKA8ToLabA16(interleaved, fromInterleaved);
    RasterTools::ConvertCMYKA8ToLabA16(planar, planarLab);
    Raster::Interleave(planarLab, fromPlanar);
    for (int i = 0; i < 32; ++i) {
        EXPECT_EQ(fromInterleaved.pixels[i], fromPlanar.pixels[i]) << i;
        // Alpha: a × (1/255) × 65535 + 0.5, truncated.
        EXPECT_EQ(fromInterleaved.pixels[i].w, ushort(float(i * 7) * 0.003921569f * 65535.0f + 0.5f)) << i;
        // White ink-free, the colour is the colour manager's conversion of the working pixel.
        const auto working = RasterTools::ToWorking<PixelFormat::CMYKA8>(interleaved.pixels[i]);
        const auto lab = RasterTools::FromWorking<PixelFormat::LabA16>(working);
        EXPECT_NEAR(fromInterleaved.pixels[i].x, lab.x, 1.0) << i;
        EXPECT_NEAR(fromInterleaved.pixels[i].y, lab.y, 1.0) << i;
        EXPECT_NEAR(fromInterleaved.pixels[i].z, lab.z, 1.0) << i;
    }
}

// ---- Channel write masks

struct WriteMaskCase {
    PixelFormat format;
    int mask;
};

TEST(ChannelWriteMasks, WriteExactlyTheChannelsWhoseBitIsSet) {
    const WriteMaskCase cases[] = {
        {PixelFormat::RGBA8, 0},   {PixelFormat::RGBA8, 7},   {PixelFormat::RGBA8, 15},
        {PixelFormat::RGBA8, 8},   {PixelFormat::RGBA16, 5},  {PixelFormat::RGBAUF, 7},
        {PixelFormat::IA8, 7},     {PixelFormat::IA16, 8},    {PixelFormat::CMYKA8, 31},
        {PixelFormat::CMYKA8, 16}, {PixelFormat::CMYKA8, 15}, {PixelFormat::LabA16, 6}};
    for (const auto& c : cases) {
        const auto& info = Raster::GetPixelFormatInfo(c.format);
        const auto source = MakeImage(c.format, 41, 3, 1u);
        for (const bool onDevice : {false, true}) {
            const auto device = onDevice ? OpenCLDevice() : nullptr;
            if (onDevice && !device) continue;
            const auto original = MakeImage(c.format, 41, 3, 2u);
            const auto destination = MakeImage(c.format, 41, 3, 2u);
            ASSERT_NE(RenderAll<AnyCopy>(source, destination, {}, device, c.mask), RenderPath::Failed);
            for (int y = 0; y < 3; ++y)
                for (int x = 0; x < 41; ++x) {
                    const auto written = ReadComponents(*destination, x, y);
                    const auto from = ReadComponents(*source, x, y);
                    const auto kept = ReadComponents(*original, x, y);
                    for (int ch = 0; ch < info.channelCount; ++ch) {
                        // Intensity answers to any colour bit; alpha's bit is the highest of the format's.
                        const int bit = info.channelCount == 2 ? (ch == 0 ? 7 : 8) : 1 << ch;
                        const bool writes = (c.mask & bit) != 0;
                        ASSERT_EQ(written[ch], writes ? from[ch] : kept[ch])
                            << Raster::GetPixelFormatName(c.format) << " mask " << c.mask << " channel " << ch
                            << " at " << x << "," << y << (onDevice ? " on the device" : " on the processor");
                    }
                }
        }
    }
}

TEST(ChannelWriteMasks, ParseByNameOrNumber) {
    using RasterTools::ParseChannelMask;
    EXPECT_EQ(ParseChannelMask(PixelFormat::RGBA8, "rgb"), 7);
    EXPECT_EQ(ParseChannelMask(PixelFormat::RGBA8, "a"), 8);
    EXPECT_EQ(ParseChannelMask(PixelFormat::RGBA8, "15"), 15);
    EXPECT_EQ(ParseChannelMask(PixelFormat::CMYKA8, "cmyka"), 31);
    EXPECT_EQ(ParseChannelMask(PixelFormat::CMYKA8, "alpha"), 16);
    EXPECT_EQ(ParseChannelMask(PixelFormat::IA16, "i"), 7);
    EXPECT_EQ(ParseChannelMask(PixelFormat::LabA16, "Lab"), 7);
    EXPECT_EQ(ParseChannelMask(PixelFormat::LabA16, "L,alpha"), 9);
    EXPECT_EQ(ParseChannelMask(PixelFormat::RGBA8, "0"), 0);
    // Refused: unknown names, bits the format lacks, negative numbers, nothing at all.
    EXPECT_EQ(ParseChannelMask(PixelFormat::RGBA8, "rgbx"), std::nullopt);
    EXPECT_EQ(ParseChannelMask(PixelFormat::RGBA8, "16"), std::nullopt);
    EXPECT_EQ(ParseChannelMask(PixelFormat::RGBA8, "-1"), std::nullopt);
    EXPECT_EQ(ParseChannelMask(PixelFormat::RGBA8, ""), std::nullopt);
    EXPECT_EQ(ParseChannelMask(PixelFormat::IA8, "r"), std::nullopt);
}

} // namespace
