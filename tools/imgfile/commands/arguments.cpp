// Parsing lists of numbers. Read arguments.h first.
#include "commands/arguments.h"

#include "failure.h"

#include <charconv>
#include <vector>

namespace {

// Splits "1,2,3" or "64x128"; throws wrong_usage unless it consists of integers, 0 or more.
std::vector<std::int32_t> parse_numbers(const std::string &option, const std::string &argument,
                                        char separator)
{
    std::vector<std::int32_t> numbers;
    const char *position = argument.data(), *const end = position + argument.size();
    for (;;) {
        std::int32_t number = -1;
        const auto [next, error] = std::from_chars(position, end, number);
        if (error != std::errc() || number < 0 || (next != end && *next != separator))
            throw wrong_usage(text(option, ": invalid value \"", argument, "\""));
        numbers.push_back(number);
        if (next == end) return numbers;
        position = next + 1;
    }
}

}  // namespace

tile_size parse_tile(const std::string &argument)
{
    if (argument == "none") return {};
    const auto sides = parse_numbers("--tile", argument, 'x');
    if (sides.size() > 2 || sides.front() == 0 || sides.back() == 0)
        throw wrong_usage("--tile takes none, N, or NxM (lines x samples)");
    return {sides.front(), sides.back()};
}

band_list parse_bands(const std::optional<std::string> &argument, const image_reader &image,
                      const band_list &fallback)
{
    if (!argument) return fallback;
    band_list bands = parse_numbers("--band", *argument, ',');
    for (const std::int32_t band : bands)
        if (band >= image.form.nbands)
            throw failure(image.name, text("has no band ", band, ": it has ", image.form.nbands,
                                           ", counted from 0"));
    return bands;
}

window parse_window(const std::optional<std::string> &argument, const image_reader &image)
{
    const shape &form = image.form;
    if (!argument) return form.whole();
    const auto numbers = parse_numbers("--window", *argument, ',');
    if (numbers.size() != 4) throw wrong_usage("--window takes LINE,SAMP,NLINES,NSAMPS");
    const window part{numbers[0], numbers[1], numbers[2], numbers[3]};
    if (part.nlines < 1 || part.nsamps < 1) throw wrong_usage("--window is empty");
    if (std::int64_t{part.line} + part.nlines > form.nlines ||
        std::int64_t{part.samp} + part.nsamps > form.nsamps)
        throw failure(image.name, text("has no window ", *argument, ": it has ", form.nlines,
                                       " lines x ", form.nsamps, " samples"));
    return part;
}
