// Opening, creating and closing an image's storage: operations of a type slot, whose contracts
// stand in base/types.h. All return 0 or -1, quietly.
#ifndef IMG_STD_SETUP_H
#define IMG_STD_SETUP_H

#include <cstdint>

struct img_desc;

// Opens the file, asks the type's probe, reads the header and computes the file organisation. -1,
// with nothing left open: not of this type, truncated, outside the driver's limits, or not to be
// opened.
std::int32_t img_std_open(img_desc *desc);
// Creates the file and writes the header for the geometry in the record. On failure nothing is left
// open; a file that was begun stays.
std::int32_t img_std_create(img_desc *desc);
// Makes an in-memory image of the geometry in the record, all samples 0.
std::int32_t img_std_create_mem(img_desc *desc);
// Completes a file that is too short with zero bytes and closes it; frees the state. Returns the
// result of closing the data descriptor, 0 without one.
std::int32_t img_std_close(img_desc *desc);
// Closes the descriptors, frees the state and removes the image's files. Returns the result of
// removing the file that bears the image's name.
std::int32_t img_std_delete(img_desc *desc);

// Computes the file organisation from the geometry and the type's hooks. -1: an image outside the
// driver's limits, or a file whose length cannot be determined.
std::int32_t img_std_setup(img_desc *desc);
// Closes the descriptors without completing the file and frees the state.
void img_std_fail_close(img_desc *desc);

#endif
