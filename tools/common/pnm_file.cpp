// Parsing PNM headers and reading lines of PNM files. Assumes nothing of a file: sizes that
// overflow, and files that end early, are refused. Read pnm_file.h first.
#include "common/pnm_file.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstddef>
#include <optional>
#include <stdexcept>
#include <string>
#include <system_error>

#include <unistd.h>

namespace {

constexpr std::int32_t HIGHEST_SAMPLE = 65535;
constexpr std::size_t LONGEST_HEADER = 65536;  // bytes; comments may be long

bool is_blank(int byte)
{
    return byte == ' ' || (byte >= '\t' && byte <= '\r');
}

// Takes the header's numbers apart.
class header_text {
public:
    explicit header_text(std::string_view bytes) : m_bytes(bytes) {}
    // The next number, after blanks and comments; nothing when none follows, or one beyond 31 bits.
    std::optional<std::int32_t> number()
    {
        while (is_blank(next()) || next() == '#') {
            if (next() == '#')
                m_position = std::min(m_bytes.find('\n', m_position), m_bytes.size());
            else
                ++m_position;
        }
        if (next() < '0' || next() > '9') return std::nullopt;
        std::int64_t value = 0;
        for (; next() >= '0' && next() <= '9'; ++m_position) {
            value = value * 10 + (next() - '0');
            if (value > INT_MAX) return std::nullopt;
        }
        return static_cast<std::int32_t>(value);
    }
    // The next byte; -1: the text ends.
    int next() const
    {
        return m_position < m_bytes.size() ? static_cast<unsigned char>(m_bytes[m_position]) : -1;
    }
    std::size_t position() const { return m_position; }

private:
    std::string_view m_bytes;
    std::size_t m_position = 2;  // after the two letters that the file starts with
};

// Returns the bytes read; fewer than asked: the file ends. -1: errno has the reason.
std::int64_t read_bytes(int fd, std::int64_t offset, std::span<std::uint8_t> bytes)
{
    std::size_t done = 0;
    while (done < bytes.size()) {
        const ssize_t got = ::pread(fd, bytes.data() + done, bytes.size() - done,
                                    offset + static_cast<std::int64_t>(done));
        if (got == -1 && errno == EINTR) continue;
        if (got == -1) return -1;
        if (got == 0) break;
        done += static_cast<std::size_t>(got);
    }
    return static_cast<std::int64_t>(done);
}

pnm_header read_header(int fd)
{
    std::string start(LONGEST_HEADER, '\0');
    const std::int64_t got =
        read_bytes(fd, 0, {reinterpret_cast<std::uint8_t *>(start.data()), start.size()});
    start.resize(static_cast<std::size_t>(std::max<std::int64_t>(got, 0)));
    return parse_pnm_header(start);
}

}  // namespace

std::int64_t pnm_header::file_length() const
{
    if (nlines > INT64_MAX / 2 / line_length()) return -1;
    return data_offset + line_length() * nlines;
}

pnm_header parse_pnm_header(std::string_view start)
{
    if (start.size() < 2 || start[0] != 'P' || (start[1] != '5' && start[1] != '6'))
        throw std::runtime_error("is not a binary PGM (P5) or PPM (P6) file");
    header_text text(start);
    const auto nsamps = text.number(), nlines = text.number(), highest = text.number();
    if (!nsamps || !nlines || !highest || *nsamps < 1 || *nlines < 1 || *highest < 1 ||
        *highest > HIGHEST_SAMPLE || !is_blank(text.next()))
        throw std::runtime_error("has no valid PGM or PPM header");
    return {.nlines = *nlines,
            .nsamps = *nsamps,
            .nbands = start[1] == '6' ? 3 : 1,
            .highest = *highest,
            .data_offset = static_cast<std::int64_t>(text.position()) + 1};
}

pnm_file::pnm_file(int fd) : m_fd(fd), m_header(read_header(fd)) {}

void pnm_file::read(std::int64_t line, std::int64_t first_byte,
                    std::span<std::uint8_t> pixels) const
{
    const std::int64_t got =
        read_bytes(m_fd, m_header.data_offset + line * m_header.line_length() + first_byte, pixels);
    if (got == -1)
        throw std::runtime_error("line " + std::to_string(line) +
                                 " cannot be read: " + std::generic_category().message(errno));
    if (got == std::ssize(pixels)) return;
    const std::int64_t missing = line + (first_byte + got) / m_header.line_length();
    throw std::runtime_error("truncated: line " + std::to_string(missing) + " is missing");
}
