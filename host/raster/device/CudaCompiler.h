#pragma once
// Compiles language-0 kernel text to PTX with NVRTC, which is opened at run time; needs no GPU.

#include <optional>
#include <string>
#include <string_view>

namespace Raster {

struct PtxCompilation {
    std::optional<std::string> ptx; // nothing when the text did not compile or NVRTC is missing
    std::string log;                // the compiler's messages, or why nothing was compiled
};

// True when an NVRTC library could be opened and all the functions used here were found.
bool IsNvrtcAvailable();

// "NVRTC 13.0 (libnvrtc.so.13)" when found, else the names that were tried.
std::string DescribeNvrtc();

// Compiles text with NVRTC and checks that the PTX defines entryPoint, which therefore must be declared
// `extern "C" __global__`. architecture is a virtual architecture such as "compute_90"; empty takes NVRTC's
// default. Compiles without fused multiply-add contraction, like every kernel of this layer.
PtxCompilation CompileToPtx(std::string_view text, std::string_view entryPoint,
                            std::string_view architecture = {});

} // namespace Raster
