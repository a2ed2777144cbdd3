#include "chain/ramp.h"

#include "api/multiversion.h"

#include <algorithm>
#include <cstring>

namespace {

constexpr std::uint32_t TOP = 255;
constexpr std::int32_t MAX_SIZE = 4096;  // for more entries a ramp takes more than 16 bits

// All in 16 bits, of which a register holds the most. The product with the inverse is the quotient,
// or one more: then the remainder is negative.
inline std::uint8_t value_at(const img_chain_ramp &ramp, std::uint16_t sample)
{
    const std::uint16_t inside = std::max(std::min(sample, ramp.last), ramp.low);
    const auto above = static_cast<std::uint16_t>(inside - ramp.low);
    const auto scaled = static_cast<std::uint16_t>(above * ramp.scale);
    const auto product = static_cast<std::uint16_t>(std::uint32_t{scaled} * ramp.inverse >> 16U);
    const auto about = static_cast<std::uint16_t>(product >> 7U);
    const auto remainder =
        static_cast<std::uint16_t>((above << 8U) - about * ramp.span - ramp.late);
    const auto value = static_cast<std::int16_t>(about - (remainder >> 15U));
    return static_cast<std::uint8_t>(
        std::clamp<std::int16_t>(value, 0, static_cast<std::int16_t>(TOP)));
}

// Returns the ramp that reaches its end `span` above `low`.
img_chain_ramp ramp_over(std::uint32_t low, std::uint32_t span, std::uint32_t late,
                         std::int32_t size)
{
    std::uint32_t scale = 1;
    while (span * scale * 2 <= 65536) scale *= 2;
    const std::uint32_t end = low + span - (span * scale == 65536 ? 1 : 0);
    const std::uint32_t inverse = (std::uint32_t{1} << 31U) / (span * scale) + 1;
    return {.low = static_cast<std::uint16_t>(low),
            .last = static_cast<std::uint16_t>(std::min(end, static_cast<std::uint32_t>(size) - 1)),
            .span = static_cast<std::uint16_t>(span),
            .scale = static_cast<std::uint16_t>(scale),
            .inverse = static_cast<std::uint16_t>(std::min(inverse, 65535U)),
            .late = static_cast<std::uint16_t>(late)};
}

// Returns the first of the entries that has reached `value`; the number of entries: none has. In a
// table that falls somewhere it is any of them, but not before the one of a lower value.
std::uint32_t first_of(std::uint32_t value, const std::uint16_t *table, std::uint32_t size)
{
    std::uint32_t first = 0;
    for (std::uint32_t end = size; first < end;) {
        const std::uint32_t middle = (first + end) / 2;
        if (table[middle] < value)
            first = middle + 1;
        else
            end = middle;
    }
    return first;
}

// Returns 0 when the ramp equals the table.
IMG_MULTIVERSION std::uint32_t compare(const img_chain_ramp &given, const std::uint16_t *table,
                                       std::uint32_t size)
{
    const img_chain_ramp ramp = given;  // which no store can change
    std::uint32_t differences = 0;
    for (std::uint32_t i = 0; i < size; ++i)
        differences |= std::uint32_t{table[i]} ^ value_at(ramp, static_cast<std::uint16_t>(i));
    return differences;
}

}  // namespace

bool img_chain_find_ramp(const std::uint16_t *table, std::int32_t size, img_chain_ramp *ramp)
{
    if (size > MAX_SIZE) return false;
    const auto nentries = static_cast<std::uint32_t>(size);
    // A ramp reaches value v at v / 256 of its span above its low end, rounded up. Where the table
    // reaches 1 and 255 tells the span but for its rounding.
    const std::uint32_t one = first_of(1, table, nentries);
    const std::uint32_t top = first_of(TOP, table, nentries);
    const std::uint32_t about = top - one + 2 * ((top - one) / (TOP - 1)) + 1;
    for (const std::uint32_t span : {about, about - 1, about + 1}) {
        for (const std::uint32_t late : {0U, 1U}) {
            const std::uint32_t up_to_one = (span + TOP + late) / (TOP + 1);
            if (span == 0 || up_to_one > one) continue;
            *ramp = ramp_over(one - up_to_one, span, late, size);
            if (compare(*ramp, table, nentries) == 0) return true;
        }
    }
    return false;
}

IMG_MULTIVERSION void img_chain_map_ramp(const std::uint8_t *from, std::uint8_t *to,
                                         std::size_t count, const img_chain_ramp &ramp)
{
    const img_chain_ramp own = ramp;  // which no store can change
    for (std::size_t i = 0; i < count; ++i) {
        std::uint16_t sample;
        std::memcpy(&sample, from + i * sizeof sample, sizeof sample);
        to[i] = value_at(own, sample);
    }
}
