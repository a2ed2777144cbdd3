// Where samples lie behind the header, said once more and without the library.
#ifndef IMG_TEST_LAYOUT_RULES_H
#define IMG_TEST_LAYOUT_RULES_H

#include "support/test_image.h"

#include <cstddef>

// Lines or samples that are stored for `extent` of them.
inline std::int32_t stored_extent(std::int32_t extent, std::int32_t tile_extent)
{
    return tile_extent == 0 ? extent : (extent + tile_extent - 1) / tile_extent * tile_extent;
}

// Bytes between the first pixel and a sample.
inline std::size_t stored_at(const test_geometry &image, std::int32_t band, std::int32_t line,
                             std::int32_t samp)
{
    const std::int32_t width = stored_extent(image.nsamps, image.tile_nsamps);
    const std::int32_t height = stored_extent(image.nlines, image.tile_nlines);
    const std::int32_t tile_plane = image.tile_nlines * image.tile_nsamps;
    std::int32_t tile = 0, pixel = line * width + samp;
    if (tile_plane != 0) {
        tile = line / image.tile_nlines * (width / image.tile_nsamps) + samp / image.tile_nsamps;
        pixel = line % image.tile_nlines * image.tile_nsamps + samp % image.tile_nsamps;
    }
    std::int32_t sample = band * width * height + tile * tile_plane + pixel;
    if (image.layout == IMG_LAYOUT_BIP || image.layout == IMG_LAYOUT_TILED_BIP)
        sample = (tile * tile_plane + pixel) * image.nbands + band;
    else if (image.layout == IMG_LAYOUT_TILED)
        sample = (tile * image.nbands + band) * tile_plane + pixel;
    return static_cast<std::size_t>(sample * image.nbytes);
}

// Bytes of all pixels.
inline std::size_t stored_bytes(const test_geometry &image)
{
    return static_cast<std::size_t>(stored_extent(image.nlines, image.tile_nlines) *
                                    stored_extent(image.nsamps, image.tile_nsamps) * image.nbands *
                                    image.nbytes);
}

#endif
