// The record of one open image, and the table of open images.
#ifndef IMG_DESC_H
#define IMG_DESC_H

#include "api/id_pool.h"
#include "api/img.h"

#include <array>
#include <cstdint>
#include <memory>

struct img_io_method;
struct img_std_file;
struct img_tile_cache;

inline constexpr std::int32_t IMG_MAX_HANDLES = 60;

// Combines the bands of a window into one buffer. Row i of every buffer starts at sample
// i * stride; `bands` holds `nbands` of them. The result is not examined.
using img_merge_fn = std::int32_t (*)(std::int32_t line, std::int32_t samp, std::int32_t nlines,
                                      std::int32_t nsamps, std::int32_t stride, std::int32_t nbytes,
                                      std::int32_t nbands, const std::uint8_t *const *bands,
                                      std::uint8_t *buffer);

// One open image. Made by img_alloc_image and freed by img_release_image; the geometry is set by
// img_createfile or, while a file is opened, by the type's read-header hook through
// img_set_image_params, before anything else reads it.
struct img_desc {
    std::int32_t type;                      // image-type slot; IMG_NO_TYPE: none yet
    std::unique_ptr<char[]> filename;       // without the access-method suffix
    const img_io_method *io_method;         // null: the name asks for a method that does not exist
    std::int32_t oflags;                    // the caller's open flags and IMG_OPEN_BINARY
    std::int32_t nsamps, nlines;            // width and height of the image
    std::int32_t tile_nsamps, tile_nlines;  // width and height of a tile; a 0 in either: untiled
    std::int32_t nbands;
    std::int32_t nbytes;                   // bytes per sample, 1 or 2
    std::int32_t nbits;                    // significant bits per sample
    std::int32_t swap;                     // not 0: the file's byte order is not the host's
    std::int32_t layout;                   // an IMG_LAYOUT_ code
    std::array<std::int32_t, 3> band_map;  // band at each position of a tiled, interleaved pixel
    std::unique_ptr<std::uint8_t[]> mem_image;  // the whole image; null: it lives in a file
    std::int32_t lut_size;                      // entries of each LUT; 0: none
    std::array<std::unique_ptr<std::uint8_t[]>, 3> lut;
    std::int32_t unclipped;                  // not 0: the type takes windows beyond the image
    std::unique_ptr<std::uint8_t[]> header;  // the type's copy of its header or trailer, if any
    img_std_file *std_file;                  // made and freed by the standard driver
    img_handle handle;                       // the record's own
    img_tile_cache *tile_cache;              // made by img_load_tiles, freed at the release
    std::int32_t cache_mb;                   // memory budget of the tile cache; 0: no cache
    std::int32_t cache_pending;              // 1 until img_load_tiles has tried to make the cache
    std::int32_t virtual_tiled;              // 1: an untiled file that is presented in tiles
    std::int32_t merge_bands;                // not 0: the image shows its bands merged into one
    img_merge_fn merge_fn;                   // null: it is not merged after all
};

inline bool img_is_tiled(const img_desc *desc)
{
    return desc->tile_nsamps != 0 && desc->tile_nlines != 0;
}

// Tiles that it takes to hold `extent` lines or samples, the last one perhaps in part.
inline std::int32_t img_whole_tiles(std::int32_t extent, std::int32_t tile_extent)
{
    return extent / tile_extent + (extent % tile_extent != 0 ? 1 : 0);
}

// Samples, and bytes, of one tile plane, in every layout.
inline std::size_t img_plane_samples(const img_desc *desc)
{
    return static_cast<std::size_t>(desc->tile_nlines) *
           static_cast<std::size_t>(desc->tile_nsamps);
}
inline std::size_t img_plane_size(const img_desc *desc)
{
    return img_plane_samples(desc) * static_cast<std::size_t>(desc->nbytes);
}

// IMG_OPEN_READ_ONLY, IMG_OPEN_WRITE_ONLY or IMG_OPEN_READ_WRITE, as the image was opened.
inline std::int32_t img_access_mode(const img_desc *desc)
{
    return desc->oflags & 3;
}

inline img_id_pool *img_handle_pool = nullptr;  // made at start-up, gone after img_mgr_cleanup
inline std::array<img_desc *, IMG_MAX_HANDLES> img_open_images{};  // by handle; null: not open

// Returns the image of `handle`, or null for a handle outside 0..59 or not open.
img_desc *img_find_image(img_handle handle);

// Takes a handle and makes its record with `filename` and `io_method` split off `name` (null
// counts as empty). Returns the handle, or -1 after a message: no free handle (errno 24), or no
// memory, which leaves the handle free.
img_handle img_alloc_image(const char *name, std::int32_t flags);

// Frees the image's record, if there is one, and gives the handle back. `flush` not 0: tiles
// that wait in the cache are written first.
void img_release_image(img_handle handle, std::int32_t flush);

// Returns 0 when `handle` names an open image, else -1 after a message.
std::int32_t img_validate_img_handle(img_handle handle);

// Returns the significant bits per sample, or -1 quietly for a handle that names no image.
std::int32_t img_query_nbits(img_handle handle);

// Fills in the geometry of an image that is being opened. `nbits` -1: 12 for two-byte samples,
// else 8 x `nbytes`. The three LUTs
// of `lut_size` bytes pass to the record; null and 0: none.
void img_set_image_params(img_desc *desc, std::int32_t nlines, std::int32_t nsamps,
                          std::int32_t tile_nsamps, std::int32_t tile_nlines, std::int32_t nbands,
                          std::int32_t nbytes, std::int32_t nbits, std::int32_t layout,
                          std::int32_t lut_size, std::unique_ptr<std::uint8_t[]> lut0,
                          std::unique_ptr<std::uint8_t[]> lut1,
                          std::unique_ptr<std::uint8_t[]> lut2);

// Returns the four bytes at `bytes` as a word of the host's order with its bytes reversed.
std::uint32_t img_swap32(const std::uint8_t *bytes);

#endif
