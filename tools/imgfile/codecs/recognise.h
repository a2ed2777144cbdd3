// Opening an image of any format.
#ifndef TOOL_RECOGNISE_H
#define TOOL_RECOGNISE_H

#include "codecs/image.h"

#include <memory>

// Returns a reader for the file, whose format its bytes tell. Throws `failure` when it is not an
// image of a known format.
std::unique_ptr<image_reader> open_reader(input_file file);

// The same for a name; "-" is standard input.
std::unique_ptr<image_reader> open_reader(const std::string &name);

#endif
