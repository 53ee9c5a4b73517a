#pragma once
// Compiling a pipeline's language-0 (CUDA C++) kernel text with NVRTC, as the pipeline and filter tests do.

#include "host/raster/device/CudaCompiler.h"
#include "pipeline/DeviceSteps.h"
#include "pipeline/KernelAssembly.h"

#include <vector>

#include <gtest/gtest.h>

namespace PipelineTest {

// Expects the language-0 text that Stages assemble for shape to compile to PTX; a failure names the formats
// and carries the compiler's log. Callers skip with REQUIRE_NVRTC() where NVRTC is missing.
template <class Stages>
void ExpectLanguageZeroCompiles(const RasterTools::KernelShape& shape) {
    const auto descriptor =
        RasterTools::DescribeKernel<Stages>(Raster::HardwareKernelLanguage::CudaCpp, shape);
    ASSERT_TRUE(descriptor);
    const auto text = Raster::AssembleKernelSource(*descriptor, Raster::HardwareKernelLanguage::CudaCpp);
    const auto ptx = Raster::CompileToPtx(text, descriptor->entryPoint);
    EXPECT_TRUE(ptx.ptx) << Raster::GetPixelFormatName(shape.source) << " to "
                         << Raster::GetPixelFormatName(shape.dest) << ":\n"
                         << ptx.log;
}

// Expects every kernel of a filter's own device steps to compile to PTX; a failure names the entry point and
// the format and carries the compiler's log.
inline void ExpectStepsCompile(const std::vector<RasterTools::DeviceKernelText>& kernels,
                               Raster::PixelFormat format) {
    for (const auto& kernel : kernels) {
        const auto ptx = Raster::CompileToPtx(kernel.text, kernel.entryPoint);
        EXPECT_TRUE(ptx.ptx) << kernel.entryPoint << " for " << Raster::GetPixelFormatName(format) << ":\n"
                             << ptx.log;
    }
}

} // namespace PipelineTest

// Skips the test, saying why, where NVRTC is missing.
#define REQUIRE_NVRTC()                                                                                      \
    if (!Raster::IsNvrtcAvailable())                                                                         \
    GTEST_SKIP() << "NVRTC is not installed, so language-0 text cannot be compiled here ("                   \
                 << Raster::DescribeNvrtc() << ")"
