// The standard raster driver: one file organisation for all formats that consist of a header or
// trailer and raw pixels. It opens and creates the files, knows where each sample lies, and moves
// regions and whole tiles of one band.
//
// This is the driver's face: the state of an image, and how a format takes its slot. Inside are,
// each with its header:
//
//   std_setup               opening, creating, closing; the file organisation
//   std_bytes               bytes of the file: positions, growth, loans
//   std_offset              where lines, pixels, tiles and samples lie
//   std_samples             copying samples
//   std_region              the type's `read` and `write`, which hand a region on to
//     std_lines               untiled, band sequential
//     std_interleaved_lines   untiled, pixel interleaved
//     std_tiled               tiled
//   std_tiles               the type's `read_tiles` and `write_tiles`, with
//     std_interleaved_tiles   the tiles of layout 4
//     std_virtual_tiles       tiles of an untiled file
//   std_memory              between an image in memory and a file
#ifndef IMG_STD_H
#define IMG_STD_H

#include "base/shared_lock.h"
#include "base/types.h"

#include <array>
#include <cstdint>
#include <memory>

// Driver state of one open image. Made by img_std_open, img_std_create and img_std_create_mem;
// freed by img_std_close, img_std_fail_close and img_std_delete. Offsets and sizes are in bytes.
// The set-up validates that they fit 31 bits, the end of the last tile and plane included.
struct img_std_file {
    std::int32_t hdr_fd;         // header hooks use it; equals data_fd; -1: in-memory image
    std::int32_t data_fd;        // pixel data; -1: in-memory image
    std::int32_t veof;           // file: its length as last seen; memory: offset of the last byte
    std::int32_t veof_max;       // memory: offset of the last byte; file: its length at set-up
    std::int32_t data_offset;    // first pixel byte; set by the read- or write-header hook
    std::int32_t band_size;      // one band plane: padded_nlines x padded_nsamps samples
    std::int32_t tiles_across;   // tiles in a row of tiles; 0: untiled
    std::int32_t tiles_down;     // rows of tiles; 0: untiled
    std::int32_t tile_size;      // one tile plane, in layout 4 the whole tile; 0: untiled
    std::int32_t padded_nsamps;  // samples of a stored line
    std::int32_t padded_nlines;  // stored lines of a band plane
    std::unique_ptr<char[]> companion_name;  // null: the image has no second file
    img_mutex position_mutex;  // held by a read that seeks, for several threads may read
};

// The fill of transfers that have none of their own.
inline constexpr std::array<std::uint8_t, 16> img_zero_sample{};

// Fills type slot and hook slot `slot` with the standard driver's operations and the hooks given;
// note that the tiled layout comes before the untiled one. The strings are referenced. Returns 0.
std::int32_t img_std_fill_type(std::int32_t slot, const char *name, const char *extension,
                               std::int32_t tiled_layout, std::int32_t untiled_layout,
                               img_image_fn probe, img_image_fn read_header,
                               img_image_fn write_header, img_image_fn padded_nlines_fn,
                               img_image_fn padded_nsamps_fn, img_type_op_fn type_op,
                               img_type_desc *slot_record);

#endif
