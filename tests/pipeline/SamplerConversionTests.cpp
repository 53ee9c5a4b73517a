// The sampler conversion fragments on a device against the processor's conversions: a kernel reads a
// secondary sampler image of its own format (clamped at its edges) and writes destination pixels, beside the
// source's own conversion; every pixel must equal the processor's. Language 0 is compiled with NVRTC for
// every pair of layer formats.

#include "LanguageZeroCheck.h"

#include "host/raster/PixelTraits.h"
#include "host/raster/device/ExecuteKernel.h"
#include "host/raster/device/Hardware.h"
#include "host/raster/device/HardwareBuffer.h"
#include "pipeline/Conversions.h"
#include "pipeline/DeviceSteps.h"
#include "pipeline/Formats.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <random>
#include <string>
#include <vector>

namespace {

using Raster::PixelFormat;
using Raster::StoredPixel;
using Language = Raster::HardwareKernelLanguage;

// With a source, `near` is the working colour of the sampler pixel two to the left and three down (clamped)
// through ReadSampler and `other` the source converted; without one, `near` is that sampler pixel through
// ReadSampler and ConvertWorkingToDest, and `other` the sampler pixel itself through ConvertSamplerToDest.
constexpr const char* WithSourceLoop = R"(
KERNEL(sampler_check)(GLOBAL const sampler_type* sampler_pixels, GLOBAL const source_type* source_pixels,
                      GLOBAL rgbauf_type* near, GLOBAL dest_type* other, int width, int height)
{
    const int x = GLOBAL_X, y = GLOBAL_Y;
    if (x >= width || y >= height) return;
    const int i = y * width + x;
    near[i] = ReadSampler(make_int2(x - 2, y + 3), make_uint2(width, height), sampler_pixels);
    other[i] = ConvertSourceToDest(source_pixels[i]);
}
)";

constexpr const char* ReferenceLoop = R"(
KERNEL(sampler_check)(GLOBAL const sampler_type* sampler_pixels, GLOBAL dest_type* near, GLOBAL dest_type* other,
                      int width, int height)
{
    const int x = GLOBAL_X, y = GLOBAL_Y;
    if (x >= width || y >= height) return;
    const int i = y * width + x;
    near[i] = ConvertWorkingToDest(ReadSampler(make_int2(x - 2, y + 3), make_uint2(width, height), sampler_pixels));
    other[i] = ConvertSamplerToDest(sampler_pixels[i]);
}
)";

// The whole program: the steps' prelude, the traits of the formats involved, the fragment under test, the
// loop. Empty where a fragment is missing.
std::string ProgramText(Language language, PixelFormat source, PixelFormat dest, PixelFormat sampler,
                        bool withSource) {
    const char* destTraits = Raster::GetTraitsFragment(dest, Raster::KernelTraitsRole::Dest, language);
    const char* sourceTraits = Raster::GetTraitsFragment(source, Raster::KernelTraitsRole::Source, language);
    const char* conversion =
        withSource ? RasterTools::GetSamplerConversionFragment(source, dest, sampler, language)
                   : RasterTools::GetSamplerReferenceConversionFragment(dest, sampler, language);
    if (!destTraits || !sourceTraits || !conversion) return {};
    return std::string(RasterTools::DeviceStepsPrelude(language)) + destTraits + sourceTraits + conversion +
           (withSource ? WithSourceLoop : ReferenceLoop);
}

template <PixelFormat F>
std::vector<StoredPixel<F>> RandomImage(int count, unsigned seed) {
    std::mt19937 random(seed);
    std::vector<StoredPixel<F>> pixels(static_cast<std::size_t>(count));
    if constexpr (F == PixelFormat::RGBAUF) {
        std::uniform_real_distribution<float> spread(-0.25f, 1.25f);
        for (auto& p : pixels)
            p = Raster::KernelMath::make_float4(spread(random), spread(random), spread(random),
                                                spread(random));
    } else {
        auto* bytes = reinterpret_cast<unsigned char*>(pixels.data());
        for (std::size_t i = 0; i < pixels.size() * sizeof(StoredPixel<F>); ++i)
            bytes[i] = static_cast<unsigned char>(random());
    }
    return pixels;
}

template <PixelFormat Source, PixelFormat Dest, PixelFormat Sampler>
void CheckOnDevice(const Raster::HardwareDevice* device, bool withSource) {
    constexpr int Width = 37, Height = 6;
    const std::string name = std::string(withSource ? Raster::GetPixelFormatName(Source) : "no source") +
                             " to " + std::string(Raster::GetPixelFormatName(Dest)) + ", sampler " +
                             std::string(Raster::GetPixelFormatName(Sampler));
    const auto sampler = RandomImage<Sampler>(Width * Height, 7);
    const auto source = RandomImage<Source>(Width * Height, 11);
    const auto upload = [&](const auto& pixels) {
        using Pixel = typename std::decay_t<decltype(pixels)>::value_type;
        return Raster::CreateHardwareBuffer(device, pixels.data(), Width * sizeof(Pixel), Width, Height,
                                            int(sizeof(Pixel)));
    };
    using Working = Raster::KernelMath::float4;
    constexpr int DestBytes = int(sizeof(StoredPixel<Dest>));
    const int nearBytes = withSource ? int(sizeof(Working)) : DestBytes;
    const auto samplerBuffer = upload(sampler);
    const auto sourceBuffer = upload(source);
    const auto nearBuffer = Raster::CreateHardwareBuffer(device, nullptr, 0, Width, Height, nearBytes);
    const auto otherBuffer = Raster::CreateHardwareBuffer(device, nullptr, 0, Width, Height, DestBytes);
    ASSERT_TRUE(samplerBuffer && sourceBuffer && nearBuffer && otherBuffer) << Raster::GetLastHardwareError();

    RasterTools::DeviceKernelText kernel{
        ProgramText(device->GetLanguage(), Source, Dest, Sampler, withSource), "sampler_check"};
    ASSERT_FALSE(kernel.text.empty()) << name;
    Raster::HardwareKernelArguments arguments;
    arguments.AddBuffer(samplerBuffer);
    if (withSource) arguments.AddBuffer(sourceBuffer);
    arguments.AddBuffer(nearBuffer).AddBuffer(otherBuffer).AddInt(Width).AddInt(Height);
    ASSERT_TRUE(Raster::ExecuteKernel(device, kernel.Descriptor(), Width, Height, arguments))
        << name << ": " << Raster::GetLastHardwareError() << "\n"
        << Raster::GetKernelBuildLog(device, kernel.Descriptor());

    std::vector<unsigned char> near(std::size_t(Width * Height * nearBytes));
    std::vector<StoredPixel<Dest>> other(Width * Height);
    ASSERT_TRUE(nearBuffer->Download(near.data(), std::size_t(Width * nearBytes)));
    ASSERT_TRUE(otherBuffer->Download(other.data(), Width * DestBytes));
    for (int y = 0; y < Height; ++y) {
        for (int x = 0; x < Width; ++x) {
            const int i = y * Width + x;
            const int nx = std::clamp(x - 2, 0, Width - 1), ny = std::clamp(y + 3, 0, Height - 1);
            const Working nearWorking =
                RasterTools::ToWorking<Sampler>(sampler[std::size_t(ny * Width + nx)]);
            const StoredPixel<Dest> nearDest = RasterTools::FromWorking<Dest>(nearWorking);
            const void* expectNear = withSource ? static_cast<const void*>(&nearWorking) : &nearDest;
            const StoredPixel<Dest> expectOther =
                withSource ? Raster::PixelConversion<Source, Dest>::Convert(source[std::size_t(i)])
                           : RasterTools::FromWorking<Dest>(
                                 RasterTools::ToWorking<Sampler>(sampler[std::size_t(i)]));
            ASSERT_EQ(std::memcmp(&near[std::size_t(i * nearBytes)], expectNear, std::size_t(nearBytes)), 0)
                << name << ": ReadSampler at (" << x << ", " << y << ")";
            ASSERT_EQ(std::memcmp(&other[std::size_t(i)], &expectOther, DestBytes), 0)
                << name << ": " << (withSource ? "ConvertSourceToDest" : "ConvertSamplerToDest") << " at ("
                << x << ", " << y << ")";
        }
    }
}

TEST(SamplerConversion, OpenCLDeviceAgreesWithTheProcessor) {
    const auto device = Raster::Hardware::GetDevice("opencl");
    if (!device)
        GTEST_SKIP() << "no OpenCL device: the ICD loader found no platform (install pocl-opencl-icd)";
    // With a source: the sampler's format differs from both, and the source's conversion is the identity or
    // the joint one.
    CheckOnDevice<PixelFormat::RGBA8, PixelFormat::RGBA8, PixelFormat::CMYKA8>(device.Get(), true);
    CheckOnDevice<PixelFormat::IA16, PixelFormat::RGBA16, PixelFormat::RGBAUF>(device.Get(), true);
    // Without one, the sampler is the reference.
    CheckOnDevice<PixelFormat::RGBA8, PixelFormat::IA8, PixelFormat::RGBA16>(device.Get(), false);
    CheckOnDevice<PixelFormat::RGBA8, PixelFormat::CMYKA8, PixelFormat::IA8>(device.Get(), false);
}

TEST(SamplerConversion, NvrtcCompilesEveryPairOfLayerFormats) {
    REQUIRE_NVRTC();
    for (const PixelFormat dest : RasterTools::LayerFormats) {
        for (const PixelFormat sampler : RasterTools::LayerFormats) {
            // The source's part is the conversion fragment every pipeline kernel has; one source covers it.
            for (const bool withSource : {true, false}) {
                const std::string text =
                    ProgramText(Language::CudaCpp, PixelFormat::RGBA16, dest, sampler, withSource);
                ASSERT_FALSE(text.empty());
                const auto ptx = Raster::CompileToPtx(text, "sampler_check");
                EXPECT_TRUE(ptx.ptx) << Raster::GetPixelFormatName(dest) << ", sampler "
                                     << Raster::GetPixelFormatName(sampler)
                                     << (withSource ? "" : ", no source") << ":\n"
                                     << ptx.log;
            }
        }
    }
}

TEST(SamplerConversion, UnknownLanguagesAndFormatsGiveNoText) {
    EXPECT_EQ(RasterTools::GetSamplerConversionFragment(PixelFormat::RGBA8, PixelFormat::RGBA8,
                                                        PixelFormat::RGBA16, Language::None),
              nullptr);
    EXPECT_EQ(RasterTools::GetSamplerReferenceConversionFragment(PixelFormat::RGBA8, PixelFormat::IntensityUF,
                                                                 Language::OpenCLC),
              nullptr);
    EXPECT_TRUE(Raster::GetSamplerConversionFragment(Language::None, "", "", "return source;").empty());
    // The same text twice: built once and kept.
    EXPECT_EQ(RasterTools::GetSamplerConversionFragment(PixelFormat::RGBA8, PixelFormat::IA8,
                                                        PixelFormat::CMYKA8, Language::OpenCLC),
              RasterTools::GetSamplerConversionFragment(PixelFormat::RGBA8, PixelFormat::IA8,
                                                        PixelFormat::CMYKA8, Language::OpenCLC));
}

} // namespace
