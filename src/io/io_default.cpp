// The access method named "": the operating system's ordinary files.
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
        name, nullptr, img_platform_open, img_platform_close, img_platform_read, img_platform_write,
        img_platform_seek, img_platform_unlink, no_value);
    return result == 0 ? img_offer_lending(name, img_platform_lend) : result;
}
