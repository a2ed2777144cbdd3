// The two formats, told once more and without the library: their files byte by byte, and which
// images may be created and opened.
#ifndef IMG_TEST_FORMAT_RULES_H
#define IMG_TEST_FORMAT_RULES_H

#include "support/file_model.h"

inline constexpr std::int32_t VITEC_HEADER = 48 + 64 + 68 + 64, HELAVA_TRAILER = 16;
inline constexpr std::int32_t VITEC_MAGIC = 0x005B0720, HELAVA_MAGIC = 0x48411484;
inline constexpr bool IS_LITTLE_ENDIAN = std::endian::native == std::endian::little;

// Stores a word, unless it would not lie within the file.
inline void put_word(bytes &file, std::size_t offset, std::int64_t word, bool little_endian = false)
{
    for (std::size_t i = 0; offset <= file.size() - 4 && i < 4; ++i)
        file[offset + i] = static_cast<std::uint8_t>(word >> 8 * (little_endian ? i : 3 - i));
}

// Bytes of an image block, each the first of a word.
inline constexpr std::int32_t VITEC_HEADER_LENGTH = 0, VITEC_VERSION = 24, VITEC_NSAMPS = 36,
                              VITEC_NLINES = 40, VITEC_TILE_NSAMPS = 44, VITEC_TILE_NLINES = 48,
                              VITEC_NBANDS = 56, VITEC_NBYTES_CODE = 60, VITEC_BLOCK = 68;

struct vitec_variant {
    std::int32_t link = 108;  // the image block lies 4 bytes further
    std::int32_t header_length = 132, version = 7;
    bool little_endian = false;
};

// Returns a file of `length` bytes with those fields of a VITec header that readers look at.
inline bytes vitec_file(const test_geometry &image, std::size_t length = VITEC_HEADER,
                        const vitec_variant &variant = {})
{
    bytes file(length);
    const auto put = [&](std::size_t offset, std::int64_t word) {
        put_word(file, offset, word, variant.little_endian);
    };
    const auto block = img_count(std::int64_t{variant.link} + 4);
    put(0, VITEC_MAGIC);
    put(4, variant.link);
    put(block + VITEC_HEADER_LENGTH, variant.header_length);
    put(block + VITEC_VERSION, variant.version);
    put(block + VITEC_NSAMPS, image.nsamps);
    put(block + VITEC_NLINES, image.nlines);
    put(block + VITEC_TILE_NSAMPS, image.tile_nsamps);
    put(block + VITEC_TILE_NLINES, image.tile_nlines);
    put(block + VITEC_NBANDS, image.nbands);
    put(block + VITEC_NBYTES_CODE, std::int64_t{image.nbytes} - 1);
    return file;
}

// Returns `nsamples` samples of value 0 and a Helava trailer.
inline bytes helava_file(const test_geometry &image, std::size_t nsamples,
                         bool little_endian = false)
{
    bytes file(nsamples + HELAVA_TRAILER);
    for (const std::int32_t word : {image.nbands, image.nsamps, image.nlines, HELAVA_MAGIC}) {
        put_word(file, nsamples, word, little_endian);
        nsamples += 4;
    }
    return file;
}

// Gives the bytes from `first` to `end` values that show where they lie.
inline bytes numbered(bytes content, std::int64_t first, std::size_t end)
{
    for (auto at = img_count(first); at < end; ++at)
        content[at] = static_cast<std::uint8_t>(at * 7 + at / 256);
    return content;
}

// Returns a VITec file with numbered bytes after the image block.
inline file_model vitec(test_geometry image, std::size_t length, const vitec_variant &variant = {})
{
    image.layout = has_tiles(image) ? IMG_LAYOUT_TILED : IMG_LAYOUT_BSQ;
    image.swap = IS_LITTLE_ENDIAN != variant.little_endian ? 1 : 0;
    const std::int64_t block = std::int64_t{variant.link} + 4;
    const std::int64_t end = std::max<std::int64_t>(block, 112) + VITEC_BLOCK;
    return {image, block + variant.header_length,
            numbered(vitec_file(image, length, variant), end, length)};
}

// True when an image of that geometry, any numbers, may be opened and created: no size is
// negative, samples have one byte or two, and every size and the end of the data fit 31 bits.
inline bool is_within_limits(const test_geometry &image, std::int64_t data_offset)
{
    if (std::min({image.nlines, image.nsamps, image.nbands, image.tile_nsamps, image.tile_nlines}) <
            0 ||
        image.nbytes < 1 || image.nbytes > 2 || data_offset < 0)
        return false;
    // As floating-point numbers, products are exact or far too large, but never wrap.
    const auto width = static_cast<double>(stored_extent(image.nsamps, image.tile_nsamps));
    const auto height = static_cast<double>(stored_extent(image.nlines, image.tile_nlines));
    const double plane = width * height * image.nbytes;
    const double tile = static_cast<double>(image.tile_nsamps) * image.tile_nlines * image.nbytes;
    const double end = static_cast<double>(data_offset) + plane * image.nbands;
    return std::max({width, height, plane, tile, end}) <= INT32_MAX;
}

// Why a VITec header cannot store an image, however small it may be.
inline std::string vitec_objection(const test_geometry &image)
{
    if (image.nbands > 3) return "Unsupported number of bands, must be less than 4!!\n";
    for (const std::int32_t size : {image.tile_nsamps, image.tile_nlines})
        if (size != 0 && (size < 8 || !std::has_single_bit(static_cast<std::uint16_t>(size))))
            return "Unsupported tile size, must be power of 2 >= 8!!\n";
    return image.nbytes < 3
               ? ""
               : "Unsupported # bits per pixel (" + std::to_string(image.nbytes) + ")!!\n";
}

// True when a file of that type can be created.
inline bool can_be_created(const test_geometry &image, std::int32_t type, std::int32_t data_offset)
{
    return is_within_limits(image, data_offset) &&
           (type != IMG_TYPE_VITEC || vitec_objection(image).empty()) &&
           (type != IMG_TYPE_HELAVA || image.nbytes == 1);
}

// Returns the image that a file holds, if it holds one.
inline std::optional<file_model> recognised(const bytes &file)
{
    for (const bool vitec : {true, false})
        for (const bool little_endian : {false, true}) {
            const auto word = [&](std::int64_t at) {
                std::uint32_t value = 0;
                for (std::int64_t i = 0; i < 4; ++i)
                    value = value << 8U | file[img_count(at + (little_endian ? 3 - i : i))];
                return static_cast<std::int32_t>(value);
            };
            const std::int64_t length = std::ssize(file), trailer = length - HELAVA_TRAILER;
            file_model found{.image = {}, .content = file};
            if (vitec) {
                const std::int64_t block = length < 48 ? length : std::int64_t{word(4)} + 4;
                if (block < 0 || block + VITEC_BLOCK > length || word(0) != VITEC_MAGIC ||
                    word(block + VITEC_VERSION) != 7 ||
                    word(block + VITEC_NBYTES_CODE) == INT32_MAX)
                    continue;
                found.image = {.nlines = word(block + VITEC_NLINES),
                               .nsamps = word(block + VITEC_NSAMPS),
                               .nbands = word(block + VITEC_NBANDS),
                               .nbytes = word(block + VITEC_NBYTES_CODE) + 1,
                               .tile_nsamps = word(block + VITEC_TILE_NSAMPS),
                               .tile_nlines = word(block + VITEC_TILE_NLINES)};
                if (has_tiles(found.image)) found.image.layout = IMG_LAYOUT_TILED;
                found.data_offset = block + word(block + VITEC_HEADER_LENGTH);
            } else {
                if (trailer < 0 || word(trailer + 12) != HELAVA_MAGIC) continue;
                found.image = {.nlines = word(trailer + 8),
                               .nsamps = word(trailer + 4),
                               .nbands = word(trailer)};
            }
            found.image.swap = little_endian != IS_LITTLE_ENDIAN ? 1 : 0;
            if (is_within_limits(found.image, found.data_offset)) return found;
        }
    return {};
}

#endif
