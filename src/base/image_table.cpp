// The table of open images and the check of handles. It makes and frees nothing: records come and
// go in api/open.cpp. Read image_table.h first.
#include "base/image_table.h"

#include "base/count.h"
#include "base/img_desc.h"
#include "base/report.h"
#include "base/shared_lock.h"

#include <utility>

img_id_pool *img_handle_pool = nullptr;
std::array<img_desc *, IMG_MAX_HANDLES> img_open_images{};

namespace {

img_mutex pool_mutex;

}  // namespace

img_handle img_take_handle()
{
    const img_mutex_lock lock(pool_mutex);
    return img_pool_take(img_handle_pool);
}

void img_give_back_handle(img_handle handle)
{
    const img_mutex_lock lock(pool_mutex);
    img_pool_give_back(img_handle_pool, handle);
}

bool img_make_handle_pool()
{
    const img_mutex_lock lock(pool_mutex);
    img_handle_pool = img_pool_create(0, IMG_MAX_HANDLES);
    return img_handle_pool != nullptr;
}

void img_free_handle_pool()
{
    const img_mutex_lock lock(pool_mutex);
    img_pool_free(std::exchange(img_handle_pool, nullptr));
}

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

void img_report_invalid_handle(img_handle handle)
{
    img_fail(img_is_handle(handle) ? "img_validate_img_handle: img_handle not open\n"
                                   : "img_validate_img_handle: img_handle is out of range\n");
}

std::int32_t img_validate_img_handle(img_handle handle)
{
    if (img_find_image(handle) != nullptr) return 0;
    img_report_invalid_handle(handle);
    return -1;
}

std::int32_t img_query_nbits(img_handle handle)
{
    const img_desc *const desc = img_find_image(handle);
    return desc != nullptr ? desc->nbits : -1;
}
