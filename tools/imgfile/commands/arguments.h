// Values of options that several commands have.
#ifndef TOOL_ARGUMENTS_H
#define TOOL_ARGUMENTS_H

#include "codecs/image.h"

#include <optional>
#include <string>

// Reads "none", "256" or "128x256" (lines x samples). Throws `wrong_usage`.
tile_size parse_tile(const std::string &argument);

// Reads "0,2" as bands of the image; without an argument returns `fallback`. Throws `wrong_usage`,
// and `failure` for a band that the image does not have.
band_list parse_bands(const std::optional<std::string> &argument, const image_reader &image,
                      const band_list &fallback);

// Reads "LINE,SAMP,NLINES,NSAMPS" as a window of the image; without an argument returns all of it.
// Throws `wrong_usage`, and `failure` for a window that is not inside the image.
window parse_window(const std::optional<std::string> &argument, const image_reader &image);

#endif
