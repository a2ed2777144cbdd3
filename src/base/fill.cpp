// Filling memory with copies of one sample. Read fill.h first.
#include "base/fill.h"

#include <cstring>

void img_fill_samples(std::uint8_t *buffer, std::size_t count, std::int32_t nbytes,
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
