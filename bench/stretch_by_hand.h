// The stretch of big-endian 12-bit samples to bytes, written for this alone.
#ifndef BENCH_STRETCH_BY_HAND_H
#define BENCH_STRETCH_BY_HAND_H

#include <array>
#include <cstddef>
#include <cstdint>

using sample_counts = std::array<std::uint32_t, 65536>;  // those beyond 12 bits are never looked at

// Counts of nothing yet, kept between windows.
sample_counts &new_counts();
// Exchanges the bytes of `count` samples on the way; they may stay in place.
void exchange_by_hand(const std::uint8_t *from, std::uint16_t *to, std::size_t count);
// Counts every fourth sample of a part of a line that begins at sample `first` of that line.
void count_by_hand(const std::uint16_t *from, std::size_t first, std::size_t count,
                   sample_counts &counts);
// Stretches samples by what was counted.
void stretch_by_hand(const std::uint16_t *from, std::size_t count, sample_counts &counts,
                     std::uint8_t *to);

#endif
