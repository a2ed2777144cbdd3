// How a format that is built on the standard driver takes its slots. Read std.h first, then
// base/types.h and base/type_hooks.h for what the slots mean.
#include "std/std.h"

#include "base/count.h"
#include "base/type_hooks.h"
#include "std/std_memory.h"
#include "std/std_region.h"
#include "std/std_setup.h"
#include "std/std_tiles.h"

std::int32_t img_std_fill_type(std::int32_t slot, const char *name, const char *extension,
                               std::int32_t tiled_layout, std::int32_t untiled_layout,
                               img_image_fn probe, img_image_fn read_header,
                               img_image_fn write_header, img_image_fn padded_nlines_fn,
                               img_image_fn padded_nsamps_fn, img_type_op_fn type_op,
                               img_type_desc *slot_record)
{
    img_type_hooks_table[img_count(slot)] = {
        .untiled_layout = untiled_layout,
        .tiled_layout = tiled_layout,
        .probe = probe,
        .read_header = read_header,
        .write_header = write_header,
        .padded_nlines_fn = padded_nlines_fn,
        .padded_nsamps_fn = padded_nsamps_fn,
    };
    *slot_record = {
        .enabled = 1,
        .name = name,
        .extension = extension,
        .open = img_std_open,
        .create = img_std_create,
        .create_mem = img_std_create_mem,
        .close = img_std_close,
        .read = img_std_read,
        .write = img_std_write,
        .read_tiles = img_std_read_tiles,
        .write_tiles = img_std_write_tiles,
        .io_virtual = img_std_io_virtual,
        .pix_io_virtual = img_std_pix_io_virtual,
        .delete_image = img_std_delete,
        .type_op = type_op,
        .spare = slot_record->spare,
    };
    return 0;
}
