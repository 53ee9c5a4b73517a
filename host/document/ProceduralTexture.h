#pragma once
// The procedural texture's model: equations with channel masks, named inputs with their kinds and values,
// and the consolidated config that holds them. Every piece is immutable once made and serialisable.

#include "host/kernel/ClassProperties.h"
#include "host/kernel/Consolidated.h"
#include "host/kernel/Serialiser.h"

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace Raster {
enum class PixelFormat : std::uint8_t;
}

// One equation: its text and the channels (bit 0 the colour format's first) its result is written to.
class ProceduralTextureEquation final : public Kernel::Serialisable {
public:
    ProceduralTextureEquation() = default;
    ProceduralTextureEquation(std::string text, std::uint32_t channelMask)
        : m_Text(std::move(text))
        , m_ChannelMask(channelMask) {}

    const std::string& GetText() const noexcept { return m_Text; }
    std::uint32_t GetChannelMask() const noexcept { return m_ChannelMask; }

    bool operator==(const ProceduralTextureEquation& other) const noexcept {
        return m_Text == other.m_Text && m_ChannelMask == other.m_ChannelMask;
    }

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override;

private:
    std::string m_Text;
    std::uint32_t m_ChannelMask = 0;
};

// A named input of the equations. Kinds 0 to 4 are numbers; the vector kind is a direction given by two
// angles. Immutable; the With* operations return changed copies.
class ExpressionConstant : public Kernel::Serialisable {
public:
    enum Kind : int {
        Real = 0,    // a number within [min, max]
        Integer = 1, // a whole number within [min, max]
        Angle = 2,   // an angle in the config's unit, within [min, max]
        Percent = 3, // a fraction shown as a percentage, within [min, max]
        Toggle = 4,  // 0 or 1
        Vector = 5,  // a unit vector from two angles: three components
    };
    static constexpr int KindCount = 6;

    ExpressionConstant() = default;

    Kind GetKind() const noexcept { return m_Kind; }
    bool IsVector() const noexcept { return m_Kind == Vector; }
    // The name used in equations.
    const std::string& GetConstant() const noexcept { return m_Name; }
    const std::string& GetDescription() const noexcept { return m_Description; }
    double GetRangeMinimum() const noexcept { return m_Minimum; }
    double GetRangeMaximum() const noexcept { return m_Maximum; }

    Kernel::Counted<const ExpressionConstant> WithName(std::string name) const;
    Kernel::Counted<const ExpressionConstant> WithDescription(std::string description) const;
    Kernel::Counted<const ExpressionConstant> WithRange(double minimum, double maximum) const;

    // Makes an input of kind; null for an unknown kind.
    static Kernel::Counted<const ExpressionConstant>
    Create(int kind, std::string name, std::string description, double minimum, double maximum);

    bool operator==(const ExpressionConstant& other) const noexcept;
    std::size_t Hash() const noexcept;

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override;

protected:
    ExpressionConstant(Kind kind, std::string name, std::string description, double minimum, double maximum)
        : m_Kind(kind)
        , m_Name(std::move(name))
        , m_Description(std::move(description))
        , m_Minimum(minimum)
        , m_Maximum(maximum) {}
    virtual ExpressionConstant* Copy() const { return new ExpressionConstant(*this); }

    Kind m_Kind = Real;
    std::string m_Name;
    std::string m_Description;
    double m_Minimum = 0.0;
    double m_Maximum = 1.0;
};

// The kinds callers name by type.
class ExpressionConstantReal final : public ExpressionConstant {
public:
    ExpressionConstantReal(std::string name, std::string description, double minimum, double maximum)
        : ExpressionConstant(Real, std::move(name), std::move(description), minimum, maximum) {}
    double GetMin() const noexcept { return m_Minimum; }
    double GetMax() const noexcept { return m_Maximum; }

private:
    ExpressionConstant* Copy() const override { return new ExpressionConstantReal(*this); }
};

class ExpressionConstantInteger final : public ExpressionConstant {
public:
    ExpressionConstantInteger(std::string name, std::string description, int minimum, int maximum)
        : ExpressionConstant(Integer, std::move(name), std::move(description), minimum, maximum) {}
    int GetMin() const noexcept { return int(m_Minimum); }
    int GetMax() const noexcept { return int(m_Maximum); }

private:
    ExpressionConstant* Copy() const override { return new ExpressionConstantInteger(*this); }
};

class ExpressionConstantVector final : public ExpressionConstant {
public:
    ExpressionConstantVector(std::string name, std::string description)
        : ExpressionConstant(Vector, std::move(name), std::move(description), 0.0, 0.0) {}

private:
    ExpressionConstant* Copy() const override { return new ExpressionConstantVector(*this); }
};

// The inputs of a config, in order. Immutable.
class ExpressionConstantSet final : public Kernel::Serialisable {
public:
    // Inputs beyond this are refused on load, which keeps a hostile document's work bounded.
    static constexpr std::size_t MaxConstants = 256;

    ExpressionConstantSet() = default;
    explicit ExpressionConstantSet(std::vector<Kernel::Counted<const ExpressionConstant>> constants)
        : m_Constants(std::move(constants)) {}

    std::size_t GetCount() const noexcept { return m_Constants.size(); }
    const ExpressionConstant& Get(std::size_t index) const { return *m_Constants[index]; }
    const std::vector<Kernel::Counted<const ExpressionConstant>>& GetConstants() const noexcept {
        return m_Constants;
    }
    // The index of the input named name, or -1.
    int IndexOf(std::string_view name) const noexcept;

    Kernel::Counted<const ExpressionConstantSet> WithAdded(Kernel::Counted<const ExpressionConstant> c) const;
    Kernel::Counted<const ExpressionConstantSet>
    WithReplaced(std::size_t index, Kernel::Counted<const ExpressionConstant> c) const;
    Kernel::Counted<const ExpressionConstantSet> WithDeleted(std::size_t index) const;

    bool operator==(const ExpressionConstantSet& other) const noexcept;
    std::size_t Hash() const noexcept;

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override;

private:
    std::vector<Kernel::Counted<const ExpressionConstant>> m_Constants;
};

// A vector input's value: two angles in radians, a around the vertical axis and e the elevation.
struct ExpressionConstantValueVec {
    double a = 0.0;
    double e = 0.0;
    bool operator==(const ExpressionConstantValueVec&) const = default;
};
using ExpressionConstantValueReal = double;
using ExpressionConstantValueInteger = int;
using ExpressionConstantValue =
    std::variant<ExpressionConstantValueReal, ExpressionConstantValueInteger, ExpressionConstantValueVec>;

// The current value of each input of a set, in set order.
class ExpressionConstantValues final : public Kernel::Serialisable {
public:
    ExpressionConstantValues() = default;
    explicit ExpressionConstantValues(std::vector<ExpressionConstantValue> values)
        : m_Values(std::move(values)) {}

    // Defaults for every input: the lower end of a number's range (an integer as int), (0, 0) for vectors.
    static Kernel::Counted<ExpressionConstantValues> Create(const ExpressionConstantSet& set);
    Kernel::Counted<ExpressionConstantValues> Clone() const;

    std::size_t GetCount() const noexcept { return m_Values.size(); }
    const ExpressionConstantValue& Get(std::size_t index) const { return m_Values[index]; }
    void Set(std::size_t index, ExpressionConstantValue value) { m_Values.at(index) = value; }
    const std::vector<ExpressionConstantValue>& GetValues() const noexcept { return m_Values; }

    // The value as a number: an integer as a double, a vector's angle a.
    static double ToDouble(const ExpressionConstantValue& value) noexcept;
    // A vector value's unit vector: (cos e cos a, -(sin a cos e), sin e).
    static std::array<double, 3> ToUnitVector(const ExpressionConstantValueVec& value) noexcept;

    bool operator==(const ExpressionConstantValues& other) const noexcept {
        return m_Values == other.m_Values;
    }

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override;

private:
    std::vector<ExpressionConstantValue> m_Values;
};

// The equations, inputs, colour format and angle unit of one texture. Consolidated: equal configs are one
// object. Editing returns a new config.
class ProceduralTextureConfig final : public Kernel::Serialisable {
public:
    enum ColourFormat : int { RGB = 0, CMYK = 1, Lab = 2, Intensity = 3, Alpha = 4 };
    static constexpr int ColourFormatCount = 5;
    // Equations beyond this are refused on load.
    static constexpr std::size_t MaxEquations = 64;

    using Handle = Kernel::Consolidated<ProceduralTextureConfig>;
    using Equations = std::vector<Kernel::Counted<const ProceduralTextureEquation>>;

    ProceduralTextureConfig() = default;
    ProceduralTextureConfig(ColourFormat format, Equations equations,
                            Kernel::Counted<const ExpressionConstantSet> constants, bool anglesInRadians);

    static Handle CreateEmpty(ColourFormat format);
    static Handle Consolidate(const ProceduralTextureConfig& config) { return Handle::Make(config); }
    // The colour format whose pixels a raster format holds; nothing for a format without one.
    static std::optional<ColourFormat> ColourFormatFromRasterFormat(Raster::PixelFormat format);
    static const char* ColourFormatString(ColourFormat format);
    // Channel names in mask order ("R", "G", "B", "A" for RGB), and their count.
    static const std::vector<std::string>& ChannelNames(ColourFormat format);
    static int ChannelCount(ColourFormat format);
    // A channel list as people type it: single-letter names run together ("rgb"), otherwise separated by
    // commas ("l,lb"), in any case. Nothing (error says why) for an unknown channel or an empty list.
    static std::optional<std::uint32_t> ParseChannels(ColourFormat format, std::string_view text,
                                                      std::string* error = nullptr);
    static std::string FormatChannels(ColourFormat format, std::uint32_t mask);
    // "RGB", "CMYK", "Lab", "Intensity", "Alpha" in any case.
    static std::optional<ColourFormat> ParseColourFormat(std::string_view text);

    ColourFormat GetColourFormat() const noexcept { return m_ColourFormat; }
    const Equations& GetEquations() const noexcept { return m_Equations; }
    std::size_t GetEquationCount() const noexcept { return m_Equations.size(); }
    const ExpressionConstantSet& GetConstantSet() const noexcept { return *m_Constants; }
    const Kernel::Counted<const ExpressionConstantSet>& GetConstantSetHandle() const noexcept {
        return m_Constants;
    }
    bool GetAnglesInRadians() const noexcept { return m_AnglesInRadians; }

    // An empty equation writing every channel is appended.
    Handle AddEquation() const;
    Handle AddEquation(const ProceduralTextureEquation& equation) const;
    Handle DeleteEquation(std::size_t index) const;
    Handle ReplaceEquation(std::size_t index, const ProceduralTextureEquation& equation) const;
    Handle ReplaceConstantSet(Kernel::Counted<const ExpressionConstantSet> set) const;
    Handle ChangeAnglesInRadians(bool anglesInRadians) const;

    bool operator==(const ProceduralTextureConfig& other) const noexcept;
    std::size_t Hash() const noexcept;

    void Save(Kernel::OutSerialiser& out) const override;
    // Refuses (false) an unknown colour format, too many equations or inputs, or a broken nested object.
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override;

private:
    ColourFormat m_ColourFormat = RGB;
    Equations m_Equations;
    Kernel::Counted<const ExpressionConstantSet> m_Constants{new ExpressionConstantSet};
    bool m_AnglesInRadians = false;
};

// A config as a preset, with named sets of input values (input presets) that users switch between.
class ProceduralTextureConfigProperty final : public Kernel::Serialisable {
public:
    struct InputsPreset {
        std::string name;
        Kernel::Counted<const ExpressionConstantValues> values;
    };

    ProceduralTextureConfigProperty() = default;
    ProceduralTextureConfigProperty(ProceduralTextureConfig::Handle config,
                                    Kernel::Counted<const ExpressionConstantValues> values)
        : m_Config(std::move(config))
        , m_Values(std::move(values)) {}

    const ProceduralTextureConfig::Handle& GetConfig() const noexcept { return m_Config; }
    const Kernel::Counted<const ExpressionConstantValues>& GetValues() const noexcept { return m_Values; }
    void SetConfig(ProceduralTextureConfig::Handle config) { m_Config = std::move(config); }
    void SetValues(Kernel::Counted<const ExpressionConstantValues> values) { m_Values = std::move(values); }

    // Each returns false when nothing changed (an index out of range, an unchanged name).
    bool AddPreset(std::string name, Kernel::Counted<const ExpressionConstantValues> values);
    bool ReplacePreset(std::size_t index, Kernel::Counted<const ExpressionConstantValues> values);
    bool DeletePreset(std::size_t index);
    bool RenamePreset(std::size_t index, std::string name);
    // The index of the first preset whose values equal values, or -1.
    int FindPresetMatch(const ExpressionConstantValues& values) const;
    const std::vector<InputsPreset>& GetPresets() const noexcept { return m_Presets; }
    bool HasConstants() const noexcept { return m_Config && m_Config->GetConstantSet().GetCount() > 0; }

    void Save(Kernel::OutSerialiser& out) const override;
    bool Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short version) override;
    const Kernel::ClassProperties& GetObjectClassProperties() const override;

private:
    ProceduralTextureConfig::Handle m_Config;
    Kernel::Counted<const ExpressionConstantValues> m_Values;
    std::vector<InputsPreset> m_Presets;
};

// A texture as a JSON document, for files people write by hand:
//   {"colourFormat": "RGB", "anglesInRadians": false,
//    "equations": [{"channels": "rgb", "text": "sin(x / 8) * 0.5 + 0.5"}],
//    "inputs": [{"name": "period", "kind": "real", "description": "...", "min": 1, "max": 100, "value": 8},
//               {"name": "light", "kind": "vector", "value": [0.5, 0.3]}]}
// Kinds: real, integer, angle, percent, toggle, vector (value: the angles a and e in radians).
struct ProceduralTextureDefinition {
    ProceduralTextureConfig::Handle config;
    Kernel::Counted<ExpressionConstantValues> values;
};
// Nothing, with error naming the place and the problem, for text that is not such a document.
std::optional<ProceduralTextureDefinition> ReadProceduralTextureJson(std::string_view text,
                                                                     std::string& error);
std::string WriteProceduralTextureJson(const ProceduralTextureConfig& config,
                                       const ExpressionConstantValues* values);
