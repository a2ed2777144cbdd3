// Functions that are built several times, for processors of different abilities. The loader picks
// the version that fits.
#ifndef IMG_MULTIVERSION_H
#define IMG_MULTIVERSION_H

#include <cstdint>  // defines __GLIBC__

// Other compilers, C libraries and processors get one version. (clang 14 has the attribute, but the
// function is then missing where another file calls it.)
#if defined(__x86_64__) && defined(__GLIBC__) && !defined(__clang__)
#define IMG_MULTIVERSION __attribute__((target_clones("avx2", "default")))
#else
#define IMG_MULTIVERSION
#endif

#endif
