// The pixel brush commands: the path choice, the colour with its opacity and offsets, every layer format,
// masks, round trips through documents, invariance under splitting and placement, and hostile input.

#include "PixelToolSupport.h"

#include "brushes/PixelDab.h"
#include "brushes/RasterPixelBrushCommand.h"
#include "brushes/RasterPixelEraseCommand.h"
#include "brushes/RasterPixelUndoCommand.h"
#include "host/document/DocumentFile.h"
#include "host/document/PixelEffect.h"

#include <gtest/gtest.h>

#include <cmath>

namespace {

using namespace RasterTools;

Kernel::Counted<Raster::RasterBrush> SquareBrush(double size = 1.0) {
    Kernel::Counted<Raster::RasterBrush> brush(new Raster::SquareRasterBrush());
    brush->SetSize(size);
    return brush;
}

Raster::BrushNozzle Nozzle(Kernel::RectT<double> rect, float strength = 1.0f, int mode = 0) {
    Raster::BrushNozzle nozzle;
    nozzle.rect = rect;
    nozzle.strength = strength;
    nozzle.mode = mode;
    return nozzle;
}

// Runs one nozzle of command straight into target.
void Perform(const RasterBrushCommand& command, Raster::BrushNozzle nozzle,
             Kernel::Counted<Raster::DynamicBuffer> target) {
    if (Raster::IsMaskFormat(target->GetFormat()))
        nozzle.mask = std::move(target);
    else
        nozzle.bitmap = std::move(target);
    command.PerformNozzle(nozzle);
}

TEST(PixelBrushCommand, StrengthExactlyOneIsOpaqueAndAnyOtherStrengthBlends) {
    EXPECT_EQ(ChooseDabPath(0, 1.0), Raster::DabPath::Opaque);
    EXPECT_EQ(ChooseDabPath(0, 0.999), Raster::DabPath::Blended);
    EXPECT_EQ(ChooseDabPath(0, 1.0000001), Raster::DabPath::Blended);
    EXPECT_EQ(ChooseDabPath(1, 0.2), Raster::DabPath::Stamp);
    EXPECT_FALSE(ChooseDabPath(2, 1.0));
    EXPECT_FALSE(ChooseDabPath(-1, 1.0));
    // The two paths differ where the precision shows it: 16-bit white over black.
    RasterPixelBrushCommand command({1, 1, 1, 1}, {}, {}, SquareBrush());
    auto image = Raster::DynamicBuffer::Create(2, 1, Raster::PixelFormat::RGBA16);
    Perform(command, Nozzle({0, 0, 1, 1}, 1.0f), image);
    Perform(command, Nozzle({1, 0, 2, 1}, 0.999f), image);
    const std::uint16_t* p = image->Row<std::uint16_t>(0);
    EXPECT_EQ(p[0], 65535);
    EXPECT_EQ(p[4], 65469); // round(0.999 × 65535) of the way from 0
}

TEST(PixelBrushCommand, ColourOffsetsWrapTheHueAndClampSaturationAndLightness) {
    HueSaturationLightness hsl{0.2, 0.5, 0.5};
    EXPECT_NEAR(OffsetHueSaturationLightness(hsl, 1.0, 0, 0).hue, 0.2, 1e-12);
    hsl.hue = 0.0;
    EXPECT_NEAR(OffsetHueSaturationLightness(hsl, -0.1, 0, 0).hue, 0.9, 1e-12);
    hsl.saturation = 0.8;
    EXPECT_EQ(OffsetHueSaturationLightness(hsl, 0, 0.5, 0).saturation, 1.0);
    EXPECT_EQ(OffsetHueSaturationLightness(hsl, 0, -2.0, 0).saturation, 0.0);
    EXPECT_EQ(OffsetHueSaturationLightness(hsl, 0, 0, 0.7).lightness, 1.0);
    EXPECT_EQ(OffsetHueSaturationLightness(hsl, NAN, INFINITY, 0).hue, 0.0);
    EXPECT_EQ(OffsetHueSaturationLightness({1e-17, 0, 0}, -1e-17 * 2, 0, 0).hue < 1.0, true);

    // Pure red turned by a third of the hue circle is pure green; lightness +0.5 is white.
    RasterPixelBrushCommand red({1, 0, 0, 1}, {}, {}, SquareBrush());
    auto image = Raster::DynamicBuffer::Create(3, 1, Raster::PixelFormat::RGBA8);
    auto nozzle = Nozzle({0, 0, 1, 1});
    nozzle.hueOffset = 1.0f / 3.0f;
    Perform(red, nozzle, image);
    nozzle = Nozzle({1, 0, 2, 1});
    nozzle.hueOffset = -1.0f / 3.0f;
    Perform(red, nozzle, image);
    nozzle = Nozzle({2, 0, 3, 1});
    nozzle.lightnessOffset = 0.5f;
    Perform(red, nozzle, image);
    const std::uint8_t* p = image->Row<std::uint8_t>(0);
    EXPECT_EQ((std::vector<int>{p[0], p[1], p[2], p[3]}), (std::vector<int>{0, 255, 0, 255}));
    EXPECT_EQ((std::vector<int>{p[4], p[5], p[6], p[7]}), (std::vector<int>{0, 0, 255, 255}));
    EXPECT_EQ((std::vector<int>{p[8], p[9], p[10], p[11]}), (std::vector<int>{255, 255, 255, 255}));
}

TEST(PixelBrushCommand, OpacityScalesTheColoursAlphaInEachPrecision) {
    const ColourCoverage coverage = MakeColourCoverage(1.0, 0.5);
    EXPECT_EQ(coverage.alpha8, 128);    // mul8(255, 128)
    EXPECT_EQ(coverage.alpha16, 32768); // 65535 × 32768 / 65535
    EXPECT_EQ(coverage.alphaF, 32768.0f / 65535.0f);
    EXPECT_EQ(MakeColourCoverage(0.5, 0.5).alpha8, 64);     // 128 × 128 = 16384: (16384 + 128 + 64) >> 8
    EXPECT_EQ(MakeColourCoverage(0.5, 0.5).alpha16, 16384); // 32768 × 32768 / 65535 = 16384.25
    EXPECT_EQ(MakeColourCoverage(NAN, 2.0).alpha8, 0);

    RasterPixelBrushCommand command({0, 0, 1, 1}, {}, {}, SquareBrush());
    auto image = Raster::DynamicBuffer::Create(1, 1, Raster::PixelFormat::RGBAUF);
    auto nozzle = Nozzle({0, 0, 1, 1});
    nozzle.opacity = 0.5f;
    Perform(command, nozzle, image);
    EXPECT_EQ(image->Row<float>(0)[3], 32768.0f / 65535.0f);
    EXPECT_EQ(image->Row<float>(0)[2], 1.0f);
}

TEST(PixelBrushCommand, EveryLayerFormatTakesTheColourAsItsOwnPixelUnderFullCoverage) {
    const Raster::PixelFormat formats[] = {Raster::PixelFormat::RGBA8,  Raster::PixelFormat::RGBA16,
                                           Raster::PixelFormat::RGBAUF, Raster::PixelFormat::IA8,
                                           Raster::PixelFormat::IA16,   Raster::PixelFormat::CMYKA8,
                                           Raster::PixelFormat::LabA16};
    const Renderer::ConsolidatedColour colour{0.2f, 0.6f, 0.4f, 1.0f};
    for (const auto format : formats) {
        SCOPED_TRACE(std::string(Raster::GetPixelFormatName(format)));
        PixelToolDocument doc(8, 8, format);
        const auto before = Bytes(doc.Pixels());
        doc.controller->SetDocumentDefaults({.foreground = colour});
        doc.tool->Stroke({{3, 2}});
        const auto expected =
            GetRasterDynamicPixel(colour, Raster::ColourProfiles{}, 0, format, MakeColourCoverage(1, 1));
        ASSERT_TRUE(expected);
        const auto after = Bytes(doc.Pixels());
        const std::size_t bpp = std::size_t(Raster::GetBytesPerPixel(format));
        const std::size_t row = doc.Pixels().GetRowBytes();
        for (std::size_t i = 0; i < after.size(); ++i) {
            const std::size_t x = (i % row) / bpp, y = i / row;
            if (x == 3 && y == 2)
                EXPECT_EQ(after[i], std::uint8_t((*expected)[i % bpp])) << "byte " << i % bpp;
            else
                EXPECT_EQ(after[i], before[i]) << x << "," << y;
        }
        // Erasing the same pixel leaves its colour and clears its alpha.
        doc.tool->SetAlternateLatch(true);
        doc.tool->Stroke({{3, 2}});
        const auto& info = Raster::GetPixelFormatInfo(format);
        const auto erased = doc.PixelAt(3, 2);
        for (int b = 0; b < info.bytesPerComponent; ++b)
            EXPECT_EQ(erased[std::size_t(info.alphaIndex * info.bytesPerComponent + b)], 0);
        EXPECT_EQ(erased[0], std::uint8_t((*expected)[0]));
    }
}

TEST(PixelBrushCommand, MasksAndCoverageOnlyBrushesTakeFullIntensity) {
    for (const auto format :
         {Raster::PixelFormat::MaskA8, Raster::PixelFormat::MaskA16, Raster::PixelFormat::MaskAF}) {
        SCOPED_TRACE(std::string(Raster::GetPixelFormatName(format)));
        RasterPixelBrushCommand command({1, 0, 0, 1}, {}, {}, SquareBrush(2));
        auto mask = Raster::DynamicBuffer::Create(4, 1, format);
        Perform(command, Nozzle({0, 0, 2, 1}), mask);
        // Strength times opacity: 0.5 × 1 blends half way.
        auto half = Nozzle({2, 0, 3, 1}, 0.5f);
        Perform(command, half, mask);
        const double full = Raster::MaskFullValue(format);
        const auto read = [&](int x) {
            if (format == Raster::PixelFormat::MaskA8) return double(mask->Row<std::uint8_t>(0)[x]);
            if (format == Raster::PixelFormat::MaskA16) return double(mask->Row<std::uint16_t>(0)[x]);
            return double(mask->Row<float>(0)[x]);
        };
        EXPECT_EQ(read(0), full);
        EXPECT_EQ(read(1), full);
        EXPECT_NEAR(read(2), full / 2, full / 200);
        EXPECT_EQ(read(3), 0.0);
        // The erase command takes a mask back to zero.
        RasterPixelEraseCommand erase({}, {}, SquareBrush());
        Perform(erase, Nozzle({0, 0, 1, 1}), mask);
        EXPECT_EQ(read(0), 0.0);
    }
    // A coverage-only brush paints the nozzle's mask, never the colour bitmap.
    auto brush = SquareBrush();
    brush->SetCoverageOnly(true);
    RasterPixelBrushCommand command({1, 0, 0, 1}, {}, {}, brush);
    auto bitmap = Raster::DynamicBuffer::Create(1, 1, Raster::PixelFormat::RGBA8);
    auto mask = Raster::DynamicBuffer::Create(1, 1, Raster::PixelFormat::MaskA8);
    auto nozzle = Nozzle({0, 0, 1, 1});
    nozzle.bitmap = bitmap;
    nozzle.mask = mask;
    command.PerformNozzle(nozzle);
    EXPECT_EQ(mask->Row<std::uint8_t>(0)[0], 255);
    EXPECT_EQ(bitmap->Row<std::uint8_t>(0)[0], 0);
}

TEST(PixelBrushCommand, BrushDynamicAndMaskTextureScaleTheDab) {
    auto brush = SquareBrush(4);
    brush->GetDynamic(0).SetActive(true);
    brush->GetDynamic(0).SetValue(1.0);
    RasterPixelBrushCommand command({1, 1, 1, 1}, {}, {}, brush);
    auto image = Raster::DynamicBuffer::Create(4, 2, Raster::PixelFormat::IA8);
    auto nozzle = Nozzle({0, 0, 4, 1});
    nozzle.pressure = 0.5f;
    Perform(command, nozzle, image);
    // The dynamic's 0.5 blends half way, on the opaque path too.
    EXPECT_EQ(image->Row<std::uint8_t>(0)[0], 128);
    EXPECT_EQ(image->Row<std::uint8_t>(0)[1], 128);

    auto texture = Raster::DynamicBuffer::Create(2, 1, Raster::PixelFormat::MaskAF);
    texture->Row<float>(0)[1] = 1.0f;
    ASSERT_TRUE(brush->SetMaskTexture(texture));
    brush->GetDynamic(0).SetActive(false);
    brush->SetMaskTextureMode(1);
    Perform(command, Nozzle({0, 1, 4, 2}), image);
    const std::uint8_t* row = image->Row<std::uint8_t>(1);
    EXPECT_EQ((std::vector<int>{row[0], row[2], row[4], row[6]}), (std::vector<int>{0, 255, 0, 255}));
    // Mode 0 leaves the texture unused.
    brush->SetMaskTextureMode(0);
    Perform(command, Nozzle({0, 1, 4, 2}), image);
    EXPECT_EQ(image->Row<std::uint8_t>(1)[0], 255);
}

TEST(PixelBrushCommand, NozzleRectsRoundHalfAwayFromZeroAndClipToTheTarget) {
    EXPECT_EQ(RoundNozzleRect({0.5, 1.5, 2.5, 3.49}, 10, 10), (Kernel::RectT<int>{1, 2, 3, 3}));
    EXPECT_EQ(RoundNozzleRect({-2.5, -0.4, 1.5, 1}, 10, 10), (Kernel::RectT<int>{0, 0, 2, 1}));
    EXPECT_TRUE(RoundNozzleRect({3, 3, 3.4, 9}, 10, 10).IsEmpty());
    EXPECT_TRUE(RoundNozzleRect({NAN, 0, 1, 1}, 10, 10).IsEmpty());
    EXPECT_EQ(RoundNozzleRect({-1e300, -1e300, 1e300, 1e300}, 10, 10), (Kernel::RectT<int>{0, 0, 10, 10}));
}

TEST(PixelBrushCommands, HistoryLabelsAndCopies) {
    const std::vector<Raster::BrushNozzle> nozzles = {Nozzle({1, 1, 2, 2})};
    RasterPixelBrushCommand paint({0.5f, 0.25f, 0, 1}, nozzles, {}, SquareBrush());
    RasterPixelEraseCommand erase(nozzles, {}, SquareBrush());
    RasterPixelUndoCommand restore(nozzles, {}, SquareBrush(), nullptr);
    EXPECT_EQ(paint.GetDescription(),
              (Kernel::LocalisedString{"Pixel Brush", "Raster pixel brush command name"}));
    EXPECT_EQ(erase.GetDescription(),
              (Kernel::LocalisedString{"Pixel Brush", "Raster pixel brush command name"}));
    EXPECT_EQ(restore.GetDescription(),
              (Kernel::LocalisedString{"Pixel Undo Brush", "Raster pixel undo brush command name"}));
    auto copy = Kernel::CountedCast<RasterPixelBrushCommand>(paint.Copy());
    ASSERT_TRUE(copy);
    EXPECT_EQ(copy->GetColour(), paint.GetColour());
    ASSERT_EQ(copy->GetNozzles().size(), 1u);
    EXPECT_TRUE(copy->GetNozzles()[0].SameDab(nozzles[0]));
    EXPECT_NE(copy->GetBrush(), paint.GetBrush()); // the brush is copied, not shared
    paint.SetFinished(true);
    EXPECT_FALSE(paint.Copy());
    EXPECT_FALSE(paint.Clone());
    bool hasColour = false;
    for (const auto& property : paint.EnumerateReflecteds())
        hasColour |= property->GetLabel() == Kernel::LocalisedString{"Colour", "Reflectable property"};
    EXPECT_TRUE(hasColour);
}

TEST(PixelBrushCommands, AStrokeSavedLoadedUndoneAndRedoneLeavesTheDocumentAsExpected) {
    PixelToolDocument doc(40, 30, Raster::PixelFormat::RGBA16);
    const auto original = Bytes(doc.Pixels());
    doc.controller->SetDocumentDefaults({.foreground = {0.1f, 0.9f, 0.3f, 1}});
    auto brush = doc.tool->GetCurrentBrush()->Copy();
    brush->SetSize(3);
    doc.tool->ReplaceBrush(brush);
    doc.tool->Stroke({{2, 2}, {30, 20}, {5, 25}});
    doc.tool->SetAlternateLatch(true);
    doc.tool->Stroke({{0, 10}, {39, 10}});
    const auto painted = Bytes(doc.Pixels());
    ASSERT_NE(painted, original);

    std::string error;
    const auto encoded = DocumentFile::Encode(*doc.document, &error);
    ASSERT_FALSE(encoded.empty()) << error;
    Kernel::Counted<Document> loaded;
    ASSERT_FALSE(DocumentFile::Decode(encoded, loaded));
    const auto layer = Kernel::CountedCast<RasterNode>(loaded->GetLayers().at(0));
    EXPECT_EQ(Bytes(*layer->GetPixels()), painted);
    ASSERT_EQ(loaded->GetHistory().size(), 2u);
    const auto* first = dynamic_cast<const RasterPixelBrushCommand*>(loaded->GetHistory()[0].command.Get());
    const auto* second = dynamic_cast<const RasterPixelEraseCommand*>(loaded->GetHistory()[1].command.Get());
    ASSERT_TRUE(first && second);
    EXPECT_EQ(first->GetColour(), (Renderer::ConsolidatedColour{0.1f, 0.9f, 0.3f, 1}));
    EXPECT_EQ(first->GetBrush()->GetSize(), 3.0);
    const auto* saved =
        dynamic_cast<const RasterPixelBrushCommand*>(doc.document->GetHistory()[0].command.Get());
    ASSERT_EQ(first->GetNozzles().size(), saved->GetNozzles().size());
    for (std::size_t i = 0; i < saved->GetNozzles().size(); ++i)
        EXPECT_TRUE(first->GetNozzles()[i].SameDab(saved->GetNozzles()[i])) << i;
    EXPECT_EQ(second->GetDescription().GetEnglish(), "Pixel Brush");

    ASSERT_TRUE(loaded->Undo());
    ASSERT_TRUE(loaded->Undo());
    EXPECT_EQ(Bytes(*layer->GetPixels()), original);
    ASSERT_TRUE(loaded->Redo());
    ASSERT_TRUE(loaded->Redo());
    EXPECT_EQ(Bytes(*layer->GetPixels()), painted);
    // Running the loaded commands again paints the same pixels as the tool did.
    ASSERT_TRUE(loaded->Undo());
    ASSERT_TRUE(loaded->Undo());
    Kernel::Counted<RasterCommand> again[2] = {Kernel::CountedCast<RasterCommand>(first->Clone()),
                                               Kernel::CountedCast<RasterCommand>(second->Clone())};
    for (auto& command : again)
        ASSERT_FALSE(ApplyPixelCommand(*loaded, command));
    EXPECT_EQ(Bytes(*layer->GetPixels()), painted);
}

TEST(PixelBrushCommands, PixelsDoNotDependOnHowAStrokeIsSplitOrWhereTheLayerSits) {
    const std::vector<Kernel::PointT<double>> points = {{1, 1}, {25, 14}, {3, 17}, {28, 2}};
    PixelToolDocument whole(32, 20);
    whole.controller->SetDocumentDefaults({.foreground = {0.7f, 0.1f, 0.5f, 0.6f}});
    whole.tool->Stroke(points);

    // The same dabs as one command per segment.
    PixelToolDocument split(32, 20);
    const auto* command =
        dynamic_cast<const RasterPixelBrushCommand*>(whole.document->GetHistory()[0].command.Get());
    ASSERT_TRUE(command);
    const auto& nozzles = command->GetNozzles();
    for (std::size_t from = 0; from < nozzles.size(); from += 7) {
        std::vector<Raster::BrushNozzle> part(nozzles.begin() + std::ptrdiff_t(from),
                                              nozzles.begin() +
                                                  std::ptrdiff_t(std::min(nozzles.size(), from + 7)));
        split.controller->EnqueueCommand(Kernel::Counted<Command>(new RasterPixelBrushCommand(
                                             command->GetColour(), part, {}, SquareBrush())),
                                         false);
    }
    EXPECT_EQ(Bytes(split.Pixels()), Bytes(whole.Pixels()));

    // The same stroke on a layer placed at (-5, 3) in the document, painted at document coordinates.
    PixelToolDocument moved(32, 20);
    moved.layer->SetOffset({-5, 3});
    moved.controller->SetDocumentDefaults({.foreground = {0.7f, 0.1f, 0.5f, 0.6f}});
    std::vector<Kernel::PointT<double>> shifted;
    for (const auto& p : points)
        shifted.push_back({p.x - 5, p.y + 3});
    moved.tool->Stroke(shifted);
    EXPECT_EQ(Bytes(moved.Pixels()), Bytes(whole.Pixels()));
}

TEST(PixelBrushCommands, ThePixelSelectionLimitsTheStroke) {
    PixelToolDocument doc(20, 10);
    auto mask = Raster::DynamicBuffer::Create(20, 10, Raster::PixelFormat::MaskA8);
    for (int x = 0; x < 10; ++x)
        mask->Row<std::uint8_t>(5)[x] = 255;
    doc.document->SetPixelSelection(Kernel::MakeCounted<SelectionRasterNode>(mask));
    doc.controller->SetDocumentDefaults({.foreground = {1, 1, 1, 1}});
    doc.tool->Stroke({{0, 5}, {19, 5}});
    EXPECT_EQ(doc.PixelAt(9, 5), (std::vector<std::uint8_t>{255, 255, 255, 255}));
    EXPECT_EQ(doc.PixelAt(10, 5), (std::vector<std::uint8_t>{128, 128, 128, 255}));
}

TEST(PixelBrushCommands, HostileSerialisedCommandsAreRefusedOrPaintNothing) {
    const auto brushBytes = Kernel::SerialiseObject(*SquareBrush());
    const auto build = [&](std::vector<double> nozzleFields, bool withBrush = true) {
        Kernel::OutSerialiser out;
        const double colour[4] = {1, 0, 0, 1};
        out.SaveArray(Kernel::MakeFourCC("Colr"), colour);
        out.SaveArray(Kernel::MakeFourCC("Nozl"), nozzleFields);
        if (withBrush) out.SaveObject(Kernel::MakeFourCC("Brsh"), *SquareBrush());
        return out.GetBytes();
    };
    const auto load = [](const std::vector<std::byte>& records) {
        Kernel::FileStore store;
        auto command = Kernel::MakeCounted<RasterPixelBrushCommand>();
        const Kernel::InSerialiser in(records);
        return command->Load(in, store, 1) ? command : nullptr;
    };
    EXPECT_FALSE(load(build({1, 2, 3})));                                   // not whole nozzles
    EXPECT_FALSE(load(build({0, 0, 1, 1, 1, 1, 0, 0, 0, 0, 0, 1}, false))); // no brush
    // Wild values load but change nothing they should not.
    const double inf = INFINITY;
    auto command = load(
        build({NAN,    0,      1,     1,     1,          1,   0,    0, 0,   0,   0,    1, // NaN corner
               -1e300, -1e300, 1e300, 1e300, 1,          1,   7,    0, 0,   0,   0,    1, // unknown mode
               0,      0,      1,     1,     1,          1,   1e20, 0, 0,   0,   0,    1, // mode beyond int
               2,      2,      3,     3,     1,          1,   0.5,  0, 0,   0,   0,    1, // fractional mode
               4,      4,      5,     5,     float(inf), NAN, 0,    0, inf, NAN, -inf, NAN}));
    ASSERT_TRUE(command);
    PixelToolDocument doc(8, 8);
    const auto before = Bytes(doc.Pixels());
    ASSERT_FALSE(ApplyPixelCommand(*doc.document, command));
    const auto after = Bytes(doc.Pixels());
    for (std::size_t i = 0; i < after.size(); ++i) {
        const std::size_t x = (i % doc.Pixels().GetRowBytes()) / 4, y = i / doc.Pixels().GetRowBytes();
        // Only the last nozzle (infinite opacity counts as full, NaN strength as none) may touch (4, 4).
        if (!(x == 4 && y == 4)) {
            EXPECT_EQ(after[i], before[i]) << x << "," << y;
        }
    }
    // A hostile brush record: a texture that claims more pixels than it has.
    Kernel::OutSerialiser brush;
    brush.SaveType(Kernel::MakeFourCC("TxFm"), std::uint32_t(Raster::PixelFormat::MaskA8));
    brush.SaveType(Kernel::MakeFourCC("TxWd"), std::int32_t(100000));
    brush.SaveType(Kernel::MakeFourCC("TxHt"), std::int32_t(100000));
    const std::byte few[4] = {};
    brush.SaveArray(Kernel::MakeFourCC("TxPx"), few);
    Kernel::FileStore store;
    Raster::SquareRasterBrush square;
    EXPECT_FALSE(square.Load(Kernel::InSerialiser(brush.GetBytes()), store, 1));
    (void)brushBytes;
}

} // namespace
