// VITec files: a header of 244 bytes, then pixels, band sequential or tile by tile.
//
//   0    48  file block: magic word, link to the image block, creation date, signature
//   48   64  zero
//   112  68  image block: geometry, and where the pixels begin
//   180  64  zero
//   244      pixels
//
// Readers follow the two lengths, so that other writers' files may place the image block and the
// pixels elsewhere. Words are 32 bits in the byte order that the magic word shows.
#ifndef IMG_VITEC_H
#define IMG_VITEC_H

#include "base/types.h"

#include <array>
#include <cstddef>
#include <cstdint>

enum : std::uint32_t {
    IMG_VITEC_MAGIC = 0x005B0720,
    IMG_VITEC_SWAPPED_MAGIC = 0x20075B00,
    IMG_VITEC_VERSION = 7
};

inline constexpr std::size_t IMG_VITEC_RESERVED = 64;  // zero bytes after each of the two blocks
inline constexpr std::int32_t IMG_VITEC_DATA_OFFSET = 244;  // first pixel byte of a new file

struct img_vitec_file_block {
    std::array<std::uint8_t, 48> bytes;  // those without a name are 0
};
enum : std::size_t {  // offsets in the file block
    IMG_VITEC_AT_MAGIC = 0,
    IMG_VITEC_AT_IMAGE_BLOCK_LINK = 4,  // offset of the image block in the file, less 4
    IMG_VITEC_FILE_WORDS_END = 16,      // the bytes before are words, those after are not
    IMG_VITEC_AT_CREATE_DATE = 16,      // local time: year - 1900, month 0..11, day, h, min, s
    IMG_VITEC_AT_SIGNATURE = 32         // "VITec" and a 0 byte
};

struct img_vitec_image_block {
    std::array<std::uint8_t, 68> bytes;  // those without a name are 0
};
enum : std::size_t {                 // offsets in the image block
    IMG_VITEC_AT_HEADER_LENGTH = 0,  // bytes from this block's start to the first pixel
    IMG_VITEC_AT_TOTAL_LENGTH = 4,   // pixel bytes and header_length; readers ignore it
    IMG_VITEC_AT_DESCRIPTION = 8,    // 16 bytes of text, empty; not a word
    IMG_VITEC_AT_VERSION = 24,       // IMG_VITEC_VERSION; any other is refused
    IMG_VITEC_AT_NSAMPS = 36,        // samples per line
    IMG_VITEC_AT_NLINES = 40,        // lines
    IMG_VITEC_AT_TILE_NSAMPS = 44,   // tile width; 0: untiled
    IMG_VITEC_AT_TILE_NLINES = 48,   // tile height; 0: untiled
    IMG_VITEC_AT_BAND_FLAG = 52,     // 1 for fewer than three bands, else 0; readers ignore it
    IMG_VITEC_AT_NBANDS = 56,        // bands
    IMG_VITEC_AT_NBYTES_CODE = 60,   // bytes per sample, less 1
    IMG_VITEC_IMAGE_WORDS_END = 68
};

// Takes type slot `slot`. Returns 0.
std::int32_t img_vitec_register(std::int32_t slot, img_type_desc *slot_record);

// The type's hooks; what they take and return is said at img_type_hooks.
std::int32_t img_vitec_probe(img_desc *desc);
std::int32_t img_vitec_read_header(img_desc *desc);
std::int32_t img_vitec_write_header(img_desc *desc);
std::int32_t img_vitec_padded_nlines(img_desc *desc);
std::int32_t img_vitec_padded_nsamps(img_desc *desc);

// Returns 1 when exactly one of the lower sixteen bits of `value` is set, else 0; the upper
// sixteen are not looked at.
std::int32_t img_is_power_of_two(std::int32_t value);

// Fills in the block, in host order, for `extra_length` bytes between it and the pixels. Returns
// 0, or -1 after a message for a geometry that the format cannot store; the block is then of no
// use.
std::int32_t img_vitec_build_image_block(img_vitec_image_block *block, std::int32_t nlines,
                                         std::int32_t nsamps, std::int32_t tile_nsamps,
                                         std::int32_t tile_nlines, std::int32_t nbands,
                                         std::int32_t nbytes, std::int32_t extra_length);

// Turns the words of the block from file order to host order, or back.
void img_vitec_swap_image_block(img_vitec_image_block *block);

#endif
