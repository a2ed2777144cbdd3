// The record of one open image. It travels down every call.
#ifndef IMG_DESC_H
#define IMG_DESC_H

#include "base/count.h"
#include "imgfile/img.h"

#include <array>
#include <cstdint>
#include <memory>

struct img_io_method;
struct img_std_file;
struct img_tile_cache;

// How the pixels of an image lie in its file. Band sequential: one plane per band, plane after
// plane. Pixel interleaved: the samples of all bands of a pixel lie side by side.
enum : std::int32_t {
    IMG_LAYOUT_BSQ = 0,         // untiled, band sequential
    IMG_LAYOUT_BIP = 1,         // untiled, pixel interleaved
    IMG_LAYOUT_TILED = 2,       // tile after tile, each as one tile plane per band
    IMG_LAYOUT_BAND_TILED = 3,  // band after band, each as its tile planes
    IMG_LAYOUT_TILED_BIP = 4,   // tile after tile, each pixel interleaved
    IMG_LAYOUT_DEFAULT = 6      // to be replaced by the type's default at the set-up
};

inline constexpr std::int32_t IMG_ACCESS_MODE = 3;  // the bits of open flags that hold the mode
inline constexpr std::size_t IMG_MAX_INTERLEAVED_BANDS = 3;  // of tiles that are pixel interleaved
inline constexpr std::int32_t IMG_TWO_BYTE_BITS = 12;        // significant bits of two-byte samples

// Combines the bands of a window into one buffer. Row i of every buffer starts at sample
// i * `stride`; `bands` holds `nbands` of them. The result is ignored.
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
    std::int32_t nbytes;  // bytes per sample, 1 or 2
    std::int32_t nbits;   // significant bits per sample
    std::int32_t swap;    // not 0: the file's byte order is not the host's
    std::int32_t layout;  // an IMG_LAYOUT_ code
    std::array<std::int32_t, IMG_MAX_INTERLEAVED_BANDS>
        band_map;  // band at each position of a tiled, interleaved pixel
    std::unique_ptr<std::uint8_t[]> mem_image;  // the whole image; null: it lives in a file
    std::int32_t lut_size;                      // entries of each LUT; 0: none
    // Identity tables of one-byte images. The record keeps them for types that state tables of
    // their own; nothing in the library reads their entries.
    std::array<std::unique_ptr<std::uint8_t[]>, 3> lut;
    std::int32_t unclipped;                  // not 0: the type takes windows beyond the image
    std::unique_ptr<std::uint8_t[]> header;  // the type's copy of its header or trailer, if any
    img_std_file *std_file;                  // owned by the standard driver, which frees it
    img_handle handle;                       // the record's own
    img_tile_cache *tile_cache;              // owned; made by img_load_tiles; null: none
    std::int32_t cache_mb;                   // memory budget of the tile cache; 0: no cache
    std::int32_t cache_pending;              // 1 until img_load_tiles has tried to make the cache
    std::int32_t virtual_tiled;              // 1: an untiled file that is presented in tiles
    std::int32_t merge_bands;                // not 0: the image shows its bands merged into one
    img_merge_fn merge_fn;                   // null: the bands stay apart after all
};

inline bool img_is_tiled(const img_desc *desc)
{
    return desc->tile_nsamps != 0 && desc->tile_nlines != 0;
}

// Returns the tiles that `extent` lines or samples take, the last one perhaps in part.
inline std::int32_t img_whole_tiles(std::int32_t extent, std::int32_t tile_extent)
{
    return extent / tile_extent + (extent % tile_extent != 0 ? 1 : 0);
}

// Samples, and bytes, of one tile plane, in every layout.
inline std::size_t img_plane_samples(const img_desc *desc)
{
    return img_count(desc->tile_nlines) * img_count(desc->tile_nsamps);
}
inline std::size_t img_plane_size(const img_desc *desc)
{
    return img_plane_samples(desc) * img_count(desc->nbytes);
}

// IMG_OPEN_READ_ONLY, IMG_OPEN_WRITE_ONLY or IMG_OPEN_READ_WRITE, as the image was opened.
inline std::int32_t img_access_mode(const img_desc *desc)
{
    return desc->oflags & IMG_ACCESS_MODE;
}

// Fills in the geometry of an image that is being opened. `nbits` -1: 12 for two-byte samples, else
// 8 x `nbytes`. The three LUTs of `lut_size` bytes pass to the record; null and 0: none.
void img_set_image_params(img_desc *desc, std::int32_t nlines, std::int32_t nsamps,
                          std::int32_t tile_nsamps, std::int32_t tile_nlines, std::int32_t nbands,
                          std::int32_t nbytes, std::int32_t nbits, std::int32_t layout,
                          std::int32_t lut_size, std::unique_ptr<std::uint8_t[]> lut0,
                          std::unique_ptr<std::uint8_t[]> lut1,
                          std::unique_ptr<std::uint8_t[]> lut2);

#endif
