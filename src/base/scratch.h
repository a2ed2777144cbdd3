// Working memory of a call. Blocks that a call gives back are kept, up to a limit, for the next
// call: fresh pages must be zeroed by the kernel, which costs more than most copies.
#ifndef IMG_SCRATCH_H
#define IMG_SCRATCH_H

#include <cstddef>
#include <cstdint>
#include <memory>

inline constexpr std::size_t IMG_SCRATCH_ALIGNMENT = 4096;              // of every block
inline constexpr std::size_t IMG_SCRATCH_LIMIT = std::size_t{8} << 20;  // most bytes kept

// Gives a block back when its owner goes out of scope.
struct img_scratch_return {
    std::size_t capacity = 0;
    void operator()(std::uint8_t *block) const;
};
// A block of working memory with undefined content, or null.
using img_scratch = std::unique_ptr<std::uint8_t[], img_scratch_return>;

// Returns a block of at least `size` bytes; null when memory is short.
img_scratch img_take_scratch(std::size_t size);

// Frees the blocks that are kept.
void img_free_scratch();

#endif
