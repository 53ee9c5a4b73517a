#include "filters/lighting/LightingParams.h"

#include "filters/distort/DistortPlacement.h"
#include "host/kernel/ClassProperties.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <limits>
#include <string>

namespace RasterTools {

namespace {

using Kernel::MakeFourCC;

// The saved form's nested objects. Each is a class of the host's registry, so that a stream names what it
// holds and a reader creates it from its class code.

// A colour: four floats.
class ColourObject final : public Kernel::Serialisable {
public:
    Renderer::ConsolidatedColour colour;

    void Save(Kernel::OutSerialiser& out) const override {
        const float channels[4] = {colour.r, colour.g, colour.b, colour.a};
        const Kernel::FourCC codes[4] = {MakeFourCC("Red "), MakeFourCC("Grn "), MakeFourCC("Blue"),
                                         MakeFourCC("Alph")};
        for (int i = 0; i < 4; ++i)
            out.SaveType(codes[i], double(channels[i]));
    }
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore&, unsigned short) override {
        double channels[4] = {};
        const Kernel::FourCC codes[4] = {MakeFourCC("Red "), MakeFourCC("Grn "), MakeFourCC("Blue"),
                                         MakeFourCC("Alph")};
        for (int i = 0; i < 4; ++i)
            if (!in.LoadType(codes[i], channels[i])) return false;
        colour = {float(channels[0]), float(channels[1]), float(channels[2]), float(channels[3])};
        return true;
    }
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return Properties(); }
    static const Kernel::ClassProperties& Properties();
};
const Kernel::ClassProperties& ColourObject::Properties() {
    static const Kernel::ClassProperties properties(
        MakeFourCC("RGBc"), [] { return Kernel::Counted<Kernel::Serialisable>(new ColourObject); }, 1,
        nullptr, nullptr);
    return properties;
}

// The bump map: its size and its floats, little-endian.
class BumpMapObject final : public Kernel::Serialisable {
public:
    Kernel::Counted<const Raster::DynamicBuffer> map;

    void Save(Kernel::OutSerialiser& out) const override {
        const int width = map->GetWidth(), height = map->GetHeight();
        out.SaveType(MakeFourCC("Wdth"), std::int32_t(width));
        out.SaveType(MakeFourCC("Hght"), std::int32_t(height));
        std::vector<std::byte> bytes(std::size_t(width) * std::size_t(height) * sizeof(float));
        for (int y = 0; y < height; ++y)
            std::memcpy(bytes.data() + std::size_t(y) * std::size_t(width) * sizeof(float), map->RowBytes(y),
                        std::size_t(width) * sizeof(float));
        out.SaveArray(MakeFourCC("Hts "), std::span<const std::byte>(bytes));
    }
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore&, unsigned short) override {
        std::int32_t width = 0, height = 0;
        std::vector<std::byte> bytes;
        if (!in.LoadType(MakeFourCC("Wdth"), width) || !in.LoadType(MakeFourCC("Hght"), height) ||
            !in.LoadArray(MakeFourCC("Hts "), bytes) || width <= 0 || height <= 0 ||
            bytes.size() != std::size_t(width) * std::size_t(height) * sizeof(float))
            return false;
        auto loaded = Raster::DynamicBuffer::Create(width, height, Raster::PixelFormat::IntensityUF);
        if (!loaded) return false;
        for (int y = 0; y < height; ++y) {
            float* row = loaded->Row<float>(y);
            std::memcpy(row, bytes.data() + std::size_t(y) * std::size_t(width) * sizeof(float),
                        std::size_t(width) * sizeof(float));
            // A height that is not a number would poison every normal next to it.
            for (int x = 0; x < width; ++x)
                if (!std::isfinite(row[x])) row[x] = 0.0f;
        }
        map = loaded;
        return true;
    }
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return Properties(); }
    static const Kernel::ClassProperties& Properties();
};
const Kernel::ClassProperties& BumpMapObject::Properties() {
    static const Kernel::ClassProperties properties(
        MakeFourCC("LBmp"), [] { return Kernel::Counted<Kernel::Serialisable>(new BumpMapObject); }, 1,
        nullptr, nullptr);
    return properties;
}

// One light source.
class LightObject final : public Kernel::Serialisable {
public:
    LightSource light;

    void Save(Kernel::OutSerialiser& out) const override { light.Save(out); }
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore&, unsigned short version) override {
        return light.Load(in, LightSource::GetClassUID(), version);
    }
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return Properties(); }
    static const Kernel::ClassProperties& Properties();
};
const Kernel::ClassProperties& LightObject::Properties() {
    static const Kernel::ClassProperties properties(
        LightSource::GetClassUID(), [] { return Kernel::Counted<Kernel::Serialisable>(new LightObject); },
        LightSource::GetSchemaVersion(), nullptr, nullptr);
    return properties;
}

// The lights in order: their count, then light i under "L" and i in three digits.
class LightListObject final : public Kernel::Serialisable {
public:
    std::vector<LightSource> lights;

    // Lists longer than this are refused when read: far beyond what anyone places by hand.
    static constexpr std::int32_t MaxSaved = 999;

    static Kernel::FourCC Code(int index) {
        // As MakeFourCC packs them: the first character in the highest byte.
        const char text[4] = {'L', char('0' + index / 100 % 10), char('0' + index / 10 % 10),
                              char('0' + index % 10)};
        Kernel::FourCC code = 0;
        for (int i = 0; i < 4; ++i)
            code = (code << 8) | Kernel::FourCC(static_cast<unsigned char>(text[i]));
        return code;
    }
    void Save(Kernel::OutSerialiser& out) const override {
        const int count = int(std::min<std::size_t>(lights.size(), MaxSaved));
        out.SaveType(MakeFourCC("Cnt "), std::int32_t(count));
        for (int i = 0; i < count; ++i) {
            LightObject object;
            object.light = lights[std::size_t(i)];
            out.SaveObject(Code(i), object);
        }
    }
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short) override {
        std::int32_t count = -1;
        if (!in.LoadType(MakeFourCC("Cnt "), count) || count < 0 || count > MaxSaved) return false;
        std::vector<LightSource> loaded;
        for (int i = 0; i < count; ++i) {
            const auto object = Kernel::CountedCast<LightObject>(in.LoadObject(Code(i), store));
            if (!object) return false;
            loaded.push_back(object->light);
        }
        lights = std::move(loaded);
        return true;
    }
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return Properties(); }
    static const Kernel::ClassProperties& Properties();
};
const Kernel::ClassProperties& LightListObject::Properties() {
    static const Kernel::ClassProperties properties(
        MakeFourCC("LLst"), [] { return Kernel::Counted<Kernel::Serialisable>(new LightListObject); }, 1,
        nullptr, nullptr);
    return properties;
}

// The records' classes enter the host's registry when first used, not when the library loads: loading it
// registers its commands and tools alone.
void RegisterRecordClasses() {
    ColourObject::Properties();
    BumpMapObject::Properties();
    LightObject::Properties();
    LightListObject::Properties();
}

void SaveColour(Kernel::OutSerialiser& out, Kernel::FourCC code, const Renderer::ConsolidatedColour& colour) {
    ColourObject object;
    object.colour = colour;
    out.SaveObject(code, object);
}

// An absent colour keeps its value; one that is present but does not read back fails.
bool LoadColour(const Kernel::InSerialiser& in, Kernel::FourCC code, Renderer::ConsolidatedColour& colour) {
    if (!in.Has(code)) return true;
    Kernel::FileStore store;
    const auto object = Kernel::CountedCast<ColourObject>(in.LoadObject(code, store));
    if (!object) return false;
    colour = object->colour;
    return true;
}

double Finite(double value, double fallback, double lowest, double highest) {
    return std::isfinite(value) ? std::clamp(value, lowest, highest) : fallback;
}

void BoundColour(Renderer::ConsolidatedColour& colour) {
    // Colours beyond 0..1 are kept (unbounded pixels), but not numbers without limit.
    for (float* channel : {&colour.r, &colour.g, &colour.b, &colour.a})
        *channel = std::isfinite(*channel) ? std::clamp(*channel, -1000.0f, 1000.0f) : 1.0f;
}

// How far from the origin a light may be placed: far beyond any layer, and small enough that squared
// distances stay far from the single-precision range.
constexpr double PlaceLimit = 1e6;

} // namespace

LightSource::LightSource(const Kernel::RectT<double>& document)
    : centre{document.Width() / 2.0, document.Height() / 2.0}
    , distance(0.15 *
               std::sqrt(document.Width() * document.Width() + document.Height() * document.Height())) {}

void LightSource::Save(Kernel::OutSerialiser& out) const {
    RegisterRecordClasses();
    out.SaveType(MakeFourCC("Type"), std::int32_t(type));
    SaveColour(out, MakeFourCC("Colo"), colour);
    out.SaveType(MakeFourCC("Spin"), spin);
    out.SaveType(MakeFourCC("Tilt"), tilt);
    out.SaveType(MakeFourCC("Cent"), centre);
    out.SaveType(MakeFourCC("Dist"), distance);
    out.SaveType(MakeFourCC("OCon"), outerCone);
    out.SaveType(MakeFourCC("ICon"), innerCone);
}

bool LightSource::Load(const Kernel::InSerialiser& in, Kernel::FourCC classUID, unsigned short version) {
    if (classUID != GetClassUID() || version > GetSchemaVersion() || !in.IsValid()) return false;
    RegisterRecordClasses();
    LightSource loaded = *this;
    std::int32_t kind = std::int32_t(type);
    in.LoadType(MakeFourCC("Type"), kind);
    loaded.type = Type(kind); // an unknown kind is kept and skipped by renders
    if (!LoadColour(in, MakeFourCC("Colo"), loaded.colour)) return false;
    in.LoadType(MakeFourCC("Spin"), loaded.spin);
    in.LoadType(MakeFourCC("Tilt"), loaded.tilt);
    in.LoadType(MakeFourCC("Cent"), loaded.centre);
    in.LoadType(MakeFourCC("Dist"), loaded.distance);
    in.LoadType(MakeFourCC("OCon"), loaded.outerCone);
    in.LoadType(MakeFourCC("ICon"), loaded.innerCone);
    *this = loaded;
    return true;
}

void LightSource::ApplyTransform(const Raster::AffineTransform::Params& transform) {
    Distort::TransformCircle(centre, distance, transform, false);
}

bool LightSource::ApplyInverseTransform(const Raster::AffineTransform::Params& transform) {
    return Distort::TransformCircle(centre, distance, transform, true);
}

LightingParams::LightingParams(const Kernel::RectT<double>& document)
    : lights{LightSource(document)} {}

void LightingParams::Save(Kernel::OutSerialiser& out, bool full) const {
    RegisterRecordClasses();
    out.SaveType(MakeFourCC("Ambi"), ambient);
    out.SaveType(MakeFourCC("Diff"), diffuse);
    out.SaveType(MakeFourCC("Spec"), specular);
    out.SaveType(MakeFourCC("Expo"), exponent);
    SaveColour(out, MakeFourCC("AmbC"), ambientColour);
    SaveColour(out, MakeFourCC("SpeC"), specularColour);
    out.SaveType(MakeFourCC("Dept"), depth);
    if (bumpMap) {
        BumpMapObject object;
        object.map = bumpMap;
        out.SaveObject(MakeFourCC("BMap"), object);
    }
    out.SaveType(MakeFourCC("ScaX"), scaleXToFit);
    out.SaveType(MakeFourCC("ScaY"), scaleYToFit);
    out.SaveType(MakeFourCC("BMOp"), bumpMapOpacity);
    if (full) {
        LightListObject object;
        object.lights = lights;
        out.SaveObject(MakeFourCC("Lits"), object);
    }
}

bool LightingParams::Load(const Kernel::InSerialiser& in, Kernel::FourCC classUID, unsigned short version,
                          Kernel::FileStore& store) {
    if (classUID != GetClassUID() || version > GetSchemaVersion() || !in.IsValid()) return false;
    RegisterRecordClasses();
    LightingParams loaded = *this;
    in.LoadType(MakeFourCC("Ambi"), loaded.ambient);
    in.LoadType(MakeFourCC("Diff"), loaded.diffuse);
    in.LoadType(MakeFourCC("Spec"), loaded.specular);
    in.LoadType(MakeFourCC("Expo"), loaded.exponent);
    if (!LoadColour(in, MakeFourCC("AmbC"), loaded.ambientColour) ||
        !LoadColour(in, MakeFourCC("SpeC"), loaded.specularColour))
        return false;
    in.LoadType(MakeFourCC("Dept"), loaded.depth);
    loaded.bumpMap = nullptr;
    if (in.Has(MakeFourCC("BMap"))) {
        const auto object = Kernel::CountedCast<BumpMapObject>(in.LoadObject(MakeFourCC("BMap"), store));
        if (!object) return false;
        loaded.bumpMap = object->map;
    }
    in.LoadType(MakeFourCC("ScaX"), loaded.scaleXToFit);
    in.LoadType(MakeFourCC("ScaY"), loaded.scaleYToFit);
    in.LoadType(MakeFourCC("BMOp"), loaded.bumpMapOpacity);
    if (in.Has(MakeFourCC("Lits"))) {
        const auto object = Kernel::CountedCast<LightListObject>(in.LoadObject(MakeFourCC("Lits"), store));
        if (!object) return false;
        loaded.lights = object->lights;
    }
    loaded.Bound();
    *this = std::move(loaded);
    return true;
}

void LightingParams::ApplyTransform(const Raster::AffineTransform::Params& transform) {
    for (LightSource& light : lights)
        light.ApplyTransform(transform);
    Bound();
}

bool LightingParams::ApplyInverseTransform(const Raster::AffineTransform::Params& transform) {
    // A singular transform fails for every light alike, so either all move or none.
    bool applied = true;
    for (LightSource& light : lights)
        applied = light.ApplyInverseTransform(transform) && applied;
    Bound();
    return applied;
}

void LightingParams::Bound() {
    ambient = Finite(ambient, 0.2, 0.0, 100.0);
    diffuse = Finite(diffuse, 1.0, 0.0, 100.0);
    specular = Finite(specular, 0.5, 0.0, 100.0);
    exponent = Finite(exponent, 5.0, 1.0, 128.0);
    depth = Finite(depth, 0.0, -10000.0, 10000.0);
    bumpMapOpacity = Finite(bumpMapOpacity, 1.0, 0.0, 1.0);
    BoundColour(ambientColour);
    BoundColour(specularColour);
    if (bumpMap && bumpMap->GetFormat() != Raster::PixelFormat::IntensityUF) bumpMap = nullptr;
    constexpr double Turn = 6.283185307179586;
    for (LightSource& light : lights) {
        BoundColour(light.colour);
        light.spin = Finite(light.spin, 2.356194490192345, -Turn, Turn);
        light.tilt = Finite(light.tilt, 0.5235987755982988, 0.0, Turn / 4.0);
        // Unset stays unset (not a number); otherwise within reach.
        for (double* coordinate : {&light.centre.x, &light.centre.y})
            if (!std::isnan(*coordinate)) *coordinate = std::clamp(*coordinate, -PlaceLimit, PlaceLimit);
        light.distance = std::isnan(light.distance) ? 0.0 : std::clamp(light.distance, 0.0, PlaceLimit);
        light.outerCone = Finite(light.outerCone, 0.5235987755982988, 0.0, Turn / 4.0);
        light.innerCone = Finite(light.innerCone, 0.5, 0.0, 1.0);
    }
}

} // namespace RasterTools
