// Calls on images whose answers, and whose effects on their files, are held against a plain model.
#ifndef IMG_FUZZ_CHECKED_IMAGE_H
#define IMG_FUZZ_CHECKED_IMAGE_H

#include "input.h"
#include "memory_disk.h"
#include "support/format_rules.h"

// Ends the process after a message, so that the fuzzer keeps the input, unless `holds`.
void require(bool holds, const char *what);

// One input's use of the library: it begins with all handles free and an empty disk, and at its
// end gives back what is still open. What the library prints is thrown away.
struct fuzz_run {
    fuzz_run();
    ~fuzz_run();
};

struct open_image {
    img_handle handle = -1;
    std::int32_t oflags = 0;
    std::string file{};  // on the disk, where a copy lies of one that is elsewhere; empty: not open
    file_model in_file{};
};

// In all that follows `next` is the handle that is to be given out, and `faulty` says that the
// disk may go wrong and the call fail.

// Opens a file, which is to succeed if it holds an image.
open_image checked_open(const std::string &name, std::int32_t oflags, img_handle next,
                        bool faulty = false);
// Creates an image of the geometry that the input says, which is to succeed if it can be stored.
open_image checked_create(fuzz_input &in, const std::string &name, img_handle next,
                          bool faulty = false);
// Loads or dumps a window or tiles, as the input says.
void checked_transfer(fuzz_input &in, const open_image &image, bool faulty = false);
// Closes an image, which completes its file.
void checked_close(const open_image &image, bool faulty = false);

#endif
