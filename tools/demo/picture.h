// Pictures, and their files in the binary PGM and PPM formats.
#ifndef DEMO_PICTURE_H
#define DEMO_PICTURE_H

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

// A picture in memory: band after band, line after line, two-byte samples in the host's order, as
// img_dump_buffer takes them.
struct picture {
    picture(std::int32_t lines, std::int32_t samps, std::int32_t bands, std::int32_t max);

    std::size_t offset(std::int32_t band, std::int32_t line, std::int32_t samp) const
    {
        const auto plane = static_cast<std::size_t>(band) * static_cast<std::size_t>(nlines);
        const auto row =
            (plane + static_cast<std::size_t>(line)) * static_cast<std::size_t>(nsamps);
        return (row + static_cast<std::size_t>(samp)) * static_cast<std::size_t>(nbytes);
    }
    int sample(std::int32_t band, std::int32_t line, std::int32_t samp) const;
    void set_sample(std::int32_t band, std::int32_t line, std::int32_t samp, int value);

    std::int32_t nlines, nsamps, nbands;  // at least 1 each
    std::int32_t maxval;                  // what the file states: 1..65535
    std::int32_t nbytes;                  // of a sample: 1 for a maxval up to 255, else 2
    std::vector<std::uint8_t> bytes;
};

// Throws std::runtime_error, whose text says what is wrong with the file.
picture read_pnm(const std::string &name);

// Throws std::runtime_error, which names the file.
void write_pnm(const std::string &name, const picture &image);

#endif
