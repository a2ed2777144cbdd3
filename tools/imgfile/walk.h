// Through an image of any size, piece by piece.
#ifndef TOOL_WALK_H
#define TOOL_WALK_H

#include "codecs/image.h"

#include <functional>

// Reads these bands of a window piece by piece and calls `use` with the position and size of each
// piece in the window, and its samples. Pieces come from top to bottom, and from left to right;
// their shapes suit the reader and the `target` of the samples. Takes about 8 MiB of memory; more
// for longer lines that must be whole, which are refused from 64 MiB on.
void walk(image_reader &reader, const window &part, const band_list &bands,
          const access_needs &target,
          const std::function<void(const window &piece, const block &samples)> &use);

#endif
