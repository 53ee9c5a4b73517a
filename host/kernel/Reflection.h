#pragma once
// Reflected properties: typed, labelled values bound to an object's accessors, for panels and scripts.

#include "host/kernel/Countable.h"
#include "host/kernel/FourCC.h"
#include "host/kernel/Geometry.h"
#include "host/kernel/String.h"

#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace Kernel {

// A small host-defined fact attached to a reflected property.
class ReflectedAttribute : public virtual Countable {
public:
    virtual std::string Describe() const = 0;
};

class PrecisionAttribute : public ReflectedAttribute {
public:
    explicit PrecisionAttribute(int decimals)
        : m_Decimals(decimals) {}
    int GetDecimals() const noexcept { return m_Decimals; }
    std::string Describe() const override { return "precision=" + std::to_string(m_Decimals); }

private:
    int m_Decimals;
};

class SensitivityAttribute : public ReflectedAttribute {
public:
    explicit SensitivityAttribute(double perPixel)
        : m_PerPixel(perPixel) {}
    double GetSensitivity() const noexcept { return m_PerPixel; }
    std::string Describe() const override;

private:
    double m_PerPixel;
};

class NoHardLimitAttribute : public ReflectedAttribute {
public:
    std::string Describe() const override { return "no-hard-limit"; }
};

class RepresentsOpacityAttribute : public ReflectedAttribute {
public:
    std::string Describe() const override { return "opacity"; }
};

class ContinuousAttribute : public ReflectedAttribute {
public:
    std::string Describe() const override { return "continuous"; }
};

class DescriptionAttribute : public ReflectedAttribute {
public:
    explicit DescriptionAttribute(LocalisedString text)
        : m_Text(std::move(text)) {}
    const LocalisedString& GetText() const noexcept { return m_Text; }
    std::string Describe() const override { return "description=\"" + m_Text.GetEnglish() + "\""; }

private:
    LocalisedString m_Text;
};

// Whether the property applies at the moment (a disabled control otherwise).
class ValidityAttribute : public ReflectedAttribute {
public:
    explicit ValidityAttribute(std::function<bool()> isValid)
        : m_IsValid(std::move(isValid)) {}
    bool IsValid() const { return !m_IsValid || m_IsValid(); }
    std::string Describe() const override { return IsValid() ? "valid" : "invalid"; }

private:
    std::function<bool()> m_IsValid;
};

class ImageAttribute : public ReflectedAttribute {
public:
    explicit ImageAttribute(std::string name)
        : m_Name(std::move(name)) {}
    const std::string& GetName() const noexcept { return m_Name; }
    std::string Describe() const override { return "image=" + m_Name; }

private:
    std::string m_Name;
};

// How a unit-range value is shown: which physical unit it carries. The numbers are the host's unit
// categories.
enum class UnitKind { None = 0, Percent = 1, Degrees = 2, Pixels = 5 };
std::string_view UnitKindName(UnitKind kind);

class ValueTypeAttribute : public ReflectedAttribute {
public:
    explicit ValueTypeAttribute(UnitKind kind)
        : m_Kind(kind) {}
    UnitKind GetKind() const noexcept { return m_Kind; }
    std::string Describe() const override { return "unit=" + std::string(UnitKindName(m_Kind)); }

private:
    UnitKind m_Kind;
};

using AttributeList = std::vector<Counted<ReflectedAttribute>>;

// One reflected property. Value access goes through text so that generic front ends (panels, scripts)
// need not know the concrete type; typed subclasses add typed access.
class Reflected : public virtual Countable {
public:
    // The value changes without user action (a panel should poll it).
    class VolatileAttribute : public ReflectedAttribute {
    public:
        std::string Describe() const override { return "volatile"; }
    };

    Reflected(FourCC identifier, LocalisedString label, AttributeList attributes = {})
        : m_Identifier(identifier)
        , m_Label(std::move(label))
        , m_Attributes(std::move(attributes)) {}

    FourCC GetIdentifier() const noexcept { return m_Identifier; }
    const LocalisedString& GetLabel() const noexcept { return m_Label; }
    const AttributeList& GetAttributes() const noexcept { return m_Attributes; }
    template <class A>
    const A* FindAttribute() const {
        for (const auto& attribute : m_Attributes)
            if (auto* found = dynamic_cast<const A*>(attribute.Get())) return found;
        return nullptr;
    }

    virtual std::string GetTypeName() const = 0;
    virtual std::string GetValueText() const = 0;
    // False when the text does not parse as a value of this property.
    virtual bool SetValueText(std::string_view text) = 0;
    // "range=0..100" and the like; empty when the type has no further description.
    virtual std::string DescribeRange() const { return {}; }

private:
    FourCC m_Identifier;
    LocalisedString m_Label;
    AttributeList m_Attributes;
};

// A double shown within a display range.
class ReflectedUnitRange : public Reflected {
public:
    ReflectedUnitRange(FourCC identifier, LocalisedString label, double minimum, double maximum,
                       AttributeList attributes = {})
        : Reflected(identifier, std::move(label), std::move(attributes))
        , m_Minimum(minimum)
        , m_Maximum(maximum) {}

    double GetMinimum() const noexcept { return m_Minimum; }
    double GetMaximum() const noexcept { return m_Maximum; }
    virtual double GetValue() const = 0;
    virtual void SetValue(double value) = 0;

    std::string GetTypeName() const override { return "unit-range"; }
    std::string GetValueText() const override;
    bool SetValueText(std::string_view text) override;
    std::string DescribeRange() const override;

private:
    double m_Minimum;
    double m_Maximum;
};

// A unit range bound to a getter and a setter.
class ReflectedUnitRangeBinding : public ReflectedUnitRange {
public:
    ReflectedUnitRangeBinding(FourCC identifier, LocalisedString label, double minimum, double maximum,
                              std::function<double()> getter, std::function<void(double)> setter,
                              AttributeList attributes = {})
        : ReflectedUnitRange(identifier, std::move(label), minimum, maximum, std::move(attributes))
        , m_Getter(std::move(getter))
        , m_Setter(std::move(setter)) {}

    double GetValue() const override { return m_Getter(); }
    void SetValue(double value) override { m_Setter(value); }

private:
    std::function<double()> m_Getter;
    std::function<void(double)> m_Setter;
};

// A file-system path as a reflected value.
struct Path {
    std::string value;
    friend bool operator==(const Path&, const Path&) = default;
};

// Text form of the values a ReflectedBinding can carry; specialised per type.
template <class T>
struct ReflectedValueTraits;

template <>
struct ReflectedValueTraits<double> {
    static constexpr std::string_view kName = "double";
    // The shortest text that reads back as the same value.
    static std::string Format(double value);
    // The whole text as one finite number.
    static bool Parse(std::string_view text, double& value);
};
template <>
struct ReflectedValueTraits<bool> {
    static constexpr std::string_view kName = "bool";
    static std::string Format(bool value);
    static bool Parse(std::string_view text, bool& value);
};
template <>
struct ReflectedValueTraits<int> {
    static constexpr std::string_view kName = "int";
    static std::string Format(int value);
    static bool Parse(std::string_view text, int& value);
};
template <>
struct ReflectedValueTraits<PointT<double>> {
    static constexpr std::string_view kName = "point";
    static std::string Format(PointT<double> value);
    static bool Parse(std::string_view text, PointT<double>& value);
};
template <>
struct ReflectedValueTraits<UTF8String> {
    static constexpr std::string_view kName = "string";
    static std::string Format(const UTF8String& value) { return value.str(); }
    static bool Parse(std::string_view text, UTF8String& value) {
        value = UTF8String(text);
        return true;
    }
};
template <>
struct ReflectedValueTraits<Path> {
    static constexpr std::string_view kName = "path";
    static std::string Format(const Path& value) { return value.value; }
    static bool Parse(std::string_view text, Path& value) {
        value.value = std::string(text);
        return true;
    }
};

// A value of type T bound to a getter and a setter.
template <class T>
class ReflectedBinding : public Reflected {
public:
    ReflectedBinding(FourCC identifier, LocalisedString label, std::function<T()> getter,
                     std::function<void(T)> setter, AttributeList attributes = {})
        : Reflected(identifier, std::move(label), std::move(attributes))
        , m_Getter(std::move(getter))
        , m_Setter(std::move(setter)) {}

    T GetValue() const { return m_Getter(); }
    // A binding made without a setter is read-only and ignores values.
    void SetValue(T value) {
        if (m_Setter) m_Setter(std::move(value));
    }
    bool IsReadOnly() const noexcept { return !m_Setter; }

    std::string GetTypeName() const override { return std::string(ReflectedValueTraits<T>::kName); }
    std::string GetValueText() const override { return ReflectedValueTraits<T>::Format(GetValue()); }
    bool SetValueText(std::string_view text) override {
        T value{};
        if (IsReadOnly() || !ReflectedValueTraits<T>::Parse(text, value)) return false;
        SetValue(std::move(value));
        return true;
    }

private:
    std::function<T()> m_Getter;
    std::function<void(T)> m_Setter;
};

// A choice among named values, bound to an index getter and setter.
class ReflectedEnum : public Reflected {
public:
    ReflectedEnum(FourCC identifier, LocalisedString label, std::vector<LocalisedString> choices,
                  std::function<int()> getter, std::function<void(int)> setter,
                  AttributeList attributes = {});

    const std::vector<LocalisedString>& GetChoices() const noexcept { return m_Choices; }
    int GetValue() const { return m_Getter(); }
    void SetValue(int index) { m_Setter(index); }

    std::string GetTypeName() const override { return "enum"; }
    std::string GetValueText() const override;
    // Accepts the English name of a choice or its index.
    bool SetValueText(std::string_view text) override;
    std::string DescribeRange() const override;

private:
    std::vector<LocalisedString> m_Choices;
    std::function<int()> m_Getter;
    std::function<void(int)> m_Setter;
};

// A blend-mode choice; the modes are the host's, named here for display.
class ReflectedBlendMode : public ReflectedEnum {
public:
    ReflectedBlendMode(FourCC identifier, LocalisedString label, std::function<int()> getter,
                       std::function<void(int)> setter, AttributeList attributes = {});
    std::string GetTypeName() const override { return "blend-mode"; }
    static const std::vector<LocalisedString>& GetBlendModeNames();
};

// A button: setting any value runs the action.
class ReflectedAction : public Reflected {
public:
    ReflectedAction(FourCC identifier, LocalisedString label, std::function<void()> action,
                    AttributeList attributes = {})
        : Reflected(identifier, std::move(label), std::move(attributes))
        , m_Action(std::move(action)) {}

    void Invoke() { m_Action(); }
    std::string GetTypeName() const override { return "action"; }
    std::string GetValueText() const override { return {}; }
    bool SetValueText(std::string_view) override {
        Invoke();
        return true;
    }

private:
    std::function<void()> m_Action;
};

using ReflectedList = std::vector<Counted<Reflected>>;

// An object that publishes reflected properties.
class Reflectable : public virtual Countable {
public:
    virtual ReflectedList EnumerateReflecteds() { return {}; }
    virtual ReflectedList EnumerateQuickActions() { return {}; }
};

} // namespace Kernel
