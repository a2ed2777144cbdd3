// Seeks and transfers of whole header blocks, and the probe for a magic word. Assumes that the
// descriptor was opened by the method it comes with. Read header_file.h and io/io_method.h first.
#include "formats/header_file.h"

#include "base/img_desc.h"
#include "formats/words.h"
#include "io/io_method.h"
#include "std/std.h"

#include <array>
#include <cerrno>

img_header_file img_header_file_of(const img_desc *desc)
{
    return {desc->io_method, desc->std_file->hdr_fd};
}

std::int32_t img_header_seek(const img_header_file &file, std::int64_t offset, std::int32_t whence)
{
    if (offset < INT32_MIN || offset > INT32_MAX) {
        errno = EOVERFLOW;
        return -1;
    }
    return file.method->seek(file.fd, static_cast<std::int32_t>(offset), whence);
}

bool img_header_read(const img_header_file &file, std::span<std::uint8_t> block)
{
    const auto count = static_cast<std::uint32_t>(block.size());
    return file.method->read(file.fd, block.data(), count) == static_cast<std::int32_t>(count);
}

bool img_header_write(const img_header_file &file, std::span<const std::uint8_t> block)
{
    const auto count = static_cast<std::uint32_t>(block.size());
    return file.method->write(file.fd, block.data(), count) == static_cast<std::int32_t>(count);
}

std::int32_t img_find_magic(const img_header_file &file, std::uint32_t magic,
                            std::uint32_t swapped_magic, std::int32_t offset)
{
    std::array<std::uint8_t, sizeof magic> block;
    if (img_header_seek(file, offset, IMG_SEEK_START) != offset || !img_header_read(file, block) ||
        img_header_seek(file, offset, IMG_SEEK_START) != offset)
        return -1;
    const std::uint32_t word = img_get_word(block, 0);
    if (word == magic) return 0;
    return word == swapped_magic ? 1 : -1;
}

std::int32_t img_probe_magic(img_desc *desc, std::uint32_t magic, std::uint32_t swapped_magic,
                             std::int32_t offset)
{
    const std::int32_t swap =
        img_find_magic(img_header_file_of(desc), magic, swapped_magic, offset);
    if (swap == -1) return 0;
    desc->swap = swap;
    return 1;
}

std::int32_t img_no_type_op()
{
    return -1;
}
