// Lookup tables to 8 bits that rise in a straight line, as those of the stretch do: computing such
// a ramp takes several samples at once, which looking them up does not.
#ifndef IMG_RAMP_H
#define IMG_RAMP_H

#include <cstddef>
#include <cstdint>

// Maps a sample to (sample - low) * 256 / span, from 0 at most to 255. Samples beyond `last` map as
// it does.
struct img_chain_ramp {
    std::uint16_t low, last, span;
    std::uint16_t scale;    // the power of two that makes `span` reach beyond 32768; 0: of a span
                            // of 1, which has nothing above `low` to be scaled
    std::uint16_t inverse;  // 2^31 / (scale * span), rounded up
    std::uint16_t late;     // 1: what is a whole number exactly maps to the one before
};

// Finds the ramp that equals all of the `size` entries of a table, at most 4096. Returns false when
// there is none.
bool img_chain_find_ramp(const std::uint16_t *table, std::int32_t size, img_chain_ramp *ramp);

// Maps `count` two-byte samples, of any alignment, to bytes.
void img_chain_map_ramp(const std::uint8_t *from, std::uint8_t *to, std::size_t count,
                        const img_chain_ramp &ramp);

#endif
