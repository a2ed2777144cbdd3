// Where lines, pixels, tiles and samples lie, in each of the five layouts. Offsets are in bytes
// from the start of the file, or of mem_image for an image in memory.
#ifndef IMG_STD_OFFSET_H
#define IMG_STD_OFFSET_H

#include <cstdint>

struct img_desc;

// Of a sample in a plane of lines; of a pixel in lines of interleaved pixels; of a tile of `band`,
// which in layout 4 is the tile of all bands. The position lies inside the image.
std::int64_t img_std_line_offset(const img_desc *desc, std::int64_t line, std::int32_t samp,
                                 std::int32_t band);
std::int64_t img_std_pixel_offset(const img_desc *desc, std::int64_t line, std::int32_t samp);
std::int64_t img_std_tile_offset(const img_desc *desc, std::int64_t tile, std::int32_t band);

// Returns the offset of a sample in the image's layout; 0 in a layout that has no addressing; -1
// for a negative position, one beyond the last tile, and an offset beyond 31 bits.
std::int32_t img_std_sample_offset(const img_desc *desc, std::int32_t line, std::int32_t samp,
                                   std::int32_t band);

#endif
