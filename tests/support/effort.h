// How much of a long loop a run of the tests goes through.
#ifndef IMG_TEST_EFFORT_H
#define IMG_TEST_EFFORT_H

#include <algorithm>
#include <cstdlib>

// Returns that share of `all` rounds, at least one, which the environment variable
// IMGFILE_TEST_EFFORT states in percent; without it a tenth. The sanitizer job takes all.
inline int rounds(int all)
{
    const char *const percent = std::getenv("IMGFILE_TEST_EFFORT");
    return std::max(1, all * (percent != nullptr ? std::atoi(percent) : 10) / 100);
}

#endif
