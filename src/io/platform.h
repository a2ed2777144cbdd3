// What the library asks of the operating system: ordinary files and the local time. A port
// replaces the files behind this header, which end in _posix.
#ifndef IMG_PLATFORM_H
#define IMG_PLATFORM_H

#include "io/io_method.h"

#include <array>
#include <cstdint>

// The operations of the default access method, as img_io_method describes them. Only regular
// files and block devices are opened. Descriptors are 3 or more and not inherited by programs
// that the host starts; 64 of them may be open. Reads and writes go on after an interruption and
// until the count is reached, the file ends or an error occurs; after an error they return what
// was moved before it, -1 if that is nothing. Positions that do not fit 31 bits are a failure.
std::int32_t img_platform_open(const char *filename, std::int32_t oflags, std::int32_t mode);
std::int32_t img_platform_close(std::int32_t fd);
std::int32_t img_platform_read(std::int32_t fd, void *buffer, std::uint32_t count);
std::int32_t img_platform_write(std::int32_t fd, const void *buffer, std::uint32_t count);
std::int32_t img_platform_seek(std::int32_t fd, std::int32_t offset, std::int32_t whence);
std::int32_t img_platform_unlink(const char *filename);
// Lends the bytes of regular files. What becomes of the file meanwhile does not harm the process.
std::int32_t img_platform_lend(std::int32_t fd, std::int32_t offset, std::int32_t count,
                               img_io_use_fn use, void *arg);

// Returns the local time as years since 1900 (its low 8 bits), month 0..11, day 1..31, hour,
// minute and second; all 0 when it cannot be had.
std::array<std::uint8_t, 6> img_platform_local_time();

#endif
