#include "picture.h"

#include <array>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <limits>
#include <stdexcept>
#include <system_error>

namespace {

// The next number of a header, after blanks and comments; -1: there is none, or it is not below
// 2^31.
std::int64_t read_number(std::istream &file)
{
    int next = file.get();
    while (next == '#' || next == ' ' || (next >= '\t' && next <= '\r')) {
        if (next == '#')
            while (next != '\n' && next != '\r' && next != EOF) next = file.get();
        else
            next = file.get();
    }
    std::int64_t number = next >= '0' && next <= '9' ? 0 : -1;
    for (; next >= '0' && next <= '9'; next = file.get()) {
        number = number * 10 + (next - '0');
        if (number > std::numeric_limits<std::int32_t>::max()) return -1;
    }
    if (next != EOF) file.unget();
    return number;
}

// Reads the header of a file of `length` bytes, up to its first sample.
picture read_header(std::istream &file, std::uintmax_t length)
{
    std::array<char, 2> magic{};
    file.read(magic.data(), magic.size());
    if (magic[0] != 'P' || (magic[1] != '5' && magic[1] != '6'))
        throw std::runtime_error("not a binary PGM or PPM picture");
    const std::int32_t nbands = magic[1] == '6' ? 3 : 1;

    const std::int64_t nsamps = read_number(file), nlines = read_number(file);
    const std::int64_t maxval = read_number(file);
    const int blank = file.get();
    if (nsamps < 1 || nlines < 1)
        throw std::runtime_error("no usable width and height in its header");
    if (maxval < 1 || maxval > 65535)
        throw std::runtime_error("the highest value in its header is not in 1..65535");
    if (blank != ' ' && (blank < '\t' || blank > '\r'))
        throw std::runtime_error("no blank after its header");

    // What the file must hold is held against its length before any memory is taken for it.
    const std::int64_t pixel = std::int64_t{nbands} * (maxval > 255 ? 2 : 1);
    const auto expected = static_cast<std::uintmax_t>(nlines * nsamps);
    const std::uintmax_t left = length - static_cast<std::uintmax_t>(file.tellg());
    if (expected > left / static_cast<std::uintmax_t>(pixel))
        throw std::runtime_error("cut short: its header announces more samples than it holds");
    return {static_cast<std::int32_t>(nlines), static_cast<std::int32_t>(nsamps), nbands,
            static_cast<std::int32_t>(maxval)};
}

}  // namespace

picture::picture(std::int32_t lines, std::int32_t samps, std::int32_t bands, std::int32_t max)
    : nlines{lines}, nsamps{samps}, nbands{bands}, maxval{max}, nbytes{max > 255 ? 2 : 1},
      bytes(offset(bands, 0, 0))
{
}

int picture::sample(std::int32_t band, std::int32_t line, std::int32_t samp) const
{
    const std::uint8_t *at = &bytes[offset(band, line, samp)];
    if (nbytes == 1) return *at;
    std::uint16_t value;
    std::memcpy(&value, at, sizeof value);
    return value;
}

void picture::set_sample(std::int32_t band, std::int32_t line, std::int32_t samp, int value)
{
    std::uint8_t *at = &bytes[offset(band, line, samp)];
    if (nbytes == 1) {
        *at = static_cast<std::uint8_t>(value);
        return;
    }
    const auto wide = static_cast<std::uint16_t>(value);
    std::memcpy(at, &wide, sizeof wide);
}

picture read_pnm(const std::string &name)
{
    std::error_code error;
    const auto status = std::filesystem::status(name, error);
    if (status.type() == std::filesystem::file_type::not_found)
        throw std::runtime_error("no such file");
    if (!std::filesystem::is_regular_file(status)) throw std::runtime_error("not a regular file");
    const std::uintmax_t length = std::filesystem::file_size(name, error);
    std::ifstream file(name, std::ios::binary);
    if (error || !file) throw std::runtime_error("cannot be opened");

    picture image = read_header(file, length);
    const std::int32_t width = image.nbands * image.nbytes;  // bytes of a pixel
    std::vector<char> row(static_cast<std::size_t>(image.nsamps) * static_cast<std::size_t>(width));
    for (std::int32_t line = 0; line < image.nlines; ++line) {
        if (!file.read(row.data(), static_cast<std::streamsize>(row.size())))
            throw std::runtime_error("cannot be read to its end");
        std::size_t from = 0;
        const auto byte = [&] { return static_cast<unsigned char>(row[from++]); };
        for (std::int32_t samp = 0; samp < image.nsamps; ++samp) {
            for (std::int32_t band = 0; band < image.nbands; ++band) {
                int value = byte();
                if (image.nbytes == 2) value = value << 8 | byte();  // the high byte comes first
                image.set_sample(band, line, samp, value);
            }
        }
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
