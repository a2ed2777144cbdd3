// imgfile preview: a picture for people.
#include "band_stretch.h"
#include "commands.h"
#include "failure.h"
#include "output.h"
#include "walk.h"

#include "base/img_desc.h"

#include <algorithm>
#include <map>

namespace {

// The means of squares of `factor` x `factor` samples, which come from the top on, from left to
// right.
class reduction {
public:
    reduction(const shape &of, std::int32_t nbands, std::int32_t factor)
        : m_of(of), m_factor(factor),
          m_means(img_whole_tiles(of.nlines, factor), img_whole_tiles(of.nsamps, factor), nbands, 2)
    {
    }
    shape form() const { return {m_means.nlines, m_means.nsamps, m_means.nbands, 1, 8}; }
    const block &means() const { return m_means; }

    void add(const window &place, const block &samples)
    {
        const bool ends_lines = place.samp + samples.nsamps == m_of.nsamps;
        for (std::int32_t line = 0; line < samples.nlines; ++line) {
            const std::int32_t at = place.line + line;
            line_sums &sums = m_sums[at / m_factor];
            sums.resize(static_cast<std::size_t>(m_means.nbands) * width());
            for (std::int32_t band = 0; band < samples.nbands; ++band)
                samples.use_row(band, line, [&](const auto *row) {
                    std::uint64_t *const own = &sums[static_cast<std::size_t>(band) * width()];
                    for (std::int32_t i = 0; i < samples.nsamps; ++i)
                        own[(place.samp + i) / m_factor] += row[i];
                });
            if (ends_lines && ((at + 1) % m_factor == 0 || at + 1 == m_of.nlines)) {
                finish_line(at / m_factor, at % m_factor + 1, sums);
                m_sums.erase(at / m_factor);
            }
        }
    }

private:
    using line_sums = std::vector<std::uint64_t>;

    std::size_t width() const { return static_cast<std::size_t>(m_means.nsamps); }
    void finish_line(std::int32_t line, std::int32_t nlines, const line_sums &sums)
    {
        for (std::int32_t band = 0; band < m_means.nbands; ++band) {
            auto *const row = reinterpret_cast<std::uint16_t *>(m_means.row(band, line));
            for (std::int32_t samp = 0; samp < m_means.nsamps; ++samp) {
                const std::int32_t nsamps = std::min(m_factor, m_of.nsamps - samp * m_factor);
                row[samp] = static_cast<std::uint16_t>(
                    sums[static_cast<std::size_t>(band) * width() +
                         static_cast<std::size_t>(samp)] /
                    (static_cast<std::uint64_t>(nsamps) * static_cast<std::uint64_t>(nlines)));
            }
        }
    }

    shape m_of;
    std::int32_t m_factor;
    block m_means;
    std::map<std::int32_t, line_sums> m_sums;  // of the lines of means that are being made
};

}  // namespace

int run_preview(const preview_options &asked)
{
    check_png_name(asked.out);
    const auto in = open_image(asked.in);
    if (in->form.nsamples() == 0) throw failure(in->name, "is empty: there is nothing to see");
    const band_list bands =
        parse_bands(asked.bands, *in, in->form.nbands == 3 ? in->all_bands() : band_list{0});
    if (bands.size() != 1 && bands.size() != 3) throw wrong_usage("--band takes one band or three");
    output_file out(asked.out, asked.overwrite, asked.in == "-" ? "" : asked.in);

    const std::int32_t longer = std::max(in->form.nlines, in->form.nsamps);
    reduction reduced(in->form, static_cast<std::int32_t>(bands.size()),
                      img_whole_tiles(longer, asked.size));
    std::vector<stretch> stretches(bands.size(), stretch(in->form.nbits));
    const auto writer = create_image(out, file_format::png, reduced.form(), {});
    walk(*in, whole(in->form), bands, {}, [&](const window &place, const block &samples) {
        reduced.add(place, samples);
        for (std::size_t i = 0; i < stretches.size(); ++i)
            stretches[i].count(samples, static_cast<std::int32_t>(i), place.samp);
    });
    for (stretch &each : stretches) {
        each.finish();
        if (asked.raw) each = stretch::straight(in->form.nbits);
    }
    writer->write(whole(reduced.form()), stretched(reduced.means(), stretches));
    writer->finish();
    out.commit(-1);
    if (!in->remark.empty()) note(in->name, in->remark);
    return 0;
}
