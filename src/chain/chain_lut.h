// Lookup tables: applied to a buffer, applied from one buffer to another, and re-expressed for
// other widths.
#ifndef IMG_CHAIN_LUT_H
#define IMG_CHAIN_LUT_H

#include "chain/chain.h"

#include <algorithm>

// Returns the entry of `sample` in a table of `size` entries, the last one for a sample beyond it.
inline std::uint16_t img_chain_entry(const std::uint16_t *table, std::int32_t size,
                                     std::uint32_t sample)
{
    return table[std::min(sample, static_cast<std::uint32_t>(size) - 1)];
}
// Replaces every sample of the window by its entry; one-byte samples get the entry's low byte.
void img_chain_apply_lut(std::uint8_t *buffer, const img_buffer_def *def, const img_chain_lut *lut);
// Re-expresses the table of `src` for the widths of `dst`, whose size may not exceed the room in
// `dst_table`.
void img_chain_convert_lut(const std::uint16_t *src_table, const img_chain_lut *src,
                           std::uint16_t *dst_table, const img_chain_lut *dst);
// The two functions of a LUT's remap link; `record` is its img_chain_lut.
std::int32_t img_chain_lut_input_definition(void *record, const img_buffer_def *out_def,
                                            img_buffer_def *in_def);
std::int32_t img_chain_lut_remap(void *record, const std::uint8_t *in_buffer,
                                 const img_buffer_def *in_def, std::uint8_t *out_buffer,
                                 const img_buffer_def *out_def, std::int32_t pending,
                                 const std::uint16_t *lut);

#endif
