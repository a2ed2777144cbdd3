// The stretch of 12-bit samples to bytes, written for this one use: a histogram of every fourth
// sample gives a table, in which each sample is looked up.
#ifndef BENCH_STRETCH_BY_HAND_H
#define BENCH_STRETCH_BY_HAND_H

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>

using sample_counts = std::array<std::uint32_t, 65536>;  // entries above 4095 are ignored
using value_table = std::array<std::uint8_t, 65536>;

// Returns counts of 0. They are kept between windows, as the table is.
sample_counts &new_counts();
// Counts every fourth sample of a row that begins at sample `first` of its line. Samples are stored
// in the byte order `order`.
void count_by_hand(const std::uint8_t *row, std::size_t first, std::size_t count, std::endian order,
                   sample_counts &counts);
// Returns the table for what was counted.
const value_table &stretch_table(sample_counts &counts);
// Looks up `count` samples.
void look_up(const std::uint8_t *samples, std::size_t count, std::endian order,
             const value_table &table, std::uint8_t *buffer);

#endif
