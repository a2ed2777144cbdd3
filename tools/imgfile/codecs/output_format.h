// Choosing the format of an output, and creating an image in it.
#ifndef TOOL_OUTPUT_FORMAT_H
#define TOOL_OUTPUT_FORMAT_H

#include "codecs/image.h"

#include <memory>

class output_file;

// Returns the format called `wanted` or, if that is empty, the one that the ending of `name`
// stands for. Throws `wrong_usage`, which names `option` as the way to choose a format.
file_format format_of_output(const std::string &name, const std::string &wanted,
                             const std::string &option);

// Throws `wrong_usage` for a name that does not end in ".png".
void check_png_name(const std::string &name);

// Starts an image in `out`. Throws `failure` when the format cannot hold it.
std::unique_ptr<image_writer> create_writer(output_file &out, file_format format, const shape &form,
                                            tile_size tiles);

#endif
