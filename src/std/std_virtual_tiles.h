// Virtual tiles: an untiled file presented in tiles, which are composed of its lines.
#ifndef IMG_STD_VIRTUAL_TILES_H
#define IMG_STD_VIRTUAL_TILES_H

#include <cstdint>

struct img_desc;

// Arguments and results are those of std_tiles.h; failures print what transfers of lines print.
// Both stop at the first tile that fails. Samples of a plane that lie outside the image are not
// touched.
std::int32_t img_std_read_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                        std::int32_t ntiles, std::int32_t band,
                                        std::uint8_t *buffer);
std::int32_t img_std_write_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                         std::int32_t ntiles, std::int32_t band,
                                         const std::uint8_t *buffer);
// The read for tiles that are stored again; `missed` is that of img_std_pre_read_lines.
std::int32_t img_std_pre_read_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                            std::int32_t ntiles, std::int32_t band,
                                            std::uint8_t *buffer, int *missed);

#endif
