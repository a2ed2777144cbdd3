// Binary PGM and PPM files as images of the tool. Read codecs.h and common/pnm_file.h first.
#include "codecs/codecs.h"
#include "codecs/pixels.h"
#include "failure.h"
#include "output_file.h"

#include "common/pnm_file.h"

#include <algorithm>
#include <bit>
#include <stdexcept>

namespace {

constexpr int HIGHEST_BYTE = 255, HIGHEST_OF_TWO_BYTES = 65535;

// Runs an action on the file; a failure gets the name of the file.
template <typename Action>
auto checked(const std::string &name, Action action)
{
    try {
        return action();
    } catch (const std::runtime_error &problem) {
        throw failure(name, problem.what());
    }
}

std::int32_t stated_bits(const pnm_header &header)
{
    if (header.nbytes() == 1) return 8;
    return static_cast<std::int32_t>(std::bit_width(static_cast<std::uint32_t>(header.highest)));
}

class pnm_reader : public image_reader {
public:
    explicit pnm_reader(input_file file)
        : image_reader(file, file_format::pgm), m_file(std::move(file)),
          m_pnm(checked(name, [this] { return pnm_file(m_file.fd()); }))
    {
        const pnm_header &header = m_pnm.header();
        if (header.nbands == 3) format = file_format::ppm;
        form = {.nlines = header.nlines,
                .nsamps = header.nsamps,
                .nbands = header.nbands,
                .nbytes = header.nbytes(),
                .nbits = stated_bits(header)};
        expected_length = header.file_length();
    }

    void read(const window &part, const band_list &bands, block &samples) override
    {
        constexpr std::int64_t at_once = std::int64_t{1} << 20U;  // bytes of whole lines
        const pnm_header &header = m_pnm.header();
        const auto step = static_cast<std::int32_t>(
            part.nsamps == form.nsamps
                ? std::clamp<std::int64_t>(at_once / header.line_length(), 1, part.nlines)
                : 1);
        const std::int64_t piece = part.nsamps * header.pixel_length();
        for (std::int32_t first = 0; first < part.nlines; first += step) {
            const std::int32_t count = std::min(step, part.nlines - first);
            m_pixels.resize(static_cast<std::size_t>(count * piece));
            checked(name, [&] {
                m_pnm.read(std::int64_t{part.line} + first, part.samp * header.pixel_length(),
                           m_pixels);
            });
            if (BIG_ENDIAN_IS_FOREIGN && form.nbytes == 2)
                exchange_bytes(m_pixels.data(), m_pixels.size() / 2);
            for (std::int32_t i = 0; i < count; ++i)
                spread_pixels(&m_pixels[static_cast<std::size_t>(i * piece)], form.nbands, bands,
                              {first + i, 0, part.nsamps, 0}, samples);
        }
    }

private:
    input_file m_file;
    pnm_file m_pnm;
    std::vector<std::uint8_t> m_pixels;
};

// The header of two-byte samples always states 65535, so that other programs do not scale them.
class pnm_writer : public image_writer {
public:
    pnm_writer(output_file &out, const shape &form) : m_out(out), m_form(form)
    {
        in_order = out.is_standard_output();
        const std::string header =
            text(form.nbands == 3 ? "P6" : "P5", "\n", form.nsamps, " ", form.nlines, "\n",
                 form.nbytes == 2 ? HIGHEST_OF_TWO_BYTES : HIGHEST_BYTE, "\n");
        m_first = static_cast<std::int64_t>(header.size());
        if (!in_order) out.reserve(offset(m_form.nlines, 0));
        out.write(header.data(), header.size());
    }

    void write(const window &part, const block &samples) override
    {
        m_pixels.resize(samples.bytes.size());
        const std::size_t length = m_pixels.size() / static_cast<std::size_t>(samples.nlines);
        for (std::int32_t line = 0; line < samples.nlines; ++line)
            gather_pixels(samples, {line, 0, samples.nsamps, 0},
                          &m_pixels[static_cast<std::size_t>(line) * length]);
        if (BIG_ENDIAN_IS_FOREIGN && samples.nbytes == 2)
            exchange_bytes(m_pixels.data(), m_pixels.size() / 2);
        if (samples.nsamps == m_form.nsamps)
            m_out.write(m_pixels.data(), m_pixels.size());
        else
            for (std::int32_t line = 0; line < samples.nlines; ++line)
                m_out.write_at(offset(part.line + line, part.samp),
                               &m_pixels[static_cast<std::size_t>(line) * length], length);
    }
    std::int64_t finish() override { return offset(m_form.nlines, 0); }

private:
    std::int64_t offset(std::int64_t line, std::int64_t samp) const
    {
        return m_first + (line * m_form.nsamps + samp) * m_form.nbands * m_form.nbytes;
    }

    output_file &m_out;
    shape m_form;
    std::int64_t m_first = 0;
    std::vector<std::uint8_t> m_pixels;
};

}  // namespace

std::unique_ptr<image_reader> open_pnm(input_file file)
{
    return std::make_unique<pnm_reader>(std::move(file));
}

std::unique_ptr<image_writer> create_pnm(output_file &out, file_format format, const shape &form)
{
    if ((format == file_format::pgm && form.nbands != 1) ||
        (format == file_format::ppm && form.nbands != 3))
        throw failure(out.name(), text(name_of(format), " files hold ",
                                       format == file_format::pgm ? "1 band" : "3 bands", ", not ",
                                       form.nbands));
    if (form.nbands != 1 && form.nbands != 3)
        throw failure(out.name(), text("PGM and PPM files hold 1 or 3 bands, not ", form.nbands,
                                       "; --band chooses some"));
    if (form.nsamples() == 0) throw failure(out.name(), "PGM and PPM files cannot be empty");
    return std::make_unique<pnm_writer>(out, form);
}
