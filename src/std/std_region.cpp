// Choosing the transfer of a region by the image's layout. Read std_region.h first.
#include "std/std_region.h"

#include "base/img_desc.h"
#include "base/types.h"
#include "std/std_interleaved_lines.h"
#include "std/std_lines.h"
#include "std/std_tiled.h"

namespace {

struct region_transfer {
    img_read_fn read;
    img_write_fn write;
};

region_transfer transfer_of(const img_desc *desc)
{
    switch (desc->layout) {
    case IMG_LAYOUT_TILED:
    case IMG_LAYOUT_BAND_TILED:
    case IMG_LAYOUT_TILED_BIP:
        return {.read = img_read_tiled, .write = img_std_write_tiled};
    case IMG_LAYOUT_BIP:
        if (desc->nbands > 1)
            return {.read = img_std_read_nontiled_interleaved,
                    .write = img_std_write_nontiled_interleaved};
        [[fallthrough]];  // with one band the two layouts are the same
    default:
        return {.read = img_read_nontiled, .write = img_std_write_nontiled};
    }
}

bool spans(std::int32_t first, std::int32_t count, std::int32_t extent)
{
    return first >= 0 && std::int64_t{first} + count <= extent;
}

enum class verdict { move, move_nothing, refuse };

// Refuses regions outside the image, which only images whose `unclipped` is set are asked for:
// other windows are clipped before.
verdict judge(const img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
              std::int32_t nsamps, std::int32_t band)
{
    if (nlines < 1 || nsamps < 1) return verdict::move_nothing;
    const bool is_inside = spans(line, nlines, desc->nlines) && spans(samp, nsamps, desc->nsamps) &&
                           spans(band, 1, desc->nbands);
    return is_inside ? verdict::move : verdict::refuse;
}

// The result of a region that is not moved.
std::int32_t result_of(verdict answer)
{
    return answer == verdict::refuse ? -1 : 0;
}

}  // namespace

std::int32_t img_std_read(img_desc *desc, std::int32_t line, std::int32_t samp, std::int32_t nlines,
                          std::int32_t nsamps, std::int32_t band, std::uint8_t *buffer,
                          std::int32_t stride)
{
    const verdict answer = judge(desc, line, samp, nlines, nsamps, band);
    if (answer != verdict::move) return result_of(answer);
    return transfer_of(desc).read(desc, line, samp, nlines, nsamps, band, buffer, stride);
}

std::int32_t img_std_write(img_desc *desc, std::int32_t line, std::int32_t samp,
                           std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                           const std::uint8_t *buffer, std::int32_t stride,
                           const std::uint8_t *fill)
{
    const verdict answer = judge(desc, line, samp, nlines, nsamps, band);
    if (answer != verdict::move) return result_of(answer);
    return transfer_of(desc).write(desc, line, samp, nlines, nsamps, band, buffer, stride, fill);
}
