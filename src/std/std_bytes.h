// Bytes of an image's data, in its file or in memory: positions, growth, loans.
#ifndef IMG_STD_BYTES_H
#define IMG_STD_BYTES_H

#include "io/io_method.h"

#include <cstdint>

struct img_desc;

// Returns a size or an offset, which is not negative, as it is, or -1 when it does not fit 31 bits.
inline std::int32_t img_std_fit31(std::int64_t size)
{
    return size <= INT32_MAX ? static_cast<std::int32_t>(size) : -1;
}

// --- Positions of the data descriptor. 0, or -1 with errno set. ---

// Returns 0 when a seek went to `expected`. A position elsewhere is an input/output error.
std::int32_t img_std_check_position(std::int32_t position, std::int64_t expected);
std::int32_t img_std_seek_to(const img_desc *desc, std::int64_t offset);
// The same for a write: a file that is shorter grows to `offset` first, with zero bytes.
std::int32_t img_std_seek_to_write(img_desc *desc, std::int64_t offset);
// Returns the file's length, with the descriptor at its end, or -1.
std::int32_t img_std_length(const img_desc *desc);
// Sets veof to the file's length.
std::int32_t img_std_update_veof(img_desc *desc);

// --- Growth. 0, or -1 with errno set. ---

// Appends `count` >= 1 zero bytes to the file, whose descriptor must be at its end, `end`. Writes
// only the last byte.
std::int32_t img_std_append_zeros(const img_desc *desc, std::int32_t end, std::int64_t count);
// Appends `count` >= 1 zero bytes to the data file and leaves its descriptor at the new end; does
// nothing for an in-memory image.
std::int32_t img_std_extend(img_desc *desc, std::int32_t count);

// --- Transfers ---

// Read or write `count` bytes at `offset` of the file. A write grows the file up to it and updates
// veof. Return the bytes moved, or -1 with errno set.
std::int32_t img_std_read_at(const img_desc *desc, std::int64_t offset, void *buffer,
                             std::int32_t count);
std::int32_t img_std_write_at(img_desc *desc, std::int64_t offset, const void *buffer,
                              std::int32_t count);
// After a pre-read that returned `got` instead of `count`: sets `*missed` to an errno value if the
// file holds bytes that were not read; leaves it as it is if the file ends there. Keeps errno of a
// failed read.
void img_std_note_missed(const img_desc *desc, std::int64_t offset, std::int32_t got,
                         std::int32_t count, int *missed);

// Returns the place of the `count` bytes at `offset` of an image in memory, for a write, and raises
// veof to the last of them; null when they do not lie inside.
std::uint8_t *img_std_memory_to_write(img_desc *desc, std::int64_t offset, std::int32_t count);

// --- Loans ---

// True when transfers to the image's file may be merged and split freely. Not for images in memory.
bool img_std_may_merge(const img_desc *desc);
// Calls `use` with the `count` bytes at `offset` where they lie: in memory, or in a file whose
// access method lends them. Returns true when all of them were there. False: `use` may have been
// called with bytes that are not those of the file; its result must be discarded, and the ordinary
// transfers run instead.
bool img_std_lend(const img_desc *desc, std::int64_t offset, std::int64_t count, img_io_use_fn use,
                  void *arg);
template <typename Use>
bool img_std_lend(const img_desc *desc, std::int64_t offset, std::int64_t count, Use use)
{
    const img_io_use_fn call = [](void *arg, const std::uint8_t *lent) {
        (*static_cast<Use *>(arg))(lent);
    };
    return img_std_lend(desc, offset, count, call, &use);
}

#endif
