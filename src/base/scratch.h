// Working memory of a call. Blocks that a call gives back are kept for the next call of the same
// thread, up to a limit: fresh pages must be zeroed by the kernel, which costs more than most
// copies. They are freed when the thread ends.
#ifndef IMG_SCRATCH_H
#define IMG_SCRATCH_H

#include <cstddef>
#include <cstdint>
#include <memory>

inline constexpr std::size_t IMG_SCRATCH_ALIGNMENT = 4096;              // of every block
inline constexpr std::size_t IMG_SCRATCH_LIMIT = std::size_t{8} << 20;  // bytes kept per thread

// Gives a block back when its owner goes out of scope.
struct img_scratch_return {
    std::size_t capacity = 0;
    void operator()(std::uint8_t *block) const;
};
// A block of working memory with undefined content, or null.
using img_scratch = std::unique_ptr<std::uint8_t[], img_scratch_return>;

// Returns a block of at least `size` bytes; null when memory is short.
img_scratch img_take_scratch(std::size_t size);

// Prepares for threads that end; without it, or without memory, blocks are not kept.
void img_start_scratch();
// Frees the blocks of all threads. No other thread may be in a call.
void img_free_scratch();
// The same, when the library is unloaded: no blocks are kept from then on.
void img_stop_scratch();

// Enclose a fork. In the child, the other threads' blocks are freed.
void img_scratch_before_fork();
void img_scratch_after_fork(bool in_child);

#endif
