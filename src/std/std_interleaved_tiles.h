// Pixel interleaved tiles, the tiles of layout 4: splitting them into tile planes and merging
// planes into them.
#ifndef IMG_STD_INTERLEAVED_TILES_H
#define IMG_STD_INTERLEAVED_TILES_H

#include "base/img_desc.h"

#include <array>
#include <cstddef>
#include <cstdint>

// The band at each position of a pixel, and one plane per band; null: no plane.
using img_std_band_map = std::array<std::int32_t, IMG_MAX_INTERLEAVED_BANDS>;
using img_std_planes = std::array<std::uint8_t *, IMG_MAX_INTERLEAVED_BANDS>;
using img_std_const_planes = std::array<const std::uint8_t *, IMG_MAX_INTERLEAVED_BANDS>;

// Copy the samples of each band between one tile and the bands' planes; sample k of a pixel belongs
// to band `band_map`[k]. Bands whose plane is null are passed over.
void img_std_split_tile(const std::uint8_t *tile, std::int32_t tile_nsamps,
                        std::int32_t tile_nlines, std::int32_t nbytes, std::int32_t nbands,
                        const img_std_band_map &band_map, const img_std_planes &planes);
void img_std_merge_tile(std::int32_t nbands, const img_std_band_map &band_map,
                        const img_std_const_planes &planes, std::int32_t tile_nsamps,
                        std::int32_t tile_nlines, std::int32_t nbytes, std::uint8_t *tile);

// Splits a tile of which only the first `length` bytes are there. Where they end inside a two-byte
// sample, its first byte is copied, too: a write of another band stores it again.
void img_std_split_bytes(const std::uint8_t *tile, std::size_t length, std::int32_t nbytes,
                         std::int32_t nbands, const img_std_band_map &band_map,
                         const img_std_planes &planes);

#endif
