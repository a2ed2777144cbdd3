// Samples of one or two bytes as they lie in a buffer, in the byte order of the host.
#ifndef IMG_TEST_SAMPLE_H
#define IMG_TEST_SAMPLE_H

#include <cstdint>
#include <cstring>

inline std::uint16_t get_sample(const std::uint8_t *from, std::int32_t nbytes)
{
    std::uint16_t sample = *from;
    if (nbytes == 2) std::memcpy(&sample, from, sizeof sample);
    return sample;
}

inline void put_sample(std::uint8_t *to, std::int32_t nbytes, std::uint16_t sample)
{
    if (nbytes == 2)
        std::memcpy(to, &sample, sizeof sample);
    else
        *to = static_cast<std::uint8_t>(sample);
}

#endif
