// Values reach a filter's renderer from panels, drags, settings, loaded documents and constructors; every
// route ends within the parameter's accepted values, so that no single value makes the work unbounded.
// Also the units and attributes that the panels publish.

#include "filters/Catalogue.h"
#include "filters/distort/SphereTool.h"
#include "filters/distort/TwirlTool.h"
#include "filters/tonal/RasterUnsharpMaskCommand.h"
#include "filters/tonal/UnsharpMaskTool.h"
#include "host/document/VeyraController.h"
#include "host/kernel/ClassProperties.h"
#include "tests/frame/FrameTestSupport.h"

#include <cmath>
#include <limits>

using namespace RasterTools;
using RasterToolsTest::EditorFixture;

namespace {

constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();

// A command of the filter as the class registry makes it for loading, with one property loaded from a
// stream that holds only value.
template <class T>
std::vector<ParameterValue> LoadOne(const FilterInfo& info, const ParameterSpec& spec, T value,
                                    Kernel::TypeTag tag) {
    const Kernel::ClassProperties* properties = Kernel::ClassProperties::Find(info.classCode);
    EXPECT_NE(properties, nullptr);
    if (!properties) return {};
    const auto command = Kernel::CountedCast<RasterCommand>(properties->CreateObject());
    EXPECT_TRUE(command);
    if (!command) return {};
    Kernel::OutSerialiser out;
    out.SaveTypeI(spec.code, tag, &value, sizeof value);
    Kernel::InSerialiser in(out.GetBytes());
    Kernel::FileStore store;
    command->Load(in, store, 1);
    return info.readCommand(*command);
}

std::size_t IndexOf(const FilterInfo& info, const ParameterSpec& spec) {
    return std::size_t(&spec - info.parameters.data());
}

// Each property of a panel as "id: attribute, attribute".
std::vector<std::string> DescribeAttributes(const Kernel::ReflectedList& properties) {
    std::vector<std::string> lines;
    for (const auto& property : properties) {
        std::string line = Kernel::FourCCToString(property->GetIdentifier()) + ":";
        for (const auto& attribute : property->GetAttributes())
            line += " " + attribute->Describe();
        lines.push_back(line);
    }
    return lines;
}

} // namespace

TEST(ValueBounds, LoadedCommandsHoldOnlyAcceptedValues) {
    for (const auto& info : GetFilterCatalogue()) {
        for (const auto& spec : info.parameters) {
            SCOPED_TRACE(std::string(info.name) + " " + std::string(spec.name));
            const std::size_t index = IndexOf(info, spec);
            switch (spec.type) {
            case ParameterType::Double:
                for (const double hostile : {1e6, 1.9e19, 1e300, -1e300, HUGE_VAL, -HUGE_VAL, kNaN}) {
                    const auto values = LoadOne(info, spec, hostile, Kernel::TypeTag::Double);
                    ASSERT_EQ(values.size(), info.parameters.size());
                    EXPECT_TRUE(IsAcceptedValue(spec, values[index]))
                        << hostile << " loaded as " << FormatParameterValue(values[index]);
                    if (std::isnan(hostile)) {
                        EXPECT_EQ(values[index], spec.defaultValue);
                    }
                    if (hostile == 1e300) {
                        EXPECT_EQ(values[index], ParameterValue(HighestValue(spec)));
                    }
                }
                break;
            case ParameterType::Int:
                for (const int hostile : {-2147483647 - 1, 2147483647, 99}) {
                    const auto values = LoadOne(info, spec, hostile, Kernel::TypeTag::Int32);
                    ASSERT_EQ(values.size(), info.parameters.size());
                    EXPECT_TRUE(IsAcceptedValue(spec, values[index])) << hostile;
                }
                break;
            case ParameterType::Point:
                for (const Kernel::PointT<double> hostile :
                     {Kernel::PointT<double>{1e300, -1e300}, Kernel::PointT<double>{HUGE_VAL, 3.0},
                      Kernel::PointT<double>{kNaN, 3.0}}) {
                    const auto values = LoadOne(info, spec, hostile, Kernel::TypeTag::Point);
                    ASSERT_EQ(values.size(), info.parameters.size());
                    const auto point = std::get<Kernel::PointT<double>>(values[index]);
                    const auto fallback = std::get<Kernel::PointT<double>>(spec.defaultValue);
                    if (std::isnan(hostile.x)) {
                        // Half a point is no point: the default, which may be the unset centre.
                        EXPECT_EQ(std::isnan(point.x), std::isnan(fallback.x));
                        EXPECT_EQ(std::isnan(point.y), std::isnan(fallback.y));
                    } else {
                        EXPECT_TRUE(IsAcceptedValue(spec, values[index])) << point.x << "," << point.y;
                    }
                }
                break;
            case ParameterType::Bool:
                break;
            }
        }
    }
}

TEST(ValueBounds, ConstructedCommandsHoldOnlyAcceptedValues) {
    for (const auto& info : GetFilterCatalogue()) {
        SCOPED_TRACE(std::string(info.name));
        std::vector<ParameterValue> values;
        for (const auto& spec : info.parameters) {
            switch (spec.type) {
            case ParameterType::Double:
                values.emplace_back(1e12);
                break;
            case ParameterType::Int:
                values.emplace_back(1 << 30);
                break;
            case ParameterType::Point:
                values.emplace_back(Kernel::PointT<double>{-1e12, 1e12});
                break;
            case ParameterType::Bool:
                values.emplace_back(true);
                break;
            }
        }
        const auto read = info.readCommand(*info.makeCommand(true, values));
        ASSERT_EQ(read.size(), info.parameters.size());
        for (std::size_t i = 0; i < read.size(); ++i)
            EXPECT_TRUE(IsAcceptedValue(info.parameters[i], read[i])) << info.parameters[i].name;
    }
}

TEST(ValueBounds, ALoadedUnsharpMaskReadsABoundedMargin) {
    const FilterInfo* info = FindFilter("unsharpmask");
    ASSERT_NE(info, nullptr);
    const auto command = Kernel::CountedCast<RasterUnsharpMaskCommand>(
        Kernel::ClassProperties::Find(info->classCode)->CreateObject());
    ASSERT_TRUE(command);
    Kernel::OutSerialiser out;
    const double radius = 1e6;
    out.SaveTypeI(Kernel::MakeFourCC("Radi"), Kernel::TypeTag::Double, &radius, sizeof radius);
    Kernel::InSerialiser in(out.GetBytes());
    Kernel::FileStore store;
    command->Load(in, store, 1);
    EXPECT_EQ(command->GetRadius(), 100.0);
    Kernel::RectT<double> rect{0.0, 0.0, 10.0, 10.0};
    command->PrepareInputRectangle(rect);
    // ceil(100 / 3) pixels on each side at most.
    EXPECT_LE(rect.Width(), 10.0 + 2.0 * 34.0);
}

class ToolValueBounds : public EditorFixture {};

TEST_F(ToolValueBounds, EveryToolRouteStopsTheUnsharpRadiusAtItsLimit) {
    // A settings file edited by hand.
    VeyraController::GetInstance().SetDoubleForKey("tools.unsharpmask.radius", 1e6);
    auto unsharp = CountedCast<UnsharpMaskTool>(StartTool(ToolID::UnsharpMask));
    EXPECT_EQ(unsharp->GetRadius(), 100.0);

    // A drag of 1500 document units.
    unsharp->OnBeginDrag(ToolPointSpread{{0.0, 0.0}});
    unsharp->OnDrag(ToolPointSpread{{900.0, 1200.0}});
    EXPECT_EQ(unsharp->GetRadius(), 100.0);
    unsharp->OnEndDrag(ToolPointSpread{{900.0, 1200.0}});
    EXPECT_EQ(unsharp->GetRadius(), 100.0);

    // The panel.
    for (const auto& property : unsharp->EnumerateReflecteds())
        if (Kernel::FourCCToString(property->GetIdentifier()) == "radi") {
            ASSERT_TRUE(property->SetValueText("1e6"));
            EXPECT_EQ(property->GetValueText(), "100");
            ASSERT_TRUE(property->SetValueText("-5"));
            EXPECT_EQ(property->GetValueText(), "0");
        }

    // What the commit stores is what was rendered.
    unsharp->SetRadius(5e5);
    unsharp->Commit();
    EXPECT_EQ(VeyraController::GetInstance().GetDoubleForKey("tools.unsharpmask.radius", -1.0), 100.0);
}

TEST_F(ToolValueBounds, TwirlAndSpherePanelsStopAtTheirLimits) {
    auto twirl = CountedCast<TwirlTool>(StartTool(ToolID::Twirl));
    for (const auto& property : twirl->EnumerateReflecteds()) {
        const std::string id = Kernel::FourCCToString(property->GetIdentifier());
        if (id == "inte") {
            ASSERT_TRUE(property->SetValueText("1.9e19"));
            EXPECT_EQ(twirl->GetRadius(), RadiusLimit);
            // Beyond the panel's range but within the limit is kept.
            ASSERT_TRUE(property->SetValueText("5000"));
            EXPECT_EQ(twirl->GetRadius(), 5000.0);
        } else if (id == "angl") {
            ASSERT_TRUE(property->SetValueText("1e30"));
            EXPECT_EQ(twirl->GetTwirl(), 720.0);
        }
    }
    auto sphere = CountedCast<SphereTool>(StartTool(ToolID::Sphere));
    for (const auto& property : sphere->EnumerateReflecteds()) {
        const std::string id = Kernel::FourCCToString(property->GetIdentifier());
        if (id == "radi") {
            ASSERT_TRUE(property->SetValueText("1e300"));
            EXPECT_EQ(sphere->GetRadius(), RadiusLimit);
        } else if (id == "inte") {
            ASSERT_TRUE(property->SetValueText("-400"));
            EXPECT_EQ(sphere->GetIntensity(), -100.0);
        }
    }
}

TEST(UnitKinds, AreNumberedAsTheHostsCategories) {
    EXPECT_EQ(int(Kernel::UnitKind::Percent), 1);
    EXPECT_EQ(int(Kernel::UnitKind::Degrees), 2);
    EXPECT_EQ(int(Kernel::UnitKind::Pixels), 5);
}

TEST_F(ToolValueBounds, PanelsCarryOnlyTheStatedAttributes) {
    const struct {
        ToolID tool;
        std::vector<std::string> own; // the tool's own properties, after the base's
    } cases[] = {
        {ToolID::AddNoise, {"inte:", "mono: image=monochromatic", "gaus: image=gaussian"}},
        {ToolID::Diffuse, {"inte:"}},
        {ToolID::UnsharpMask, {"radi:", "fact:", "thrs:"}},
        {ToolID::MotionBlur, {"radi:", "angl:"}},
        {ToolID::Twirl, {"angl: unit=degrees", "inte: unit=pixels", "cntr:"}},
        {ToolID::Sphere, {"radi: unit=pixels", "inte: unit=percent"}},
    };
    for (const auto& test : cases) {
        SCOPED_TRACE(int(test.tool));
        const auto lines = DescribeAttributes(StartTool(test.tool)->EnumerateReflecteds());
        ASSERT_GE(lines.size(), test.own.size());
        const std::vector<std::string> own(lines.end() - std::ptrdiff_t(test.own.size()), lines.end());
        EXPECT_EQ(own, test.own);
    }
    // The live filter layer's panels carry no attributes at all.
    for (const auto& info : GetFilterCatalogue()) {
        std::vector<ParameterValue> values;
        for (const auto& spec : info.parameters)
            values.push_back(spec.defaultValue);
        for (const auto& property : info.makeCommand(true, values)->EnumerateReflecteds()) {
            EXPECT_EQ(property->FindAttribute<Kernel::NoHardLimitAttribute>(), nullptr) << info.name;
            EXPECT_EQ(property->FindAttribute<Kernel::ImageAttribute>(), nullptr) << info.name;
        }
    }
}
