// The region operations of standard-driver types: each layout has its transfer.
#include "base/img_desc.h"
#include "std/std.h"

namespace {

enum class organisation { lines, interleaved_lines, tiles };

organisation organisation_of(const img_desc *desc)
{
    switch (desc->layout) {
    case IMG_LAYOUT_BIP:
        return desc->nbands > 1 ? organisation::interleaved_lines : organisation::lines;
    case IMG_LAYOUT_TILED:
    case IMG_LAYOUT_BAND_TILED:
    case IMG_LAYOUT_TILED_BIP:
        return organisation::tiles;
    default:
        return organisation::lines;
    }
}

bool spans(std::int32_t first, std::int32_t count, std::int32_t extent)
{
    return first >= 0 && std::int64_t{first} + count <= extent;
}

// Only an image that takes windows beyond its edges can ask for a region that is not inside it.
bool is_inside(const img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
               std::int32_t nsamps, std::int32_t band)
{
    return spans(line, nlines, desc->nlines) && spans(samp, nsamps, desc->nsamps) &&
           spans(band, 1, desc->nbands);
}

}  // namespace

std::int32_t img_std_read(img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
                          std::int32_t nsamps, std::int32_t band, std::uint8_t *buffer,
                          std::int32_t stride)
{
    if (nlines < 1 || nsamps < 1) return 0;
    if (!is_inside(desc, line, samp, nlines, nsamps, band)) return -1;
    switch (organisation_of(desc)) {
    case organisation::interleaved_lines:
        return img_std_read_nontiled_interleaved(desc, line, samp, nlines, nsamps, band, buffer,
                                                 stride);
    case organisation::tiles:
        return img_read_tiled(desc, line, samp, nlines, nsamps, band, buffer, stride);
    default:
        return img_read_nontiled(desc, line, samp, nlines, nsamps, band, buffer, stride);
    }
}

std::int32_t img_std_write(img_desc *desc, std::int32_t line, std::int32_t samp,
                           std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                           const std::uint8_t *buffer, std::int32_t stride,
                           const std::uint8_t *fill)
{
    if (nlines < 1 || nsamps < 1) return 0;
    if (!is_inside(desc, line, samp, nlines, nsamps, band)) return -1;
    switch (organisation_of(desc)) {
    case organisation::interleaved_lines:
        return img_std_write_nontiled_interleaved(desc, line, samp, nlines, nsamps, band, buffer,
                                                  stride, fill);
    case organisation::tiles:
        return img_std_write_tiled(desc, line, samp, nlines, nsamps, band, buffer, stride, fill);
    default:
        return img_std_write_nontiled(desc, line, samp, nlines, nsamps, band, buffer, stride, fill);
    }
}
