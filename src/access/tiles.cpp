// Runs of whole tiles: validated here, then moved by the type's operations, through the image's
// cache if it has one. The cache is made here, at the first load. Read tiles.h and tile_cache.h
// first.
#include "access/tiles.h"

#include "access/tile_cache.h"
#include "base/img_desc.h"
#include "base/types.h"

namespace {

// Tiles in one band of a tiled image.
std::int64_t tile_count(const img_desc *desc)
{
    return std::int64_t{img_whole_tiles(desc->nsamps, desc->tile_nsamps)} *
           img_whole_tiles(desc->nlines, desc->tile_nlines);
}

bool is_a_run_of_tiles(const img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                       std::int32_t band)
{
    return band >= 0 && band < desc->nbands && first_tile >= 0 &&
           std::int64_t{first_tile} + ntiles <= tile_count(desc);
}

// The cache's write-back operation. The band comes before the tile here, after it in write_tiles.
std::int32_t img_std_write_tile(void *arg, std::int32_t band, std::int32_t tile,
                                const std::uint8_t *buffer)
{
    auto *const image = static_cast<img_desc *>(arg);
    return img_type_of(image).write_tiles(image, tile, 1, band, buffer);
}

// Makes the image's cache at the first load. A budget that is too small is not tried again.
void make_cache(img_desc *desc)
{
    if (desc->cache_pending == 0 || desc->cache_mb <= 0) return;
    desc->tile_cache = img_tile_cache_create(static_cast<std::int32_t>(img_plane_size(desc)),
                                             static_cast<std::int32_t>(tile_count(desc)),
                                             desc->nbands, desc->cache_mb);
    img_tile_cache_set_write_back(desc->tile_cache, img_std_write_tile, desc);
    desc->cache_pending = 0;
}

std::int32_t load_through_cache(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                std::int32_t band, std::uint8_t *buffer, img_tile_reader_fn reader,
                                void *arg)
{
    img_tile_cache *const cache = desc->tile_cache;
    for (std::int32_t tile = first_tile; tile < first_tile + ntiles; ++tile) {
        if (img_tile_cache_get(cache, tile, band, buffer) != 0) {
            const std::int32_t result = reader(arg, desc, tile, 1, band, buffer);
            if (result != 0) return result;
            img_tile_cache_put(cache, tile, band, buffer, 0);
        }
        buffer += img_tile_cache_tile_bytes(cache);
    }
    return 0;
}

std::int32_t dump_through_cache(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                std::int32_t band, const std::uint8_t *buffer)
{
    img_tile_cache *const cache = desc->tile_cache;
    for (std::int32_t tile = first_tile; tile < first_tile + ntiles; ++tile) {
        const std::int32_t result = img_tile_cache_put(cache, tile, band, buffer, 1);
        if (result != 0) return result;
        buffer += img_tile_cache_tile_bytes(cache);
    }
    return 0;
}

}  // namespace

std::int32_t img_load_tile_run(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                               std::int32_t band, std::uint8_t *buffer)
{
    if (img_type_of(desc).read_tiles == nullptr) return -1;
    const img_tile_reader_fn reader = [](void * /*arg*/, img_desc *image, std::int32_t first,
                                         std::int32_t count, std::int32_t image_band,
                                         std::uint8_t *planes) {
        return img_type_of(image).read_tiles(image, first, count, image_band, planes);
    };
    return img_load_tile_run_by(desc, first_tile, ntiles, band, buffer, reader, nullptr);
}

std::int32_t img_load_tile_run_by(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                  std::int32_t band, std::uint8_t *buffer,
                                  img_tile_reader_fn reader, void *arg)
{
    if (desc->mem_image || img_access_mode(desc) == IMG_OPEN_WRITE_ONLY) return -1;
    if (!img_is_tiled(desc) || ntiles < 1) return 0;
    if (buffer == nullptr || !is_a_run_of_tiles(desc, first_tile, ntiles, band)) return -1;
    make_cache(desc);
    if (desc->tile_cache != nullptr)
        return load_through_cache(desc, first_tile, ntiles, band, buffer, reader, arg);
    return reader(arg, desc, first_tile, ntiles, band, buffer);
}

std::int32_t img_dump_tile_run(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                               std::int32_t band, const std::uint8_t *buffer)
{
    if (img_access_mode(desc) == IMG_OPEN_READ_ONLY || img_type_of(desc).write_tiles == nullptr)
        return -1;
    if (!img_is_tiled(desc) || ntiles < 1) return 0;
    if (buffer == nullptr || !is_a_run_of_tiles(desc, first_tile, ntiles, band)) return -1;
    if (desc->tile_cache != nullptr)
        return dump_through_cache(desc, first_tile, ntiles, band, buffer);
    return img_type_of(desc).write_tiles(desc, first_tile, ntiles, band, buffer);
}
