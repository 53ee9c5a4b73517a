// Registry-driven agreement: every registered command that renders through the pipeline, with sample
// parameters from its parameter table, from every layer format; rendered on the processor and on the OpenCL
// device, whole and in tiles of several shapes. Every rendering must give the reference's pixels: exactly,
// or within one unit of the last stored bit where LabA16 conversions (transcendental functions) are involved.

#include "PipelineTestSupport.h"

#include "filters/Catalogue.h"
#include "pipeline/Formats.h"

#include <cctype>
#include <limits>

using namespace RasterTools;
using PipelineTest::Compare;
using Raster::PixelFormat;

namespace {

struct Sample {
    const FilterInfo* filter;
    std::vector<ParameterValue> values;
    std::string label; // parameter values, for messages and test names
    PixelFormat source;
};

// Values that reach each parameter's corners: every value of a small integer range, the ends of other
// ranges, the opposite of a boolean. One parameter moves at a time; the rest keep their defaults. Then the
// filter's own samples.
std::vector<std::vector<ParameterValue>> SampleValues(const FilterInfo& filter) {
    std::vector<ParameterValue> defaults;
    for (const auto& spec : filter.parameters)
        defaults.push_back(spec.defaultValue);
    std::vector<std::vector<ParameterValue>> samples{defaults};
    for (std::size_t i = 0; i < filter.parameters.size(); ++i) {
        const ParameterSpec& spec = filter.parameters[i];
        std::vector<ParameterValue> moved;
        switch (spec.type) {
        case ParameterType::Int:
            if (spec.maximum - spec.minimum <= 16)
                for (int v = int(spec.minimum); v <= int(spec.maximum); ++v)
                    moved.emplace_back(v);
            else
                moved = {int(spec.minimum), int(spec.maximum)};
            break;
        case ParameterType::Double:
            moved = {spec.minimum, spec.maximum};
            break;
        case ParameterType::Bool:
            moved = {!std::get<bool>(spec.defaultValue)};
            break;
        case ParameterType::Point:
            moved = {Kernel::PointT<double>{spec.minimum, spec.maximum},
                     Kernel::PointT<double>{spec.maximum, spec.minimum}};
            break;
        }
        for (const auto& value : moved) {
            if (value == spec.defaultValue) continue;
            auto sample = defaults;
            sample[i] = value;
            samples.push_back(sample);
        }
    }
    for (const auto& sample : filter.samples)
        samples.push_back(sample);
    return samples;
}

std::string Label(const FilterInfo& filter, const std::vector<ParameterValue>& values) {
    std::string label(filter.name);
    for (std::size_t i = 0; i < values.size(); ++i)
        label += " " + std::string(filter.parameters[i].name) + "=" + FormatParameterValue(values[i]);
    return label;
}

std::vector<Sample> AllSamples() {
    std::vector<Sample> samples;
    for (const auto& filter : GetFilterCatalogue()) {
        const auto probe = filter.makeCommand(false, {});
        if (!dynamic_cast<const PipelineCommand*>(probe.Get())) continue; // renders outside the pipeline
        for (const auto& values : SampleValues(filter))
            for (PixelFormat source : LayerFormats)
                samples.push_back({&filter, values, Label(filter, values), source});
    }
    return samples;
}

void PrintTo(const Sample& sample, std::ostream* out) {
    *out << sample.label << " from " << Raster::GetPixelFormatName(sample.source);
}

std::string TestName(const testing::TestParamInfo<Sample>& info) {
    std::string name =
        info.param.label + " from " + std::string(Raster::GetPixelFormatName(info.param.source));
    for (char& c : name)
        if (!std::isalnum(static_cast<unsigned char>(c))) c = '_';
    return name + "_" + std::to_string(info.index);
}

// Tile shapes: odd, aligned, unaligned with the grid shifted off the origin, narrower than a span.
struct Tiling {
    const char* name;
    int width, height, originX, originY;
};
constexpr Tiling Tilings[] = {
    {"whole", 0, 0, 0, 0},   {"13x11", 13, 11, 0, 0},
    {"32x32", 32, 32, 0, 0}, {"45x23 shifted by (5, 3)", 45, 23, 5, 3},
    {"7 wide", 7, 64, 0, 0},
};

class PipelineConformance : public testing::TestWithParam<Sample> {};

TEST_P(PipelineConformance, ProcessorAndDeviceAgreeInEveryTiling) {
    const Sample& sample = GetParam();
    const auto command = sample.filter->makeCommand(false, sample.values);
    const auto* pipeline = dynamic_cast<const PipelineCommand*>(command.Get());
    ASSERT_NE(pipeline, nullptr);

    const auto source = PipelineTest::MakeImage(sample.source, 37, 29, 17u);
    RenderTarget base;
    base.source.pixels = source;

    // The reference: the processor over the whole image.
    const auto reference = PipelineTest::MakeDestination(*pipeline, *source);
    base.destination.pixels = reference;
    const auto dest = reference->GetFormat();
    const std::string what = sample.label + ", " + std::string(Raster::GetPixelFormatName(sample.source)) +
                             " to " + std::string(Raster::GetPixelFormatName(dest));
    {
        const auto paths = PipelineTest::RenderTiled(*pipeline, base, 0, 0);
        ASSERT_EQ(paths.processor, 1) << what << ": the processor refused the formats";
    }

    // Lab conversions use transcendental functions, which the colour manager and the kernel compute
    // differently: they agree to one unit of the last stored bit. A float destination holds far finer steps
    // than the LabA16 source they came from, so there the unit is one step of the LabA16 scale.
    const bool lab = sample.source == PixelFormat::LabA16 || dest == PixelFormat::LabA16;
    const double labFloatStep = (1.0 / 65535.0) / double(std::numeric_limits<float>::epsilon());
    const double tolerance = !lab ? 0.0 : Raster::IsFloatFormat(dest) ? labFloatStep : 1.0;
    const auto device = PipelineTest::OpenCLDevice();
    for (const bool onDevice : {false, true}) {
        if (onDevice && (!device || !pipeline->HasDeviceKernel())) continue;
        for (const Tiling& tiling : Tilings) {
            if (!onDevice && tiling.width == 0) continue; // that is the reference
            RenderTarget target = base;
            target.destination.pixels = PipelineTest::MakeDestination(*pipeline, *source);
            if (onDevice) {
                target.device = device;
                target.source.cache = Raster::HardwareCache::Create(target.source.pixels);
                target.destination.cache = Raster::HardwareCache::Create(target.destination.pixels);
                ASSERT_TRUE(pipeline->PrepareDevice(target)) << what << ": the kernel did not compile\n"
                                                             << Raster::GetLastHardwareError();
            }
            const auto paths = PipelineTest::RenderTiled(*pipeline, target, tiling.width, tiling.height,
                                                         tiling.originX, tiling.originY);
            const char* path = onDevice ? "device" : "processor";
            EXPECT_EQ(paths.other, 0) << what << ", " << path << ", " << tiling.name;
            if (onDevice) {
                EXPECT_EQ(paths.processor, 0)
                    << what << ", " << tiling.name << ": tiles fell back to the processor\n"
                    << Raster::GetLastHardwareError();
            }
            // Near black the CMYK split divides by 1 - k, so a Lab step can trade black ink for coloured
            // inks: both mean the same colour, and that is what is compared.
            const bool cmykFromLab = sample.source == PixelFormat::LabA16 && dest == PixelFormat::CMYKA8;
            const auto difference = cmykFromLab ? PipelineTest::CompareCMYKMeaning(*target.destination.pixels,
                                                                                   *reference, tolerance)
                                                : Compare(*target.destination.pixels, *reference, tolerance);
            if (difference)
                ADD_FAILURE() << what << ", " << path << ", tiles " << tiling.name
                              << " differ from the processor's whole render at " << difference->Describe();
        }
    }
    // The processor's tilings were checked above; say so rather than pass without the device.
    if (pipeline->HasDeviceKernel() && !device)
        GTEST_SKIP() << "no OpenCL device (install pocl-opencl-icd): the device renders were not compared";
}

INSTANTIATE_TEST_SUITE_P(Registered, PipelineConformance, testing::ValuesIn(AllSamples()), TestName);

} // namespace
