#include "chain/line.h"

#include "api/multiversion.h"

#include <algorithm>
#include <cstring>

namespace {

constexpr std::uint32_t TOP = 255;
constexpr std::int32_t MAX_SIZE = 4096;  // for more entries a line takes more than 32 bits

inline std::uint8_t value_at(const img_chain_line &line, std::uint16_t sample)
{
    const std::uint16_t inside = std::max(std::min(sample, line.last), line.low);
    const auto above_low = static_cast<std::uint16_t>(inside - line.low);
    const std::uint32_t value = std::min(above_low, line.rise) * line.multiplier >> line.shift;
    return static_cast<std::uint8_t>(std::min(value, TOP));
}

// Returns the line that reaches its end `span` above `low`. Its multiplier, a fraction, is taken
// `off` too large.
img_chain_line line_over(std::uint32_t low, std::uint32_t span, std::uint32_t rise,
                         std::uint32_t off, std::int32_t size)
{
    const std::uint32_t shift = span > 2048 ? 24 : 23;
    const auto multiplier = static_cast<std::uint32_t>((std::uint64_t{256} << shift) / span);
    return {.last = static_cast<std::uint16_t>(size - 1),
            .low = static_cast<std::uint16_t>(low),
            .rise = static_cast<std::uint16_t>(rise),
            .multiplier = multiplier + off,
            .shift = shift};
}

}  // namespace

// Returns 0 when the line equals the table.
IMG_MULTIVERSION std::uint32_t
img_chain_compare_line(const img_chain_line &given, const std::uint16_t *table, std::uint32_t size)
{
    const img_chain_line line = given;  // which no store can change
    std::uint32_t differences = 0;
    for (std::uint32_t i = 0; i < size; ++i)
        differences |= std::uint32_t{table[i]} ^ value_at(line, static_cast<std::uint16_t>(i));
    return differences;
}

bool img_chain_find_line(const std::uint16_t *table, std::int32_t size, img_chain_line *line)
{
    if (size > MAX_SIZE) return false;
    const auto first_of = [=](std::uint32_t value) {
        const auto *const found = std::lower_bound(table, table + size, value);
        return static_cast<std::uint32_t>(found - table);
    };
    // A line reaches value v at v / 256 of its span above its low end, rounded up. Where the table
    // reaches 1 and 255 tells the span but for its rounding.
    const std::uint32_t one = first_of(1);
    const std::uint32_t top = first_of(TOP);
    const std::uint32_t about = top - one + 2 * ((top - one) / (TOP - 1)) + 1;
    for (const std::uint32_t span : {about, about - 1, about + 1}) {
        const std::uint32_t up_to_one = (span + TOP) / (TOP + 1);
        if (span == 0 || up_to_one > one) continue;
        for (const std::uint32_t off : {1U, 0U}) {
            const std::uint32_t low = one - up_to_one;
            *line = line_over(low, span, top - low, off, size);
            if (img_chain_compare_line(*line, table, static_cast<std::uint32_t>(size)) == 0)
                return true;
        }
    }
    return false;
}

IMG_MULTIVERSION void img_chain_map_line(const std::uint8_t *from, std::uint8_t *to,
                                         std::size_t count, const img_chain_line &line)
{
    const img_chain_line own = line;  // which no store can change
    for (std::size_t i = 0; i < count; ++i) {
        std::uint16_t sample;
        std::memcpy(&sample, from + i * sizeof sample, sizeof sample);
        to[i] = value_at(own, sample);
    }
}
