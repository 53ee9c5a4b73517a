#pragma once
// Shared by the device tests: kernel texts owned by the test, the sample kernel and its expected results.

#include "host/raster/device/ExecuteKernel.h"

#include <gtest/gtest.h>

#include <array>
#include <cstdint>
#include <string>
#include <vector>

namespace DeviceTest {

using namespace Raster;

// Fourteen fragment texts and an entry point, owned here so that descriptors can point into them.
struct KernelText {
    std::array<std::string, HardwareKernelDescriptor::FragmentCount> fragments;
    std::string entryPoint;

    std::string& operator[](HardwareKernelFragment f) { return fragments[static_cast<std::size_t>(f)]; }

    HardwareKernelDescriptor Descriptor() const {
        HardwareKernelDescriptor descriptor;
        for (std::size_t i = 0; i < fragments.size(); ++i)
            descriptor.fragments[i] = fragments[i].c_str();
        descriptor.entryPoint = entryPoint.c_str();
        return descriptor;
    }
};

// A kernel whose whole text is the per-pixel loop fragment.
inline KernelText LoopOnly(std::string text, std::string entryPoint) {
    KernelText kernel;
    kernel[HardwareKernelFragment::PerPixelLoop] = std::move(text);
    kernel.entryPoint = std::move(entryPoint);
    return kernel;
}

// The sample kernel, in both languages: over a width × height grid it sets
//     values[i] = values[i] * scale + params[params_length - 1]
// and inverts red, green and blue (not alpha) of the RGBA8 pixels inside [rect_min, rect_max).
// Its helper lives in the Process fragment and the kernel in the loop fragment, so it only compiles when
// the fragments are pasted callee first. Arguments: values, pixels, params (+ length), width, height,
// rect_min, rect_max, scale.
inline KernelText AdjustKernel(HardwareKernelLanguage language) {
    KernelText kernel;
    kernel.entryPoint = "adjust";
    if (language == HardwareKernelLanguage::OpenCLC) {
        kernel[HardwareKernelFragment::Process] =
            "uchar4 InvertColour(uchar4 p) { return (uchar4)((uchar)(255 - p.x), (uchar)(255 - p.y), "
            "(uchar)(255 - p.z), p.w); }";
        kernel[HardwareKernelFragment::PerPixelLoop] = R"(
kernel void adjust(global float* values, global uchar4* pixels, constant float* params, int params_length,
                   int width, int height, int2 rect_min, int2 rect_max, float scale)
{
    const int x = get_global_id(0), y = get_global_id(1);
    if (x >= width || y >= height) return;
    const int i = y * width + x;
    values[i] = values[i] * scale + params[params_length - 1];
    if (x >= rect_min.x && y >= rect_min.y && x < rect_max.x && y < rect_max.y)
        pixels[i] = InvertColour(pixels[i]);
})";
    } else {
        kernel[HardwareKernelFragment::Process] =
            "struct Colour { static uchar4 Invert(uchar4 p) { return make_uchar4(255 - p.x, 255 - p.y, "
            "255 - p.z, p.w); } };";
        kernel[HardwareKernelFragment::PerPixelLoop] = R"(
extern "C" __global__ void adjust(float* values, uchar4* pixels, const float* params, int params_length,
                                  int width, int height, int2 rect_min, int2 rect_max, float scale)
{
    const int x = blockIdx.x * blockDim.x + threadIdx.x, y = blockIdx.y * blockDim.y + threadIdx.y;
    if (x >= width || y >= height) return;
    const int i = y * width + x;
    values[i] = values[i] * scale + params[params_length - 1];
    if (x >= rect_min.x && y >= rect_min.y && x < rect_max.x && y < rect_max.y)
        pixels[i] = Colour::Invert(pixels[i]);
})";
    }
    return kernel;
}

// The host images the sample kernel starts from: values[i] = i / 2 and RGBA pixels of a strided image.
struct AdjustImages {
    static constexpr int Width = 7;
    static constexpr int Height = 5;
    static constexpr std::size_t PixelStride = Width * 4 + 12; // padded rows, as bitmaps have
    std::vector<float> values;
    std::vector<std::uint8_t> pixels;

    AdjustImages()
        : values(Width * Height)
        , pixels(PixelStride * Height, 0xEE) {
        for (int i = 0; i < Width * Height; ++i)
            values[i] = static_cast<float>(i) * 0.5f;
        for (int y = 0; y < Height; ++y)
            for (int x = 0; x < Width; ++x)
                for (int c = 0; c < 4; ++c)
                    pixels[y * PixelStride + x * 4 + c] = Channel(x, y, c);
    }
    static std::uint8_t Channel(int x, int y, int c) {
        return static_cast<std::uint8_t>(x * 37 + y * 11 + c * 5 + 3);
    }
};

// Compiles and runs the sample kernel on device and checks every value against the formula above, worked out
// by hand for scale 2 and a last parameter of 2.5 over the rectangle [2, 6) × [1, 4).
inline void RunAdjustKernel(const HardwareDevice* device, const KernelText& kernel) {
    AdjustImages images;
    constexpr int W = AdjustImages::Width, H = AdjustImages::Height;
    auto values = CreateHardwareBuffer(device, images.values.data(), W * sizeof(float), W, H, sizeof(float));
    auto pixels = CreateHardwareBuffer(device, images.pixels.data(), AdjustImages::PixelStride, W, H, 4);
    ASSERT_TRUE(values && pixels) << GetLastHardwareError();

    const std::vector<float> params{0.25f, -1.0f, 2.5f};
    HardwareKernelArguments arguments;
    arguments.AddBuffer(values)
        .AddBuffer(pixels)
        .AddParams(params)
        .AddInt(W)
        .AddInt(H)
        .AddInt2(2, 1)
        .AddInt2(6, 4)
        .AddFloat(2.0f);
    ASSERT_TRUE(ExecuteKernel(device, kernel.Descriptor(), W, H, arguments))
        << GetLastHardwareError() << "\n"
        << GetKernelBuildLog(device, kernel.Descriptor());

    std::vector<float> resultValues(W * H, -1.0f);
    std::vector<std::uint8_t> resultPixels(AdjustImages::PixelStride * H, 0x77);
    ASSERT_TRUE(values->Download(resultValues.data(), W * sizeof(float)));
    ASSERT_TRUE(pixels->Download(resultPixels.data(), AdjustImages::PixelStride));
    for (int i = 0; i < W * H; ++i)
        EXPECT_EQ(resultValues[i], static_cast<float>(i) + 2.5f) << "value " << i;
    for (int y = 0; y < H; ++y) {
        for (int x = 0; x < W; ++x) {
            const bool inside = x >= 2 && x < 6 && y >= 1 && y < 4;
            for (int c = 0; c < 4; ++c) {
                const std::uint8_t original = AdjustImages::Channel(x, y, c);
                const int expected = inside && c < 3 ? 255 - original : original;
                EXPECT_EQ(resultPixels[y * AdjustImages::PixelStride + x * 4 + c], expected)
                    << "pixel " << x << "," << y << " channel " << c;
            }
        }
        // A download writes pixels only, never the padding at the end of a row.
        for (std::size_t b = W * 4; b < AdjustImages::PixelStride; ++b)
            EXPECT_EQ(resultPixels[y * AdjustImages::PixelStride + b], 0x77) << "row " << y << " padding";
    }
}

// The first OpenCL device, preferring a GPU; null where no OpenCL platform is installed.
inline Kernel::Counted<HardwareDevice> OpenCLDevice() {
    return Hardware::GetDevice("opencl");
}

} // namespace DeviceTest

#define REQUIRE_OPENCL_DEVICE(name)                                                                          \
    const auto name = ::DeviceTest::OpenCLDevice();                                                          \
    if (!name)                                                                                               \
    GTEST_SKIP() << "no OpenCL device: the ICD loader found no platform (install "                           \
                    "pocl-opencl-icd)"
