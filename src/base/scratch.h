// Working memory of a call. What a call gives back is kept, up to a bound, for the next one: memory
// fresh from the system costs more than most windows do.
#ifndef IMG_SCRATCH_H
#define IMG_SCRATCH_H

#include <cstddef>
#include <cstdint>
#include <memory>

inline constexpr std::size_t IMG_SCRATCH_ALIGNMENT = 4096;              // of every block
inline constexpr std::size_t IMG_SCRATCH_LIMIT = std::size_t{8} << 20;  // bytes kept at most

struct img_scratch_return {
    std::size_t capacity = 0;
    void operator()(std::uint8_t *block) const;
};
// A block of working memory, its content undefined; null: none.
using img_scratch = std::unique_ptr<std::uint8_t[], img_scratch_return>;

// Returns a block of at least `size` bytes; null when memory is short.
img_scratch img_take_scratch(std::size_t size);

// Gives back to the system what is kept.
void img_free_scratch();

#endif
