// imgfile convert: an image, or a part of it, in another format.
#include "band_stretch.h"
#include "commands.h"
#include "failure.h"
#include "output.h"
#include "walk.h"

#include <algorithm>
#include <charconv>

namespace {

// Splits "1,2,3" or "64x128"; throws wrong_usage unless it is made of whole numbers, 0 or more.
std::vector<std::int32_t> parse_numbers(const std::string &option, const std::string &from,
                                        char between)
{
    std::vector<std::int32_t> numbers;
    const char *at = from.data(), *const end = at + from.size();
    for (;;) {
        std::int32_t number = -1;
        const auto [next, error] = std::from_chars(at, end, number);
        if (error != std::errc() || number < 0 || (next != end && *next != between))
            throw wrong_usage(text(option, ": \"", from, "\" is not understood"));
        numbers.push_back(number);
        if (next == end) return numbers;
        at = next + 1;
    }
}

window parse_window(const std::optional<std::string> &from, const std::string &name,
                    const shape &form)
{
    if (!from) return whole(form);
    const auto numbers = parse_numbers("--window", *from, ',');
    if (numbers.size() != 4) throw wrong_usage("--window takes LINE,SAMP,NLINES,NSAMPS");
    const window part{numbers[0], numbers[1], numbers[2], numbers[3]};
    if (part.nlines < 1 || part.nsamps < 1) throw wrong_usage("--window is empty");
    if (std::int64_t{part.line} + part.nlines > form.nlines ||
        std::int64_t{part.samp} + part.nsamps > form.nsamps)
        throw failure(name, text("has no window ", *from, ": it has ", form.nlines, " lines x ",
                                 form.nsamps, " samples"));
    return part;
}

}  // namespace

tile_size parse_tile(const std::string &from)
{
    if (from == "none") return {};
    const auto sides = parse_numbers("--tile", from, 'x');
    if (sides.size() > 2 || sides.front() == 0 || sides.back() == 0)
        throw wrong_usage("--tile takes none, N, or NxM (lines x samples)");
    return {sides.front(), sides.back()};
}

band_list parse_bands(const std::optional<std::string> &from, const image_reader &image,
                      const band_list &otherwise)
{
    if (!from) return otherwise;
    band_list bands = parse_numbers("--band", *from, ',');
    for (const std::int32_t band : bands)
        if (band >= image.form.nbands)
            throw failure(image.name, text("has no band ", band, ": it has ", image.form.nbands,
                                           ", counted from 0"));
    return bands;
}

int run_convert(const convert_options &asked)
{
    const file_format format = format_of_output(asked.out, asked.format, "--format");
    const tile_size tiles = parse_tile(asked.tile);
    const auto in = open_image(asked.in);
    const window part = parse_window(asked.window, in->name, in->form);
    const band_list bands = parse_bands(asked.bands, *in, in->all_bands());

    output_file out(asked.out, asked.overwrite, asked.in == "-" ? "" : asked.in);
    shape form{part.nlines, part.nsamps, static_cast<std::int32_t>(bands.size()), in->form.nbytes,
               in->form.nbits};
    std::vector<stretch> stretches;
    if (asked.stretch) {
        form.nbytes = 1;
        form.nbits = 8;
    }
    auto writer = create_image(out, format, form, tiles);
    if (asked.stretch) stretches = measure_stretches(*open_image(asked.in), part, bands);

    // Where samples are said to have fewer bits than they may have, in either file.
    const std::int32_t nbits = format == file_format::vitec && !asked.stretch
                                   ? std::min(in->form.nbits, 12)
                                   : in->form.nbits;
    std::int64_t beyond = 0;
    walk(*in, part, bands, *writer, [&](const window &place, const block &samples) {
        if (in->form.nbytes == 2 && nbits < 16) beyond += count_beyond(samples, (1 << nbits) - 1);
        writer->write(place, asked.stretch ? stretched(samples, stretches) : samples);
    });
    const std::int64_t length = writer->finish();
    writer.reset();
    out.commit(length);
    if (!in->remark.empty()) note(in->name, in->remark);
    if (beyond != 0)
        note(in->name, text(grouped(beyond), " samples lie beyond ", nbits, " bits; they were ",
                            asked.stretch ? "mapped as the highest value" : "kept as they are"));
    return 0;
}
