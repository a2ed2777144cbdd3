// Finding and applying ramps. The arithmetic is in 16 bits, which fill vector registers best; a
// ramp counts only if it gives exactly the table, entry by entry. Read ramp.h first.
#include "chain/ramp.h"

#include "base/multiversion.h"

#include <algorithm>
#include <cstring>

namespace {

constexpr std::uint32_t TOP = 255;
constexpr std::int32_t MAX_SIZE = 4096;  // for more entries a ramp takes more than 16 bits

// The product with the inverse is the quotient, or one more: then the remainder is negative.
inline std::uint8_t value_at(const img_chain_ramp &ramp, std::uint16_t sample)
{
    const std::uint16_t inside = std::max(std::min(sample, ramp.last), ramp.low);
    const auto above = static_cast<std::uint16_t>(inside - ramp.low);
    const auto scaled = static_cast<std::uint16_t>(above * ramp.scale);
    const auto product = static_cast<std::uint16_t>(std::uint32_t{scaled} * ramp.inverse >> 16U);
    const auto estimate = static_cast<std::uint16_t>(product >> 7U);
    const auto remainder =
        static_cast<std::uint16_t>((above << 8U) - estimate * ramp.span - ramp.bias);
    const auto value = static_cast<std::int16_t>(estimate - (remainder >> 15U));
    return static_cast<std::uint8_t>(
        std::clamp<std::int16_t>(value, 0, static_cast<std::int16_t>(TOP)));
}

// Returns the ramp that reaches its end `span` above `low`.
img_chain_ramp ramp_over(std::uint32_t low, std::uint32_t span, std::uint32_t bias,
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
            .bias = static_cast<std::uint16_t>(bias)};
}

// Returns the index of the first entry of at least `value`, `size` if none is. In a table that is
// not sorted the index is arbitrary, but does not fall as `value` rises.
std::uint32_t first_reaching(std::uint32_t value, const std::uint16_t *table, std::uint32_t size)
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
    const img_chain_ramp ramp = given;  // local copy: cannot alias the output
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
    // A ramp reaches value v at v / 256 of its span above its low end, rounded up. The places where
    // the table reaches 1 and 255 give the span, except for its rounding.
    const std::uint32_t one = first_reaching(1, table, nentries);
    const std::uint32_t top = first_reaching(TOP, table, nentries);
    const std::uint32_t estimate = top - one + 2 * ((top - one) / (TOP - 1)) + 1;
    for (const std::uint32_t span : {estimate, estimate - 1, estimate + 1}) {
        for (const std::uint32_t bias : {0U, 1U}) {
            const std::uint32_t rise_to_one = (span + TOP + bias) / (TOP + 1);
            if (span == 0 || rise_to_one > one) continue;
            *ramp = ramp_over(one - rise_to_one, span, bias, size);
            if (compare(*ramp, table, nentries) == 0) return true;
        }
    }
    return false;
}

IMG_MULTIVERSION void img_chain_map_ramp(const std::uint8_t *source, std::uint8_t *target,
                                         std::size_t count, const img_chain_ramp &ramp)
{
    const img_chain_ramp own = ramp;  // local copy: cannot alias the output
    for (std::size_t i = 0; i < count; ++i) {
        std::uint16_t sample;
        std::memcpy(&sample, source + i * sizeof sample, sizeof sample);
        target[i] = value_at(own, sample);
    }
}
