// Copying samples. The loops are plain C++ that compilers turn into vector code;
// base/multiversion.h says how the exchange is built twice. Read std_samples.h first.
#include "std/std_samples.h"

#include "base/count.h"
#include "base/img_desc.h"
#include "base/multiversion.h"

#include <algorithm>
#include <cstring>

namespace {

inline void copy_exchanged(const std::uint8_t *source, std::size_t source_step,
                           std::uint8_t *target, std::size_t target_step, std::size_t count)
{
    for (std::size_t i = 0; i < count; ++i) {
        std::uint16_t sample;
        std::memcpy(&sample, source + i * source_step, sizeof sample);
        sample = static_cast<std::uint16_t>(sample << 8U | sample >> 8U);
        std::memcpy(target + i * target_step, &sample, sizeof sample);
    }
}

template <std::size_t Nbytes>
void copy_spaced(const std::uint8_t *source, std::size_t source_step, std::uint8_t *target,
                 std::size_t target_step, std::size_t count)
{
    for (std::size_t i = 0; i < count; ++i)
        std::memcpy(target + i * target_step, source + i * source_step, Nbytes);
}

// Copies side by side in pieces: the C library writes one large copy past the processor's caches,
// which takes longer.
void copy_in_pieces(const std::uint8_t *source, std::uint8_t *target, std::size_t count)
{
    constexpr std::size_t piece = 65536;
    for (; count > piece; count -= piece, source += piece, target += piece)
        std::memcpy(target, source, piece);
    std::memcpy(target, source, count);
}

// Copies `count` bytes, at least `Block`, in blocks of that size: each is one vector move or a few.
// The last block may overlap the one before.
template <std::size_t Block>
inline void copy_blocks(const std::uint8_t *source, std::uint8_t *target, std::size_t count)
{
    const std::size_t last = count - Block;
    for (std::size_t i = 0; i < last; i += Block) std::memcpy(target + i, source + i, Block);
    std::memcpy(target + last, source + last, Block);
}

// Rows of 8 to so many bytes are copied without a call.
constexpr std::size_t SHORT_ROW = 256;

inline void copy_short_row(const std::uint8_t *source, std::uint8_t *target, std::size_t count)
{
    if (count >= 64)
        copy_blocks<64>(source, target, count);
    else if (count >= 16)
        copy_blocks<16>(source, target, count);
    else if (count >= 8)
        copy_blocks<8>(source, target, count);
    else
        std::memcpy(target, source, count);
}

// Calls `copy(source, target)` for each row, and prefetches the rows that follow soon. Rows on
// pages of their own are out of reach of the processor's own prefetching; rows without gaps are
// not.
template <typename Copy>
inline void copy_each_row(const img_std_rows &rows, std::uint8_t *target, std::size_t target_pitch,
                          std::size_t nrows, std::size_t row_length, Copy copy)
{
    constexpr std::size_t cache_line = 64;
    constexpr std::size_t bytes_ahead = 4096;
    constexpr std::size_t most_rows_ahead = 16;
    const std::size_t ahead =
        std::clamp<std::size_t>(bytes_ahead / (row_length + 1), 1, most_rows_ahead);
    const std::size_t prefetched = std::min(row_length, bytes_ahead / 2);
    for (std::size_t row = 0; row < nrows; ++row) {
        const std::uint8_t *const source = rows.first + row * rows.pitch;
        if (rows.pitch > row_length && row + ahead < nrows)
            for (std::size_t i = 0; i < prefetched; i += cache_line)
                __builtin_prefetch(source + ahead * rows.pitch + i);
        copy(source, target + row * target_pitch);
    }
}

}  // namespace

std::size_t img_std_sample_bytes(const img_desc *desc, std::int64_t count)
{
    return img_count(count) * img_count(desc->nbytes);
}

bool img_std_exchanges_bytes(const img_desc *desc)
{
    return desc->nbytes == 2 && desc->swap != 0;
}

IMG_MULTIVERSION void img_std_exchange_bytes(const std::uint8_t *source, std::uint8_t *target,
                                             std::size_t count)
{
    copy_exchanged(source, 2, target, 2, count);
}

void img_std_copy_samples(const std::uint8_t *source, std::size_t source_step, std::uint8_t *target,
                          std::size_t target_step, std::size_t count, std::int32_t nbytes,
                          bool exchange)
{
    const std::size_t width = img_count(nbytes);
    const bool packed = source_step == width && target_step == width;
    if (exchange && packed)
        img_std_exchange_bytes(source, target, count);
    else if (exchange)
        copy_exchanged(source, source_step, target, target_step, count);
    else if (packed)
        std::memcpy(target, source, count * width);
    else if (width == 1)
        copy_spaced<1>(source, source_step, target, target_step, count);
    else
        copy_spaced<2>(source, source_step, target, target_step, count);
}

void img_std_copy_rows(const img_std_rows &rows, std::uint8_t *target, std::size_t target_pitch,
                       std::size_t nrows, std::size_t nsamps, std::int32_t nbytes, bool exchange)
{
    const std::size_t width = img_count(nbytes);
    if (rows.pitch == rows.step * nsamps && target_pitch == width * nsamps) {
        nsamps *= nrows;
        nrows = std::min<std::size_t>(nrows, 1);
    }
    const std::size_t row_length = rows.step * nsamps;
    if (rows.step == width && !exchange && nrows == 1) {
        copy_in_pieces(rows.first, target, row_length);
    } else if (rows.step == width && !exchange && row_length <= SHORT_ROW) {
        copy_each_row(rows, target, target_pitch, nrows, row_length,
                      [row_length](const std::uint8_t *source, std::uint8_t *row) {
                          copy_short_row(source, row, row_length);
                      });
    } else {
        copy_each_row(rows, target, target_pitch, nrows, row_length,
                      [&](const std::uint8_t *source, std::uint8_t *row) {
                          img_std_copy_samples(source, rows.step, row, width, nsamps, nbytes,
                                               exchange);
                      });
    }
}
