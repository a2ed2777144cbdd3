// Regions of tiled images. Bytes are asked for on loan once: a read asks for the whole region, a
// write row by row until a loan is refused. After a refusal the tiles are transferred whole,
// through access/tiles.h and with it through the image's cache. Read std_tiled.h, then std_tiles.h.
#include "std/std_tiled.h"

#include "access/tiles.h"
#include "base/count.h"
#include "base/fill.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/scratch.h"
#include "base/types.h"
#include "std/std.h"
#include "std/std_bytes.h"
#include "std/std_offset.h"
#include "std/std_samples.h"
#include "std/std_tiles.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace {

// Break-even: moving this many bytes takes as long as the extra calls that avoid moving them.
constexpr std::size_t BREAK_EVEN_BYTES = 8192;

// How a run of lines, or of samples, falls into tiles.
class tile_span {
public:
    struct part {
        std::int32_t first;  // first line or sample in the tile
        std::int32_t count;
        std::int32_t start;  // index of the first one in the span
    };

    tile_span(std::int32_t begin, std::int32_t extent, std::int32_t tile_extent)
        : m_begin(begin), m_last(begin + extent - 1), m_tile_extent(tile_extent)
    {
    }
    std::int32_t extent() const { return m_last - m_begin + 1; }
    std::int32_t first_tile() const { return m_begin / m_tile_extent; }
    std::int32_t ntiles() const { return m_last / m_tile_extent - first_tile() + 1; }
    // Returns the part of the span that lies in its `index`th tile.
    part in_tile(std::int32_t index) const
    {
        const std::int32_t first = index == 0 ? m_begin % m_tile_extent : 0;
        const std::int32_t last =
            index == ntiles() - 1 ? m_last % m_tile_extent : m_tile_extent - 1;
        const std::int32_t start = index * m_tile_extent - m_begin % m_tile_extent;
        return {first, last - first + 1, std::max(start, 0)};
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
    std::size_t line, samp;    // where it begins in the region
};

// A region of a tiled image: a run of tiles in each row of tiles.
class tiled_region {
public:
    tiled_region(const img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
                 std::int32_t nsamps, std::int32_t stride)
        : m_desc(desc), m_lines(line, nlines, desc->tile_nlines),
          m_samps(samp, nsamps, desc->tile_nsamps), m_stride(stride)
    {
    }
    std::size_t run_length() const { return img_count(ntiles()) * img_plane_size(m_desc); }
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
                img_count(lines.first) * img_count(m_desc->tile_nsamps) + img_count(samps.first);
            visit(tile_part{
                .index = tile,
                .nlines = img_count(lines.count),
                .nsamps = img_count(samps.count),
                .first_sample = first_sample,
                .run_byte = img_count(tile) * img_plane_size(m_desc) + first_sample * width(),
                .line = img_count(lines.start),
                .samp = img_count(samps.start),
            });
        }
    }
    // Where a part begins in the caller's buffer.
    std::size_t buffer_byte(const tile_part &part) const
    {
        return part.line * buffer_pitch() + part.samp * width();
    }
    img_std_target target(std::uint8_t *buffer) const
    {
        return {.rows = buffer,
                .nrows = img_count(m_lines.extent()),
                .row_length = img_count(m_samps.extent()) * width(),
                .pitch = buffer_pitch()};
    }
    // The lines of its tiles that the region touches.
    tile_span::part lines_in_tile(std::int32_t tile_row) const { return m_lines.in_tile(tile_row); }
    // Bytes of a sample; from one row of the caller's buffer to the next; from one line of a plane
    // to the next.
    std::size_t width() const { return img_count(m_desc->nbytes); }
    std::size_t buffer_pitch() const { return img_count(m_stride) * width(); }
    std::size_t plane_pitch() const { return img_count(m_desc->tile_nsamps) * width(); }

private:
    const img_desc *m_desc;
    tile_span m_lines, m_samps;
    std::int32_t m_stride;
};

// True when regions may be moved past `read_tiles`: the type has the driver's own operation, no
// cache holds newer tiles (virtual tiles exist only with one), and the access method may be asked
// for any pieces.
bool reads_stored_tiles(const img_desc *desc)
{
    return !desc->mem_image && desc->tile_cache == nullptr && desc->cache_mb == 0 &&
           img_std_may_merge(desc) && img_type_of(desc).read_tiles == img_std_read_tiles;
}

// Copies the region from where its tiles lie. Returns false when they are refused on loan.
bool read_lent_region(const img_desc *desc, const tiled_region &region, std::int32_t band,
                      std::uint8_t *buffer)
{
    const std::int32_t last_row = region.tile_rows() - 1;
    const std::int32_t last_tile = region.first_tile(last_row) + region.ntiles() - 1;
    const std::int64_t begin = img_std_tile_offset(desc, region.first_tile(0), band);
    const std::int64_t end = img_std_tile_offset(desc, last_tile, band) + desc->std_file->tile_size;
    const img_std_plane plane = img_std_plane_in_tile(desc, band);
    const std::size_t line_length = plane.step * img_count(desc->tile_nsamps);
    const bool exchange = img_std_exchanges_bytes(desc);
    const auto copy = [&](const std::uint8_t *bytes, std::uint8_t *rows, std::size_t pitch) {
        for (std::int32_t row = 0; row <= last_row; ++row)
            region.for_each_tile(row, [&](const tile_part &part) {
                const std::int64_t tile =
                    img_std_tile_offset(desc, region.first_tile(row) + part.index, band) - begin;
                img_std_copy_rows({bytes + tile + plane.first + part.first_sample * plane.step,
                                   line_length, plane.step},
                                  rows + part.line * pitch + part.samp * region.width(), pitch,
                                  part.nlines, part.nsamps, desc->nbytes, exchange);
            });
    };
    return img_std_lend_rows(desc, begin, end - begin, region.target(buffer), copy);
}

// Loads a run without asking for it on loan.
std::int32_t load_refused_run(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                              std::int32_t band, std::uint8_t *run)
{
    const img_tile_reader_fn reader = [](void * /*arg*/, img_desc *image, std::int32_t first,
                                         std::int32_t count, std::int32_t image_band,
                                         std::uint8_t *planes) {
        return img_std_read_refused_tiles(image, first, count, image_band, planes);
    };
    return img_load_tile_run_by(desc, first_tile, ntiles, band, run, reader, nullptr);
}

// --- Writing ---

// One row of tiles of a write.
struct row_write {
    img_desc *desc;
    const tiled_region &region;
    std::int32_t row, band;
    const std::uint8_t *buffer;  // the caller's, from the region's first sample on
    const std::uint8_t *fill;    // null: 0
    std::uint8_t *run;           // room for the row's run of planes

    std::int32_t first_tile() const { return region.first_tile(row); }
    std::int32_t ntiles() const { return region.ntiles(); }
};

// How a row of tiles keeps the samples that the region does not cover.
enum class keeping {
    nothing,      // the region covers the whole run, which is stored as it is
    other_lines,  // only the lines that the region touches are read, on loan, and stored
    lent_run,     // the whole run is read on loan, overlaid and stored
    read_run      // the whole run is filled, pre-read, overlaid and stored
};

// `direct`: the run may be moved past `read_tiles` and `write_tiles`. `lends`: no loan was refused.
keeping choose_keeping(const row_write &write, bool direct, bool lends)
{
    const img_desc *const desc = write.desc;
    if (!direct) return keeping::read_run;
    if (write.region.covers_run(write.row)) return keeping::nothing;
    if (!lends) return keeping::read_run;
    const bool lines_lie_together =
        img_std_plane_in_tile(desc, write.band).step == write.region.width();
    const std::size_t touched = img_count(write.region.lines_in_tile(write.row).count);
    const std::size_t untouched = img_plane_size(desc) - touched * write.region.plane_pitch();
    if (lines_lie_together && untouched >= BREAK_EVEN_BYTES) return keeping::other_lines;
    return write.region.run_length() >= BREAK_EVEN_BYTES ? keeping::lent_run : keeping::read_run;
}

// Lays the part of the region that lies in the row of tiles over the planes in `run`.
void overlay(const row_write &write)
{
    const tiled_region &region = write.region;
    region.for_each_tile(write.row, [&](const tile_part &part) {
        img_std_copy_rows(
            {write.buffer + region.buffer_byte(part), region.buffer_pitch(), region.width()},
            write.run + part.run_byte, region.plane_pitch(), part.nlines, part.nsamps,
            write.desc->nbytes, img_std_exchanges_bytes(write.desc));
    });
}

enum class stored { yes, refused, failed };  // refused: the lines were not lent

// Stores those lines of a run that the region touches, in one call per tile.
stored store_touched_lines(const row_write &write)
{
    const tiled_region &region = write.region;
    const tile_span::part lines = region.lines_in_tile(write.row);
    const std::size_t skipped = img_count(lines.first) * region.plane_pitch();
    const std::size_t length = img_count(lines.count) * region.plane_pitch();
    if (!img_std_read_lent_tiles(write.desc, write.first_tile(), write.ntiles(), write.band,
                                 skipped / region.width(), length / region.width(), write.run))
        return stored::refused;
    overlay(write);
    const auto count = static_cast<std::int32_t>(length);
    const std::uint8_t *plane = write.run;
    for (std::int32_t i = 0; i < write.ntiles(); ++i) {
        const std::int64_t offset =
            img_std_tile_offset(write.desc, write.first_tile() + i, write.band) +
            static_cast<std::int64_t>(skipped);
        if (img_std_write_at(write.desc, offset, plane + skipped, count) != count)
            return stored::failed;
        plane += img_plane_size(write.desc);
    }
    return stored::yes;
}

// True unless the file is known to end before the end of the tile.
bool may_hold_tile(const img_desc *desc, std::int32_t tile, std::int32_t band)
{
    const std::int64_t end = img_std_tile_offset(desc, tile, band) + desc->std_file->tile_size;
    const std::int32_t length = img_std_length(desc);
    return length == -1 || length >= end;
}

// Calls the type's own read_tiles, which may be null, without its messages.
std::int32_t read_quietly(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                          std::int32_t band, std::uint8_t *buffer)
{
    const img_read_tiles_fn read_tiles = img_type_of(desc).read_tiles;
    if (read_tiles == nullptr) return -1;
    const std::int32_t reports = std::exchange(img_std_report_errors, 0);
    const std::int32_t result = read_tiles(desc, first_tile, ntiles, band, buffer);
    img_std_report_errors = reports;
    return result;
}

// A pre-read through a type's own read_tiles. Such an operation does not say why it failed. After a
// failure each tile is asked for alone: one that the file holds whole must be read. Whether the
// tile in which the file ends was read as far as it goes remains unknown.
std::int32_t pre_read_by_type(img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                              std::int32_t band, std::uint8_t *buffer, int *missed)
{
    if (read_quietly(desc, first_tile, ntiles, band, buffer) == 0) return 0;
    for (std::int32_t tile = first_tile; tile < first_tile + ntiles; ++tile) {
        if (may_hold_tile(desc, tile, band) && read_quietly(desc, tile, 1, band, buffer) != 0)
            *missed = EIO;
        buffer += img_plane_size(desc);
    }
    return -1;
}

// Reads tiles that are stored again; `arg` is the `missed` of img_std_pre_read_tiles.
std::int32_t pre_read(void *arg, img_desc *desc, std::int32_t first_tile, std::int32_t ntiles,
                      std::int32_t band, std::uint8_t *buffer)
{
    auto *const missed = static_cast<int *>(arg);
    return img_type_of(desc).read_tiles == img_std_read_tiles
               ? img_std_pre_read_tiles(desc, first_tile, ntiles, band, buffer, missed)
               : pre_read_by_type(desc, first_tile, ntiles, band, buffer, missed);
}

// Reads the tiles of a run that the image holds; the others keep what is in `run`. Returns 0, or
// -1 after a message when the image holds bytes that could not be read.
std::int32_t read_stored_run(const row_write &write)
{
    img_desc *const desc = write.desc;
    int missed = 0;
    if (img_access_mode(desc) == IMG_OPEN_WRITE_ONLY) {
        missed = EBADF;
    } else if (desc->mem_image) {
        img_std_pre_read_tiles(desc, write.first_tile(), write.ntiles(), write.band, write.run,
                               &missed);
    } else {
        // With a cache, tiles are loaded one by one: after a tile that cannot be read, the next one
        // may be in the cache, or be a virtual tile of which the file holds some lines.
        const std::int32_t step = desc->cache_mb != 0 ? 1 : write.ntiles();
        for (std::int32_t i = 0; i < write.ntiles(); i += step)
            img_load_tile_run_by(desc, write.first_tile() + i, step, write.band,
                                 write.run + img_count(i) * img_plane_size(desc), pre_read,
                                 &missed);
    }
    return missed == 0 ? 0 : img_std_fail_pre_read(missed);
}

// Puts into `run` the samples that the row keeps. Returns 0, or -1 after a message. A loan that is
// refused clears `*lends`.
std::int32_t fetch_run(const row_write &write, keeping way, bool *lends)
{
    const std::size_t samples = img_plane_samples(write.desc);
    if (way == keeping::nothing) return 0;
    if (way == keeping::lent_run) {
        if (img_std_read_lent_tiles(write.desc, write.first_tile(), write.ntiles(), write.band, 0,
                                    samples, write.run))
            return 0;
        *lends = false;
    }
    img_fill_samples(write.run, samples * img_count(write.ntiles()), write.desc->nbytes,
                     write.fill != nullptr ? write.fill : img_zero_sample.data());
    return read_stored_run(write);
}

std::int32_t write_row(const row_write &write, bool direct, bool *lends)
{
    keeping way = choose_keeping(write, direct, *lends);
    if (way == keeping::other_lines) {
        const stored result = store_touched_lines(write);
        if (result == stored::yes) return 0;
        // A failure is reported by the transfer of the whole run.
        if (result == stored::refused) *lends = false;
        way = keeping::read_run;
    }
    if (fetch_run(write, way, lends) == -1) return -1;
    overlay(write);
    return img_dump_tile_run(write.desc, write.first_tile(), write.ntiles(), write.band,
                             write.run) == -1
               ? -1
               : 0;
}

}  // namespace

std::int32_t img_read_tiled(img_desc *desc, std::int32_t line, std::int32_t samp,
                            std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                            std::uint8_t *buffer, std::int32_t stride)
{
    const tiled_region region(desc, line, samp, nlines, nsamps, stride);
    const bool direct = reads_stored_tiles(desc);
    if (direct && read_lent_region(desc, region, band, buffer)) return 0;

    const img_scratch run = img_take_scratch(region.run_length());
    if (!run) return img_fail_errno("img_read_tiled:malloc");
    // Virtual tiles at the edges have no samples for all of their plane, but are cached whole.
    if (desc->virtual_tiled != 0) std::fill_n(run.get(), region.run_length(), std::uint8_t{0});
    const auto load = direct ? load_refused_run : img_load_tile_run;
    for (std::int32_t row = 0; row < region.tile_rows(); ++row) {
        if (load(desc, region.first_tile(row), region.ntiles(), band, run.get()) == -1) return -1;
        region.for_each_tile(row, [&](const tile_part &part) {
            img_std_copy_rows({run.get() + part.run_byte, region.plane_pitch(), region.width()},
                              buffer + region.buffer_byte(part), region.buffer_pitch(), part.nlines,
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
    // Not for write-only images: a tile that cannot be read back is not replaced, even if the
    // region covers it.
    const bool direct = reads_stored_tiles(desc) && img_access_mode(desc) == IMG_OPEN_READ_WRITE &&
                        img_type_of(desc).write_tiles == img_std_write_tiles;
    bool lends = true;
    for (std::int32_t row = 0; row < region.tile_rows(); ++row) {
        const row_write write{.desc = desc,
                              .region = region,
                              .row = row,
                              .band = band,
                              .buffer = buffer,
                              .fill = fill,
                              .run = run.get()};
        if (write_row(write, direct, &lends) == -1) return -1;
    }
    return 0;
}
