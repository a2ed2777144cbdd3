// Reading a header from a descriptor, and its date. Read native_header.h, formats/vitec.h and
// formats/helava.h first.
#include "codecs/native_header.h"

#include "codecs/open_file_method.h"

#include "formats/header_file.h"
#include "io/io_method.h"

#include <chrono>
#include <cstdio>
#include <span>

native_header read_native_header(int fd)
{
    const img_header_file file{&plain_method(), fd};
    native_header header;
    if (const std::int32_t swap = img_vitec_find_magic(file); swap != -1)
        if (img_vitec_blocks blocks; img_vitec_read_blocks(file, swap, &blocks)) {
            header.vitec = blocks;
            return header;
        }
    if (const std::int32_t swap = img_helava_find_magic(file); swap != -1) {
        std::array<std::uint8_t, IMG_HELAVA_TRAILER_LENGTH> trailer{};
        if (img_helava_read_trailer_words(file, swap, trailer)) header.helava = trailer;
    }
    return header;
}

bool has_date(const img_vitec_file_block &block)
{
    const auto *const bytes = &block.bytes[IMG_VITEC_AT_CREATE_DATE];
    const std::chrono::year_month_day day(std::chrono::year(1900 + bytes[0]),
                                          std::chrono::month(bytes[1] + 1U),
                                          std::chrono::day(bytes[2]));
    return day.ok() && bytes[3] <= 23 && bytes[4] <= 59 && bytes[5] <= 60;
}

std::string date_text(const img_vitec_file_block &block)
{
    const auto *const bytes = &block.bytes[IMG_VITEC_AT_CREATE_DATE];
    char date[32];
    std::snprintf(date, sizeof date, "%04d-%02d-%02d %02d:%02d:%02d", 1900 + bytes[0], bytes[1] + 1,
                  bytes[2], bytes[3], bytes[4], bytes[5]);
    return date;
}
