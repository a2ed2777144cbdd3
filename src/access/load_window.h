// Reading a window: the work of img_load_buffer once its handle is found.
#ifndef IMG_LOAD_WINDOW_H
#define IMG_LOAD_WINDOW_H

#include "access/window.h"

#include <cstdint>

struct img_desc;

// Arguments, result and messages are those of img_load_buffer.
std::int32_t img_load_window(img_desc *desc, const img_window &window, std::int32_t band,
                             std::uint8_t *buffer, std::int32_t stride, const std::uint8_t *fill);

#endif
