// The table of header hooks. Read type_hooks.h first.
#include "base/type_hooks.h"

#include "base/count.h"
#include "base/img_desc.h"

std::array<img_type_hooks, IMG_MAX_TYPES + 1> img_type_hooks_table{};

const img_type_hooks &img_hooks_of(const img_desc *desc)
{
    return img_type_hooks_table[img_count(desc->type)];
}
