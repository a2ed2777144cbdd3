// Between pixels, in which most formats store samples, and the bands of a block.
#ifndef TOOL_PIXELS_H
#define TOOL_PIXELS_H

#include "codecs/image.h"

#include <bit>

// A piece of one line of a block: `count` samples from `samp` on, of the bands from `first_band`
// on.
struct line_part {
    std::int32_t line, samp, count, first_band;
};

// Stores pixels, of `nbands` samples each in the host's order, in a piece of a line of a block: the
// bands listed, in their order.
void spread_pixels(const std::uint8_t *pixels, std::int32_t nbands, const band_list &bands,
                   const line_part &part, block &samples);

// Collects the pixels of a piece of a line, all bands from `first_band` on.
void gather_pixels(const block &samples, const line_part &part, std::uint8_t *pixels);

// Exchanges the bytes of `count` two-byte samples.
void exchange_bytes(std::uint8_t *samples, std::size_t count);

// True where two-byte samples of files in big-endian order must be exchanged.
inline constexpr bool BIG_ENDIAN_IS_FOREIGN = std::endian::native == std::endian::little;

#endif
