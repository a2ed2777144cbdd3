// Whole tiles of one band. In layouts 0, 1 and 3, and with one band, a run is contiguous and moves
// in one call; in layout 2 it moves tile by tile; in layout 4 whole tiles of all bands move and are
// split or merged. Read std_tiles.h first.
#include "std/std_tiles.h"

#include "access/tile_cache.h"
#include "base/count.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/scratch.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_interleaved_tiles.h"
#include "std/std_offset.h"
#include "std/std_samples.h"
#include "std/std_virtual_tiles.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

constinit thread_local std::int32_t img_std_report_errors = 1;

namespace {

bool is_interleaved(const img_desc *desc)
{
    return desc->layout == IMG_LAYOUT_TILED_BIP && desc->nbands > 1;
}

// True where the planes of other bands lie between those of a run.
bool is_split_by_bands(const img_desc *desc)
{
    return desc->layout == IMG_LAYOUT_TILED && desc->nbands > 1;
}

std::int32_t run_bytes(const img_desc *desc, std::int32_t ntiles)
{
    return ntiles * desc->std_file->tile_size;
}

img_scratch new_zero_plane(const img_desc *desc)
{
    const std::size_t size = img_plane_size(desc);
    img_scratch plane = img_take_scratch(size);
    if (plane) std::memset(plane.get(), 0, size);
    return plane;
}

// How a read by calls treats the image's cache and its own failures.
struct read_mode {
    img_tile_cache *cache;  // gets the other bands of interleaved tiles; null: it does not
    int *missed;            // null: failures are printed; else a pre-read, which notes them here

    bool prints() const { return missed == nullptr && img_std_report_errors != 0; }
};

// Fails a read of an in-memory image that does not hold all of the run.
std::int32_t fail_beyond_virtual_eof(const read_mode &mode)
{
    return mode.prints() ? img_fail("img_std_read_tiles: read beyond virtual eof!!\n") : -1;
}

// Reads `length` bytes of tiles. Returns the bytes read; fewer than `length` is a failure that has
// been printed or noted, -1 that no byte was read.
std::int32_t read_bytes(img_desc *desc, std::int64_t offset, std::uint8_t *buffer,
                        std::int32_t length, const read_mode &mode)
{
    if (desc->mem_image) {
        if (offset + length - 1 > desc->std_file->veof) return fail_beyond_virtual_eof(mode);
        std::memcpy(buffer, desc->mem_image.get() + offset, img_count(length));
        return length;
    }
    const std::int32_t got = img_std_read_at(desc, offset, buffer, length);
    if (got == length) return got;
    if (mode.missed != nullptr) img_std_note_missed(desc, offset, got, length, mode.missed);
    if (mode.prints()) {
        if (got == -1)
            img_fail_errno("img_std_read_tiles:read");
        else
            img_fail("img_std_read_tiles: %d of %d bytes read!!\n", got, length);
    }
    return got;
}

// Writes `length` bytes of tiles. `per_tile`: they are one tile of several that are written one by
// one, whose short write is reported in two lines.
std::int32_t write_bytes(img_desc *desc, std::int64_t offset, const std::uint8_t *buffer,
                         std::int32_t length, bool per_tile)
{
    if (desc->mem_image) {
        std::uint8_t *const tiles = img_std_memory_to_write(desc, offset, length);
        if (tiles == nullptr) return img_fail("img_std_write_tiles: write past virtual eof!!\n");
        std::memcpy(tiles, buffer, img_count(length));
        return 0;
    }
    const std::int32_t written = img_std_write_at(desc, offset, buffer, length);
    if (written == length) return 0;
    if (written == -1) return img_fail_errno("img_std_write_tiles:write");
    if (!per_tile)
        return img_fail("img_std_write_tiles: %d of %d bytes written!!\n", written, length);
    img_fail("img_std_write_tiles:%d of %d bytes written!!\n", written, length);
    return img_fail_errno("img_std_write_tiles:partial write");
}

// Splits one whole interleaved tile: `band` to `plane`, the others to the cache, if there is one.
// A tile that the cache holds already may be newer than the file's and stays.
void split_tile_into_cache(const img_desc *desc, const std::uint8_t *pixels, std::int32_t tile,
                           std::int32_t band, std::uint8_t *plane, img_tile_cache *cache)
{
    std::array<img_scratch, IMG_MAX_INTERLEAVED_BANDS> others;
    img_std_planes planes{};
    for (std::int32_t each = 0; each < desc->nbands; ++each) {
        const std::size_t index = img_count(each);
        if (each != band && cache != nullptr && img_tile_cache_has(cache, tile, each) == 0)
            others[index] = new_zero_plane(desc);  // null: it is not cached
        planes[index] = each == band ? plane : others[index].get();
    }
    img_std_split_tile(pixels, desc->tile_nsamps, desc->tile_nlines, desc->nbytes, desc->nbands,
                       desc->band_map, planes);
    for (std::int32_t each = 0; each < desc->nbands; ++each)
        if (const auto &other = others[img_count(each)]; other)
            img_tile_cache_put(cache, tile, each, other.get(), 0);
}

std::int32_t read_interleaved(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                              std::int32_t band, std::uint8_t *buffer, const read_mode &mode)
{
    // Tiles in memory are split where they lie, unless they reach beyond its end.
    if (desc->mem_image) return fail_beyond_virtual_eof(mode);
    const std::int32_t length = run_bytes(desc, ntiles);
    const img_scratch run = img_take_scratch(img_count(length));
    if (!run) {
        if (mode.missed != nullptr) *mode.missed = ENOMEM;
        return -1;
    }
    const std::int32_t got =
        read_bytes(desc, img_std_tile_offset(desc, first_tile, band), run.get(), length, mode);
    const std::uint8_t *pixels = run.get();
    const std::size_t tile_size = img_count(desc->std_file->tile_size);
    std::size_t left = img_count(std::clamp(got, 0, length));
    for (std::int32_t tile = first_tile; left >= tile_size; ++tile) {
        split_tile_into_cache(desc, pixels, tile, band, buffer, mode.cache);
        pixels += tile_size;
        left -= tile_size;
        buffer += img_plane_size(desc);
    }
    if (got == length) return 0;
    img_std_planes planes{};  // of the tile in which the file ends
    planes[img_count(band)] = buffer;
    if (mode.missed == nullptr) left -= left % img_count(desc->nbytes);  // half of a sample
    img_std_split_bytes(pixels, left, desc->nbytes, desc->nbands, desc->band_map, planes);
    return -1;
}

// Reads stored tiles by transfers.
std::int32_t read_by_calls(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                           std::int32_t band, std::uint8_t *buffer, const read_mode &mode)
{
    if (is_interleaved(desc)) return read_interleaved(desc, first_tile, ntiles, band, buffer, mode);
    const std::int32_t pieces = is_split_by_bands(desc) ? ntiles : 1;
    const std::int32_t length = run_bytes(desc, ntiles / pieces);
    for (std::int32_t i = 0; i < pieces; ++i) {
        const std::int64_t offset = img_std_tile_offset(desc, first_tile + i, band);
        if (read_bytes(desc, offset, buffer, length, mode) != length) return -1;
        buffer += length;
    }
    return 0;
}

// Reads stored tiles from where they lie.
bool read_lent(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles, std::int32_t band,
               std::uint8_t *buffer)
{
    return img_std_read_lent_tiles(desc, first_tile, ntiles, band, 0, img_plane_samples(desc),
                                   buffer);
}

bool moves_nothing(const img_desc *desc, std::int32_t ntiles)
{
    return ntiles < 1 || desc->std_file->tile_size == 0;
}

// Builds one interleaved tile of the caller's plane and of the other planes that the file holds, 0
// where it holds none. Returns 0, or -1: memory is short, or a pre-read missed bytes.
std::int32_t merge_with_other_bands(img_desc *desc, std::int32_t tile, std::int32_t band,
                                    const std::uint8_t *plane, std::uint8_t *pixels)
{
    std::array<img_scratch, IMG_MAX_INTERLEAVED_BANDS> others;
    img_std_const_planes planes{};
    int missed = 0;
    for (std::int32_t each = 0; each < desc->nbands; ++each) {
        if (each == band) continue;
        auto &other = others[img_count(each)];
        other = new_zero_plane(desc);
        if (!other) return -1;
        if (!desc->mem_image || !read_lent(desc, tile, 1, each, other.get()))
            read_by_calls(desc, tile, 1, each, other.get(), {.cache = nullptr, .missed = &missed});
        planes[img_count(each)] = other.get();
    }
    if (missed != 0) return img_std_fail_pre_read(missed);
    planes[img_count(band)] = plane;
    img_std_merge_tile(desc->nbands, desc->band_map, planes, desc->tile_nsamps, desc->tile_nlines,
                       desc->nbytes, pixels);
    return 0;
}

std::int32_t write_interleaved(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                               std::int32_t band, const std::uint8_t *buffer)
{
    const std::int32_t length = run_bytes(desc, ntiles);
    const img_scratch run = img_take_scratch(img_count(length));
    if (!run) return -1;
    for (std::int32_t i = 0; i < ntiles; ++i)
        if (merge_with_other_bands(desc, first_tile + i, band,
                                   buffer + img_count(i) * img_plane_size(desc),
                                   run.get() + img_count(run_bytes(desc, i))) == -1)
            return -1;
    return write_bytes(desc, img_std_tile_offset(desc, first_tile, band), run.get(), length, false);
}

}  // namespace

std::int32_t img_std_read_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                std::int32_t band, std::uint8_t *buffer)
{
    if (moves_nothing(desc, ntiles)) return 0;
    if (desc->virtual_tiled != 0)
        return img_std_read_virtual_tiles(desc, first_tile, ntiles, band, buffer);
    // Interleaved tiles are read whole where a cache takes the other bands.
    const bool feeds_cache = is_interleaved(desc) && desc->tile_cache != nullptr;
    if (!feeds_cache && read_lent(desc, first_tile, ntiles, band, buffer)) return 0;
    return read_by_calls(desc, first_tile, ntiles, band, buffer,
                         {.cache = desc->tile_cache, .missed = nullptr});
}

std::int32_t img_std_read_refused_tiles(img_desc *desc, std::int32_t first_tile,
                                        std::int32_t ntiles, std::int32_t band,
                                        std::uint8_t *buffer)
{
    return read_by_calls(desc, first_tile, ntiles, band, buffer,
                         {.cache = desc->tile_cache, .missed = nullptr});
}

std::int32_t img_std_pre_read_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                    std::int32_t band, std::uint8_t *buffer, int *missed)
{
    if (desc->virtual_tiled != 0)
        return img_std_pre_read_virtual_tiles(desc, first_tile, ntiles, band, buffer, missed);
    if (desc->mem_image && read_lent(desc, first_tile, ntiles, band, buffer)) return 0;
    return read_by_calls(desc, first_tile, ntiles, band, buffer,
                         {.cache = desc->tile_cache, .missed = missed});
}

std::int32_t img_std_fail_pre_read(int missed)
{
    errno = missed;
    return img_fail_errno("img_std_read_tiles:read");
}

std::int32_t img_std_write_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                 std::int32_t band, const std::uint8_t *buffer)
{
    if (moves_nothing(desc, ntiles)) return 0;
    if (desc->virtual_tiled != 0)
        return img_std_write_virtual_tiles(desc, first_tile, ntiles, band, buffer);
    if (is_interleaved(desc)) return write_interleaved(desc, first_tile, ntiles, band, buffer);

    const bool tile_by_tile = is_split_by_bands(desc);
    const std::int32_t pieces = tile_by_tile ? ntiles : 1;
    const std::int32_t length = run_bytes(desc, ntiles / pieces);
    for (std::int32_t i = 0; i < pieces; ++i) {
        const std::int64_t offset = img_std_tile_offset(desc, first_tile + i, band);
        if (write_bytes(desc, offset, buffer, length, tile_by_tile) == -1) return -1;
        buffer += length;
    }
    return 0;
}

bool img_std_read_lent_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                             std::int32_t band, std::size_t first_sample, std::size_t nsamps,
                             std::uint8_t *buffer)
{
    const std::int64_t begin = img_std_tile_offset(desc, first_tile, band);
    const std::int64_t next = img_std_tile_offset(desc, std::int64_t{first_tile} + 1, band);
    const std::int64_t end = begin + (next - begin) * (ntiles - 1) + desc->std_file->tile_size;
    const img_std_plane plane = img_std_plane_in_tile(desc, band);
    return img_std_lend(desc, begin, end - begin, false, [&](const std::uint8_t *bytes) {
        img_std_copy_rows(
            {bytes + plane.first + first_sample * plane.step, img_count(next - begin), plane.step},
            buffer + first_sample * img_count(desc->nbytes), img_plane_size(desc),
            img_count(ntiles), nsamps, desc->nbytes, false);
    });
}

img_std_plane img_std_plane_in_tile(const img_desc *desc, std::int32_t band)
{
    const std::size_t width = img_count(desc->nbytes);
    if (!is_interleaved(desc)) return {0, width};
    const auto position = std::ranges::find(desc->band_map, band) - desc->band_map.begin();
    return {img_count(position) * width, img_count(desc->nbands) * width};
}
