// Ordinary files of the operating system: the operations of the default access method, as
// io_method.h describes them. A port replaces platform_posix.cpp and local_time_posix.cpp and,
// where it lends files, file_mapping_posix and bus_error_guard_posix.
//
// Only regular files and block devices are opened. Descriptors are 3 or more and not inherited by
// programs that the host starts; IMG_MAX_PLATFORM_FILES of them may be open. Reads and writes go on
// after an interruption and until the count is reached, the file ends or an error occurs; after an
// error they return the bytes that were moved before it, -1 if none were. Positions that do not fit
// 31 bits are a failure.
#ifndef IMG_PLATFORM_H
#define IMG_PLATFORM_H

#include "io/io_method.h"

#include <cstddef>
#include <cstdint>

inline constexpr std::size_t IMG_MAX_PLATFORM_FILES = 1024;

std::int32_t img_platform_open(const char *filename, std::int32_t oflags, std::int32_t mode);
std::int32_t img_platform_close(std::int32_t fd);
std::int32_t img_platform_read(std::int32_t fd, void *buffer, std::uint32_t count);
std::int32_t img_platform_read_at(std::int32_t fd, std::int32_t offset, void *buffer,
                                  std::uint32_t count);
std::int32_t img_platform_write(std::int32_t fd, const void *buffer, std::uint32_t count);
std::int32_t img_platform_seek(std::int32_t fd, std::int32_t offset, std::int32_t whence);
std::int32_t img_platform_unlink(const char *filename);
// Lends the bytes of regular files. Truncating the file meanwhile does not harm the process.
std::int32_t img_platform_lend(std::int32_t fd, std::int32_t offset, std::int32_t count,
                               std::int32_t discards, img_io_use_fn use, void *arg);
// For the child of a fork, and when the library is unloaded.
void img_platform_after_fork();
void img_platform_unload();

#endif
