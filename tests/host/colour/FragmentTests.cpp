// The Lab kernel text against the colour manager: language 0 compiled into this program, language 1 run on
// the OpenCL device, language 0 compiled by NVRTC (and run where a CUDA device exists). Both are made of the
// source the processor compiles, so every stored LabA16 value of the grid and every working colour must
// convert to exactly the processor's bits.

#include "ColourTestSupport.h"

#include "host/raster/LabFragments.h"
#include "host/raster/device/CudaCompiler.h"
#include "host/raster/device/ExecuteKernel.h"

#include <gtest/gtest.h>

#include <math.h>

#include <algorithm>
#include <bit>
#include <cstring>
#include <string>

// The language-0 text exactly as the host hands it out (written at build time by lab_fragment_dump), over
// what CUDA supplies and it uses: float4, make_float4 and the bit casts. Built without contraction, as the
// kernels are.
namespace HostText {
struct float4 {
    float x, y, z, w;
};
inline float4 make_float4(float x, float y, float z, float w) {
    return {x, y, z, w};
}
inline int __float_as_int(float v) {
    return std::bit_cast<int>(v);
}
inline float __int_as_float(int v) {
    return std::bit_cast<float>(v);
}
#include "LabFragmentCpp.inc"
} // namespace HostText

using namespace ColourTest;
using namespace Raster;

namespace {

// What the LabA16 traits do around the two functions: stored / 65535 in, and "* 65535 + 0.5" truncated out.
RGBPixel HostTextToRGB(const LabPixel& lab) {
    const HostText::float4 in{lab[0] / 65535.0f, lab[1] / 65535.0f, lab[2] / 65535.0f, lab[3] / 65535.0f};
    const HostText::float4 out = HostText::labaf_to_rgbauf(in);
    return {out.x, out.y, out.z, out.w};
}

LabPixel HostTextToLab(const RGBPixel& rgb) {
    const HostText::float4 out = HostText::rgbauf_to_labaf({rgb[0], rgb[1], rgb[2], rgb[3]});
    const auto store = [](float v) { return static_cast<std::uint16_t>(v * 65535.0f + 0.5f); };
    return {store(out.x), store(out.y), store(out.z), store(out.w)};
}

// The same bits, alpha included.
::testing::AssertionResult RGBAgrees(const RGBPixel& text, const RGBPixel& processor) {
    if (std::memcmp(text.data(), processor.data(), sizeof text) == 0) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure()
           << "text " << text[0] << " " << text[1] << " " << text[2] << " " << text[3] << ", processor "
           << processor[0] << " " << processor[1] << " " << processor[2] << " " << processor[3];
}

::testing::AssertionResult LabAgrees(const LabPixel& text, const LabPixel& processor) {
    if (text == processor) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure()
           << "text " << text[0] << " " << text[1] << " " << text[2] << " " << text[3] << ", processor "
           << processor[0] << " " << processor[1] << " " << processor[2] << " " << processor[3];
}

std::string Describe(const LabPixel& p) {
    return std::to_string(p[0]) + " " + std::to_string(p[1]) + " " + std::to_string(p[2]) + " " +
           std::to_string(p[3]);
}
std::string Describe(const RGBPixel& p) {
    return std::to_string(p[0]) + " " + std::to_string(p[1]) + " " + std::to_string(p[2]) + " " +
           std::to_string(p[3]);
}

// The agreement kernel: converts a grid of stored Lab pixels to working colours and a grid of working colours
// to stored Lab pixels, through the traits' own expressions.
const char* const OpenCLLoop = R"(
kernel void lab_agreement(global const ushort4* lab_in, global float4* rgb_out, global const float4* rgb_in,
                          global ushort4* lab_out, int width, int height)
{
    const int x = get_global_id(0), y = get_global_id(1);
    if (x >= width || y >= height) return;
    const int i = y * width + x;
    rgb_out[i] = labaf_to_rgbauf(convert_float4(lab_in[i]) / 65535.0f);
    lab_out[i] = convert_ushort4(rgbauf_to_labaf(rgb_in[i]) * 65535.0f + 0.5f);
}
)";

const char* const CudaLoop = R"(
extern "C" __global__ void lab_agreement(const ushort4* lab_in, float4* rgb_out, const float4* rgb_in,
                                         ushort4* lab_out, int width, int height)
{
    const int x = blockIdx.x * blockDim.x + threadIdx.x, y = blockIdx.y * blockDim.y + threadIdx.y;
    if (x >= width || y >= height) return;
    const int i = y * width + x;
    const ushort4 s = lab_in[i];
    float4 lab;
    lab.x = s.x / 65535.0f;
    lab.y = s.y / 65535.0f;
    lab.z = s.z / 65535.0f;
    lab.w = s.w / 65535.0f;
    rgb_out[i] = labaf_to_rgbauf(lab);
    const float4 l = rgbauf_to_labaf(rgb_in[i]);
    ushort4 o;
    o.x = (unsigned short)(l.x * 65535.0f + 0.5f);
    o.y = (unsigned short)(l.y * 65535.0f + 0.5f);
    o.z = (unsigned short)(l.z * 65535.0f + 0.5f);
    o.w = (unsigned short)(l.w * 65535.0f + 0.5f);
    lab_out[i] = o;
}
)";

struct AgreementKernel {
    std::array<std::string, HardwareKernelDescriptor::FragmentCount> fragments;

    explicit AgreementKernel(HardwareKernelLanguage language) {
        const char* lab = GetLabConversionFragment(static_cast<int>(language));
        fragments[static_cast<std::size_t>(HardwareKernelFragment::Conversion)] = lab ? lab : "";
        fragments[static_cast<std::size_t>(HardwareKernelFragment::PerPixelLoop)] =
            language == HardwareKernelLanguage::OpenCLC ? OpenCLLoop : CudaLoop;
    }
    HardwareKernelDescriptor Descriptor() const {
        HardwareKernelDescriptor descriptor;
        for (std::size_t i = 0; i < fragments.size(); ++i)
            descriptor.fragments[i] = fragments[i].c_str();
        descriptor.entryPoint = "lab_agreement";
        return descriptor;
    }
};

// Runs the agreement kernel on the device over both grids and compares every pixel with the processor.
void CheckDeviceAgainstProcessor(const HardwareDevice* device) {
    const auto labGrid = LabGrid();
    auto rgbGrid = RGBGrid();
    const auto hostile = HostileColours();
    rgbGrid.insert(rgbGrid.begin(), hostile.begin(), hostile.end());
    constexpr int Width = 256;
    const int height = static_cast<int>((std::max(labGrid.size(), rgbGrid.size()) + Width - 1) / Width);
    const std::size_t total = std::size_t(Width) * height;
    // Both inputs fill the whole grid, the shorter one by repeating itself.
    std::vector<LabPixel> labIn(total);
    std::vector<RGBPixel> rgbIn(total);
    for (std::size_t i = 0; i < total; ++i) {
        labIn[i] = labGrid[i % labGrid.size()];
        rgbIn[i] = rgbGrid[i % rgbGrid.size()];
    }
    auto labInBuffer = CreateHardwareBuffer(device, labIn.data(), Width * 8, Width, height, 8);
    auto rgbOutBuffer = CreateHardwareBuffer(device, nullptr, 0, Width, height, 16);
    auto rgbInBuffer = CreateHardwareBuffer(device, rgbIn.data(), Width * 16, Width, height, 16);
    auto labOutBuffer = CreateHardwareBuffer(device, nullptr, 0, Width, height, 8);
    ASSERT_TRUE(labInBuffer && rgbOutBuffer && rgbInBuffer && labOutBuffer) << GetLastHardwareError();

    const AgreementKernel kernel(device->GetLanguage());
    HardwareKernelArguments arguments;
    arguments.AddBuffer(labInBuffer)
        .AddBuffer(rgbOutBuffer)
        .AddBuffer(rgbInBuffer)
        .AddBuffer(labOutBuffer)
        .AddInt(Width)
        .AddInt(height);
    ASSERT_TRUE(ExecuteKernel(device, kernel.Descriptor(), Width, height, arguments))
        << GetLastHardwareError() << "\n"
        << GetKernelBuildLog(device, kernel.Descriptor());

    std::vector<RGBPixel> rgbOut(total);
    std::vector<LabPixel> labOut(total);
    ASSERT_TRUE(rgbOutBuffer->Download(rgbOut.data(), Width * 16));
    ASSERT_TRUE(labOutBuffer->Download(labOut.data(), Width * 8));
    for (std::size_t i = 0; i < labGrid.size(); ++i)
        ASSERT_TRUE(RGBAgrees(rgbOut[i], ToRGB(labGrid[i]))) << "stored Lab " << Describe(labGrid[i]);
    for (std::size_t i = 0; i < rgbGrid.size(); ++i)
        ASSERT_TRUE(LabAgrees(labOut[i], ToLab(rgbGrid[i]))) << "working colour " << Describe(rgbGrid[i]);
}

std::string NvrtcText() {
    return std::string(GetLabConversionFragment(0)) + CudaLoop;
}

} // namespace

TEST(LabKernelText, LanguageZeroOnTheHostAgreesWithTheProcessorOverStoredLab) {
    for (const LabPixel& lab : LabGrid()) {
        const RGBPixel processor = ToRGB(lab);
        ASSERT_TRUE(RGBAgrees(HostTextToRGB(lab), processor)) << "stored Lab " << Describe(lab);
        // And back: the text's own round trip lands where the processor's does.
        ASSERT_TRUE(LabAgrees(HostTextToLab(processor), ToLab(processor))) << "stored Lab " << Describe(lab);
    }
}

TEST(LabKernelText, LanguageZeroOnTheHostAgreesWithTheProcessorOverWorkingColours) {
    for (const RGBPixel& rgb : RGBGrid())
        ASSERT_TRUE(LabAgrees(HostTextToLab(rgb), ToLab(rgb))) << "working colour " << Describe(rgb);
    for (const RGBPixel& rgb : HostileColours())
        ASSERT_TRUE(LabAgrees(HostTextToLab(rgb), ToLab(rgb))) << "working colour " << Describe(rgb);
    // Alpha outside 0..1 clamps as on the processor.
    EXPECT_EQ(HostTextToLab({0.5f, 0.5f, 0.5f, -0.5f})[3], 0);
    EXPECT_EQ(HostTextToLab({0.5f, 0.5f, 0.5f, 2.0f})[3], 65535);
}

TEST(LabKernelText, NeutralStoredValuesHaveNoChromaInTheText) {
    // The neutral point of a and b cancels exactly, so grey stays grey to the last bit of the text's float.
    for (int l = 0; l <= 65535; l += 257) {
        const RGBPixel rgb = HostTextToRGB({static_cast<std::uint16_t>(l), 32768, 32768, 65535});
        EXPECT_NEAR(rgb[0], rgb[1], 2e-6f * std::max(1.0f, rgb[1])) << l;
        EXPECT_NEAR(rgb[2], rgb[1], 2e-6f * std::max(1.0f, rgb[1])) << l;
    }
}

TEST(LabKernelText, OnlyTheTwoKernelLanguagesHaveText) {
    ASSERT_NE(GetLabConversionFragment(0), nullptr);
    ASSERT_NE(GetLabConversionFragment(1), nullptr);
    EXPECT_EQ(GetLabConversionFragment(-1), nullptr);
    EXPECT_EQ(GetLabConversionFragment(2), nullptr);
    for (int language : {0, 1}) {
        const std::string text = GetLabConversionFragment(language);
        EXPECT_NE(text.find("float4 labaf_to_rgbauf(float4 lab)"), std::string::npos) << language;
        EXPECT_NE(text.find("float4 rgbauf_to_labaf(float4 rgb)"), std::string::npos) << language;
    }
}

TEST(LabKernelText, OpenCLDeviceAgreesWithTheProcessor) {
    const auto device = Hardware::GetDevice("opencl");
    if (!device)
        GTEST_SKIP() << "no OpenCL device: the ICD loader found no platform (install pocl-opencl-icd)";
    std::cout << "[ info     ] " << device->Describe() << "\n";
    CheckDeviceAgainstProcessor(device.Get());
}

TEST(LabKernelText, NvrtcCompilesLanguageZero) {
    if (!IsNvrtcAvailable())
        GTEST_SKIP() << "NVRTC not found, language 0 is not compiled here: " << DescribeNvrtc();
    const auto result = CompileToPtx(NvrtcText(), "lab_agreement");
    ASSERT_TRUE(result.ptx) << result.log;
    EXPECT_NE(result.ptx->find(".entry lab_agreement"), std::string::npos);
}

TEST(LabKernelText, CudaDeviceAgreesWithTheProcessor) {
    const auto device = Hardware::GetDevice("cuda");
    if (!device) GTEST_SKIP() << "no CUDA device (needs libcuda, NVRTC and a GPU)";
    CheckDeviceAgainstProcessor(device.Get());
}
