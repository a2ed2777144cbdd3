// Whole tiles of one band, in the file's byte order.
#include "access/tile_cache.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/scratch.h"
#include "std/std.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

namespace {

// Sets the image's cache aside, so that reads go to the file alone, and puts it back.
class without_cache {
public:
    explicit without_cache(img_desc *desc)
        : m_desc(desc), m_cache(std::exchange(desc->tile_cache, nullptr))
    {
    }
    ~without_cache() { m_desc->tile_cache = m_cache; }
    without_cache(const without_cache &) = delete;
    without_cache &operator=(const without_cache &) = delete;

private:
    img_desc *m_desc;
    img_tile_cache *m_cache;
};

bool is_interleaved(const img_desc *desc)
{
    return desc->layout == IMG_LAYOUT_TILED_BIP && desc->nbands > 1;
}

// In layout 2 with several bands a run of one band is not contiguous.
bool has_planes_between(const img_desc *desc)
{
    return desc->layout == IMG_LAYOUT_TILED && desc->nbands > 1;
}

std::int32_t run_bytes(const img_desc *desc, std::int32_t ntiles)
{
    return ntiles * desc->std_file->tile_size;
}

img_scratch new_run(std::int32_t length)
{
    return img_take_scratch(static_cast<std::size_t>(length));
}

img_scratch new_zero_plane(const img_desc *desc)
{
    const std::size_t size = img_plane_size(desc);
    img_scratch plane = img_take_scratch(size);
    if (plane) std::memset(plane.get(), 0, size);
    return plane;
}

// Fails a read of an in-memory image that does not have all of what it was asked for.
std::int32_t fail_beyond_virtual_eof()
{
    return img_std_report_errors != 0 ? img_fail("img_std_read_tiles: read beyond virtual eof!!\n")
                                      : -1;
}

// Reads `length` bytes of tiles. Returns how many came; fewer than `length` is a failure that
// has been reported, -1 that none came at all.
std::int32_t read_bytes(img_desc *desc, std::int64_t offset, std::uint8_t *buffer,
                        std::int32_t length)
{
    if (desc->mem_image) {
        if (offset + length - 1 > desc->std_file->veof) return fail_beyond_virtual_eof();
        std::memcpy(buffer, desc->mem_image.get() + offset, static_cast<std::size_t>(length));
        return length;
    }
    const std::int32_t got = img_std_read_at(desc, offset, buffer, length);
    if (got != length && img_std_report_errors != 0) {
        if (got == -1)
            img_fail_errno("img_std_read_tiles:read");
        else
            img_fail("img_std_read_tiles: %d of %d bytes read!!\n", got, length);
    }
    return got;
}

// Writes `length` bytes of tiles. `per_tile` says that they are one tile of several that are
// written one by one, whose short write is reported in two lines.
std::int32_t write_bytes(img_desc *desc, std::int64_t offset, const std::uint8_t *buffer,
                         std::int32_t length, bool per_tile)
{
    if (desc->mem_image) {
        std::uint8_t *const to = img_std_memory_to_write(desc, offset, length);
        if (to == nullptr) return img_fail("img_std_write_tiles: write past virtual eof!!\n");
        std::memcpy(to, buffer, static_cast<std::size_t>(length));
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

// Copies the samples at position `position` of the first `length` bytes of interleaved pixels to
// a plane: all of those that are there whole.
void split_position(const std::uint8_t *pixels, std::size_t length, std::size_t position,
                    std::size_t nbands, std::int32_t nbytes, std::uint8_t *plane)
{
    const auto width = static_cast<std::size_t>(nbytes);
    const std::size_t pixel = nbands * width;
    const std::size_t sample_end = (position + 1) * width;
    if (length < sample_end) return;
    img_std_copy_samples(pixels + position * width, pixel, plane, width,
                         (length - sample_end) / pixel + 1, nbytes, false);
}

void split_bytes(const std::uint8_t *tile, std::size_t length, std::int32_t nbytes,
                 std::int32_t nbands, const std::array<std::int32_t, 3> &band_map,
                 const std::array<std::uint8_t *, 3> &planes)
{
    for (std::size_t position = 0; position < static_cast<std::size_t>(nbands); ++position) {
        std::uint8_t *const plane = planes[static_cast<std::size_t>(band_map[position])];
        if (plane != nullptr)
            split_position(tile, length, position, static_cast<std::size_t>(nbands), nbytes, plane);
    }
}

// Splits one whole interleaved tile: `band` to `plane`, the others to the cache, if there is one.
// A tile that the cache holds already may be newer than the file's and stays.
void split_tile_into_cache(const img_desc *desc, const std::uint8_t *pixels, std::int32_t tile,
                           std::int32_t band, std::uint8_t *plane)
{
    std::array<img_scratch, 3> others;
    std::array<std::uint8_t *, 3> planes{};
    for (std::int32_t each = 0; each < desc->nbands; ++each) {
        const auto at = static_cast<std::size_t>(each);
        if (each != band && desc->tile_cache != nullptr &&
            img_tile_cache_has(desc->tile_cache, tile, each) == 0)
            others[at] = new_zero_plane(desc);  // null: it is not cached
        planes[at] = each == band ? plane : others[at].get();
    }
    img_std_split_tile(pixels, desc->tile_nsamps, desc->tile_nlines, desc->nbytes, desc->nbands,
                       desc->band_map, planes);
    for (std::int32_t each = 0; each < desc->nbands; ++each)
        if (const auto &other = others[static_cast<std::size_t>(each)]; other)
            img_tile_cache_put(desc->tile_cache, tile, each, other.get(), 0);
}

std::int32_t read_interleaved(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                              std::int32_t band, std::uint8_t *buffer)
{
    if (desc->mem_image) return fail_beyond_virtual_eof();  // else it had been split where it lies
    const std::int32_t length = run_bytes(desc, ntiles);
    const img_scratch run = new_run(length);
    if (!run) {
        desc->std_file->read_error = ENOMEM;  // what the file holds stays unknown
        return -1;
    }
    const std::int32_t got =
        read_bytes(desc, img_std_tile_offset(desc, first_tile, band), run.get(), length);
    const std::uint8_t *pixels = run.get();
    const auto tile_size = static_cast<std::size_t>(desc->std_file->tile_size);
    auto left = static_cast<std::size_t>(std::clamp(got, 0, length));
    for (std::int32_t tile = first_tile; left >= tile_size; ++tile) {
        split_tile_into_cache(desc, pixels, tile, band, buffer);
        pixels += tile_size;
        left -= tile_size;
        buffer += img_plane_size(desc);
    }
    if (got == length) return 0;
    std::array<std::uint8_t *, 3> planes{};  // the tile in which the file ends
    planes[static_cast<std::size_t>(band)] = buffer;
    split_bytes(pixels, left, desc->nbytes, desc->nbands, desc->band_map, planes);
    return -1;
}

// Builds one interleaved tile of the caller's plane and of what the file holds of the others.
// Returns 0, or -1: memory is short, or the file holds more of them than could be read.
std::int32_t merge_with_other_bands(img_desc *desc, std::int32_t tile, std::int32_t band,
                                    const std::uint8_t *plane, std::uint8_t *pixels)
{
    std::array<img_scratch, 3> others;
    std::array<const std::uint8_t *, 3> planes{};
    const without_cache from_the_file(desc);
    const img_std_pre_read pre_read(desc);
    for (std::int32_t each = 0; each < desc->nbands; ++each) {
        if (each == band) continue;
        auto &other = others[static_cast<std::size_t>(each)];
        other = new_zero_plane(desc);  // 0 where the file holds nothing yet
        if (!other) return -1;
        img_std_read_tiles(desc, tile, 1, each, other.get());
        planes[static_cast<std::size_t>(each)] = other.get();
    }
    if (pre_read.result() == -1) return -1;
    planes[static_cast<std::size_t>(band)] = plane;
    img_std_merge_tile(desc->nbands, desc->band_map, planes, desc->tile_nsamps, desc->tile_nlines,
                       desc->nbytes, pixels);
    return 0;
}

std::int32_t write_interleaved(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                               std::int32_t band, const std::uint8_t *buffer)
{
    const std::int32_t length = run_bytes(desc, ntiles);
    const img_scratch run = new_run(length);
    if (!run) return -1;
    for (std::int32_t i = 0; i < ntiles; ++i) {
        const auto at = static_cast<std::size_t>(i);
        const auto tile_size = static_cast<std::size_t>(desc->std_file->tile_size);
        if (merge_with_other_bands(desc, first_tile + i, band, buffer + at * img_plane_size(desc),
                                   run.get() + at * tile_size) == -1)
            return -1;
    }
    return write_bytes(desc, img_std_tile_offset(desc, first_tile, band), run.get(), length, false);
}

// The region of an untiled image that one virtual tile shows.
struct virtual_tile {
    std::int32_t line, samp, nlines, nsamps;
};

virtual_tile virtual_tile_at(const img_desc *desc, std::int32_t tile)
{
    const std::int32_t line = desc->tile_nlines * (tile / desc->std_file->tiles_across);
    const std::int32_t samp = desc->tile_nsamps * (tile % desc->std_file->tiles_across);
    return {line, samp, std::min(desc->tile_nlines, desc->nlines - line),
            std::min(desc->tile_nsamps, desc->nsamps - samp)};
}

// Calls `move(part, first_byte)` for each tile of a run, until one answers other than 0.
template <typename Move>
std::int32_t move_virtual_tiles(const img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                Move move)
{
    for (std::int32_t i = 0; i < ntiles; ++i) {
        const std::int32_t result = move(virtual_tile_at(desc, first_tile + i),
                                         static_cast<std::size_t>(i) * img_plane_size(desc));
        if (result != 0) return result;
    }
    return 0;
}

}  // namespace

img_std_pre_read::img_std_pre_read(img_desc *desc)
    : m_file(desc->std_file), m_outer_report_errors(std::exchange(img_std_report_errors, 0)),
      m_outer_read_error(std::exchange(m_file->read_error, 0))
{
    ++m_file->pre_reads;
}

img_std_pre_read::~img_std_pre_read()
{
    img_std_report_errors = m_outer_report_errors;
    m_file->read_error = m_outer_read_error;
    --m_file->pre_reads;
}

std::int32_t img_std_pre_read::result() const
{
    if (m_file->read_error == 0) return 0;
    errno = m_file->read_error;
    return img_fail_errno("img_std_read_tiles:read");
}

img_std_plane img_std_plane_in_tile(const img_desc *desc, std::int32_t band)
{
    const auto width = static_cast<std::size_t>(desc->nbytes);
    if (!is_interleaved(desc)) return {0, width};
    const auto position = std::ranges::find(desc->band_map, band) - desc->band_map.begin();
    return {static_cast<std::size_t>(position) * width,
            static_cast<std::size_t>(desc->nbands) * width};
}

bool img_std_read_lent_tiles(const img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                             std::int32_t band, std::size_t first_sample, std::size_t nsamps,
                             std::uint8_t *buffer)
{
    const std::int64_t begin = img_std_tile_offset(desc, first_tile, band);
    const std::int64_t next = img_std_tile_offset(desc, std::int64_t{first_tile} + 1, band);
    const std::int64_t end = begin + (next - begin) * (ntiles - 1) + desc->std_file->tile_size;
    const img_std_plane plane = img_std_plane_in_tile(desc, band);
    return img_std_lend(desc, begin, end - begin, [&](const std::uint8_t *bytes) {
        img_std_copy_rows({bytes + plane.first + first_sample * plane.step,
                           static_cast<std::size_t>(next - begin), plane.step},
                          buffer + first_sample * static_cast<std::size_t>(desc->nbytes),
                          img_plane_size(desc), static_cast<std::size_t>(ntiles), nsamps,
                          desc->nbytes, false);
    });
}

std::int32_t img_std_read_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                std::int32_t band, std::uint8_t *buffer)
{
    if (ntiles < 1 || desc->std_file->tile_size == 0) return 0;
    if (desc->virtual_tiled != 0)
        return img_std_read_virtual_tiles(desc, first_tile, ntiles, band, buffer);
    // A read of one band of interleaved tiles leaves the others in the cache.
    const bool for_cache = is_interleaved(desc) && desc->tile_cache != nullptr;
    if (!for_cache &&
        img_std_read_lent_tiles(desc, first_tile, ntiles, band, 0, img_plane_samples(desc), buffer))
        return 0;
    if (is_interleaved(desc)) return read_interleaved(desc, first_tile, ntiles, band, buffer);

    const std::int32_t pieces = has_planes_between(desc) ? ntiles : 1;
    const std::int32_t length = run_bytes(desc, ntiles / pieces);
    for (std::int32_t i = 0; i < pieces; ++i) {
        if (read_bytes(desc, img_std_tile_offset(desc, first_tile + i, band), buffer, length) !=
            length)
            return -1;
        buffer += length;
    }
    return 0;
}

std::int32_t img_std_write_tiles(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                                 std::int32_t band, const std::uint8_t *buffer)
{
    if (ntiles < 1 || desc->std_file->tile_size == 0) return 0;
    if (desc->virtual_tiled != 0)
        return img_std_write_virtual_tiles(desc, first_tile, ntiles, band, buffer);
    if (is_interleaved(desc)) return write_interleaved(desc, first_tile, ntiles, band, buffer);

    const bool tile_by_tile = has_planes_between(desc);
    const std::int32_t pieces = tile_by_tile ? ntiles : 1;
    const std::int32_t length = run_bytes(desc, ntiles / pieces);
    for (std::int32_t i = 0; i < pieces; ++i) {
        if (write_bytes(desc, img_std_tile_offset(desc, first_tile + i, band), buffer, length,
                        tile_by_tile) == -1)
            return -1;
        buffer += length;
    }
    return 0;
}

std::int32_t img_std_read_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                        std::int32_t ntiles, std::int32_t band,
                                        std::uint8_t *buffer)
{
    return move_virtual_tiles(
        desc, first_tile, ntiles, [=](const virtual_tile &part, std::size_t at) {
            return img_std_read_lines(desc, part.line, part.samp, part.nlines, part.nsamps, band,
                                      buffer + at, desc->tile_nsamps, false);
        });
}

std::int32_t img_std_write_virtual_tiles(img_desc *desc, std::int32_t first_tile,
                                         std::int32_t ntiles, std::int32_t band,
                                         const std::uint8_t *buffer)
{
    return move_virtual_tiles(
        desc, first_tile, ntiles, [=](const virtual_tile &part, std::size_t at) {
            return img_std_write_lines(desc, part.line, part.samp, part.nlines, part.nsamps, band,
                                       buffer + at, desc->tile_nsamps, false);
        });
}

void img_std_split_tile(const std::uint8_t *tile, std::int32_t tile_nsamps,
                        std::int32_t tile_nlines, std::int32_t nbytes, std::int32_t nbands,
                        const std::array<std::int32_t, 3> &band_map,
                        const std::array<std::uint8_t *, 3> &planes)
{
    const std::size_t pixels =
        static_cast<std::size_t>(tile_nsamps) * static_cast<std::size_t>(tile_nlines);
    split_bytes(tile, pixels * static_cast<std::size_t>(nbands * nbytes), nbytes, nbands, band_map,
                planes);
}

void img_std_merge_tile(std::int32_t nbands, const std::array<std::int32_t, 3> &band_map,
                        const std::array<const std::uint8_t *, 3> &planes, std::int32_t tile_nsamps,
                        std::int32_t tile_nlines, std::int32_t nbytes, std::uint8_t *tile)
{
    const auto width = static_cast<std::size_t>(nbytes);
    const auto bands = static_cast<std::size_t>(nbands);
    const std::size_t pixels =
        static_cast<std::size_t>(tile_nsamps) * static_cast<std::size_t>(tile_nlines);
    for (std::size_t position = 0; position < bands; ++position)
        if (const auto *plane = planes[static_cast<std::size_t>(band_map[position])]; plane)
            img_std_copy_samples(plane, width, tile + position * width, bands * width, pixels,
                                 nbytes, false);
}
