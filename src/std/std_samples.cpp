// Moving and filling samples, whatever the transfer that needs it.
#include "std/std.h"

#include <cstring>

namespace {

template <std::size_t Nbytes>
void copy_spaced(const std::uint8_t *from, std::size_t from_step, std::uint8_t *to,
                 std::size_t to_step, std::size_t count)
{
    for (std::size_t i = 0; i < count; ++i)
        std::memcpy(to + i * to_step, from + i * from_step, Nbytes);
}

void copy_exchanged(const std::uint8_t *from, std::size_t from_step, std::uint8_t *to,
                    std::size_t to_step, std::size_t count)
{
    for (std::size_t i = 0; i < count; ++i) {
        std::uint16_t sample;
        std::memcpy(&sample, from + i * from_step, sizeof sample);
        sample = static_cast<std::uint16_t>(sample << 8U | sample >> 8U);
        std::memcpy(to + i * to_step, &sample, sizeof sample);
    }
}

}  // namespace

void img_std_copy_samples(const std::uint8_t *from, std::size_t from_step, std::uint8_t *to,
                          std::size_t to_step, std::size_t count, std::int32_t nbytes,
                          bool exchange)
{
    const auto width = static_cast<std::size_t>(nbytes);
    if (exchange) {
        copy_exchanged(from, from_step, to, to_step, count);
    } else if (from_step == width && to_step == width) {
        std::memcpy(to, from, count * width);
    } else if (width == 1) {
        copy_spaced<1>(from, from_step, to, to_step, count);
    } else {
        copy_spaced<2>(from, from_step, to, to_step, count);
    }
}

void img_fill_samples(std::uint8_t *buffer, std::size_t count, std::int32_t nbytes,
                      const std::uint8_t *value)
{
    if (nbytes == 1) {
        std::memset(buffer, *value, count);
    } else {
        copy_spaced<2>(value, 0, buffer, 2, count);
    }
}
