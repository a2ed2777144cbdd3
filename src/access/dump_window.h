// Writing a window: the work of img_dump_buffer once its handle is found.
#ifndef IMG_DUMP_WINDOW_H
#define IMG_DUMP_WINDOW_H

#include "access/window.h"

#include <cstdint>

struct img_desc;

// Arguments, result and messages are those of img_dump_buffer.
std::int32_t img_dump_window(img_desc *desc, img_window window, std::int32_t band,
                             const std::uint8_t *buffer, std::int32_t stride,
                             const std::uint8_t *fill);

#endif
