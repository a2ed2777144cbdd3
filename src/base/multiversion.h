// Functions that are built several times, for processors of different abilities. The one that
// fits is chosen when the library is loaded.
#ifndef IMG_MULTIVERSION_H
#define IMG_MULTIVERSION_H

#include <cstdint>  // says which C library this is

// Other compilers, C libraries and processors get the one version that suits all. (clang 14 knows
// the attribute, but loses the function where it is called from another file.)
#if defined(__x86_64__) && defined(__GLIBC__) && !defined(__clang__)
#define IMG_MULTIVERSION __attribute__((target_clones("avx2", "default")))
#else
#define IMG_MULTIVERSION
#endif

#endif
