// How often each value occurs in a band, and what follows from it.
#ifndef TOOL_HISTOGRAM_H
#define TOOL_HISTOGRAM_H

#include "band_stretch.h"
#include "image.h"

#include <cstdint>
#include <string>
#include <vector>

struct band_histogram {
    std::int32_t band;
    std::int32_t nbits;                 // that samples are said to have
    std::vector<std::uint64_t> counts;  // by value, all that one or two bytes can hold
    stretch spread;                     // of the whole band

    std::uint64_t total() const;
    // Of samples at all: total() is not 0.
    std::int32_t lowest() const;
    std::int32_t highest() const;
    double mean() const;
    double deviation() const;  // of the population
    std::uint64_t beyond() const;
};

// Reads all bands of an image.
std::vector<band_histogram> measure_histograms(image_reader &image);

// Lines of text: as many ranges of values, and a bar for each.
void print_histogram(const band_histogram &of, std::int32_t nrows);

// A picture in PNG format of the histograms and of their stretches, in memory.
std::string draw_histograms(const std::vector<band_histogram> &of, const std::string &title);

#endif
