// Flattening documents: "over" compositing worked out by hand across formats, placement, live filter layers,
// skipped filters, tiling invariance, and direct pixel changes with their undo.

#include "host/document/DocumentRender.h"
#include "host/document/PixelEffect.h"
#include "tests/host/document/PixelDocumentSupport.h"

#include <cstring>
#include <gtest/gtest.h>

using namespace DocumentTests;
using Raster::PixelFormat;

namespace {

Kernel::Counted<RasterNode> AddRaster(Document& document, Kernel::Counted<Raster::DynamicBuffer> pixels,
                                      Kernel::PointT<int> offset = {}) {
    auto node = Kernel::MakeCounted<RasterNode>("layer " + std::to_string(document.GetLayers().size()),
                                                std::move(pixels), offset);
    document.InsertLayer(document.GetLayers().size(), node);
    return node;
}

template <class T>
T At(const Raster::DynamicBuffer& image, int x, int y, int component) {
    T value;
    std::memcpy(&value,
                image.RowBytes(y) + std::size_t(x) * std::size_t(image.GetBytesPerPixel()) +
                    sizeof(T) * component,
                sizeof(T));
    return value;
}

std::vector<int> Pixel8(const Raster::DynamicBuffer& image, int x, int y) {
    std::vector<int> pixel;
    for (int c = 0; c < Raster::GetChannelCount(image.GetFormat()); ++c)
        pixel.push_back(At<std::uint8_t>(image, x, y, c));
    return pixel;
}

} // namespace

TEST(Compositing, OverIsWorkedOutOnStraightAlphaAcrossFormats) {
    {
        // Half-transparent red over opaque blue: alpha 128/255 ≈ 0.50196 of red, the rest of blue.
        Document document;
        AddRaster(document, MakeFilled(2, 1, PixelFormat::RGBA8, {0, 0, 1, 1}));
        AddRaster(document, MakeFilled(2, 1, PixelFormat::RGBA8, {1, 0, 0, 128.0 / 255.0}));
        const FlattenResult result = FlattenDocument(document);
        ASSERT_TRUE(result.image) << result.error;
        EXPECT_EQ(result.image->GetFormat(), PixelFormat::RGBA8);
        EXPECT_EQ(Pixel8(*result.image, 1, 0), (std::vector<int>{128, 0, 127, 255}));
    }
    {
        // A quarter-opaque float green over white IA16, as RGBA16: r = b = 0.75, g = 1.
        Document document;
        AddRaster(document, MakeFilled(1, 1, PixelFormat::IA16, {1, 1}));
        AddRaster(document, MakeFilled(1, 1, PixelFormat::RGBAUF, {0, 1, 0, 0.25}));
        FlattenOptions options;
        options.format = PixelFormat::RGBA16;
        const FlattenResult result = FlattenDocument(document, options);
        ASSERT_TRUE(result.image) << result.error;
        EXPECT_EQ(At<std::uint16_t>(*result.image, 0, 0, 0), 49151); // round(0.75 × 65535) = 49151.25
        EXPECT_EQ(At<std::uint16_t>(*result.image, 0, 0, 1), 65535);
        EXPECT_EQ(At<std::uint16_t>(*result.image, 0, 0, 2), 49151);
        EXPECT_EQ(At<std::uint16_t>(*result.image, 0, 0, 3), 65535);
    }
    {
        // Both half transparent: alpha 0.5 + 0.5 × 0.5 = 0.75; red 0.5 / 0.75, blue 0.25 / 0.75.
        Document document;
        AddRaster(document, MakeFilled(1, 1, PixelFormat::RGBAUF, {0, 0, 1, 0.5}));
        AddRaster(document, MakeFilled(1, 1, PixelFormat::RGBAUF, {1, 0, 0, 0.5}));
        const FlattenResult result = FlattenDocument(document);
        ASSERT_TRUE(result.image) << result.error;
        EXPECT_NEAR(At<float>(*result.image, 0, 0, 0), 2.0 / 3.0, 1e-6);
        EXPECT_NEAR(At<float>(*result.image, 0, 0, 1), 0.0, 1e-6);
        EXPECT_NEAR(At<float>(*result.image, 0, 0, 2), 1.0 / 3.0, 1e-6);
        EXPECT_NEAR(At<float>(*result.image, 0, 0, 3), 0.75, 1e-6);
    }
    {
        // Opaque black IA8 over white CMYKA8, in the bottom layer's format: all black ink; a fully
        // transparent layer changes nothing.
        Document document;
        AddRaster(document, MakeFilled(2, 1, PixelFormat::CMYKA8, {0, 0, 0, 0, 1}));
        AddRaster(document, MakeFilled(1, 1, PixelFormat::IA8, {0, 1}));
        AddRaster(document, MakeFilled(2, 1, PixelFormat::RGBA8, {1, 0, 0, 0}));
        const FlattenResult result = FlattenDocument(document);
        ASSERT_TRUE(result.image) << result.error;
        EXPECT_EQ(result.image->GetFormat(), PixelFormat::CMYKA8);
        EXPECT_EQ(Pixel8(*result.image, 0, 0), (std::vector<int>{0, 0, 0, 255, 255}));
        EXPECT_EQ(Pixel8(*result.image, 1, 0), (std::vector<int>{0, 0, 0, 0, 255}));
    }
}

TEST(Compositing, LayersArePlacedByTheirOffsetsAndTheImageCoversThemAll) {
    Document document;
    AddRaster(document, MakeFilled(2, 1, PixelFormat::RGBA8, {0, 0, 1, 1}));
    AddRaster(document, MakeFilled(1, 2, PixelFormat::RGBA8, {1, 0, 0, 1}), {2, -1});
    const FlattenResult result = FlattenDocument(document);
    ASSERT_TRUE(result.image) << result.error;
    EXPECT_EQ(result.bounds, (Kernel::RectT<int>{0, -1, 3, 1}));
    ASSERT_EQ(result.image->GetWidth(), 3);
    ASSERT_EQ(result.image->GetHeight(), 2);
    EXPECT_EQ(Pixel8(*result.image, 0, 0), (std::vector<int>{0, 0, 0, 0})); // nothing above the bottom layer
    EXPECT_EQ(Pixel8(*result.image, 0, 1), (std::vector<int>{0, 0, 255, 255}));
    EXPECT_EQ(Pixel8(*result.image, 2, 0), (std::vector<int>{255, 0, 0, 255}));
    EXPECT_EQ(Pixel8(*result.image, 2, 1), (std::vector<int>{255, 0, 0, 255}));
}

TEST(Compositing, LiveLayersFilterWhatLiesBeneathAndUnrenderableOnesAreSkipped) {
    Document document;
    AddRaster(document, MakeFilled(3, 2, PixelFormat::RGBA8, {10 / 255.0, 20 / 255.0, 30 / 255.0, 1}));
    document.InsertLayer(1, Kernel::MakeCounted<FilterRasterNode>(
                                "invert", Kernel::Counted<RasterDevicePreviewableFilterLayerCommand>(
                                              new InvertCommand(true))));
    document.InsertLayer(
        2, Kernel::MakeCounted<FilterRasterNode>(
               "opaque", Kernel::Counted<RasterDevicePreviewableFilterLayerCommand>(new OpaqueCommand())));
    // Above the live layers: not inverted.
    AddRaster(document, MakeFilled(1, 1, PixelFormat::RGBA8, {0, 1, 0, 1}));
    const FlattenResult result = FlattenDocument(document);
    ASSERT_TRUE(result.image) << result.error;
    ASSERT_EQ(result.warnings.size(), 1u);
    EXPECT_NE(result.warnings[0].find("\"opaque\""), std::string::npos) << result.warnings[0];
    EXPECT_EQ(Pixel8(*result.image, 0, 0), (std::vector<int>{0, 255, 0, 255}));
    EXPECT_EQ(Pixel8(*result.image, 2, 1), (std::vector<int>{245, 235, 225, 255}));
}

TEST(Compositing, TilingAndThreadsDoNotChangeTheResult) {
    Document document;
    AddRaster(document, MakeNoiseImage(37, 23, PixelFormat::RGBA16, 1));
    AddRaster(document, MakeNoiseImage(20, 30, PixelFormat::RGBA8, 2), {9, -4});
    document.InsertLayer(2, Kernel::MakeCounted<FilterRasterNode>(
                                "invert", Kernel::Counted<RasterDevicePreviewableFilterLayerCommand>(
                                              new InvertCommand(true))));
    AddRaster(document, MakeNoiseImage(5, 7, PixelFormat::IA8, 3), {30, 20});
    FlattenOptions whole;
    whole.tileSize = 0;
    whole.threads = 1;
    const FlattenResult reference = FlattenDocument(document, whole);
    ASSERT_TRUE(reference.image) << reference.error;
    for (const int tile : {1, 7, 16}) {
        FlattenOptions options;
        options.tileSize = tile;
        double last = 0.0;
        bool rising = true;
        options.progress = [&](double fraction) {
            rising = rising && fraction >= last;
            last = fraction;
        };
        const FlattenResult result = FlattenDocument(document, options);
        ASSERT_TRUE(result.image) << result.error;
        EXPECT_EQ(PixelBytes(*result.image), PixelBytes(*reference.image)) << "tile " << tile;
        EXPECT_TRUE(rising);
        EXPECT_EQ(last, 1.0);
    }
    bool abort = true;
    FlattenOptions aborted;
    aborted.abort = &abort;
    EXPECT_FALSE(FlattenDocument(document, aborted).image);
    EXPECT_FALSE(FlattenDocument(Document()).image);
}

TEST(PixelEffect, ChangesTheSelectedLayersWithinThePixelSelectionAndUndoes) {
    Document document;
    auto bottom = AddRaster(document, MakeNoiseImage(8, 6, PixelFormat::RGBA8, 4), {2, 1});
    auto top = AddRaster(document, MakeNoiseImage(8, 6, PixelFormat::RGBA8, 5));
    const auto original = PixelBytes(*bottom->GetPixels());
    const auto originalTop = PixelBytes(*top->GetPixels());

    // Document pixels (4..6) × (2..3) are selected: layer pixels (2..4) × (1..2) of the bottom layer.
    auto mask = Raster::DynamicBuffer::Create(10, 8, PixelFormat::MaskA8);
    for (int y = 2; y < 4; ++y)
        for (int x = 4; x < 7; ++x)
            mask->Row<std::uint8_t>(y)[x] = 255;
    document.SetPixelSelection(Kernel::MakeCounted<SelectionRasterNode>(mask));
    document.SetSelection({Kernel::Counted<Node>(bottom)});
    ASSERT_EQ(GetPixelTargets(document).size(), 1u);

    ASSERT_FALSE(ApplyPixelCommand(document, Kernel::Counted<RasterCommand>(new InvertCommand())));
    ASSERT_EQ(document.GetHistory().size(), 1u);
    const auto& entry = document.GetHistory()[0];
    ASSERT_EQ(entry.patches.size(), 1u);
    EXPECT_EQ(entry.patches[0].rect, (Kernel::RectT<int>{2, 1, 5, 3}));
    const auto changed = PixelBytes(*bottom->GetPixels());
    for (int y = 0; y < 6; ++y)
        for (int x = 0; x < 8; ++x)
            for (int c = 0; c < 4; ++c) {
                const std::size_t at = std::size_t(y * 8 + x) * 4 + std::size_t(c);
                const bool inside = x >= 2 && x < 5 && y >= 1 && y < 3 && c < 3;
                EXPECT_EQ(int(changed[at]), inside ? 255 - int(original[at]) : int(original[at]))
                    << x << "," << y << " channel " << c;
            }
    EXPECT_EQ(PixelBytes(*top->GetPixels()), originalTop);

    ASSERT_TRUE(document.Undo());
    EXPECT_EQ(PixelBytes(*bottom->GetPixels()), original);
    ASSERT_TRUE(document.Redo());
    EXPECT_EQ(PixelBytes(*bottom->GetPixels()), changed);

    // Without a layer selection the top raster layer is changed; an aborted change leaves everything.
    document.SetSelection({});
    document.SetPixelSelection({});
    bool abort = true;
    PixelEffectOptions options;
    options.abort = &abort;
    EXPECT_TRUE(ApplyPixelCommand(document, Kernel::Counted<RasterCommand>(new InvertCommand()), options));
    EXPECT_EQ(document.GetHistory().size(), 1u);
    EXPECT_EQ(PixelBytes(*top->GetPixels()), originalTop);
    ASSERT_FALSE(ApplyPixelCommand(document, Kernel::Counted<RasterCommand>(new InvertCommand())));
    EXPECT_NE(PixelBytes(*top->GetPixels()), originalTop);
    EXPECT_EQ(document.GetHistory().back().patches[0].rect, (Kernel::RectT<int>{0, 0, 8, 6}));
}
