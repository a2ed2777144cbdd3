// The linear contrast stretch: a histogram of the window, its low and high cut, and the table that
// spreads the values between them. All arithmetic that decides an entry is in double precision and
// in a fixed order, so that every build gives the same bytes. Read stretch.h first.
#include "chain/stretch.h"

#include "base/count.h"
#include "base/multiversion.h"
#include "base/report.h"

#include <algorithm>
#include <cstring>

namespace {

constexpr std::int32_t MAX_BITS = 16;

bool is_stretch_width(std::int32_t bits)
{
    return bits >= 1 && bits <= MAX_BITS;
}

// Samples beyond the stated bits are counted behind the histogram, for a branch would be
// mispredicted. They take turns with four counters: with one, each increment would wait for the one
// before.
constexpr std::size_t SPARE_COUNTERS = 4;

// Counts every fourth sample of each line in a histogram of `size` counters and the spare ones.
template <typename Sample>
void count_samples(const std::uint8_t *buffer, const img_buffer_def &def, std::uint32_t *histogram,
                   std::size_t size)
{
    constexpr std::size_t step = 4;
    constexpr std::size_t pitch = step * sizeof(Sample);
    const auto count = [histogram, size](const std::uint8_t *sample, std::size_t spare) {
        Sample value;
        std::memcpy(&value, sample, sizeof value);
        ++histogram[std::min<std::size_t>(value, size + spare)];
    };
    const auto line_length = img_count(def.stride) * sizeof(Sample);
    const auto nlines = img_count(std::max(def.nlines, 0));
    const auto ncounted = (img_count(std::max(def.nsamps, 0)) + step - 1) / step;
    for (std::size_t line = 0; line < nlines; ++line) {
        const std::uint8_t *const first = buffer + line * line_length;
        std::size_t i = 0;
        for (; i + 4 <= ncounted; i += 4) {
            const std::uint8_t *const sample = first + i * pitch;
            count(sample, 0);
            count(sample + pitch, 1);
            count(sample + 2 * pitch, 2);
            count(sample + 3 * pitch, 3);
        }
        for (; i < ncounted; ++i) count(first + i * pitch, 0);
    }
}

struct cut {
    std::size_t low, high;  // first and last value of the stretch
};

// Cuts off the lowest half percent and the highest percent of the samples. Only bins within the
// middle 98.5 percent of the value range count towards the total.
cut find_cut(const std::uint32_t *histogram, std::size_t size)
{
    const auto rounded = [size](double share) {
        return static_cast<std::size_t>((static_cast<double>(size) * share * 10.0 + 0.5) / 10.0);
    };
    const std::size_t first = rounded(0.005);
    const std::size_t end = rounded(0.99);
    std::uint32_t total = 0;
    for (std::size_t bin = first; bin < end; ++bin) total += histogram[bin];

    // The first bin counts twice: as the start value and as the first one added.
    std::uint32_t count = histogram[first];
    const auto advance_to = [&](std::size_t bin, double share) {
        const auto wanted = static_cast<std::uint32_t>(total * share);
        while (count < wanted && bin < size) count += histogram[bin++];
        return bin;
    };
    const std::size_t low = advance_to(first, 0.005);
    return {low, advance_to(low, 0.99)};
}

// For an output wider than the input: spreads the values over the wider range.
void fill_widening_stretch(std::uint16_t *lut, std::size_t size, double low, double gain,
                           std::int64_t top)
{
    for (std::size_t i = 0; i < size; ++i) {
        const auto stretched = static_cast<std::int64_t>((static_cast<double>(i) - low) * gain);
        const std::int64_t value = stretched * (top + 1) / static_cast<std::int64_t>(size);
        lut[i] = static_cast<std::uint16_t>(std::clamp<std::int64_t>(value, 0, top));
    }
}

}  // namespace

IMG_MULTIVERSION void img_chain_fill_stretch(std::uint16_t *lut, std::int32_t size, double low,
                                             double gain, std::int32_t shift, std::int32_t top)
{
    const double end = size;  // values beyond it end at the top all the same
    for (std::int32_t i = 0; i < size; ++i) {
        double stretched = (static_cast<double>(i) - low) * gain;
        stretched = stretched > 0.0 ? stretched : 0.0;
        stretched = stretched < end ? stretched : end;
        const std::int32_t value = static_cast<std::int32_t>(stretched) >> shift;
        lut[i] = static_cast<std::uint16_t>(value < top ? value : top);
    }
}

std::int32_t img_chain_create_16to8_lut(void * /*arg*/, const std::uint8_t *buffer,
                                        const img_buffer_def *def, std::uint16_t *lut)
{
    return img_chain_create_stretch_lut_from_buffer(buffer, def, lut, 8);
}

std::int32_t img_chain_create_stretch_lut_from_buffer(const std::uint8_t *buffer,
                                                      const img_buffer_def *def, std::uint16_t *lut,
                                                      std::int32_t bits_out)
{
    const std::int32_t bits_in = def->nbits;
    if (bits_in > MAX_BITS)
        return img_fail("img_chain_create_16to8_lut:image resolution overflow\n");
    const std::size_t size = is_stretch_width(bits_in) ? std::size_t{1} << bits_in : 1;
    const img_chain_lut descriptor{.bits_in = static_cast<std::uint8_t>(bits_in),
                                   .bits_out = static_cast<std::uint8_t>(bits_out),
                                   .size = static_cast<std::int32_t>(size),
                                   .lut = lut,
                                   .owned = 0};
    const img_scratch counters = img_take_scratch((size + SPARE_COUNTERS) * sizeof(std::uint32_t));
    if (!counters) return img_fail_errno("img_chain_create_stretch_lut_from_buffer:calloc");
    auto *const histogram = reinterpret_cast<std::uint32_t *>(counters.get());
    std::fill_n(histogram, size + SPARE_COUNTERS, 0U);
    if (def->nbytes == 2)
        count_samples<std::uint16_t>(buffer, *def, histogram, size);
    else
        count_samples<std::uint8_t>(buffer, *def, histogram, size);
    if (def->fill < size) histogram[def->fill] = 0;
    img_chain_compute_stretch_lut(histogram, bits_in, &descriptor, lut);
    return 0;
}

std::int32_t img_chain_compute_stretch_lut(const std::uint32_t *histogram, std::int32_t bits_in,
                                           const img_chain_lut *descriptor, std::uint16_t *lut)
{
    if (!is_stretch_width(bits_in) || histogram == nullptr)
        return img_fail("img_chain_compute_stretch_lut: Invalid arguments\n");
    if (descriptor != nullptr && descriptor->bits_in != bits_in)
        return img_fail("img_chain_compute_stretch_lut: histogram doesnt match lut bits_in\n");
    const std::int32_t bits_out = descriptor != nullptr ? descriptor->bits_out : bits_in;
    if (bits_out > MAX_BITS) return img_fail("img_chain_compute_stretch_lut: Invalid arguments\n");

    const std::size_t size = std::size_t{1} << bits_in;
    const auto [low, high] = find_cut(histogram, size);
    const double gain =
        high != low ? static_cast<double>(size) / static_cast<double>(high - low) : 1.0;
    const std::int32_t top = (std::int32_t{1} << bits_out) - 1;
    if (bits_out <= bits_in)
        img_chain_fill_stretch(lut, static_cast<std::int32_t>(size), static_cast<double>(low), gain,
                               bits_in - bits_out, top);
    else
        fill_widening_stretch(lut, size, static_cast<double>(low), gain, top);
    return 0;
}
