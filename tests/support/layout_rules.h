// Where samples lie behind the header, told once more and without the library.
#ifndef IMG_TEST_LAYOUT_RULES_H
#define IMG_TEST_LAYOUT_RULES_H

#include "support/test_image.h"
#include "support/transfer.h"

#include <algorithm>

inline bool has_tiles(const test_geometry &image)
{
    return image.tile_nsamps != 0 && image.tile_nlines != 0;
}

// True when a pixel's samples of all bands lie side by side, and move together.
inline bool is_interleaved(const test_geometry &image)
{
    return image.nbands > 1 &&
           (image.layout == IMG_LAYOUT_BIP || image.layout == IMG_LAYOUT_TILED_BIP);
}

// Lines or samples that are stored for `extent` of them.
inline std::int64_t stored_extent(std::int64_t extent, std::int64_t tile_extent)
{
    return tile_extent == 0 ? extent : (extent + tile_extent - 1) / tile_extent * tile_extent;
}

// Bytes between the first pixel and a sample.
inline std::int64_t stored_at(const test_geometry &image, std::int64_t band, std::int64_t line,
                              std::int64_t samp)
{
    const std::int64_t width = stored_extent(image.nsamps, image.tile_nsamps);
    const std::int64_t height = stored_extent(image.nlines, image.tile_nlines);
    const std::int64_t tile_plane = std::int64_t{image.tile_nlines} * image.tile_nsamps;
    std::int64_t tile = 0, pixel = line * width + samp;
    if (tile_plane != 0) {
        tile = line / image.tile_nlines * (width / image.tile_nsamps) + samp / image.tile_nsamps;
        pixel = line % image.tile_nlines * image.tile_nsamps + samp % image.tile_nsamps;
    }
    std::int64_t sample = band * width * height + tile * tile_plane + pixel;
    if (image.layout == IMG_LAYOUT_TILED_BIP && image.nbands > 0)
        band = (band + image.nbands - image.band_shift) % image.nbands;
    if (image.layout == IMG_LAYOUT_BIP || image.layout == IMG_LAYOUT_TILED_BIP)
        sample = (tile * tile_plane + pixel) * image.nbands + band;
    else if (image.layout == IMG_LAYOUT_TILED)
        sample = (tile * image.nbands + band) * tile_plane + pixel;
    return sample * image.nbytes;
}

// Bytes of all pixels.
inline std::size_t stored_bytes(const test_geometry &image)
{
    return img_count(stored_extent(image.nlines, image.tile_nlines) *
                     stored_extent(image.nsamps, image.tile_nsamps) * image.nbands * image.nbytes);
}

// The tiles that transfers count: those stored, or those that the cache gives to an untiled image.
struct tile_grid {
    std::int64_t height, width, across, down;
};
inline tile_grid tiles_of(const test_geometry &image)
{
    const std::int64_t height = has_tiles(image) ? image.tile_nlines : image.virtual_nlines;
    const std::int64_t width = has_tiles(image) ? image.tile_nsamps : image.virtual_nsamps;
    if (height == 0 || width == 0) return {};
    return {height, width, (image.nsamps + width - 1) / width,
            (image.nlines + height - 1) / height};
}

// Returns -1 when a transfer is to be refused, 0 when it is to move nothing, and 1 else.
inline std::int32_t verdict_on(const transfer &request, const test_geometry &image)
{
    const tile_grid grid = tiles_of(image);
    if (request.tiles && (grid.height == 0 || request.nlines < 1)) return 0;
    if (request.band < 0 || request.band >= image.nbands) return -1;
    if (request.tiles)
        return request.line >= 0 &&
                       std::int64_t{request.line} + request.nlines <= grid.across * grid.down
                   ? 1
                   : -1;
    // Rows of a dump that lie partly over each other are taken while the bytes of a stride suffice.
    if (request.nsamps > std::int64_t{request.pitch()} * (request.writes ? image.nbytes : 1))
        return -1;
    return request.nlines > 0 && request.nsamps > 0 ? 1 : 0;
}

// Calls `visit(in_buffer, stored)` with the offsets of every byte that a transfer moves, in the
// buffer and behind the header, in the order of the buffer.
template <typename Visit>
void for_each_byte(const test_geometry &image, const transfer &request, Visit visit)
{
    const auto visit_sample = [&](std::int64_t i, std::int64_t line, std::int64_t samp) {
        const std::int64_t stored = stored_at(image, request.band, line, samp);
        const std::int64_t exchange = !request.tiles && image.swap != 0 ? image.nbytes - 1 : 0;
        for (std::int64_t k = 0; k < image.nbytes; ++k)
            visit(img_count(i) * img_count(image.nbytes) + img_count(k),
                  img_count(stored + (k ^ exchange)));
    };
    if (request.tiles) {
        const auto [height, width, across, down] = tiles_of(image);
        for (std::int64_t i = 0; i < request.nlines * height * width; ++i) {
            const std::int64_t tile = request.line + i / (height * width);
            const std::int64_t line = tile / across * height + i / width % height;
            const std::int64_t samp = tile % across * width + i % width;
            if (has_tiles(image) || (line < image.nlines && samp < image.nsamps))
                visit_sample(i, line, samp);
        }
        return;
    }
    const std::int64_t bottom =
        std::min<std::int64_t>(std::int64_t{request.line} + request.nlines, image.nlines);
    const std::int64_t right =
        std::min<std::int64_t>(std::int64_t{request.samp} + request.nsamps, image.nsamps);
    for (std::int64_t line = std::max(request.line, 0); line < bottom; ++line)
        for (std::int64_t samp = std::max(request.samp, 0); samp < right; ++samp)
            visit_sample((line - request.line) * request.pitch() + samp - request.samp, line, samp);
}

#endif
