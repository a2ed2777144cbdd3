// Helava files: one-byte samples, band after band, then a trailer that gives their geometry.
#ifndef IMG_HELAVA_H
#define IMG_HELAVA_H

#include "base/types.h"

#include <cstddef>
#include <cstdint>

enum : std::uint32_t { IMG_HELAVA_MAGIC = 0x48411484, IMG_HELAVA_SWAPPED_MAGIC = 0x84144148 };

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

// The type's hooks; what they take and return is said at img_type_hooks. Both that move the
// trailer leave a copy in the record's `header`: in host order when read, as in the file when
// written.
std::int32_t img_helava_probe(img_desc *desc);
std::int32_t img_helava_read_trailer(img_desc *desc);
std::int32_t img_helava_write_trailer(img_desc *desc);
std::int32_t img_helava_padded_nsamps(img_desc *desc);

#endif
