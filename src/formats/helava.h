// Helava files: one-byte samples, band after band, then a trailer that gives their geometry.
#ifndef IMG_HELAVA_H
#define IMG_HELAVA_H

#include "base/types.h"
#include "formats/words.h"

#include <cstddef>
#include <cstdint>
#include <span>

struct img_header_file;

inline constexpr char IMG_HELAVA_NAME[] = "Helava";
inline constexpr std::uint32_t IMG_HELAVA_MAGIC = 0x48411484;
inline constexpr std::uint32_t IMG_HELAVA_SWAPPED_MAGIC = img_swapped_word(IMG_HELAVA_MAGIC);

// The last 16 bytes of the file: four 32-bit words in the byte order that the magic word shows.
inline constexpr std::size_t IMG_HELAVA_TRAILER_LENGTH = 16;
enum : std::size_t {  // offsets in the trailer
    IMG_HELAVA_AT_NBANDS = 0,
    IMG_HELAVA_AT_NSAMPS = 4,  // samples per line
    IMG_HELAVA_AT_NLINES = 8,
    IMG_HELAVA_AT_MAGIC = 12
};

// Takes type slot `slot`. Returns 0.
std::int32_t img_helava_register(std::int32_t slot, img_type_desc *slot_record);

// Looks for the magic word at the end of an open file. Returns the `swap` of the file: 0 when its
// words are in the host's byte order, 1 when they are not; -1 when the word is not there.
std::int32_t img_helava_find_magic(const img_header_file &file);
// Reads the trailer of an open file and turns its words to host order; `swap` as found. Returns
// true when all of the trailer was read.
bool img_helava_read_trailer_words(const img_header_file &file, std::int32_t swap,
                                   std::span<std::uint8_t, IMG_HELAVA_TRAILER_LENGTH> trailer);

// The type's hooks; img_type_hooks describes their arguments and results. Reading and writing the
// trailer both leave a copy in the record's `header`: in host order when read, as in the file when
// written.
std::int32_t img_helava_probe(img_desc *desc);
std::int32_t img_helava_read_trailer(img_desc *desc);
std::int32_t img_helava_write_trailer(img_desc *desc);
std::int32_t img_helava_padded_nsamps(img_desc *desc);

#endif
