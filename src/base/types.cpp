// The table of image types. Read types.h first.
#include "base/types.h"

#include "base/count.h"
#include "base/img_desc.h"

std::array<img_type_desc, IMG_MAX_TYPES + 1> img_type_table{};

img_type_desc &img_type_slot(std::int32_t slot)
{
    return img_type_table[img_count(slot)];
}

const img_type_desc &img_type_of(const img_desc *desc)
{
    return img_type_slot(desc->type);
}
