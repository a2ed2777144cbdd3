// Parts of images as PNG files to look at.
#ifndef DEMO_PREVIEW_H
#define DEMO_PREVIEW_H

#include "check.h"

#include <string>

// Writes a window of an image, in colours when it has three bands, else its first band. Windows
// longer than 1024 are reduced by a whole number, each sample the mean of those that it stands
// for. Throws std::runtime_error.
void write_preview(const std::string &name, img_handle image, const window &area);

#endif
