// Windows: what is asked of an image, which part of it the image has, and filling the rest.
#ifndef IMG_BUFFER_H
#define IMG_BUFFER_H

#include "api/img.h"

#include <cstddef>
#include <cstdint>

struct img_desc;

enum : std::int32_t {
    IMG_WINDOW_INSIDE = 0,   // wholly inside the image
    IMG_WINDOW_OUTSIDE = 1,  // no sample of it is inside, or there is no image
    IMG_WINDOW_PARTIAL = 2   // partly outside
};

// `nlines` x `nsamps` samples, the first at (`line`, `samp`).
struct img_window {
    std::int32_t line, samp, nlines, nsamps;
};

// Classifies a window; `handle` lies within 0..59.
std::int32_t img_window_test(img_handle handle, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps);

// True when `samples` take less than 2^31 bytes, as all of any image does. A host that asks for
// more is mistaken, and filling or reading that much would run over the end of its buffer.
bool img_fits_a_buffer(std::int64_t samples, std::int32_t nbytes);

// Reduces a window that is not outside to its part inside the image, which an empty image may
// leave without samples. Returns the samples that come before that part in a buffer whose rows
// are `stride` samples apart.
std::size_t img_clip_window(const img_desc *desc, img_window *window, std::int32_t stride);

// Sets the first `nsamps` samples of each of `nlines` rows, `stride` samples apart, to the sample
// of `nbytes` bytes at `value`.
void img_fill_window(std::uint8_t *buffer, std::int32_t stride, std::int32_t nsamps,
                     std::int32_t nlines, std::int32_t nbytes, const std::uint8_t *value);

// Reads a window inside the image from every band and merges them into `buffer` with the image's
// merge_fn. Returns the result of the last read, or -1 after a message when memory is short.
std::int32_t img_load_merged(img_desc *desc, std::int32_t line, std::int32_t samp,
                             std::int32_t nlines, std::int32_t nsamps, std::uint8_t *buffer,
                             std::int32_t stride);

#endif
