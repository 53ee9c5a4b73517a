// rastertools apply addnoise as a user runs it: the same file from the processor and the OpenCL device, and
// from every tile size, in every layer format (--format converts the input when it is read).

#include "host/io/ImageIO.h"
#include "host/raster/PixelFormat.h"
#include "tests/app/CommandLineSupport.h"

namespace {

using AppTests::Result;

class ApplyNoise : public AppTests::CommandLine {
protected:
    std::string Bytes(const std::string& name) {
        std::string bytes;
        const auto error = Kernel::ReadWholeFile(m_Folder / name, bytes, 1 << 24);
        EXPECT_FALSE(error) << name << ": " << error.value_or("");
        return bytes;
    }

    // A 16-bit RGBA gradient with varied alpha, 83 × 45 pixels.
    void WriteInput(const std::string& name) {
        auto image = Raster::DynamicBuffer::Create(83, 45, Raster::PixelFormat::RGBA16);
        ASSERT_TRUE(image);
        for (int y = 0; y < 45; ++y) {
            auto* row = reinterpret_cast<std::uint16_t*>(image->RowBytes(y));
            for (int x = 0; x < 83; ++x) {
                row[4 * x + 0] = std::uint16_t(x * 789);
                row[4 * x + 1] = std::uint16_t(y * 1456);
                row[4 * x + 2] = std::uint16_t((x * y * 37) & 0xFFFF);
                row[4 * x + 3] = std::uint16_t(65535 - x * 100);
            }
        }
        const auto written = IO::WriteImage(m_Folder / name, *image);
        ASSERT_TRUE(written) << written.error;
    }
};

TEST_F(ApplyNoise, DeviceAndTilesGiveIdenticalFilesInEveryFormat) {
    WriteInput("in.png");
    const bool opencl = Run("apply addnoise --device opencl in.png probe.tif").exitCode == 0;
    for (const char* format : {"rgba8", "rgba16", "rgbauf", "ia8", "ia16", "cmyka8", "laba16"}) {
        for (const char* kind :
             {"--intensity 30 --mono false --gaussian true", "--intensity 30 --mono true --gaussian false"}) {
            const std::string common = std::string("apply addnoise ") + kind + " --format " + format + " ";
            const Result reference = Run(common + "--device cpu --tile 512 in.png cpu512.tif");
            ASSERT_EQ(reference.exitCode, 0) << reference.output;
            const Result tiled = Run(common + "--device cpu --tile 37 in.png cpu37.tif");
            ASSERT_EQ(tiled.exitCode, 0) << tiled.output;
            EXPECT_EQ(Bytes("cpu37.tif"), Bytes("cpu512.tif"))
                << format << ", " << kind << ": tiles 37 and 512";
            const Result plain = Run(std::string("apply addnoise --intensity 0 --format ") + format +
                                     " --device cpu in.png unchanged.tif");
            ASSERT_EQ(plain.exitCode, 0) << plain.output;
            EXPECT_NE(Bytes("unchanged.tif"), Bytes("cpu512.tif")) << format << ", " << kind << ": no noise";
            if (!opencl) continue;
            for (const char* tile : {"37", "512"}) {
                const Result device = Run(common + "--device opencl --tile " + tile + " in.png device.tif");
                ASSERT_EQ(device.exitCode, 0) << device.output;
                EXPECT_EQ(Bytes("device.tif"), Bytes("cpu512.tif"))
                    << format << ", " << kind << ": OpenCL with tiles of " << tile;
            }
        }
    }
    if (!opencl) GTEST_SKIP() << "no OpenCL device: only processor tilings were compared";
}

TEST_F(ApplyNoise, AnUnknownFormatIsAUsageError) {
    WriteInput("in.png");
    const Result result = Run("apply addnoise --intensity 0.3 --format rgb7 in.png out.tif");
    EXPECT_NE(result.exitCode, 0);
    EXPECT_NE(result.output.find("not a layer format"), std::string::npos) << result.output;
}

} // namespace
