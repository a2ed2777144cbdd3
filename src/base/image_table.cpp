// The table of open images and the check of handles. It makes and frees nothing: records come and
// go in api/open.cpp. Read image_table.h first.
#include "base/image_table.h"

#include "base/count.h"
#include "base/img_desc.h"
#include "base/report.h"

img_id_pool *img_handle_pool = nullptr;
std::array<img_desc *, IMG_MAX_HANDLES> img_open_images{};

bool img_is_handle(img_handle handle)
{
    return handle >= 0 && handle < IMG_MAX_HANDLES;
}

img_desc *&img_image_slot(img_handle handle)
{
    return img_open_images[img_count(handle)];
}

img_desc *img_find_image(img_handle handle)
{
    return img_is_handle(handle) ? img_image_slot(handle) : nullptr;
}

img_desc *img_find_valid_image(img_handle handle)
{
    if (!img_is_handle(handle)) {
        img_fail("img_validate_img_handle: img_handle is out of range\n");
        return nullptr;
    }
    img_desc *const desc = img_image_slot(handle);
    if (desc == nullptr) img_fail("img_validate_img_handle: img_handle not open\n");
    return desc;
}

std::int32_t img_validate_img_handle(img_handle handle)
{
    return img_find_valid_image(handle) != nullptr ? 0 : -1;
}

std::int32_t img_query_nbits(img_handle handle)
{
    const img_desc *const desc = img_find_image(handle);
    return desc != nullptr ? desc->nbits : -1;
}
