#include "base/scratch.h"

#include <algorithm>
#include <array>
#include <bit>
#include <limits>
#include <new>
#include <utility>

#if defined(__SANITIZE_ADDRESS__)
#define IMG_CHECKED_ADDRESSES
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define IMG_CHECKED_ADDRESSES
#endif
#endif
#ifdef IMG_CHECKED_ADDRESSES
#include <sanitizer/asan_interface.h>
#endif

namespace {

struct kept_block {
    std::uint8_t *block;  // null: none
    std::size_t capacity;
};
std::array<kept_block, 8> kept{};  // the longest kept first
std::size_t kept_bytes = 0;

constexpr std::align_val_t ALIGNMENT{IMG_SCRATCH_ALIGNMENT};

// Tells a checker of addresses what of a block may be touched.
void mark_usable([[maybe_unused]] const kept_block &of, [[maybe_unused]] std::size_t size)
{
#ifdef IMG_CHECKED_ADDRESSES
    ASAN_UNPOISON_MEMORY_REGION(of.block, size);
    ASAN_POISON_MEMORY_REGION(of.block + size, of.capacity - size);
#endif
}

void free_block(const kept_block &of)
{
    mark_usable(of, of.capacity);
    ::operator delete[](of.block, ALIGNMENT);
}

// Takes a block off those that are kept; the later ones move up.
kept_block take_kept(kept_block *place)
{
    const kept_block taken = std::exchange(*place, {});
    kept_bytes -= taken.capacity;
    std::rotate(place, place + 1, kept.end());
    return taken;
}

// Returns a block of that capacity, if there is none among those that are kept a new one.
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
    // Sizes that differ a little fit the same block.
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
