// Regions of tiled images, one run of whole tiles per row of tiles. Arguments and results are those
// of std_region.h; failures print what transfers of tiles print.
#ifndef IMG_STD_TILED_H
#define IMG_STD_TILED_H

#include <cstdint>

struct img_desc;

std::int32_t img_read_tiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                            std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                            std::uint8_t *buffer, std::int32_t stride);
// Gives `fill` (null: 0), its bytes as they are, to the parts of its tiles that the image does not
// hold yet. Fails rather than store a tile of which bytes that the file holds could not be read
// back.
std::int32_t img_std_write_tiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                 const std::uint8_t *buffer, std::int32_t stride,
                                 const std::uint8_t *fill);

#endif
