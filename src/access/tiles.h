// Runs of whole tiles of one band: the work of img_load_tiles and img_dump_tiles once their handle
// is found, and the way by which the standard driver moves windows of tiled images. Both go through
// the image's tile cache, if it has one.
#ifndef IMG_TILES_H
#define IMG_TILES_H

#include <cstdint>

struct img_desc;

// Arguments, results and messages are those of img_load_tiles and img_dump_tiles.
std::int32_t img_load_tile_run(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                               std::int32_t band, std::uint8_t *buffer);
std::int32_t img_dump_tile_run(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                               std::int32_t band, const std::uint8_t *buffer);

#endif
