// Whether an image file holds a picture, asked as a host would ask.
#ifndef DEMO_COMPARISON_H
#define DEMO_COMPARISON_H

#include "img.h"
#include "picture.h"

#include <cstdint>
#include <string>

// An image, closed when it goes out of scope. Takes what img_openfile and img_createfile answer,
// and throws std::runtime_error for -1.
class open_image {
public:
    explicit open_image(img_handle handle);
    open_image(const open_image &) = delete;
    open_image &operator=(const open_image &) = delete;
    ~open_image() { img_closefile(m_handle); }
    operator img_handle() const { return m_handle; }

private:
    img_handle m_handle;
};

struct window {
    std::int32_t line, samp, nlines, nsamps;
};

// What was compared of one image file.
struct tally {
    std::int64_t nwindows = 0, ntiles = 0, nsamples = 0, nunequal = 0;
    std::string first_unequal;  // where; empty: nowhere
};

// An image file under examination. All that follow add to `seen`, and throw std::runtime_error
// when the library refuses what it is asked.
struct examined {
    img_handle image;
    const picture &source;
    tally seen{};
};

// Size, bands, type and tile size; `tile` 0: untiled.
void check_description(examined &file, std::int32_t type, std::int32_t tile);

// Windows inside, across each edge and corner and outside, and such as cover the whole picture
// together. One-byte samples are compared with the picture. Two-byte samples arrive stretched:
// then equal samples must look equal and brighter ones no darker; and the windows must equal
// those of `twin`, another image of the picture, unless it is -1.
void check_windows(examined &file, img_handle twin);

// All tiles, whole; their parts outside the picture must be 0.
void check_tiles(examined &file, std::int32_t tile);

#endif
