// The Helava format: finds the trailer at the end of a file, reads it, and writes it behind the
// samples of a new one. Assumes samples of one byte: the trailer has no field for their size. Read
// helava.h first.
#include "formats/helava.h"

#include "base/img_desc.h"
#include "formats/header_file.h"
#include "io/io_method.h"
#include "std/std.h"

#include <new>

namespace {

using trailer_bytes = std::span<std::uint8_t, IMG_HELAVA_TRAILER_LENGTH>;

// Gives the record a trailer of zeros. Returns false when memory is short.
bool make_trailer(img_desc *desc)
{
    desc->header.reset(new (std::nothrow) std::uint8_t[IMG_HELAVA_TRAILER_LENGTH]{});
    return desc->header != nullptr;
}

trailer_bytes trailer_of(const img_desc *desc)
{
    return trailer_bytes(desc->header.get(), IMG_HELAVA_TRAILER_LENGTH);
}

// Returns the offset of the magic word, the last of the file; negative when the file has no room
// for it or its length is unknown.
std::int32_t magic_offset(const img_header_file &file)
{
    constexpr std::int32_t size = sizeof IMG_HELAVA_MAGIC;
    return img_header_seek(file, 0, IMG_SEEK_END) - size;
}

// Returns the offset of the trailer, which follows the samples; negative for negative sizes, and
// when the trailer would end beyond 31 bits.
std::int64_t trailer_offset(const img_desc *desc)
{
    constexpr std::int64_t last = INT32_MAX - std::int64_t{IMG_HELAVA_TRAILER_LENGTH};
    const std::int64_t band = std::int64_t{desc->nsamps} * desc->nlines;
    if (desc->nbands == 0) return 0;
    if (band < 0 || band > last) return -1;
    const std::int64_t offset = band * desc->nbands;
    return offset <= last ? offset : -1;
}

}  // namespace

std::int32_t img_helava_register(std::int32_t slot, img_type_desc *slot_record)
{
    return img_std_fill_type(slot, IMG_HELAVA_NAME, /*extension=*/".d",
                             /*tiled_layout=*/IMG_LAYOUT_BSQ, /*untiled_layout=*/IMG_LAYOUT_BSQ,
                             /*probe=*/img_helava_probe,
                             /*read_header=*/img_helava_read_trailer,
                             /*write_header=*/img_helava_write_trailer,
                             /*padded_nlines_fn=*/nullptr,
                             /*padded_nsamps_fn=*/img_helava_padded_nsamps,
                             /*type_op=*/img_no_type_op, slot_record);
}

std::int32_t img_helava_find_magic(const img_header_file &file)
{
    const std::int32_t offset = magic_offset(file);
    if (offset < 0) return -1;
    return img_find_magic(file, IMG_HELAVA_MAGIC, IMG_HELAVA_SWAPPED_MAGIC, offset);
}

bool img_helava_read_trailer_words(const img_header_file &file, std::int32_t swap,
                                   trailer_bytes trailer)
{
    if (img_header_seek(file, -std::int64_t{IMG_HELAVA_TRAILER_LENGTH}, IMG_SEEK_END) == -1 ||
        !img_header_read(file, trailer))
        return false;
    if (swap != 0) img_swap_words(trailer, 0, IMG_HELAVA_TRAILER_LENGTH);
    return true;
}

std::int32_t img_helava_probe(img_desc *desc)
{
    const std::int32_t offset = magic_offset(img_header_file_of(desc));
    if (offset < 0) return 0;
    return img_probe_magic(desc, IMG_HELAVA_MAGIC, IMG_HELAVA_SWAPPED_MAGIC, offset);
}

std::int32_t img_helava_read_trailer(img_desc *desc)
{
    const img_header_file file = img_header_file_of(desc);
    if (!make_trailer(desc) || !img_helava_read_trailer_words(file, desc->swap, trailer_of(desc)))
        return -1;
    const trailer_bytes trailer = trailer_of(desc);
    img_set_image_params(desc, img_get_int(trailer, IMG_HELAVA_AT_NLINES),
                         img_get_int(trailer, IMG_HELAVA_AT_NSAMPS), /*tile_nsamps=*/0,
                         /*tile_nlines=*/0, img_get_int(trailer, IMG_HELAVA_AT_NBANDS),
                         /*nbytes=*/1, /*nbits=*/-1, IMG_LAYOUT_BSQ, /*lut_size=*/0, nullptr,
                         nullptr, nullptr);
    desc->std_file->data_offset = 0;
    return img_header_seek(file, 0, IMG_SEEK_START) == 0 ? 0 : -1;
}

std::int32_t img_helava_write_trailer(img_desc *desc)
{
    if (desc->nbytes != 1 || !make_trailer(desc)) return -1;
    const img_header_file file = img_header_file_of(desc);
    const trailer_bytes trailer = trailer_of(desc);
    img_put_int(trailer, IMG_HELAVA_AT_NBANDS, desc->nbands);
    img_put_int(trailer, IMG_HELAVA_AT_NSAMPS, desc->nsamps);
    img_put_int(trailer, IMG_HELAVA_AT_NLINES, desc->nlines);
    img_put_word(trailer, IMG_HELAVA_AT_MAGIC, IMG_HELAVA_MAGIC);
    if constexpr (IMG_WRITES_SWAPPED) img_swap_words(trailer, 0, IMG_HELAVA_TRAILER_LENGTH);

    // The samples are filled in below the trailer, which remains the end of the file.
    const std::int64_t offset = trailer_offset(desc);
    if (offset < 0 || img_header_seek(file, offset, IMG_SEEK_START) != offset ||
        !img_header_write(file, trailer))
        return -1;
    desc->std_file->data_offset = 0;
    return img_header_seek(file, 0, IMG_SEEK_START) == 0 ? 0 : -1;
}

std::int32_t img_helava_padded_nsamps(img_desc *desc)
{
    return desc->nsamps;
}
