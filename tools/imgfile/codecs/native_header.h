// The headers of VITec and Helava files, valid or not, by the library's own readers of headers.
#ifndef TOOL_NATIVE_HEADER_H
#define TOOL_NATIVE_HEADER_H

#include "formats/helava.h"
#include "formats/vitec.h"

#include <array>
#include <cstdint>
#include <optional>
#include <string>

// Words in the host's order. At most one is set: a file with a complete VITec header is not
// searched for a Helava trailer.
struct native_header {
    std::optional<img_vitec_blocks> vitec;
    std::optional<std::array<std::uint8_t, IMG_HELAVA_TRAILER_LENGTH>> helava;
};

// Reads the header of an open file; nothing when it has no magic word, or ends within the header.
native_header read_native_header(int fd);

// Whether the bytes of the date of creation are those of a date.
bool has_date(const img_vitec_file_block &block);

// Returns them as "2026-11-23 08:15:30", whether they are a date or not.
std::string date_text(const img_vitec_file_block &block);

#endif
