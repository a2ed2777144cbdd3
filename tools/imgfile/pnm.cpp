// Binary PGM and PPM files: a header of text, then pixels, line by line, the high byte first.
#include "descriptor.h"
#include "failure.h"
#include "image.h"
#include "output.h"
#include "samples.h"

#include <algorithm>
#include <bit>
#include <cerrno>
#include <climits>
#include <optional>

#include <sys/stat.h>
#include <unistd.h>

namespace {

bool is_blank(int byte)
{
    return byte == ' ' || (byte >= '\t' && byte <= '\r');
}

// Takes the header's numbers apart.
class header_text {
public:
    explicit header_text(std::string bytes) : m_bytes(std::move(bytes)) {}
    // The next number, after blanks and comments, if there is one below 2^31.
    std::optional<std::int32_t> number()
    {
        while (is_blank(next()) || next() == '#') {
            if (next() == '#')
                m_at = std::min(m_bytes.find('\n', m_at), m_bytes.size());
            else
                ++m_at;
        }
        if (next() < '0' || next() > '9') return std::nullopt;
        std::int64_t value = 0;
        for (; next() >= '0' && next() <= '9'; ++m_at) {
            value = value * 10 + (next() - '0');
            if (value > INT_MAX) return std::nullopt;
        }
        return static_cast<std::int32_t>(value);
    }
    int next() const
    {
        return m_at < m_bytes.size() ? static_cast<unsigned char>(m_bytes[m_at]) : -1;
    }
    std::size_t m_at = 2;  // after the two letters that the file begins with

private:
    std::string m_bytes;
};

class pnm_reader : public image_reader {
public:
    pnm_reader(const std::string &path, int fd) : image_reader(path, file_format::pgm), m_file(fd)
    {
        std::string start(65536, '\0');  // comments may be long
        start.resize(
            static_cast<std::size_t>(std::max<ssize_t>(read_at(0, start.data(), start.size()), 0)));
        if (start.size() < 2 || (start[1] != '5' && start[1] != '6'))
            throw failure(name, "is a PNM file of a kind that is not read: only binary PGM (P5) "
                                "and PPM (P6) are");
        form.nbands = start[1] == '6' ? 3 : 1;
        if (form.nbands == 3) format = file_format::ppm;
        header_text header(start);
        const auto nsamps = header.number(), nlines = header.number(), highest = header.number();
        if (!nsamps || !nlines || !highest || *nsamps < 1 || *nlines < 1 || *highest < 1 ||
            *highest > 65535 || !is_blank(header.next()))
            throw failure(name, "has no usable PGM or PPM header");
        form.nlines = *nlines;
        form.nsamps = *nsamps;
        form.nbytes = *highest > 255 ? 2 : 1;
        form.nbits = form.nbytes == 1
                         ? 8
                         : static_cast<int>(std::bit_width(static_cast<std::uint32_t>(*highest)));
        m_first = static_cast<std::int64_t>(header.m_at) + 1;
        m_line_length = std::int64_t{form.nsamps} * form.nbands * form.nbytes;
        if (form.nlines <= INT64_MAX / 2 / m_line_length)
            length = m_first + m_line_length * form.nlines;
    }

    void read(const window &part, const band_list &bands, block &to) override
    {
        constexpr std::int64_t at_once = std::int64_t{1} << 20U;  // bytes of lines that are whole
        const std::int64_t pixel = std::int64_t{form.nbands} * form.nbytes;
        const auto step = static_cast<std::int32_t>(
            part.nsamps == form.nsamps
                ? std::clamp<std::int64_t>(at_once / m_line_length, 1, part.nlines)
                : 1);
        const std::int64_t piece = part.nsamps * pixel;
        for (std::int32_t first = 0; first < part.nlines; first += step) {
            const std::int32_t count = std::min(step, part.nlines - first);
            m_pixels.resize(static_cast<std::size_t>(count * piece));
            read_pixels(std::int64_t{part.line} + first, part.samp * pixel, piece);
            for (std::int32_t i = 0; i < count; ++i)
                spread_pixels(&m_pixels[static_cast<std::size_t>(i * piece)], form.nbands, bands,
                              {first + i, 0, part.nsamps, 0}, to);
        }
    }

private:
    // Fills m_pixels with pieces of lines, `piece` bytes each; with more than one: of whole lines.
    void read_pixels(std::int64_t line, std::int64_t first_byte, std::int64_t piece)
    {
        const ssize_t got =
            read_at(m_first + line * m_line_length + first_byte, m_pixels.data(), m_pixels.size());
        if (got == -1)
            throw failure(name, text("line ", line, " cannot be read: ", system_text(errno)));
        if (static_cast<std::size_t>(got) != m_pixels.size())
            throw failure(name, text("cut short: line ", line + got / piece, " is missing"));
        if (BIG_ENDIAN_IS_FOREIGN && form.nbytes == 2)
            exchange_bytes(m_pixels.data(), m_pixels.size() / 2);
    }
    // Returns the bytes that came; fewer than asked: the file ends.
    ssize_t read_at(std::int64_t offset, void *to, std::size_t count) const
    {
        std::size_t done = 0;
        while (done < count) {
            const ssize_t got = ::pread(m_file, static_cast<char *>(to) + done, count - done,
                                        offset + static_cast<std::int64_t>(done));
            if (got == -1 && errno == EINTR) continue;
            if (got == -1) return -1;
            if (got == 0) break;
            done += static_cast<std::size_t>(got);
        }
        return static_cast<ssize_t>(done);
    }

    descriptor m_file;
    std::int64_t m_first = 0, m_line_length = 0;
    std::vector<std::uint8_t> m_pixels;
};

// Samples of two bytes are said to reach 65535, whatever they do: so no program scales them.
class pnm_writer : public image_writer {
public:
    pnm_writer(output_file &out, const shape &form) : m_out(out), m_form(form)
    {
        in_order = out.is_standard_output();
        const std::string header = text(form.nbands == 3 ? "P6" : "P5", "\n", form.nsamps, " ",
                                        form.nlines, "\n", form.nbytes == 2 ? 65535 : 255, "\n");
        m_first = static_cast<std::int64_t>(header.size());
        if (!in_order) out.reserve(finish());
        out.write(header.data(), header.size());
    }

    void write(const window &at, const block &from) override
    {
        m_pixels.resize(from.bytes.size());
        const std::size_t length = m_pixels.size() / static_cast<std::size_t>(from.nlines);
        for (std::int32_t line = 0; line < from.nlines; ++line)
            gather_pixels(from, {line, 0, from.nsamps, 0},
                          &m_pixels[static_cast<std::size_t>(line) * length]);
        if (BIG_ENDIAN_IS_FOREIGN && from.nbytes == 2)
            exchange_bytes(m_pixels.data(), m_pixels.size() / 2);
        if (from.nsamps == m_form.nsamps)
            m_out.write(m_pixels.data(), m_pixels.size());
        else
            for (std::int32_t line = 0; line < from.nlines; ++line)
                m_out.write_at(offset(at.line + line, at.samp),
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

std::unique_ptr<image_reader> open_pnm(const std::string &name, int fd)
{
    return std::make_unique<pnm_reader>(name, fd);
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
    if (form.nsamples() == 0) throw failure(out.name(), "an empty image is no PGM or PPM picture");
    return std::make_unique<pnm_writer>(out, form);
}
