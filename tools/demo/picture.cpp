// Pictures in memory, and their files: read with the reader that the tool uses, too. Read picture.h
// and common/pnm_file.h first.
#include "picture.h"

#include "common/pnm_file.h"

#include <cstring>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <system_error>

#include <fcntl.h>
#include <unistd.h>

namespace {

// Closes its file when it goes out of scope.
class open_file {
public:
    explicit open_file(const std::string &name) : m_fd(::open(name.c_str(), O_RDONLY | O_CLOEXEC))
    {
        if (m_fd == -1) throw std::runtime_error("cannot be opened");
    }
    ~open_file() { ::close(m_fd); }
    open_file(const open_file &) = delete;
    open_file &operator=(const open_file &) = delete;
    int fd() const { return m_fd; }

private:
    int m_fd;
};

// Stores a line of pixels, as the file holds them, in the bands of the picture.
void store_line(picture &image, std::int32_t line, const std::vector<std::uint8_t> &pixels)
{
    auto next = pixels.begin();
    for (std::int32_t samp = 0; samp < image.nsamps; ++samp)
        for (std::int32_t band = 0; band < image.nbands; ++band) {
            int value = *next++;
            if (image.nbytes == 2) value = value << 8 | *next++;  // the high byte comes first
            image.set_sample(band, line, samp, value);
        }
}

}  // namespace

picture::picture(std::int32_t lines, std::int32_t samps, std::int32_t bands, std::int32_t max)
    : nlines{lines}, nsamps{samps}, nbands{bands}, maxval{max}, nbytes{max > 255 ? 2 : 1},
      bytes(offset(bands, 0, 0))
{
}

int picture::sample(std::int32_t band, std::int32_t line, std::int32_t samp) const
{
    const std::uint8_t *const first = &bytes[offset(band, line, samp)];
    if (nbytes == 1) return *first;
    std::uint16_t value;
    std::memcpy(&value, first, sizeof value);
    return value;
}

void picture::set_sample(std::int32_t band, std::int32_t line, std::int32_t samp, int value)
{
    std::uint8_t *const first = &bytes[offset(band, line, samp)];
    if (nbytes == 1) {
        *first = static_cast<std::uint8_t>(value);
        return;
    }
    const auto wide = static_cast<std::uint16_t>(value);
    std::memcpy(first, &wide, sizeof wide);
}

picture read_pnm(const std::string &name)
{
    std::error_code error;
    const auto status = std::filesystem::status(name, error);
    if (status.type() == std::filesystem::file_type::not_found)
        throw std::runtime_error("no such file");
    if (!std::filesystem::is_regular_file(status)) throw std::runtime_error("not a regular file");
    const open_file file(name);
    const pnm_file pnm(file.fd());
    const pnm_header &header = pnm.header();
    // The length is checked before memory is allocated for the samples.
    const std::int64_t length = header.file_length();
    if (length == -1 || length > ::lseek(file.fd(), 0, SEEK_END))
        throw std::runtime_error("truncated: its header states more samples than it holds");

    picture image{header.nlines, header.nsamps, header.nbands, header.highest};
    std::vector<std::uint8_t> pixels(static_cast<std::size_t>(header.line_length()));
    for (std::int32_t line = 0; line < image.nlines; ++line) {
        pnm.read(line, 0, pixels);
        store_line(image, line, pixels);
    }
    return image;
}

void write_pnm(const std::string &name, const picture &image)
{
    std::ofstream file(name, std::ios::binary | std::ios::trunc);
    file << (image.nbands == 3 ? "P6\n" : "P5\n") << image.nsamps << ' ' << image.nlines << '\n'
         << image.maxval << '\n';
    for (std::int32_t line = 0; line < image.nlines; ++line) {
        for (std::int32_t samp = 0; samp < image.nsamps; ++samp) {
            for (std::int32_t band = 0; band < image.nbands; ++band) {
                const int value = image.sample(band, line, samp);
                if (image.nbytes == 2) file.put(static_cast<char>(value >> 8));
                file.put(static_cast<char>(value & 0xFF));
            }
        }
    }
    if (!file.flush()) throw std::runtime_error(name + ": cannot be written");
}
