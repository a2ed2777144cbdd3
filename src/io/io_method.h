// Access methods: the named back-ends through which all file input and output goes.
#ifndef IMG_IO_METHOD_H
#define IMG_IO_METHOD_H

#include <array>
#include <cstdint>
#include <memory>
#include <string_view>

inline constexpr std::int32_t IMG_MAX_IO_METHODS = 100;

enum : std::int32_t {  // from where a seek counts
    IMG_SEEK_START = 0,
    IMG_SEEK_CURRENT = 1,
    IMG_SEEK_END = 2
};

using img_io_open_fn = std::int32_t (*)(const char *filename, std::int32_t oflags,
                                        std::int32_t mode);
using img_io_close_fn = std::int32_t (*)(std::int32_t fd);
using img_io_read_fn = std::int32_t (*)(std::int32_t fd, void *buffer, std::uint32_t count);
using img_io_write_fn = std::int32_t (*)(std::int32_t fd, const void *buffer, std::uint32_t count);
using img_io_seek_fn = std::int32_t (*)(std::int32_t fd, std::int32_t offset, std::int32_t whence);
using img_io_unlink_fn = std::int32_t (*)(const char *filename);
using img_io_value_fn = double (*)();
// Reads lent bytes; they are valid until it returns.
using img_io_use_fn = void (*)(void *arg, const std::uint8_t *bytes);
// Calls `use` once with the bytes [offset, offset + count) of an open file as they lie in memory.
// Returns 0 when the file had all of them until `use` came back. Else -1, quietly: they cannot be
// lent, and `use` was not called or what it did is worth nothing.
using img_io_lend_fn = std::int32_t (*)(std::int32_t fd, std::int32_t offset, std::int32_t count,
                                        img_io_use_fn use, void *arg);

// One access method. Its operations have the meaning of the low-level file calls of those names;
// all of them return -1 for failure and leave the reason in errno. None may call the library for
// the image that it works for.
struct img_io_method {
    const char *name;      // referenced: the registrant keeps it valid for the life of the process
    std::int32_t enabled;  // 1: it can be found; 0: its initialisation failed
    img_io_open_fn open;   // flags as for img_openfile, mode as in POSIX; a descriptor >= 0
    img_io_close_fn close;
    img_io_read_fn read;      // bytes read; fewer than asked: the file ends, or an error stopped it
    img_io_write_fn write;    // bytes written; fewer than asked is a failure to the caller
    img_io_seek_fn seek;      // whence as above; the new position from the start. A
                              // write after a seek past the end fills the gap with zero bytes
    img_io_unlink_fn unlink;  // removes a file by name
    img_io_value_fn get_value;  // never called by the library
    // Null: not offered. A method that offers it leaves it to the library into how many calls a
    // transfer is cut; all others see one seek and one transfer for each line or run of tiles.
    img_io_lend_fn lend;
};

// Methods in the order of their registration; entry i is in use for i < img_io_method_count.
inline std::array<img_io_method, IMG_MAX_IO_METHODS> img_io_method_table{};
inline std::int32_t img_io_method_count = 0;

// Appends a method. An operation that is null is replaced by one that fails. `init_op`, if given,
// decides whether the method is enabled: it returns 0 if so. Returns 0, or -1 quietly when an
// enabled method has that name, it is null, or the table is full.
std::int32_t img_register_io_method(const char *name, std::int32_t (*init_op)(const char *name),
                                    img_io_open_fn open, img_io_close_fn close, img_io_read_fn read,
                                    img_io_write_fn write, img_io_seek_fn seek,
                                    img_io_unlink_fn unlink, img_io_value_fn get_value);

// Lets the enabled method of that name offer to lend its bytes. Returns 0, or -1 quietly when there
// is none.
std::int32_t img_offer_lending(const char *name, img_io_lend_fn lend);

// Returns the index of the enabled method of that name, compared byte for byte, or -1.
std::int32_t img_find_io_method(const char *name);

// Returns the enabled method of that name, or null.
const img_io_method *img_lookup_io_method(const char *name);

// Returns an owned copy of a name; null when memory is short.
std::unique_ptr<char[]> img_copy_name(std::string_view name);

// Splits the name of an image, "FILE" or "FILE@METHOD", into an owned file name and the enabled
// method of that name (null: there is none). Leading "@" are dropped; a name of nothing else is
// a file name. Returns 0, or -1 quietly when memory is short; then nothing is stored.
std::int32_t img_split_name(const char *name, std::unique_ptr<char[]> *filename_out,
                            const img_io_method **io_method_out);

// Registers the method that works on the operating system's files under `name`.
std::int32_t img_register_default_io_method(const char *name);

#endif
