// Comparing an image file with a picture through the functions that a host calls.
#ifndef DEMO_COMPARISON_H
#define DEMO_COMPARISON_H

#include "img.h"
#include "picture.h"

#include "common/image_window.h"

#include <cstdint>
#include <string>

// An image, closed when it goes out of scope. Takes the result of img_openfile or img_createfile
// and throws std::runtime_error for -1.
class image_closer {
public:
    explicit image_closer(img_handle handle);
    image_closer(const image_closer &) = delete;
    image_closer &operator=(const image_closer &) = delete;
    ~image_closer() { img_closefile(m_handle); }
    operator img_handle() const { return m_handle; }

private:
    img_handle m_handle;
};

// The result of comparing one image file.
struct tally {
    std::int64_t nwindows = 0, ntiles = 0, nsamples = 0, nunequal = 0;
    std::string first_unequal;  // a description; empty: all are equal
};

// An image file under examination. The functions below add to `seen`, and throw std::runtime_error
// when a call of the library fails.
struct examined {
    img_handle image;
    const picture &source;
    tally seen{};
};

// Checks size, bands, type and tile size; `tile` 0: untiled.
void check_description(examined &file, std::int32_t type, std::int32_t tile);

// Checks windows inside the picture, across each edge and corner, outside, and windows that
// together cover the picture. One-byte samples are compared with the picture. Two-byte samples
// arrive stretched: equal samples must give equal bytes, and brighter ones no darker bytes; unless
// `twin` is -1, the windows must equal those of that image, which holds the same picture.
void check_windows(examined &file, img_handle twin);

// Checks all whole tiles; their parts outside the picture must be 0.
void check_tiles(examined &file, std::int32_t tile);

#endif
