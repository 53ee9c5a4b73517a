#pragma once
// RT_AVX2_CLONES builds a function twice, for AVX2 and for any x86-64, and the loader picks one at run time.
// Neither clone contracts multiplications and additions (AVX2 brings no fused multiply-add), so both give the
// same floats as the kernel text. Sanitizer builds and other compilers get the one baseline function.
#if defined(__GNUC__) && !defined(__clang__) && defined(__x86_64__) && !defined(__SANITIZE_ADDRESS__)
#define RT_AVX2_CLONES __attribute__((target_clones("avx2", "default")))
#else
#define RT_AVX2_CLONES
#endif
