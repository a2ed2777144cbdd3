// Between pixels, as most formats have them, and bands.
#ifndef TOOL_SAMPLES_H
#define TOOL_SAMPLES_H

#include "image.h"

// A piece of one line of a block: `count` samples from `samp` on, of the bands from `first_band`
// on.
struct line_part {
    std::int32_t line, samp, count, first_band;
};

// Spreads pixels, `nbands` samples each in the host's order, over a piece of a line of a block:
// these bands of them.
void spread_pixels(const std::uint8_t *pixels, std::int32_t nbands, const band_list &bands,
                   const line_part &part, block &to);

// Gathers the pixels of a piece of a line, all bands from `first_band` on.
void gather_pixels(const block &from, const line_part &part, std::uint8_t *to);

// Exchanges the bytes of `count` two-byte samples.
void exchange_bytes(std::uint8_t *samples, std::size_t count);

// True where two-byte samples of files in big-endian order have to be exchanged.
inline constexpr bool BIG_ENDIAN_IS_FOREIGN = __BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__;

#endif
