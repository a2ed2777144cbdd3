// Writing a window: the part of it that the image has, without the chain.
#include "access/buffer.h"
#include "api/img_desc.h"
#include "api/report.h"
#include "api/types.h"

std::int32_t img_dump_buffer(img_handle handle, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps, std::int32_t band,
                             const void *buffer, std::int32_t stride, const void *fill)
{
    img_desc *const desc = img_find_image(handle);
    if (desc == nullptr || img_access_mode(desc) == IMG_OPEN_READ_ONLY ||
        img_type_of(desc).write == nullptr)
        return -1;
    // Rows of two-byte samples may overlap: the depth counts as the message says.
    if (nsamps > std::int64_t{stride} * desc->nbytes)
        return img_fail("img_dump_buffer: nlines cannot exceed stride*depth!\n");
    if (band < 0 || band >= desc->nbands)
        return img_fail("img_dump_buffer: band %d not available!\n", band);
    if (nlines < 1 || nsamps < 1) return 0;
    if (buffer == nullptr) return -1;

    img_window window{line, samp, nlines, nsamps};
    std::size_t skipped = 0;
    if (desc->unclipped == 0) {
        const std::int32_t place = img_window_test(handle, line, samp, nlines, nsamps);
        if (place == IMG_WINDOW_OUTSIDE) return 0;
        if (place == IMG_WINDOW_PARTIAL) skipped = img_clip_window(desc, &window, stride);
    }
    if (window.nlines < 1 || window.nsamps < 1) return 0;  // an empty image has nothing to take
    // Rows that are not read need not be there.
    const std::int64_t samples = static_cast<std::int64_t>(skipped) +
                                 (std::int64_t{window.nlines} - 1) * stride + window.nsamps;
    if (!img_fits_a_buffer(samples, desc->nbytes)) return -1;
    return img_type_of(desc).write(desc, window.line, window.samp, window.nlines, window.nsamps,
                                   band,
                                   static_cast<const std::uint8_t *>(buffer) +
                                       skipped * static_cast<std::size_t>(desc->nbytes),
                                   stride, static_cast<const std::uint8_t *>(fill));
}
