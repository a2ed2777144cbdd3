// Histogram, table and look-up. Read stretch_by_hand.h first.
#include "stretch_by_hand.h"

#include <algorithm>
#include <cstring>
#include <numeric>

#if defined(__x86_64__) && defined(__GLIBC__) && !defined(__clang__)
#define FOR_EACH_PROCESSOR __attribute__((target_clones("avx2", "default")))
#else
#define FOR_EACH_PROCESSOR
#endif

namespace {

constexpr std::size_t VALUES = 4096;

struct cut {
    std::size_t low, high;
};

cut find_cut(const sample_counts &counts)
{
    const std::uint32_t total = std::accumulate(&counts[20], &counts[4055], 0U);
    std::size_t low = 20;
    std::uint32_t count = counts[low];
    while (count < static_cast<std::uint32_t>(total * 0.005) && low < VALUES)
        count += counts[low++];
    std::size_t high = low;
    while (count < static_cast<std::uint32_t>(total * 0.99) && high < VALUES)
        count += counts[high++];
    return {low, high};
}

std::uint16_t sample_at(const std::uint8_t *row, std::size_t index, std::endian order)
{
    std::uint16_t sample;
    std::memcpy(&sample, row + 2 * index, sizeof sample);
    return order == std::endian::native ? sample : __builtin_bswap16(sample);
}

// Loads four samples, the first one in the highest 16 bits.
std::uint64_t four_samples(const std::uint8_t *samples, std::endian order)
{
    std::uint64_t four;
    std::memcpy(&four, samples, sizeof four);
    if (std::endian::native == std::endian::little) four = __builtin_bswap64(four);
    if (order == std::endian::big) return four;
    return (four & 0x00FF00FF00FF00FFU) << 8U | (four >> 8U & 0x00FF00FF00FF00FFU);
}

}  // namespace

sample_counts &new_counts()
{
    static sample_counts counts;
    std::fill_n(counts.begin(), VALUES, 0U);
    return counts;
}

void count_by_hand(const std::uint8_t *row, std::size_t first, std::size_t count, std::endian order,
                   sample_counts &counts)
{
    for (std::size_t i = (4 - first % 4) % 4; i < count; i += 4) ++counts[sample_at(row, i, order)];
}

FOR_EACH_PROCESSOR void fill_table(std::uint8_t *table, double low, double gain)
{
    for (int i = 0; i < static_cast<int>(VALUES); ++i) {
        const double value = std::min(std::max((i - low) * gain, 0.0), 4095.0);
        table[i] = static_cast<std::uint8_t>(static_cast<int>(value) >> 4);
    }
}

const value_table &stretch_table(sample_counts &counts)
{
    static value_table table{};
    counts[0] = 0;  // the fill
    const auto [low, high] = find_cut(counts);
    const double gain = high != low ? 4096.0 / static_cast<double>(high - low) : 1.0;
    fill_table(table.data(), static_cast<double>(low), gain);
    if (table.back() != table[VALUES - 1])
        std::fill(table.begin() + VALUES, table.end(), table[VALUES - 1]);
    return table;
}

void look_up(const std::uint8_t *samples, std::size_t count, std::endian order,
             const value_table &table, std::uint8_t *buffer)
{
    std::size_t i = 0;
    for (; i + 4 <= count; i += 4) {  // one load for four samples
        const std::uint64_t four = four_samples(samples + 2 * i, order);
        buffer[i] = table[four >> 48U];
        buffer[i + 1] = table[four >> 32U & 0xFFFFU];
        buffer[i + 2] = table[four >> 16U & 0xFFFFU];
        buffer[i + 3] = table[four & 0xFFFFU];
    }
    for (; i < count; ++i) buffer[i] = table[sample_at(samples, i, order)];
}
