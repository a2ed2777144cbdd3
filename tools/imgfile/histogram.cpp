// Counting samples, and what follows from the counts. Read histogram.h first.
#include "histogram.h"

#include "walk.h"

#include "common/grouped.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <numeric>
#include <string>

std::uint64_t band_histogram::total() const
{
    return std::accumulate(counts.begin(), counts.end(), std::uint64_t{0});
}

std::int32_t band_histogram::lowest() const
{
    const auto found = std::ranges::find_if(counts, [](std::uint64_t count) { return count != 0; });
    return static_cast<std::int32_t>(found - counts.begin());
}

std::int32_t band_histogram::highest() const
{
    const auto found = std::find_if(counts.rbegin(), counts.rend(),
                                    [](std::uint64_t count) { return count != 0; });
    return static_cast<std::int32_t>(counts.rend() - found) - 1;
}

double band_histogram::mean() const
{
    double sum = 0;
    for (std::size_t value = 0; value < counts.size(); ++value)
        sum += static_cast<double>(value) * static_cast<double>(counts[value]);
    return sum / static_cast<double>(total());
}

double band_histogram::deviation() const
{
    const double middle = mean();
    double sum = 0;
    for (std::size_t value = 0; value < counts.size(); ++value) {
        const double distance = static_cast<double>(value) - middle;
        sum += distance * distance * static_cast<double>(counts[value]);
    }
    return std::sqrt(sum / static_cast<double>(total()));
}

double band_histogram::share_of_zero() const
{
    return static_cast<double>(counts[0]) / static_cast<double>(total());
}

std::uint64_t band_histogram::beyond() const
{
    const std::size_t known =
        std::min(counts.size(), std::size_t{1} << static_cast<unsigned>(nbits));
    return std::accumulate(counts.begin() + static_cast<std::ptrdiff_t>(known), counts.end(),
                           std::uint64_t{0});
}

std::vector<band_histogram> measure_histograms(image_reader &reader)
{
    const shape &form = reader.form;
    const band_list bands = reader.all_bands();
    std::vector<band_histogram> histograms;
    for (const std::int32_t band : bands)
        histograms.push_back({band, form.nbits,
                              std::vector<std::uint64_t>(form.nbytes == 1 ? 256 : 65536),
                              band_stretch(form.nbits)});
    walk(reader, form.whole(), bands, {}, [&](const window &piece, const block &samples) {
        samples.for_each_row([&](std::int32_t band, std::int32_t, const auto *row) {
            auto &counts = histograms[static_cast<std::size_t>(band)].counts;
            for (std::int32_t i = 0; i < samples.nsamps; ++i) ++counts[row[i]];
        });
        for (band_histogram &each : histograms) each.stretch.count(samples, each.band, piece.samp);
    });
    for (band_histogram &each : histograms) each.stretch.finish();
    return histograms;
}

void print_histogram(const band_histogram &histogram, std::int32_t nrows)
{
    const std::int32_t low = histogram.lowest(), high = histogram.highest();
    const std::int32_t step = (high - low) / nrows + 1;
    std::vector<std::uint64_t> rows;
    for (std::int32_t first = low; first <= high; first += step) {
        const auto begin = histogram.counts.begin() + first;
        rows.push_back(
            std::accumulate(begin, begin + std::min(step, high - first + 1), std::uint64_t{0}));
    }
    const std::uint64_t most = std::ranges::max(rows);
    for (std::size_t i = 0; i < rows.size(); ++i) {
        const std::int32_t first = low + static_cast<std::int32_t>(i) * step;
        // Rounded up: a range that holds any sample has a mark.
        const auto length = (rows[i] * 50 + most - 1) / most;
        std::printf("  %5d..%-5d |%-50s| %s\n", first, std::min(first + step - 1, high),
                    std::string(length, '#').c_str(),
                    grouped(static_cast<std::int64_t>(rows[i])).c_str());
    }
}
