// Checks that enrol every filter of the catalogue: its language-0 kernel texts compile with NVRTC for every
// layer format, and its processor renders are the same bytes with the SIMD builds on and off.

#include "LanguageZeroCheck.h"
#include "PipelineTestSupport.h"

#include "filters/Catalogue.h"
#include "host/kernel/Simd.h"
#include "pipeline/Formats.h"

using namespace RasterTools;
using Raster::PixelFormat;

namespace {

// The filter's own samples where it has some (its defaults may change nothing), else its defaults.
std::vector<ParameterValue> SampleOf(const FilterInfo& filter) {
    return filter.samples.empty() ? std::vector<ParameterValue>{} : filter.samples.front();
}

TEST(CatalogueKernels, LanguageZeroTextsCompileWithNvrtcForEveryFilterAndFormat) {
    REQUIRE_NVRTC();
    for (const auto& filter : GetFilterCatalogue()) {
        const auto command = filter.makeCommand(false, {});
        const auto* pipeline = dynamic_cast<const PipelineCommand*>(command.Get());
        if (!pipeline || !pipeline->HasDeviceKernel()) continue;
        SCOPED_TRACE(std::string(filter.name));
        ASSERT_TRUE(filter.kernelTexts) << "the filter has a device kernel but declares no kernel texts";
        for (const PixelFormat format : LayerFormats) {
            const auto texts = filter.kernelTexts(Raster::HardwareKernelLanguage::CudaCpp, format);
            EXPECT_FALSE(texts.empty()) << Raster::GetPixelFormatName(format);
            for (const auto& text : texts)
                EXPECT_FALSE(text.text.empty())
                    << Raster::GetPixelFormatName(format) << ": a fragment has no language-0 text";
            PipelineTest::ExpectStepsCompile(texts, format);
        }
    }
}

// Restores the SIMD switch however the test ends.
struct SimdGuard {
    ~SimdGuard() { Kernel::SetSimdEnabled(true); }
};

TEST(CatalogueSimd, PlainAndSimdBuildsGiveTheSameBytesForEveryFilterAndFormat) {
    Kernel::SetSimdEnabled(true);
    if (!Kernel::HasAvx2())
        GTEST_SKIP() << "this processor has no AVX2 (or RASTERTOOLS_NO_SIMD is set): there is only the plain "
                        "build to run";
    const SimdGuard guard;
    Kernel::SetSimdEnabled(false);
    ASSERT_FALSE(Kernel::HasAvx2()) << "the switch must turn the AVX2 builds off";
    for (const auto& filter : GetFilterCatalogue()) {
        const auto command = filter.makeCommand(false, SampleOf(filter));
        const auto* pipeline = dynamic_cast<const PipelineCommand*>(command.Get());
        if (!pipeline) continue;
        for (const PixelFormat format : LayerFormats) {
            // Wider than two spans and an odd height, so that both the span loops and their tails run.
            const auto source = PipelineTest::MakeImage(format, 77, 21, 5u);
            Kernel::SetSimdEnabled(true);
            const auto simd = PipelineTest::Render(*pipeline, source, 0);
            Kernel::SetSimdEnabled(false);
            const auto plain = PipelineTest::Render(*pipeline, source, 0);
            ASSERT_TRUE(simd && plain) << filter.name << " " << Raster::GetPixelFormatName(format);
            const auto difference = PipelineTest::Compare(*simd, *plain);
            EXPECT_FALSE(difference) << filter.name << " from " << Raster::GetPixelFormatName(format)
                                     << ": the SIMD and plain builds differ at " << difference->Describe();
        }
    }
}

} // namespace
