// Filling with a sample.
#ifndef IMG_FILL_H
#define IMG_FILL_H

#include <cstddef>
#include <cstdint>
#include <cstring>

// Writes `count` copies of the sample of `nbytes` bytes, 1 or 2, at `value`.
inline void img_fill_samples(std::uint8_t *buffer, std::size_t count, std::int32_t nbytes,
                             const std::uint8_t *value)
{
    if (nbytes == 1) {
        std::memset(buffer, *value, count);
        return;
    }
    std::uint16_t sample;
    std::memcpy(&sample, value, sizeof sample);
    for (std::size_t i = 0; i < count; ++i)
        std::memcpy(buffer + i * sizeof sample, &sample, sizeof sample);
}

#endif
