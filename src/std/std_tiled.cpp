// Regions of tiled images: one run of whole tiles per row of tiles.
#include "access/tiles.h"
#include "base/fill.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/scratch.h"
#include "std/std.h"

#include <algorithm>
#include <cerrno>

namespace {

// Bytes that take as long to move as the calls that spare moving them.
constexpr std::size_t WORTH_A_CALL = 8192;

// How a stretch of lines, or of samples, falls into tiles.
class tile_span {
public:
    struct part {
        std::int32_t first;  // first line or sample in the tile
        std::int32_t count;
        std::int32_t place;  // where it lies in the stretch
    };

    tile_span(std::int32_t begin, std::int32_t extent, std::int32_t tile_extent)
        : m_begin(begin), m_last(begin + extent - 1), m_tile_extent(tile_extent)
    {
    }
    std::int32_t first_tile() const { return m_begin / m_tile_extent; }
    std::int32_t ntiles() const { return m_last / m_tile_extent - first_tile() + 1; }
    // What the stretch covers of its `index`th tile.
    part in_tile(std::int32_t index) const
    {
        const std::int32_t first = index == 0 ? m_begin % m_tile_extent : 0;
        const std::int32_t last =
            index == ntiles() - 1 ? m_last % m_tile_extent : m_tile_extent - 1;
        const std::int32_t place = index * m_tile_extent - m_begin % m_tile_extent;
        return {first, last - first + 1, std::max(place, 0)};
    }

private:
    std::int32_t m_begin, m_last, m_tile_extent;
};

// The part of a region that lies in one tile.
struct tile_part {
    std::int32_t index;  // of the tile in the run of its row of tiles
    std::size_t nlines, nsamps;
    std::size_t first_sample;  // in the tile
    std::size_t run_byte;      // where it begins in a run of planes
    std::size_t buffer_byte;   // where it begins in the caller's buffer
};

// A region of a tiled image, which covers a run of tiles in each row of tiles.
class tiled_region {
public:
    tiled_region(const img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
                 std::int32_t nsamps, std::int32_t stride)
        : m_desc(desc), m_lines(line, nlines, desc->tile_nlines),
          m_samps(samp, nsamps, desc->tile_nsamps), m_stride(stride)
    {
    }
    std::size_t run_length() const
    {
        return static_cast<std::size_t>(ntiles()) * img_plane_size(m_desc);
    }
    std::int32_t tile_rows() const { return m_lines.ntiles(); }
    std::int32_t ntiles() const { return m_samps.ntiles(); }
    std::int32_t first_tile(std::int32_t tile_row) const
    {
        return (m_lines.first_tile() + tile_row) * m_desc->std_file->tiles_across +
               m_samps.first_tile();
    }
    // True when the region has all samples of a run.
    bool covers_run(std::int32_t tile_row) const
    {
        return m_lines.in_tile(tile_row).count == m_desc->tile_nlines &&
               m_samps.in_tile(0).count == m_desc->tile_nsamps &&
               m_samps.in_tile(ntiles() - 1).count == m_desc->tile_nsamps;
    }

    // Calls `visit(tile_part)` for each tile of a run.
    template <typename Visit>
    void for_each_tile(std::int32_t tile_row, Visit visit) const
    {
        const tile_span::part lines = m_lines.in_tile(tile_row);
        for (std::int32_t tile = 0; tile < ntiles(); ++tile) {
            const tile_span::part samps = m_samps.in_tile(tile);
            const std::size_t first_sample =
                extent(lines.first) * extent(m_desc->tile_nsamps) + extent(samps.first);
            visit(tile_part{
                .index = tile,
                .nlines = extent(lines.count),
                .nsamps = extent(samps.count),
                .first_sample = first_sample,
                .run_byte =
                    extent(tile) * img_plane_size(m_desc) + first_sample * extent(m_desc->nbytes),
                .buffer_byte = extent(lines.place) * buffer_pitch() +
                               extent(samps.place) * extent(m_desc->nbytes),
            });
        }
    }
    // The lines of its tiles that the region touches.
    tile_span::part lines_in_tile(std::int32_t tile_row) const { return m_lines.in_tile(tile_row); }
    // Bytes from one row of the caller's buffer to the next, and from one line of a plane.
    std::size_t buffer_pitch() const { return extent(m_stride) * extent(m_desc->nbytes); }
    std::size_t plane_pitch() const { return extent(m_desc->tile_nsamps) * extent(m_desc->nbytes); }

private:
    static std::size_t extent(std::int32_t count) { return static_cast<std::size_t>(count); }

    const img_desc *m_desc;
    tile_span m_lines, m_samps;
    std::int32_t m_stride;
};

// True when nothing stands between the region and the stored tiles: no cache, as there is for all
// virtual tiles, and nobody who counts the calls.
bool reaches_stored_tiles(const img_desc *desc)
{
    return !desc->mem_image && desc->tile_cache == nullptr && desc->cache_mb == 0 &&
           img_std_joins_calls(desc);
}

// Copies the region out of the tiles where they lie. Returns false when they are not lent.
bool read_lent_region(const img_desc *desc, const tiled_region &region, std::int32_t band,
                      std::uint8_t *buffer)
{
    const std::int32_t last_row = region.tile_rows() - 1;
    const std::int32_t last_tile = region.first_tile(last_row) + region.ntiles() - 1;
    const std::int64_t begin = img_std_tile_offset(desc, region.first_tile(0), band);
    const std::int64_t end = img_std_tile_offset(desc, last_tile, band) + desc->std_file->tile_size;
    const img_std_plane plane = img_std_plane_in_tile(desc, band);
    const std::size_t line_length = plane.step * static_cast<std::size_t>(desc->tile_nsamps);
    const bool exchange = img_std_exchanges_bytes(desc);
    return img_std_lend(desc, begin, end - begin, [&](const std::uint8_t *bytes) {
        for (std::int32_t row = 0; row <= last_row; ++row)
            region.for_each_tile(row, [&](const tile_part &part) {
                const std::int64_t tile =
                    img_std_tile_offset(desc, region.first_tile(row) + part.index, band) - begin;
                img_std_copy_rows({bytes + tile + plane.first + part.first_sample * plane.step,
                                   line_length, plane.step},
                                  buffer + part.buffer_byte, region.buffer_pitch(), part.nlines,
                                  part.nsamps, desc->nbytes, exchange);
            });
    });
}

// Lays the part of the region that lies in a row of tiles over what is in `run`.
void lay_over(const img_desc *desc, const tiled_region &region, std::int32_t row,
              const std::uint8_t *buffer, std::uint8_t *run)
{
    region.for_each_tile(row, [&](const tile_part &part) {
        img_std_copy_rows({buffer + part.buffer_byte, region.buffer_pitch(),
                           static_cast<std::size_t>(desc->nbytes)},
                          run + part.run_byte, region.plane_pitch(), part.nlines, part.nsamps,
                          desc->nbytes, img_std_exchanges_bytes(desc));
    });
}

// True when it pays to write the region's lines alone, in one call per tile: most of the planes is
// not touched, and that is more bytes than a call is worth.
bool touches_few_lines(const img_desc *desc, const tiled_region &region, std::int32_t row,
                       std::int32_t band)
{
    const bool lines_lie_together =
        img_std_plane_in_tile(desc, band).step == static_cast<std::size_t>(desc->nbytes);
    const auto touched = static_cast<std::size_t>(region.lines_in_tile(row).count);
    return lines_lie_together &&
           img_plane_size(desc) - touched * region.plane_pitch() >= WORTH_A_CALL;
}

// Writes those lines of a run that the region touches, without the rest of its tiles. Returns
// false when the file does not hold the run yet, or not all could be written: then the run is to be
// stored whole.
bool write_touched_lines(img_desc *desc, const tiled_region &region, std::int32_t row,
                         std::int32_t band, const std::uint8_t *buffer, std::uint8_t *run)
{
    const std::int32_t first_tile = region.first_tile(row);
    const auto width = static_cast<std::size_t>(desc->nbytes);
    const tile_span::part lines = region.lines_in_tile(row);
    const std::size_t skipped = static_cast<std::size_t>(lines.first) * region.plane_pitch();
    const std::size_t length = static_cast<std::size_t>(lines.count) * region.plane_pitch();
    if (!img_std_read_lent_tiles(desc, first_tile, region.ntiles(), band, skipped / width,
                                 length / width, run))
        return false;
    lay_over(desc, region, row, buffer, run);
    for (std::int32_t i = 0; i < region.ntiles(); ++i) {
        const std::int64_t offset =
            img_std_tile_offset(desc, first_tile + i, band) + static_cast<std::int64_t>(skipped);
        if (img_std_write_at(desc, offset, run + skipped, static_cast<std::int32_t>(length)) !=
            static_cast<std::int32_t>(length))
            return false;
        run += img_plane_size(desc);
    }
    return true;
}

// Lays what the image holds of a run over what is in `run`. Returns 0, or -1 after a message
// when the image holds more of it than could be read.
std::int32_t read_stored_run(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                             std::int32_t band, std::uint8_t *run)
{
    const img_std_pre_read pre_read(desc);
    if (img_access_mode(desc) == IMG_OPEN_WRITE_ONLY) {
        desc->std_file->read_error = EBADF;  // there is no way to know what it holds
    } else if (desc->mem_image) {
        img_std_read_tiles(desc, first_tile, ntiles, band, run);
    } else if (desc->cache_mb != 0) {  // as it is for all virtual tiles
        // Behind a tile that cannot be read may lie one that waits in the cache, or lines that
        // the file does hold: each tile is asked for by itself.
        for (std::int32_t i = 0; i < ntiles; ++i)
            img_load_tile_run(desc, first_tile + i, 1, band,
                              run + static_cast<std::size_t>(i) * img_plane_size(desc));
    } else {
        img_load_tile_run(desc, first_tile, ntiles, band, run);
    }
    return pre_read.result();
}

// Puts into `run` what is to survive of it under the region, and the fill where the image holds
// nothing yet. Returns 0, or -1 after a message.
std::int32_t fetch_run(img_desc *desc, const tiled_region &region, std::int32_t row,
                       std::int32_t band, const std::uint8_t *fill, bool direct, std::uint8_t *run)
{
    const std::int32_t first_tile = region.first_tile(row);
    const std::int32_t ntiles = region.ntiles();
    const std::size_t samples = img_plane_samples(desc);
    if (direct && region.covers_run(row)) return 0;
    if (direct && region.run_length() >= WORTH_A_CALL &&
        img_std_read_lent_tiles(desc, first_tile, ntiles, band, 0, samples, run))
        return 0;
    img_fill_samples(run, samples * static_cast<std::size_t>(ntiles), desc->nbytes,
                     fill != nullptr ? fill : img_zero_sample.data());
    return read_stored_run(desc, first_tile, ntiles, band, run);
}

}  // namespace

std::int32_t img_read_tiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                            std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                            std::uint8_t *buffer, std::int32_t stride)
{
    const tiled_region region(desc, line, samp, nlines, nsamps, stride);
    if (reaches_stored_tiles(desc) && read_lent_region(desc, region, band, buffer)) return 0;

    const img_scratch run = img_take_scratch(region.run_length());
    if (!run) return img_fail_errno("img_read_tiled:malloc");
    // Virtual tiles at the edges have no samples for all of their plane, but are cached whole.
    if (desc->virtual_tiled != 0) std::fill_n(run.get(), region.run_length(), std::uint8_t{0});
    const auto width = static_cast<std::size_t>(desc->nbytes);
    for (std::int32_t row = 0; row < region.tile_rows(); ++row) {
        if (img_load_tile_run(desc, region.first_tile(row), region.ntiles(), band, run.get()) == -1)
            return -1;
        region.for_each_tile(row, [&](const tile_part &part) {
            img_std_copy_rows({run.get() + part.run_byte, region.plane_pitch(), width},
                              buffer + part.buffer_byte, region.buffer_pitch(), part.nlines,
                              part.nsamps, desc->nbytes, img_std_exchanges_bytes(desc));
        });
    }
    return 0;
}

std::int32_t img_std_write_tiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                                 std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                                 const std::uint8_t *buffer, std::int32_t stride,
                                 const std::uint8_t *fill)
{
    const tiled_region region(desc, line, samp, nlines, nsamps, stride);
    const img_scratch run = img_take_scratch(region.run_length());
    if (!run) return img_fail_errno("img_std_write_tiled:malloc");
    // Who may not read a tile may not replace it either, even a whole one.
    const bool direct = reaches_stored_tiles(desc) && img_access_mode(desc) == IMG_OPEN_READ_WRITE;
    for (std::int32_t row = 0; row < region.tile_rows(); ++row) {
        if (direct && touches_few_lines(desc, region, row, band) &&
            write_touched_lines(desc, region, row, band, buffer, run.get()))
            continue;
        if (fetch_run(desc, region, row, band, fill, direct, run.get()) == -1) return -1;
        lay_over(desc, region, row, buffer, run.get());
        if (img_dump_tile_run(desc, region.first_tile(row), region.ntiles(), band, run.get()) == -1)
            return -1;
    }
    return 0;
}
