// imgfile convert: an image, or a part of it, in another format. Read codecs/image.h and walk.h
// first.
#include "band_stretch.h"
#include "codecs/output_format.h"
#include "codecs/recognise.h"
#include "commands/arguments.h"
#include "commands/commands.h"
#include "failure.h"
#include "notes.h"
#include "output_file.h"
#include "walk.h"

#include "base/img_desc.h"
#include "common/grouped.h"

#include <algorithm>

int run_convert(const convert_options &options)
{
    const file_format format = format_of_output(options.out, options.format, "--format");
    const tile_size tiles = parse_tile(options.tile);
    const auto in = open_reader(options.in);
    const window part = parse_window(options.window, *in);
    const band_list bands = parse_bands(options.bands, *in, in->all_bands());

    output_file out(options.out, options.overwrite, in->identity);
    shape form{part.nlines, part.nsamps, static_cast<std::int32_t>(bands.size()), in->form.nbytes,
               in->form.nbits};
    if (options.stretch) {
        form.nbytes = 1;
        form.nbits = 8;
    }
    auto writer = create_writer(out, format, form, tiles);
    std::vector<band_stretch> stretches;
    if (options.stretch) stretches = measure_stretches(*in, part, bands);

    // The fewest bits that either file states for a sample.
    const std::int32_t nbits = format == file_format::vitec && !options.stretch
                                   ? std::min(in->form.nbits, IMG_TWO_BYTE_BITS)
                                   : in->form.nbits;
    std::int64_t beyond = 0;
    walk(*in, part, bands, *writer, [&](const window &piece, const block &samples) {
        if (in->form.nbytes == 2 && nbits < 16) beyond += count_beyond(samples, (1 << nbits) - 1);
        writer->write(piece, options.stretch ? stretched(samples, stretches) : samples);
    });
    const std::int64_t length = writer->finish();
    writer.reset();
    out.commit(length);
    if (!in->remark.empty()) note(in->name, in->remark);
    if (beyond != 0)
        note(in->name, text(grouped(beyond), " samples lie beyond ", nbits, " bits; they were ",
                            options.stretch ? "mapped as the highest value" : "kept as they are"));
    return 0;
}
