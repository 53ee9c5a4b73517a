// Choosing the render device: --device, then RASTERTOOLS_DEVICE, then auto; refusals name their origin.

#include "host/document/TileRenderer.h"
#include "tests/host/device/SelectorVariable.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <optional>
#include <string>

namespace {

using DeviceTest::SelectorVariable;
using Raster::Hardware;

std::size_t CountDevices(Raster::HardwareBackEnd backEnd) {
    const auto& devices = Hardware::GetDevices();
    return static_cast<std::size_t>(std::count_if(devices.begin(), devices.end(), [&](const auto& device) {
        return device && device->GetBackEnd() == backEnd;
    }));
}

} // namespace

TEST(DeviceSelection, CommandLineThenVariableThenAuto) {
    {
        SelectorVariable unset(nullptr);
        const auto s = ResolveDeviceSelector("");
        EXPECT_EQ(s.selector, "auto");
        EXPECT_EQ(s.origin, "default");
        EXPECT_TRUE(s.IsValid());
        EXPECT_EQ(ResolveDeviceSelector("cuda").selector, "cuda");
    }
    {
        SelectorVariable set(" OpenCL ");
        const auto fromVariable = ResolveDeviceSelector("");
        EXPECT_EQ(fromVariable.selector, "opencl");
        EXPECT_EQ(fromVariable.origin, "RASTERTOOLS_DEVICE=OpenCL");
        const auto fromCommandLine = ResolveDeviceSelector("cpu");
        EXPECT_EQ(fromCommandLine.selector, "cpu") << "the command line wins over the variable";
        EXPECT_EQ(fromCommandLine.origin, "--device cpu");
        EXPECT_EQ(ResolveDeviceSelector("   ").selector, "opencl") << "a blank value counts as not given";
    }
    {
        SelectorVariable blank("  ");
        EXPECT_EQ(ResolveDeviceSelector("").selector, "auto") << "a blank variable counts as unset";
    }
    {
        SelectorVariable bad("gpu");
        EXPECT_EQ(ResolveDeviceSelector("auto").selector, "auto")
            << "a bad variable is not read when overridden";
        EXPECT_TRUE(ResolveDeviceSelector("auto").IsValid());
    }
}

TEST(DeviceSelection, NormalisesCaseBlanksAndIndices) {
    SelectorVariable unset(nullptr);
    EXPECT_EQ(ResolveDeviceSelector("AUTO").selector, "auto");
    EXPECT_EQ(ResolveDeviceSelector("\tCpu\n").selector, "cpu");
    EXPECT_EQ(ResolveDeviceSelector(" OpenCL:1 ").selector, "opencl:1");
    EXPECT_EQ(ResolveDeviceSelector("cuda:007").selector, "cuda:7");
}

TEST(DeviceSelection, RefusesAnythingElseNamingWhereItCameFrom) {
    SelectorVariable unset(nullptr);
    for (const char* bad : {"gpu", "metal", "cpu:1", "auto:0", "opencl:", "opencl:x", "cuda:-1", "open cl",
                            "--device", "cuda,opencl"}) {
        const auto s = ResolveDeviceSelector(bad);
        EXPECT_FALSE(s.IsValid()) << bad;
        EXPECT_EQ(s.selector, "") << bad;
        EXPECT_EQ(s.error.rfind("--device " + std::string(bad) + ": unknown device", 0), 0u) << s.error;
        EXPECT_NE(s.error.find("auto, cpu, opencl or cuda"), std::string::npos) << s.error;

        const auto lookup = FindRenderDevice(s);
        EXPECT_EQ(lookup.device, nullptr) << bad;
        EXPECT_EQ(lookup.error, s.error) << "the lookup passes the refusal on";
    }
    SelectorVariable badVariable("gpu");
    const auto s = ResolveDeviceSelector("");
    EXPECT_FALSE(s.IsValid());
    EXPECT_EQ(s.error.rfind("RASTERTOOLS_DEVICE=gpu: unknown device", 0), 0u) << s.error;
}

TEST(DeviceLookup, CpuIsNoDeviceAndAutoMayFindNone) {
    SelectorVariable unset(nullptr);
    const auto cpu = FindRenderDevice(ResolveDeviceSelector("cpu"));
    EXPECT_EQ(cpu.device, nullptr);
    EXPECT_TRUE(cpu.IsValid());

    const auto automatic = FindRenderDevice(ResolveDeviceSelector(""));
    EXPECT_TRUE(automatic.IsValid()) << "auto never refuses: " << automatic.error;
    EXPECT_EQ(automatic.device, Hardware::GetDevice("auto"));
}

TEST(DeviceLookup, AnExplicitBackEndMustBeThere) {
    SelectorVariable unset(nullptr);
    struct Case {
        const char* word;
        const char* name;
        Raster::HardwareBackEnd backEnd;
    };
    for (const Case& c : {Case{"opencl", "OpenCL", Raster::HardwareBackEnd::OpenCL},
                          Case{"cuda", "CUDA", Raster::HardwareBackEnd::Cuda}}) {
        SCOPED_TRACE(c.word);
        const std::size_t present = CountDevices(c.backEnd);
        const auto lookup = FindRenderDevice(ResolveDeviceSelector(c.word));
        if (present > 0) {
            EXPECT_TRUE(lookup.IsValid()) << lookup.error;
            ASSERT_NE(lookup.device, nullptr);
            EXPECT_EQ(lookup.device->GetBackEnd(), c.backEnd);
            EXPECT_EQ(FindRenderDevice(ResolveDeviceSelector(std::string(c.word) + ":0")).device,
                      Hardware::GetDevice(std::string(c.word) + ":0"));
        } else {
            EXPECT_EQ(lookup.device, nullptr);
            EXPECT_EQ(lookup.error, "--device " + std::string(c.word) + ": no " + c.name + " device found");
        }

        // One past the last device of that back end.
        const std::string beyond = std::string(c.word) + ":" + std::to_string(present);
        const auto missing = FindRenderDevice(ResolveDeviceSelector(beyond));
        EXPECT_EQ(missing.device, nullptr);
        const std::string expected = present == 0
                                         ? "--device " + beyond + ": no " + c.name + " device found"
                                         : "--device " + beyond + ": no " + c.name + " device " +
                                               std::to_string(present) + " (" + std::to_string(present) +
                                               (present == 1 ? " device" : " devices") + ", numbered from 0)";
        EXPECT_EQ(missing.error, expected);

        // The same refusal names the variable when that is where the choice came from.
        SelectorVariable set(c.word);
        const auto fromVariable = FindRenderDevice(ResolveDeviceSelector(""));
        const std::string expectedFromVariable =
            present == 0 ? "RASTERTOOLS_DEVICE=" + std::string(c.word) + ": no " + c.name + " device found"
                         : "";
        EXPECT_EQ(fromVariable.error, expectedFromVariable);
    }
}
