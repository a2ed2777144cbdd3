// The four exported queries. Their contracts stand in imgfile/img.h.
#include "api/calls.h"
#include "base/img_desc.h"
#include "imgfile/img.h"

std::int32_t img_query_dimension(img_handle handle, std::int32_t *nlines_out,
                                 std::int32_t *nsamps_out)
{
    const img_call call;
    const img_image_use image(handle, img_purpose::query);
    const img_desc *const desc = image.desc();
    if (desc == nullptr) return -1;
    if (nlines_out != nullptr) *nlines_out = desc->nlines;
    if (nsamps_out != nullptr) *nsamps_out = desc->nsamps;
    return 0;
}

std::int32_t img_query_tile_size(img_handle handle, std::int32_t *tile_nsamps_out,
                                 std::int32_t *tile_nlines_out)
{
    const img_call call;
    const img_image_use image(handle, img_purpose::query);
    const img_desc *const desc = image.desc();
    if (desc == nullptr) return -1;
    if (tile_nsamps_out != nullptr) *tile_nsamps_out = desc->tile_nsamps;
    if (tile_nlines_out != nullptr) *tile_nlines_out = desc->tile_nlines;
    return 0;
}

std::int32_t img_query_image_type(img_handle handle)
{
    const img_call call;
    const img_image_use image(handle, img_purpose::query);
    const img_desc *const desc = image.desc();
    return desc != nullptr ? desc->type : IMG_NO_TYPE;
}

std::int32_t img_query_num_bands(img_handle handle)
{
    const img_call call;
    const img_image_use image(handle, img_purpose::query);
    const img_desc *const desc = image.desc();
    if (desc == nullptr) return -1;
    return desc->merge_bands != 0 ? 1 : desc->nbands;
}
