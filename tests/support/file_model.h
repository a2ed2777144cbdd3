// The model of what a transfer does to a buffer and to a file: what is to be delivered, stored and
// printed.
#ifndef IMG_TEST_FILE_MODEL_H
#define IMG_TEST_FILE_MODEL_H

#include "support/files.h"
#include "support/layout_rules.h"

#include <bit>
#include <set>
#include <utility>

// A file byte by byte, and the image in it. Two-byte samples pass no chain.
struct file_model {
    test_geometry image;
    std::int64_t data_offset = 0;
    bytes content{};
    std::string text{};  // what the loads so far are to print

    std::size_t at(std::size_t stored) const { return img_count(data_offset) + stored; }
    // Does to `buffer` what a load does that is not refused, and returns its result. Lines, or rows
    // of tiles, are delivered until one is not whole in the file.
    std::int32_t load(const transfer &window, bytes::iterator buffer, std::uint8_t fill = FILL)
    {
        if (window.tiles) {
            // What the file has of a tile is there; of interleaved pixels, whole samples are.
            bool whole = !has_tiles(image) || reads(window.band, window.line, window.nlines);
            const std::size_t pixel = has_tiles(image) ? 1 : img_count(image.nbands);
            const std::size_t unit = is_interleaved(image) ? nbytes() * pixel : 1;
            for_each_byte(image, window, [&](std::size_t to, std::size_t stored) {
                if (at((stored / unit + 1) * unit) <= content.size())
                    buffer[static_cast<std::ptrdiff_t>(to)] = content[at(stored)];
                else
                    whole = false;
            });
            return whole ? 0 : -1;
        }
        const std::int64_t left = std::max(window.samp, 0), top = std::max(window.line, 0);
        const std::int64_t right = right_of(window), bottom = bottom_of(window);
        if (left > window.samp || top > window.line ||
            right < std::int64_t{window.samp} + window.nsamps ||
            bottom < std::int64_t{window.line} + window.nlines)
            fill_rows(window, buffer, fill);
        if (left >= right) return 0;
        const std::int64_t height = has_tiles(image) ? image.tile_nlines : 1;
        for (std::int64_t line = top; line < bottom;) {
            transfer part = window;
            part.line = static_cast<std::int32_t>(line);
            part.nlines =
                static_cast<std::int32_t>(std::min(stored_extent(line + 1, height), bottom) - line);
            const auto rows = buffer + (line - window.line) * window.pitch() * image.nbytes;
            if (!reads(window.band, line, left, right, rows + (left - window.samp) * image.nbytes))
                return -1;
            for_each_byte(image, part, [&](std::size_t to, std::size_t stored) {
                rows[static_cast<std::ptrdiff_t>(to)] = content[at(stored)];
            });
            line += part.nlines;
        }
        return 0;
    }
    // Does to the file what a dump does that is not refused. In the tiles that a window touches,
    // what is not stored yet gets `fill`, the bytes of a sample.
    void dump(const transfer &window, const std::uint8_t *buffer, const bytes &fill)
    {
        if (has_tiles(image) && !window.tiles)
            for (const std::int64_t tile : touched_tiles(window)) {
                const std::size_t length = content.size();
                transfer whole{.band = window.band, .line = static_cast<std::int32_t>(tile)};
                whole.tiles = true;
                for_each_byte(image, whole, [&](std::size_t from, std::size_t stored) {
                    if (at(stored) >= length) store(stored, fill[from % nbytes()]);
                });
            }
        for_each_byte(image, window,
                      [&](std::size_t from, std::size_t stored) { store(stored, buffer[from]); });
    }
    // Stores all that is missing, as zero bytes.
    void complete() { content.resize(std::max(content.size(), at(stored_bytes(image)))); }

private:
    std::size_t nbytes() const { return img_count(image.nbytes); }
    std::int64_t tile_bytes() const
    {
        const tile_grid grid = tiles_of(image);
        return grid.height * grid.width * image.nbytes * (is_interleaved(image) ? image.nbands : 1);
    }
    // Where the part of a window that lies in the image ends.
    std::int64_t bottom_of(const transfer &window) const
    {
        return std::min<std::int64_t>(std::int64_t{window.line} + window.nlines, image.nlines);
    }
    std::int64_t right_of(const transfer &window) const
    {
        return std::min<std::int64_t>(std::int64_t{window.samp} + window.nsamps, image.nsamps);
    }

    void fill_rows(const transfer &window, bytes::iterator buffer, std::uint8_t fill) const
    {
        const std::int64_t low = std::endian::native == std::endian::little ? 0 : image.nbytes - 1;
        for (std::int64_t i = 0; i < window.nlines; ++i)
            for (std::int64_t k = 0; k < std::int64_t{window.nsamps} * image.nbytes; ++k)
                buffer[i * window.pitch() * image.nbytes + k] = k % image.nbytes == low ? fill : 0;
    }
    std::set<std::int64_t> touched_tiles(const transfer &window) const
    {
        const tile_grid grid = tiles_of(image);
        std::set<std::int64_t> tiles;
        for (std::int64_t line = std::max(window.line, 0); line < bottom_of(window); ++line)
            for (std::int64_t samp = std::max(window.samp, 0); samp < right_of(window); ++samp)
                tiles.insert(line / grid.height * grid.across + samp / grid.width);
        return tiles;
    }
    // The file grows by whole tiles where it has such.
    void store(std::size_t stored, std::uint8_t value)
    {
        const std::size_t size = has_tiles(image) ? img_count(tile_bytes()) : 1;
        content.resize(std::max(content.size(), at((stored / size + 1) * size)));
        content[at(stored)] = value;
    }

    // Reads `pieces` of `length` bytes, the first at `stored`, the others `step` bytes apart.
    // False: the file ends before.
    bool reads_pieces(std::int64_t stored, std::int64_t pieces, std::int64_t length,
                      std::int64_t step)
    {
        for (; pieces > 0; --pieces, stored += step) {
            const std::int64_t got =
                std::max<std::int64_t>(std::ssize(content) - data_offset - stored, 0);
            if (got >= length) continue;
            text += has_tiles(image)        ? "img_std_read_tiles: "
                    : is_interleaved(image) ? "img_std_read_nontiled_interleaved: "
                                            : "img_read_nontiled: ";
            text += std::to_string(got) + " of " + std::to_string(length) + " bytes read!!\n";
            return false;
        }
        return true;
    }
    bool reads(std::int64_t band, std::int64_t first_tile, std::int64_t ntiles)
    {
        const auto [height, width, across, down] = tiles_of(image);
        const bool separate = image.layout == IMG_LAYOUT_TILED && image.nbands > 1;
        const std::int64_t first =
            stored_at(image, is_interleaved(image) ? image.band_shift : band,
                      first_tile / across * height, first_tile % across * width);
        const std::int64_t size = tile_bytes();
        return separate ? reads_pieces(first, ntiles, size, size * image.nbands)
                        : reads_pieces(first, 1, size * ntiles, 0);
    }
    // Reads the samples `left` to `right` of a line, or the tiles that hold them. Of a line that is
    // not whole, `to` gets what there is.
    bool reads(std::int64_t band, std::int64_t line, std::int64_t left, std::int64_t right,
               bytes::iterator to)
    {
        if (has_tiles(image)) {
            const tile_grid grid = tiles_of(image);
            const std::int64_t first = left / grid.width, last = (right - 1) / grid.width;
            return reads(band, line / grid.height * grid.across + first, last - first + 1);
        }
        const bool interleaved = is_interleaved(image);
        const std::int64_t stored = stored_at(image, interleaved ? 0 : band, line, left);
        if (reads_pieces(stored, 1,
                         (right - left) * image.nbytes * (interleaved ? image.nbands : 1), 0))
            return true;
        const std::int64_t first = std::min(data_offset + stored, std::ssize(content));
        if (!interleaved) std::copy(content.begin() + first, content.end(), to);
        return false;
    }
};

#endif
