// Where a sample lies, in each of the five layouts.
#include "api/img_desc.h"
#include "std/std.h"

#include <limits>

namespace {

std::int64_t untiled_offset(const img_desc *desc, std::int64_t line, std::int64_t samp,
                            std::int64_t band)
{
    const img_std_file *const file = desc->std_file;
    const std::int64_t pixel = line * file->padded_nsamps + samp;
    if (desc->layout == IMG_LAYOUT_BSQ) return band * file->band_size + pixel * desc->nbytes;
    return (pixel * desc->nbands + band) * desc->nbytes;
}

std::int64_t tiled_offset(const img_desc *desc, std::int64_t line, std::int64_t samp,
                          std::int64_t band)
{
    const img_std_file *const file = desc->std_file;
    const std::int64_t tile =
        line / desc->tile_nlines * file->tiles_across + samp / desc->tile_nsamps;
    const std::int64_t pixel =
        line % desc->tile_nlines * desc->tile_nsamps + samp % desc->tile_nsamps;
    switch (desc->layout) {
    case IMG_LAYOUT_TILED:
        return (tile * desc->nbands + band) * file->tile_size + pixel * desc->nbytes;
    case IMG_LAYOUT_BAND_TILED:
        return band * file->band_size + tile * file->tile_size + pixel * desc->nbytes;
    default:
        return tile * file->tile_size + (pixel * desc->nbands + band) * desc->nbytes;
    }
}

}  // namespace

std::int32_t img_std_sample_offset(const img_desc *desc, std::int32_t line, std::int32_t samp,
                                   std::int32_t band)
{
    if (line < 0 || samp < 0 || band < 0) return -1;
    std::int64_t offset = desc->std_file->data_offset;
    switch (desc->layout) {
    case IMG_LAYOUT_BSQ:
    case IMG_LAYOUT_BIP:
        offset += untiled_offset(desc, line, samp, band);
        break;
    case IMG_LAYOUT_TILED:
    case IMG_LAYOUT_BAND_TILED:
    case IMG_LAYOUT_TILED_BIP:
        offset += tiled_offset(desc, line, samp, band);
        break;
    default:
        return 0;
    }
    return offset <= std::numeric_limits<std::int32_t>::max() ? static_cast<std::int32_t>(offset)
                                                              : -1;
}
