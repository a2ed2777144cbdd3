// imgfile compare: two images, sample by sample.
#include "commands.h"
#include "failure.h"
#include "walk.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>

namespace {

std::int32_t sample_at(const block &of, std::int32_t band, std::int32_t line, std::int32_t samp)
{
    const std::uint8_t *const row = of.row(band, line);
    return of.nbytes == 1 ? row[samp] : reinterpret_cast<const std::uint16_t *>(row)[samp];
}

struct differences {
    std::int64_t count = 0;
    std::int32_t largest = 0;
    std::int64_t first_place = 0;  // line by line, then sample by sample, then band by band
    std::int32_t line = 0, samp = 0, band = 0, a = 0, b = 0;  // of the first
};

void add_differences(const window &place, const block &a, const block &b, std::int64_t line_length,
                     differences &seen)
{
    if (a.nbytes == b.nbytes && a.bytes == b.bytes) return;
    for (std::int32_t band = 0; band < a.nbands; ++band)
        for (std::int32_t line = 0; line < a.nlines; ++line)
            for (std::int32_t samp = 0; samp < a.nsamps; ++samp) {
                const std::int32_t in_a = sample_at(a, band, line, samp);
                const std::int32_t in_b = sample_at(b, band, line, samp);
                if (in_a == in_b) continue;
                const std::int64_t at =
                    ((place.line + line) * line_length + place.samp + samp) * a.nbands + band;
                if (seen.count++ == 0 || at < seen.first_place) {
                    seen.first_place = at;
                    seen.line = place.line + line;
                    seen.samp = place.samp + samp;
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

int run_compare(const compare_options &asked)
{
    const auto a = open_image(asked.a), b = open_image(asked.b);
    const std::string a_name = in_one_line(asked.a), b_name = in_one_line(asked.b);
    if (a->form.nlines != b->form.nlines || a->form.nsamps != b->form.nsamps ||
        a->form.nbands != b->form.nbands) {
        std::printf("%s and %s differ in size: %s, and %s\n", a_name.c_str(), b_name.c_str(),
                    size_of(a->form).c_str(), size_of(b->form).c_str());
        return 1;
    }
    differences seen;
    const band_list bands = a->all_bands();
    walk(*a, whole(a->form), bands, *b, [&](const window &place, const block &samples) {
        block others(place.nlines, place.nsamps, samples.nbands, b->form.nbytes);
        b->read(place, bands, others);
        add_differences(place, samples, others, a->form.nsamps, seen);
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
