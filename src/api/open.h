// The life of an image, from inside the library: what img_openfile, img_createfile and
// img_closefile are made of.
#ifndef IMG_OPEN_H
#define IMG_OPEN_H

#include "imgfile/img.h"

#include <cstdint>

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

#endif
