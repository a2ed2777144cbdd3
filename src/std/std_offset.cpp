// Where lines, pixels, tiles and samples lie. Offsets of positions inside the image fit 31 bits, as
// the set-up has validated; only img_std_sample_offset takes positions that may lie outside. Read
// std_offset.h first.
#include "std/std_offset.h"

#include "base/img_desc.h"
#include "std/std.h"
#include "std/std_bytes.h"

namespace {

std::int32_t untiled_sample_offset(const img_desc *desc, std::int32_t line, std::int32_t samp,
                                   std::int32_t band)
{
    // With more pixels before it the offset does not fit, and its products may overflow 64 bits.
    if (std::int64_t{line} * desc->std_file->padded_nsamps + samp > INT32_MAX) return -1;
    if (desc->layout == IMG_LAYOUT_BSQ)
        return img_std_fit31(img_std_line_offset(desc, line, samp, band));
    return img_std_fit31(img_std_pixel_offset(desc, line, samp) +
                         std::int64_t{band} * desc->nbytes);
}

std::int32_t tiled_sample_offset(const img_desc *desc, std::int32_t line, std::int32_t samp,
                                 std::int32_t band)
{
    const img_std_file *const file = desc->std_file;
    const std::int32_t tile_row = line / desc->tile_nlines;
    const std::int32_t tile_col = samp / desc->tile_nsamps;
    if (tile_row >= file->tiles_down || tile_col >= file->tiles_across) return -1;
    const std::int64_t pixel =
        std::int64_t{line % desc->tile_nlines} * desc->tile_nsamps + samp % desc->tile_nsamps;
    const std::int64_t tile =
        img_std_tile_offset(desc, tile_row * file->tiles_across + tile_col, band);
    const bool interleaved = desc->layout == IMG_LAYOUT_TILED_BIP;
    return img_std_fit31(tile + (interleaved ? pixel * desc->nbands + band : pixel) * desc->nbytes);
}

}  // namespace

std::int64_t img_std_line_offset(const img_desc *desc, std::int64_t line, std::int32_t samp,
                                 std::int32_t band)
{
    const img_std_file *const file = desc->std_file;
    return file->data_offset + std::int64_t{band} * file->band_size +
           (line * file->padded_nsamps + samp) * desc->nbytes;
}

std::int64_t img_std_pixel_offset(const img_desc *desc, std::int64_t line, std::int32_t samp)
{
    const img_std_file *const file = desc->std_file;
    return file->data_offset + (line * file->padded_nsamps + samp) * desc->nbands * desc->nbytes;
}

std::int64_t img_std_tile_offset(const img_desc *desc, std::int64_t tile, std::int32_t band)
{
    const img_std_file *const file = desc->std_file;
    switch (desc->layout) {
    case IMG_LAYOUT_TILED:
        return file->data_offset + (tile * desc->nbands + band) * file->tile_size;
    case IMG_LAYOUT_TILED_BIP:
        return file->data_offset + tile * file->tile_size;
    default:
        return file->data_offset + std::int64_t{band} * file->band_size + tile * file->tile_size;
    }
}

std::int32_t img_std_sample_offset(const img_desc *desc, std::int32_t line, std::int32_t samp,
                                   std::int32_t band)
{
    if (line < 0 || samp < 0 || band < 0) return -1;
    switch (desc->layout) {
    case IMG_LAYOUT_BSQ:
    case IMG_LAYOUT_BIP:
        return untiled_sample_offset(desc, line, samp, band);
    case IMG_LAYOUT_TILED:
    case IMG_LAYOUT_BAND_TILED:
    case IMG_LAYOUT_TILED_BIP:
        return tiled_sample_offset(desc, line, samp, band);
    default:
        return 0;
    }
}
