// The second half of a load: passing the samples through the links.
#ifndef IMG_CHAIN_APPLY_H
#define IMG_CHAIN_APPLY_H

#include "chain/chain.h"

// Passes the samples that were read through the links into the caller's buffer, and ends the load.
// Returns 0, or -1 after a message; quietly without a preparation, or without memory for a link's
// output.
std::int32_t img_chain_apply(img_chain &chain);
// The same for a handle within 0..59.
std::int32_t img_apply_img_chain(img_handle handle);

#endif
