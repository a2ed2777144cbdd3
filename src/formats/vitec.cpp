// The VITec format: recognises a file by its magic word, follows the links of its header to the
// geometry and the pixels, and builds the header of a new file. Assumes nothing of the values that
// a header states beyond its version: the standard driver validates the geometry. Read vitec.h
// first.
#include "formats/vitec.h"

#include "base/img_desc.h"
#include "base/report.h"
#include "formats/header_file.h"
#include "io/io_method.h"
#include "io/local_time.h"
#include "std/std.h"

#include <algorithm>

namespace {

// Returns `extent` raised to a multiple of `tile_extent`, 0 for none; -1 beyond 31 bits.
std::int32_t padded(std::int32_t extent, std::int32_t tile_extent)
{
    if (tile_extent == 0 || extent % tile_extent == 0) return extent;
    const std::int64_t raised = std::int64_t{extent} - extent % tile_extent + tile_extent;
    return raised <= INT32_MAX ? static_cast<std::int32_t>(raised) : -1;
}

bool is_storable_tile_size(std::int32_t size)
{
    return size == 0 || (size >= IMG_VITEC_MIN_TILE && img_is_power_of_two(size) != 0);
}

// The word wraps, and only the width is counted in whole tiles; readers ignore it.
std::uint32_t total_length(std::int32_t nlines, std::int32_t nsamps, std::int32_t tile_nsamps,
                           std::int32_t tile_nlines, std::int32_t nbands, std::int32_t nbytes)
{
    auto line_samples = static_cast<std::uint32_t>(nsamps);
    if (tile_nsamps != 0 && tile_nlines != 0)
        line_samples = static_cast<std::uint32_t>(img_whole_tiles(nsamps, tile_nsamps)) *
                       static_cast<std::uint32_t>(tile_nsamps);
    return static_cast<std::uint32_t>(nlines) * line_samples * static_cast<std::uint32_t>(nbands) *
           static_cast<std::uint32_t>(nbytes);
}

// Returns the file block as it is written.
img_vitec_file_block new_file_block()
{
    img_vitec_file_block block{};
    img_put_word(block.bytes, IMG_VITEC_AT_MAGIC, IMG_VITEC_MAGIC);
    img_put_int(block.bytes, IMG_VITEC_AT_IMAGE_BLOCK_LINK,
                IMG_VITEC_IMAGE_BLOCK_OFFSET - IMG_VITEC_LINK_BASE);
    if constexpr (IMG_WRITES_SWAPPED) img_swap_words(block.bytes, 0, IMG_VITEC_FILE_WORDS_END);
    std::ranges::copy(img_local_time(), &block.bytes[IMG_VITEC_AT_CREATE_DATE]);
    std::ranges::copy(IMG_VITEC_NAME, &block.bytes[IMG_VITEC_AT_SIGNATURE]);
    return block;
}

// Hands the geometry of an image block in host order to the image.
void take_geometry(img_desc *desc, const img_vitec_image_block &block)
{
    const auto field = [&block](std::size_t offset) { return img_get_int(block.bytes, offset); };
    // The 32-bit product decides; the set-up refuses sizes that wrap it to 0.
    const bool tiled = img_get_word(block.bytes, IMG_VITEC_AT_TILE_NSAMPS) *
                           img_get_word(block.bytes, IMG_VITEC_AT_TILE_NLINES) !=
                       0;
    const std::uint32_t nbytes = img_get_word(block.bytes, IMG_VITEC_AT_NBYTES_CODE) + 1;
    img_set_image_params(desc, field(IMG_VITEC_AT_NLINES), field(IMG_VITEC_AT_NSAMPS),
                         field(IMG_VITEC_AT_TILE_NSAMPS), field(IMG_VITEC_AT_TILE_NLINES),
                         field(IMG_VITEC_AT_NBANDS), static_cast<std::int32_t>(nbytes), -1,
                         tiled ? IMG_LAYOUT_TILED : IMG_LAYOUT_BSQ, 0, nullptr, nullptr, nullptr);
}

}  // namespace

std::int32_t img_vitec_register(std::int32_t slot, img_type_desc *slot_record)
{
    return img_std_fill_type(slot, IMG_VITEC_NAME, /*extension=*/".img",
                             /*tiled_layout=*/IMG_LAYOUT_TILED, /*untiled_layout=*/IMG_LAYOUT_BSQ,
                             /*probe=*/img_vitec_probe,
                             /*read_header=*/img_vitec_read_header,
                             /*write_header=*/img_vitec_write_header,
                             /*padded_nlines_fn=*/img_vitec_padded_nlines,
                             /*padded_nsamps_fn=*/img_vitec_padded_nsamps,
                             /*type_op=*/img_no_type_op, slot_record);
}

std::int32_t img_vitec_find_magic(const img_header_file &file)
{
    return img_find_magic(file, IMG_VITEC_MAGIC, IMG_VITEC_SWAPPED_MAGIC, IMG_VITEC_AT_MAGIC);
}

bool img_vitec_read_blocks(const img_header_file &file, std::int32_t swap, img_vitec_blocks *blocks)
{
    if (!img_header_read(file, blocks->file.bytes)) return false;
    if (swap != 0) img_swap_words(blocks->file.bytes, 0, IMG_VITEC_FILE_WORDS_END);
    blocks->image_offset =
        std::int64_t{img_get_int(blocks->file.bytes, IMG_VITEC_AT_IMAGE_BLOCK_LINK)} +
        IMG_VITEC_LINK_BASE;
    if (img_header_seek(file, blocks->image_offset, IMG_SEEK_START) == -1 ||
        !img_header_read(file, blocks->image.bytes))
        return false;
    if (swap != 0) img_vitec_swap_image_block(&blocks->image);
    return true;
}

std::int32_t img_vitec_probe(img_desc *desc)
{
    return img_probe_magic(desc, IMG_VITEC_MAGIC, IMG_VITEC_SWAPPED_MAGIC, IMG_VITEC_AT_MAGIC);
}

std::int32_t img_vitec_read_header(img_desc *desc)
{
    const img_header_file file = img_header_file_of(desc);
    img_vitec_blocks blocks;
    if (!img_vitec_read_blocks(file, desc->swap, &blocks) ||
        img_get_word(blocks.image.bytes, IMG_VITEC_AT_VERSION) != IMG_VITEC_VERSION)
        return -1;
    take_geometry(desc, blocks.image);

    const std::int64_t header_length = img_get_int(blocks.image.bytes, IMG_VITEC_AT_HEADER_LENGTH);
    const std::int32_t data_offset = img_header_seek(
        file, header_length - std::int64_t{IMG_VITEC_IMAGE_BLOCK_SIZE}, IMG_SEEK_CURRENT);
    desc->std_file->data_offset = data_offset;
    return data_offset != -1 && data_offset == blocks.image_offset + header_length ? 0 : -1;
}

std::int32_t img_vitec_write_header(img_desc *desc)
{
    constexpr std::array<std::uint8_t, IMG_VITEC_RESERVED> reserved{};
    const img_header_file file = img_header_file_of(desc);
    const img_vitec_file_block file_block = new_file_block();
    if (!img_header_write(file, file_block.bytes) || !img_header_write(file, reserved)) return -1;
    img_vitec_image_block block{};
    if (img_vitec_build_image_block(&block, desc->nlines, desc->nsamps, desc->tile_nsamps,
                                    desc->tile_nlines, desc->nbands, desc->nbytes,
                                    IMG_VITEC_RESERVED) == -1)
        return -1;
    if constexpr (IMG_WRITES_SWAPPED) img_vitec_swap_image_block(&block);
    if (!img_header_write(file, block.bytes) || !img_header_write(file, reserved)) return -1;
    desc->swap = IMG_WRITES_SWAPPED ? 1 : 0;
    desc->std_file->data_offset = img_header_seek(file, 0, IMG_SEEK_CURRENT);
    return desc->std_file->data_offset == IMG_VITEC_DATA_OFFSET ? 0 : -1;
}

std::int32_t img_vitec_padded_nlines(img_desc *desc)
{
    return padded(desc->nlines, desc->tile_nlines);
}

std::int32_t img_vitec_padded_nsamps(img_desc *desc)
{
    return padded(desc->nsamps, desc->tile_nsamps);
}

std::int32_t img_is_power_of_two(std::int32_t value)
{
    return std::popcount(static_cast<std::uint16_t>(value)) == 1 ? 1 : 0;
}

bool img_vitec_is_tile_size(std::int32_t size)
{
    return size >= IMG_VITEC_MIN_TILE && size <= IMG_VITEC_MAX_TILE &&
           img_is_power_of_two(size) != 0;
}

std::int32_t img_vitec_build_image_block(img_vitec_image_block *block, std::int32_t nlines,
                                         std::int32_t nsamps, std::int32_t tile_nsamps,
                                         std::int32_t tile_nlines, std::int32_t nbands,
                                         std::int32_t nbytes, std::int32_t extra_length)
{
    const auto put = [block](std::size_t offset, std::int32_t value) {
        img_put_int(block->bytes, offset, value);
    };
    const std::int32_t header_length = extra_length + std::int32_t{IMG_VITEC_IMAGE_BLOCK_SIZE};
    *block = {};
    put(IMG_VITEC_AT_HEADER_LENGTH, header_length);
    put(IMG_VITEC_AT_VERSION, IMG_VITEC_VERSION);
    put(IMG_VITEC_AT_BAND_FLAG, nbands < 3 ? 1 : 0);
    put(IMG_VITEC_AT_NSAMPS, nsamps);
    put(IMG_VITEC_AT_NLINES, nlines);
    if (nbands > IMG_VITEC_MAX_BANDS)
        return img_fail("Unsupported number of bands, must be less than 4!!\n");
    put(IMG_VITEC_AT_NBANDS, nbands);
    if (!is_storable_tile_size(tile_nsamps) || !is_storable_tile_size(tile_nlines))
        return img_fail("Unsupported tile size, must be power of 2 >= 8!!\n");
    put(IMG_VITEC_AT_TILE_NSAMPS, tile_nsamps);
    put(IMG_VITEC_AT_TILE_NLINES, tile_nlines);
    if (nbytes > 2) return img_fail("Unsupported # bits per pixel (%d)!!\n", nbytes);
    img_put_word(block->bytes, IMG_VITEC_AT_NBYTES_CODE, static_cast<std::uint32_t>(nbytes) - 1);
    img_put_word(block->bytes, IMG_VITEC_AT_TOTAL_LENGTH,
                 total_length(nlines, nsamps, tile_nsamps, tile_nlines, nbands, nbytes) +
                     static_cast<std::uint32_t>(header_length));
    return 0;
}

void img_vitec_swap_image_block(img_vitec_image_block *block)
{
    img_swap_words(block->bytes, IMG_VITEC_AT_HEADER_LENGTH, IMG_VITEC_AT_DESCRIPTION);
    img_swap_words(block->bytes, IMG_VITEC_AT_VERSION, IMG_VITEC_IMAGE_WORDS_END);
}
