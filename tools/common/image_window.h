// A rectangular part of an image.
#ifndef TOOLS_IMAGE_WINDOW_H
#define TOOLS_IMAGE_WINDOW_H

#include <cstdint>

struct window {
    std::int32_t line, samp;      // of its first sample
    std::int32_t nlines, nsamps;  // its height and width
};

#endif
