// Lookup tables to 8 bits that rise in a straight line, as those of a stretch do. Such a ramp can
// be computed for several samples at once; a lookup cannot.
#ifndef IMG_RAMP_H
#define IMG_RAMP_H

#include <cstddef>
#include <cstdint>

// Maps a sample to (sample - low) * 256 / span, clamped to 0..255. Samples beyond `last` map as it
// does.
struct img_chain_ramp {
    std::uint16_t low, last, span;
    std::uint16_t scale;    // the power of two that brings `span` above 32768; 0 for a span of 1,
                            // which has no value between its ends
    std::uint16_t inverse;  // 2^31 / (scale * span), rounded up
    std::uint16_t bias;     // 1: an exact quotient maps to the value below it
};

// Finds the ramp that equals all `size` entries of a table, at most 4096. Returns false if none
// does.
bool img_chain_find_ramp(const std::uint16_t *table, std::int32_t size, img_chain_ramp *ramp);

// Maps `count` two-byte samples, of any alignment, to bytes.
void img_chain_map_ramp(const std::uint8_t *source, std::uint8_t *target, std::size_t count,
                        const img_chain_ramp &ramp);

#endif
