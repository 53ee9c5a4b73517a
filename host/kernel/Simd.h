#pragma once
// What the processor running this can do, for loops built twice (for AVX2 and for any x86-64) that pick
// their build at run time. RASTERTOOLS_NO_SIMD=1 in the environment turns every SIMD path off, so that the
// portable builds can be compared with them or a fault narrowed down. RT_AVX2_BUILD says whether the compiler
// can make the AVX2 build at all. Neither build contracts multiplications and additions (AVX2 brings no fused
// multiply-add), so both give the same floats as the kernel text.

#if defined(__x86_64__) && (defined(__GNUC__) || defined(__clang__))
#define RT_AVX2_BUILD 1
// No fma: a fused multiply-add rounds once where the portable build rounds twice.
#define RT_TARGET_AVX2 __attribute__((target("avx2")))
#else
#define RT_AVX2_BUILD 0
#endif

// RT_AVX2_DISPATCH(Name, Body, (parameters), (arguments)) defines void Name(parameters) that runs Body, a
// function inlined into both, built for AVX2 where HasAvx2() says so and built for any x86-64 otherwise.
// Sanitizer builds and other compilers get the one baseline function.
#if RT_AVX2_BUILD && !defined(__SANITIZE_ADDRESS__)
#define RT_AVX2_DISPATCH(Name, Body, Parameters, Arguments)                                                  \
    RT_TARGET_AVX2 __attribute__((flatten)) static void Name##Avx2 Parameters noexcept {                     \
        Body Arguments;                                                                                      \
    }                                                                                                        \
    void Name Parameters noexcept {                                                                          \
        if (::Kernel::HasAvx2())                                                                             \
            Name##Avx2 Arguments;                                                                            \
        else                                                                                                 \
            Body Arguments;                                                                                  \
    }
#else
#define RT_AVX2_DISPATCH(Name, Body, Parameters, Arguments)                                                  \
    void Name Parameters noexcept {                                                                          \
        Body Arguments;                                                                                      \
    }
#endif

namespace Kernel {

// False when RASTERTOOLS_NO_SIMD was set (to anything but "" or "0") when the library loaded, or after
// SetSimdEnabled(false).
bool IsSimdEnabled() noexcept;
// For tests that compare the two builds in one process; the renders running meanwhile may take either.
void SetSimdEnabled(bool enabled) noexcept;

// Whether the AVX2 builds may run: the processor has AVX2 and SIMD is enabled.
inline bool HasAvx2() noexcept {
#if RT_AVX2_BUILD
    static const bool has = [] {
        __builtin_cpu_init();
        return __builtin_cpu_supports("avx2") != 0;
    }();
    return has && IsSimdEnabled();
#else
    return false;
#endif
}

} // namespace Kernel
