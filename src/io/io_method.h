// Access methods: the named back-ends through which all file input and output goes. This header is
// the contract of such a method; io_default.cpp registers the library's own.
//
// An image uses one descriptor from its open to its close, and only with the method that opened it:
//
//   open                       first
//   seek, read, write, lend    any number of times, in any order
//   close                      last, also after failures
//
// There is one position per descriptor. read and write start at it and move it on by the bytes that
// they return; read_at and lend neither use nor move it. After a failed call the position is
// unknown: the library seeks from the start or the end before the next transfer.
//
// Threads. Operations on different descriptors run at the same time, and so do open and unlink. On
// one descriptor, read_at and lend run at the same time as each other; the other operations run
// alone.
//
// The library holds the lock of the image, and its own against forks, while an operation runs. An
// operation must not call the library for the image that it works for, nor for images whose
// operations may call back for that one; must not fork; and must not wait for another thread that
// may be calling the library. Calls for other images are allowed.
#ifndef IMG_IO_METHOD_H
#define IMG_IO_METHOD_H

#include <array>
#include <cstdint>
#include <memory>
#include <string_view>

inline constexpr std::int32_t IMG_MAX_IO_METHODS = 100;

enum : std::int32_t {  // the position that the offset of a seek counts from
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
// Reads lent bytes, which are valid until it returns. Called with the `arg` of the loan.
using img_io_use_fn = void (*)(void *arg, const std::uint8_t *bytes);
using img_io_lend_fn = std::int32_t (*)(std::int32_t fd, std::int32_t offset, std::int32_t count,
                                        std::int32_t discards, img_io_use_fn use, void *arg);
using img_io_read_at_fn = std::int32_t (*)(std::int32_t fd, std::int32_t offset, void *buffer,
                                           std::uint32_t count);

// One access method. Operations that fail return -1 and leave the reason in errno. A transfer that
// fails fails the host's call. While a file is probed a failure means "not of this type"; while it
// is closed a failure is ignored.
//
// A registration replaces a null operation by one that fails with ENOSYS, so that callers need not
// test for it; `read_at` and `lend` alone may be null here.
struct img_io_method {
    const char *name;      // referenced: the registrant keeps it valid for the life of the process
    std::int32_t enabled;  // 1: it can be found; 0: its initialisation failed

    // Opens the file, or creates it. Called once for each type that is tried, with the same flags.
    // `filename` is never null; it may be empty. `oflags`: the flags of img_openfile as the host
    // gave them, or read-write | create | truncate for a create, each with IMG_OPEN_BINARY; a host
    // may state any bits. `mode`: 0666. Returns a descriptor >= 0. A file that an open created
    // stays also where the library then refuses it.
    img_io_open_fn open;
    // Called once per descriptor. The descriptor counts as closed whatever the result.
    img_io_close_fn close;
    // Reads up to `count` bytes, 1 to 2^31 - 1, into `buffer`. Returns the bytes read: fewer than
    // `count` where the file ends or an error stops the read, 0 at the end and beyond it. The
    // library treats fewer bytes as the end of the file and does not ask for the rest.
    img_io_read_fn read;
    // Writes `count` bytes, 1 to 2^31 - 1. Returns the bytes written; fewer than `count` is a
    // failure to the library, which does not ask for the rest; only a merged write is repeated line
    // by line. A write beyond the end of the file fills the gap with zero bytes: the library grows
    // a file by writing its last byte.
    img_io_write_fn write;
    // Moves the position to `offset` from one of the three IMG_SEEK_ places. Offsets may come from
    // a header and be any number. A position beyond the end is valid and does not change the file;
    // one before the start or beyond 31 bits fails. Returns the new position from the start:
    // seek(fd, 0, IMG_SEEK_END) is how the library asks for the length.
    img_io_seek_fn seek;
    // Removes a file by name, after its descriptors are closed. No function of a host reaches it.
    img_io_unlink_fn unlink;
    img_io_value_fn get_value;  // never called

    // Reads as `read` does, but from `offset`, 0 to 2^31 - 1. Null: the library seeks and reads,
    // for one thread at a time.
    img_io_read_at_fn read_at;
    // Calls `use` with the bytes [offset, offset + count) of the file where they lie
    // in memory: in a mapping, or in a buffer of the method's own. The library does not compare
    // them with the file's length; an offset below 0 or a count below 1 is refused. Returns 0 when
    // `use` was called and the file had all of these bytes from before the call until `use`
    // returned. Else -1, quietly: a refusal is no failure. The library then makes the ordinary
    // calls, and their results count. `discards` 0: `use` is called once at most, and not with
    // bytes that the file is known not to have any more; not 0: both may be, since the library
    // discards what `use` did before.
    // Null: nothing is lent.
    img_io_lend_fn lend;
    // 1: the library may merge the transfers of several lines or tiles into one call and split one
    // into several, and leaves out writes to a file opened read-only. 0: it makes one call per
    // line, per contiguous run of tiles, or per sample of an interleaved write, each after a seek;
    // a write is followed by a seek to the end.
    std::int32_t may_merge_transfers;
};

// Methods in the order of their registration; entry i is in use for i < img_io_method_count.
extern std::array<img_io_method, IMG_MAX_IO_METHODS> img_io_method_table;
extern std::int32_t img_io_method_count;

// Appends a method without positional reads, that lends nothing and whose transfers are not merged.
// `init_op`, if given, decides whether the method is enabled: it returns 0 if so. Returns 0, or -1
// quietly when an enabled method has that name, the name is null, or the table is full.
std::int32_t img_register_io_method(const char *name, std::int32_t (*init_op)(const char *name),
                                    img_io_open_fn open, img_io_close_fn close, img_io_read_fn read,
                                    img_io_write_fn write, img_io_seek_fn seek,
                                    img_io_unlink_fn unlink, img_io_value_fn get_value);

// Set what a registration has no argument for, of the enabled method of that name: its `read_at`,
// its `lend` (null: none), and that its transfers may be merged. To be called before an image is
// opened with the method. Return 0, or -1 quietly when no such method exists.
std::int32_t img_offer_positional_reads(const char *name, img_io_read_at_fn read_at);
std::int32_t img_offer_lending(const char *name, img_io_lend_fn lend);
std::int32_t img_allow_merging(const char *name);

// Returns the index of the enabled method of that name, compared byte for byte, or -1.
std::int32_t img_find_io_method(const char *name);

// Returns the enabled method of that name, or null.
const img_io_method *img_lookup_io_method(const char *name);

// Returns an owned copy of a name; null when memory is short.
std::unique_ptr<char[]> img_copy_name(std::string_view name);

// Splits the name of an image, "FILE" or "FILE@METHOD", into an owned file name and the enabled
// method of that name (null: no such method). Leading "@" are dropped; a name of nothing else is a
// file name. Returns 0, or -1 quietly when memory is short; then nothing is stored.
std::int32_t img_split_name(const char *name, std::unique_ptr<char[]> *filename_out,
                            const img_io_method **io_method_out);

#endif
