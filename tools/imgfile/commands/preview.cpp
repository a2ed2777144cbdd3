// imgfile preview: a reduced picture of an image. Read codecs/image.h and walk.h first.
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

#include <algorithm>
#include <map>

namespace {

// The mean of each square of `factor` x `factor` samples. Samples arrive as from a walk: from top
// to bottom, and from left to right.
class reduction {
public:
    reduction(const shape &form, std::int32_t nbands, std::int32_t factor)
        : m_source(form), m_factor(factor), m_means(img_whole_tiles(form.nlines, factor),
                                                    img_whole_tiles(form.nsamps, factor), nbands, 2)
    {
    }
    shape form() const { return {m_means.nlines, m_means.nsamps, m_means.nbands, 1, 8}; }
    const block &means() const { return m_means; }

    void add(const window &piece, const block &samples)
    {
        const bool ends_lines = piece.samp + samples.nsamps == m_source.nsamps;
        for (std::int32_t line = 0; line < samples.nlines; ++line) {
            const std::int32_t source_line = piece.line + line;
            line_sums &sums = m_sums[source_line / m_factor];
            sums.resize(static_cast<std::size_t>(m_means.nbands) * width());
            for (std::int32_t band = 0; band < samples.nbands; ++band)
                samples.use_row(band, line, [&](const auto *row) {
                    std::uint64_t *const own = &sums[static_cast<std::size_t>(band) * width()];
                    for (std::int32_t i = 0; i < samples.nsamps; ++i)
                        own[(piece.samp + i) / m_factor] += row[i];
                });
            if (ends_lines &&
                ((source_line + 1) % m_factor == 0 || source_line + 1 == m_source.nlines)) {
                finish_line(source_line / m_factor, source_line % m_factor + 1, sums);
                m_sums.erase(source_line / m_factor);
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
                const std::int32_t nsamps = std::min(m_factor, m_source.nsamps - samp * m_factor);
                row[samp] = static_cast<std::uint16_t>(
                    sums[static_cast<std::size_t>(band) * width() +
                         static_cast<std::size_t>(samp)] /
                    (static_cast<std::uint64_t>(nsamps) * static_cast<std::uint64_t>(nlines)));
            }
        }
    }

    shape m_source;
    std::int32_t m_factor;
    block m_means;
    std::map<std::int32_t, line_sums> m_sums;  // by line of means; those that are not complete
};

}  // namespace

int run_preview(const preview_options &options)
{
    check_png_name(options.out);
    const auto in = open_reader(options.in);
    if (in->form.nsamples() == 0) throw failure(in->name, "has no samples to show");
    const band_list bands =
        parse_bands(options.bands, *in, in->form.nbands == 3 ? in->all_bands() : band_list{0});
    if (bands.size() != 1 && bands.size() != 3) throw wrong_usage("--band takes one band or three");
    output_file out(options.out, options.overwrite, in->identity);

    const std::int32_t longer = std::max(in->form.nlines, in->form.nsamps);
    reduction reduced(in->form, static_cast<std::int32_t>(bands.size()),
                      img_whole_tiles(longer, options.size));
    std::vector<band_stretch> stretches(bands.size(), band_stretch(in->form.nbits));
    const auto writer = create_writer(out, file_format::png, reduced.form(), {});
    walk(*in, in->form.whole(), bands, {}, [&](const window &piece, const block &samples) {
        reduced.add(piece, samples);
        for (std::size_t i = 0; i < stretches.size(); ++i)
            stretches[i].count(samples, static_cast<std::int32_t>(i), piece.samp);
    });
    for (band_stretch &each : stretches) {
        each.finish();
        if (options.raw) each = band_stretch::straight(in->form.nbits);
    }
    writer->write(reduced.form().whole(), stretched(reduced.means(), stretches));
    writer->finish();
    out.commit(-1);
    if (!in->remark.empty()) note(in->name, in->remark);
    return 0;
}
