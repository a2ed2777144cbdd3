// Virtual tiles. They travel in the file's byte order like stored ones. Read std_virtual_tiles.h,
// then std_lines.h.
#include "std/std_virtual_tiles.h"

#include "base/img_desc.h"
#include "std/std.h"
#include "std/std_lines.h"

#include <algorithm>

namespace {

// The part of the image that one virtual tile shows.
struct tile_region {
    std::int32_t line, samp, nlines, nsamps;
};

tile_region region_of(const img_desc *desc, std::int32_t tile)
{
    const std::int32_t line = desc->tile_nlines * (tile / desc->std_file->tiles_across);
    const std::int32_t samp = desc->tile_nsamps * (tile % desc->std_file->tiles_across);
    return {.line = line,
            .samp = samp,
            .nlines = std::min(desc->tile_nlines, desc->nlines - line),
            .nsamps = std::min(desc->tile_nsamps, desc->nsamps - samp)};
}

// Calls `move(region, offset)` for each tile of a run, until one returns other than 0. The offset
// is that of the tile's plane in the buffer.
template <typename Move>
std::int32_t for_each_tile(const img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                           Move move)
{
    for (std::int32_t i = 0; i < ntiles; ++i) {
        const std::int32_t result =
            move(region_of(desc, first_tile + i), img_count(i) * img_plane_size(desc));
        if (result != 0) return result;
    }
    return 0;
}

}  // namespace

std::int32_t img_std_read_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                        std::int32_t ntiles, std::int32_t band,
                                        std::uint8_t *buffer)
{
    return for_each_tile(
        desc, first_tile, ntiles, [=](const tile_region &region, std::size_t offset) {
            return img_std_read_lines(desc, region.line, region.samp, region.nlines, region.nsamps,
                                      band, buffer + offset, desc->tile_nsamps, false);
        });
}

std::int32_t img_std_write_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                         std::int32_t ntiles, std::int32_t band,
                                         const std::uint8_t *buffer)
{
    return for_each_tile(
        desc, first_tile, ntiles, [=](const tile_region &region, std::size_t offset) {
            return img_std_write_lines(desc, region.line, region.samp, region.nlines, region.nsamps,
                                       band, buffer + offset, desc->tile_nsamps, false);
        });
}

std::int32_t img_std_pre_read_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                            std::int32_t ntiles, std::int32_t band,
                                            std::uint8_t *buffer, int *missed)
{
    return for_each_tile(
        desc, first_tile, ntiles, [=](const tile_region &region, std::size_t offset) {
            return img_std_pre_read_lines(desc, region.line, region.samp, region.nlines,
                                          region.nsamps, band, buffer + offset, desc->tile_nsamps,
                                          missed);
        });
}
