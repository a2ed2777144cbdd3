// Counts and sizes as an index type: the library counts in signed 32-bit numbers, memory in
// std::size_t.
#ifndef IMG_COUNT_H
#define IMG_COUNT_H

#include <cstddef>
#include <cstdint>

// Returns `count`, which must not be negative.
constexpr std::size_t img_count(std::int64_t count)
{
    return static_cast<std::size_t>(count);
}

#endif
