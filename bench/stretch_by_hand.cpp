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

// A stretch as a division: value 256 is reached `span` above `low`.
struct line {
    std::uint16_t low, last, span;
    std::uint16_t scale, inverse;  // of what is above `low`, to 16 bits; 2^31 / (scale * span)
};

line line_over(std::size_t low, std::size_t span)
{
    std::uint32_t scale = 1;
    while (span * scale * 2 <= 65536) scale *= 2;
    return {.low = static_cast<std::uint16_t>(low),
            .last = static_cast<std::uint16_t>(low + span - (span * scale == 65536 ? 1 : 0)),
            .span = static_cast<std::uint16_t>(span),
            .scale = static_cast<std::uint16_t>(scale),
            .inverse = static_cast<std::uint16_t>(
                std::min<std::size_t>((1UL << 31U) / (span * scale) + 1, 65535))};
}

// All in 16 bits, of which a register holds the most: the product with the inverse is never too
// small and at most 1 too large, which the sign of the remainder tells.
inline std::uint8_t value_on(const line &of, std::uint16_t sample)
{
    const std::uint16_t inside = std::max(std::min(sample, of.last), of.low);
    const auto above = static_cast<std::uint16_t>(inside - of.low);
    const auto scaled = static_cast<std::uint16_t>(above * of.scale);
    const auto product = static_cast<std::uint16_t>(std::uint32_t{scaled} * of.inverse >> 16U);
    const auto about = static_cast<std::uint16_t>(product >> 7U);
    const auto remainder = static_cast<std::uint16_t>((above << 8U) - about * of.span);
    const auto value = static_cast<std::uint16_t>(about - (remainder >> 15U));
    return static_cast<std::uint8_t>(std::min<std::uint16_t>(value, 255));
}

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

}  // namespace

sample_counts &new_counts()
{
    static sample_counts counts;
    std::fill_n(counts.begin(), VALUES, 0U);
    return counts;
}

FOR_EACH_PROCESSOR void exchange_by_hand(const std::uint8_t *from, std::uint16_t *to,
                                         std::size_t count)
{
    for (std::size_t i = 0; i < count; ++i) {
        std::uint16_t sample;
        std::memcpy(&sample, from + 2 * i, sizeof sample);
        to[i] = static_cast<std::uint16_t>(sample << 8U | sample >> 8U);
    }
}

void count_by_hand(const std::uint16_t *from, std::size_t first, std::size_t count,
                   sample_counts &counts)
{
    for (std::size_t i = (4 - first % 4) % 4; i < count; i += 4) ++counts[from[i]];
}

FOR_EACH_PROCESSOR void fill_table(std::uint8_t *table, double low, double gain)
{
    for (int i = 0; i < static_cast<int>(VALUES); ++i) {
        const double value = std::min(std::max((i - low) * gain, 0.0), 4095.0);
        table[i] = static_cast<std::uint8_t>(static_cast<int>(value) >> 4);
    }
}

FOR_EACH_PROCESSOR void map_along(const line &given, const std::uint16_t *from, std::size_t count,
                                  std::uint8_t *to)
{
    const line of = given;  // which no store can change
    for (std::size_t i = 0; i < count; ++i) to[i] = value_on(of, from[i]);
}

void stretch_by_hand(const std::uint16_t *from, std::size_t count, sample_counts &counts,
                     std::uint8_t *to)
{
    static const auto all_samples = [] {
        std::array<std::uint16_t, VALUES> samples{};
        std::iota(samples.begin(), samples.end(), std::uint16_t{0});
        return samples;
    }();
    counts[0] = 0;  // the fill
    const auto [low, high] = find_cut(counts);
    const double gain = high != low ? 4096.0 / static_cast<double>(high - low) : 1.0;
    std::array<std::uint8_t, VALUES> table, divided;
    fill_table(table.data(), static_cast<double>(low), gain);

    // What is divided exactly and what comes of rounded factors may differ in a few entries.
    const line of = line_over(low, high != low ? high - low : VALUES);
    map_along(of, all_samples.data(), VALUES, divided.data());
    if (divided == table)
        map_along(of, from, count, to);
    else
        for (std::size_t i = 0; i < count; ++i)
            to[i] = table[std::min(from[i], all_samples.back())];
}
