// Writing a window: the part of it inside the image goes to the type's `write`, without passing the
// chain. Read dump_window.h first.
#include "access/dump_window.h"

#include "base/count.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/types.h"

std::int32_t img_dump_window(img_desc *desc, img_window window, std::int32_t band,
                             const std::uint8_t *buffer, std::int32_t stride,
                             const std::uint8_t *fill)
{
    if (img_access_mode(desc) == IMG_OPEN_READ_ONLY || img_type_of(desc).write == nullptr)
        return -1;
    // The message says "depth": rows of two-byte samples may overlap in the buffer.
    if (window.nsamps > std::int64_t{stride} * desc->nbytes)
        return img_fail("img_dump_buffer: nlines cannot exceed stride*depth!\n");
    if (band < 0 || band >= desc->nbands)
        return img_fail("img_dump_buffer: band %d not available!\n", band);
    if (window.nlines < 1 || window.nsamps < 1) return 0;
    if (buffer == nullptr) return -1;

    std::size_t skipped = 0;
    if (desc->unclipped == 0) {
        const std::int32_t window_class = img_window_class(desc, window);
        if (window_class == IMG_WINDOW_OUTSIDE) return 0;
        if (window_class == IMG_WINDOW_PARTIAL) skipped = img_clip_window(desc, &window, stride);
    }
    if (window.nlines < 1 || window.nsamps < 1) return 0;  // an empty image takes nothing
    // Rows that are clipped away need not exist in the caller's buffer.
    const std::int64_t samples = static_cast<std::int64_t>(skipped) +
                                 (std::int64_t{window.nlines} - 1) * stride + window.nsamps;
    if (!img_fits_a_buffer(samples, desc->nbytes)) return -1;
    return img_type_of(desc).write(desc, window.line, window.samp, window.nlines, window.nsamps,
                                   band, buffer + skipped * img_count(desc->nbytes), stride, fill);
}
