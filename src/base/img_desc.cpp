// Filling in the geometry of an image. Read img_desc.h first.
#include "base/img_desc.h"

#include <utility>

namespace {

// Significant bits of samples of which only the bytes are known. Any number of bytes may come from
// a header or a host: the product wraps, and the set-up refuses the image afterwards.
std::int32_t default_nbits(std::int32_t nbytes)
{
    return nbytes == 2 ? IMG_TWO_BYTE_BITS
                       : static_cast<std::int32_t>(8U * static_cast<std::uint32_t>(nbytes));
}

}  // namespace

void img_set_image_params(img_desc *desc, std::int32_t nlines, std::int32_t nsamps,
                          std::int32_t tile_nsamps, std::int32_t tile_nlines, std::int32_t nbands,
                          std::int32_t nbytes, std::int32_t nbits, std::int32_t layout,
                          std::int32_t lut_size, std::unique_ptr<std::uint8_t[]> lut0,
                          std::unique_ptr<std::uint8_t[]> lut1,
                          std::unique_ptr<std::uint8_t[]> lut2)
{
    desc->nlines = nlines;
    desc->nsamps = nsamps;
    desc->tile_nsamps = tile_nsamps;
    desc->tile_nlines = tile_nlines;
    desc->nbands = nbands;
    desc->nbytes = nbytes;
    desc->nbits = nbits != -1 ? nbits : default_nbits(nbytes);
    desc->layout = layout;
    desc->lut_size = lut_size;
    desc->lut = {std::move(lut0), std::move(lut1), std::move(lut2)};
    desc->band_map = {0, 1, 2};
    desc->unclipped = 0;
}
