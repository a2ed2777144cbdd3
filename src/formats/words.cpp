#include "formats/words.h"

#include "io/io_method.h"
#include "std/std.h"

#include <array>
#include <cerrno>

std::uint32_t img_swap32(const std::uint8_t *bytes)
{
    std::uint32_t word;
    std::memcpy(&word, bytes, sizeof word);
    return word << 24U | (word & 0xFF00U) << 8U | (word >> 8U & 0xFF00U) | word >> 24U;
}

std::int32_t img_header_seek(const img_desc *desc, std::int64_t offset, std::int32_t whence)
{
    if (offset < INT32_MIN || offset > INT32_MAX) {
        errno = EOVERFLOW;
        return -1;
    }
    return desc->io_method->seek(desc->std_file->hdr_fd, static_cast<std::int32_t>(offset), whence);
}

std::int32_t img_header_read(const img_desc *desc, std::span<std::uint8_t> block)
{
    const auto count = static_cast<std::uint32_t>(block.size());
    const std::int32_t got = desc->io_method->read(desc->std_file->hdr_fd, block.data(), count);
    return got == static_cast<std::int32_t>(count) ? 0 : -1;
}

std::int32_t img_header_write(const img_desc *desc, std::span<const std::uint8_t> block)
{
    const auto count = static_cast<std::uint32_t>(block.size());
    const std::int32_t written =
        desc->io_method->write(desc->std_file->hdr_fd, block.data(), count);
    return written == static_cast<std::int32_t>(count) ? 0 : -1;
}

std::int32_t img_probe_magic(img_desc *desc, std::uint32_t magic, std::uint32_t swapped_magic,
                             std::int32_t offset)
{
    std::array<std::uint8_t, 4> block;
    if (img_header_seek(desc, offset, IMG_SEEK_START) != offset ||
        img_header_read(desc, block) == -1 ||
        img_header_seek(desc, offset, IMG_SEEK_START) != offset)
        return 0;
    const std::uint32_t word = img_get_word(block, 0);
    if (word != magic && word != swapped_magic) return 0;
    desc->swap = word == magic ? 0 : 1;
    return 1;
}

std::int32_t img_no_type_op()
{
    return -1;
}
