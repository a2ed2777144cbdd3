// Regions of tiled images: one run of whole tiles per row of tiles.
#include "api/img.h"
#include "api/img_desc.h"
#include "api/report.h"
#include "std/std.h"

#include <algorithm>
#include <cerrno>
#include <new>

namespace {

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

// A region of a tiled image together with the run buffer, which holds the region's part of one
// row of tiles at a time.
class tiled_region {
public:
    tiled_region(img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
                 std::int32_t nsamps, std::int32_t stride)
        : m_desc(desc), m_lines(line, nlines, desc->tile_nlines),
          m_samps(samp, nsamps, desc->tile_nsamps), m_stride(stride),
          m_run(new (std::nothrow) std::uint8_t[run_length()])
    {
    }
    std::uint8_t *run() const { return m_run.get(); }  // null: memory is short
    std::size_t run_length() const
    {
        return static_cast<std::size_t>(ntiles()) * img_std_plane_size(m_desc);
    }
    std::int32_t tile_rows() const { return m_lines.ntiles(); }
    std::int32_t ntiles() const { return m_samps.ntiles(); }
    std::int32_t first_tile(std::int32_t tile_row) const
    {
        return (m_lines.first_tile() + tile_row) * m_desc->std_file->tiles_across +
               m_samps.first_tile();
    }

    // Calls `copy(run_byte, buffer_byte, count)` for every tile line of the region in a row of
    // tiles: `count` samples that lie at these bytes of the run and of the caller's buffer.
    template <typename Copy>
    void for_each_tile_line(std::int32_t tile_row, Copy copy) const
    {
        const tile_span::part lines = m_lines.in_tile(tile_row);
        for (std::int32_t tile = 0; tile < ntiles(); ++tile) {
            const tile_span::part samps = m_samps.in_tile(tile);
            for (std::int32_t i = 0; i < lines.count; ++i)
                copy(run_byte(tile, lines.first + i, samps.first),
                     buffer_byte(lines.place + i, samps.place),
                     static_cast<std::size_t>(samps.count));
        }
    }

private:
    std::size_t nbytes() const { return static_cast<std::size_t>(m_desc->nbytes); }
    std::size_t run_byte(std::int32_t tile, std::int32_t line, std::int32_t samp) const
    {
        const std::int32_t sample = line * m_desc->tile_nsamps + samp;
        return static_cast<std::size_t>(tile) * img_std_plane_size(m_desc) +
               static_cast<std::size_t>(sample) * nbytes();
    }
    std::size_t buffer_byte(std::int32_t row, std::int32_t samp) const
    {
        return (static_cast<std::size_t>(row) * static_cast<std::size_t>(m_stride) +
                static_cast<std::size_t>(samp)) *
               nbytes();
    }

    img_desc *m_desc;
    tile_span m_lines, m_samps;
    std::int32_t m_stride;
    std::unique_ptr<std::uint8_t[]> m_run;
};

void copy_tile_line(const img_desc *desc, const std::uint8_t *from, std::uint8_t *to,
                    std::size_t count)
{
    const auto step = static_cast<std::size_t>(desc->nbytes);
    img_std_copy_samples(from, step, to, step, count, desc->nbytes, img_std_exchanges_bytes(desc));
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
            img_load_tiles(desc->handle, first_tile + i, 1, band,
                           run + static_cast<std::size_t>(i) * img_std_plane_size(desc));
    } else {
        img_load_tiles(desc->handle, first_tile, ntiles, band, run);
    }
    return pre_read.result();
}

}  // namespace

std::int32_t img_read_tiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                            std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                            std::uint8_t *buffer, std::int32_t stride)
{
    const tiled_region region(desc, line, samp, nlines, nsamps, stride);
    if (region.run() == nullptr) return img_fail_errno("img_read_tiled:malloc");
    // Virtual tiles at the edges have no samples for all of their plane, but are cached whole.
    if (desc->virtual_tiled != 0) std::fill_n(region.run(), region.run_length(), std::uint8_t{0});
    for (std::int32_t row = 0; row < region.tile_rows(); ++row) {
        if (img_load_tiles(desc->handle, region.first_tile(row), region.ntiles(), band,
                           region.run()) == -1)
            return -1;
        region.for_each_tile_line(
            row, [&](std::size_t run_byte, std::size_t buffer_byte, std::size_t count) {
                copy_tile_line(desc, region.run() + run_byte, buffer + buffer_byte, count);
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
    if (region.run() == nullptr) return img_fail_errno("img_std_write_tiled:malloc");
    const std::size_t run_samples = region.run_length() / static_cast<std::size_t>(desc->nbytes);
    for (std::int32_t row = 0; row < region.tile_rows(); ++row) {
        const std::int32_t first_tile = region.first_tile(row);
        img_fill_samples(region.run(), run_samples, desc->nbytes,
                         fill != nullptr ? fill : img_zero_sample.data());
        if (read_stored_run(desc, first_tile, region.ntiles(), band, region.run()) == -1) return -1;
        region.for_each_tile_line(
            row, [&](std::size_t run_byte, std::size_t buffer_byte, std::size_t count) {
                copy_tile_line(desc, buffer + buffer_byte, region.run() + run_byte, count);
            });
        if (img_dump_tiles(desc->handle, first_tile, region.ntiles(), band, region.run()) == -1)
            return -1;
    }
    return 0;
}
