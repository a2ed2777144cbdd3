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
#include "formats/words.h"

#include <array>
#include <cstddef>
#include <cstdint>

struct img_header_file;

inline constexpr char IMG_VITEC_NAME[] = "VITec";  // of the type; with its 0 byte the signature
inline constexpr std::uint32_t IMG_VITEC_MAGIC = 0x005B0720;
inline constexpr std::uint32_t IMG_VITEC_SWAPPED_MAGIC = img_swapped_word(IMG_VITEC_MAGIC);
inline constexpr std::uint32_t IMG_VITEC_VERSION = 7;

// The sizes of what comes before the pixels, in order. Two reserved parts are zero bytes.
inline constexpr std::size_t IMG_VITEC_FILE_BLOCK_SIZE = 48;
inline constexpr std::size_t IMG_VITEC_RESERVED = 64;
inline constexpr std::size_t IMG_VITEC_IMAGE_BLOCK_SIZE = 68;
// Where a new file has its image block and its first pixel byte.
inline constexpr std::int32_t IMG_VITEC_IMAGE_BLOCK_OFFSET =
    IMG_VITEC_FILE_BLOCK_SIZE + IMG_VITEC_RESERVED;
inline constexpr std::int32_t IMG_VITEC_DATA_OFFSET =
    IMG_VITEC_IMAGE_BLOCK_OFFSET + IMG_VITEC_IMAGE_BLOCK_SIZE + IMG_VITEC_RESERVED;
// The link to the image block counts from the end of the magic word.
inline constexpr std::int32_t IMG_VITEC_LINK_BASE = sizeof IMG_VITEC_MAGIC;

// What a new file may have.
inline constexpr std::int32_t IMG_VITEC_MAX_BANDS = 3;
inline constexpr std::int32_t IMG_VITEC_MIN_TILE = 8;      // lines or samples of a tile
inline constexpr std::int32_t IMG_VITEC_MAX_TILE = 32768;  // the same

struct img_vitec_file_block {
    std::array<std::uint8_t, IMG_VITEC_FILE_BLOCK_SIZE> bytes;  // those without a name are 0
};
enum : std::size_t {  // offsets in the file block
    IMG_VITEC_AT_MAGIC = 0,
    IMG_VITEC_AT_IMAGE_BLOCK_LINK = 4,  // offset of the image block, less IMG_VITEC_LINK_BASE
    IMG_VITEC_FILE_WORDS_END = 16,      // the bytes before are words, those after are not
    IMG_VITEC_AT_CREATE_DATE = 16,      // local time: year - 1900, month 0..11, day, h, min, s
    IMG_VITEC_AT_SIGNATURE = 32
};
inline constexpr std::size_t IMG_VITEC_CREATE_DATE_SIZE = 6;

struct img_vitec_image_block {
    std::array<std::uint8_t, IMG_VITEC_IMAGE_BLOCK_SIZE> bytes;  // those without a name are 0
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
    IMG_VITEC_IMAGE_WORDS_END = IMG_VITEC_IMAGE_BLOCK_SIZE
};

// The two blocks of a file's header, words in host order.
struct img_vitec_blocks {
    img_vitec_file_block file;
    img_vitec_image_block image;
    std::int64_t image_offset;  // of the image block in the file, as the link states it
};

// Takes type slot `slot`. Returns 0.
std::int32_t img_vitec_register(std::int32_t slot, img_type_desc *slot_record);

// Looks for the magic word at the start of an open file and leaves the descriptor there. Returns
// the `swap` of the file: 0 when its words are in the host's byte order, 1 when they are not; -1
// when the word is not there.
std::int32_t img_vitec_find_magic(const img_header_file &file);
// Reads both blocks, from the start of an open file on; `swap` as found. Leaves the descriptor at
// the end of the image block. Returns true when all of both was read, whatever it states.
bool img_vitec_read_blocks(const img_header_file &file, std::int32_t swap,
                           img_vitec_blocks *blocks);

// The type's hooks; img_type_hooks describes their arguments and results.
std::int32_t img_vitec_probe(img_desc *desc);
std::int32_t img_vitec_read_header(img_desc *desc);
std::int32_t img_vitec_write_header(img_desc *desc);
std::int32_t img_vitec_padded_nlines(img_desc *desc);
std::int32_t img_vitec_padded_nsamps(img_desc *desc);

// Returns 1 when exactly one of the lower sixteen bits of `value` is set, else 0; the upper
// sixteen are ignored.
std::int32_t img_is_power_of_two(std::int32_t value);

// True for a height or width that the tiles of a file may have. A new file takes some larger sizes
// as well: those that img_is_power_of_two takes for powers of two.
bool img_vitec_is_tile_size(std::int32_t size);

// Fills in the block, in host order, for `extra_length` bytes between it and the pixels. Returns
// 0, or -1 after a message for a geometry that the format cannot store; the block is then not
// usable.
std::int32_t img_vitec_build_image_block(img_vitec_image_block *block, std::int32_t nlines,
                                         std::int32_t nsamps, std::int32_t tile_nsamps,
                                         std::int32_t tile_nlines, std::int32_t nbands,
                                         std::int32_t nbytes, std::int32_t extra_length);

// Turns the words of the block from the other byte order to host order, or back.
void img_vitec_swap_image_block(img_vitec_image_block *block);

#endif
