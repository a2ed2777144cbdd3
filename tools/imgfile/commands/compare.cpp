// imgfile compare: two images, sample by sample. Read codecs/image.h and walk.h first.
#include "codecs/recognise.h"
#include "commands/commands.h"
#include "failure.h"
#include "walk.h"

#include "common/grouped.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>

namespace {

std::int32_t sample_at(const block &samples, std::int32_t band, std::int32_t line,
                       std::int32_t samp)
{
    const std::uint8_t *const row = samples.row(band, line);
    return samples.nbytes == 1 ? row[samp] : reinterpret_cast<const std::uint16_t *>(row)[samp];
}

struct differences {
    std::int64_t count = 0;
    std::int32_t largest = 0;
    std::int64_t first_index = 0;  // in the order of lines, then samples, then bands
    std::int32_t line = 0, samp = 0, band = 0, a = 0, b = 0;  // of the first difference
};

void add_differences(const window &piece, const block &a, const block &b, std::int64_t line_length,
                     differences &seen)
{
    if (a.nbytes == b.nbytes && a.bytes == b.bytes) return;
    for (std::int32_t band = 0; band < a.nbands; ++band)
        for (std::int32_t line = 0; line < a.nlines; ++line)
            for (std::int32_t samp = 0; samp < a.nsamps; ++samp) {
                const std::int32_t in_a = sample_at(a, band, line, samp);
                const std::int32_t in_b = sample_at(b, band, line, samp);
                if (in_a == in_b) continue;
                const std::int64_t index =
                    ((piece.line + line) * line_length + piece.samp + samp) * a.nbands + band;
                if (seen.count++ == 0 || index < seen.first_index) {
                    seen.first_index = index;
                    seen.line = piece.line + line;
                    seen.samp = piece.samp + samp;
                    seen.band = band;
                    seen.a = in_a;
                    seen.b = in_b;
                }
                seen.largest = std::max(seen.largest, std::abs(in_a - in_b));
            }
}

std::string size_of(const shape &form)
{
    return text(form.nlines, " lines x ", form.nsamps, " samples x ", form.nbands,
                form.nbands == 1 ? " band" : " bands");
}

}  // namespace

int run_compare(const compare_options &options)
{
    const auto a = open_reader(options.a), b = open_reader(options.b);
    const std::string a_name = in_one_line(options.a), b_name = in_one_line(options.b);
    if (a->form.nlines != b->form.nlines || a->form.nsamps != b->form.nsamps ||
        a->form.nbands != b->form.nbands) {
        std::printf("%s and %s differ in size: %s, and %s\n", a_name.c_str(), b_name.c_str(),
                    size_of(a->form).c_str(), size_of(b->form).c_str());
        return 1;
    }
    differences seen;
    const band_list bands = a->all_bands();
    walk(*a, a->form.whole(), bands, *b, [&](const window &piece, const block &samples) {
        block others(piece.nlines, piece.nsamps, samples.nbands, b->form.nbytes);
        b->read(piece, bands, others);
        add_differences(piece, samples, others, a->form.nsamps, seen);
    });
    if (seen.count == 0) {
        std::printf("%s and %s are equal: %s samples\n", a_name.c_str(), b_name.c_str(),
                    grouped(a->form.nsamples()).c_str());
        return 0;
    }
    std::printf("%s and %s differ: %s of %s samples; first at line %d, sample %d, band %d: %d and "
                "%d; largest difference %d\n",
                a_name.c_str(), b_name.c_str(), grouped(seen.count).c_str(),
                grouped(a->form.nsamples()).c_str(), seen.line, seen.samp, seen.band, seen.a,
                seen.b, seen.largest);
    return 1;
}
