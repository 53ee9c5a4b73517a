// Twirl and sphere renders in every layer format: what must stay as it was stays exactly, the processor gives
// the same pixels in every tiling, and the OpenCL device agrees with it within one unit of the stored value,
// under views that zoom, rotate and place the layer away from the origin.

#include "DistortTestSupport.h"

#include "pipeline/Formats.h"
#include "tests/pipeline/LanguageZeroCheck.h"

#include <cmath>
#include <numbers>

namespace {

using namespace RasterTools;
using PipelineTest::Compare;
using PipelineTest::ReadComponents;
using Raster::PixelFormat;

constexpr int Width = 61, Height = 43;

Raster::AffineTransform::Params Affine(double a, double b, double c, double d, double e, double f) {
    Raster::AffineTransform::Params p;
    p.m = {a, b, c, d, e, f};
    return p;
}

struct NamedView {
    const char* name;
    DistortTest::View view;
};

std::vector<NamedView> Views() {
    const double angle = 30.0 * std::numbers::pi / 180.0;
    const double c = std::cos(angle), s = std::sin(angle);
    return {
        {"no view", {}},
        {"zoom 2", {{}, Affine(2.0, 0.0, 0.0, 0.0, 2.0, 0.0)}},
        {"rotated 30 degrees", {{}, Affine(c, -s, 12.5, s, c, -7.25)}},
        {"layer at (40, 25)", {{40.0, 25.0, 101.0, 68.0}, Affine(1.0, 0.0, 40.0, 0.0, 1.0, 25.0)}},
    };
}

// A command kept alive by its host face, rendered through its pipeline face.
struct NamedCommand {
    std::string name;
    Kernel::Counted<RasterCommand> holder;
    const PipelineCommand* command;
};

template <class T>
NamedCommand Named(std::string name, Kernel::Counted<T> command) {
    const PipelineCommand* pipeline = command.Get();
    return {std::move(name), Kernel::Counted<RasterCommand>(command.Get()), pipeline};
}

std::vector<NamedCommand> Commands() {
    using DistortTest::MakeSphere;
    using DistortTest::MakeTwirl;
    return {
        Named("twirl 90 r 25 at the middle", MakeTwirl(90.0, 25.0, UnsetCentre)),
        Named("twirl -400 r 70 off-centre", MakeTwirl(-400.0, 70.0, {12.3, 30.7})),
        Named("sphere 50 r 20 at the middle", MakeSphere(50.0, 20.0, UnsetCentre)),
        Named("sphere -80 r 35 off-centre", MakeSphere(-80.0, 35.0, {40.25, 10.5})),
        Named("sphere 100 r 60 at a pixel centre", MakeSphere(100.0, 60.0, {30.5, 21.5})),
    };
}

class DistortFormats : public testing::TestWithParam<PixelFormat> {};

TEST_P(DistortFormats, EveryTilingAndBothPathsAgree) {
    const PixelFormat format = GetParam();
    const auto source = PipelineTest::MakeImage(format, Width, Height, 11u);
    const auto device = PipelineTest::OpenCLDevice();
    for (const NamedCommand& command : Commands()) {
        for (const NamedView& view : Views()) {
            const auto reference = DistortTest::Render(*command.command, source, 0, nullptr, view.view);
            ASSERT_TRUE(reference);
            for (const bool onDevice : {false, true}) {
                if (onDevice && !device) continue;
                for (const int tile : {0, 37, 32, 512}) {
                    if (!onDevice && tile == 0) continue; // that is the reference
                    const auto result = DistortTest::Render(*command.command, source, tile,
                                                            onDevice ? device : nullptr, view.view);
                    ASSERT_TRUE(result);
                    // The processor's tiles are bit for bit its whole render; the device may round the
                    // mapping's arithmetic differently, by at most one unit of the stored value.
                    if (const auto difference = Compare(*result, *reference, onDevice ? 1.0 : 0.0))
                        ADD_FAILURE() << Raster::GetPixelFormatName(format) << ", " << command.name << ", "
                                      << view.name << ", " << (onDevice ? "device" : "processor")
                                      << ", tiles " << tile << ": " << difference->Describe();
                }
            }
        }
    }
    if (!device) GTEST_SKIP() << "no OpenCL device: only processor tilings were compared";
}

// Renders on the processor and, where there is one, on the device.
std::vector<Kernel::Counted<Raster::DynamicBuffer>>
BothPaths(const PipelineCommand& command, const Kernel::Counted<Raster::DynamicBuffer>& source) {
    std::vector<Kernel::Counted<Raster::DynamicBuffer>> results{DistortTest::Render(command, source, 32)};
    if (const auto device = PipelineTest::OpenCLDevice())
        results.push_back(DistortTest::Render(command, source, 32, device));
    return results;
}

TEST_P(DistortFormats, IdleSettingsChangeNothing) {
    const PixelFormat format = GetParam();
    const auto source = PipelineTest::MakeImage(format, Width, Height, 4u);
    using DistortTest::MakeSphere;
    using DistortTest::MakeTwirl;
    const std::vector<NamedCommand> idle = {
        Named("twirl angle 0", MakeTwirl(0.0, 30.0, UnsetCentre)),
        Named("twirl radius 0", MakeTwirl(120.0, 0.0, {20.5, 20.5})),
        Named("twirl far away", MakeTwirl(120.0, 40.0, {-200.0, 20.0})),
        Named("sphere intensity 0", MakeSphere(0.0, 30.0, UnsetCentre)),
        Named("sphere radius 0", MakeSphere(100.0, 0.0, {20.5, 20.5})),
    };
    for (const NamedCommand& command : idle)
        for (const auto& result : BothPaths(*command.command, source)) {
            ASSERT_TRUE(result) << command.name;
            if (const auto difference = Compare(*result, *source))
                ADD_FAILURE() << command.name << ": " << difference->Describe();
        }
}

// Pixels whose centre lies at or beyond the radius keep their exact value, and the ones inside move.
TEST_P(DistortFormats, PixelsAtOrBeyondTheRadiusStay) {
    const PixelFormat format = GetParam();
    const auto source = PipelineTest::MakeImage(format, Width, Height, 8u);
    const Kernel::PointT<double> centre{30.0, 21.0};
    const double radius = 15.0;
    const std::vector<NamedCommand> commands = {
        Named("twirl", DistortTest::MakeTwirl(250.0, radius, centre)),
        Named("bulge", DistortTest::MakeSphere(100.0, radius, centre)),
        Named("pinch", DistortTest::MakeSphere(-100.0, radius, centre)),
    };
    for (const auto& command : commands)
        for (const auto& result : BothPaths(*command.command, source)) {
            ASSERT_TRUE(result);
            int moved = 0;
            for (int y = 0; y < Height; ++y)
                for (int x = 0; x < Width; ++x) {
                    const double dx = x + 0.5 - centre.x, dy = y + 0.5 - centre.y;
                    const bool changed = ReadComponents(*result, x, y) != ReadComponents(*source, x, y);
                    if (dx * dx + dy * dy >= radius * radius) {
                        ASSERT_FALSE(changed)
                            << command.name << ": (" << x << ", " << y << ") lies outside the circle";
                    }
                    moved += changed;
                }
            EXPECT_GT(moved, 300) << command.name << ": the circle should change";
        }
}

TEST_P(DistortFormats, TheSpheresExactCentreIsItsOwnPixel) {
    const PixelFormat format = GetParam();
    const auto source = PipelineTest::MakeImage(format, Width, Height, 2u);
    for (const double intensity : {100.0, 35.0, -100.0}) {
        const auto sphere = DistortTest::MakeSphere(intensity, 18.0, {20.5, 10.5});
        for (const auto& result : BothPaths(*sphere, source)) {
            ASSERT_TRUE(result);
            EXPECT_EQ(ReadComponents(*result, 20, 10), ReadComponents(*source, 20, 10)) << intensity;
        }
    }
}

// A half turn of the whole circle about a pixel corner maps the pixel beside the centre onto its mirror
// image: with radius 1000 a pixel half a unit from the centre turns by 180 × (999.5 / 1000)^2 ≈ 179.8
// degrees, close enough to land within one pixel.
TEST(DistortRender, AHalfTurnNearTheCentreSwapsNeighbours) {
    const Raster::KernelMath::uchar4 pixels[4] = {
        {10, 20, 30, 255}, {200, 100, 50, 255}, {1, 2, 3, 255}, {90, 80, 70, 255}};
    auto source = Raster::DynamicBuffer::Create(2, 2, PixelFormat::RGBA8);
    ASSERT_TRUE(source);
    for (int i = 0; i < 4; ++i)
        source->Row<Raster::KernelMath::uchar4>(i / 2)[i % 2] = pixels[i];
    const auto twirl = DistortTest::MakeTwirl(180.0, 1000.0, {1.0, 1.0});
    for (const auto& result : BothPaths(*twirl, source)) {
        ASSERT_TRUE(result);
        for (int i = 0; i < 4; ++i) {
            const auto got = ReadComponents(*result, i % 2, i / 2);
            const auto opposite = ReadComponents(*source, 1 - i % 2, 1 - i / 2);
            for (std::size_t c = 0; c < 4; ++c)
                EXPECT_NEAR(got[c], opposite[c], 3.0) << "pixel " << i << " channel " << c;
        }
    }
}

std::string FormatName(const testing::TestParamInfo<PixelFormat>& info) {
    return std::string(Raster::GetPixelFormatName(info.param));
}

INSTANTIATE_TEST_SUITE_P(Layer, DistortFormats, testing::ValuesIn(RasterTools::LayerFormats), FormatName);

} // namespace
