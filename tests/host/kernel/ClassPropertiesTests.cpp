#include "TestObjects.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>

using namespace Kernel;
using namespace Kernel::Literals;
using namespace KernelTests;

TEST(ClassProperties, FindsRegisteredClasses) {
    EXPECT_EQ(ClassProperties::Find(Sample::kClassCode), &Sample::s_Properties);
    EXPECT_EQ(ClassProperties::Find(Tiny::kClassCode), &Tiny::s_Properties);
    EXPECT_EQ(ClassProperties::Find("Circ"_4cc), &Hierarchy::s_Circle);
    EXPECT_EQ(ClassProperties::Find("None"_4cc), nullptr);
    EXPECT_EQ(ClassProperties::Find(0), nullptr); // abstract bases are not registered
    EXPECT_EQ(Sample::s_Properties.GetVersion(), Sample::kVersion);
    EXPECT_EQ(Sample::s_Properties.GetClassCode(), Sample::kClassCode);
}

TEST(ClassProperties, CreatesObjects) {
    const long live = Countable::GetLiveObjectCount();
    {
        Counted<Serialisable> object = ClassProperties::Find(Sample::kClassCode)->CreateObject();
        ASSERT_TRUE(object);
        EXPECT_EQ(&object->GetObjectClassProperties(), &Sample::s_Properties);
        EXPECT_TRUE(CountedCast<Sample>(object));
        // No factory: nothing is created.
        EXPECT_FALSE(Hierarchy::s_Shape.CreateObject());
    }
    EXPECT_EQ(Countable::GetLiveObjectCount(), live);
}

TEST(ClassProperties, IsKindOf) {
    EXPECT_TRUE(Hierarchy::s_Circle.IsKindOf(Hierarchy::s_Circle));
    EXPECT_TRUE(Hierarchy::s_Circle.IsKindOf(Hierarchy::s_Shape));
    EXPECT_TRUE(Hierarchy::s_Circle.IsKindOf(Hierarchy::s_Abstract));
    EXPECT_TRUE(Hierarchy::s_Shape.IsKindOf(Hierarchy::s_Abstract));
    EXPECT_FALSE(Hierarchy::s_Shape.IsKindOf(Hierarchy::s_Circle));
    EXPECT_FALSE(Hierarchy::s_Abstract.IsKindOf(Hierarchy::s_Shape));
    EXPECT_FALSE(Sample::s_Properties.IsKindOf(Hierarchy::s_Abstract));
    EXPECT_EQ(Hierarchy::s_Circle.GetBase(), &Hierarchy::s_Shape);
}

TEST(ClassProperties, GetRegisteredIsSortedByCode) {
    const auto classes = ClassProperties::GetRegistered();
    EXPECT_TRUE(std::is_sorted(classes.begin(), classes.end(),
                               [](auto* a, auto* b) { return a->GetClassCode() < b->GetClassCode(); }));
    for (const ClassProperties* expected :
         {&Sample::s_Properties, &Tiny::s_Properties, &Hierarchy::s_Shape, &Hierarchy::s_Circle})
        EXPECT_NE(std::find(classes.begin(), classes.end(), expected), classes.end());
    EXPECT_EQ(std::find(classes.begin(), classes.end(), &Hierarchy::s_Abstract), classes.end());
}

TEST(ClassProperties, UnregistersOnDestruction) {
    const FourCC code = "Tmp1"_4cc;
    ASSERT_EQ(ClassProperties::Find(code), nullptr);
    const std::size_t before = ClassProperties::GetRegistered().size();
    {
        const ClassProperties temporary(code, nullptr, 1, nullptr, nullptr);
        EXPECT_EQ(ClassProperties::Find(code), &temporary);
        EXPECT_EQ(ClassProperties::GetRegistered().size(), before + 1);
    }
    EXPECT_EQ(ClassProperties::Find(code), nullptr);
    EXPECT_EQ(ClassProperties::GetRegistered().size(), before);
}

TEST(ClassProperties, DuplicateCodeKeepsTheFirstAndWarns) {
    const FourCC code = "Tmp2"_4cc;
    auto first = std::make_unique<ClassProperties>(code, nullptr, 1, nullptr, nullptr);
    testing::internal::CaptureStderr();
    auto second = std::make_unique<ClassProperties>(code, nullptr, 2, nullptr, nullptr);
    const std::string warning = testing::internal::GetCapturedStderr();
    EXPECT_NE(warning.find("Tmp2"), std::string::npos) << warning;
    EXPECT_EQ(std::count(warning.begin(), warning.end(), '\n'), 1) << warning;
    EXPECT_EQ(ClassProperties::Find(code), first.get());

    // The refused duplicate going away leaves the first registered.
    second.reset();
    EXPECT_EQ(ClassProperties::Find(code), first.get());
    first.reset();
    EXPECT_EQ(ClassProperties::Find(code), nullptr);
}

TEST(ClassProperties, Defaults) {
    static const ClassPropertiesBase::DefaultItem defaults[] = {{"Amnt"_4cc, 0.5}, {"Cont"_4cc, 2.0}, {}};
    const ClassProperties withDefaults("Tmp3"_4cc, nullptr, 1, defaults, nullptr);
    ASSERT_EQ(withDefaults.GetDefaults(), defaults);
    int n = 0;
    for (const auto* item = withDefaults.GetDefaults(); item->code != 0; ++item)
        ++n;
    EXPECT_EQ(n, 2);
    EXPECT_EQ(Sample::s_Properties.GetDefaults(), nullptr);
}
