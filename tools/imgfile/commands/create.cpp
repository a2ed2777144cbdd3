// imgfile create: an image of zeros, or a test pattern. Read codecs/image.h first.
#include "codecs/output_format.h"
#include "commands/arguments.h"
#include "commands/commands.h"
#include "failure.h"
#include "output_file.h"
#include "progress.h"

#include "base/img_desc.h"

#include <algorithm>

namespace {

// Returns a sample of the pattern: a ramp from corner to corner, in another direction for each
// band, and a grid line every 64 lines and samples.
std::int32_t pattern_at(const shape &form, std::int64_t line, std::int64_t samp, std::int32_t band)
{
    const std::int64_t highest = form.highest();
    if (line % 64 == 0 || samp % 64 == 0) return static_cast<std::int32_t>(highest);
    const std::int64_t from_left = band % 2 == 0 ? samp : form.nsamps - 1 - samp;
    const std::int64_t from_top = band % 3 == 1 ? form.nlines - 1 - line : line;
    return static_cast<std::int32_t>((from_left + from_top) * highest /
                                     std::max<std::int64_t>(form.nsamps + form.nlines - 2, 1));
}

void write_pattern(image_writer &writer, const shape &form)
{
    const std::int64_t line_length = std::int64_t{form.nsamps} * form.nbands * form.nbytes;
    const std::int64_t height = std::max<std::int64_t>(writer.tiles.nlines, 1);
    const std::int64_t budget = std::max<std::int64_t>((std::int64_t{4} << 20U) / line_length, 1);
    const auto step =
        static_cast<std::int32_t>(std::max(budget / height * height, std::min(budget, height)));
    progress shown(form.bytes());
    for (std::int64_t top = 0; top < form.nlines; top += step) {
        const auto nlines =
            static_cast<std::int32_t>(std::min<std::int64_t>(step, form.nlines - top));
        block samples(nlines, form.nsamps, form.nbands, form.nbytes);
        for (std::int32_t band = 0; band < form.nbands; ++band)
            for (std::int32_t line = 0; line < nlines; ++line) {
                std::uint8_t *const row = samples.row(band, line);
                for (std::int32_t samp = 0; samp < form.nsamps; ++samp) {
                    const std::int32_t value = pattern_at(form, top + line, samp, band);
                    if (form.nbytes == 1)
                        row[samp] = static_cast<std::uint8_t>(value);
                    else
                        reinterpret_cast<std::uint16_t *>(row)[samp] =
                            static_cast<std::uint16_t>(value);
                }
            }
        writer.write({static_cast<std::int32_t>(top), 0, nlines, form.nsamps}, samples);
        shown.add(static_cast<std::int64_t>(samples.bytes.size()));
    }
}

}  // namespace

int run_create(const create_options &options)
{
    const file_format format = format_of_output(options.out, options.type, "--type");
    if (format != file_format::vitec && format != file_format::helava)
        throw wrong_usage(
            text(options.out, ": cannot create ", name_of(format),
                 " files; create a VITec or Helava file and use \"imgfile convert\""));
    const shape form{options.nlines, options.nsamps, options.nbands, options.nbytes,
                     options.nbytes == 2 ? IMG_TWO_BYTE_BITS : 8};
    const tile_size tiles = parse_tile(options.tile);
    output_file out(options.out, options.overwrite);
    auto writer = create_writer(out, format, form, tiles);
    if (options.pattern && form.nsamples() > 0) write_pattern(*writer, form);
    const std::int64_t length = writer->finish();
    writer.reset();
    out.commit(length);
    return 0;
}
