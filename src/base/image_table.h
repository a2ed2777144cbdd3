// The table of open images: from the handle that a host holds to the record behind it.
#ifndef IMG_IMAGE_TABLE_H
#define IMG_IMAGE_TABLE_H

#include "base/id_pool.h"
#include "imgfile/img.h"

#include <array>
#include <cstdint>

struct img_desc;

inline constexpr std::int32_t IMG_MAX_HANDLES = 60;

extern img_id_pool *img_handle_pool;  // free handles; made at start-up, gone after img_mgr_cleanup
extern std::array<img_desc *, IMG_MAX_HANDLES> img_open_images;  // by handle; null: not open

// True for a handle within 0..59.
bool img_is_handle(img_handle handle);

// Returns the table entry of a handle within 0..59.
img_desc *&img_image_slot(img_handle handle);

// Returns the image of `handle`, or null for a handle outside 0..59 or not open.
img_desc *img_find_image(img_handle handle);

// Returns the image of `handle`, or null after a message that says which of the two it is: outside
// 0..59, or not open.
img_desc *img_find_valid_image(img_handle handle);

// Returns 0 when `handle` names an open image, else -1 after the same message.
std::int32_t img_validate_img_handle(img_handle handle);

// Returns the significant bits per sample, or -1 quietly for a handle that names no image.
std::int32_t img_query_nbits(img_handle handle);

#endif
