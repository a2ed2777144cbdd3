// What the headers of VITec and Helava files say, usable or not.
#ifndef TOOL_HEADER_H
#define TOOL_HEADER_H

#include "formats/vitec.h"

#include <array>
#include <cstdint>
#include <optional>
#include <string>

// Both blocks of a VITec file, words in the host's order.
struct vitec_header {
    bool big_endian;
    img_vitec_file_block file;
    img_vitec_image_block image;
    std::int64_t image_block_at;

    std::int32_t file_word(std::size_t at) const;
    std::int32_t word(std::size_t at) const;  // of the image block
    bool has_date() const;
    // "2026-11-23 08:15:30", whether that is a date or not.
    std::string date() const;
};

struct helava_trailer {
    bool big_endian;
    std::int32_t nbands, nsamps, nlines;
};

// Whether tiles of a VITec file may be so many lines high, or samples wide.
bool is_vitec_tile_side(std::int32_t side);

// Return nothing when the file does not have the magic word, or ends before the header does; throw
// `failure` when it cannot be opened.
std::optional<vitec_header> read_vitec_header(const std::string &name);
std::optional<helava_trailer> read_helava_trailer(const std::string &name);

#endif
