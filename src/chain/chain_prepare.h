// The first half of a load: which samples the image type must deliver, and where each link works.
#ifndef IMG_CHAIN_PREPARE_H
#define IMG_CHAIN_PREPARE_H

#include "chain/chain.h"

struct img_desc;

// Returns the buffer into which the image type must read the window that `work_def` then describes:
// `buffer` itself or the chain's own. Null on failure, after a message unless memory is short.
// `def` describes `buffer`, its width that of `out_bits`. Both records must last until the
// application or the release; the chain refers to them.
std::uint8_t *img_chain_prepare(img_chain &chain, const img_desc *desc, std::uint8_t *buffer,
                                const img_buffer_def *def, img_buffer_def *work_def);
// The same for a handle within 0..59; null quietly when it names no image.
std::uint8_t *img_chain_prepare_operations(img_handle handle, std::uint8_t *buffer,
                                           const img_buffer_def *def, img_buffer_def *work_def);

#endif
