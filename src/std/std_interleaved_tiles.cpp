// Splitting and merging pixel interleaved tiles. Reading and storing them is in std_tiles.cpp. Read
// std_interleaved_tiles.h first.
#include "std/std_interleaved_tiles.h"

#include "base/count.h"
#include "std/std_samples.h"

#include <algorithm>

void img_std_split_bytes(const std::uint8_t *tile, std::size_t length, std::int32_t nbytes,
                         std::int32_t nbands, const img_std_band_map &band_map,
                         const img_std_planes &planes)
{
    const std::size_t width = img_count(nbytes);
    const std::size_t pixel = img_count(nbands) * width;
    const std::size_t pixels = length / pixel;
    for (std::size_t position = 0; position < img_count(nbands); ++position) {
        std::uint8_t *const plane = planes[img_count(band_map[position])];
        if (plane == nullptr) continue;
        const std::size_t first = position * width;
        img_std_copy_samples(tile + first, pixel, plane, width, pixels, nbytes, false);
        // The bytes may end inside this band's sample of the last pixel.
        const std::uint8_t *const last = tile + std::min(pixels * pixel + first, length);
        std::copy_n(last, std::min(img_count(tile + length - last), width), plane + pixels * width);
    }
}

void img_std_split_tile(const std::uint8_t *tile, std::int32_t tile_nsamps,
                        std::int32_t tile_nlines, std::int32_t nbytes, std::int32_t nbands,
                        const img_std_band_map &band_map, const img_std_planes &planes)
{
    const std::size_t pixels = img_count(tile_nsamps) * img_count(tile_nlines);
    img_std_split_bytes(tile, pixels * img_count(nbands) * img_count(nbytes), nbytes, nbands,
                        band_map, planes);
}

void img_std_merge_tile(std::int32_t nbands, const img_std_band_map &band_map,
                        const img_std_const_planes &planes, std::int32_t tile_nsamps,
                        std::int32_t tile_nlines, std::int32_t nbytes, std::uint8_t *tile)
{
    const std::size_t width = img_count(nbytes);
    const std::size_t pixel = img_count(nbands) * width;
    const std::size_t pixels = img_count(tile_nsamps) * img_count(tile_nlines);
    for (std::size_t position = 0; position < img_count(nbands); ++position)
        if (const auto *plane = planes[img_count(band_map[position])]; plane != nullptr)
            img_std_copy_samples(plane, width, tile + position * width, pixel, pixels, nbytes,
                                 false);
}
