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

// Reads tiles that the cache does not hold; arguments and result are those of a type's read_tiles.
using img_tile_reader_fn = std::int32_t (*)(void *arg, img_desc *desc, std::int32_t first_tile,
                                            std::int32_t ntiles, std::int32_t band,
                                            std::uint8_t *buffer);
// As img_load_tile_run, with `reader` in the place of the type's read_tiles.
std::int32_t img_load_tile_run_by(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                  std::int32_t band, std::uint8_t *buffer,
                                  img_tile_reader_fn reader, void *arg);

#endif
