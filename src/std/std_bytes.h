// Bytes of an image's data, in its file or in memory: positions, growth, loans.
#ifndef IMG_STD_BYTES_H
#define IMG_STD_BYTES_H

#include "base/scratch.h"
#include "io/io_method.h"

#include <cstddef>
#include <cstdint>
#include <cstring>

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

// Read or write `count` bytes at `offset` of the file. Reads of several threads run at the same
// time where the access method can read at a position; else they take turns. A write grows the file
// up to it and updates veof. Return the bytes moved, or -1 with errno set.
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
// transfers run instead. `discards` true: that costs the caller nothing, so that `use` may be
// called although the file is known to have changed.
bool img_std_lend(const img_desc *desc, std::int64_t offset, std::int64_t count, bool discards,
                  img_io_use_fn use, void *arg);
template <typename Use>
bool img_std_lend(const img_desc *desc, std::int64_t offset, std::int64_t count, bool discards,
                  Use use)
{
    const img_io_use_fn call = [](void *arg, const std::uint8_t *lent) {
        (*static_cast<Use *>(arg))(lent);
    };
    return img_std_lend(desc, offset, count, discards, call, &use);
}

// Where the samples of a region go: rows of `row_length` bytes, `pitch` bytes apart.
struct img_std_target {
    std::uint8_t *rows;
    std::size_t nrows, row_length, pitch;
};
// Returns working memory between the lent bytes and the target of a small region, null for others.
// A copy of so many bytes in the processor's cache takes less time than the call of the system that
// it saves.
img_scratch img_std_between(const img_desc *desc, std::size_t size);
// Lends the bytes for a copy of samples: calls `copy(bytes, rows, pitch)`, which fills rows that
// lie `pitch` bytes apart. Small regions are copied in between, so that a failed loan leaves the
// target alone. Returns true when the target was filled.
template <typename Copy>
bool img_std_lend_rows(const img_desc *desc, std::int64_t offset, std::int64_t count,
                       const img_std_target &target, Copy copy)
{
    const img_scratch between = img_std_between(desc, target.nrows * target.row_length);
    if (!between)
        return img_std_lend(desc, offset, count, false, [&](const std::uint8_t *lent) {
            copy(lent, target.rows, target.pitch);
        });
    if (!img_std_lend(desc, offset, count, true, [&](const std::uint8_t *lent) {
            copy(lent, between.get(), target.row_length);
        }))
        return false;
    if (target.pitch == target.row_length) {
        std::memcpy(target.rows, between.get(), target.nrows * target.row_length);
        return true;
    }
    for (std::size_t row = 0; row < target.nrows; ++row)
        std::memcpy(target.rows + row * target.pitch, between.get() + row * target.row_length,
                    target.row_length);
    return true;
}

#endif
