// The life of an image, from inside the library: what img_openfile, img_createfile and
// img_closefile are made of.
#ifndef IMG_OPEN_H
#define IMG_OPEN_H

#include "imgfile/img.h"

#include <cstdint>
#include <memory>

struct img_desc;
struct img_io_method;

// Takes a handle and makes its record with `filename` and `io_method` split off `name` (null counts
// as empty). Returns the handle, or -1 after a message: no free handle (errno 24), or no memory,
// which leaves the handle free.
img_handle img_alloc_image(const char *name, std::int32_t flags);

// Frees the image's record, if there is one, and gives the handle back. `flush` not 0: tiles that
// wait in the cache are written first.
void img_release_image(img_handle handle, std::int32_t flush);

// As img_openfile and img_createfile, for a file name that is not split: an "@" in it means
// nothing. `filename` null counts as empty; `method` null: the default one.
img_handle img_open_plain_file(const char *filename, const img_io_method *method,
                               std::int32_t flags);
img_handle img_create_plain_file(const char *filename, const img_io_method *method,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t nbands,
                                 std::int32_t type, std::int32_t tile_nsamps,
                                 std::int32_t tile_nlines, std::int32_t nbytes);

// --- Images without a handle ---
//
// Programs that link the library statically may have any number of them open. They show samples as
// they are stored: no chain, no stretch, no cache. One thread at a time may use such an image;
// those of different threads run at the same time.

struct img_raw_close {
    void operator()(img_desc *desc) const;  // completes and closes the file, too
};
using img_raw_image = std::unique_ptr<img_desc, img_raw_close>;

// As img_open_plain_file and img_create_plain_file, without a message of their own. Null: failed,
// with errno set; EINVAL where no type takes the file, EMFILE where too many are open.
img_raw_image img_open_raw(const char *filename, const img_io_method *method, std::int32_t flags);
img_raw_image img_create_raw(const char *filename, const img_io_method *method, std::int32_t nlines,
                             std::int32_t nsamps, std::int32_t nbands, std::int32_t type,
                             std::int32_t tile_nsamps, std::int32_t tile_nlines,
                             std::int32_t nbytes);

// Move samples of one band between a region inside the image, of at least one sample, and rows that
// are `stride` samples apart. Return 0, or -1 after a message.
std::int32_t img_read_raw(img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
                          std::int32_t nsamps, std::int32_t band, std::uint8_t *buffer,
                          std::int32_t stride);
std::int32_t img_write_raw(img_desc *desc, std::int32_t line, std::int32_t samp,
                           std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                           const std::uint8_t *buffer, std::int32_t stride);
// Reads `nsamps` samples that lie side by side in the file, from `offset` on, by one call of the
// access method: where they are read once, that takes less time than to map them. Returns 0, or -1
// with `buffer` partly written.
std::int32_t img_read_raw_run(img_desc *desc, std::int64_t offset, std::int32_t nsamps,
                              std::uint8_t *buffer);

#endif
