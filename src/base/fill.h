// Filling memory with copies of one sample.
#ifndef IMG_FILL_H
#define IMG_FILL_H

#include <cstddef>
#include <cstdint>

// Writes `count` copies of the sample of `nbytes` bytes, 1 or 2, at `value`.
void img_fill_samples(std::uint8_t *buffer, std::size_t count, std::int32_t nbytes,
                      const std::uint8_t *value);

#endif
