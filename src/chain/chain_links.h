// The links of a chain: adding, removing and resetting them. The chain's owner does this when an
// image is opened; loads only read the links.
#ifndef IMG_CHAIN_LINKS_H
#define IMG_CHAIN_LINKS_H

#include "chain/chain.h"

// All return 0, or -1 with nothing changed: for a handle that names no image after a message; for a
// slot outside 0..9 or a missing function quietly. A change ends a preparation. Adding into a slot
// overwrites it and frees nothing: remove its link first.

// Frees what the links own and empties all slots.
void img_chain_init(img_handle handle);
std::int32_t img_chain_add_remap_link(img_handle handle, std::int32_t link, std::int32_t out_bits,
                                      void *arg, img_chain_process_fn process_fn,
                                      img_chain_input_def_fn input_def_fn);
// Adds a LUT of 1 << `bits_in` entries: as a link of its own (`remap` 0) or as a remap link that
// applies it. `owned` 1: the link frees `lut`, which is from new[]. Also -1, quietly, for a width
// outside 1..30, a null `lut`, and when memory is short.
std::int32_t img_chain_add_lut_link(img_handle handle, std::int32_t link, std::int32_t bits_in,
                                    std::int32_t bits_out, std::int32_t remap, std::uint16_t *lut,
                                    std::int32_t owned);
// Adds a link that computes a LUT from the data, and in the later slot `target` the link that uses
// it, as above. Without a `lut` the chain makes one of its own. Also -1 when memory is short.
std::int32_t img_chain_add_lut_create_link(img_handle handle, std::int32_t link, void *arg,
                                           img_chain_create_fn create_fn, std::int32_t target,
                                           std::int32_t bits_in, std::int32_t bits_out,
                                           std::int32_t remap, std::uint16_t *lut,
                                           std::int32_t owned);
// Empties a slot, and the target of a link that computes a LUT with it.
std::int32_t img_chain_remove_link(img_handle handle, std::int32_t link);
// Sets out_bits: that of the last remap link that states a width, else the image's bits.
void img_chain_update_out_bits(img_handle handle);

#endif
