#pragma once
// What the processor running this can do, for loops built twice (for AVX2 and for any x86-64) that pick
// their build once at run time. RT_AVX2_BUILD says whether the compiler can make the AVX2 build at all.
// Neither build contracts multiplications and additions (AVX2 brings no fused multiply-add), so both give the
// same floats as the kernel text.

#if defined(__x86_64__) && (defined(__GNUC__) || defined(__clang__))
#define RT_AVX2_BUILD 1
// No fma: a fused multiply-add rounds once where the portable build rounds twice.
#define RT_TARGET_AVX2 __attribute__((target("avx2")))
#else
#define RT_AVX2_BUILD 0
#endif

// RT_AVX2_CLONES builds a function twice, and the loader picks one. Sanitizer builds and other compilers get
// the one baseline function.
#if defined(__GNUC__) && !defined(__clang__) && defined(__x86_64__) && !defined(__SANITIZE_ADDRESS__)
#define RT_AVX2_CLONES __attribute__((target_clones("avx2", "default")))
#else
#define RT_AVX2_CLONES
#endif

namespace RasterTools {

inline bool HasAvx2() noexcept {
#if RT_AVX2_BUILD
    static const bool has = [] {
        __builtin_cpu_init();
        return __builtin_cpu_supports("avx2") != 0;
    }();
    return has;
#else
    return false;
#endif
}

} // namespace RasterTools
