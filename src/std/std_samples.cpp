// Moving samples, whatever the transfer that needs it.
#include "base/multiversion.h"
#include "std/std.h"

#include <algorithm>
#include <cstring>

namespace {

inline void copy_exchanged(const std::uint8_t *from, std::size_t from_step, std::uint8_t *to,
                           std::size_t to_step, std::size_t count)
{
    for (std::size_t i = 0; i < count; ++i) {
        std::uint16_t sample;
        std::memcpy(&sample, from + i * from_step, sizeof sample);
        sample = static_cast<std::uint16_t>(sample << 8U | sample >> 8U);
        std::memcpy(to + i * to_step, &sample, sizeof sample);
    }
}

template <std::size_t Nbytes>
void copy_spaced(const std::uint8_t *from, std::size_t from_step, std::uint8_t *to,
                 std::size_t to_step, std::size_t count)
{
    for (std::size_t i = 0; i < count; ++i)
        std::memcpy(to + i * to_step, from + i * from_step, Nbytes);
}

// Asks for bytes that are to be read soon: rows on pages of their own come from memory one by one
// otherwise.
void prefetch(const std::uint8_t *bytes, std::size_t count)
{
    constexpr std::size_t cache_line = 64;
    constexpr std::size_t most = 2048;
    for (std::size_t at = 0; at < std::min(count, most); at += cache_line)
        __builtin_prefetch(bytes + at);
}

}  // namespace

IMG_MULTIVERSION void img_std_exchange_bytes(const std::uint8_t *from, std::uint8_t *to,
                                             std::size_t count)
{
    copy_exchanged(from, 2, to, 2, count);
}

void img_std_copy_samples(const std::uint8_t *from, std::size_t from_step, std::uint8_t *to,
                          std::size_t to_step, std::size_t count, std::int32_t nbytes,
                          bool exchange)
{
    const auto width = static_cast<std::size_t>(nbytes);
    const bool packed = from_step == width && to_step == width;
    if (exchange && packed)
        img_std_exchange_bytes(from, to, count);
    else if (exchange)
        copy_exchanged(from, from_step, to, to_step, count);
    else if (packed)
        std::memcpy(to, from, count * width);
    else if (width == 1)
        copy_spaced<1>(from, from_step, to, to_step, count);
    else
        copy_spaced<2>(from, from_step, to, to_step, count);
}

void img_std_copy_rows(const img_std_rows &from, std::uint8_t *to, std::size_t to_pitch,
                       std::size_t nrows, std::size_t nsamps, std::int32_t nbytes, bool exchange)
{
    const auto width = static_cast<std::size_t>(nbytes);
    if (from.pitch == from.step * nsamps && to_pitch == width * nsamps) {
        nsamps *= nrows;
        nrows = std::min<std::size_t>(nrows, 1);
    }
    const std::size_t row_length = from.step * nsamps;
    constexpr std::size_t bytes_ahead = 4096;
    constexpr std::size_t most_rows_ahead = 16;
    const std::size_t ahead =
        std::clamp<std::size_t>(bytes_ahead / (row_length + 1), 1, most_rows_ahead);
    for (std::size_t row = 0; row < nrows; ++row) {
        if (row + ahead < nrows) prefetch(from.first + (row + ahead) * from.pitch, row_length);
        img_std_copy_samples(from.first + row * from.pitch, from.step, to + row * to_pitch, width,
                             nsamps, nbytes, exchange);
    }
}
