// Windows: what a host asks of an image, the part of it that the image has, and filling the rest.
#ifndef IMG_WINDOW_H
#define IMG_WINDOW_H

#include "imgfile/img.h"

#include <cstddef>
#include <cstdint>

struct img_desc;

enum : std::int32_t {
    IMG_WINDOW_INSIDE = 0,   // wholly inside the image
    IMG_WINDOW_OUTSIDE = 1,  // no sample of it is inside, or there is no image
    IMG_WINDOW_PARTIAL = 2   // partly outside
};

// `nlines` x `nsamps` samples, the first at (`line`, `samp`). Any numbers: a host states them.
struct img_window {
    std::int32_t line, samp, nlines, nsamps;
};

// Returns the class of a window, an IMG_WINDOW_ code.
std::int32_t img_window_class(const img_desc *desc, const img_window &window);
// The same for a handle; IMG_WINDOW_OUTSIDE if it names no image.
std::int32_t img_window_test(img_handle handle, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps);

// True when `samples` take less than 2^31 bytes, as all of any image does. A host that asks for
// more is mistaken: moving that much would run over the end of its buffer.
bool img_fits_a_buffer(std::int64_t samples, std::int32_t nbytes);

// Reduces a window that is not outside to its part inside the image, which is empty where the image
// is. Returns the samples that come before that part in a buffer whose rows are `stride` samples
// apart.
std::size_t img_clip_window(const img_desc *desc, img_window *window, std::int32_t stride);

// Sets the first `nsamps` samples of each of `nlines` rows, `stride` samples apart, to the sample
// of `nbytes` bytes at `value`.
void img_fill_window(std::uint8_t *buffer, std::int32_t stride, std::int32_t nsamps,
                     std::int32_t nlines, std::int32_t nbytes, const std::uint8_t *value);

#endif
