// Regions of untiled, pixel interleaved images: one band out of lines of pixels. Arguments and
// results are those of std_region.h.
#ifndef IMG_STD_INTERLEAVED_LINES_H
#define IMG_STD_INTERLEAVED_LINES_H

#include <cstdint>

struct img_desc;

std::int32_t img_std_read_nontiled_interleaved(img_desc *desc, std::int32_t line, std::int32_t samp,
                                               std::int32_t nlines, std::int32_t nsamps,
                                               std::int32_t band, std::uint8_t *buffer,
                                               std::int32_t stride);
// Touches the bytes of this band alone and ignores `fill`.
std::int32_t img_std_write_nontiled_interleaved(img_desc *desc, std::int32_t line,
                                                std::int32_t samp, std::int32_t nlines,
                                                std::int32_t nsamps, std::int32_t band,
                                                const std::uint8_t *buffer, std::int32_t stride,
                                                const std::uint8_t *fill);

#endif
