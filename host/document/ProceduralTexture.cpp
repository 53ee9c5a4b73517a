// The procedural texture's model: value semantics, editing, hashing and serialisation.
#include "host/document/ProceduralTexture.h"

#include "host/raster/PixelFormat.h"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <cctype>
#include <cmath>
#include <functional>

using Kernel::Counted;
using Kernel::FourCC;
using Kernel::MakeFourCC;

namespace {

// Codes of list entries: a tag letter in the top byte, the index below it.
FourCC Indexed(char tag, std::size_t index) {
    return (FourCC(std::uint8_t(tag)) << 24) | FourCC(index & 0xFFFFFF);
}

void Combine(std::size_t& seed, std::size_t value) noexcept {
    seed ^= value + 0x9e3779b97f4a7c15ull + (seed << 6) + (seed >> 2);
}

std::size_t HashDouble(double value) noexcept {
    return std::hash<double>{}(value == 0.0 ? 0.0 : value); // -0 and +0 compare equal
}

// Reads a count no larger than limit; false when it is absent, negative or too large.
bool LoadCount(const Kernel::InSerialiser& in, FourCC code, std::size_t limit, std::size_t& count) {
    std::int32_t stored = 0;
    if (!in.LoadType(code, stored)) return false;
    if (stored < 0 || std::size_t(stored) > limit) return false;
    count = std::size_t(stored);
    return true;
}

template <class T>
Counted<T> LoadObjectOf(const Kernel::InSerialiser& in, FourCC code, Kernel::FileStore& store) {
    Counted<Kernel::Serialisable> object = in.LoadObject(code, store);
    return Counted<T>(dynamic_cast<T*>(object.Get()));
}

constexpr FourCC CountCode = MakeFourCC("Cnt ");

} // namespace

// ---- ProceduralTextureEquation

static const Kernel::ClassProperties s_EquationClass{
    MakeFourCC("PTEq"), [] { return Counted<Kernel::Serialisable>(new ProceduralTextureEquation); }, 1,
    nullptr, nullptr};

void ProceduralTextureEquation::Save(Kernel::OutSerialiser& out) const {
    out.SaveType(MakeFourCC("Text"), std::string_view(m_Text));
    out.SaveType(MakeFourCC("Mask"), std::uint32_t(m_ChannelMask));
}

bool ProceduralTextureEquation::Load(const Kernel::InSerialiser& in, Kernel::FileStore&, unsigned short) {
    if (!in.LoadType(MakeFourCC("Text"), m_Text)) return false;
    std::uint32_t mask = 0;
    if (!in.LoadType(MakeFourCC("Mask"), mask)) return false;
    m_ChannelMask = mask;
    return true;
}

const Kernel::ClassProperties& ProceduralTextureEquation::GetObjectClassProperties() const {
    return s_EquationClass;
}

// ---- ExpressionConstant

static const Kernel::ClassProperties s_ConstantClass{
    MakeFourCC("ExCn"), [] { return Counted<Kernel::Serialisable>(new ExpressionConstant); }, 1, nullptr,
    nullptr};

Counted<const ExpressionConstant> ExpressionConstant::Create(int kind, std::string name,
                                                             std::string description, double minimum,
                                                             double maximum) {
    switch (kind) {
    case Real:
        return Counted<const ExpressionConstant>(
            new ExpressionConstantReal(std::move(name), std::move(description), minimum, maximum));
    case Integer:
        return Counted<const ExpressionConstant>(new ExpressionConstantInteger(
            std::move(name), std::move(description), int(std::lround(minimum)), int(std::lround(maximum))));
    case Angle:
    case Percent:
    case Toggle:
        return Counted<const ExpressionConstant>(
            new ExpressionConstant(Kind(kind), std::move(name), std::move(description), minimum, maximum));
    case Vector:
        return Counted<const ExpressionConstant>(
            new ExpressionConstantVector(std::move(name), std::move(description)));
    default:
        return {};
    }
}

Counted<const ExpressionConstant> ExpressionConstant::WithName(std::string name) const {
    ExpressionConstant* copy = Copy();
    copy->m_Name = std::move(name);
    return Counted<const ExpressionConstant>(copy);
}

Counted<const ExpressionConstant> ExpressionConstant::WithDescription(std::string description) const {
    ExpressionConstant* copy = Copy();
    copy->m_Description = std::move(description);
    return Counted<const ExpressionConstant>(copy);
}

Counted<const ExpressionConstant> ExpressionConstant::WithRange(double minimum, double maximum) const {
    ExpressionConstant* copy = Copy();
    copy->m_Minimum = minimum;
    copy->m_Maximum = maximum;
    return Counted<const ExpressionConstant>(copy);
}

bool ExpressionConstant::operator==(const ExpressionConstant& other) const noexcept {
    return m_Kind == other.m_Kind && m_Name == other.m_Name && m_Description == other.m_Description &&
           m_Minimum == other.m_Minimum && m_Maximum == other.m_Maximum;
}

std::size_t ExpressionConstant::Hash() const noexcept {
    std::size_t seed = std::size_t(m_Kind);
    Combine(seed, std::hash<std::string>{}(m_Name));
    Combine(seed, std::hash<std::string>{}(m_Description));
    Combine(seed, HashDouble(m_Minimum));
    Combine(seed, HashDouble(m_Maximum));
    return seed;
}

void ExpressionConstant::Save(Kernel::OutSerialiser& out) const {
    out.SaveType(MakeFourCC("Kind"), std::int32_t(m_Kind));
    out.SaveType(MakeFourCC("Name"), std::string_view(m_Name));
    out.SaveType(MakeFourCC("Desc"), std::string_view(m_Description));
    out.SaveType(MakeFourCC("RMin"), m_Minimum);
    out.SaveType(MakeFourCC("RMax"), m_Maximum);
}

bool ExpressionConstant::Load(const Kernel::InSerialiser& in, Kernel::FileStore&, unsigned short) {
    std::int32_t kind = -1;
    if (!in.LoadType(MakeFourCC("Kind"), kind) || kind < 0 || kind >= KindCount) return false;
    if (!in.LoadType(MakeFourCC("Name"), m_Name)) return false;
    in.LoadType(MakeFourCC("Desc"), m_Description);
    in.LoadType(MakeFourCC("RMin"), m_Minimum);
    in.LoadType(MakeFourCC("RMax"), m_Maximum);
    m_Kind = Kind(kind);
    return true;
}

const Kernel::ClassProperties& ExpressionConstant::GetObjectClassProperties() const {
    return s_ConstantClass;
}

// ---- ExpressionConstantSet

static const Kernel::ClassProperties s_SetClass{
    MakeFourCC("ExCS"), [] { return Counted<Kernel::Serialisable>(new ExpressionConstantSet); }, 1, nullptr,
    nullptr};

int ExpressionConstantSet::IndexOf(std::string_view name) const noexcept {
    for (std::size_t i = 0; i < m_Constants.size(); ++i)
        if (m_Constants[i]->GetConstant() == name) return int(i);
    return -1;
}

Counted<const ExpressionConstantSet>
ExpressionConstantSet::WithAdded(Counted<const ExpressionConstant> constant) const {
    auto constants = m_Constants;
    if (constant) constants.push_back(std::move(constant));
    return Counted<const ExpressionConstantSet>(new ExpressionConstantSet(std::move(constants)));
}

Counted<const ExpressionConstantSet>
ExpressionConstantSet::WithReplaced(std::size_t index, Counted<const ExpressionConstant> constant) const {
    auto constants = m_Constants;
    if (index < constants.size() && constant) constants[index] = std::move(constant);
    return Counted<const ExpressionConstantSet>(new ExpressionConstantSet(std::move(constants)));
}

Counted<const ExpressionConstantSet> ExpressionConstantSet::WithDeleted(std::size_t index) const {
    auto constants = m_Constants;
    if (index < constants.size()) constants.erase(constants.begin() + std::ptrdiff_t(index));
    return Counted<const ExpressionConstantSet>(new ExpressionConstantSet(std::move(constants)));
}

bool ExpressionConstantSet::operator==(const ExpressionConstantSet& other) const noexcept {
    if (m_Constants.size() != other.m_Constants.size()) return false;
    for (std::size_t i = 0; i < m_Constants.size(); ++i)
        if (!(*m_Constants[i] == *other.m_Constants[i])) return false;
    return true;
}

std::size_t ExpressionConstantSet::Hash() const noexcept {
    std::size_t seed = m_Constants.size();
    for (const auto& constant : m_Constants)
        Combine(seed, constant->Hash());
    return seed;
}

void ExpressionConstantSet::Save(Kernel::OutSerialiser& out) const {
    out.SaveType(CountCode, std::int32_t(m_Constants.size()));
    for (std::size_t i = 0; i < m_Constants.size(); ++i)
        out.SaveObject(Indexed('c', i), *m_Constants[i]);
}

bool ExpressionConstantSet::Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short) {
    std::size_t count = 0;
    if (!LoadCount(in, CountCode, MaxConstants, count)) return false;
    std::vector<Counted<const ExpressionConstant>> constants;
    for (std::size_t i = 0; i < count; ++i) {
        auto constant = LoadObjectOf<ExpressionConstant>(in, Indexed('c', i), store);
        if (!constant) return false;
        constants.push_back(std::move(constant));
    }
    m_Constants = std::move(constants);
    return true;
}

const Kernel::ClassProperties& ExpressionConstantSet::GetObjectClassProperties() const {
    return s_SetClass;
}

// ---- ExpressionConstantValues

static const Kernel::ClassProperties s_ValuesClass{
    MakeFourCC("ExCV"), [] { return Counted<Kernel::Serialisable>(new ExpressionConstantValues); }, 1,
    nullptr, nullptr};

Counted<ExpressionConstantValues> ExpressionConstantValues::Create(const ExpressionConstantSet& set) {
    std::vector<ExpressionConstantValue> values;
    for (const auto& constant : set.GetConstants()) {
        switch (constant->GetKind()) {
        case ExpressionConstant::Integer:
            values.emplace_back(int(std::lround(constant->GetRangeMinimum())));
            break;
        case ExpressionConstant::Vector:
            values.emplace_back(ExpressionConstantValueVec{});
            break;
        default:
            values.emplace_back(constant->GetRangeMinimum());
            break;
        }
    }
    return Counted<ExpressionConstantValues>(new ExpressionConstantValues(std::move(values)));
}

Counted<ExpressionConstantValues> ExpressionConstantValues::Clone() const {
    return Counted<ExpressionConstantValues>(new ExpressionConstantValues(m_Values));
}

double ExpressionConstantValues::ToDouble(const ExpressionConstantValue& value) noexcept {
    if (const auto* real = std::get_if<ExpressionConstantValueReal>(&value)) return *real;
    if (const auto* whole = std::get_if<ExpressionConstantValueInteger>(&value)) return double(*whole);
    return std::get<ExpressionConstantValueVec>(value).a;
}

std::array<double, 3>
ExpressionConstantValues::ToUnitVector(const ExpressionConstantValueVec& value) noexcept {
    return {std::cos(value.e) * std::cos(value.a), -(std::sin(value.a) * std::cos(value.e)),
            std::sin(value.e)};
}

void ExpressionConstantValues::Save(Kernel::OutSerialiser& out) const {
    out.SaveType(CountCode, std::int32_t(m_Values.size()));
    for (std::size_t i = 0; i < m_Values.size(); ++i) {
        const auto& value = m_Values[i];
        out.SaveType(Indexed('k', i), std::int32_t(value.index()));
        if (const auto* real = std::get_if<ExpressionConstantValueReal>(&value))
            out.SaveType(Indexed('v', i), *real);
        else if (const auto* whole = std::get_if<ExpressionConstantValueInteger>(&value))
            out.SaveType(Indexed('v', i), std::int32_t(*whole));
        else {
            const auto& vec = std::get<ExpressionConstantValueVec>(value);
            out.SaveType(Indexed('v', i), Kernel::PointT<double>{vec.a, vec.e});
        }
    }
}

bool ExpressionConstantValues::Load(const Kernel::InSerialiser& in, Kernel::FileStore&, unsigned short) {
    std::size_t count = 0;
    if (!LoadCount(in, CountCode, ExpressionConstantSet::MaxConstants, count)) return false;
    std::vector<ExpressionConstantValue> values;
    for (std::size_t i = 0; i < count; ++i) {
        std::int32_t kind = -1;
        if (!in.LoadType(Indexed('k', i), kind)) return false;
        if (kind == 0) {
            double real = 0.0;
            if (!in.LoadType(Indexed('v', i), real)) return false;
            values.emplace_back(real);
        } else if (kind == 1) {
            std::int32_t whole = 0;
            if (!in.LoadType(Indexed('v', i), whole)) return false;
            values.emplace_back(int(whole));
        } else if (kind == 2) {
            Kernel::PointT<double> angles{};
            if (!in.LoadType(Indexed('v', i), angles)) return false;
            values.emplace_back(ExpressionConstantValueVec{angles.x, angles.y});
        } else {
            return false;
        }
    }
    m_Values = std::move(values);
    return true;
}

const Kernel::ClassProperties& ExpressionConstantValues::GetObjectClassProperties() const {
    return s_ValuesClass;
}

// ---- ProceduralTextureConfig

static const Kernel::ClassProperties s_ConfigClass{
    MakeFourCC("PTCf"), [] { return Counted<Kernel::Serialisable>(new ProceduralTextureConfig); }, 1, nullptr,
    nullptr};

ProceduralTextureConfig::ProceduralTextureConfig(ColourFormat format, Equations equations,
                                                 Counted<const ExpressionConstantSet> constants,
                                                 bool anglesInRadians)
    : m_ColourFormat(format)
    , m_Equations(std::move(equations))
    , m_Constants(constants ? std::move(constants)
                            : Counted<const ExpressionConstantSet>(new ExpressionConstantSet))
    , m_AnglesInRadians(anglesInRadians) {}

ProceduralTextureConfig::Handle ProceduralTextureConfig::CreateEmpty(ColourFormat format) {
    return Consolidate(ProceduralTextureConfig(format, {}, nullptr, false));
}

std::optional<ProceduralTextureConfig::ColourFormat>
ProceduralTextureConfig::ColourFormatFromRasterFormat(Raster::PixelFormat format) {
    using Raster::PixelFormat;
    switch (format) {
    case PixelFormat::RGBA8:
    case PixelFormat::RGBA16:
    case PixelFormat::RGBAUF:
        return RGB;
    case PixelFormat::CMYKA8:
        return CMYK;
    case PixelFormat::LabA16:
        return Lab;
    case PixelFormat::IA8:
    case PixelFormat::IA16:
        return Intensity;
    case PixelFormat::MaskA8:
    case PixelFormat::MaskA16:
    case PixelFormat::MaskAF:
        return Alpha;
    default:
        return std::nullopt;
    }
}

const char* ProceduralTextureConfig::ColourFormatString(ColourFormat format) {
    switch (format) {
    case RGB:
        return "RGB";
    case CMYK:
        return "CMYK";
    case Lab:
        return "Lab";
    case Intensity:
        return "Intensity";
    case Alpha:
        return "Alpha";
    }
    return "";
}

const std::vector<std::string>& ProceduralTextureConfig::ChannelNames(ColourFormat format) {
    static const std::vector<std::string> names[ColourFormatCount] = {
        {"R", "G", "B", "A"}, {"C", "M", "Y", "K", "A"}, {"L", "LA", "LB", "A"}, {"I", "A"}, {"A"}};
    static const std::vector<std::string> none;
    return format >= 0 && format < ColourFormatCount ? names[format] : none;
}

int ProceduralTextureConfig::ChannelCount(ColourFormat format) {
    return int(ChannelNames(format).size());
}

namespace {
bool SameLetters(std::string_view a, std::string_view b) {
    return a.size() == b.size() && std::equal(a.begin(), a.end(), b.begin(), [](char x, char y) {
               return std::tolower(static_cast<unsigned char>(x)) ==
                      std::tolower(static_cast<unsigned char>(y));
           });
}
} // namespace

std::optional<std::uint32_t>
ProceduralTextureConfig::ParseChannels(ColourFormat format, std::string_view text, std::string* error) {
    const auto& names = ChannelNames(format);
    std::string all;
    for (const auto& name : names)
        all += (all.empty() ? "" : ", ") + name;
    std::uint32_t mask = 0;
    const auto add = [&](std::string_view name) {
        for (std::size_t c = 0; c < names.size(); ++c)
            if (SameLetters(name, names[c])) {
                mask |= 1u << c;
                return true;
            }
        if (error)
            *error = "unknown channel \"" + std::string(name) + "\" (" + ColourFormatString(format) +
                     " has " + all + ")";
        return false;
    };
    if (text.find(',') != std::string_view::npos) {
        std::size_t start = 0;
        while (start <= text.size()) {
            const auto end = std::min(text.find(',', start), text.size());
            if (!add(text.substr(start, end - start))) return std::nullopt;
            start = end + 1;
        }
    } else {
        bool whole = false;
        for (const auto& name : names)
            whole = whole || SameLetters(text, name);
        if (whole) {
            add(text);
        } else {
            for (std::size_t i = 0; i < text.size(); ++i)
                if (!add(text.substr(i, 1))) return std::nullopt;
        }
    }
    if (!mask) {
        if (error)
            *error = "no channel named (" + std::string(ColourFormatString(format)) + " has " + all + ")";
        return std::nullopt;
    }
    return mask;
}

std::string ProceduralTextureConfig::FormatChannels(ColourFormat format, std::uint32_t mask) {
    const auto& names = ChannelNames(format);
    const bool letters =
        std::all_of(names.begin(), names.end(), [](const std::string& n) { return n.size() == 1; });
    std::string text;
    for (std::size_t c = 0; c < names.size(); ++c) {
        if (!(mask & (1u << c))) continue;
        if (!letters && !text.empty()) text += ',';
        for (char letter : names[c])
            text += char(std::tolower(static_cast<unsigned char>(letter)));
    }
    return text;
}

std::optional<ProceduralTextureConfig::ColourFormat>
ProceduralTextureConfig::ParseColourFormat(std::string_view text) {
    for (int f = 0; f < ColourFormatCount; ++f)
        if (SameLetters(text, ColourFormatString(ColourFormat(f)))) return ColourFormat(f);
    return std::nullopt;
}

ProceduralTextureConfig::Handle ProceduralTextureConfig::AddEquation() const {
    return AddEquation(ProceduralTextureEquation({}, (1u << ChannelCount(m_ColourFormat)) - 1));
}

ProceduralTextureConfig::Handle
ProceduralTextureConfig::AddEquation(const ProceduralTextureEquation& equation) const {
    ProceduralTextureConfig copy(*this);
    copy.m_Equations.emplace_back(new ProceduralTextureEquation(equation));
    return Consolidate(copy);
}

ProceduralTextureConfig::Handle ProceduralTextureConfig::DeleteEquation(std::size_t index) const {
    ProceduralTextureConfig copy(*this);
    if (index < copy.m_Equations.size())
        copy.m_Equations.erase(copy.m_Equations.begin() + std::ptrdiff_t(index));
    return Consolidate(copy);
}

ProceduralTextureConfig::Handle
ProceduralTextureConfig::ReplaceEquation(std::size_t index, const ProceduralTextureEquation& equation) const {
    ProceduralTextureConfig copy(*this);
    if (index < copy.m_Equations.size())
        copy.m_Equations[index] =
            Counted<const ProceduralTextureEquation>(new ProceduralTextureEquation(equation));
    return Consolidate(copy);
}

ProceduralTextureConfig::Handle
ProceduralTextureConfig::ReplaceConstantSet(Counted<const ExpressionConstantSet> set) const {
    ProceduralTextureConfig copy(*this);
    if (set) copy.m_Constants = std::move(set);
    return Consolidate(copy);
}

ProceduralTextureConfig::Handle ProceduralTextureConfig::ChangeAnglesInRadians(bool anglesInRadians) const {
    ProceduralTextureConfig copy(*this);
    copy.m_AnglesInRadians = anglesInRadians;
    return Consolidate(copy);
}

bool ProceduralTextureConfig::operator==(const ProceduralTextureConfig& other) const noexcept {
    if (m_ColourFormat != other.m_ColourFormat || m_AnglesInRadians != other.m_AnglesInRadians) return false;
    if (m_Equations.size() != other.m_Equations.size()) return false;
    for (std::size_t i = 0; i < m_Equations.size(); ++i)
        if (!(*m_Equations[i] == *other.m_Equations[i])) return false;
    return *m_Constants == *other.m_Constants;
}

std::size_t ProceduralTextureConfig::Hash() const noexcept {
    std::size_t seed = std::size_t(m_ColourFormat) * 2 + (m_AnglesInRadians ? 1 : 0);
    for (const auto& equation : m_Equations) {
        Combine(seed, std::hash<std::string>{}(equation->GetText()));
        Combine(seed, equation->GetChannelMask());
    }
    Combine(seed, m_Constants->Hash());
    return seed;
}

void ProceduralTextureConfig::Save(Kernel::OutSerialiser& out) const {
    out.SaveType(MakeFourCC("ClrF"), std::int32_t(m_ColourFormat));
    out.SaveType(MakeFourCC("Rads"), m_AnglesInRadians);
    out.SaveType(CountCode, std::int32_t(m_Equations.size()));
    for (std::size_t i = 0; i < m_Equations.size(); ++i)
        out.SaveObject(Indexed('e', i), *m_Equations[i]);
    out.SaveObject(MakeFourCC("CSet"), *m_Constants);
}

bool ProceduralTextureConfig::Load(const Kernel::InSerialiser& in, Kernel::FileStore& store, unsigned short) {
    std::int32_t format = -1;
    if (!in.LoadType(MakeFourCC("ClrF"), format) || format < 0 || format >= ColourFormatCount) return false;
    bool radians = false;
    in.LoadType(MakeFourCC("Rads"), radians);
    std::size_t count = 0;
    if (!LoadCount(in, CountCode, MaxEquations, count)) return false;
    Equations equations;
    for (std::size_t i = 0; i < count; ++i) {
        auto equation = LoadObjectOf<ProceduralTextureEquation>(in, Indexed('e', i), store);
        if (!equation) return false;
        equations.push_back(std::move(equation));
    }
    auto constants = LoadObjectOf<ExpressionConstantSet>(in, MakeFourCC("CSet"), store);
    if (!constants) return false;
    m_ColourFormat = ColourFormat(format);
    m_AnglesInRadians = radians;
    m_Equations = std::move(equations);
    m_Constants = std::move(constants);
    return true;
}

const Kernel::ClassProperties& ProceduralTextureConfig::GetObjectClassProperties() const {
    return s_ConfigClass;
}

// ---- ProceduralTextureConfigProperty

static const Kernel::ClassProperties s_PropertyClass{
    MakeFourCC("PTCP"), [] { return Counted<Kernel::Serialisable>(new ProceduralTextureConfigProperty); }, 1,
    nullptr, nullptr};

bool ProceduralTextureConfigProperty::AddPreset(std::string name,
                                                Counted<const ExpressionConstantValues> values) {
    if (!values || m_Presets.size() >= ExpressionConstantSet::MaxConstants) return false;
    m_Presets.push_back({std::move(name), std::move(values)});
    return true;
}

bool ProceduralTextureConfigProperty::ReplacePreset(std::size_t index,
                                                    Counted<const ExpressionConstantValues> values) {
    if (index >= m_Presets.size() || !values) return false;
    if (m_Presets[index].values && *m_Presets[index].values == *values) return false;
    m_Presets[index].values = std::move(values);
    return true;
}

bool ProceduralTextureConfigProperty::DeletePreset(std::size_t index) {
    if (index >= m_Presets.size()) return false;
    m_Presets.erase(m_Presets.begin() + std::ptrdiff_t(index));
    return true;
}

bool ProceduralTextureConfigProperty::RenamePreset(std::size_t index, std::string name) {
    if (index >= m_Presets.size() || m_Presets[index].name == name) return false;
    m_Presets[index].name = std::move(name);
    return true;
}

int ProceduralTextureConfigProperty::FindPresetMatch(const ExpressionConstantValues& values) const {
    for (std::size_t i = 0; i < m_Presets.size(); ++i)
        if (m_Presets[i].values && *m_Presets[i].values == values) return int(i);
    return -1;
}

void ProceduralTextureConfigProperty::Save(Kernel::OutSerialiser& out) const {
    if (m_Config) out.SaveObject(MakeFourCC("Cnfg"), *m_Config);
    if (m_Values) out.SaveObject(MakeFourCC("CVls"), *m_Values);
    out.SaveType(CountCode, std::int32_t(m_Presets.size()));
    for (std::size_t i = 0; i < m_Presets.size(); ++i) {
        out.SaveType(Indexed('n', i), std::string_view(m_Presets[i].name));
        out.SaveObject(Indexed('p', i), *m_Presets[i].values);
    }
}

bool ProceduralTextureConfigProperty::Load(const Kernel::InSerialiser& in, Kernel::FileStore& store,
                                           unsigned short) {
    auto config = LoadObjectOf<ProceduralTextureConfig>(in, MakeFourCC("Cnfg"), store);
    if (!config) return false;
    auto values = LoadObjectOf<ExpressionConstantValues>(in, MakeFourCC("CVls"), store);
    std::size_t count = 0;
    if (!LoadCount(in, CountCode, ExpressionConstantSet::MaxConstants, count)) return false;
    std::vector<InputsPreset> presets;
    for (std::size_t i = 0; i < count; ++i) {
        InputsPreset preset;
        if (!in.LoadType(Indexed('n', i), preset.name)) return false;
        preset.values = LoadObjectOf<ExpressionConstantValues>(in, Indexed('p', i), store);
        if (!preset.values) return false;
        presets.push_back(std::move(preset));
    }
    m_Config = ProceduralTextureConfig::Consolidate(*config);
    m_Values = std::move(values);
    m_Presets = std::move(presets);
    return true;
}

const Kernel::ClassProperties& ProceduralTextureConfigProperty::GetObjectClassProperties() const {
    return s_PropertyClass;
}

// ---- The JSON form

namespace {

const char* const KindNames[ExpressionConstant::KindCount] = {"real",    "integer", "angle",
                                                              "percent", "toggle",  "vector"};

} // namespace

std::optional<ProceduralTextureDefinition> ReadProceduralTextureJson(std::string_view text,
                                                                     std::string& error) {
    using nlohmann::json;
    const json document = json::parse(text.begin(), text.end(), nullptr, false);
    if (document.is_discarded() || !document.is_object()) {
        error = "not a JSON object";
        return std::nullopt;
    }
    const auto fail = [&](std::string why) -> std::optional<ProceduralTextureDefinition> {
        error = std::move(why);
        return std::nullopt;
    };
    ProceduralTextureConfig::ColourFormat format = ProceduralTextureConfig::RGB;
    if (document.contains("colourFormat")) {
        const auto& value = document["colourFormat"];
        const auto parsed = value.is_string()
                                ? ProceduralTextureConfig::ParseColourFormat(value.get<std::string>())
                                : std::nullopt;
        if (!parsed) return fail("colourFormat: expected RGB, CMYK, Lab, Intensity or Alpha");
        format = *parsed;
    }
    bool radians = false;
    if (document.contains("anglesInRadians")) {
        if (!document["anglesInRadians"].is_boolean()) return fail("anglesInRadians: expected true or false");
        radians = document["anglesInRadians"].get<bool>();
    }
    std::vector<Counted<const ExpressionConstant>> constants;
    std::vector<ExpressionConstantValue> values;
    if (document.contains("inputs")) {
        const auto& inputs = document["inputs"];
        if (!inputs.is_array() || inputs.size() > ExpressionConstantSet::MaxConstants)
            return fail("inputs: expected an array of at most " +
                        std::to_string(ExpressionConstantSet::MaxConstants));
        for (std::size_t i = 0; i < inputs.size(); ++i) {
            const auto& input = inputs[i];
            const std::string where = "inputs[" + std::to_string(i) + "]";
            if (!input.is_object() || !input.contains("name") || !input["name"].is_string())
                return fail(where + ": expected an object with a \"name\"");
            int kind = ExpressionConstant::Real;
            if (input.contains("kind")) {
                const auto& k = input["kind"];
                const auto* found = k.is_string() ? std::find(std::begin(KindNames), std::end(KindNames),
                                                              k.get<std::string>())
                                                  : std::end(KindNames);
                if (found == std::end(KindNames))
                    return fail(where + ".kind: expected real, integer, angle, percent, toggle or vector");
                kind = int(found - std::begin(KindNames));
            }
            const auto number = [&](const char* key, double fallback, double& out) {
                if (!input.contains(key)) {
                    out = fallback;
                    return true;
                }
                if (!input[key].is_number()) return false;
                out = input[key].get<double>();
                return std::isfinite(out);
            };
            double minimum = 0.0, maximum = 1.0;
            if (!number("min", 0.0, minimum) || !number("max", 1.0, maximum))
                return fail(where + ": min and max must be numbers");
            const std::string description = input.contains("description") && input["description"].is_string()
                                                ? input["description"].get<std::string>()
                                                : "";
            constants.push_back(ExpressionConstant::Create(kind, input["name"].get<std::string>(),
                                                           description, minimum, maximum));
            if (kind == ExpressionConstant::Vector) {
                ExpressionConstantValueVec angles;
                if (input.contains("value")) {
                    const auto& v = input["value"];
                    if (!v.is_array() || v.size() != 2 || !v[0].is_number() || !v[1].is_number())
                        return fail(where + ".value: a vector takes [a, e], two angles in radians");
                    angles = {v[0].get<double>(), v[1].get<double>()};
                }
                values.emplace_back(angles);
            } else {
                double value = kind == ExpressionConstant::Real && !input.contains("value") ? 1.0 : minimum;
                if (!number("value", value, value)) return fail(where + ".value: expected a number");
                if (kind == ExpressionConstant::Integer)
                    values.emplace_back(int(std::clamp(std::round(value), -2147483648.0, 2147483647.0)));
                else
                    values.emplace_back(value);
            }
        }
    }
    Counted<const ExpressionConstantSet> set(new ExpressionConstantSet(std::move(constants)));
    auto config =
        ProceduralTextureConfig::CreateEmpty(format)->ReplaceConstantSet(set)->ChangeAnglesInRadians(radians);
    if (!document.contains("equations") || !document["equations"].is_array())
        return fail("equations: expected an array");
    const auto& equations = document["equations"];
    if (equations.size() > ProceduralTextureConfig::MaxEquations)
        return fail("equations: at most " + std::to_string(ProceduralTextureConfig::MaxEquations));
    for (std::size_t i = 0; i < equations.size(); ++i) {
        const auto& equation = equations[i];
        const std::string where = "equations[" + std::to_string(i) + "]";
        if (!equation.is_object() || !equation.contains("text") || !equation["text"].is_string())
            return fail(where + ": expected an object with a \"text\"");
        std::uint32_t mask = (1u << ProceduralTextureConfig::ChannelCount(format)) - 1;
        if (equation.contains("channels")) {
            std::string why;
            const auto parsed = equation["channels"].is_string()
                                    ? ProceduralTextureConfig::ParseChannels(
                                          format, equation["channels"].get<std::string>(), &why)
                                    : std::nullopt;
            if (!parsed) return fail(where + ".channels: " + (why.empty() ? "expected a string" : why));
            mask = *parsed;
        }
        config = config->AddEquation(ProceduralTextureEquation(equation["text"].get<std::string>(), mask));
    }
    return ProceduralTextureDefinition{
        config, Counted<ExpressionConstantValues>(new ExpressionConstantValues(std::move(values)))};
}

std::string WriteProceduralTextureJson(const ProceduralTextureConfig& config,
                                       const ExpressionConstantValues* values) {
    using nlohmann::json;
    json document;
    document["colourFormat"] = ProceduralTextureConfig::ColourFormatString(config.GetColourFormat());
    document["anglesInRadians"] = config.GetAnglesInRadians();
    json equations = json::array();
    for (const auto& equation : config.GetEquations())
        equations.push_back({{"channels", ProceduralTextureConfig::FormatChannels(
                                              config.GetColourFormat(), equation->GetChannelMask())},
                             {"text", equation->GetText()}});
    document["equations"] = equations;
    json inputs = json::array();
    const auto& set = config.GetConstantSet();
    for (std::size_t i = 0; i < set.GetCount(); ++i) {
        const auto& constant = set.Get(i);
        json input = {{"name", constant.GetConstant()},
                      {"kind", KindNames[constant.GetKind()]},
                      {"description", constant.GetDescription()}};
        if (!constant.IsVector()) {
            input["min"] = constant.GetRangeMinimum();
            input["max"] = constant.GetRangeMaximum();
        }
        if (values && i < values->GetCount()) {
            const auto& value = values->Get(i);
            if (const auto* vec = std::get_if<ExpressionConstantValueVec>(&value))
                input["value"] = {vec->a, vec->e};
            else
                input["value"] = ExpressionConstantValues::ToDouble(value);
        }
        inputs.push_back(input);
    }
    document["inputs"] = inputs;
    return document.dump(2) + "\n";
}
