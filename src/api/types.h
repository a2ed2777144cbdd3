// The image-type table: what each file format can do; and the library-wide settings.
#ifndef IMG_TYPES_H
#define IMG_TYPES_H

#include "api/img.h"

#include <array>
#include <cstdint>

struct img_desc;

inline constexpr std::int32_t IMG_MAX_TYPES = 44;     // slots 0..43; slot IMG_NO_TYPE stays empty
inline constexpr std::int32_t IMG_STATIC_TYPES = 25;  // slots offered to the static registrations

// How the pixels of an image lie in its file. Band sequential: one plane per band after the
// other; pixel interleaved: the samples of all bands of a pixel side by side.
enum : std::int32_t {
    IMG_LAYOUT_BSQ = 0,         // untiled, band sequential
    IMG_LAYOUT_BIP = 1,         // untiled, pixel interleaved
    IMG_LAYOUT_TILED = 2,       // tile after tile, each as one tile plane per band
    IMG_LAYOUT_BAND_TILED = 3,  // band after band, each as its tile planes
    IMG_LAYOUT_TILED_BIP = 4,   // tile after tile, each pixel interleaved
    IMG_LAYOUT_DEFAULT = 6      // to be replaced by the type's default at the set-up
};

// Moves a region of one band; row i of the buffer starts at sample i * stride. The region lies
// inside the image unless its `unclipped` is set. Two-byte samples are in host order.
using img_read_fn = std::int32_t (*)(img_desc *desc, std::int32_t line, std::int32_t samp,
                                     std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                     std::uint8_t *buffer, std::int32_t stride);
using img_write_fn = std::int32_t (*)(img_desc *desc, std::int32_t line, std::int32_t samp,
                                      std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                      const std::uint8_t *buffer, std::int32_t stride,
                                      const std::uint8_t *fill);
// Moves a run of tile planes of one band, in the file's byte order.
using img_read_tiles_fn = std::int32_t (*)(img_desc *desc, std::int32_t first_tile,
                                           std::int32_t ntiles, std::int32_t band,
                                           std::uint8_t *buffer);
using img_write_tiles_fn = std::int32_t (*)(img_desc *desc, std::int32_t first_tile,
                                            std::int32_t ntiles, std::int32_t band,
                                            const std::uint8_t *buffer);
// Anything done to an image as a whole.
using img_image_fn = std::int32_t (*)(img_desc *desc);
// What a type adds of its own; the library does not call it.
using img_type_op_fn = std::int32_t (*)();

// One image type. Operations return 0 or more for success and -1 for failure; an empty slot
// means that the type does not offer the operation, and callers test for it.
struct img_type_desc {
    std::int32_t enabled;   // 1: the slot holds a usable type
    const char *name;       // referenced, not owned; null: empty slot
    const char *extension;  // usual file-name ending, referenced; null: empty slot
    img_image_fn open;      // recognises and opens the file; -1: not of this type, or failed
    img_image_fn create;
    img_image_fn create_mem;  // makes an in-memory image of the geometry in the record
    img_image_fn close;       // completes and closes the image's storage
    img_read_fn read;
    img_write_fn write;
    img_read_tiles_fn read_tiles;
    img_write_tiles_fn write_tiles;
    // Moves all of `mem_desc`, an image in memory, from or to the image, as img_std_io_virtual
    // does.
    std::int32_t (*io_virtual)(std::int32_t writing, img_desc *desc, img_desc *mem_desc,
                               std::int32_t line0, std::int32_t samp0);
    // Moves one sample, as img_std_pix_io_virtual does.
    std::int32_t (*pix_io_virtual)(std::int32_t writing, img_desc *desc, std::int32_t line,
                                   std::int32_t samp, std::int32_t band, std::uint8_t *value);
    img_image_fn delete_image;  // closes the image and removes its files
    img_type_op_fn type_op;
    std::array<void *, 3> spare;
};

// What a type built on the standard driver adds to it.
struct img_type_hooks {
    std::int32_t untiled_layout;    // layout of an image that leaves the choice to its type
    std::int32_t tiled_layout;      // the same for an image with both tile sizes
    img_image_fn probe;             // not 0: the open file is of this type; may set `swap`
    img_image_fn read_header;       // fills the geometry and sets data_offset; -1: failure
    img_image_fn write_header;      // writes the geometry and sets data_offset; -1: failure
    img_image_fn padded_nlines_fn;  // stored lines of a band; -1: too many; null: nlines
    img_image_fn padded_nsamps_fn;  // stored samples of a line; -1: too many; null: nsamps
};

inline std::array<img_type_desc, IMG_MAX_TYPES + 1> img_type_table{};
inline std::array<img_type_hooks, IMG_MAX_TYPES + 1> img_type_hooks_table{};

// Returns the slot of the image's type; the empty one for an image without.
const img_type_desc &img_type_of(const img_desc *desc);

// Fills the tables and makes the handle pool, once per process. Does nothing afterwards.
void img_library_init();

// Settings of the whole library. Nothing changes them at run time.
inline std::int32_t img_mapdown_src_slot = 0;       // chain slot that computes the stretch
inline std::int32_t img_mapdown_slot = 9;           // chain slot that applies it
inline std::int32_t img_default_tile_nsamps = 128;  // tile width of virtual tiling
inline std::int32_t img_default_tile_nlines = 128;  // tile height of virtual tiling
inline std::int32_t img_cache_mb = 0;  // tile-cache budget of a new image; not 0: virtual tiling

#endif
