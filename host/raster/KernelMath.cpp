// The kernel text of the shared numerics: each language's prelude, then the same source the processor
// compiles.
#include "host/raster/KernelMath.h"

#include "host/raster/KernelText.h"

#include <string>

namespace Raster {

namespace {

constexpr const char* OpenCLPrelude = R"(#define RT_OVERLOAD __attribute__((overloadable))
#define params_address_space constant
#define constant_address_space global const
#define device_address_space global
#define make_float2(a, b) ((float2)((a), (b)))
#define make_float4(a, b, c, d) ((float4)((a), (b), (c), (d)))
#define make_float8(a, b, c, d, e, f, g, h) ((float8)((a), (b), (c), (d), (e), (f), (g), (h)))
#define make_int2(a, b) ((int2)((a), (b)))
#define make_uint2(a, b) ((uint2)((a), (b)))
#define make_uchar2(a, b) ((uchar2)((a), (b)))
#define make_uchar4(a, b, c, d) ((uchar4)((a), (b), (c), (d)))
#define make_ushort2(a, b) ((ushort2)((a), (b)))
#define make_ushort4(a, b, c, d) ((ushort4)((a), (b), (c), (d)))
#define rt_round round
#define rt_floor floor
#define rt_fmin fmin
#define rt_fmax fmax
#define rt_fabs fabs
// Conversions to integers saturate (and take NaN to 0), as the processor's do; the built-in plain ones leave
// out-of-range values undefined.
#undef convert_int2
#define convert_int2 convert_int2_sat
#undef convert_uchar2
#define convert_uchar2 convert_uchar2_sat
#undef convert_uchar4
#define convert_uchar4 convert_uchar4_sat
#undef convert_ushort2
#define convert_ushort2 convert_ushort2_sat
#undef convert_ushort4
#define convert_ushort4 convert_ushort4_sat
)";

constexpr const char* CudaPrelude = R"(typedef unsigned char uchar;
typedef unsigned short ushort;
typedef unsigned int uint;
#define RT_OVERLOAD
#define params_address_space const
#define constant_address_space const
#define device_address_space
#define rt_round roundf
#define rt_floor floorf
#define rt_fmin fminf
#define rt_fmax fmaxf
#define rt_fabs fabsf
)";

std::string BuildKernelMathText(HardwareKernelLanguage language) {
    std::string text = "#ifndef RT_KERNEL_MATH\n#define RT_KERNEL_MATH\n";
    if (language == HardwareKernelLanguage::OpenCLC) {
        text += OpenCLPrelude;
        text += RASTER_KERNEL_STRINGIFY(RASTER_KERNEL_SCALAR_SOURCE);
        text += '\n';
    } else if (language == HardwareKernelLanguage::CudaCpp) {
        text += CudaPrelude;
        text += RASTER_KERNEL_STRINGIFY(RASTER_KERNEL_SCALAR_SOURCE);
        text += '\n';
        text += RASTER_KERNEL_STRINGIFY(RASTER_KERNEL_CPP_SOURCE);
        text += '\n';
    } else {
        return {};
    }
    text += "#define RandomMax " + std::to_string(KernelMath::RandomMax) + "u\n";
    text += RASTER_KERNEL_STRINGIFY(RASTER_KERNEL_SHARED_SOURCE);
    text += "\n#endif\n";
    return text;
}

} // namespace

const char* GetKernelMathText(HardwareKernelLanguage language) {
    static const KernelTextPair texts(BuildKernelMathText);
    return texts.Get(language);
}

std::string FormatKernelText(std::string_view pattern, std::initializer_list<std::string_view> arguments) {
    std::string out;
    out.reserve(pattern.size());
    for (std::size_t i = 0; i < pattern.size(); ++i) {
        const char c = pattern[i];
        if (c == '%' && i + 1 < pattern.size()) {
            const char next = pattern[i + 1];
            if (next == '%') {
                out += '%';
                ++i;
                continue;
            }
            if (next >= '1' && next <= '9') {
                const auto index = static_cast<std::size_t>(next - '1');
                if (index < arguments.size()) {
                    out += *(arguments.begin() + index);
                    ++i;
                    continue;
                }
            }
        }
        out += c;
    }
    return out;
}

} // namespace Raster
