// The lighting records and several coloured lights: defaults, save and load (lights, colours and the bump
// map) and damaged streams, transforms forwarded to every light, the first light as the parameter table's
// view, two coloured lights summed by hand, and a many-light render agreeing on the processor and the device
// in every format and tiling.

#include "PipelineTestSupport.h"

#include "filters/lighting/RasterLightingCommand.h"
#include "pipeline/Formats.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <functional>
#include <limits>

namespace {

using namespace RasterTools;
using PipelineTest::ReadComponents;
using Raster::PixelFormat;

constexpr double Pi = 3.14159265358979323846;

Kernel::Counted<const Raster::DynamicBuffer> Heights(int width, int height, float start) {
    auto map = Raster::DynamicBuffer::Create(width, height, PixelFormat::IntensityUF);
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x)
            map->Row<float>(y)[x] = start + float(x) * 0.25f - float(y);
    return map;
}

bool SameHeights(const Raster::DynamicBuffer& a, const Raster::DynamicBuffer& b) {
    if (a.GetWidth() != b.GetWidth() || a.GetHeight() != b.GetHeight()) return false;
    for (int y = 0; y < a.GetHeight(); ++y)
        if (std::memcmp(a.RowBytes(y), b.RowBytes(y), std::size_t(a.GetWidth()) * sizeof(float)) != 0)
            return false;
    return true;
}

// Two lights unlike each other and unlike the defaults in every field.
LightingParams Varied() {
    LightingParams params;
    params.ambient = 0.35;
    params.diffuse = 0.8;
    params.specular = 0.9;
    params.exponent = 12.0;
    params.ambientColour = {0.25f, 0.5f, 1.0f, 1.0f};
    params.specularColour = {1.0f, 0.75f, 0.125f, 0.5f};
    params.depth = -4.5;
    params.bumpMap = Heights(5, 3, 0.5f);
    params.scaleXToFit = false;
    params.scaleYToFit = true;
    params.bumpMapOpacity = 0.625;
    LightSource spot;
    spot.colour = {1.0f, 0.0f, 0.0f, 1.0f};
    spot.spin = 0.25;
    spot.tilt = 0.75;
    spot.centre = {12.5, -3.25};
    spot.distance = 44.0;
    spot.outerCone = 0.4;
    spot.innerCone = 0.3;
    LightSource directional;
    directional.type = LightSource::Type::Directional;
    directional.colour = {0.0f, 0.5f, 1.0f, 1.0f};
    directional.spin = -1.0;
    directional.tilt = 1.2;
    directional.centre = {3.0, 4.0};
    directional.distance = 7.0;
    params.lights = {spot, directional};
    return params;
}

void ExpectSame(const LightingParams& loaded, const LightingParams& original) {
    LightingParams a = loaded, b = original;
    ASSERT_EQ(bool(a.bumpMap), bool(b.bumpMap));
    if (a.bumpMap) {
        EXPECT_TRUE(SameHeights(*a.bumpMap, *b.bumpMap));
    }
    a.bumpMap = b.bumpMap = nullptr; // compared by content above
    EXPECT_TRUE(a == b);
}

// The first place in a saved stream where the record code stands with room bytes from it and accept holds;
// null where there is none.
std::byte* FindRecord(
    std::vector<std::byte>& bytes, std::uint32_t code, std::size_t room,
    const std::function<bool(const std::byte*)>& accept = [](const std::byte*) { return true; }) {
    for (std::size_t i = 0; i + room <= bytes.size(); ++i)
        if (std::memcmp(bytes.data() + i, &code, 4) == 0 && accept(bytes.data() + i)) return bytes.data() + i;
    return nullptr;
}

std::vector<std::byte> Saved(const LightingParams& params, bool full = true) {
    Kernel::OutSerialiser out;
    params.Save(out, full);
    return out.GetBytes();
}

bool LoadInto(LightingParams& params, const std::vector<std::byte>& bytes) {
    Kernel::FileStore store;
    const Kernel::InSerialiser in(bytes);
    return params.Load(in, LightingParams::GetClassUID(), LightingParams::GetSchemaVersion(), store);
}

TEST(LightingRecords, BothConstructorsGiveTheDocumentedDefaults) {
    const LightSource plain;
    EXPECT_EQ(plain.type, LightSource::Type::Spot);
    EXPECT_EQ(plain.colour, (Renderer::ConsolidatedColour{1.0f, 1.0f, 1.0f, 1.0f}));
    EXPECT_DOUBLE_EQ(plain.spin, 135.0 * Pi / 180.0);
    EXPECT_DOUBLE_EQ(plain.tilt, 30.0 * Pi / 180.0);
    EXPECT_EQ(plain.centre, (Kernel::PointT<double>{0.0, 0.0}));
    EXPECT_EQ(plain.distance, 100.0);
    EXPECT_DOUBLE_EQ(plain.outerCone, 30.0 * Pi / 180.0);
    EXPECT_EQ(plain.innerCone, 0.5);

    // A 300 × 400 document: the middle, and 0.15 × the diagonal of 500.
    const LightSource placed(Kernel::RectT<double>{10.0, 20.0, 310.0, 420.0});
    EXPECT_EQ(placed.centre, (Kernel::PointT<double>{150.0, 200.0}));
    EXPECT_DOUBLE_EQ(placed.distance, 75.0);
    EXPECT_EQ(placed.spin, plain.spin);

    const LightingParams params(Kernel::RectT<double>{0.0, 0.0, 300.0, 400.0});
    EXPECT_EQ(params.ambient, 0.2);
    EXPECT_EQ(params.diffuse, 1.0);
    EXPECT_EQ(params.specular, 0.5);
    EXPECT_EQ(params.exponent, 5.0);
    EXPECT_EQ(params.ambientColour, plain.colour);
    EXPECT_EQ(params.specularColour, plain.colour);
    EXPECT_EQ(params.depth, 0.0);
    EXPECT_FALSE(params.bumpMap);
    EXPECT_TRUE(params.scaleXToFit && params.scaleYToFit);
    EXPECT_EQ(params.bumpMapOpacity, 1.0);
    ASSERT_EQ(params.lights.size(), 1u);
    EXPECT_EQ(params.lights[0].centre, (Kernel::PointT<double>{150.0, 200.0}));
    EXPECT_EQ(LightingParams().lights, std::vector<LightSource>{LightSource()});
}

TEST(LightingRecords, ParamsLightsColoursAndBumpMapSurviveSaveAndLoad) {
    const LightingParams original = Varied();
    LightingParams loaded;
    ASSERT_TRUE(LoadInto(loaded, Saved(original)));
    ExpectSame(loaded, original);

    // Without the lights, a load keeps the lights it had.
    LightingParams surface;
    surface.lights = {LightSource(Kernel::RectT<double>{0.0, 0.0, 8.0, 6.0})};
    const auto kept = surface.lights;
    ASSERT_TRUE(LoadInto(surface, Saved(original, false)));
    EXPECT_EQ(surface.lights, kept);
    EXPECT_EQ(surface.ambientColour, original.ambientColour);

    // An empty list is a list.
    LightingParams dark = original;
    dark.lights.clear();
    LightingParams reloaded;
    ASSERT_TRUE(LoadInto(reloaded, Saved(dark)));
    EXPECT_TRUE(reloaded.lights.empty());

    // Through the command and a whole-object stream, as documents keep it; a copy and a move keep it all.
    const auto command = Kernel::MakeCounted<RasterLightingCommand>(true, original);
    Kernel::FileStore store;
    const auto restored = Kernel::CountedCast<RasterLightingCommand>(
        Kernel::DeserialiseObject(Kernel::SerialiseObject(*command), store));
    ASSERT_TRUE(restored);
    ExpectSame(restored->GetParams(), original);
    LightingParams copy = restored->GetParams();
    const LightingParams moved = std::move(copy);
    ExpectSame(moved, original);
    ExpectSame(Kernel::CountedCast<RasterLightingCommand>(restored->Clone())->GetParams(), original);
}

TEST(LightingRecords, DamagedStreamsAreRefusedAndChangeNothing) {
    const std::vector<std::byte> bytes = Saved(Varied());
    const LightingParams before;
    // Cut anywhere inside a record: the stream does not validate.
    for (const std::size_t keep : {bytes.size() - 1, bytes.size() / 2, std::size_t(7)}) {
        LightingParams params;
        EXPECT_FALSE(LoadInto(params, std::vector<std::byte>(bytes.begin(), bytes.begin() + long(keep))))
            << keep;
        EXPECT_TRUE(params == before);
    }
    // Another class or a newer version.
    {
        LightingParams params;
        Kernel::FileStore store;
        const Kernel::InSerialiser in(bytes);
        EXPECT_FALSE(params.Load(in, LightSource::GetClassUID(), 1, store));
        EXPECT_FALSE(params.Load(in, LightingParams::GetClassUID(), 2, store));
    }
    // Well-formed records whose contents lie: a list that promises more lights than it holds, a bump map
    // whose floats do not fill it, a colour without its blue.
    {
        LightingParams twoLights = Varied();
        std::vector<std::byte> damaged = Saved(twoLights);
        // The count record inside the list: "Cnt ", tag, size 4, then the count. Raise 2 to 3.
        std::byte* count = FindRecord(damaged, Kernel::MakeFourCC("Cnt "), 14,
                                      [](const std::byte* at) { return at[10] == std::byte(2); });
        ASSERT_NE(count, nullptr);
        count[10] = std::byte(3);
        LightingParams params;
        EXPECT_FALSE(LoadInto(params, damaged));
        EXPECT_TRUE(params == before);
    }
    {
        LightingParams mapped = Varied();
        mapped.lights.clear();
        std::vector<std::byte> damaged = Saved(mapped);
        // The bump map's width: 5 becomes 6, so its 15 floats no longer fill it.
        std::byte* width = FindRecord(damaged, Kernel::MakeFourCC("Wdth"), 14);
        ASSERT_NE(width, nullptr);
        width[10] = std::byte(6);
        LightingParams params;
        EXPECT_FALSE(LoadInto(params, damaged));
        EXPECT_TRUE(params == before);
    }
    {
        LightingParams coloured = Varied();
        std::vector<std::byte> damaged = Saved(coloured);
        // Rename the first "Blue" record: the colour it belongs to is incomplete.
        std::byte* blue = FindRecord(damaged, Kernel::MakeFourCC("Blue"), 4);
        ASSERT_NE(blue, nullptr);
        blue[0] = std::byte('X');
        LightingParams params;
        EXPECT_FALSE(LoadInto(params, damaged));
    }
    // A damaged command does not load either.
    const auto command = Kernel::MakeCounted<RasterLightingCommand>(false, Varied());
    auto object = Kernel::SerialiseObject(*command);
    object.resize(object.size() - 3);
    Kernel::FileStore store;
    EXPECT_FALSE(Kernel::DeserialiseObject(object, store));
}

TEST(LightingRecords, TransformsReachEveryLightAndHostileValuesAreBounded) {
    LightingParams params = Varied();
    params.lights[1].centre = {std::numeric_limits<double>::quiet_NaN(), 0.0};
    Raster::AffineTransform::Params layer;
    layer.m = {2.0, 0.0, 3.0, 0.0, 2.0, 4.0};
    params.ApplyTransform(layer);
    EXPECT_EQ(params.lights[0].centre, (Kernel::PointT<double>{28.0, -2.5}));
    EXPECT_EQ(params.lights[0].distance, 88.0);
    EXPECT_TRUE(std::isnan(params.lights[1].centre.x)); // unset stays unset
    EXPECT_EQ(params.lights[1].distance, 14.0);
    EXPECT_TRUE(params.ApplyInverseTransform(layer));
    EXPECT_EQ(params.lights[0].centre, (Kernel::PointT<double>{12.5, -3.25}));
    EXPECT_EQ(params.lights[1].distance, 7.0);

    // The command forwards to its params.
    const auto command = Kernel::MakeCounted<RasterLightingCommand>(false, Varied());
    command->ApplyTransform(layer);
    EXPECT_EQ(command->GetParams().lights[1].centre, (Kernel::PointT<double>{9.0, 12.0}));
    EXPECT_EQ(command->GetCentre(), (Kernel::PointT<double>{28.0, -2.5})); // the table shows the first

    const double nan = std::numeric_limits<double>::quiet_NaN(),
                 inf = std::numeric_limits<double>::infinity();
    LightingParams hostile;
    hostile.ambient = nan;
    hostile.exponent = inf;
    hostile.ambientColour = {float(nan), 1.0f, float(inf), 0.0f};
    hostile.lights = {LightSource()};
    hostile.lights[0].spin = inf;
    hostile.lights[0].distance = -inf;
    hostile.lights[0].type = LightSource::Type(77);
    const auto bounded = Kernel::MakeCounted<RasterLightingCommand>(false, hostile);
    const auto block = bounded->GetSamplerParams({0.0, 0.0, 10.0, 10.0}, {});
    for (const float f : block.block)
        ASSERT_TRUE(std::isfinite(f));
    // A kind past the directional light renders as one, as the table shows it.
    EXPECT_EQ(block.block[LightingMath::LightingFirstLight + LightingMath::LightingLightType], 2.0f);
}

TEST(LightingRecords, TheTableIsTheFirstLightsViewAndPanelsChangeOnlyWhatTheyShow) {
    LightingParams params = Varied();
    params.lights[0].spin = 0.1; // not a whole number of degrees: the table's degrees do not round back
    const auto command = Kernel::MakeCounted<RasterLightingCommand>(true, params);
    const LightingParameters& table = command->GetParameters();
    EXPECT_NEAR(table.spin, 0.1 * 180.0 / Pi, 1e-9); // degrees to a billionth
    EXPECT_EQ(table.lightType, 0);
    EXPECT_EQ(table.ambient, 0.35);
    EXPECT_EQ(command->GetParams().lights[0].spin, 0.1); // exactly, not through degrees
    // A panel edit on the table (reflection writes the table's fields) reaches the first light alone.
    for (auto& reflected : command->EnumerateReflecteds())
        if (reflected->GetIdentifier() == Kernel::MakeFourCC("tilt")) {
            ASSERT_TRUE(reflected->SetValueText("60"));
        }
    const LightingParams after = command->GetParams();
    EXPECT_DOUBLE_EQ(after.lights[0].tilt, Pi / 3.0);
    EXPECT_EQ(after.lights[0].spin, 0.1);
    EXPECT_EQ(after.lights[1], params.lights[1]);
    EXPECT_EQ(after.ambientColour, params.ambientColour);
    // The short form is one white light.
    LightingParameters one;
    one.lightType = 1;
    one.centre = {4.0, 5.0};
    one.distance = 9.0;
    const auto single = Kernel::MakeCounted<RasterLightingCommand>(false, one).Get()->GetParams();
    ASSERT_EQ(single.lights.size(), 1u);
    EXPECT_EQ(single.lights[0].type, LightSource::Type::Point);
    EXPECT_EQ(single.lights[0].centre, (Kernel::PointT<double>{4.0, 5.0}));
    EXPECT_EQ(single.lights[0].colour, (Renderer::ConsolidatedColour{1.0f, 1.0f, 1.0f, 1.0f}));
}

// Two point lights over a flat grey surface at (4, 4), exponent 1: a red one straight above (l = (0, 0, -1):
// ta = 1, rz = 2·1 − 1 = 1) and a blue-green one 3 pixels along x and 4 up (l = (3, 0, −4) / 5: ta = 0.8,
// rz = 1.6 − 0.8 = 0.8). Per channel, with pixel 0.5, ambient 0.2 × (1, 1, 0.5), specular 0.5 × (1, 0.5, 1):
//   R: 0.5 × (1 + 0.2)         + 1 × 1 × 0.5           = 1.1
//   G: 0.5 × (0.5·0.8 + 0.2)   + 0.5·0.8 × 0.5 × 0.5   = 0.4
//   B: 0.5 × (0.8 + 0.2 × 0.5) + 0.8 × 1 × 0.5         = 0.85
// and alone, the red light leaves green and blue with the ambient light: 0.1 and 0.05.
TEST(LightingRecords, TwoColouredLightsSumAsWorkedByHandOnEveryPath) {
    LightingParams params;
    params.ambient = 0.2;
    params.ambientColour = {1.0f, 1.0f, 0.5f, 1.0f};
    params.specular = 0.5;
    params.specularColour = {1.0f, 0.5f, 1.0f, 1.0f};
    params.exponent = 1.0;
    params.depth = 1.0;
    LightSource red;
    red.type = LightSource::Type::Point;
    red.colour = {1.0f, 0.0f, 0.0f, 1.0f};
    red.centre = {4.0, 4.0};
    red.distance = 10.0;
    LightSource teal = red;
    teal.colour = {0.0f, 0.5f, 1.0f, 1.0f};
    teal.centre = {7.0, 4.0};
    teal.distance = 4.0;
    const float grey[4] = {0.5f, 0.5f, 0.5f, 1.0f};
    const auto source = PipelineTest::MakeFilled(PixelFormat::RGBAUF, 9, 9, grey);
    const auto device = PipelineTest::OpenCLDevice();
    struct Case {
        std::vector<LightSource> lights;
        double r, g, b;
    };
    for (const Case& c : {Case{{red, teal}, 1.1, 0.4, 0.85}, Case{{red}, 1.1, 0.1, 0.05}}) {
        params.lights = c.lights;
        const auto command = Kernel::MakeCounted<RasterLightingCommand>(false, params);
        for (const bool onDevice : {false, true}) {
            if (onDevice && !device) continue;
            SCOPED_TRACE(onDevice ? "device" : "processor");
            const auto out = PipelineTest::Render(*command, source, 4, onDevice ? device : nullptr);
            ASSERT_TRUE(out);
            const auto lit = ReadComponents(*out, 4, 4);
            EXPECT_NEAR(lit[0], c.r, 1e-6);
            EXPECT_NEAR(lit[1], c.g, 1e-6);
            EXPECT_NEAR(lit[2], c.b, 1e-6);
            EXPECT_EQ(lit[3], 1.0);
        }
    }
    if (!device) GTEST_SKIP() << "no OpenCL device: the device path was not checked";
}

// A bump map of 1.0 everywhere over a 4 × 3 layer that it fits exactly, depth 2 (normal z 2 / 2 = 1),
// lit from straight above by a directional light with diffuse 1 and nothing else. Inside, the heights are
// equal: the flat rule gives −direction.z = 1. At the left edge the height outside is 0: n = (1, 0, 1) / √2
// and the pixel takes 1 / √2; in the bottom right corner n = (−1, −1, 1) / √3 and 1 / √3. A map of half the
// size stretched over the layer reads its pixels twice as far apart.
TEST(LightingBumpMap, TheBumpMapsBorderSlopesToZeroOnEveryPath) {
    auto ones = Raster::DynamicBuffer::Create(4, 3, PixelFormat::IntensityUF);
    for (int y = 0; y < 3; ++y)
        for (int x = 0; x < 4; ++x)
            ones->Row<float>(y)[x] = 1.0f;
    LightingParams params;
    params.ambient = 0.0;
    params.specular = 0.0;
    params.depth = 2.0;
    params.bumpMap = ones;
    LightSource above;
    above.type = LightSource::Type::Directional;
    above.tilt = Pi / 2.0;
    params.lights = {above};
    // Red 1 with a blue that cancels its luminance: the layer's own relief would be all but flat, so a slope
    // at the border can only be the map's.
    const float red[4] = {1.0f, 0.0f, -0.2126f / 0.0722f, 1.0f};
    const auto source = PipelineTest::MakeFilled(PixelFormat::RGBAUF, 4, 3, red);
    const auto device = PipelineTest::OpenCLDevice();
    const auto command = Kernel::MakeCounted<RasterLightingCommand>(false, params);
    for (const bool onDevice : {false, true}) {
        if (onDevice && !device) continue;
        SCOPED_TRACE(onDevice ? "device" : "processor");
        const auto out = PipelineTest::Render(*command, source, 2, onDevice ? device : nullptr);
        ASSERT_TRUE(out);
        EXPECT_NEAR(ReadComponents(*out, 1, 1)[0], 1.0, 1e-6);
        EXPECT_NEAR(ReadComponents(*out, 2, 1)[0], 1.0, 1e-6);
        EXPECT_NEAR(ReadComponents(*out, 0, 1)[0], 1.0 / std::sqrt(2.0), 1e-6);
        EXPECT_NEAR(ReadComponents(*out, 3, 2)[0], 1.0 / std::sqrt(3.0), 1e-6);
        EXPECT_EQ(ReadComponents(*out, 3, 2)[3], 1.0);
    }
    // Without the map, the layer's own relief: flat to within its float rounding.
    LightingParams own = params;
    own.bumpMap = nullptr;
    const auto plain =
        PipelineTest::Render(*Kernel::MakeCounted<RasterLightingCommand>(false, own), source, 0);
    ASSERT_TRUE(plain);
    EXPECT_NEAR(ReadComponents(*plain, 0, 1)[0], 1.0, 1e-6);
    // Half the size, fitted: pixel x sits at map column x / 2 and its neighbours one map pixel either side,
    // truncated toward zero: pixel 1 reads columns 0 (from −0.5) and 1, flat; pixel 0 reads −1 and pixel 2
    // reads 2, both outside.
    auto half = Raster::DynamicBuffer::Create(2, 3, PixelFormat::IntensityUF);
    for (int y = 0; y < 3; ++y)
        half->Row<float>(y)[0] = half->Row<float>(y)[1] = 1.0f;
    params.bumpMap = half;
    const auto fitted =
        PipelineTest::Render(*Kernel::MakeCounted<RasterLightingCommand>(false, params), source, 0);
    ASSERT_TRUE(fitted);
    EXPECT_NEAR(ReadComponents(*fitted, 0, 1)[0], 1.0 / std::sqrt(2.0), 1e-6);
    EXPECT_NEAR(ReadComponents(*fitted, 1, 1)[0], 1.0, 1e-6);
    EXPECT_NEAR(ReadComponents(*fitted, 2, 1)[0], 1.0 / std::sqrt(2.0), 1e-6);
    // One map pixel per layer pixel: pixels 0 and 1 reach outside the map; pixel 3's heights are all
    // outside it, 0, so flat.
    params.scaleXToFit = false;
    const auto unfitted =
        PipelineTest::Render(*Kernel::MakeCounted<RasterLightingCommand>(false, params), source, 0);
    ASSERT_TRUE(unfitted);
    EXPECT_NEAR(ReadComponents(*unfitted, 0, 1)[0], 1.0 / std::sqrt(2.0), 1e-6);
    EXPECT_NEAR(ReadComponents(*unfitted, 1, 1)[0], 1.0 / std::sqrt(2.0), 1e-6);
    EXPECT_NEAR(ReadComponents(*unfitted, 3, 1)[0], 1.0, 1e-6);
    if (!device) GTEST_SKIP() << "no OpenCL device: the device path was not checked";
}

// Tile shapes as the registry's sweep uses them: odd, aligned, shifted, narrower than a span.
struct Tiling {
    int width, height, originX, originY;
};
constexpr Tiling Tilings[] = {{13, 11, 0, 0}, {32, 32, 0, 0}, {45, 23, 5, 3}, {7, 64, 0, 0}};

TEST(LightingRecords, ManyColouredLightsAgreeOnTheProcessorAndTheDeviceInEveryFormatAndTiling) {
    LightingParams params = Varied();
    params.bumpMap = nullptr; // the layer's own relief
    params.depth = 3.0;
    LightSource point;
    point.type = LightSource::Type::Point;
    point.colour = {0.5f, 1.0f, 0.25f, 1.0f};
    point.centre = {30.0, 20.0};
    point.distance = 12.0;
    LightSource unknown = point;
    unknown.type = LightSource::Type(-3); // skipped
    LightSource unset;                    // aimed at the middle from the default reach
    unset.centre = UnsetLightCentre;
    unset.distance = 0.0;
    unset.colour = {0.75f, 0.25f, 0.5f, 1.0f};
    params.lights.insert(params.lights.end(), {point, unknown, unset});
    LightingParams bumped = params;
    bumped.bumpMap = Heights(10, 7, -0.75f); // stretched across the layer, and beyond its bounds
    bumped.scaleYToFit = false;
    const auto device = PipelineTest::OpenCLDevice();
    for (const auto& command : {Kernel::MakeCounted<RasterLightingCommand>(false, params),
                                Kernel::MakeCounted<RasterLightingCommand>(false, bumped)})
        for (const PixelFormat format : LayerFormats) {
            SCOPED_TRACE(Raster::GetPixelFormatName(format));
            SCOPED_TRACE(command->GetParams().bumpMap ? "with a bump map" : "the layer's own relief");
            const auto source = PipelineTest::MakeImage(format, 37, 29, 17u);
            RenderTarget base;
            base.source.pixels = source;
            const auto reference = PipelineTest::MakeDestination(*command, *source);
            base.destination.pixels = reference;
            ASSERT_EQ(PipelineTest::RenderTiled(*command, base, 0, 0).processor, 1);
            const bool lab = format == PixelFormat::LabA16;
            for (const bool onDevice : {false, true}) {
                if (onDevice && !device) continue;
                for (const Tiling& tiling : Tilings) {
                    RenderTarget target = base;
                    target.destination.pixels = PipelineTest::MakeDestination(*command, *source);
                    if (onDevice) {
                        target.device = device;
                        target.source.cache = Raster::HardwareCache::Create(target.source.pixels);
                        target.destination.cache = Raster::HardwareCache::Create(target.destination.pixels);
                        ASSERT_TRUE(command->PrepareDevice(target)) << Raster::GetLastHardwareError();
                    }
                    const auto paths = PipelineTest::RenderTiled(
                        *command, target, tiling.width, tiling.height, tiling.originX, tiling.originY);
                    EXPECT_EQ(paths.other, 0);
                    if (onDevice) {
                        EXPECT_EQ(paths.processor, 0) << Raster::GetLastHardwareError();
                    }
                    const auto difference =
                        PipelineTest::Compare(*target.destination.pixels, *reference, lab ? 1.0 : 0.0);
                    if (difference)
                        ADD_FAILURE() << (onDevice ? "device" : "processor") << ", tiles " << tiling.width
                                      << "x" << tiling.height << " differ at " << difference->Describe();
                }
            }
        }
    if (!device) GTEST_SKIP() << "no OpenCL device: the device renders were not compared";
}

} // namespace
