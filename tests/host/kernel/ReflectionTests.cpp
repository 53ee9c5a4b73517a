#include "host/kernel/Reflection.h"
#include "host/renderer/Colour.h"

#include <gtest/gtest.h>

#include <limits>

using namespace Kernel;
using namespace Kernel::Literals;
using Renderer::ConsolidatedColour;

namespace {

// Clang 14 emits a call to the consteval _4cc (and fails to link) when it appears in a default member
// initializer of a class template, so the codes used there are constants.
constexpr FourCC kTestCode = "test"_4cc;
constexpr FourCC kRangeCode = "rang"_4cc;

// A binding over a local variable, counting the setter's calls.
template <class T>
struct Bound {
    T value{};
    int sets = 0;
    Counted<ReflectedBinding<T>> reflected = MakeCounted<ReflectedBinding<T>>(
        kTestCode, LocalisedString("Test", "Tests"), [this] { return value; },
        [this](T v) {
            value = std::move(v);
            ++sets;
        });
};

struct BoundRange {
    double value = 0.0;
    int sets = 0;
    Counted<ReflectedUnitRange> reflected;
    BoundRange(double minimum, double maximum, AttributeList attributes = {})
        : reflected(MakeCounted<ReflectedUnitRangeBinding>(
              kRangeCode, LocalisedString("Radius", "Tests"), minimum, maximum, [this] { return value; },
              [this](double v) {
                  value = v;
                  ++sets;
              },
              std::move(attributes))) {}
};

} // namespace

TEST(Reflection, UnitKindsAreTheHostsCategories) {
    EXPECT_EQ(UnitKindName(UnitKind::None), "none");
    EXPECT_EQ(UnitKindName(UnitKind::Pixels), "pixels");
    EXPECT_EQ(UnitKindName(UnitKind::Degrees), "degrees");
    EXPECT_EQ(UnitKindName(UnitKind::Percent), "percent");
    // The numbers are part of the contract: a host reads them, not the names.
    EXPECT_EQ(int(UnitKind::None), 0);
    EXPECT_EQ(int(UnitKind::Percent), 1);
    EXPECT_EQ(int(UnitKind::Degrees), 2);
    EXPECT_EQ(int(UnitKind::Pixels), 5);
}

TEST(Reflection, Attributes) {
    EXPECT_EQ(SensitivityAttribute(0.5).Describe(), "sensitivity=0.5");
    EXPECT_EQ(SensitivityAttribute(0.1).Describe(), "sensitivity=0.1");
    EXPECT_EQ(ValueTypeAttribute(UnitKind::Degrees).Describe(), "unit=degrees");
    EXPECT_EQ(PrecisionAttribute(2).Describe(), "precision=2");

    BoundRange range(0, 100,
                     {MakeCounted<PrecisionAttribute>(1), MakeCounted<ValueTypeAttribute>(UnitKind::Pixels),
                      MakeCounted<NoHardLimitAttribute>()});
    ASSERT_NE(range.reflected->FindAttribute<ValueTypeAttribute>(), nullptr);
    EXPECT_EQ(range.reflected->FindAttribute<ValueTypeAttribute>()->GetKind(), UnitKind::Pixels);
    EXPECT_NE(range.reflected->FindAttribute<NoHardLimitAttribute>(), nullptr);
    EXPECT_EQ(range.reflected->FindAttribute<SensitivityAttribute>(), nullptr);
    EXPECT_EQ(range.reflected->GetIdentifier(), kRangeCode);
    EXPECT_EQ(range.reflected->GetLabel().GetEnglish(), "Radius");
}

TEST(Reflection, UnitRangeText) {
    BoundRange range(0, 100);
    EXPECT_EQ(range.reflected->GetTypeName(), "unit-range");
    EXPECT_EQ(range.reflected->DescribeRange(), "range=0..100");
    EXPECT_EQ(BoundRange(-0.5, 1.25).reflected->DescribeRange(), "range=-0.5..1.25");

    range.value = 0.1;
    EXPECT_EQ(range.reflected->GetValueText(), "0.1"); // shortest text that reads back
    range.value = 1.0 / 3.0;
    const std::string third = range.reflected->GetValueText();
    range.value = 0;
    ASSERT_TRUE(range.reflected->SetValueText(third));
    EXPECT_EQ(range.value, 1.0 / 3.0);

    EXPECT_TRUE(range.reflected->SetValueText("25"));
    EXPECT_EQ(range.value, 25.0);
    EXPECT_TRUE(range.reflected->SetValueText("-2.5e1"));
    EXPECT_EQ(range.value, -25.0);
    // Beyond the display range: accepted, some properties have no hard limit.
    EXPECT_TRUE(range.reflected->SetValueText("150"));
    EXPECT_EQ(range.value, 150.0);
    EXPECT_EQ(range.sets, 4);

    for (const char* bad :
         {"", " 1", "1 ", "abc", "1.5x", "1,5", "nan", "inf", "-inf", "1e999", "0x10", "+1"})
        EXPECT_FALSE(range.reflected->SetValueText(bad)) << bad;
    EXPECT_EQ(range.value, 150.0);
    EXPECT_EQ(range.sets, 4);
}

TEST(Reflection, BoolText) {
    Bound<bool> b;
    EXPECT_EQ(b.reflected->GetTypeName(), "bool");
    EXPECT_EQ(b.reflected->GetValueText(), "false");
    b.value = true;
    EXPECT_EQ(b.reflected->GetValueText(), "true");
    for (const char* yes : {"true", "1", "yes", "on", "TRUE", "Yes"}) {
        b.value = false;
        EXPECT_TRUE(b.reflected->SetValueText(yes)) << yes;
        EXPECT_TRUE(b.value) << yes;
    }
    for (const char* no : {"false", "0", "no", "off", "Off"}) {
        b.value = true;
        EXPECT_TRUE(b.reflected->SetValueText(no)) << no;
        EXPECT_FALSE(b.value) << no;
    }
    const int sets = b.sets;
    for (const char* bad : {"", "2", "truee", "t", " true", "yes ", "-1", "nope"})
        EXPECT_FALSE(b.reflected->SetValueText(bad)) << bad;
    EXPECT_EQ(b.sets, sets);
}

TEST(Reflection, IntText) {
    Bound<int> i;
    EXPECT_EQ(i.reflected->GetTypeName(), "int");
    i.value = -42;
    EXPECT_EQ(i.reflected->GetValueText(), "-42");
    EXPECT_TRUE(i.reflected->SetValueText("2147483647"));
    EXPECT_EQ(i.value, std::numeric_limits<int>::max());
    EXPECT_TRUE(i.reflected->SetValueText("-2147483648"));
    EXPECT_EQ(i.value, std::numeric_limits<int>::min());
    EXPECT_TRUE(i.reflected->SetValueText("007"));
    EXPECT_EQ(i.value, 7);
    for (const char* bad :
         {"", "2147483648", "-2147483649", "1.0", " 1", "1 ", "0x10", "1e3", "+1", "-", "abc"})
        EXPECT_FALSE(i.reflected->SetValueText(bad)) << bad;
    EXPECT_EQ(i.value, 7);
}

TEST(Reflection, PointText) {
    Bound<PointT<double>> p;
    EXPECT_EQ(p.reflected->GetTypeName(), "point");
    p.value = {1.5, -2};
    EXPECT_EQ(p.reflected->GetValueText(), "1.5,-2");
    p.value = {0.1, 1e300};
    const std::string text = p.reflected->GetValueText();
    EXPECT_EQ(text, "0.1,1e+300");
    p.value = {};
    ASSERT_TRUE(p.reflected->SetValueText(text));
    EXPECT_EQ(p.value, (PointT<double>{0.1, 1e300}));
    for (const char* bad :
         {"", "1", "1,2,3", ",", "1,", ",2", "a,b", "1 ,2", "1, 2", "nan,1", "1;2", "(1,2)"})
        EXPECT_FALSE(p.reflected->SetValueText(bad)) << bad;
    EXPECT_EQ(p.value, (PointT<double>{0.1, 1e300}));
}

TEST(Reflection, StringAndPathText) {
    Bound<UTF8String> s;
    EXPECT_EQ(s.reflected->GetTypeName(), "string");
    EXPECT_TRUE(s.reflected->SetValueText("Caf\xC3\xA9, 1,2"));
    EXPECT_EQ(s.value, UTF8String("Caf\xC3\xA9, 1,2"));
    EXPECT_EQ(s.reflected->GetValueText(), "Caf\xC3\xA9, 1,2");
    EXPECT_TRUE(s.reflected->SetValueText(""));
    EXPECT_TRUE(s.value.empty());

    Bound<Path> path;
    EXPECT_EQ(path.reflected->GetTypeName(), "path");
    EXPECT_TRUE(path.reflected->SetValueText("/tmp/some file.png"));
    EXPECT_EQ(path.value, Path{"/tmp/some file.png"});
    EXPECT_EQ(path.reflected->GetValueText(), "/tmp/some file.png");
}

TEST(Reflection, EnumText) {
    int index = 1;
    int sets = 0;
    const auto e = MakeCounted<ReflectedEnum>(
        "enum"_4cc, LocalisedString("Mode", "Tests"),
        std::vector<LocalisedString>{{"One", "Tests"}, {"Two", "Tests"}, {"Three", "Tests"}},
        [&] { return index; },
        [&](int v) {
            index = v;
            ++sets;
        });
    EXPECT_EQ(e->GetTypeName(), "enum");
    EXPECT_EQ(e->GetValueText(), "Two");
    EXPECT_EQ(e->DescribeRange(), "choices=One|Two|Three");
    EXPECT_TRUE(e->SetValueText("Three"));
    EXPECT_EQ(index, 2);
    EXPECT_TRUE(e->SetValueText("0"));
    EXPECT_EQ(index, 0);
    EXPECT_EQ(e->GetValueText(), "One");
    for (const char* bad : {"", "3", "-1", "two", "Four", " 1", "1.0", "One|Two"})
        EXPECT_FALSE(e->SetValueText(bad)) << bad;
    EXPECT_EQ(index, 0);
    EXPECT_EQ(sets, 2);
    index = 7; // no choice of that index: no name
    EXPECT_EQ(e->GetValueText(), "");
}

TEST(Reflection, BlendModes) {
    const auto& names = ReflectedBlendMode::GetBlendModeNames();
    ASSERT_EQ(names.size(), 16u);
    EXPECT_EQ(names.front().GetEnglish(), "Normal");
    EXPECT_EQ(names.back().GetEnglish(), "Luminosity");
    for (const auto& name : names)
        EXPECT_EQ(name.GetContext(), "Blend mode");

    int mode = 0;
    const auto blend = MakeCounted<ReflectedBlendMode>(
        "blnd"_4cc, LocalisedString("Blend", "Tests"), [&] { return mode; }, [&](int v) { mode = v; });
    EXPECT_EQ(blend->GetTypeName(), "blend-mode");
    EXPECT_EQ(blend->GetValueText(), "Normal");
    EXPECT_TRUE(blend->SetValueText("Colour Dodge"));
    EXPECT_EQ(mode, 6);
    EXPECT_EQ(blend->GetValueText(), "Colour Dodge");
    EXPECT_TRUE(blend->SetValueText("15"));
    EXPECT_EQ(blend->GetValueText(), "Luminosity");
    EXPECT_FALSE(blend->SetValueText("16"));
    EXPECT_FALSE(blend->SetValueText("Color Dodge"));
    EXPECT_EQ(blend->DescribeRange().rfind("choices=Normal|Multiply|Screen|", 0), 0u);
}

TEST(Reflection, ColourText) {
    Bound<ConsolidatedColour> c;
    EXPECT_EQ(c.reflected->GetTypeName(), "colour");
    c.value = {1.0f, 0.5f, 0.25f, 1.0f};
    EXPECT_EQ(c.reflected->GetValueText(), "1,0.5,0.25,1");
    c.value = {0.1f, 1.0f / 3.0f, -0.0f, 2.5f}; // not clamped
    const std::string text = c.reflected->GetValueText();
    EXPECT_EQ(text.rfind("0.1,", 0), 0u); // the shortest float text, not the double's digits
    c.value = {};
    ASSERT_TRUE(c.reflected->SetValueText(text));
    EXPECT_EQ(c.value, (ConsolidatedColour{0.1f, 1.0f / 3.0f, -0.0f, 2.5f}));
    const int sets = c.sets;
    for (const char* bad : {"", "1,2,3", "1,2,3,4,5", "1,,3,4", "1,2,3,4,", ",1,2,3", "a,b,c,d", "nan,0,0,0",
                            "1,2,3,inf", "1, 2,3,4", "1e99,0,0,0"})
        EXPECT_FALSE(c.reflected->SetValueText(bad)) << bad;
    EXPECT_EQ(c.sets, sets);
}

TEST(Reflection, Action) {
    int runs = 0;
    const auto action =
        MakeCounted<ReflectedAction>("actn"_4cc, LocalisedString("Reset", "Tests"), [&] { ++runs; });
    EXPECT_EQ(action->GetTypeName(), "action");
    EXPECT_EQ(action->GetValueText(), "");
    EXPECT_TRUE(action->SetValueText(""));
    EXPECT_TRUE(action->SetValueText("anything"));
    EXPECT_EQ(runs, 2);
    action->Invoke();
    EXPECT_EQ(runs, 3);
}

TEST(Reflection, GenericAccessThroughTheBase) {
    int value = 3;
    ReflectedList list;
    list.push_back(MakeCounted<ReflectedBinding<int>>(
        "ival"_4cc, LocalisedString("Count", "Tests"), [&] { return value; }, [&](int v) { value = v; }));
    list.push_back(MakeCounted<ReflectedBinding<ConsolidatedColour>>(
        "colr"_4cc, LocalisedString("Colour", "Tests"),
        [] {
            return ConsolidatedColour{1, 0, 0, 1};
        },
        [](ConsolidatedColour) {}));
    EXPECT_EQ(list[0]->GetValueText(), "3");
    EXPECT_TRUE(list[0]->SetValueText("9"));
    EXPECT_EQ(value, 9);
    EXPECT_EQ(list[0]->DescribeRange(), "");
    EXPECT_EQ(list[1]->GetValueText(), "1,0,0,1");
}

TEST(Localisation, CatalogueLookup) {
    const LocalisedString label("Radius", "Tests");
    EXPECT_EQ(label.Localise(), "Radius");
    LocaleCatalogue::GetInstance().Add("Tests", "Radius", "Rayon");
    EXPECT_EQ(label.Localise(), "Rayon");
    EXPECT_EQ(LocalisedString("Radius", "Other").Localise(), "Radius");
    LocaleCatalogue::GetInstance().Clear();
    EXPECT_EQ(label.Localise(), "Radius");
}
