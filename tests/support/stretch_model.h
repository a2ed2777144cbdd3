// The stretch of two-byte samples once more, as plainly as it can be said.
#ifndef IMG_TEST_STRETCH_MODEL_H
#define IMG_TEST_STRETCH_MODEL_H

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <utility>
#include <vector>

using samples = std::vector<std::uint16_t>;
using counters = std::vector<std::uint32_t>;

// The first bin that counts and the first behind that no longer does, for 1 to 16 bits.
inline constexpr std::pair<std::size_t, std::size_t> COUNTING_BINS[] = {
    {0, 2},     {0, 4},      {0, 7},       {0, 15},     {0, 31},    {0, 63},
    {0, 126},   {1, 253},    {2, 506},     {5, 1013},   {10, 2027}, {20, 4055},
    {41, 8110}, {81, 16220}, {163, 32440}, {327, 64880}};

// The table for a histogram of 1 << `bits_in` counters.
inline samples expected_stretch(const counters &histogram, int bits_in, int bits_out)
{
    const auto [first, end] = COUNTING_BINS[bits_in - 1];
    std::uint32_t total = 0;
    for (std::size_t bin = first; bin < end; ++bin) total += histogram[bin];
    std::uint32_t count = histogram[first];  // and again below: the first bin counts twice
    const auto cut = [&](std::size_t bin, double share) {
        while (count < static_cast<std::uint32_t>(total * share)) count += histogram[bin++];
        return bin;
    };
    const std::size_t low = cut(first, 0.005);
    const std::size_t high = cut(low, 0.99);
    const auto size = static_cast<double>(histogram.size());
    const double gain = high == low ? 1.0 : size / static_cast<double>(high - low);

    samples lut;
    for (std::size_t value = 0; value < histogram.size(); ++value) {
        const double above = static_cast<double>(value) - static_cast<double>(low);
        const double rescaled =
            std::floor(std::ldexp(std::trunc(above * gain), bits_out - bits_in));
        lut.push_back(static_cast<std::uint16_t>(std::clamp(rescaled, 0.0, (1 << bits_out) - 1.0)));
    }
    return lut;
}

// The table for a window: every fourth sample of each line counts, but not the fill.
inline samples expected_stretch(const samples &window, std::int32_t nsamps, std::uint16_t fill,
                                int bits_in, int bits_out)
{
    counters histogram(std::size_t{1} << bits_in);
    for (std::size_t i = 0; i < window.size(); ++i)
        if (i % static_cast<std::size_t>(nsamps) % 4 == 0 && window[i] != fill &&
            window[i] < histogram.size())
            ++histogram[window[i]];
    return expected_stretch(histogram, bits_in, bits_out);
}

#endif
