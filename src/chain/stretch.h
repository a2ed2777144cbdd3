// The linear contrast stretch that brings two-byte samples to 8 bits: the callback of the mapdown's
// first link, and what it is made of.
#ifndef IMG_STRETCH_H
#define IMG_STRETCH_H

#include "chain/chain.h"

// The callback of the mapdown: a stretch to 8 bits; ignores `arg`.
std::int32_t img_chain_create_16to8_lut(void *arg, const std::uint8_t *buffer,
                                        const img_buffer_def *def, std::uint16_t *lut);
// Fills `lut`, 1 << def->nbits entries, with the stretch of the window's histogram, taken at every
// fourth sample of each line and without the fill, to `bits_out` bits. Samples of more than
// def->nbits bits are not counted. Returns 0, or -1 after a message: more than 16 bits, or memory
// is short. Widths below 1 print a message, leave `lut` as it is and return 0.
std::int32_t img_chain_create_stretch_lut_from_buffer(const std::uint8_t *buffer,
                                                      const img_buffer_def *def, std::uint16_t *lut,
                                                      std::int32_t bits_out);
// Fills `lut` from a histogram of 1 << `bits_in` counters. `descriptor` states the widths; null:
// the output is as wide as the input. Returns 0, or -1 after a message, `lut` untouched, for widths
// outside 1..16 or that disagree, and for a null histogram.
std::int32_t img_chain_compute_stretch_lut(const std::uint32_t *histogram, std::int32_t bits_in,
                                           const img_chain_lut *descriptor, std::uint16_t *lut);
// Fills the table for img_chain_compute_stretch_lut, for outputs no wider than the input: entry i
// becomes (i - low) * gain, truncated, shifted right by `shift` and clamped to 0..top.
void img_chain_fill_stretch(std::uint16_t *lut, std::int32_t size, double low, double gain,
                            std::int32_t shift, std::int32_t top);

#endif
