#include "header.h"

#include "failure.h"

#include "formats/helava.h"
#include "formats/vitec.h"
#include "formats/words.h"

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <fstream>

namespace {

std::ifstream open_file(const std::string &name)
{
    std::ifstream file(name, std::ios::binary);
    if (!file) throw failure(name, system_text(errno));
    return file;
}

bool read_bytes(std::ifstream &file, std::int64_t offset, std::span<std::uint8_t> bytes)
{
    if (offset < 0) return false;
    file.seekg(offset);
    file.read(reinterpret_cast<char *>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    return file.good();
}

// Turns words into the host's order; returns whether they were big-endian.
bool take_order(std::span<std::uint8_t> block, std::size_t first, std::size_t end, bool swapped)
{
    if (swapped) img_swap_words(block, first, end);
    return swapped == (std::endian::native == std::endian::little);
}

}  // namespace

std::int32_t vitec_header::file_word(std::size_t at) const
{
    return img_get_int(std::array(file.bytes), at);
}

std::int32_t vitec_header::word(std::size_t at) const
{
    return img_get_int(std::array(image.bytes), at);
}

bool vitec_header::has_date() const
{
    const auto *const at = &file.bytes[IMG_VITEC_AT_CREATE_DATE];
    const std::chrono::year_month_day day(std::chrono::year(1900 + at[0]),
                                          std::chrono::month(at[1] + 1U), std::chrono::day(at[2]));
    return day.ok() && at[3] <= 23 && at[4] <= 59 && at[5] <= 60;
}

std::string vitec_header::date() const
{
    const auto *const at = &file.bytes[IMG_VITEC_AT_CREATE_DATE];
    char date[32];
    std::snprintf(date, sizeof date, "%04d-%02d-%02d %02d:%02d:%02d", 1900 + at[0], at[1] + 1,
                  at[2], at[3], at[4], at[5]);
    return date;
}

bool is_vitec_tile_side(std::int32_t side)
{
    return side >= 8 && side <= 32768 && img_is_power_of_two(side) != 0;
}

std::optional<vitec_header> read_vitec_header(const std::string &name)
{
    std::ifstream file = open_file(name);
    vitec_header header{};
    if (!read_bytes(file, 0, header.file.bytes)) return std::nullopt;
    const std::uint32_t magic = img_get_word(header.file.bytes, IMG_VITEC_AT_MAGIC);
    if (magic != IMG_VITEC_MAGIC && magic != IMG_VITEC_SWAPPED_MAGIC) return std::nullopt;
    const bool swapped = magic == IMG_VITEC_SWAPPED_MAGIC;
    header.big_endian = take_order(header.file.bytes, 0, IMG_VITEC_FILE_WORDS_END, swapped);
    header.image_block_at = std::int64_t{header.file_word(IMG_VITEC_AT_IMAGE_BLOCK_LINK)} + 4;
    if (!read_bytes(file, header.image_block_at, header.image.bytes)) return std::nullopt;
    if (swapped) img_vitec_swap_image_block(&header.image);
    return header;
}

std::optional<helava_trailer> read_helava_trailer(const std::string &name)
{
    std::ifstream file = open_file(name);
    file.seekg(0, std::ios::end);
    const std::int64_t length = file.tellg();
    std::array<std::uint8_t, IMG_HELAVA_TRAILER_LENGTH> trailer{};
    if (!read_bytes(file, length - std::int64_t{IMG_HELAVA_TRAILER_LENGTH}, trailer))
        return std::nullopt;
    const std::uint32_t magic = img_get_word(trailer, IMG_HELAVA_AT_MAGIC);
    if (magic != IMG_HELAVA_MAGIC && magic != IMG_HELAVA_SWAPPED_MAGIC) return std::nullopt;
    const bool big_endian =
        take_order(trailer, 0, IMG_HELAVA_TRAILER_LENGTH, magic == IMG_HELAVA_SWAPPED_MAGIC);
    return helava_trailer{big_endian, img_get_int(trailer, IMG_HELAVA_AT_NBANDS),
                          img_get_int(trailer, IMG_HELAVA_AT_NSAMPS),
                          img_get_int(trailer, IMG_HELAVA_AT_NLINES)};
}
