// The access method of ordinary files.
#ifndef IMG_IO_DEFAULT_H
#define IMG_IO_DEFAULT_H

#include <cstdint>

// Registers the method that works on the operating system's files under `name`. Returns the result
// of the registration.
std::int32_t img_register_default_io_method(const char *name);

#endif
