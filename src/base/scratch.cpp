// Working memory. Capacities are powers of two, so that sizes that differ a little share a block.
// Address sanitizers see the bytes beyond the size that was asked for, and blocks that are kept, as
// not usable. Read scratch.h first.
#include "base/scratch.h"

#include <algorithm>
#include <array>
#include <bit>
#include <limits>
#include <new>
#include <utility>

#if defined(__SANITIZE_ADDRESS__)
#define IMG_ADDRESS_SANITIZER
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define IMG_ADDRESS_SANITIZER
#endif
#endif
#ifdef IMG_ADDRESS_SANITIZER
#include <sanitizer/asan_interface.h>
#endif

namespace {

struct kept_block {
    std::uint8_t *block;  // null: none
    std::size_t capacity;
};
std::array<kept_block, 8> kept{};  // oldest first; free entries at the end
std::size_t kept_bytes = 0;

constexpr std::align_val_t ALIGNMENT{IMG_SCRATCH_ALIGNMENT};

// Makes the first `size` bytes of a block usable, the others not.
void mark_usable([[maybe_unused]] const kept_block &memory, [[maybe_unused]] std::size_t size)
{
#ifdef IMG_ADDRESS_SANITIZER
    ASAN_UNPOISON_MEMORY_REGION(memory.block, size);
    ASAN_POISON_MEMORY_REGION(memory.block + size, memory.capacity - size);
#endif
}

void free_block(const kept_block &memory)
{
    mark_usable(memory, memory.capacity);
    ::operator delete[](memory.block, ALIGNMENT);
}

// Takes an entry off the kept blocks; the later ones move up.
kept_block take_kept(kept_block *entry)
{
    const kept_block taken = std::exchange(*entry, {});
    kept_bytes -= taken.capacity;
    std::rotate(entry, entry + 1, kept.end());
    return taken;
}

// Returns a kept block of that capacity, or a new one.
std::uint8_t *take_block(std::size_t capacity)
{
    kept_block *const found = std::ranges::find(kept, capacity, &kept_block::capacity);
    return found != kept.end() ? take_kept(found).block
                               : new (ALIGNMENT, std::nothrow) std::uint8_t[capacity];
}

}  // namespace

img_scratch img_take_scratch(std::size_t size)
{
    if (size > std::numeric_limits<std::ptrdiff_t>::max()) return nullptr;
    const std::size_t capacity =
        std::max(size > IMG_SCRATCH_LIMIT ? size : std::bit_ceil(size), IMG_SCRATCH_ALIGNMENT);
    img_scratch block(take_block(capacity), {capacity});
    if (block) mark_usable({block.get(), capacity}, size);
    return block;
}

void img_scratch_return::operator()(std::uint8_t *block) const
{
    const kept_block back{block, capacity};
    if (capacity > IMG_SCRATCH_LIMIT) {
        free_block(back);
        return;
    }
    while (kept.back().block != nullptr || kept_bytes + capacity > IMG_SCRATCH_LIMIT)
        free_block(take_kept(kept.begin()));
    *std::ranges::find(kept, std::size_t{0}, &kept_block::capacity) = back;
    kept_bytes += capacity;
    mark_usable(back, 0);
}

void img_free_scratch()
{
    while (kept.front().block != nullptr) free_block(take_kept(kept.begin()));
}
