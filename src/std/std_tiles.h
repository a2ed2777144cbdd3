// Whole tiles of one band: the `read_tiles` and `write_tiles` operations of types that are built on
// the standard driver, and the other ways in which the driver reads tiles.
//
// A run is the tile planes of `band` of tiles `first_tile` to `first_tile` + `ntiles` - 1, inside
// the image, one after the other in `buffer` and in the file's byte order. A run of no tiles, or of
// an untiled image, moves nothing.
#ifndef IMG_STD_TILES_H
#define IMG_STD_TILES_H

#include <cstddef>
#include <cstdint>

struct img_desc;

// Of the calls of this thread. 0: img_std_read_tiles fails without a message. 1 at start. A
// pre-read through a type's own read_tiles sets it to 0 meanwhile: such an operation may call
// img_std_read_tiles, and has no argument that says so. The driver's own pre-reads do not need it.
extern constinit thread_local std::int32_t img_std_report_errors;

// Return 0, or -1 after a message; quietly when memory is short. A failed read leaves in `buffer`
// the bytes that it got.
std::int32_t img_std_read_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                std::int32_t band, std::uint8_t *buffer);
std::int32_t img_std_write_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                 std::int32_t band, const std::uint8_t *buffer);

// As img_std_read_tiles, for a run whose bytes were refused on loan: they are not asked for again.
std::int32_t img_std_read_refused_tiles(img_desc *desc, std::int32_t first_tile,
                                        std::int32_t ntiles, std::int32_t band,
                                        std::uint8_t *buffer);

// Reads a run that is overlaid and stored again, never from bytes that an access method lends.
// Prints nothing, except for virtual tiles. Returns 0, or -1 when the file does not hold all of the
// run or not all was read; for the latter `*missed` becomes the errno value that says why.
std::int32_t img_std_pre_read_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                    std::int32_t band, std::uint8_t *buffer, int *missed);
// Fails a write whose pre-read missed bytes: prints the reason and returns -1.
std::int32_t img_std_fail_pre_read(int missed);

// Copies a run from where its tiles lie, of each plane the `nsamps` samples from `first_sample` on.
// Returns false when the run is refused on loan; then `buffer` may have been written.
bool img_std_read_lent_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                             std::int32_t band, std::size_t first_sample, std::size_t nsamps,
                             std::uint8_t *buffer);

// How the samples of a band lie in a stored tile: byte of the first, bytes from one to the next.
struct img_std_plane {
    std::size_t first, step;
};
img_std_plane img_std_plane_in_tile(const img_desc *desc, std::int32_t band);

#endif
