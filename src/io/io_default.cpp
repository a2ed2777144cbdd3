// The access method of ordinary files: the operations of platform.h, the same on every system. Read
// io_method.h first.
#include "io/io_default.h"

#include "io/io_method.h"
#include "io/platform.h"

namespace {

double no_value()
{
    return 0.0;
}

}  // namespace

std::int32_t img_register_default_io_method(const char *name)
{
    const std::int32_t result = img_register_io_method(
        name, /*init_op=*/nullptr, /*open=*/img_platform_open, /*close=*/img_platform_close,
        /*read=*/img_platform_read, /*write=*/img_platform_write, /*seek=*/img_platform_seek,
        /*unlink=*/img_platform_unlink, /*get_value=*/no_value);
    if (result != 0) return result;
    img_offer_positional_reads(name, img_platform_read_at);
    img_offer_lending(name, img_platform_lend);
    return img_allow_merging(name);
}
