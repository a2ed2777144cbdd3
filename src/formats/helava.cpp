#include "formats/helava.h"

#include "formats/words.h"
#include "std/std.h"

#include <new>

namespace {

// Gives the record a trailer of zeros and returns it; empty when memory is short.
std::span<std::uint8_t> new_trailer(img_desc *desc)
{
    desc->header.reset(new (std::nothrow) std::uint8_t[IMG_HELAVA_TRAILER_LENGTH]{});
    return {desc->header.get(), desc->header ? IMG_HELAVA_TRAILER_LENGTH : 0};
}

// Returns the offset of the trailer, which comes right after the samples: negative when there can
// be no such place, or the trailer would end beyond 31 bits.
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
    return img_std_fill_type(slot, "Helava", ".d", IMG_LAYOUT_BSQ, IMG_LAYOUT_BSQ, img_helava_probe,
                             img_helava_read_trailer, img_helava_write_trailer, nullptr,
                             img_helava_padded_nsamps, img_no_type_op, slot_record);
}

std::int32_t img_helava_probe(img_desc *desc)
{
    const std::int32_t length = img_header_seek(desc, 0, IMG_SEEK_END);
    if (length < 4) return 0;
    return img_probe_magic(desc, IMG_HELAVA_MAGIC, IMG_HELAVA_SWAPPED_MAGIC, length - 4);
}

std::int32_t img_helava_read_trailer(img_desc *desc)
{
    const std::span<std::uint8_t> trailer = new_trailer(desc);
    if (trailer.empty() ||
        img_header_seek(desc, -std::int64_t{IMG_HELAVA_TRAILER_LENGTH}, IMG_SEEK_END) == -1 ||
        img_header_read(desc, trailer) == -1)
        return -1;
    if (desc->swap != 0) img_swap_words(trailer, 0, IMG_HELAVA_TRAILER_LENGTH);
    img_set_image_params(desc, img_get_int(trailer, IMG_HELAVA_AT_NLINES),
                         img_get_int(trailer, IMG_HELAVA_AT_NSAMPS), 0, 0,
                         img_get_int(trailer, IMG_HELAVA_AT_NBANDS), 1, -1, IMG_LAYOUT_BSQ, 0,
                         nullptr, nullptr, nullptr);
    desc->std_file->data_offset = 0;
    return img_header_seek(desc, 0, IMG_SEEK_START) == 0 ? 0 : -1;
}

std::int32_t img_helava_write_trailer(img_desc *desc)
{
    if (desc->nbytes != 1) return -1;  // the trailer has no field for the sample size
    const std::span<std::uint8_t> trailer = new_trailer(desc);
    if (trailer.empty()) return -1;
    img_put_int(trailer, IMG_HELAVA_AT_NBANDS, desc->nbands);
    img_put_int(trailer, IMG_HELAVA_AT_NSAMPS, desc->nsamps);
    img_put_int(trailer, IMG_HELAVA_AT_NLINES, desc->nlines);
    img_put_word(trailer, IMG_HELAVA_AT_MAGIC, IMG_HELAVA_MAGIC);
    if constexpr (IMG_WRITES_SWAPPED) img_swap_words(trailer, 0, IMG_HELAVA_TRAILER_LENGTH);

    // The pixels are filled in below the trailer, which so stays the end of the file.
    const std::int64_t offset = trailer_offset(desc);
    if (offset < 0 || img_header_seek(desc, offset, IMG_SEEK_START) != offset ||
        img_header_write(desc, trailer) == -1)
        return -1;
    desc->std_file->data_offset = 0;
    return img_header_seek(desc, 0, IMG_SEEK_START) == 0 ? 0 : -1;
}

std::int32_t img_helava_padded_nsamps(img_desc *desc)
{
    return desc->nsamps;
}
