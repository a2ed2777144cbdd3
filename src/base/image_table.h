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

// Take and give back handles, for one thread at a time. img_take_handle returns -1 when there is no
// free one.
img_handle img_take_handle();
void img_give_back_handle(img_handle handle);
// Make and free the pool of handles. img_make_handle_pool returns false when memory is short.
bool img_make_handle_pool();
void img_free_handle_pool();

// The functions below read the table. They are for a thread that opens or closes the image, or
// that has it through an img_image_use (api/calls.h).

// True for a handle within 0..59.
bool img_is_handle(img_handle handle);

// Returns the table entry of a handle within 0..59.
img_desc *&img_image_slot(img_handle handle);

// Returns the image of `handle`, or null for a handle outside 0..59 or not open.
img_desc *img_find_image(img_handle handle);

// Prints which of the two is wrong with a handle: outside 0..59, or not open.
void img_report_invalid_handle(img_handle handle);

// Returns 0 when `handle` names an open image, else -1 after the same message.
std::int32_t img_validate_img_handle(img_handle handle);

// Returns the significant bits per sample, or -1 quietly for a handle that names no image.
std::int32_t img_query_nbits(img_handle handle);

#endif
