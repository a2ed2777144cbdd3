// imgfile preview: a picture for people.
#include "commands.h"
#include "failure.h"
#include "output.h"
#include "stretch.h"
#include "walk.h"

#include <algorithm>

namespace {

// The means of squares of `factor` x `factor` samples, of lines that come from the top on.
class reduction {
public:
    reduction(const shape &of, std::int32_t nbands, std::int32_t factor)
        : m_of(of), m_factor(factor),
          m_means((of.nlines + factor - 1) / factor, (of.nsamps + factor - 1) / factor, nbands, 2),
          m_sums(static_cast<std::size_t>(nbands) * static_cast<std::size_t>(m_means.nsamps))
    {
    }
    shape form() const { return {m_means.nlines, m_means.nsamps, m_means.nbands, 1, 8}; }
    const block &means() const { return m_means; }

    // Takes whole lines.
    void add(const window &place, const block &samples)
    {
        for (std::int32_t line = 0; line < samples.nlines; ++line) {
            for (std::int32_t band = 0; band < samples.nbands; ++band)
                samples.use_row(band, line, [&](const auto *row) {
                    std::uint64_t *const sums = sums_of(band);
                    for (std::int32_t samp = 0; samp < m_of.nsamps; ++samp)
                        sums[samp / m_factor] += row[samp];
                });
            const std::int32_t at = place.line + line;
            if ((at + 1) % m_factor == 0 || at + 1 == m_of.nlines)
                finish_line(at / m_factor, at % m_factor + 1);
        }
    }

private:
    std::uint64_t *sums_of(std::int32_t band)
    {
        return &m_sums[static_cast<std::size_t>(band) * static_cast<std::size_t>(m_means.nsamps)];
    }
    void finish_line(std::int32_t line, std::int32_t height)
    {
        for (std::int32_t band = 0; band < m_means.nbands; ++band) {
            auto *const row = reinterpret_cast<std::uint16_t *>(m_means.row(band, line));
            for (std::int32_t samp = 0; samp < m_means.nsamps; ++samp) {
                const std::int32_t width = std::min(m_factor, m_of.nsamps - samp * m_factor);
                row[samp] = static_cast<std::uint16_t>(
                    sums_of(band)[samp] /
                    (static_cast<std::uint64_t>(width) * static_cast<std::uint64_t>(height)));
            }
        }
        std::ranges::fill(m_sums, std::uint64_t{0});
    }

    shape m_of;
    std::int32_t m_factor;
    block m_means;
    std::vector<std::uint64_t> m_sums;  // of the line of means that is being made
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
                      longer / asked.size + (longer % asked.size != 0 ? 1 : 0));
    std::vector<stretch> stretches(bands.size(), stretch(in->form.nbits));
    const auto writer = create_image(out, file_format::png, reduced.form(), {});
    walk(*in, whole(in->form), bands, writer.get(), [&](const window &place, const block &samples) {
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
    return 0;
}
