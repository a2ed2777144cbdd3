// The bytes of a header in its file, through the access method that opened it. The formats' hooks
// use it for the file of an image; programs that look at headers use it for any open file.
#ifndef IMG_HEADER_FILE_H
#define IMG_HEADER_FILE_H

#include <cstdint>
#include <span>

struct img_desc;
struct img_io_method;

// An open file: a descriptor, and the access method that it belongs to.
struct img_header_file {
    const img_io_method *method;
    std::int32_t fd;
};

// Returns the file that an image's hooks read and write the header in.
img_header_file img_header_file_of(const img_desc *desc);

// Moves the descriptor; `whence` is an IMG_SEEK_ code. Returns the new position, or -1 with errno
// set, also for an offset that does not fit 31 bits and its sign.
std::int32_t img_header_seek(const img_header_file &file, std::int64_t offset, std::int32_t whence);
// Move the whole block at the descriptor's position. Return true when all of it was moved.
bool img_header_read(const img_header_file &file, std::span<std::uint8_t> block);
bool img_header_write(const img_header_file &file, std::span<const std::uint8_t> block);

// Returns 0 when the word at `offset` is `magic` in the host's byte order, 1 when it is
// `swapped_magic`: `magic` in the other order. Then the descriptor stands at `offset`. Returns -1
// for any other word, and when the word cannot be read.
std::int32_t img_find_magic(const img_header_file &file, std::uint32_t magic,
                            std::uint32_t swapped_magic, std::int32_t offset);

// The same for the file of an image: returns 1, and 0 or 1 in the image's `swap`, when the magic
// word is there. Returns 0 and leaves `swap` as it was when it is not.
std::int32_t img_probe_magic(img_desc *desc, std::uint32_t magic, std::uint32_t swapped_magic,
                             std::int32_t offset);

// The type_op of types that have no operation of their own: does nothing and returns -1.
std::int32_t img_no_type_op();

#endif
