// Choosing windows, and comparing their samples one by one. Read comparison.h first.
#include "comparison.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <stdexcept>
#include <utility>
#include <vector>

namespace {

constexpr std::uint8_t fill = 77;  // of samples outside the picture

void compare(tally &seen, int expected, int found, const char *what, std::int32_t band,
             std::int32_t line, std::int32_t samp)
{
    ++seen.nsamples;
    if (expected == found) return;
    if (seen.nunequal++ == 0)
        seen.first_unequal = std::string(what) + " at band " + std::to_string(band) + ", line " +
                             std::to_string(line) + ", sample " + std::to_string(samp) + ": " +
                             std::to_string(found) + " instead of " + std::to_string(expected);
}

bool inside(const picture &source, std::int32_t line, std::int32_t samp)
{
    return line >= 0 && line < source.nlines && samp >= 0 && samp < source.nsamps;
}

std::vector<window> choose_windows(const picture &source)
{
    const std::int32_t lines = source.nlines, samps = source.nsamps;
    const std::int32_t high = std::min(lines, 101), wide = std::min(samps, 143);
    std::vector<window> chosen;
    for (const std::int32_t line : {-high / 2, (lines - high) / 2, lines - high / 2})
        for (const std::int32_t samp : {-wide / 2, (samps - wide) / 2, samps - wide / 2})
            chosen.push_back({line, samp, high, wide});
    for (const auto &[line, samp] : {std::pair{-high, 0}, {lines, 0}, {0, -wide}, {0, samps}})
        chosen.push_back({line, samp, high, wide});
    for (std::int32_t line = -50; line < lines; line += 300)
        for (std::int32_t samp = -70; samp < samps; samp += 500)
            chosen.push_back({line, samp, 300, 500});
    chosen.push_back({-1, -1, lines + 2, samps + 2});
    return chosen;
}

std::vector<std::uint8_t> load(img_handle image, const window &area, std::int32_t band)
{
    std::vector<std::uint8_t> buffer(static_cast<std::size_t>(area.nsamps) *
                                     static_cast<std::size_t>(area.nlines));
    if (img_load_buffer(image, area.line, area.samp, area.nlines, area.nsamps, band, buffer.data(),
                        area.nsamps, &fill) != 0)
        throw std::runtime_error("a window cannot be read");
    return buffer;
}

// Compares each sample of a loaded window with `expect(sample, found)`; `sample` is the picture's,
// or the fill.
template <typename Expect>
void compare_window(examined &file, const window &area, std::int32_t band,
                    const std::vector<std::uint8_t> &buffer, Expect expect)
{
    auto found = buffer.begin();
    for (std::int32_t line = area.line; line < area.line + area.nlines; ++line) {
        for (std::int32_t samp = area.samp; samp < area.samp + area.nsamps; ++samp, ++found) {
            const bool known = inside(file.source, line, samp);
            const int sample = known ? file.source.sample(band, line, samp) : fill;
            compare(file.seen, expect(sample, *found), *found, "window", band, line, samp);
        }
    }
}

void check_stretched(examined &file, const window &area, std::int32_t band, img_handle twin)
{
    constexpr int brightest = 4095, unknown = -1;  // also for samples beyond 12 bits
    const std::vector<std::uint8_t> buffer = load(file.image, area, band);
    std::array<int, brightest + 1> shown{};
    shown.fill(unknown);
    compare_window(file, area, band, buffer, [&](int sample, int found) {
        int &expected = shown[static_cast<std::size_t>(std::min(sample, brightest))];
        if (expected == unknown) expected = found;
        return expected;
    });
    const auto last = std::remove(shown.begin(), shown.end(), unknown);
    const auto darker = std::is_sorted_until(shown.begin(), last);
    if (darker != last)
        compare(file.seen, *(darker - 1), *darker, "order of a stretch", band, area.line,
                area.samp);
    if (twin != -1 && load(twin, area, band) != buffer)
        compare(file.seen, 1, 0, "equality with the untiled image", band, area.line, area.samp);
}

}  // namespace

image_closer::image_closer(img_handle handle) : m_handle{handle}
{
    if (handle == -1) throw std::runtime_error("cannot be opened or created");
}

void check_description(examined &file, std::int32_t type, std::int32_t tile)
{
    std::int32_t nlines = -1, nsamps = -1, tile_nsamps = -1, tile_nlines = -1;
    if (img_query_dimension(file.image, &nlines, &nsamps) != 0 ||
        img_query_tile_size(file.image, &tile_nsamps, &tile_nlines) != 0)
        throw std::runtime_error("its sizes cannot be queried");
    if (nlines != file.source.nlines || nsamps != file.source.nsamps || tile_nsamps != tile ||
        tile_nlines != tile || img_query_num_bands(file.image) != file.source.nbands ||
        img_query_image_type(file.image) != type)
        throw std::runtime_error("its description differs from how it was created");
}

void check_windows(examined &file, img_handle twin)
{
    for (const window &area : choose_windows(file.source)) {
        for (std::int32_t band = 0; band < file.source.nbands; ++band) {
            if (file.source.nbytes == 2)
                check_stretched(file, area, band, twin);
            else
                compare_window(file, area, band, load(file.image, area, band),
                               [](int sample, int) { return sample; });
            ++file.seen.nwindows;
        }
    }
}

void check_tiles(examined &file, std::int32_t tile)
{
    const picture &source = file.source;
    const std::int32_t across = (source.nsamps + tile - 1) / tile;
    const std::int32_t down = (source.nlines + tile - 1) / tile;
    std::vector<std::uint8_t> run(static_cast<std::size_t>(across) *
                                  static_cast<std::size_t>(tile * tile * source.nbytes));
    for (std::int32_t row = 0; row < down * source.nbands; ++row) {
        const std::int32_t band = row % source.nbands, first_line = row / source.nbands * tile;
        if (img_load_tiles(file.image, first_line / tile * across, across, band, run.data()) != 0)
            throw std::runtime_error("its tiles cannot be read");
        auto byte = run.begin();
        for (std::int32_t i = 0; i < across * tile * tile; ++i) {
            const std::int32_t line = first_line + i / tile % tile;
            const std::int32_t samp = i / (tile * tile) * tile + i % tile;
            int found = *byte++;
            if (source.nbytes == 2) found = found << 8 | *byte++;  // tiles hold the high byte first
            const int expected = inside(source, line, samp) ? source.sample(band, line, samp) : 0;
            compare(file.seen, expected, found, "tile", band, line, samp);
        }
        file.seen.ntiles += across;
    }
}
