// Images that show all their bands merged into one.
#ifndef IMG_MERGED_BANDS_H
#define IMG_MERGED_BANDS_H

#include <cstdint>

struct img_desc;

// Reads a window inside the image from every band and merges the bands into `buffer` with the
// image's merge_fn. Returns the result of the last read, or -1 after a message when memory is
// short.
std::int32_t img_load_merged(img_desc *desc, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps, std::uint8_t *buffer,
                             std::int32_t stride);

#endif
