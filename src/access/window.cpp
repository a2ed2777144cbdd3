// The geometry of windows. A host states any 32-bit numbers, so sums are taken in 64 bits. Read
// window.h first.
#include "access/window.h"

#include "base/count.h"
#include "base/fill.h"
#include "base/image_table.h"
#include "base/img_desc.h"

#include <algorithm>

namespace {

// Brings one axis of a window into 0..extent. Returns the elements that it loses in front.
std::int64_t clip_axis(std::int32_t *first, std::int32_t *count, std::int32_t extent)
{
    const std::int64_t end = std::min(std::int64_t{*first} + *count, std::int64_t{extent});
    const std::int64_t skipped = *first < 0 ? -std::int64_t{*first} : 0;
    *first = std::max(*first, 0);
    *count = static_cast<std::int32_t>(end - *first);
    return skipped;
}

}  // namespace

std::int32_t img_window_class(const img_desc *desc, const img_window &window)
{
    const std::int64_t line_end = std::int64_t{window.line} + window.nlines;
    const std::int64_t samp_end = std::int64_t{window.samp} + window.nsamps;
    if (line_end < 1 || window.line >= desc->nlines || samp_end < 1 || window.samp >= desc->nsamps)
        return IMG_WINDOW_OUTSIDE;
    if (window.line < 0 || window.samp < 0 || line_end > desc->nlines || samp_end > desc->nsamps)
        return IMG_WINDOW_PARTIAL;
    return IMG_WINDOW_INSIDE;
}

std::int32_t img_window_test(img_handle handle, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps)
{
    const img_desc *const desc = img_find_image(handle);
    return desc != nullptr ? img_window_class(desc, {line, samp, nlines, nsamps})
                           : IMG_WINDOW_OUTSIDE;
}

bool img_fits_a_buffer(std::int64_t samples, std::int32_t nbytes)
{
    return samples <= INT32_MAX && samples * nbytes <= INT32_MAX;
}

std::size_t img_clip_window(const img_desc *desc, img_window *window, std::int32_t stride)
{
    const std::int64_t lines = clip_axis(&window->line, &window->nlines, desc->nlines);
    const std::int64_t samps = clip_axis(&window->samp, &window->nsamps, desc->nsamps);
    return img_count(lines * stride + samps);
}

void img_fill_window(std::uint8_t *buffer, std::int32_t stride, std::int32_t nsamps,
                     std::int32_t nlines, std::int32_t nbytes, const std::uint8_t *value)
{
    std::size_t count = img_count(nsamps);
    if (stride == nsamps) {
        count *= img_count(nlines);
        nlines = 1;
    }
    const std::size_t step = img_count(stride) * img_count(nbytes);
    for (std::int32_t i = 0; i < nlines; ++i)
        img_fill_samples(buffer + img_count(i) * step, count, nbytes, value);
}
