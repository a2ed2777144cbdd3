// How often each sample value occurs in a band.
#ifndef TOOL_HISTOGRAM_H
#define TOOL_HISTOGRAM_H

#include "band_stretch.h"
#include "codecs/image.h"

#include <cstdint>
#include <vector>

struct band_histogram {
    std::int32_t band;
    std::int32_t nbits;                 // stated for a sample
    std::vector<std::uint64_t> counts;  // one for each value that one or two bytes can hold
    band_stretch stretch;               // of the whole band

    std::uint64_t total() const;
    // These require that total() is not 0.
    std::int32_t lowest() const;
    std::int32_t highest() const;
    double mean() const;
    double deviation() const;      // of the population
    double share_of_zero() const;  // 0 to 1
    std::uint64_t beyond() const;  // samples above the highest value of nbits bits
};

// Reads all bands of an image.
std::vector<band_histogram> measure_histograms(image_reader &reader);

// Prints a bar for each of `nrows` ranges of values, or fewer.
void print_histogram(const band_histogram &histogram, std::int32_t nrows);

#endif
